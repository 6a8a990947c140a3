#include "platform/crypto/Crypt.h"

#include <algorithm>
#include <cstring>
#include <memory>

#include <openssl/crypto.h>
#include <openssl/evp.h>

namespace adminhost {
namespace {

struct ContextFree {
    void operator()(EVP_CIPHER_CTX* context) const noexcept { EVP_CIPHER_CTX_free(context); }
};
using Context = std::unique_ptr<EVP_CIPHER_CTX, ContextFree>;

struct CipherFree {
    void operator()(EVP_CIPHER* cipher) const noexcept { EVP_CIPHER_free(cipher); }
};
using Cipher = std::unique_ptr<EVP_CIPHER, CipherFree>;

/// The library's lengths are of type int.
constexpr std::size_t pieceLength = std::size_t{1} << 30U;

/// Looking a cipher up costs more than enciphering a short value, so each is fetched once, on its first use.
const EVP_CIPHER* cipherForKeyLength(std::size_t length) noexcept {
    switch (length) {
        case 16: {
            static const Cipher cipher(EVP_CIPHER_fetch(nullptr, "AES-128-CBC", nullptr));
            return cipher.get();
        }
        case 24: {
            static const Cipher cipher(EVP_CIPHER_fetch(nullptr, "AES-192-CBC", nullptr));
            return cipher.get();
        }
        case 32: {
            static const Cipher cipher(EVP_CIPHER_fetch(nullptr, "AES-256-CBC", nullptr));
            return cipher.get();
        }
        default:
            return nullptr;
    }
}

class Transform {
  public:
    Transform(const EVP_CIPHER* cipher, const unsigned char* key, bool encrypt)
        : _context(EVP_CIPHER_CTX_new()), _cipher(cipher), _key(key), _encrypt(encrypt ? 1 : 0) {}

    [[nodiscard]] bool hasContext() const noexcept { return _context != nullptr; }

    /// Runs the whole input through the cipher from a fresh start. The output is large enough for the result.
    bool run(const unsigned char* vector, bool padding, const unsigned char* in, std::size_t length, unsigned char* out,
             std::size_t& written) noexcept {
        written = 0;
        if (EVP_CipherInit_ex2(_context.get(), _cipher, _key, vector, _encrypt, nullptr) != 1 ||
            EVP_CIPHER_CTX_set_padding(_context.get(), padding ? 1 : 0) != 1) {
            return false;
        }
        int moved = 0;
        while (length > 0) {
            const std::size_t piece = std::min(length, pieceLength);
            if (EVP_CipherUpdate(_context.get(), out + written, &moved, in, static_cast<int>(piece)) != 1) {
                return false;
            }
            written += static_cast<std::size_t>(moved);
            in += piece;
            length -= piece;
        }
        if (EVP_CipherFinal_ex(_context.get(), out + written, &moved) != 1) {
            return false;
        }
        written += static_cast<std::size_t>(moved);
        return true;
    }

  private:
    Context _context;
    const EVP_CIPHER* _cipher;
    const unsigned char* _key;
    int _encrypt;
};

std::int32_t encrypt(Transform& transform, const unsigned char* vector, const unsigned char* in, std::size_t length,
                     unsigned char* out, std::size_t available, std::size_t& moved) noexcept {
    const std::size_t needed = (length / kCCBlockSizeAES + 1) * kCCBlockSizeAES;
    if (available < needed) {
        moved = needed;
        return kCCBufferTooSmall;
    }
    if (!transform.run(vector, true, in, length, out, moved)) {
        moved = 0;
        return kCCUnimplemented;
    }
    return kCCSuccess;
}

/// Deciphers the last block first: only its padding shows how long the plain text is, and whether there is one.
std::int32_t decrypt(Transform& transform, const unsigned char* vector, const unsigned char* in, std::size_t length,
                     unsigned char* out, std::size_t available, std::size_t& moved) noexcept {
    if (length == 0 || length % kCCBlockSizeAES != 0) {
        return kCCAlignmentError;
    }
    const std::size_t body = length - kCCBlockSizeAES;
    const unsigned char* lastVector = body == 0 ? vector : in + body - kCCBlockSizeAES;
    unsigned char tail[2 * kCCBlockSizeAES];
    std::size_t tailLength = 0;
    std::int32_t status = kCCSuccess;
    if (!transform.run(lastVector, true, in + body, kCCBlockSizeAES, tail, tailLength)) {
        status = kCCDecodeError;
    } else if (available < body + tailLength) {
        moved = body + tailLength;
        status = kCCBufferTooSmall;
    } else if (body != 0 && !transform.run(vector, false, in, body, out, moved)) {
        cleanse(out, body);
        moved = 0;
        status = kCCUnimplemented;
    } else if (tailLength != 0) {
        std::memcpy(out + body, tail, tailLength);
        moved = body + tailLength;
    }
    cleanse(tail, sizeof tail);
    return status;
}

}  // namespace

std::int32_t CCCrypt(std::uint32_t operation, std::uint32_t algorithm, std::uint32_t options, const void* key,
                     std::size_t keyLength, const void* initialisationVector, const void* dataIn,
                     std::size_t dataInLength, void* dataOut, std::size_t dataOutAvailable,
                     std::size_t* dataOutMoved) noexcept {
    if (dataOutMoved == nullptr) {
        return kCCParamError;
    }
    *dataOutMoved = 0;
    if (operation > kCCDecrypt || algorithm != kCCAlgorithmAES || options != kCCOptionPKCS7Padding || key == nullptr ||
        initialisationVector == nullptr || (dataIn == nullptr && dataInLength > 0) ||
        (dataOut == nullptr && dataOutAvailable > 0) || (keyLength != 16 && keyLength != 24 && keyLength != 32)) {
        return kCCParamError;
    }
    const EVP_CIPHER* cipher = cipherForKeyLength(keyLength);
    if (cipher == nullptr) {
        return kCCUnimplemented;
    }
    Transform transform(cipher, static_cast<const unsigned char*>(key), operation == kCCEncrypt);
    if (!transform.hasContext()) {
        return kCCMemoryFailure;
    }
    const auto* vector = static_cast<const unsigned char*>(initialisationVector);
    const auto* in = static_cast<const unsigned char*>(dataIn);
    auto* out = static_cast<unsigned char*>(dataOut);
    return operation == kCCEncrypt ? encrypt(transform, vector, in, dataInLength, out, dataOutAvailable, *dataOutMoved)
                                   : decrypt(transform, vector, in, dataInLength, out, dataOutAvailable, *dataOutMoved);
}

void cleanse(void* bytes, std::size_t length) noexcept {
    OPENSSL_cleanse(bytes, length);
}

}  // namespace adminhost
