#include "codec/LumioCategories.h"

#include "codec/Base64.h"

namespace lumio {
namespace {

Bytes bytesOf(std::string_view text) noexcept {
    return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

}  // namespace

adminhost::Data LumioUtilities_encodeBase64(Bytes data) {
    return encodeBase64Data(data, {});
}

adminhost::Data LumioUtilities_encodeBase64WithoutLineBreaks(Bytes data) {
    return encodeBase64Data(data, {.lineBreaks = false});
}

adminhost::Data base64DecodedData(std::string_view text) {
    return LumioUtilities_decodeBase64(bytesOf(text));
}

bool LumioUtilities_isValidBase64Data(Bytes data) {
    std::size_t pads = 0;
    for (const std::uint8_t byte : data) {
        if (byte >= 0x80) {
            return false;
        }
        const std::int8_t entry = base64DecodeTable[byte];
        if (entry == base64Pad) {
            ++pads;
        } else if (entry < 0 || pads > 0) {
            return false;
        }
    }
    return pads <= 2 && data.size() % 4 == 0;
}

std::optional<adminhost::Dictionary> objectsWithAndForKeys(const adminhost::Dictionary& dictionary,
                                                           const std::vector<std::string>* keys) {
    if (keys == nullptr) {
        return std::nullopt;
    }
    adminhost::Dictionary found;
    for (const std::string& key : *keys) {
        found.set(key, dictionary.get(key));
    }
    return found;
}

}  // namespace lumio
