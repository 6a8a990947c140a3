#pragma once

// The one-shot cipher call, and the wiping of secrets.

#include "platform/framework/Export.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace adminhost {

constexpr std::uint32_t kCCEncrypt = 0;
constexpr std::uint32_t kCCDecrypt = 1;
constexpr std::uint32_t kCCAlgorithmAES = 0;
constexpr std::uint32_t kCCOptionPKCS7Padding = 1;
constexpr std::size_t kCCBlockSizeAES = 16;  ///< bytes

constexpr std::int32_t kCCSuccess = 0;
constexpr std::int32_t kCCParamError =
    -4300;  ///< an operation, algorithm, option, key length or pointer is not supported
constexpr std::int32_t kCCBufferTooSmall = -4301;  ///< nothing was written; dataOutMoved is the number of bytes needed
constexpr std::int32_t kCCMemoryFailure = -4302;
constexpr std::int32_t kCCAlignmentError = -4303;  ///< the length of cipher text is not a positive multiple of 16
constexpr std::int32_t kCCDecodeError = -4304;     ///< the last block has no valid padding
constexpr std::int32_t kCCUnimplemented = -4305;   ///< the cryptography library has no such cipher, or failed

/// Encrypts or decrypts dataIn at once: AES in CBC mode with PKCS#7 padding, the only combination it supports
/// (kCCAlgorithmAES, kCCOptionPKCS7Padding). The key has 16, 24 or 32 bytes, the initialisation vector 16.
///
/// On kCCSuccess dataOutMoved is the number of bytes written. The capacity is checked before anything is written, and
/// exactly: a plain text that just fits is decrypted although its cipher text is longer than the buffer. On any other
/// status than kCCSuccess and kCCBufferTooSmall dataOutMoved is 0 and no plain text is left in dataOut.
/// A wrong key is noticed only if it spoils the padding. Input and output must not overlap.
[[nodiscard]] ADMINHOST_EXPORT std::int32_t CCCrypt(std::uint32_t operation, std::uint32_t algorithm,
                                                    std::uint32_t options, const void* key, std::size_t keyLength,
                                                    const void* initialisationVector, const void* dataIn,
                                                    std::size_t dataInLength, void* dataOut,
                                                    std::size_t dataOutAvailable, std::size_t* dataOutMoved) noexcept;

/// Overwrites the bytes in a way that the compiler keeps.
ADMINHOST_EXPORT void cleanse(void* bytes, std::size_t length) noexcept;

/// Wipes a text or data of its owner when the scope ends, its unused capacity excepted.
template <typename Bytes>
class ScopedCleanse {
  public:
    explicit ScopedCleanse(Bytes& bytes) noexcept : _bytes(bytes) {}
    ScopedCleanse(const ScopedCleanse&) = delete;
    ScopedCleanse& operator=(const ScopedCleanse&) = delete;
    ~ScopedCleanse() { cleanse(_bytes.data(), _bytes.size()); }

  private:
    Bytes& _bytes;
};

}  // namespace adminhost
