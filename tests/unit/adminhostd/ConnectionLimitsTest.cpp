#include "adminhostd/ConnectionLimits.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

std::size_t addAll(ConnectionLimits& limits, uid_t uid) {
    std::size_t count = 0;
    while (limits.add(uid)) {
        ++count;
    }
    return count;
}

TEST(ConnectionLimits, OneAccountHasHalfOfWhatRootLeaves) {
    ConnectionLimits limits(1024, 256);
    EXPECT_EQ(addAll(limits, 1000), 120U);
    EXPECT_EQ(addAll(limits, 1001), 120U);
    EXPECT_EQ(addAll(limits, 1002), 0U);
    EXPECT_FALSE(limits.full());
    EXPECT_EQ(addAll(limits, 0), ConnectionLimits::rootReserve);
    EXPECT_TRUE(limits.full());
}

TEST(ConnectionLimits, RootMayHaveAllOfThem) {
    ConnectionLimits limits(1024, 256);
    EXPECT_EQ(addAll(limits, 0), 256U);
    EXPECT_TRUE(limits.full());
    EXPECT_FALSE(limits.add(1000));
}

TEST(ConnectionLimits, ClosedConnectionCanBeOpenedAgain) {
    ConnectionLimits limits(1024, 256);
    ASSERT_EQ(addAll(limits, 1000), limits.perAccount());
    limits.remove(1000);
    EXPECT_TRUE(limits.add(1000));
    EXPECT_FALSE(limits.add(1000));
    ASSERT_GT(addAll(limits, 0), 0U);
    limits.remove(0);
    EXPECT_FALSE(limits.full());
    EXPECT_TRUE(limits.add(0));
}

TEST(ConnectionLimits, FewDescriptorsLeaveTheDaemonItsOwn) {
    EXPECT_EQ(ConnectionLimits(64, 256).total(), 48U);
    EXPECT_EQ(ConnectionLimits(64, 256).others(), 32U);
    EXPECT_EQ(ConnectionLimits(64, 256).perAccount(), 16U);
    for (std::size_t descriptors = 0; descriptors < 300; ++descriptors) {
        const ConnectionLimits limits(descriptors, 256);
        EXPECT_GE(limits.perAccount(), 1U) << descriptors;
        EXPECT_GE(limits.others(), limits.perAccount()) << descriptors;
        EXPECT_GE(limits.total(), limits.others()) << descriptors;
        EXPECT_LE(limits.total(), std::max<std::size_t>(descriptors, 17) - 16) << descriptors;
    }
}

}  // namespace
}  // namespace adminhost
