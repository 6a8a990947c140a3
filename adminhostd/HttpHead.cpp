#include "adminhostd/HttpHead.h"

#include "platform/text/Hex.h"

#include <algorithm>
#include <charconv>
#include <cstring>
#include <vector>

#include <fmt/format.h>
#include <microhttpd.h>
#include <strings.h>

namespace adminhost {
namespace {

/// Closes the connection after the answer, because the end of the request may be in doubt.
HttpAnswer malformed(const char* message) {
    return {400, Dictionary{{"error", "MALFORMED_HEAD"}, {"message", message}}, {{"Connection", "close"}}};
}

/// The values of one header in the order in which they were sent.
struct HeaderValues {
    const char* name;
    std::vector<std::string_view> values = {};
};

std::vector<std::string_view> headersOf(MHD_Connection* connection, const char* name) {
    HeaderValues found{name};
    const auto collect = [](void* context, MHD_ValueKind, const char* key, const char* value) {
        auto& header = *static_cast<HeaderValues*>(context);
        if (::strcasecmp(key, header.name) == 0) {
            header.values.emplace_back(value == nullptr ? "" : value);
        }
        return MHD_YES;
    };
    ::MHD_get_connection_values(connection, MHD_HEADER_KIND, collect, &found);
    return std::move(found.values);
}

}  // namespace

std::optional<std::string_view> headerOf(MHD_Connection* connection, const char* name) {
    const char* value = nullptr;
    std::size_t size = 0;
    if (::MHD_lookup_connection_value_n(connection, MHD_HEADER_KIND, name, std::strlen(name), &value, &size) !=
        MHD_YES) {
        return std::nullopt;
    }
    return value == nullptr ? std::string_view() : std::string_view(value);
}

std::uint64_t announcedLength(MHD_Connection* connection) {
    const std::string_view text = headerOf(connection, MHD_HTTP_HEADER_CONTENT_LENGTH).value_or("");
    std::uint64_t length = 0;
    const auto parsed = std::from_chars(text.data(), text.data() + text.size(), length);
    return parsed.ec == std::errc::result_out_of_range ? UINT64_MAX : length;
}

std::string pathOf(std::string_view target) {
    constexpr std::string_view scheme = "http://";
    if (target.starts_with(scheme)) {
        target.remove_prefix(std::min(target.find('/', scheme.size()), target.size()));
    }
    return target.empty() ? "/" : std::string(target);
}

std::optional<HttpAnswer> headRefusal(MHD_Connection* connection, std::string_view version, std::size_t bytesMaximum) {
    if (::MHD_get_connection_info(connection, MHD_CONNECTION_INFO_REQUEST_HEADER_SIZE)->header_size > bytesMaximum) {
        return HttpAnswer{
            431,
            Dictionary{{"error", "HEAD_TOO_LARGE"},
                       {"message", fmt::format("The head of a request may have {} bytes at most.", bytesMaximum)}},
            {{"Connection", "close"}}};
    }
    if (version == MHD_HTTP_VERSION_1_1 && !headerOf(connection, MHD_HTTP_HEADER_HOST)) {
        return malformed("The Host header is missing; send one, with any value.");
    }
    const auto codings = headersOf(connection, MHD_HTTP_HEADER_TRANSFER_ENCODING);
    const auto lengths = headersOf(connection, MHD_HTTP_HEADER_CONTENT_LENGTH);
    if (codings.size() > 1) {
        return malformed("There is more than one Transfer-Encoding; send one.");
    }
    if (!codings.empty() && (codings.front().size() != 7 || ::strncasecmp(codings.front().data(), "chunked", 7) != 0)) {
        return malformed("The only supported Transfer-Encoding is chunked.");
    }
    // With two readings of the body's length, the rest of the body could pass as the next request.
    if (!codings.empty() && !lengths.empty()) {
        return malformed("Content-Length and Transfer-Encoding exclude each other; send one of them.");
    }
    if (std::any_of(lengths.begin(), lengths.end(), [&](std::string_view text) { return text != lengths.front(); })) {
        return malformed("There are different Content-Length headers; send one.");
    }
    return std::nullopt;
}

std::size_t decodeEscapes(void*, MHD_Connection*, char* text) {
    char* to = text;
    for (const char* from = text; *from != '\0'; ++to) {
        const int high = *from == '%' ? hexValueOf(from[1]) : -1;
        const int low = high >= 0 ? hexValueOf(from[2]) : -1;
        if (low >= 0 && high + low > 0) {
            *to = static_cast<char>(high * 16 + low);
            from += 3;
        } else {
            *to = *from++;
        }
    }
    *to = '\0';
    return static_cast<std::size_t>(to - text);
}

}  // namespace adminhost
