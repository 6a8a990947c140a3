#pragma once

// The cipher of protected values: AES in CBC mode with PKCS#7 padding under one fixed initialisation vector, so that
// equal texts under equal keys give equal cipher texts.
//
// The format uses a key of 16 bytes; one of 24 or 32 bytes works too, and with any other length the operations fail.

#include "codec/InitialisationVector.h"
#include "codec/LumioCategories.h"
#include "platform/crypto/Crypt.h"

#include <optional>

namespace lumio {

/// Returns nullopt on any failure.
[[nodiscard]] std::optional<adminhost::Data> aes128cbcEncryptDataWithKey(Bytes data, Bytes key);
/// Returns nullopt on any failure: a bad key length, a length that is not a positive multiple of 16, bad padding. A
/// wrong key that happens to give valid padding is not noticed.
[[nodiscard]] std::optional<adminhost::Data> aes128cbcDecryptDataWithKey(Bytes data, Bytes key);

/// Encrypts or decrypts, with the vector and the library's call as arguments for the tests.
using CryptCall = decltype(&adminhost::CCCrypt);
[[nodiscard]] std::optional<adminhost::Data> cryptedData(std::uint32_t operation, Bytes data, Bytes key,
                                                         const InitialisationVector& vector,
                                                         CryptCall crypt = adminhost::CCCrypt);

}  // namespace lumio
