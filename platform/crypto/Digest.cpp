#include "platform/crypto/Digest.h"

#include "platform/text/Hex.h"

#include <array>
#include <span>
#include <stdexcept>

#include <openssl/evp.h>
#include <openssl/hmac.h>

namespace adminhost {

std::string sha256Of(std::string_view bytes) {
    std::array<unsigned char, EVP_MAX_MD_SIZE> digest{};
    unsigned int length = 0;
    if (EVP_Digest(bytes.data(), bytes.size(), digest.data(), &length, EVP_sha256(), nullptr) != 1) {
        throw std::runtime_error("the cryptography library does not offer SHA-256");
    }
    return hexOf(std::span(digest).first(length));
}

std::string keyedDigestOf(std::string_view key, std::string_view bytes) {
    std::array<unsigned char, EVP_MAX_MD_SIZE> digest{};
    unsigned int length = 0;
    if (HMAC(EVP_sha256(), key.data(), static_cast<int>(key.size()),
             reinterpret_cast<const unsigned char*>(bytes.data()), bytes.size(), digest.data(), &length) == nullptr) {
        throw std::runtime_error("the cryptography library does not offer HMAC");
    }
    return hexOf(std::span(digest).first(length));
}

}  // namespace adminhost
