#include "platform/files/File.h"
#include "platform/files/ReplaceFile.h"
#include "platform/plist/PropertyList.h"
#include "platform/plist/Readers.h"

#include <utility>

#include <fmt/format.h>

namespace adminhost {

Result<Value> parsePropertyList(std::string_view bytes, std::size_t valuesMaximum) {
    if (bytes.size() > plistMaximumSize) {
        return failure(plist::contentError(fmt::format("larger than {} bytes", plistMaximumSize)));
    }
    return bytes.starts_with("bplist") ? plist::parseBinary(bytes, valuesMaximum)
                                       : plist::parseXml(bytes, valuesMaximum);
}

Result<Value> readPropertyList(const DiskPath& path) {
    auto bytes = readFile(path, plistMaximumSize);
    if (!bytes) {
        return failure(std::move(bytes.error()));
    }
    auto value = parsePropertyList(*bytes);
    if (!value) {
        std::optional<std::string>& description = value.error().description;
        description = fmt::format("{}: {}", hostPath(path).text(), description.value_or(""));
    }
    return value;
}

Result<void> writePropertyList(const Value& value, const HostPath& path) {
    auto text = xmlPropertyList(value);
    if (!text) {
        std::optional<std::string>& description = text.error().description;
        description = fmt::format("cannot serialise {}: {}", path.text(), description.value_or(""));
        return failure(std::move(text.error()));
    }
    return replaceFile(*text, path);
}

}  // namespace adminhost
