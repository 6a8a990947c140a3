#include "platform/text/IsoDate.h"

#include <cstdint>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

using std::chrono::seconds;
using std::chrono::sys_seconds;

TEST(IsoDate, TextsAreReadBack) {
    const std::pair<std::int64_t, const char*> examples[] = {{0, "1970-01-01T00:00:00Z"},
                                                             {1769846400, "2026-01-31T08:00:00Z"},
                                                             {-62167219200, "0000-01-01T00:00:00Z"},
                                                             {-62167219201, "-000001-12-31T23:59:59Z"},
                                                             {253402300799, "9999-12-31T23:59:59Z"},
                                                             {253402300800, "+010000-01-01T00:00:00Z"}};
    for (const auto& [moment, text] : examples) {
        EXPECT_EQ(isoTextOf(sys_seconds(seconds(moment))), text);
        EXPECT_EQ(isoDateOf(text), sys_seconds(seconds(moment)));
    }
}

TEST(IsoDate, NoOtherTextIsRead) {
    for (const char* text :
         {"", "2026-01-31", "2026-01-31T08:00:00", "2026-01-31 08:00:00Z", "2026-01-31T08:00:00z",
          "2026-02-30T00:00:00Z", "2026-01-31T24:00:00Z", "2026-01-31T08:00:60Z", "26-01-31T08:00:00Z",
          "+2026-01-31T08:00:00Z", "02026-01-31T08:00:00Z", "2026-1-31T08:00:00Z", "-001-01-31T08:00:00Z",
          "2026-01-31T08:00:00ZZ", "2026-01-31T08:00:0 Z"}) {
        EXPECT_FALSE(isoDateOf(text)) << text;
    }
}

TEST(IsoDate, FourDigitYearsEndWhereTheirTextsGrow) {
    EXPECT_TRUE(hasFourDigitYear(*isoDateOf("0000-01-01T00:00:00Z")));
    EXPECT_TRUE(hasFourDigitYear(*isoDateOf("9999-12-31T23:59:59Z")));
    EXPECT_FALSE(hasFourDigitYear(*isoDateOf("-000001-12-31T23:59:59Z")));
    EXPECT_FALSE(hasFourDigitYear(*isoDateOf("+010000-01-01T00:00:00Z")));
}

}  // namespace
}  // namespace adminhost
