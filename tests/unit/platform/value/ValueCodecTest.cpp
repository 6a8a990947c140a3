#include "platform/value/ValueCodec.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

std::string encoded(const Value& value) {
    std::string bytes;
    encodeValue(value, bytes);
    return bytes;
}

Value sample() {
    Dictionary many;
    for (int i = 0; i < 200; ++i) {
        many.set("key" + std::to_string(i), i);
    }
    return Dictionary{{"no", false},
                      {"yes", true},
                      {"least", INT64_MIN},
                      {"most", UINT64_MAX},
                      {"real", -0.1},
                      {"text", std::string(300, 'x') + std::string("\0é", 3)},
                      {"date", Date(std::chrono::seconds(-1))},
                      {"data", Data{0, 255, 128}},
                      {"list", Array{Value(), Value(Array{}), Value(Dictionary{}), Value("")}},
                      {"", std::move(many)}};
}

TEST(ValueCodec, GivesBackEveryValueInItsOrder) {
    const Value value = sample();
    const auto back = decodeValue(encoded(value));
    ASSERT_TRUE(back);
    EXPECT_EQ(*back, value);
    EXPECT_EQ(back->dictionary()->begin()->key, "no");
    EXPECT_EQ(decodeValue(encoded(Value())), Value());
}

TEST(ValueCodec, RefusesBytesThatAreCutOffAtAnyPlace) {
    const std::string bytes = encoded(sample());
    for (std::size_t length = 0; length < bytes.size(); ++length) {
        EXPECT_FALSE(decodeValue(std::string_view(bytes).substr(0, length))) << length;
    }
}

TEST(ValueCodec, RefusesBytesAfterTheValue) {
    EXPECT_FALSE(decodeValue(encoded(Value(1)) + '\0'));
}

TEST(ValueCodec, SurvivesEveryChangedByte) {
    const std::string bytes = encoded(sample());
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        for (const char change : {'\x01', '\x80', '\xff'}) {
            std::string changed = bytes;
            changed[i] = static_cast<char>(changed[i] ^ change);
            const auto value = decodeValue(changed);
            // An accepted value can be written again.
            EXPECT_TRUE(!value || decodeValue(encoded(*value)).has_value()) << i;
        }
    }
}

TEST(ValueCodec, RefusesNestingBeyondItsBound) {
    const auto nested = [](std::size_t depth) {
        Value value = Array{};
        for (std::size_t i = 1; i < depth; ++i) {
            Array outer;
            outer.push_back(std::move(value));
            value = std::move(outer);
        }
        return value;
    };
    EXPECT_TRUE(decodeValue(encoded(nested(codecMaximumDepth))));
    EXPECT_FALSE(decodeValue(encoded(nested(codecMaximumDepth + 1))));
    std::string bomb;
    for (int i = 0; i < 1'000'000; ++i) {
        bomb += "\x09\x01";
    }
    EXPECT_FALSE(decodeValue(bomb));
}

TEST(ValueCodec, RefusesACountThatTheBytesCannotHold) {
    EXPECT_FALSE(decodeValue("\x09\xff\xff\xff\xff\x0f"));
    EXPECT_FALSE(decodeValue("\x06\xff\xff\xff\xff\x0f"));
    EXPECT_FALSE(decodeValue("\x06\xff\xff\xff\xff\xff\xff\xff\xff\xff\x01"));
}

TEST(ValueCodec, RefusesRepeatedAndNullEntriesOfADictionary) {
    EXPECT_TRUE(
        decodeValue(std::string("\x0a\x02\x01"
                                "a\x01\x01"
                                "b\x01")));
    EXPECT_FALSE(
        decodeValue(std::string("\x0a\x02\x01"
                                "a\x01\x01"
                                "a\x01")));
    EXPECT_FALSE(
        decodeValue(std::string("\x0a\x01\x01"
                                "a\0",
                                5)));
}

TEST(ValueCodec, RefusesAnUnknownTag) {
    EXPECT_FALSE(decodeValue("\x0b"));
}

}  // namespace
}  // namespace adminhost
