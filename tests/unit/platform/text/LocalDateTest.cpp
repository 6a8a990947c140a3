#include "platform/text/LocalDate.h"
#include "platform/value/Value.h"
#include "platform/value/ValueText.h"

#include <cstdlib>
#include <ctime>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

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

}  // namespace
}  // namespace adminhost
