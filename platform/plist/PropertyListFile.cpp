#include "platform/files/File.h"
#include "platform/files/ReplaceFile.h"
#include "platform/plist/PropertyList.h"
#include "platform/plist/Readers.h"

#include <utility>

#include <fmt/format.h>

namespace adminhost {

std::optional<Value> parsePropertyList(std::string_view bytes, Error* error, std::size_t valuesMaximum) {
    Error ignored;
    Error& place = error != nullptr ? *error : ignored;
    if (bytes.size() > plistMaximumSize) {
        place = plist::contentError(fmt::format("larger than {} bytes", plistMaximumSize));
        return std::nullopt;
    }
    return bytes.starts_with("bplist") ? plist::parseBinary(bytes, place, valuesMaximum)
                                       : plist::parseXml(bytes, place, valuesMaximum);
}

std::optional<Value> readPropertyList(const DiskPath& path, Error* error) {
    const auto bytes = readFile(path, plistMaximumSize);
    if (!bytes) {
        if (error != nullptr) {
            *error = bytes.error();
        }
        return std::nullopt;
    }
    auto value = parsePropertyList(*bytes, error);
    if (!value && error != nullptr) {
        error->description = fmt::format("{}: {}", hostPath(path).text(), error->description.value_or(""));
    }
    return value;
}

std::optional<Error> writePropertyList(const Value& value, const HostPath& path) {
    Error error;
    const auto text = xmlPropertyList(value, &error);
    if (!text) {
        error.description = fmt::format("cannot serialise {}: {}", path.text(), error.description.value_or(""));
        return error;
    }
    return replaceFile(*text, path);
}

}  // namespace adminhost
