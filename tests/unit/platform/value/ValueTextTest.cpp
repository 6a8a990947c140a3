#include "platform/value/ValueText.h"

#include <cstdlib>
#include <limits>
#include <string>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

TEST(TextOf, ShowsEachKindAsDocumented) {
    EXPECT_EQ(textOf(Value()), "(null)");
    EXPECT_EQ(textOf(Value(true)), "1");
    EXPECT_EQ(textOf(Value(false)), "0");
    EXPECT_EQ(textOf(Value(-12)), "-12");
    EXPECT_EQ(textOf(Value(UINT64_MAX)), "18446744073709551615");
    EXPECT_EQ(textOf(Value(0.1)), "0.1");
    EXPECT_EQ(textOf(Value(2.0)), "2");
    EXPECT_EQ(textOf(Value("100%@")), "100%@");
    EXPECT_EQ(textOf(Value(Date(std::chrono::seconds(0)))), "1970-01-01 00:00:00 +0000");
    EXPECT_EQ(textOf(Value(Data{0x01, 0xff})), "<01ff>");
    EXPECT_EQ(textOf(Value(Array{Value(1), Value("b")})), "(\n    1,\n    b\n)");
    EXPECT_EQ(textOf(Value(Dictionary{{"k", Array{}}})), "{\n    k = (\n    );\n}");
    EXPECT_EQ(textOf(std::optional<std::string>()), "(null)");
}

TEST(TextOf, RealsAreWrittenWithoutAnExponent) {
    EXPECT_EQ(textOf(Value(99999.0)), "99999");
    EXPECT_EQ(textOf(Value(100000.0)), "100000");
    EXPECT_EQ(textOf(Value(-1234567.0)), "-1234567");
    EXPECT_EQ(textOf(Value(9007199254740992.0)), "9007199254740992");
    EXPECT_EQ(textOf(Value(1e22)), "10000000000000000000000");
    EXPECT_EQ(textOf(Value(0.00001)), "0.00001");
    EXPECT_EQ(textOf(Value(1.5e-7)), "0.00000015");
    EXPECT_EQ(textOf(Value(-0.0)), "-0");
    EXPECT_EQ(textOf(Value(std::numeric_limits<double>::infinity())), "inf");
    EXPECT_EQ(textOf(Value(-std::numeric_limits<double>::infinity())), "-inf");
}

TEST(TextOf, EveryRealIsReadBackFromItsText) {
    using Limits = std::numeric_limits<double>;
    for (const double number : {0.1, 1.0 / 3, 1e300, 123456.789, Limits::max(), Limits::lowest(), Limits::min(),
                                Limits::denorm_min(), -Limits::denorm_min()}) {
        const std::string text = textOf(Value(number));
        EXPECT_EQ(text.find('e'), std::string::npos) << text;
        EXPECT_EQ(std::strtod(text.c_str(), nullptr), number) << text;
    }
}

TEST(TextOf, ErrorIsDomainCodeAndDescription) {
    EXPECT_EQ(textOf(Error{"sqliteQuery", 1, "no such table"}), "sqliteQuery (1): no such table");
    EXPECT_EQ(textOf(Error{"adminhost_lumio", 3, std::nullopt}), "adminhost_lumio (3)");
    EXPECT_EQ(textOf(std::optional<Error>()), "(null)");
}

TEST(BooleanOf, ReadsNumbersAndFirstNonBlankCharacter) {
    for (const char* text : {"t", "T", "y", "Yes", " \ttrue", "1", "9x"}) {
        EXPECT_TRUE(booleanOf(Value(text))) << text;
    }
    for (const char* text : {"f", "", " ", "0", "01", "\n1", "no", "-1"}) {
        EXPECT_FALSE(booleanOf(Value(text))) << text;
    }
    EXPECT_TRUE(booleanOf(Value(-3)));
    EXPECT_TRUE(booleanOf(Value(UINT64_MAX)));
    EXPECT_TRUE(booleanOf(Value(0.5)));
    EXPECT_FALSE(booleanOf(Value(0)));
    EXPECT_FALSE(booleanOf(Value()));
    EXPECT_FALSE(booleanOf(Value(Array{Value(1)})));
    EXPECT_FALSE(booleanOf(Value(std::string("\0", 1))));
}

TEST(FlagOf, SkipsLeadingZerosWhereBooleanOfDoesNot) {
    EXPECT_TRUE(flagOf(Value("01")));
    EXPECT_TRUE(flagOf(Value(" 00Y")));
    EXPECT_FALSE(flagOf(Value("00")));
    EXPECT_FALSE(flagOf(Value("0 1")));
    EXPECT_FALSE(booleanOf(Value("01")));
}

}  // namespace
}  // namespace adminhost
