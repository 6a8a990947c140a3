#include "platform/value/Text.h"

#include <cstdlib>
#include <ctime>
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

class LocalDate : public testing::Test {
  protected:
    void SetUp() override {
        ::setenv("TZ", "Europe/Berlin", 1);
        ::tzset();
    }
    void TearDown() override {
        ::unsetenv("TZ");
        ::tzset();
    }
};

TEST_F(LocalDate, ReadsAndWritesLocalTime) {
    const auto date = localDateOf("2026-01-31 09:00:00");
    ASSERT_TRUE(date);
    EXPECT_EQ(textOf(Value(*date)), "2026-01-31 08:00:00 +0000");
    EXPECT_EQ(localTextOf(*date), "2026-01-31 09:00:00");
}

TEST_F(LocalDate, RefusesWhatIsNotAWholeRealDate) {
    for (const char* text : {"", "2026-01-31", "2026-01-31 09:00:00 ", "2026-01-31 09:00:00.5", "2026-02-30 00:00:00",
                             "2025-02-29 00:00:00", "2026-01-31 24:00:00", "2026-01-31 23:59:60", "garbage"}) {
        EXPECT_FALSE(localDateOf(text)) << text;
    }
    EXPECT_FALSE(localDateOf(std::string_view("2026-01-31 09:00:00\0", 20)));
    EXPECT_TRUE(localDateOf("2024-02-29 00:00:00"));
}

TEST_F(LocalDate, FieldsMayHaveFewerDigitsButNoMoreThanTheirRange) {
    EXPECT_EQ(localDateOf("2026-1-31 9:00:00"), localDateOf("2026-01-31 09:00:00"));
    for (const char* text : {"2026-13-01 00:00:00", "2026-00-01 00:00:00", "2026-01-00 00:00:00", "2026-01-32 00:00:00",
                             "2026-01-31 09:60:00", "2026-01-31T09:00:00", "2026-01-31 09:00:0x"}) {
        EXPECT_FALSE(localDateOf(text)) << text;
    }
}

TEST_F(LocalDate, AnotherZoneCountsForADayThatWasReadBefore) {
    const auto before = localDateOf("2026-01-31 09:00:00");
    ::setenv("TZ", "Asia/Kathmandu", 1);
    ::tzset();
    const auto after = localDateOf("2026-01-31 09:00:00");
    ASSERT_TRUE(before && after);
    EXPECT_EQ(*before - *after, std::chrono::minutes(285));
}

TEST_F(LocalDate, WritingFollowsAChangeOfTheZoneAtOnce) {
    const Date date{std::chrono::seconds(1769846400)};
    EXPECT_EQ(localTextOf(date), "2026-01-31 09:00:00");
    ::setenv("TZ", "Asia/Kathmandu", 1);
    EXPECT_EQ(localTextOf(date), "2026-01-31 13:45:00");
    EXPECT_EQ(localDateOf("2026-01-31 13:45:00"), date);
}

TEST_F(LocalDate, InsideADaylightSavingGapIsStillADate) {
    EXPECT_TRUE(localDateOf("2026-03-29 02:30:00"));
}

TEST_F(LocalDate, EveryHalfHourOfTwoYearsIsTheCLibrarysReading) {
    for (const char* zone : {"Europe/Berlin", "America/New_York", "Australia/Lord_Howe", "Asia/Kathmandu", "UTC"}) {
        ::setenv("TZ", zone, 1);
        ::tzset();
        for (std::time_t local = 1767225600; local < 1767225600 + 2 * 366 * 86400; local += 1800) {
            std::tm parts{};
            ::gmtime_r(&local, &parts);
            char text[64];
            ASSERT_NE(std::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &parts), 0U);
            parts.tm_isdst = -1;
            const auto expected = Date(std::chrono::seconds(::mktime(&parts)));
            const auto read = localDateOf(text);
            // An hour that the clocks show twice has two readings, and the C library's choice depends on its last one.
            ASSERT_TRUE(read && (*read == expected || localTextOf(*read) == localTextOf(expected)))
                << zone << ' ' << text;
        }
    }
}

TEST(Utf8, WellFormedTextPassesAndEachOffendingByteIsReplaced) {
    EXPECT_TRUE(isUtf8("a\xC3\xA0\xE2\x82\xAC\xF0\x9F\x98\x80"));
    for (const char* bad : {"\x80", "\xC0\xAF", "\xED\xA0\x80", "\xF4\x90\x80\x80", "\xE2\x82", "\xFF"}) {
        EXPECT_FALSE(isUtf8(bad));
    }
    EXPECT_EQ(utf8Of("a\xFFz"), "a\xEF\xBF\xBDz");
    EXPECT_EQ(utf8Of("\xE2\x82"), "\xEF\xBF\xBD\xEF\xBF\xBD");
    EXPECT_EQ(utf8Of("\xC3\xA0"), "\xC3\xA0");
}

}  // namespace
}  // namespace adminhost
