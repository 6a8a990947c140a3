#include "platform/json/Json.h"

#include <cmath>
#include <limits>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

std::string problemOf(std::string_view text) {
    const auto value = parseJson(text);
    if (value) {
        return "accepted";
    }
    EXPECT_EQ(value.error().domain, "json");
    return value.error().description.value_or("");
}

Value valueOf(std::string_view text) {
    const auto value = parseJson(text);
    EXPECT_TRUE(value) << text << ": " << value.error().description.value_or("");
    return value.value_or(Value());
}

Date dateAt(std::int64_t seconds) {
    return Date(std::chrono::seconds(seconds));
}

TEST(JsonOf, WritesEachTypeAsDocumented) {
    EXPECT_EQ(jsonOf(Value()), "null");
    EXPECT_EQ(jsonOf(Value(true)), "true");
    EXPECT_EQ(jsonOf(Value(INT64_MIN)), "-9223372036854775808");
    EXPECT_EQ(jsonOf(Value(UINT64_MAX)), "18446744073709551615");
    EXPECT_EQ(jsonOf(Value(0.1)), "0.1");
    EXPECT_EQ(jsonOf(Value(1e300)), "1e+300");
    EXPECT_EQ(jsonOf(Value("a\"\\\n\t\r\x01\x7fé")), "\"a\\\"\\\\\\n\\t\\r\\u0001\\u007fé\"");
    EXPECT_EQ(jsonOf(Value(dateAt(1769846400))), R"({"$date":"2026-01-31T08:00:00Z"})");
    EXPECT_EQ(jsonOf(Value(Data{0, 1, 255, 3})), R"({"$data":"AAH/Aw=="})");
    EXPECT_EQ(jsonOf(Value(Array{Value(1), Value("b")})), R"([1,"b"])");
    EXPECT_EQ(jsonOf(Value(Dictionary{{"b", 1}, {"a", Array{}}, {"c", Dictionary{}}})), R"({"b":1,"a":[],"c":{}})");
}

TEST(JsonOf, PrettyTextHasOneEntryALine) {
    EXPECT_EQ(jsonOf(Value(Dictionary{{"a", Array{Value(1), Value(Dictionary{})}}, {"d", dateAt(0)}}), true),
              "{\n  \"a\": [\n    1,\n    {}\n  ],\n  \"d\": {\"$date\": \"1970-01-01T00:00:00Z\"}\n}");
}

TEST(JsonOf, RealWithoutFractionStaysReal) {
    EXPECT_EQ(jsonOf(Value(2.0)), "2.0");
    EXPECT_EQ(valueOf("2.0"), Value(2.0));
    EXPECT_EQ(valueOf("2"), Value(2));
    EXPECT_EQ(valueOf("2e0"), Value(2.0));
}

TEST(JsonOf, BytesThatAreNotUtf8BecomeReplacementCharacters) {
    EXPECT_EQ(jsonOf(Value("a\xff")), "\"a\xEF\xBF\xBD\"");
}

TEST(JsonOf, EveryCharacterIsWrittenTheSameWayWhereverItIs) {
    for (int code = 0; code < 0x80; ++code) {
        const char character = static_cast<char>(code);
        const std::string alone = jsonOf(std::string(1, character));
        EXPECT_EQ(alone == '"' + std::string(1, character) + '"',
                  code >= 0x20 && code < 0x7f && character != '"' && character != '\\');
        const std::string written = alone.substr(1, alone.size() - 2);
        for (std::size_t before = 0; before < 18; ++before) {
            for (const std::size_t behind : {0U, 3U, 8U}) {
                const std::string left(before, '!');
                const std::string right(behind, '~');
                EXPECT_EQ(jsonOf(left + character + right), '"' + left + written + right + '"');
            }
        }
    }
}

TEST(JsonRoundTrip, KeepsEveryValue) {
    const Value values[] = {
        Value(Dictionary{{"$", 1}, {"$date", "x"}, {"$$data", Array{Value(true)}}, {"", "empty"}}),
        Value(Array{Value(INT64_MIN), Value(INT64_MAX), Value(UINT64_MAX), Value(0), Value(-1)}),
        Value(Array{Value(0.0), Value(0.1), Value(-1e-300), Value(std::numeric_limits<double>::max())}),
        Value(Array{Value(std::numeric_limits<double>::infinity()), Value(-std::numeric_limits<double>::infinity())}),
        Value(Array{Value(dateAt(0)), Value(dateAt(-1)), Value(dateAt(253402300799)), Value(dateAt(253402300800)),
                    Value(dateAt(-62167219201)), Value(dateAt(951782400))}),
        Value(Array{Value(Data{}), Value(Data{1}), Value(Data{1, 2}), Value(Data{1, 2, 3}),
                    Value(Data{255, 254, 253, 252})}),
        Value(std::string("a\0b\x1f\xF0\x9F\x8E\xAC", 8)),
    };
    for (const Value& value : values) {
        EXPECT_EQ(valueOf(jsonOf(value)), value) << jsonOf(value);
        EXPECT_EQ(valueOf(jsonOf(value, true)), value) << jsonOf(value, true);
    }
    EXPECT_TRUE(std::isnan(*valueOf(jsonOf(Value(std::nan("")))).real()));
}

