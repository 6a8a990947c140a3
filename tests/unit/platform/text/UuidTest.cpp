#include "platform/text/Uuid.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

TEST(UuidOf, AcceptsOneFormInEitherCase) {
    EXPECT_TRUE(uuidOf("6ba7b810-9dad-11d1-80b4-00c04fd430c8"));
    EXPECT_TRUE(uuidOf("6BA7B810-9DAD-11D1-80B4-00C04FD430C8"));
    EXPECT_FALSE(uuidOf(""));
    EXPECT_FALSE(uuidOf("6ba7b8109dad11d180b400c04fd430c8"));
    EXPECT_FALSE(uuidOf("6ba7b810-9dad-11d1-80b4-00c04fd430c8 "));
    EXPECT_FALSE(uuidOf("6ba7b810-9dad-11d1-80b4-00c04fd430cg"));
    EXPECT_FALSE(uuidOf("6ba7b810-9dad-11d1-80b4-00c04fd430c"));
}

}  // namespace
}  // namespace adminhost
