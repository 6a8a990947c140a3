// The connection against a server that a test plays: what is sent, and what happens when no answer comes.

#include "adminhostctl/Connection.h"
#include "adminhostctl/DaemonClient.h"
#include "adminhostctl/Interrupt.h"
#include "tests/support/PlayedServer.h"

#include <atomic>
#include <csignal>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace {

using adminhost::ctl::CommandAnswer;
using adminhost::ctl::CommandRef;
using adminhost::ctl::Connection;
using adminhost::ctl::DaemonClient;
using adminhost::ctl::DaemonReply;
using adminhost::ctl::Description;
using adminhost::ctl::ExitStatus;
using adminhost::ctl::Failure;
using adminhost::ctl::LostConnection;
using adminhost::ctl::ReportedGap;
using adminhost::ctl::Unavailable;
using adminhost::test::PlayedServer;
using testing::HasSubstr;
using testing::Not;

constexpr auto patience = std::chrono::seconds(20);

std::string ok(const std::string& headers = {}) {
    return "HTTP/1.1 200 OK\r\n" + headers + "Content-Length: 2\r\n\r\n{}";
}

TEST(Connection, SendsIdAndRevisionAndReadsTheHeadersOfTheAnswer) {
    const PlayedServer server(
        [](const std::string&) { return ok("ETag: \"r2\"\r\nRequest-Id: X\r\nAdminhost-Not-Done: 1\r\n"); });
    Connection connection(server.path());
    const DaemonReply reply = connection.post("/v1/p/c", "{}", patience, {"THE-ID", "\"r1\""});
    EXPECT_EQ(reply.status, 200);
    EXPECT_EQ(reply.revision, "\"r2\"");
    EXPECT_EQ(reply.requestId, "X");
    EXPECT_TRUE(reply.notDone);
    ASSERT_EQ(server.requests().size(), 1U);
    EXPECT_THAT(server.requests()[0], HasSubstr("\r\nRequest-Id: THE-ID\r\n"));
    EXPECT_THAT(server.requests()[0], HasSubstr("\r\nIf-Match: \"r1\"\r\n"));
    EXPECT_FALSE(connection.get("/", patience).revision.empty());
}

TEST(DaemonClient, PartsThatWereNotDoneDoNotLookDoneIfTheDaemonHasForgottenThem) {
    const PlayedServer server([](const std::string&) { return ok(); });
    DaemonClient client(server.path());
    CommandAnswer answer{std::nullopt, "THE-ID", "", true};
    const std::vector<ReportedGap> gaps = client.gapsOf(answer);
    ASSERT_EQ(gaps.size(), 1U);
    EXPECT_THAT(gaps[0].reason, HasSubstr("THE-ID"));
    answer.notDone = false;
    EXPECT_TRUE(client.gapsOf(answer).empty());
    EXPECT_EQ(server.requests().size(), 1U) << "nothing is looked up for a whole answer";
}

TEST(Connection, RequestWhoseConnectionIsLostIsNotSentAgain) {
    const PlayedServer server(
        [](const std::string& request) { return request.starts_with("GET") ? ok() : std::string(); });
    Connection connection(server.path());
    EXPECT_EQ(connection.get("/v1/", patience).status, 200) << "a connection that is kept open";
    try {
        static_cast<void>(connection.post("/v1/p/c", "{}", patience, {"THE-ID", ""}));
        ADD_FAILURE();
    } catch (const LostConnection& lost) {
        EXPECT_EQ(lost.status(), ExitStatus::undetermined);
        EXPECT_THAT(lost.what(), HasSubstr("the connection to the daemon was lost"));
    }
    std::size_t posts = 0;
    for (const std::string& request : server.requests()) {
        posts += request.starts_with("POST") ? 1U : 0U;
    }
    EXPECT_EQ(posts, 1U);
}

TEST(Connection, ServerThatIsNotThereWasSentNothing) {
    Connection connection("/nowhere/socket");
    try {
        static_cast<void>(connection.post("/v1/p/c", "{}", patience, {"THE-ID", ""}));
        ADD_FAILURE();
    } catch (const LostConnection&) {
        ADD_FAILURE() << "nothing was sent";
    } catch (const Failure& failure) {
        EXPECT_EQ(failure.status(), ExitStatus::notReachable);
    }
}

