#include "platform/directory/NameBasedUuid.h"

#include <algorithm>
#include <memory>
#include <stdexcept>

#include <openssl/evp.h>

namespace adminhost {
namespace {

/// SHA-1, fetched once and with one context: a pass over a large machine's accounts hashes every name.
class Sha1 {
  public:
    Sha1() : _digest(EVP_MD_fetch(nullptr, "SHA1", nullptr)), _context(EVP_MD_CTX_new()) {
        if (_digest == nullptr || _context == nullptr) {
            throw std::runtime_error("SHA-1 is not available");
        }
    }

    std::array<std::uint8_t, 20> operator()(const Uuid& space, std::string_view name) {
        std::array<std::uint8_t, 20> result{};
        if (EVP_DigestInit_ex2(_context.get(), _digest.get(), nullptr) != 1 ||
            EVP_DigestUpdate(_context.get(), space.data(), space.size()) != 1 ||
            EVP_DigestUpdate(_context.get(), name.data(), name.size()) != 1 ||
            EVP_DigestFinal_ex(_context.get(), result.data(), nullptr) != 1) {
            throw std::runtime_error("SHA-1 failed");
        }
        return result;
    }

  private:
    struct Free {
        void operator()(EVP_MD* digest) const noexcept { EVP_MD_free(digest); }
        void operator()(EVP_MD_CTX* context) const noexcept { EVP_MD_CTX_free(context); }
    };
    std::unique_ptr<EVP_MD, Free> _digest;
    std::unique_ptr<EVP_MD_CTX, Free> _context;
};

}  // namespace

Uuid nameBasedUuid(const Uuid& space, std::string_view name) {
    thread_local Sha1 sha1;
    const auto digest = sha1(space, name);
    Uuid uuid{};
    std::copy_n(digest.begin(), uuid.size(), uuid.begin());
    uuid[6] = static_cast<std::uint8_t>((uuid[6] & 0x0FU) | 0x50U);
    uuid[8] = static_cast<std::uint8_t>((uuid[8] & 0x3FU) | 0x80U);
    return uuid;
}

}  // namespace adminhost
