#include "platform/text/LineAndColumn.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

TEST(LineAndColumn, CountFromOneAndInCharacters) {
    EXPECT_EQ(lineAndColumnAfter(""), "line 1, column 1");
    EXPECT_EQ(lineAndColumnAfter("abc"), "line 1, column 4");
    EXPECT_EQ(lineAndColumnAfter("abc\n"), "line 2, column 1");
    EXPECT_EQ(lineAndColumnAfter("a\n\n\xC3\xA0\xE2\x82\xAC"), "line 3, column 3");
}

}  // namespace
}  // namespace adminhost
