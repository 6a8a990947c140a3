#include "platform/text/Base64Text.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

using Bytes = std::vector<std::uint8_t>;

Bytes bytesOf(std::string_view text) {
    return {text.begin(), text.end()};
}

TEST(Base64Text, IsTheStandardsOwnExamples) {
    const std::pair<std::string_view, std::string_view> examples[] = {{"", ""},
                                                                      {"f", "Zg=="},
                                                                      {"fo", "Zm8="},
                                                                      {"foo", "Zm9v"},
                                                                      {"foob", "Zm9vYg=="},
                                                                      {"fooba", "Zm9vYmE="},
                                                                      {"foobar", "Zm9vYmFy"}};
    for (const auto& [plain, text] : examples) {
        EXPECT_EQ(base64TextOf(bytesOf(plain)), text);
        EXPECT_EQ(bytesOfBase64Text(text), bytesOf(plain));
    }
}

TEST(Base64Text, NoOtherTextIsRead) {
    for (const char* text :
         {"Z",        "Zg",   "Zg=",  "Zg===", "=",      "==",        "====",       "Zm9v=",    "Zm9vYg=",
          "Zg==Zg==", "Zm=v", "Z===", " Zm9",  "Zm9v\n", "Zm9v\nZm9", "\nZm9v\n  ", "    Zm9v", "Zm9v    ",
          "Zh==",     "Zm9=", "Zm-v", "Zm_v",  "Zm9-",   "----",      "Zm9\xC3"}) {
        EXPECT_FALSE(bytesOfBase64Text(text)) << text;
    }
    EXPECT_FALSE(bytesOfBase64Text(std::string_view("Zm\0v", 4)));
}

TEST(Base64Text, TextsBeyondOnePieceAreReadBack) {
    for (const std::size_t size : {3'145'727U, 3'145'728U, 3'145'729U, 7'000'000U}) {
        Bytes bytes(size);
        std::uint32_t state = 1;
        for (std::uint8_t& byte : bytes) {
            state = state * 1664525U + 1013904223U;
            byte = static_cast<std::uint8_t>(state >> 24U);
        }
        const std::string text = base64TextOf(bytes);
        EXPECT_EQ(text.size(), (size + 2) / 3 * 4);
        EXPECT_EQ(text.find('\0'), std::string::npos);
        EXPECT_TRUE(bytesOfBase64Text(text) == bytes) << size;
    }
}

}  // namespace
}  // namespace adminhost
