#include "codec/Base64.h"
#include "tests/support/CapturedLog.h"

#include <random>

#include <gtest/gtest.h>

namespace lumio {
namespace {

using adminhost::Data;
using adminhost::test::CapturedLog;

Data bytes(std::string_view text) {
    return {text.begin(), text.end()};
}
std::string text(const Data& data) {
    return {data.begin(), data.end()};
}
std::string encoded(std::string_view plain) {
    return text(LumioUtilities_encodeBase64(bytes(plain)));
}
std::string decoded(std::string_view coded) {
    return text(LumioUtilities_decodeBase64(bytes(coded)));
}
bool isValid(std::string_view coded) {
    return LumioUtilities_isValidBase64Data(bytes(coded));
}

Data randomBytes(std::size_t length, unsigned seed = 1) {
    std::mt19937 random(seed);
    Data data(length);
    for (std::uint8_t& byte : data) {
        byte = static_cast<std::uint8_t>(random());
    }
    return data;
}

/// The encoder's rules one byte at a time, as a reference for the real one.
std::string encodedByTheRules(const Data& data, bool lineBreaks, bool standard, char pad) {
    std::string alphabet(base64Alphabet);
    if (!standard) {
        alphabet[63] = ',';
    }
    std::string out;
    std::size_t counter = 0;
    for (std::size_t i = 0; i < data.size(); ++i) {
        const unsigned previous = i > 0 ? data[i - 1] : 0;
        const unsigned both = (previous << 8U) | data[i];
        if (i % 3 == 0) {
            out += alphabet[data[i] >> 2U];
            counter += 1;
        } else if (i % 3 == 1) {
            out += alphabet[(both >> 4U) & 63U];
            counter += 1;
        } else {
            out += alphabet[(both >> 6U) & 63U];
            out += alphabet[data[i] & 63U];
            counter += 2;
        }
        if (lineBreaks && counter >= 76) {
            out += '\n';
            counter = 0;
        }
    }
    if (data.size() % 3 == 1) {
        out += alphabet[(static_cast<unsigned>(data.back()) << 4U) & 0x30U];
        out.append(pad == 0 ? 0 : 2, pad);
    } else if (data.size() % 3 == 2) {
        out += alphabet[(static_cast<unsigned>(data.back()) << 2U) & 0x3CU];
        out.append(pad == 0 ? 0 : 1, pad);
    }
    return out;
}

TEST(Base64Encoder, KnownVectorsComeOut) {
    EXPECT_EQ(encoded(""), "");
    EXPECT_EQ(encoded("f"), "Zg==");
    EXPECT_EQ(encoded("fo"), "Zm8=");
    EXPECT_EQ(encoded("foo"), "Zm9v");
    EXPECT_EQ(encoded("foob"), "Zm9vYg==");
    EXPECT_EQ(encoded("fooba"), "Zm9vYmE=");
    EXPECT_EQ(encoded("foobar"), "Zm9vYmFy");
}

TEST(Base64Encoder, FiftySevenBytesGiveOneFullLineAndItsLineFeed) {
    const std::string out = encoded(std::string(57, 'x'));
    EXPECT_EQ(out.size(), 77U);
    EXPECT_EQ(out.find('\n'), 76U);
}

TEST(Base64Encoder, FiftyEightBytesGiveALineAndOneGroupWithoutAFinalLineFeed) {
    const std::string out = encoded(std::string(58, 'x'));
    EXPECT_EQ(out.size(), 81U);
    EXPECT_EQ(out.find('\n'), 76U);
    EXPECT_EQ(out.substr(77), "eA==");
}

TEST(Base64Encoder, EveryPositiveMultipleOfFiftySevenEndsInALineFeed) {
    for (std::size_t lines = 1; lines < 20; ++lines) {
        EXPECT_EQ(encoded(std::string(57 * lines, 'x')).back(), '\n');
        EXPECT_NE(encoded(std::string(57 * lines - 1, 'x')).back(), '\n');
        EXPECT_NE(encoded(std::string(57 * lines + 3, 'x')).back(), '\n');
    }
}

TEST(Base64Encoder, OneByteGivesTwoPadsAndTwoBytesGiveOne) {
    EXPECT_EQ(encoded("A"), "QQ==");
    EXPECT_EQ(encoded("AB"), "QUI=");
}

TEST(Base64Encoder, WithoutLineBreaksNoLengthHasALineFeed) {
    for (std::size_t length = 0; length < 400; ++length) {
        const std::string out = text(LumioUtilities_encodeBase64WithoutLineBreaks(randomBytes(length)));
        EXPECT_EQ(out.find('\n'), std::string::npos);
        EXPECT_EQ(out.size(), (length + 2) / 3 * 4);
    }
}

TEST(Base64Encoder, AgreesWithTheRulesAtEveryLengthAndOption) {
    for (std::size_t length = 0; length < 400; ++length) {
        const Data data = randomBytes(length, static_cast<unsigned>(length));
        for (const bool lineBreaks : {true, false}) {
            for (const bool standard : {true, false}) {
                for (const char pad : {'=', '\0', '*'}) {
                    const Data out = encodeBase64Data(data, {.lineBreaks = lineBreaks,
                                                             .standardAlphabet = standard,
                                                             .pad = static_cast<std::uint8_t>(pad)});
                    ASSERT_EQ(text(out), encodedByTheRules(data, lineBreaks, standard, pad)) << length;
                }
            }
        }
    }
}

TEST(Base64Encoder, OtherAlphabetWritesACommaForEverySlash) {
    EXPECT_EQ(text(encodeBase64Data(Data(30, 0xFF), {.standardAlphabet = false})), std::string(40, ','));
    EXPECT_EQ(text(encodeBase64Data(Data{0xFF}, {.standardAlphabet = false})), ",w==");
    EXPECT_EQ(text(encodeBase64Data(Data{0xFF, 0xFF}, {.standardAlphabet = false})), ",,8=");
}

TEST(Base64Encoder, OtherAlphabetLeavesThePadAsItIs) {
    EXPECT_EQ(text(encodeBase64Data(Data{0xFF}, {.standardAlphabet = false, .pad = '/'})), ",w//");
}

TEST(Base64Encoder, PadZeroWritesNoPads) {
    EXPECT_EQ(text(encodeBase64Data(bytes("A"), {.pad = 0})), "QQ");
    EXPECT_EQ(text(encodeBase64Data(bytes("AB"), {.pad = 0})), "QUI");
}

TEST(Base64Encoder, StringIsTheWrappedText) {
    for (std::size_t length = 0; length < 400; ++length) {
        const Data data = randomBytes(length, static_cast<unsigned>(length));
        ASSERT_EQ(base64EncodedString(data), encodedByTheRules(data, true, true, '='));
    }
    const Data large = randomBytes(100000);
    EXPECT_EQ(base64EncodedString(large), text(LumioUtilities_encodeBase64(large)));
    EXPECT_EQ(base64EncodedString({}), "");
}

bool growthFails(Data& /*bytes*/, std::size_t /*capacity*/) noexcept {
    return false;
}

TEST(ByteBuffer, DropsBytesAndLogsEachWhenItCannotGrow) {
    CapturedLog log;
    ByteBuffer buffer(2, {.reserve = growthFails});
    for (const char c : {'a', 'b', 'c', 'd'}) {
        buffer.append(static_cast<std::uint8_t>(c));
    }
    char expected[96];
    std::snprintf(expected, sizeof expected, "Cannot append any more bytes to buffer at %p.",
                  static_cast<void*>(&buffer));
    EXPECT_EQ(log.lines, (std::vector<std::string>{expected, expected}));
    EXPECT_EQ(text(std::move(buffer).take()), "ab");
}

TEST(ByteBuffer, GrowsToTwiceItsLengthUntilTheLimitIsReached) {
    CapturedLog log;
    ByteBuffer buffer(4, {.limit = 8});
    for (int i = 0; i < 10; ++i) {
        buffer.append('x');
    }
    EXPECT_EQ(log.lines.size(), 2U);
    EXPECT_EQ(std::move(buffer).take().size(), 8U);
}

TEST(ByteBuffer, HandsItsBytesOverWithoutACopy) {
    ByteBuffer buffer(16);
    const std::uint8_t* place = buffer.extend(3);
    const Data taken = std::move(buffer).take();
    EXPECT_EQ(taken.data(), place);
    EXPECT_EQ(taken.size(), 3U);
}

TEST(ByteBuffer, SurvivesACapacityThatCannotBeHad) {
    CapturedLog log;
    ByteBuffer buffer(static_cast<std::size_t>(-1));
    buffer.append('x');
    EXPECT_EQ(log.lines.size(), 1U);
    EXPECT_TRUE(std::move(buffer).take().empty());
}

TEST(Base64Encoder, GoesOnWithAShortenedTextWhenTheBufferIsFull) {
    CapturedLog log;
    // 58 bytes start with room for 77 characters; 81 would be written.
    const Data data = randomBytes(58);
    const std::string out = text(encodeBase64Data(data, {.growth = {.reserve = growthFails}}));
    EXPECT_EQ(out, encodedByTheRules(data, true, true, '=').substr(0, 77));
    EXPECT_EQ(log.lines.size(), 4U);
}

TEST(Base64Encoder, ShortenedTextIsTheBeginningOfTheWholeAtEveryLength) {
    for (const bool standard : {true, false}) {
        for (std::size_t length = 1; length < 300; ++length) {
            CapturedLog log;
            const Data data = randomBytes(length);
            const std::string whole = encodedByTheRules(data, true, standard, '=');
            const std::string out =
                text(encodeBase64Data(data, {.standardAlphabet = standard, .growth = {.reserve = growthFails}}));
            ASSERT_EQ(out, whole.substr(0, std::max<std::size_t>(1, 4 * length / 3)));
            ASSERT_EQ(log.lines.size(), whole.size() - out.size());
        }
    }
}

TEST(Base64Encoder, LongTextIsShortenedOnlyAtItsEndToo) {
    for (const bool lineBreaks : {true, false}) {
        for (const std::size_t length : {3071U, 3073U, 6144U, 6145U, 20000U}) {
            CapturedLog log;
            const Data data = randomBytes(length);
            const std::string whole = encodedByTheRules(data, lineBreaks, true, '=');
            const std::string out =
                text(encodeBase64Data(data, {.lineBreaks = lineBreaks, .growth = {.reserve = growthFails}}));
            ASSERT_EQ(out, whole.substr(0, 4 * length / 3)) << length;
            ASSERT_EQ(log.lines.size(), whole.size() - out.size());
        }
    }
}

TEST(Base64Decoder, TableHasTheClassesOfEveryByte) {
    EXPECT_EQ(base64DecodeTable['A'], 0);
    EXPECT_EQ(base64DecodeTable['/'], 63);
    EXPECT_EQ(base64DecodeTable['='], -5);
    EXPECT_EQ(base64DecodeTable[' '], -4);
    EXPECT_EQ(base64DecodeTable['\t'], -4);
    EXPECT_EQ(base64DecodeTable['\r'], -3);
    EXPECT_EQ(base64DecodeTable['\n'], -2);
    for (const char invalid : {',', '-', '_', '\0', '\v', '\f', '\x7F', '"'}) {
        EXPECT_EQ(base64DecodeTable[static_cast<std::size_t>(invalid)], -1);
    }
}

TEST(Base64Decoder, KnownVectorsComeBack) {
    EXPECT_EQ(decoded(""), "");
    EXPECT_EQ(decoded("Zg=="), "f");
    EXPECT_EQ(decoded("Zm8="), "fo");
    EXPECT_EQ(decoded("Zm9v"), "foo");
    EXPECT_EQ(decoded("Zm9vYg=="), "foob");
    EXPECT_EQ(decoded("Zm9vYmE="), "fooba");
    EXPECT_EQ(decoded("Zm9vYmFy"), "foobar");
    EXPECT_EQ(text(base64DecodedData("Zm9vYmFy")), "foobar");
}

TEST(Base64Decoder, LineEndsBetweenLinesAreNotCopied) {
    EXPECT_EQ(decoded("QUJD\r\nREVG"), "ABCDEF");
    EXPECT_EQ(decoded("QUJD\nREVG\n"), "ABCDEF");
    EXPECT_EQ(decoded("QUJD\rREVG\r"), "ABCDEF");
}

TEST(Base64Decoder, TrailingBlanksEndTheDataPart) {
    EXPECT_EQ(decoded("QUJD  \n"), "ABC");
    EXPECT_EQ(decoded("QUJD\t \tREVG"), "QUJD\t \tREVG");
    EXPECT_EQ(decoded("QUI=  \r\nREVG"), "ABDEF");
}

TEST(Base64Decoder, PlainWordsComeBackUnchanged) {
    EXPECT_EQ(decoded("hello world\n"), "hello world\n");
}

TEST(Base64Decoder, PadsEndTheData) {
    EXPECT_EQ(decoded("QUI="), "AB");
    EXPECT_EQ(decoded("QQ=="), "A");
    EXPECT_EQ(decoded("QQ="), "QQ=");
    EXPECT_EQ(decoded("Q==="), "Q===");
    EXPECT_EQ(decoded("===="), "====");
    EXPECT_EQ(decoded("=="), "==");
    EXPECT_EQ(decoded("QQ== ="), "QQ== =");
    EXPECT_EQ(decoded("QQ==QUJD"), "QQ==QUJD");
    EXPECT_EQ(decoded("QUJDQQ=="), "ABCA");
}

TEST(Base64Decoder, BytesAreReadAsTheirLowSevenBits) {
    EXPECT_EQ(decoded("\xC1\xC1\xC1\xC1"), decoded("AAAA"));
    EXPECT_EQ(decoded("QUJD\x8AREVG"), "ABCDEF");
    EXPECT_EQ(decoded("QUJD\x8D\x8AREVG"), "ABCDEF");
    EXPECT_EQ(decoded("QUJD\r\x8AREVG"), "ABCDEF");
    EXPECT_EQ(decoded("QUJD\xA0\x89\nREVG"), "ABCDEF");
    EXPECT_EQ(decoded("QQ\xBD\xBD"), "A");
    EXPECT_EQ(decoded("QUJ\xAC"), "QUJ\xAC");
}

TEST(Base64Decoder, EmptyAndBlankLinesGiveNothing) {
    EXPECT_EQ(decoded("\n"), "");
    EXPECT_EQ(decoded("\r\n"), "");
    EXPECT_EQ(decoded("\r"), "");
    EXPECT_EQ(decoded(" \t \n"), "");
    EXPECT_EQ(decoded("   "), "");
    EXPECT_EQ(decoded("QUJD\n\n \r\n\rREVG"), "ABCDEF");
}

TEST(Base64Decoder, LineThatBeginsWithABlankComesBackUnchanged) {
    EXPECT_EQ(decoded(" QUJD\nREVG"), " QUJD\nDEF");
    EXPECT_EQ(decoded("\tQUJD"), "\tQUJD");
}

TEST(Base64Decoder, LineOfAWrongLengthComesBackWithItsLineEnd) {
    EXPECT_EQ(decoded("QUJDR\r\nREVG"), "QUJDR\r\nDEF");
    EXPECT_EQ(decoded("QUJDRE\rREVG"), "QUJDRE\rDEF");
    EXPECT_EQ(decoded("QUJDREV\nREVG"), "QUJDREV\nDEF");
    EXPECT_EQ(decoded("QUJDREV  \nREVG"), "QUJDREV  \nDEF");
}

TEST(Base64Decoder, InvalidCharacterLateInALineTakesTheWholeLineBack) {
    EXPECT_EQ(decoded("QUJDREVGQUJDREVG-UJD\nQUJD"), "QUJDREVGQUJDREVG-UJD\nABC");
    EXPECT_EQ(decoded("QUJDREVGQUJDREVG,\n"), "QUJDREVGQUJDREVG,\n");
}

TEST(Base64Decoder, ManyRawLinesBeforeDecodedOnesFit) {
    std::string in;
    std::string out;
    for (int i = 0; i < 500; ++i) {
        in += "no base64!\nQUJDREVG\n";
        out += "no base64!\nABCDEF";
    }
    EXPECT_EQ(decoded(in), out);
}

TEST(Base64Decoder, RemainderOfOneCharacterIsOnlyLogged) {
    CapturedLog log;
    std::uint8_t out[3];
    EXPECT_EQ(decodeRemainder(bytes("/"), 5, out), out);
    EXPECT_EQ(log.lines, std::vector<std::string>{"*** _decodeBase64Data: i=5, k=3f"});
}

TEST(Base64Decoder, WhatWasEncodedComesBackAtEveryLength) {
    for (std::size_t length = 0; length < 500; ++length) {
        const Data data = randomBytes(length, static_cast<unsigned>(length));
        ASSERT_EQ(LumioUtilities_decodeBase64(LumioUtilities_encodeBase64(data)), data);
        ASSERT_EQ(LumioUtilities_decodeBase64(LumioUtilities_encodeBase64WithoutLineBreaks(data)), data);
    }
}

/// The decoder's rules, one line and one byte at a time.
std::string decodedByTheRules(const std::string& in) {
    const auto classOf = [](char c) { return base64DecodeTable[static_cast<unsigned char>(c) & 0x7FU]; };
    std::string out;
    for (std::size_t at = 0; at < in.size();) {
        bool valid = true;
        std::size_t pads = 0;
        std::size_t blank = std::string::npos;
        std::size_t i = at;
        for (; i < in.size() && classOf(in[i]) != -2 && classOf(in[i]) != -3; ++i) {
            const int c = classOf(in[i]);
            if (c >= 0) {
                valid = valid && blank == std::string::npos && pads == 0;
            } else if (c == -5) {
                ++pads;
                valid = valid && blank == std::string::npos && pads < 3;
            } else if (c == -4) {
                blank = blank == std::string::npos ? i : blank;
            } else {
                valid = false;
            }
        }
        std::size_t next = std::min(i + 1, in.size());
        if (i < in.size() && classOf(in[i]) == -3 && next < in.size() && classOf(in[next]) == -2) {
            ++next;
        }
        const std::size_t dataEnd = valid && blank != std::string::npos ? blank : i;
        if (valid && (dataEnd - at) % 4 == 0) {
            unsigned bits = 0;
            unsigned count = 0;
            for (std::size_t k = at; k < dataEnd - pads; ++k) {
                bits = (bits << 6U) | static_cast<unsigned>(classOf(in[k]));
                count += 6;
                if (count >= 8) {
                    count -= 8;
                    out += static_cast<char>(bits >> count);
                }
            }
        } else {
            out += in.substr(at, next - at);
        }
        at = next;
    }
    return out;
}

TEST(Base64Decoder, AgreesWithTheRulesOnRandomTexts) {
    const std::string mostly = "QUJDREVGabcd0123+/QUJDREVG==  \t\r\n\n,\x8A\x8D\xA0\xBD\xC1";
    std::mt19937 random(7);
    for (int round = 0; round < 30000; ++round) {
        std::string in;
        const std::size_t length = random() % 40;
        for (std::size_t i = 0; i < length; ++i) {
            in += mostly[random() % (random() % 3 == 0 ? mostly.size() : 22)];
        }
        ASSERT_EQ(decoded(in), decodedByTheRules(in)) << in;
    }
}

TEST(Base64Test, StrictTestPassesWholeUnbrokenTextOnly) {
    EXPECT_TRUE(isValid(""));
    EXPECT_TRUE(isValid("QUJD"));
    EXPECT_TRUE(isValid("QUI="));
    EXPECT_TRUE(isValid("QQ=="));
    EXPECT_TRUE(isValid("+/+/"));
    EXPECT_FALSE(isValid("QUJD\n"));
    EXPECT_FALSE(isValid("QQ=A"));
    EXPECT_FALSE(isValid("QUJ"));
    EXPECT_FALSE(isValid("Q==="));
    EXPECT_FALSE(isValid("QUJD REV"));
    EXPECT_FALSE(isValid("QUJ\xC1"));
    EXPECT_FALSE(isValid("QUJ,"));
    EXPECT_FALSE(isValid("QUJ-"));
    EXPECT_FALSE(isValid("QUJDQQ\xBD\xBD"));
}

TEST(ObjectsWithAndForKeys, KeepsTheKeysThatHaveAValueInTheirOrder) {
    const adminhost::Dictionary dictionary{{"C", 3}, {"A", 1}, {"D", 4}};
    const std::vector<std::string> keys{"A", "B", "C"};
    const auto found = objectsWithAndForKeys(dictionary, &keys);
    ASSERT_TRUE(found);
    EXPECT_EQ(*found, (adminhost::Dictionary{{"A", 1}, {"C", 3}}));
    EXPECT_EQ(found->begin()->key, "A");
}

TEST(ObjectsWithAndForKeys, EmptyKeysGiveAnEmptyDictionaryAndNullKeysNothing) {
    const adminhost::Dictionary dictionary{{"A", 1}};
    const std::vector<std::string> none;
    EXPECT_EQ(objectsWithAndForKeys(dictionary, &none), adminhost::Dictionary());
    EXPECT_EQ(objectsWithAndForKeys(dictionary, nullptr), std::nullopt);
}

}  // namespace
}  // namespace lumio