TEST(ParseJson, KeepsTheOrderOfKeys) {
    EXPECT_EQ(jsonOf(valueOf(R"({"z":1,"a":2,"m":3})")), R"({"z":1,"a":2,"m":3})");
}

TEST(ParseJson, NullInADictionaryMeansThatTheKeyIsAbsent) {
    EXPECT_EQ(valueOf(R"({"a":null,"b":1})"), Value(Dictionary{{"b", 1}}));
    EXPECT_TRUE(valueOf("null").isNull());
}

TEST(ParseJson, NullInAListIsRefused) {
    EXPECT_EQ(problemOf("[1,null]"), "line 1, column 7: null is not allowed in a list");
}

TEST(ParseJson, KeyThatStandsTwiceIsRefused) {
    EXPECT_EQ(problemOf("{\"a\":1,\n \"a\":2}"), "line 2, column 4: the key \"a\" occurs twice");
    EXPECT_EQ(problemOf(R"({"a":null,"a":2})"), "line 1, column 13: the key \"a\" occurs twice");
    EXPECT_EQ(problemOf(R"({"a":2,"a":null})"), "line 1, column 10: the key \"a\" occurs twice");
    EXPECT_EQ(problemOf(R"({"$$a":2,"$$a":1})"), "line 1, column 14: the key \"$$a\" occurs twice");
    EXPECT_EQ(problemOf(R"({"a":2,"\u0061":1})"), "line 1, column 15: the key \"a\" occurs twice");
}

TEST(ParseJson, IntegersCoverTheWhole64BitRange) {
    EXPECT_EQ(valueOf("-9223372036854775808"), Value(INT64_MIN));
    EXPECT_EQ(valueOf("18446744073709551615"), Value(UINT64_MAX));
    EXPECT_EQ(valueOf("-0"), Value(0));
}

TEST(ParseJson, IntegerBeyond64BitsIsRefusedAndNotRounded) {
    EXPECT_NE(problemOf("[18446744073709551616]").find("the integer does not fit in 64 bits"), std::string::npos);
    EXPECT_NE(problemOf("[-9223372036854775809]").find("the integer does not fit in 64 bits"), std::string::npos);
}

TEST(ParseJson, RealBeyondItsRangeIsRefused) {
    EXPECT_NE(problemOf("[1e999]").find("number overflow"), std::string::npos);
}

TEST(ParseJson, DatesMustBeRealOnesInTheOneForm) {
    EXPECT_EQ(valueOf(R"({"$date": "2024-02-29T23:59:59Z"})"), Value(dateAt(1709251199)));
    for (const char* text :
         {"2026-02-30T00:00:00Z", "2026-01-31 08:00:00", "2026-01-31T08:00:00", "2026-01-31T08:00:00+01:00",
          "2026-1-31T08:00:00Z", "2026-01-31T24:00:00Z", "2026-01-31T08:00:60Z", "", "yesterday",
          "+2026-01-31T08:00:00Z", "-99999999999-01-31T08:00:00Z", "2026-01-31T08:00:00Zx"}) {
        EXPECT_NE(problemOf(std::string(R"({"$date":")") + text + "\"}").find("a date is written as"),
                  std::string::npos)
            << text;
    }
}

TEST(ParseJson, DataMustBeCanonicalBase64) {
    EXPECT_EQ(valueOf(R"({"$data":""})"), Value(Data{}));
    for (const char* text : {"A", "AA", "AAA", "AA=", "A===", "AA==AA==", "AB==", "AA\\nAA", "AA-_", "===="}) {
        EXPECT_NE(problemOf(std::string(R"({"$data":")") + text + "\"}").find("data is written as"), std::string::npos)
            << text;
    }
}