TEST(Connection, SignalEndsTheWaitOnlyWhileItIsGuarded) {
    const PlayedServer server([](const std::string& request) {
        if (request.starts_with("POST")) {
            static_cast<void>(std::raise(SIGTERM));  // in the server's thread: the handler is the process's
            std::this_thread::sleep_for(std::chrono::milliseconds(2500));
        }
        return ok();
    });
    Connection connection(server.path());
    {
        const adminhost::ctl::InterruptGuard guard;
        try {
            static_cast<void>(connection.post("/v1/p/c", "{}", patience, {"THE-ID", ""}));
            ADD_FAILURE();
        } catch (const LostConnection& lost) {
            EXPECT_STREQ(lost.what(), "interrupted");
        }
        EXPECT_TRUE(adminhost::ctl::isInterrupted());
    }
    EXPECT_FALSE(adminhost::ctl::isInterrupted());
    EXPECT_EQ(connection.get("/v1/", patience).status, 200) << "looking the request up goes on";
}

TEST(Connection, SilentServerEndsAReadingAndLosesAWriteAtTheTimeout) {
    const PlayedServer server([](const std::string&) {
        std::this_thread::sleep_for(std::chrono::milliseconds(400));
        return std::string();
    });
    Connection connection(server.path());
    try {
        static_cast<void>(connection.get("/v1/", std::chrono::milliseconds(100)));
        ADD_FAILURE();
    } catch (const Unavailable& failure) {
        EXPECT_EQ(failure.status(), ExitStatus::notReachable);
        EXPECT_STREQ(failure.what(), "the daemon has not answered within 0.1 s");
    }
    try {
        static_cast<void>(connection.post("/v1/p/c", "{}", std::chrono::milliseconds(100), {"THE-ID", ""}));
        ADD_FAILURE();
    } catch (const LostConnection& lost) {
        EXPECT_EQ(lost.status(), ExitStatus::undetermined) << "it may have been carried out";
        EXPECT_STREQ(lost.what(), "the daemon has not answered within 0.1 s");
    }
}

TEST(DaemonClient, TriesAgainWhenTheDaemonAsksForItButNotForever) {
    std::atomic<int> count = 0;
    int refusals = 1;
    const PlayedServer server([&](const std::string&) {
        return ++count > refusals ? ok() : "HTTP/1.1 503 Busy\r\nRetry-After: 1\r\nContent-Length: 2\r\n\r\n{}";
    });
    DaemonClient client(server.path());
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_TRUE(client.get("/v1/").dictionary() != nullptr);
    EXPECT_GE(std::chrono::steady_clock::now() - begin, std::chrono::seconds(1)) << "not before that time";
    EXPECT_EQ(count, 2);
    count = 0;
    refusals = 1000;
    DaemonClient hurried(server.path(), std::nullopt, std::chrono::milliseconds(500));
    EXPECT_THROW(static_cast<void>(hurried.get("/v1/")), Unavailable);
    EXPECT_EQ(count, 1) << "its time would be over";
}

TEST(DaemonClient, SendsADeadlineThatEndsBeforeItsTimeout) {
    const PlayedServer server([](const std::string& request) {
        return request.starts_with("GET")
                   ? "HTTP/1.1 200 OK\r\nContent-Length: 37\r\n\r\n{\"interface\":1,\"deadlineSeconds\":120}"
                   : ok();
    });
    const CommandRef command{"p", Description({{"name", "c"}, {"access", "read"}})};
    for (const auto& [timeout, header] : {std::pair{60, "Request-Deadline: 50\r\n"},
                                          {22, "Request-Deadline: 12\r\n"},
                                          {9, "Request-Deadline: 4\r\n"},
                                          {1, "Request-Deadline: 1\r\n"}}) {
        DaemonClient client(server.path(), std::nullopt, std::chrono::seconds(timeout));
        static_cast<void>(client.ask(command, {}));
        EXPECT_THAT(server.requests().back(), HasSubstr(header));
    }
    DaemonClient patient(server.path());
    static_cast<void>(patient.ask(command, {}));
    EXPECT_THAT(server.requests().back(), HasSubstr("Request-Deadline: 120\r\n")) << "the daemon's, which it announces";
}

}  // namespace
