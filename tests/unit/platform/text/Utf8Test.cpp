#include "platform/text/Utf8.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

TEST(Utf8, WellFormedTextPassesAndEachOffendingByteIsReplaced) {
    EXPECT_TRUE(isUtf8("a\xC3\xA0\xE2\x82\xAC\xF0\x9F\x98\x80"));
    for (const char* bad : {"\x80", "\xC0\xAF", "\xED\xA0\x80", "\xF4\x90\x80\x80", "\xE2\x82", "\xFF"}) {
        EXPECT_FALSE(isUtf8(bad));
    }
    EXPECT_EQ(utf8Of("a\xFFz"), "a\xEF\xBF\xBDz");
    EXPECT_EQ(utf8Of("\xE2\x82"), "\xEF\xBF\xBD\xEF\xBF\xBD");
    EXPECT_EQ(utf8Of("\xC3\xA0"), "\xC3\xA0");
}

TEST(Utf8, FirstCharacterIsReadWithItsSize) {
    EXPECT_EQ(firstCharacterOf("az").code, U'a');
    const Utf8Character euro = firstCharacterOf("\xE2\x82\xACz");
    EXPECT_EQ(euro.code, U'\u20AC');
    EXPECT_EQ(euro.size, 3U);
    EXPECT_TRUE(euro.wellFormed);
    for (const char* bad : {"\xE2\x82", "\xFFz", "\x80"}) {
        const Utf8Character character = firstCharacterOf(bad);
        EXPECT_EQ(character.code, U'\uFFFD');
        EXPECT_EQ(character.size, 1U);
        EXPECT_FALSE(character.wellFormed);
    }
}

TEST(Utf8, EveryCharacterIsAppendedAsItIsRead) {
    for (char32_t code = 0; code <= 0x10FFFF; code += code < 0x900 ? 1 : 61) {
        if (code >= 0xD800 && code <= 0xDFFF) {
            continue;
        }
        std::string text;
        appendUtf8(text, code);
        const Utf8Character character = firstCharacterOf(text);
        ASSERT_EQ(character.code, code);
        ASSERT_EQ(character.size, text.size());
        ASSERT_TRUE(character.wellFormed);
    }
}

TEST(Utf16, IsReadUpToWhatIsNotWellFormed) {
    using namespace std::string_view_literals;
    EXPECT_EQ(utf8OfUtf16("\x00z\x20\xAC\xD8\x3D\xDE\x00"sv, true).text, "z\xE2\x82\xAC\xF0\x9F\x98\x80");
    EXPECT_EQ(utf8OfUtf16("z\x00\xAC\x20\x3D\xD8\x00\xDE"sv, false).text, "z\xE2\x82\xAC\xF0\x9F\x98\x80");
    for (const std::string_view bad : {"\x00z\xD8\x3D"sv, "\x00z\xD8\x3D\x00z"sv, "\x00z\xDE\x00\x00z"sv, "\x00zz"sv}) {
        const FromUtf16 converted = utf8OfUtf16(bad, true);
        EXPECT_EQ(converted.text, "z");
        EXPECT_EQ(converted.end, 2U);
    }
}

}  // namespace
}  // namespace adminhost
