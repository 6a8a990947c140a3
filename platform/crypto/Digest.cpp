#include "platform/crypto/Digest.h"

#include <array>
#include <stdexcept>

#include <openssl/evp.h>

namespace adminhost {

std::string sha256Of(std::string_view bytes) {
    std::array<unsigned char, EVP_MAX_MD_SIZE> digest{};
    unsigned int length = 0;
    if (EVP_Digest(bytes.data(), bytes.size(), digest.data(), &length, EVP_sha256(), nullptr) != 1) {
        throw std::runtime_error("the cryptography library does not offer SHA-256");
    }
    constexpr std::string_view digits = "0123456789abcdef";
    std::string text;
    for (unsigned int i = 0; i < length; ++i) {
        text += digits[digest[i] >> 4U];
        text += digits[digest[i] & 0x0fU];
    }
    return text;
}

}  // namespace adminhost
