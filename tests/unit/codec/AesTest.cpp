#include "codec/LumioAESCategories.h"

#include <algorithm>
#include <deque>

#include <gtest/gtest.h>

namespace lumio {
namespace {

using adminhost::Data;

Data hex(std::string_view text) {
    Data data;
    for (std::size_t i = 0; i + 1 < text.size(); i += 2) {
        data.push_back(static_cast<std::uint8_t>(std::stoi(std::string(text.substr(i, 2)), nullptr, 16)));
    }
    return data;
}

Data plain(std::size_t length) {
    Data data(length);
    for (std::size_t i = 0; i < length; ++i) {
        data[i] = static_cast<std::uint8_t>(i * 7);
    }
    return data;
}

const Data key = hex("2b7e151628aed2a6abf7158809cf4f3c");

/// The real call, counted.
struct Call {
    std::size_t capacity;
    std::int32_t status;
};
std::vector<Call> calls;
std::int32_t countedCrypt(std::uint32_t operation, std::uint32_t algorithm, std::uint32_t options, const void* keyBytes,
                          std::size_t keyLength, const void* vector, const void* in, std::size_t length, void* out,
                          std::size_t available, std::size_t* moved) noexcept {
    const std::int32_t status = adminhost::CCCrypt(operation, algorithm, options, keyBytes, keyLength, vector, in,
                                                   length, out, available, moved);
    calls.push_back({available, status});
    return status;
}

std::size_t callsFor(std::uint32_t operation, const Data& data) {
    calls.clear();
    EXPECT_TRUE(cryptedData(operation, data, key, initialisationVector(), countedCrypt));
    return calls.size();
}

TEST(AesTransform, TheVectorIsTheSixteenBytesOfTheFormat) {
    const InitialisationVector vector = initialisationVector();
    EXPECT_EQ(std::string(vector.begin(), vector.end()), "LumioPropertyIV1");
}

struct Vector {
    const char* key;
    const char* cipher;
};

class AesKnownVectors : public testing::TestWithParam<Vector> {};

TEST_P(AesKnownVectors, ComeOutAndComeBack) {
    const Data vectorBytes = hex("000102030405060708090a0b0c0d0e0f");
    InitialisationVector vector{};
    std::copy(vectorBytes.begin(), vectorBytes.end(), vector.begin());
    const Data text =
        hex("6bc1bee22e409f96e93d7e117393172aae2d8a571e03ac9c9eb76fac45af8e51"
            "30c81c46a35ce411e5fbc1191a0a52eff69f2445df4f9b17ad2b417be66c3710");
    const auto cipher = cryptedData(adminhost::kCCEncrypt, text, hex(GetParam().key), vector);
    ASSERT_TRUE(cipher);
    ASSERT_EQ(cipher->size(), 80U);  // the padding is a separate block
    EXPECT_EQ(Data(cipher->begin(), cipher->begin() + 64), hex(GetParam().cipher));
    EXPECT_EQ(cryptedData(adminhost::kCCDecrypt, *cipher, hex(GetParam().key), vector), text);
}

INSTANTIATE_TEST_SUITE_P(Sp80038a, AesKnownVectors,
                         testing::Values(Vector{"2b7e151628aed2a6abf7158809cf4f3c",
                                                "7649abac8119b246cee98e9b12e9197d5086cb9b507219ee95db113a917678b2"
                                                "73bed6b8e3c1743b7116e69e222295163ff1caa1681fac09120eca307586e1a7"},
                                         Vector{"8e73b0f7da0e6452c810f32b809079e562f8ead2522c6b7b",
                                                "4f021db243bc633d7178183a9fa071e8b4d9ada9ad7dedf4e5e738763f69145a"
                                                "571b242012fb7ae07fa9baac3df102e008b0e27988598881d920a9e64f5615cd"},
                                         Vector{"603deb1015ca71be2b73aef0857d77811f352c073b6108d72d9810a30914dff4",
                                                "f58c4c04d6e5f1ba779eabfb5f7bfbd69cfc4e967edb808d679f777bc6702c7d"
                                                "39f23369a9d9bacfa530e26304231461b2eb05e2c39be9fcda6c19078c6a9d1b"}));

TEST(AesTransform, EmptyDataEncryptsToOneBlock) {
    const auto cipher = aes128cbcEncryptDataWithKey({}, key);
    ASSERT_TRUE(cipher);
    EXPECT_EQ(cipher->size(), 16U);
    EXPECT_EQ(aes128cbcDecryptDataWithKey(*cipher, key), Data());
}

TEST(AesTransform, EveryLengthUpToTenBlocksIsPaddedToTheNextBlockAndComesBack) {
    for (std::size_t length = 0; length <= 160; ++length) {
        const auto cipher = aes128cbcEncryptDataWithKey(plain(length), key);
        ASSERT_TRUE(cipher);
        EXPECT_EQ(cipher->size(), (length / 16 + 1) * 16);
        EXPECT_EQ(aes128cbcDecryptDataWithKey(*cipher, key), plain(length));
    }
}

TEST(AesTransform, OutputUpTo128BytesTakesOneCallAndALongerOneExactlyTwo) {
    EXPECT_EQ(callsFor(adminhost::kCCEncrypt, plain(112)), 1U);
    EXPECT_EQ(callsFor(adminhost::kCCEncrypt, plain(113)), 1U);
    EXPECT_EQ(callsFor(adminhost::kCCEncrypt, plain(127)), 1U);
    EXPECT_EQ(callsFor(adminhost::kCCEncrypt, plain(128)), 2U);
    EXPECT_EQ(calls[0].status, -4301);
    EXPECT_EQ(calls[0].capacity, 128U);
    EXPECT_EQ(calls[1].status, 0);
    EXPECT_EQ(calls[1].capacity, 144U);
    EXPECT_EQ(callsFor(adminhost::kCCEncrypt, plain(100000)), 2U);
}

TEST(AesTransform, PlainTextUpTo128BytesTakesOneCallAlthoughItsCipherTextIsLonger) {
    for (std::size_t length = 0; length <= 160; ++length) {
        const auto cipher = aes128cbcEncryptDataWithKey(plain(length), key);
        EXPECT_EQ(callsFor(adminhost::kCCDecrypt, *cipher), length <= 128 ? 1U : 2U) << length;
        EXPECT_EQ(calls.back().capacity, std::max<std::size_t>(128, length));
    }
}

TEST(AesTransform, ResultIsAsLongAsTheReportedCount) {
    const auto cipher = aes128cbcEncryptDataWithKey(plain(5), key);
    EXPECT_EQ(cipher->size(), 16U);
    EXPECT_EQ(aes128cbcDecryptDataWithKey(*cipher, key)->size(), 5U);
}

std::deque<std::pair<std::int32_t, std::size_t>> answers;
std::vector<std::size_t> capacities;
std::int32_t scriptedCrypt(std::uint32_t /*operation*/, std::uint32_t /*algorithm*/, std::uint32_t /*options*/,
                           const void* /*key*/, std::size_t /*keyLength*/, const void* /*vector*/, const void* /*in*/,
                           std::size_t /*length*/, void* /*out*/, std::size_t available, std::size_t* moved) noexcept {
    capacities.push_back(available);
    const auto [status, count] = answers.front();
    answers.pop_front();
    *moved = count;
    return status;
}

TEST(AesTransform, IsAskedAgainWithTheSameSizeWhenTheLibraryNamesNone) {
    answers = {{-4301, 0}, {-4301, 0}, {-4301, 500}, {0, 3}};
    capacities.clear();
    const auto result = cryptedData(0, {}, key, initialisationVector(), scriptedCrypt);
    EXPECT_EQ(capacities, (std::vector<std::size_t>{128, 128, 128, 500}));
    EXPECT_EQ(result, Data(3));
}

TEST(AesTransform, AnyOtherStatusAnswersNothing) {
    for (const std::int32_t status : {-4300, -4302, -4304, -1, 1}) {
        answers = {{status, 0}};
        EXPECT_EQ(cryptedData(0, {}, key, initialisationVector(), scriptedCrypt), std::nullopt);
    }
}

TEST(AesTransform, LengthThatIsNotAMultipleOfABlockDoesNotDecrypt) {
    Data cipher = *aes128cbcEncryptDataWithKey(plain(100), key);
    for (std::size_t length = 0; length < 112; ++length) {
        if (length % 16 != 0) {
            EXPECT_EQ(aes128cbcDecryptDataWithKey(Bytes(cipher).first(length), key), std::nullopt);
        }
    }
    cipher.push_back(0);
    EXPECT_EQ(aes128cbcDecryptDataWithKey(cipher, key), std::nullopt);
}

TEST(AesTransform, EmptyDataDoesNotDecrypt) {
    EXPECT_EQ(aes128cbcDecryptDataWithKey({}, key), std::nullopt);
}

TEST(AesTransform, BadPaddingDoesNotDecrypt) {
    // Changing a byte of the block before the last one changes the same byte of the padding.
    for (const std::size_t length : {20U, 150U, 1000U}) {
        Data cipher = *aes128cbcEncryptDataWithKey(plain(length), key);
        cipher[cipher.size() - 17] ^= 0x40U;
        EXPECT_EQ(aes128cbcDecryptDataWithKey(cipher, key), std::nullopt) << length;
    }
}

/// Returns one block whose plain text is these sixteen bytes, without padding.
Data cipherOfLastBlock(const Data& block) {
    // Encrypting adds a block of padding. Without that block the padding is read from the text's last block.
    Data cipher = *aes128cbcEncryptDataWithKey(block, key);
    cipher.resize(16);
    return cipher;
}

TEST(AesTransform, EveryLastBlockIsDecryptedExactlyWhenItsPaddingIsValid) {
    for (unsigned last = 0; last < 256; ++last) {
        // A whole padding of that length: only 1 to 16 are valid.
        Data block(16, 0xAB);
        std::fill(block.end() - static_cast<std::ptrdiff_t>(std::min(last, 16U)), block.end(), last);
        block.back() = static_cast<std::uint8_t>(last);
        const auto text = aes128cbcDecryptDataWithKey(cipherOfLastBlock(block), key);
        if (last >= 1 && last <= 16) {
            EXPECT_EQ(text, Data(16 - last, 0xAB)) << last;
        } else {
            EXPECT_EQ(text, std::nullopt) << last;
        }
    }
}

TEST(AesTransform, PaddingOfUnequalBytesDoesNotDecrypt) {
    for (unsigned last = 2; last <= 16; ++last) {
        for (unsigned wrong = 2; wrong <= last; ++wrong) {
            Data block(16, 0xAB);
            std::fill(block.end() - static_cast<std::ptrdiff_t>(last), block.end(), last);
            block[16 - wrong] ^= 0x01U;
            EXPECT_EQ(aes128cbcDecryptDataWithKey(cipherOfLastBlock(block), key), std::nullopt)
                << last << " bytes, byte " << wrong << " from the end changed";
        }
    }
}

TEST(AesTransform, BlockOfZerosIsNotPadding) {
    EXPECT_EQ(aes128cbcDecryptDataWithKey(cipherOfLastBlock(Data(16, 0)), key), std::nullopt);
}

TEST(AesTransform, KeyOfTenBytesDoesNotDecryptWhatAGoodKeyEncrypted) {
    const Data cipher = *aes128cbcEncryptDataWithKey(plain(20), key);
    EXPECT_EQ(aes128cbcDecryptDataWithKey(cipher, Data(key.begin(), key.begin() + 10)), std::nullopt);
    calls.clear();
    EXPECT_EQ(cryptedData(adminhost::kCCDecrypt, cipher, Data(key.begin(), key.begin() + 10), initialisationVector(),
                          countedCrypt),
              std::nullopt);
    ASSERT_EQ(calls.size(), 1U);
    EXPECT_EQ(calls[0].status, adminhost::kCCParamError) << "the library refuses the key, not the padding";
}

TEST(AesTransform, ChangedBitNeverGivesTheTextBack) {
    const Data cipher = *aes128cbcEncryptDataWithKey(plain(40), key);
    for (std::size_t bit = 0; bit < cipher.size() * 8; ++bit) {
        Data changed = cipher;
        changed[bit / 8] ^= static_cast<std::uint8_t>(1U << (bit % 8));
        EXPECT_NE(aes128cbcDecryptDataWithKey(changed, key), plain(40));
    }
}

TEST(AesTransform, KeysOf16And24And32BytesWorkAndNoOthers) {
    for (std::size_t length = 0; length <= 64; ++length) {
        const Data someKey = plain(length);
        const bool works = length == 16 || length == 24 || length == 32;
        EXPECT_EQ(aes128cbcEncryptDataWithKey(plain(20), someKey).has_value(), works) << length;
        if (works) {
            EXPECT_EQ(aes128cbcDecryptDataWithKey(*aes128cbcEncryptDataWithKey(plain(20), someKey), someKey),
                      plain(20));
        } else {
            EXPECT_EQ(aes128cbcDecryptDataWithKey(Data(32), someKey), std::nullopt);
        }
    }
}

TEST(AesTransform, EqualTextsUnderEqualKeysGiveEqualCipherTexts) {
    EXPECT_EQ(aes128cbcEncryptDataWithKey(plain(300), key), aes128cbcEncryptDataWithKey(plain(300), key));
    EXPECT_NE(aes128cbcEncryptDataWithKey(plain(300), key), aes128cbcEncryptDataWithKey(plain(300), plain(16)));
}

}  // namespace
}  // namespace lumio
