// Workers that break the protocol: each is killed, its request fails, and the next worker serves the others.

#include "adminhostd/Protocol.h"
#include "tests/system/host/Host.h"

namespace adminhost::test {
namespace {

Data bytesOf(const Frame& frame) {
    const std::string bytes = *encodeFrame(frame) + frame.bytes;
    return {bytes.begin(), bytes.end()};
}

Data bytesOf(protocol::ToFront message) {
    return bytesOf(protocol::frameOf(std::move(message)));
}

Frame withSurplus(protocol::ToFront message) {
    Frame frame = protocol::frameOf(std::move(message));
    frame.payload.dictionary()->set("surplus", 1);
    return frame;
}

class ProtocolTrouble : public ::testing::Test {
  protected:
    void expectEnded(const Data& bytes, const std::string& logged) {
        const pid_t worker = daemon.workerPid();
        expectError(client.post("/v1/fixture/say", jsonOf(Dictionary{{"bytes", bytes}, {"milliseconds", 5000}})), 500,
                    "WORKER_FAILED");
        EXPECT_TRUE(daemon.waitForLog(logged)) << daemon.log();
        EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
        EXPECT_NE(daemon.workerPid(), worker);
    }

    void expectEndedWhileIdle(const Data& bytes) {
        const pid_t worker = daemon.workerPid();
        EXPECT_EQ(client.post("/v1/fixture/say", jsonOf(Dictionary{{"later", bytes}})).status, 204);
        EXPECT_TRUE(eventually([&] { return daemon.workerPid() != worker; }));
        EXPECT_TRUE(daemon.waitForLog("the worker sent what it was not asked"));
        EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    }

    DaemonProcess daemon{withFixture()};
    UnixHttp client = daemon.connect();
};

TEST_F(ProtocolTrouble, BytesThatAreNotAFrameEndTheWorker) {
    expectEnded(Data(64, 'x'), "the worker sent what cannot be read");
}

TEST_F(ProtocolTrouble, PayloadThatIsNotAMessageEndsTheWorker) {
    expectEnded(bytesOf(Frame{FrameType::log, Value("text"), {}}), "cannot be read (the message is not a dictionary)");
}

TEST_F(ProtocolTrouble, SurplusMemberEndsTheWorker) {
    expectEnded(bytesOf(withSurplus(protocol::Log{"an event"})), "cannot be read (a dictionary has a surplus member)");
}

TEST_F(ProtocolTrouble, MessageForTheWorkerEndsIt) {
    expectEnded(bytesOf(protocol::frameOf(protocol::ReadHistory{"fixture", BodyForm::json})),
                "cannot be read (a message of this type is not for this side)");
}

TEST_F(ProtocolTrouble, SecondHelloEndsTheWorker) {
    expectEnded(bytesOf(protocol::Hello{}), "the worker sent what it was not asked");
}

TEST_F(ProtocolTrouble, AnswerOrReportWhileIdleEndsTheWorker) {
    protocol::Answer answer;
    answer.outcome = protocol::Outcome::nothing;
    expectEndedWhileIdle(bytesOf(answer));
    expectEndedWhileIdle(bytesOf(NotDone{"a", "b", "c"}));
}

}  // namespace
}  // namespace adminhost::test
