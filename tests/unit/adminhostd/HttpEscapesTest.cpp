#include "adminhostd/HttpHead.h"

#include <string>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

/// The text as the server decodes it in place.
std::string decoded(std::string text) {
    text.resize(decodeEscapes(nullptr, nullptr, text.data()));
    return text;
}

TEST(DecodeEscapes, DecodesTwoDigitsOfEitherCase) {
    EXPECT_EQ(decoded("/a%2Fb%2fc%41"), "/a/b/cA");
    EXPECT_EQ(decoded("%C3%a4%01"), "\xC3\xA4\x01");
    EXPECT_EQ(decoded("%2541"), "%41") << "once";
    EXPECT_EQ(decoded(""), "");
}

TEST(DecodeEscapes, LeavesWhatIsNotAnEscapeAndNeverMakesANul) {
    for (const char* text : {"%", "%4", "%g1", "%1g", "%%", "% 1", "%+1", "%-1", "%0x", "%00", "a%00b"}) {
        EXPECT_EQ(decoded(text), text);
    }
}

}  // namespace
}  // namespace adminhost