TEST(ParseJson, WrappedFormsTakeOneTextAndStandAlone) {
    EXPECT_NE(problemOf(R"({"$date":1})").find("must be a text"), std::string::npos);
    EXPECT_NE(problemOf(R"({"$date":null})").find("must be a text"), std::string::npos);
    EXPECT_NE(problemOf(R"({"$date":{}})").find("must be a text"), std::string::npos);
    EXPECT_NE(problemOf(R"({"$data":"","a":1})").find("only key"), std::string::npos);
    EXPECT_NE(problemOf(R"({"a":1,"$data":""})").find("only key"), std::string::npos);
    EXPECT_NE(problemOf(R"({"a":null,"$data":""})").find("only key"), std::string::npos);
    EXPECT_NE(problemOf(R"({"$real":"much"})").find("$real"), std::string::npos);
}

TEST(ParseJson, SingleDollarKeyIsRefused) {
    EXPECT_NE(problemOf(R"({"$other":1})").find("second \"$\""), std::string::npos);
}

TEST(ParseJson, NestingIsBoundedAt512) {
    const auto nested = [](std::size_t depth) { return std::string(depth, '[') + std::string(depth, ']'); };
    EXPECT_TRUE(parseJson(nested(512)));
    EXPECT_NE(problemOf(nested(513)).find("line 1, column 513: lists and dictionaries are nested"), std::string::npos);
    EXPECT_FALSE(parseJson(std::string(5'000'000, '[')));
}

TEST(ParseJson, NumberOfValuesIsBoundedByTheCaller) {
    // Every list, dictionary, form, null and single value counts once.
    const std::string text = R"({"a":[1,true],"b":null,"c":{"$date":"2026-01-31T08:00:00Z"}})";
    const auto codeOf = [](std::string_view json, std::size_t maximum) {
        const auto value = parseJson(json, maximum);
        return value ? 0 : value.error().code;
    };
    EXPECT_TRUE(parseJson(text, 6));
    const auto tooMany = parseJson(text, 5);
    ASSERT_FALSE(tooMany);
    EXPECT_EQ(tooMany.error(), (Error{"json", jsonTooManyValues, "line 1, column 60: there are more than 5 values"}));
    EXPECT_EQ(codeOf(R"({"a":null,"b":null})", 1), jsonTooManyValues);
    EXPECT_EQ(codeOf("[1,]", 5), 1);
}

TEST(ParseJson, InvalidUtf8IsRefusedWithItsPlaceAndNotQuoted) {
    const std::string problem = problemOf("{\"a\":\n\"x\xff\"}");
    EXPECT_TRUE(problem.starts_with("line 2, column 3: ")) << problem;
    EXPECT_EQ(problem.find('\xff'), std::string::npos);
    for (const char* text : {"\"\xC0\xAF\"", "\"\xED\xA0\x80\"", "\"\xF4\x90\x80\x80\"", "\"\xE2\x82\""}) {
        EXPECT_FALSE(parseJson(text)) << text;
    }
    EXPECT_FALSE(parseJson("\"\\ud800\""));
}

TEST(ParseJson, ColumnsCountCharacters) {
    EXPECT_TRUE(problemOf("[\"é€\", x]").starts_with("line 1, column 8: ")) << problemOf("[\"é€\", x]");
}

TEST(ParseJson, OnlyWhiteSpaceMayFollowTheValue) {
    using namespace std::string_view_literals;
    EXPECT_TRUE(parseJson("{\"a\":1} \t\r\n"));
    for (const std::string_view text : {"{\"a\":1}\0"sv, "{\"a\":1}\0{\"b\":2}"sv, "{\"a\":1} \0 "sv, "1\0"sv,
                                        "\0{\"a\":1}"sv, "{\"a\":1}x"sv, "{\"a\":1}{}"sv, "{\"a\0\":1}"sv}) {
        EXPECT_FALSE(parseJson(text)) << text;
    }
    EXPECT_EQ(problemOf("{\"a\":\n1}\0{}"sv), "line 2, column 3: only white space may follow the value");
}

TEST(ParseJson, BrokenSyntaxIsRefusedWithItsPlace) {
    EXPECT_TRUE(problemOf("").starts_with("line 1, column 1: "));
    EXPECT_TRUE(problemOf("{\n\"a\": }").starts_with("line 2, column 6: "));
    EXPECT_TRUE(problemOf("{} x").starts_with("line 1, column 4: "));
    for (const char* text :
         {"{", "[", "[1,]", "{\"a\"}", "{a:1}", "tru", "01", "1.", "'a'", "\"a", "\"\n\"", "// x\n1", "NaN"}) {
        EXPECT_FALSE(parseJson(text)) << text;
    }
}

TEST(ParseJson, MessagesDoNotQuoteWhatWasSent) {
    EXPECT_EQ(problemOf("{\"password\":\"hunter2\n\"}").find("hunter2"), std::string::npos);
}

}  // namespace
}  // namespace adminhost
