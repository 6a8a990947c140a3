#include "adminhostctl/Age.h"

#include <chrono>

#include <gtest/gtest.h>

namespace adminhost::ctl {
namespace {

using namespace std::chrono_literals;

// The zone of these tests is Europe/Berlin.
const Date noon{std::chrono::seconds(1769857200)};  // 31 Jan 2026, 12:00:00

TEST(Age, DateOfTodayHasTheTimeAndOneOfAnotherDayTheDay) {
    EXPECT_EQ(dateWithAge(noon - 125s, noon), "2 minutes ago, 11:57:55");
    EXPECT_EQ(dateWithAge(noon - 1s, noon), "1 second ago, 11:59:59");
    EXPECT_EQ(dateWithAge(noon, noon), "0 seconds ago, 12:00:00");
    EXPECT_EQ(dateWithAge(noon - 13h, noon), "13 hours ago, 30 Jan 2026, 23:00:00");
    EXPECT_EQ(dateWithAge(noon - 72h, noon), "3 days ago, 28 Jan 2026, 12:00:00");
    EXPECT_EQ(dateWithAge(noon - 24h * 800, noon), "2 years ago, 23 Nov 2023, 12:00:00");
}

TEST(Age, DateThatIsStillToComeSaysSo) {
    EXPECT_EQ(dateWithAge(noon + 5min, noon), "in 5 minutes, 12:05:00");
}

}  // namespace
}  // namespace adminhost::ctl
