#include "platform/crypto/Crypt.h"

#include <algorithm>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

using Bytes = std::vector<std::uint8_t>;

const Bytes key(16, 'k');
const Bytes vector(16, 'v');

struct Result {
    std::int32_t status = 0;
    std::size_t moved = 0;
    Bytes out;
};

Result crypt(std::uint32_t operation, const Bytes& in, std::size_t capacity, const Bytes& withKey = key) {
    Result result;
    result.out.assign(capacity, 0xEE);
    result.moved = 12345;
    result.status = CCCrypt(operation, 0, 1, withKey.data(), withKey.size(), vector.data(), in.data(), in.size(),
                            result.out.data(), capacity, &result.moved);
    return result;
}

bool untouched(const Bytes& bytes) {
    return std::all_of(bytes.begin(), bytes.end(), [](std::uint8_t byte) { return byte == 0xEE; });
}

TEST(CCCrypt, EncryptingReportsTheNeededSizeBeforeAnythingIsWritten) {
    for (std::size_t length = 0; length <= 64; ++length) {
        const std::size_t needed = (length / 16 + 1) * 16;
        const Result small = crypt(kCCEncrypt, Bytes(length, 'p'), needed - 1);
        EXPECT_EQ(small.status, -4301);
        EXPECT_EQ(small.moved, needed);
        EXPECT_TRUE(untouched(small.out));
        const Result fitting = crypt(kCCEncrypt, Bytes(length, 'p'), needed);
        EXPECT_EQ(fitting.status, 0);
        EXPECT_EQ(fitting.moved, needed);
    }
}

TEST(CCCrypt, DecryptingNeedsExactlyThePlainTextsSize) {
    for (std::size_t length = 0; length <= 64; ++length) {
        const Bytes plain(length, 'p');
        const Result cipher = crypt(kCCEncrypt, plain, 128);
        const Bytes cipherText(cipher.out.begin(), cipher.out.begin() + static_cast<long>(cipher.moved));
        if (length > 0) {
            const Result small = crypt(kCCDecrypt, cipherText, length - 1);
            EXPECT_EQ(small.status, -4301);
            EXPECT_EQ(small.moved, length);
            EXPECT_TRUE(untouched(small.out));
        }
        const Result fitting = crypt(kCCDecrypt, cipherText, length);
        EXPECT_EQ(fitting.status, 0);
        EXPECT_EQ(fitting.moved, length);
        EXPECT_EQ(fitting.out, plain);
    }
}

TEST(CCCrypt, NothingIsWrittenBehindTheResult) {
    const Result result = crypt(kCCEncrypt, Bytes(20, 'p'), 64);
    EXPECT_EQ(result.moved, 32U);
    EXPECT_TRUE(untouched(Bytes(result.out.begin() + 32, result.out.end())));
}

TEST(CCCrypt, BadKeyLengthIsAParameterError) {
    for (const std::size_t length : {0U, 10U, 15U, 17U, 23U, 31U, 33U}) {
        const Result result = crypt(kCCEncrypt, Bytes(20, 'p'), 64, Bytes(length, 'k'));
        EXPECT_EQ(result.status, -4300);
        EXPECT_EQ(result.moved, 0U);
        EXPECT_TRUE(untouched(result.out));
    }
}

TEST(CCCrypt, OtherOperationsAlgorithmsAndOptionsAreParameterErrors) {
    Bytes out(64);
    std::size_t moved = 0;
    const auto call = [&](std::uint32_t operation, std::uint32_t algorithm, std::uint32_t options) {
        return CCCrypt(operation, algorithm, options, key.data(), key.size(), vector.data(), "p", 1, out.data(),
                       out.size(), &moved);
    };
    EXPECT_EQ(call(0, 0, 1), 0);
    EXPECT_EQ(call(2, 0, 1), -4300);
    EXPECT_EQ(call(0, 1, 1), -4300);
    EXPECT_EQ(call(0, 0, 0), -4300);
    EXPECT_EQ(call(0, 0, 2), -4300);
    EXPECT_EQ(call(0, 0, 3), -4300);
}

TEST(CCCrypt, NullPointersAreParameterErrors) {
    Bytes out(64);
    std::size_t moved = 0;
    EXPECT_EQ(CCCrypt(0, 0, 1, nullptr, 16, vector.data(), "p", 1, out.data(), 64, &moved), -4300);
    EXPECT_EQ(CCCrypt(0, 0, 1, key.data(), 16, nullptr, "p", 1, out.data(), 64, &moved), -4300);
    EXPECT_EQ(CCCrypt(0, 0, 1, key.data(), 16, vector.data(), nullptr, 1, out.data(), 64, &moved), -4300);
    EXPECT_EQ(CCCrypt(0, 0, 1, key.data(), 16, vector.data(), "p", 1, nullptr, 64, &moved), -4300);
    EXPECT_EQ(CCCrypt(0, 0, 1, key.data(), 16, vector.data(), "p", 1, out.data(), 64, nullptr), -4300);
    EXPECT_EQ(CCCrypt(0, 0, 1, key.data(), 16, vector.data(), nullptr, 0, nullptr, 0, &moved), -4301);
    EXPECT_EQ(moved, 16U);
}

TEST(CCCrypt, CipherTextOfAnotherLengthThanWholeBlocksIsAnAlignmentError) {
    for (const std::size_t length : {0U, 1U, 15U, 17U, 31U}) {
        const Result result = crypt(kCCDecrypt, Bytes(length, 'c'), 64);
        EXPECT_EQ(result.status, -4303);
        EXPECT_EQ(result.moved, 0U);
        EXPECT_TRUE(untouched(result.out));
    }
}

TEST(CCCrypt, BadPaddingIsADecodeErrorThatWritesNothing) {
    Result cipher = crypt(kCCEncrypt, Bytes(40, 'p'), 48);
    cipher.out[31] ^= 0x40U;
    const Result result = crypt(kCCDecrypt, cipher.out, 64);
    EXPECT_EQ(result.status, -4304);
    EXPECT_EQ(result.moved, 0U);
    EXPECT_TRUE(untouched(result.out));
}

TEST(ScopedCleanse, WipesItsBytesAtTheEndOfTheScope) {
    Bytes secret{1, 2, 3};
    std::string text = "secret";
    {
        const ScopedCleanse wipeSecret(secret);
        const ScopedCleanse wipeText(text);
        EXPECT_EQ(secret[0], 1);
    }
    EXPECT_EQ(secret, Bytes(3));
    EXPECT_EQ(text, std::string(6, '\0'));
}

}  // namespace
}  // namespace adminhost
