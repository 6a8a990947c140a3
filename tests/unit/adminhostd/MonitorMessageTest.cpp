#include "adminhostd/MonitorMessage.h"

#include <gtest/gtest.h>
#include <sys/socket.h>

namespace adminhost {
namespace {

using Kind = ReceivedMessage::Kind;

class MonitorMessages : public ::testing::Test {
  protected:
    [[nodiscard]] Kind received() const { return receiveMonitorMessage(ends[1].get()).kind; }

    std::array<FileDescriptor, 2> ends = monitorSocketPair();
};

TEST_F(MonitorMessages, ArriveWhole) {
    ASSERT_TRUE(sendMonitorMessage(ends[0].get(), {MonitorMessage::Kind::kill, 7, 0, 0}));
    const ReceivedMessage message = receiveMonitorMessage(ends[1].get());
    EXPECT_EQ(message.kind, Kind::message);
    EXPECT_EQ(message.message.worker, 7U);
    EXPECT_EQ(received(), Kind::none);
}

TEST_F(MonitorMessages, PacketWithoutAByteIsMalformedAndNotTheEnd) {
    ASSERT_EQ(::send(ends[0].get(), "", 0, 0), 0);
    EXPECT_EQ(received(), Kind::malformed);
    EXPECT_EQ(received(), Kind::none);
}

TEST_F(MonitorMessages, AnEndThatOnlySendsNoMoreIsMalformed) {
    ASSERT_EQ(::shutdown(ends[0].get(), SHUT_WR), 0);
    EXPECT_EQ(received(), Kind::malformed);
}

TEST_F(MonitorMessages, EndOfTheOtherProcessClosesTheConversation) {
    ASSERT_TRUE(sendMonitorMessage(ends[0].get(), {MonitorMessage::Kind::kill, 7, 0, 0}));
    ends[0].close();
    EXPECT_EQ(received(), Kind::message);
    EXPECT_EQ(received(), Kind::closed);
}

}  // namespace
}  // namespace adminhost
