#include "tests/unit/platform/plist/PlistTestSupport.h"

#include <chrono>
#include <cmath>
#include <limits>

namespace {

using namespace adminhost;
using namespace std::chrono;
using namespace std::string_literals;

std::string written(const Value& value) {
    const auto text = xmlPropertyList(value);
    EXPECT_TRUE(text) << text.error().description.value_or("");
    return text.value_or("");
}

std::string refusalOf(const Value& value) {
    const auto text = xmlPropertyList(value);
    if (text) {
        return "written";
    }
    EXPECT_EQ(text.error().domain, "propertyList");
    return text.error().description.value_or("");
}

void expectRoundTrip(const Value& value) {
    const auto read = parsePropertyList(written(value));
    ASSERT_TRUE(read) << written(value);
    EXPECT_EQ(*read, value) << written(value);
}

Value nested(int depth) {
    Value value(Array{});
    for (int i = 1; i < depth; ++i) {
        Array outer;
        outer.push_back(std::move(value));
        value = Value(std::move(outer));
    }
    return value;
}

class XmlWriterOracle : public PlistTest {};

TEST(XmlWriter, WritesThisText) {
    EXPECT_EQ(
        written(Dictionary{{"b", true},
                           {"i", -7},
                           {"r", 0.1},
                           {"s", "a<b>&\"c\""},
                           {"d", sys_seconds(sys_days(2026y / January / 31) + 8h)},
                           {"x", Data{0, 1, 255}},
                           {"a", Array{1, Dictionary{}, Array{}, false}}}),
        "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n"
        "\t<key>b</key>\n\t<true/>\n"
        "\t<key>i</key>\n\t<integer>-7</integer>\n"
        "\t<key>r</key>\n\t<real>0.1</real>\n"
        "\t<key>s</key>\n\t<string>a&lt;b&gt;&amp;\"c\"</string>\n"
        "\t<key>d</key>\n\t<date>2026-01-31T08:00:00Z</date>\n"
        "\t<key>x</key>\n\t<data>AAH/</data>\n"
        "\t<key>a</key>\n\t<array>\n\t\t<integer>1</integer>\n\t\t<dict/>\n\t\t<array/>\n\t\t<false/>\n\t</array>\n"
        "</dict>\n</plist>\n");
}

TEST(XmlWriter, IntegersOfTheWholeRangeComeBack) {
    for (const Value& value :
         {Value(INT64_MIN), Value(INT64_MAX), Value(UINT64_MAX), Value(9223372036854775808U), Value(0), Value(-1)}) {
        expectRoundTrip(value);
    }
}

TEST(XmlWriter, RealsComeBackExactly) {
    for (const double number : {0.1, -0.0, 1e300, 5e-324, std::numeric_limits<double>::max(), 1.0 / 3, HUGE_VAL,
                                -HUGE_VAL, 123456789012345680.0}) {
        expectRoundTrip(number);
    }
    EXPECT_NE(written(NAN).find("<real>nan</real>"), std::string::npos);
    EXPECT_NE(written(-NAN).find("<real>nan</real>"), std::string::npos);
}

TEST(XmlWriter, WholeRealStaysAReal) {
    EXPECT_EQ(parsePropertyList(written(2.0)), Value(2.0));
}

TEST(XmlWriter, TextsComeBackExactly) {
    for (const char* text : {"", " ", "\t\n", "\r", "a\r\nb", "à€😀", "]]>", "<![CDATA[x]]>", "&amp;",
                             "\u0085\u2028\u007F", "\uFFFD\uFDD0", "\xF4\x8F\xBF\xBF"}) {
        expectRoundTrip(text);
        expectRoundTrip(Dictionary{{text, text}});
    }
}

TEST(XmlWriter, DatesComeBack) {
    for (const auto day : {year(0) / January / 1, 1900y / February / 28, 1970y / January / 1, 2024y / February / 29,
                           9999y / December / 31}) {
        expectRoundTrip(sys_seconds(sys_days(day) + 86399s));
    }
}

TEST(XmlWriter, DataOfEveryLengthComesBack) {
    Data data;
    for (int i = 0; i < 300; ++i) {
        expectRoundTrip(data);
        data.push_back(static_cast<std::uint8_t>(i * 7));
    }
}

TEST(XmlWriter, NullIsRefusedWithItsKeyPath) {
    EXPECT_EQ(refusalOf(nullptr), "null cannot be written");
    EXPECT_EQ(refusalOf(Dictionary{{"a", Array{1, Dictionary{{"b", Array{Value()}}}}}}),
              "a.1.b.0: null cannot be written");
}

TEST(XmlWriter, CharactersThatXmlForbidsAreRefused) {
    EXPECT_EQ(refusalOf("a\0b"s), "text with the character U+0000 cannot be written");
    EXPECT_EQ(refusalOf("\x1F"), "text with the character U+001F cannot be written");
    EXPECT_EQ(refusalOf("\uFFFE"), "text with the character U+FFFE cannot be written");
    EXPECT_EQ(refusalOf(Dictionary{{"k", "x\uFFFF"}}), "k: text with the character U+FFFF cannot be written");
    EXPECT_EQ(refusalOf(Dictionary{{"k\x01", 1}}), "k\x01: text with the character U+0001 cannot be written");
    EXPECT_NE(refusalOf(Dictionary{{"k\0"s, 1}}), "");
}

TEST(XmlWriter, InvalidUtf8IsRefused) {
    EXPECT_EQ(refusalOf("\xFF"), "text that is not UTF-8 cannot be written");
    EXPECT_EQ(refusalOf("\xED\xA0\x80"), "text that is not UTF-8 cannot be written");
    EXPECT_EQ(refusalOf(Dictionary{{"\xC3", 1}}), "\uFFFD: text that is not UTF-8 cannot be written");
}

TEST(XmlWriter, DatesBeyondFourDigitsAreRefused) {
    EXPECT_EQ(refusalOf(sys_seconds(sys_days(year(10000) / 1 / 1))),
              "a date outside the years 0000 to 9999 cannot be written");
    EXPECT_EQ(refusalOf(sys_seconds(sys_days(year(0) / 1 / 1)) - 1s),
              "a date outside the years 0000 to 9999 cannot be written");
    EXPECT_EQ(refusalOf(sys_seconds::max()), "a date outside the years 0000 to 9999 cannot be written");
}

TEST(XmlWriter, Depth512IsWrittenAnd513IsRefused) {
    expectRoundTrip(nested(512));
    EXPECT_TRUE(refusalOf(nested(513)).ends_with(".0: nested more than 512 deep"));
}

TEST(XmlWriter, WhatCouldNotBeReadAgainForItsSizeIsRefused) {
    EXPECT_EQ(refusalOf(std::string(plistMaximumSize, 'x')), "larger than 67108864 bytes");
}

TEST_F(XmlWriterOracle, PlistlibReadsWhatIsWritten) {
    writeBytes("ours", written(Dictionary{{"i", INT64_MIN},
                                          {"u", UINT64_MAX},
                                          {"r", 0.1},
                                          {"n", -HUGE_VAL},
                                          {"s", "à<&>\r\n\t😀"},
                                          {"", true},
                                          {"d", sys_seconds(sys_days(2026y / January / 31) + 8h + 1s)},
                                          {"x", Data{0, 1, 255, 16}},
                                          {"a", Array{Array{}, Dictionary{}, false}}}));
    python(
        "value = plistlib.load(open(sys.argv[1], 'rb'))\n"
        "expected = {'i': -2**63, 'u': 2**64-1, 'r': 0.1, 'n': float('-inf'), 's': '\\u00e0<&>\\r\\n\\t\\U0001f600', "
        "'': True,\n"
        "  'd': datetime.datetime(2026, 1, 31, 8, 0, 1), 'x': bytes([0, 1, 255, 16]), 'a': [[], {}, False]}\n"
        "assert value == expected, value\n"
        "assert list(value) == list(expected), list(value)\n",
        {path("ours")});
}

TEST_F(XmlWriterOracle, WhatPlistlibWritesIsRead) {
    python(
        "plistlib.dump({'z': [1, -2**63, 2**64-1, 0.5, float('inf'), True, False, '\\u00e0 <&>', bytes(range(200)), "
        "{}, []],\n"
        "  'd': datetime.datetime(2024, 2, 29, 23, 59, 59)}, open(sys.argv[1], 'wb'), sort_keys=False)\n",
        {path("theirs")});
    Data data(200);
    for (std::size_t i = 0; i < data.size(); ++i) {
        data[i] = static_cast<std::uint8_t>(i);
    }
    const auto value = readPropertyList(DiskPath(path("theirs")));
    ASSERT_TRUE(value) << value.error().description.value_or("");
    EXPECT_EQ(*value, Value(Dictionary{{"z", Array{1, INT64_MIN, UINT64_MAX, 0.5, HUGE_VAL, true, false, "à <&>", data,
                                                   Dictionary{}, Array{}}},
                                       {"d", sys_seconds(sys_days(2024y / February / 29) + 23h + 59min + 59s)}}));
    EXPECT_EQ(value->dictionary()->begin()->key, "z");
}

}  // namespace
