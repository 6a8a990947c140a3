// Bursts of connections for a while, with few descriptors and with the usual number.

#include "tests/system/host/Host.h"

namespace adminhost::test {
namespace {

TEST(ConnectionsSoak, AfterEachOfTwoHundredBurstsAtSixtyFourDescriptorsTheNextRequestIsAnsweredWithinASecond) {
    auto options = withFixture();
    options.descriptors = 64;
    const DaemonProcess daemon(options);
    ASSERT_NO_FATAL_FAILURE(burst(daemon, 200, 400));
    EXPECT_TRUE(eventually([&] { return descriptorsOf(daemon.frontPid()) < 16; })) << "no descriptor is left behind";
}

TEST(ConnectionsSoak, AfterEachOfAHundredBurstsBeyondTheMaximumTheNextRequestIsAnsweredWithinASecond) {
    const DaemonProcess daemon(withFixture());
    ASSERT_NO_FATAL_FAILURE(burst(daemon, 100, 400));
    EXPECT_TRUE(eventually([&] { return descriptorsOf(daemon.frontPid()) < 16; })) << "no descriptor is left behind";
}

}  // namespace
}  // namespace adminhost::test
