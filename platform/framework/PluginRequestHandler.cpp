#include "platform/framework/PluginRequestHandler.h"

#include <array>
#include <cstdint>
#include <stdexcept>

#include <sys/random.h>

namespace adminhost {
namespace {

Dictionary& defaults() {
    static Dictionary values;
    return values;
}

}  // namespace

Response Response::error(std::string_view code, std::string_view message) {
    Response response(Dictionary{{"error", code}, {"message", message}});
    response._kind = Kind::error;
    return response;
}

Response PluginRequestHandler::responseForError(std::string_view code) const {
    struct Known {
        std::string_view code;
        std::string_view message;
    };
    constexpr Known known[] = {
        {"CANNOT_START_SERVICE_ERR", "The service could not be started. Its startup log says why."},
        {"CANNOT_STOP_SERVICE_ERR", "The service could not be stopped. Its log says why."},
        {"NOT_AVAILABLE", "This release does not offer the command yet."},
        {"INTERNAL_ERROR", "The operation failed inside the plug-in. The log lines of this request say why."},
    };
    for (const Known& entry : known) {
        if (entry.code == code) {
            return Response::error(code, entry.message);
        }
    }
    return Response::error(code, "The plug-in answered an error.");
}

const Value& userDefault(std::string_view name) noexcept {
    return defaults().get(name);
}

void setUserDefault(std::string_view name, Value value) {
    defaults().set(name, std::move(value));
}

std::string makeUUIDString() {
    std::array<std::uint8_t, 16> bytes{};
    if (::getrandom(bytes.data(), bytes.size(), 0) != static_cast<ssize_t>(bytes.size())) {
        throw std::runtime_error("the system's random source did not answer");
    }
    bytes[6] = static_cast<std::uint8_t>((bytes[6] & 0x0fU) | 0x40U);  // version 4
    bytes[8] = static_cast<std::uint8_t>((bytes[8] & 0x3fU) | 0x80U);  // variant of RFC 4122
    constexpr std::string_view digits = "0123456789ABCDEF";
    std::string text;
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        if (i == 4 || i == 6 || i == 8 || i == 10) {
            text += '-';
        }
        text += digits[bytes[i] >> 4U];
        text += digits[bytes[i] & 0x0fU];
    }
    return text;
}

}  // namespace adminhost
