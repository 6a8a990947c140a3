#include "codec/LumioAESCategories.h"

namespace lumio {

std::optional<adminhost::Data> aes128cbcEncryptDataWithKey(Bytes data, Bytes key) {
    return cryptedData(adminhost::kCCEncrypt, data, key, initialisationVector());
}

std::optional<adminhost::Data> aes128cbcDecryptDataWithKey(Bytes data, Bytes key) {
    return cryptedData(adminhost::kCCDecrypt, data, key, initialisationVector());
}

std::optional<adminhost::Data> cryptedData(std::uint32_t operation, Bytes data, Bytes key,
                                           const InitialisationVector& vector, CryptCall crypt) {
    std::size_t size = 128;
    for (;;) {
        adminhost::Data buffer(size);
        std::size_t moved = 0;
        const std::int32_t status =
            crypt(operation, adminhost::kCCAlgorithmAES, adminhost::kCCOptionPKCS7Padding, key.data(), key.size(),
                  vector.data(), data.data(), data.size(), buffer.data(), buffer.size(), &moved);
        if (status == adminhost::kCCSuccess) {
            buffer.resize(moved);
            return buffer;
        }
        if (status != adminhost::kCCBufferTooSmall) {
            return std::nullopt;
        }
        // If the library does not report how much it needs, it is called again with the same size.
        size = moved == 0 ? size : moved;
    }
}

}  // namespace lumio
