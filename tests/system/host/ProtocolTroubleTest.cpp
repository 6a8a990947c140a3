// Workers that break the protocol: each is killed, its request fails, and the next worker serves the others.

#include "adminhostd/Protocol.h"
#include "platform/files/FileDescriptor.h"
#include "platform/framework/BuildNote.h"
#include "platform/release/Release.h"
#include "platform/task/StartChild.h"
#include "platform/task/ToolRegister.h"
#include "tests/support/TemporaryRoot.h"
#include "tests/system/host/Host.h"

#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

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

/// A worker without a front, to which a test says what it likes.
class LoneWorker : public ::testing::Test {
  protected:
    LoneWorker() {
        int ends[2];
        EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
        _conversation = FileDescriptor(ends[0]);
        const FileDescriptor other(ends[1]);
        auto tools = ToolRegister::create();
        EXPECT_TRUE(tools);
        ChildPlan plan;
        plan.program = std::string(BINARY_DIR) + "/bin/adminhostd-worker";
        plan.arguments = {"adminhostd-worker"};
        plan.environment = processEnvironment();
        plan.descriptors = {-1, STDERR_FILENO, STDERR_FILENO, other.get(), tools->descriptor()};
        auto started = startChild(plan);
        EXPECT_TRUE(started);
        _pid = started->pid;
    }

    [[nodiscard]] protocol::Configure configuration(const char* plugin) const {
        protocol::Configure configuration;
        configuration.build = ADMINHOST_RELEASE ", " ADMINHOST_BUILD_IDENTITY;
        configuration.root = _root.path("/");
        configuration.plugins = {pluginFile(plugin)};
        return configuration;
    }
    [[nodiscard]] bool send(protocol::ToWorker message) const {
        return writeFrame(_conversation.get(), protocol::frameOf(std::move(message)));
    }
    /// Everything that the worker sends up to its end, as the names of the messages; its plug-ins are added to the
    /// list.
    [[nodiscard]] int end(std::vector<std::string>& loaded, std::string& log) {
        ::shutdown(_conversation.get(), SHUT_WR);  // one that accepts everything ends, too
        FrameReader reader;
        while (auto frame = readFrame(_conversation.get(), reader)) {
            auto message = protocol::toFront(std::move(*frame));
            if (const auto* hello = message ? std::get_if<protocol::Hello>(&*message) : nullptr) {
                for (const protocol::OfferedPlugin& plugin : hello->plugins) {
                    loaded.push_back(plugin.file);
                }
            } else if (const auto* event = message ? std::get_if<protocol::Log>(&*message) : nullptr) {
                log += event->event;
            }
        }
        int status = -1;
        EXPECT_EQ(::waitpid(_pid, &status, 0), _pid);
        return WEXITSTATUS(status);
    }

    const TemporaryRoot _root;
    FileDescriptor _conversation;
    pid_t _pid = -1;
};

TEST_F(LoneWorker, ConfigurationAfterThatOfTheMonitorIsRefusedAndNothingOfItIsUsed) {
    ASSERT_TRUE(send(configuration("fixture_good")));
    // What a front that was taken over would send: another plug-in at another place.
    ASSERT_TRUE(send(configuration("fixture_throwing")));
    std::vector<std::string> loaded;
    std::string log;
    EXPECT_EQ(end(loaded, log), 1);
    EXPECT_EQ(loaded, std::vector<std::string>{pluginFile("fixture_good")});
    EXPECT_NE(log.find("the worker was sent what it may not be sent, and ends"), std::string::npos) << log;
}

TEST_F(LoneWorker, WorkerOfAnotherBuildThanTheDaemonLoadsNothingAndEnds) {
    protocol::Configure other = configuration("fixture_good");
    other.build += "x";
    ASSERT_TRUE(send(std::move(other)));
    std::vector<std::string> loaded;
    std::string log;
    EXPECT_EQ(end(loaded, log), 1);
    EXPECT_TRUE(loaded.empty());
    EXPECT_NE(log.find("adminhostd: the worker is of another release than the daemon; restart the daemon"),
              std::string::npos)
        << log;
}

TEST_F(LoneWorker, OrderBeforeItsConfigurationEndsIt) {
    ASSERT_TRUE(send(protocol::ReadHistory{"fixture", BodyForm::json}));
    std::vector<std::string> loaded;
    std::string log;
    EXPECT_EQ(end(loaded, log), 1);
    EXPECT_NE(log.find("may not be sent"), std::string::npos) << log;
}

}  // namespace
}  // namespace adminhost::test
