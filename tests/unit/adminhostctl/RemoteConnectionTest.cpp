// The connection with another machine, with a script in the place of ssh.

#include "adminhostctl/DaemonClient.h"
#include "adminhostctl/RemoteHost.h"
#include "tests/support/Environment.h"
#include "tests/support/TemporaryRoot.h"

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using adminhost::ctl::Connection;
using adminhost::ctl::DaemonClient;
using adminhost::ctl::ExitStatus;
using adminhost::ctl::Failure;
using adminhost::ctl::RemoteHost;
using adminhost::ctl::RequestReport;
using adminhost::ctl::Unavailable;
using adminhost::test::TemporaryRoot;
using support::ScopedEnvironment;
using testing::AllOf;
using testing::HasSubstr;

constexpr auto patience = std::chrono::seconds(60);
constexpr auto noTimeout = std::nullopt;

class RemoteConnection : public testing::Test {
  protected:
    /// What ssh does from now on. "reply BODY" reads a request and sends an answer.
    void ssh(const std::string& script) const {
        root.writeTool("/tools/ssh",
                       "#!/bin/sh\n"
                       "end=$(printf '\\r')\n"
                       "reply() {\n"
                       "    while read -r line && [ \"$line\" != \"$end\" ]; do :; done\n"
                       "    printf 'HTTP/1.1 200 OK\\r\\nContent-Length: %d\\r\\n\\r\\n%s' \"${#1}\" \"$1\"\n"
                       "}\n" +
                           script);
    }
    [[nodiscard]] static DaemonClient client(bool asks, std::optional<std::chrono::milliseconds> timeout = noTimeout) {
        return DaemonClient(Connection(std::make_unique<RemoteHost>(RemoteHost::Options{"studio", {}, asks, {}})),
                            std::nullopt, timeout);
    }

    const TemporaryRoot root;
    const ScopedEnvironment path{{{"PATH", root.path("/tools").string() + ":/usr/bin:/bin"}}};
};

TEST_F(RemoteConnection, GreetingMayFollowTextWithoutALineEnd) {
    ssh("printf 'Welcome\\n\\033]0;studio\\007'\n"
        "printf 'adminhostctl bridge\\n'\n"
        "reply '{\"release\": \"1\"}'\n"
        "cat >/dev/null\n");
    EXPECT_EQ(client(false, patience).overview().dictionary()->text("release"), "1");
}

TEST_F(RemoteConnection, MachineOrDaemonThatCannotBeReachedMayBeReachedSoon) {
    for (const auto& [script, status] :
         {std::pair{"exit 255\n", ExitStatus::hostNotReachable}, std::pair{"exit 3\n", ExitStatus::notReachable}}) {
        ssh(script);
        try {
            static_cast<void>(client(false, patience).overview());
            ADD_FAILURE() << script;
        } catch (const Unavailable& failure) {
            EXPECT_EQ(failure.status(), status);
        } catch (const Failure& failure) {
            ADD_FAILURE() << "it would not be tried again: " << failure.what();
        }
    }
}

TEST_F(RemoteConnection, DaemonThatDoesNotAcceptTheConnectionIsLateAlsoAfterALoginThatMayAsk) {
    ssh("printf 'adminhostctl bridge begins\\n'\n"
        "exec sleep 300\n");
    try {
        static_cast<void>(client(true, std::chrono::milliseconds(1500)).overview());
        ADD_FAILURE();
    } catch (const Unavailable& failure) {
        EXPECT_EQ(failure.status(), ExitStatus::notReachable);
        // What is left of the 1.5 seconds when the connection begins.
        EXPECT_TRUE(std::string(failure.what()).starts_with("the daemon of studio has not answered within 1."));
    }
}

TEST_F(RemoteConnection, PromptOfANewLoginDoesNotCountForTheLookUp) {
    ssh("sleep 10.5\n"  // longer than a request is looked up
        "printf 'adminhostctl bridge\\n'\n"
        "reply '{\"state\": \"running\"}'\n"
        "reply '{\"state\": \"done\"}'\n"
        "cat >/dev/null\n");
    EXPECT_EQ(client(true).settledReport("THE-ID").state, RequestReport::State::done);
}

TEST_F(RemoteConnection, DaemonThatIsTooOldIsRefusedBeforeAnythingElseIsAsked) {
    ssh("printf 'adminhostctl bridge\\n'\n"
        "reply '{\"interface\": 0, \"release\": \"0.0.9\"}'\n"
        "reply '{}'\n"
        "cat >/dev/null\n");
    const adminhost::ctl::CommandRef command{
        "p", adminhost::ctl::Description({{"name", "c"}, {"access", "write"}, {"deadlineSeconds", 20}})};
    for (const auto& ask : {
             std::function([](DaemonClient& daemon) { static_cast<void>(daemon.get("/v1/audit")); }),
             std::function([](DaemonClient& daemon) { static_cast<void>(daemon.get("/v1/requests/THE-ID")); }),
             std::function([](DaemonClient& daemon) { daemon.cancel("THE-ID"); }),
             std::function([&](DaemonClient& daemon) { static_cast<void>(daemon.ask(command, {})); }),
             std::function([&](DaemonClient& daemon) { daemon.check(command, {}); }),
         }) {
        DaemonClient daemon = client(false, patience);
        try {
            ask(daemon);
            ADD_FAILURE() << "it was asked";
        } catch (const Failure& failure) {
            EXPECT_EQ(failure.status(), ExitStatus::failed);
            EXPECT_THAT(failure.what(), HasSubstr("the release 0.0.9, which is too old for this adminhostctl"));
        }
    }
}

TEST_F(RemoteConnection, SocketWhosePathIsTooLongIsRejectedBeforeALogin) {
    const std::string longest = '/' + std::string(106, 's');
    EXPECT_NO_THROW(RemoteHost({"studio", longest, false, {}}));
    try {
        const RemoteHost host({"studio", longest + 's', false, {}});
        ADD_FAILURE();
    } catch (const Failure& failure) {
        EXPECT_EQ(failure.status(), ExitStatus::usage);
        EXPECT_THAT(failure.what(), AllOf(HasSubstr("--socket: "), HasSubstr("107")));
    }
}

TEST_F(RemoteConnection, RejectedArgumentsAreNotCalledAnOlderReleaseForSure) {
    ssh("exit 2\n");
    try {
        static_cast<void>(client(false, patience).overview());
        ADD_FAILURE();
    } catch (const Failure& failure) {
        EXPECT_EQ(failure.status(), ExitStatus::hostNotReachable);
        EXPECT_THAT(failure.what(), HasSubstr("has no verb \"bridge\", or rejected its arguments: its release may be "
                                              "older; install the release "));
    }
}

}  // namespace
