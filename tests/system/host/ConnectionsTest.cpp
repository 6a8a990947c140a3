// Many connections, few descriptors, and clients that do not read.

#include "tests/system/host/Host.h"

#include <csignal>
#include <fstream>
#include <sstream>

#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

DaemonProcess::Options withDescriptors(unsigned descriptors) {
    auto options = withFixture();
    options.descriptors = descriptors;
    return options;
}

/// Processor time of a process so far, in milliseconds.
long processorMilliseconds(pid_t pid) {
    std::ifstream file("/proc/" + std::to_string(pid) + "/stat");
    std::string text;
    std::getline(file, text);
    std::istringstream fields(text.substr(text.rfind(')') + 2));
    std::string skipped;
    for (int i = 0; i < 11; ++i) {
        fields >> skipped;
    }
    long user = 0;
    long system = 0;
    fields >> user >> system;
    return (user + system) * 1000 / ::sysconf(_SC_CLK_TCK);
}

/// A body of about five megabytes and 80,000 values, which its answer repeats.
std::string largeBody() {
    std::string body = "{\"list\":[\"\"";
    for (int i = 0; i < 80'000; ++i) {
        body += ",\"" + std::string(60, static_cast<char>('a' + i % 26)) + '"';
    }
    return body + "]}";
}

TEST(Connections, AfterBurstsOfFourHundredAtSixtyFourDescriptorsTheNextRequestIsAnsweredWithinASecond) {
    const DaemonProcess daemon(withDescriptors(64));
    burst(daemon, 3, 400);
}

TEST(Connections, AfterMoreThanTheMaximumWereOpenAndClosedTheNextRequestIsAnsweredWithinASecond) {
    const DaemonProcess daemon(withFixture());
    burst(daemon, 2, 400);
}

TEST(Connections, OneAccountCannotHoldAllOfThem) {
    const DaemonProcess daemon(withFixture());
    const auto fill = [](const std::string& socket, std::vector<UnixHttp>& clients) {
        for (int i = 0; i < 400; ++i) {
            clients.emplace_back(socket);
        }
    };
    if (::geteuid() != 0) {
        std::vector<UnixHttp> clients;
        fill(daemon.socket(), clients);
        UnixHttp last(daemon.socket());
        const HttpReply reply = last.reply();
        EXPECT_EQ(reply.status, 503);
        EXPECT_EQ(dictionaryOf(reply).text("error"), "TOO_MANY_CONNECTIONS");
        return;
    }
    ASSERT_EQ(::chmod(daemon.directory().c_str(), 0755), 0);
    ASSERT_EQ(::chmod(daemon.socket().c_str(), 0666), 0);
    int ready[2];
    ASSERT_EQ(::pipe(ready), 0);
    const pid_t child = ::fork();
    if (child == 0) {
        std::vector<UnixHttp> clients;
        if (::chdir(daemon.directory().c_str()) == 0 && ::setgroups(0, nullptr) == 0 && ::setgid(65534) == 0 &&
            ::setuid(65534) == 0) {
            try {
                fill("socket", clients);
                const HttpReply reply = UnixHttp("socket").reply();
                const bool refused =
                    reply.status == 503 && reply.body.find("\"TOO_MANY_CONNECTIONS\"") != std::string::npos;
                ::dprintf(ready[1], "%s", refused ? "y" : "n");
            } catch (const std::exception&) {
                ::dprintf(ready[1], "x");
            }
        }
        ::pause();
        ::_exit(0);
    }
    ::close(ready[1]);
    char outcome = '-';
    EXPECT_EQ(::read(ready[0], &outcome, 1), 1);
    ::close(ready[0]);
    EXPECT_EQ(outcome, 'y') << "its further connections are refused";
    try {
        EXPECT_EQ(UnixHttp(daemon.socket(), std::chrono::seconds(1)).get("/v1/").status, 200);
    } catch (const std::runtime_error& error) {
        ADD_FAILURE() << error.what();
    }
    ::kill(child, SIGKILL);
    ::waitpid(child, nullptr, 0);
}

TEST(Connections, ShortOfDescriptorsTheDaemonWaitsInsteadOfSpinning) {
    // The critical number depends on what the daemon itself needs: with some of these it cannot start.
    for (const unsigned descriptors : {8U, 9U, 10U, 12U, 14U, 16U}) {
        auto options = withDescriptors(descriptors);
        options.waitUntilReady = false;
        DaemonProcess daemon(options);
        std::vector<UnixHttp> clients;
        if (eventually([&] {
                return std::filesystem::exists(daemon.socket()) || daemon.wait(std::chrono::milliseconds(0));
            }) &&
            !daemon.wait(std::chrono::milliseconds(0))) {
            try {
                for (int i = 0; i < 10; ++i) {
                    clients.push_back(daemon.connect());
                    clients.back().send("GET /v1/ HTTP/1.1\r\n");
                }
            } catch (const std::runtime_error&) {
                // It may have ended in the meantime.
            }
        }
        if (daemon.wait(std::chrono::milliseconds(500))) {
            EXPECT_FALSE(daemon.log().empty()) << descriptors << ": it says why it does not start";
            continue;
        }
        const long before = processorMilliseconds(daemon.frontPid());
        std::this_thread::sleep_for(std::chrono::seconds(1));
        EXPECT_LT(processorMilliseconds(daemon.frontPid()) - before, 300) << descriptors << " descriptors:\n"
                                                                          << daemon.log().substr(0, 2000);
    }
}

TEST(Connections, TwelveClientsThatDoNotReadCostOneFormOfTheirAnswersAndItIsReturned) {
    auto options = withFixture();
    options.environment = {"ASAN_OPTIONS=quarantine_size_mb=1"};  // otherwise a sanitizer keeps freed memory
    const DaemonProcess daemon(options);
    const std::string body = largeBody();
    const std::size_t before = residentKilobytesOf(daemon.frontPid());
    {
        std::vector<UnixHttp> clients;
        for (int i = 0; i < 12; ++i) {
            clients.push_back(daemon.connect());
            // Not identical: those would have one answer.
            clients.back().begin("POST", "/v1/fixture/echo", "{\"client\":" + std::to_string(i) + "," + body.substr(1));
        }
        ASSERT_TRUE(eventually([&] {
            const Dictionary overview = dictionaryOf(daemon.connect().get("/v1/"));
            return overview.get("waiting") == Value(0) && !overview.contains("running");
        }));
        EXPECT_LT(residentKilobytesOf(daemon.frontPid()), before + 110'000)
            << "kilobytes, of 12 answers of five megabytes";
    }
    EXPECT_TRUE(eventually([&] {
        EXPECT_EQ(daemon.connect().get("/v1/").status, 200);
        return residentKilobytesOf(daemon.frontPid()) < before + 30'000;
    })) << "kilobytes before: "
        << before << ", after: " << residentKilobytesOf(daemon.frontPid());
}

TEST(Connections, AnswersThatNobodyReadsAreBoundedInTotalAndTheOldestIsDropped) {
    const DaemonProcess daemon(withFixture());
    std::vector<UnixHttp> clients;
    for (int i = 0; i < 4; ++i) {
        clients.push_back(daemon.connect());
        // Not identical: those would have one answer.
        clients.back().begin("POST", "/v1/fixture/large", R"({"bytes": 2500000)" + std::to_string(i) + "}");
    }
    ASSERT_TRUE(eventually([&] {
        const Dictionary overview = dictionaryOf(daemon.connect().get("/v1/"));
        return overview.get("waiting") == Value(0) && !overview.contains("running");
    }));
    EXPECT_THROW(clients.at(0).reply(), std::runtime_error);
    EXPECT_THROW(clients.at(1).reply(), std::runtime_error);
    EXPECT_EQ(clients.at(2).reply().status, 200);
    EXPECT_EQ(clients.at(3).reply().status, 200);
    EXPECT_TRUE(daemon.waitForLog("its client did not read it"));
}

TEST(Connections, LogIntoAPipeThatNobodyReadsKeepsNobodyWaiting) {
    int pipe[2];
    ASSERT_EQ(::pipe2(pipe, O_CLOEXEC), 0);
    auto options = withFixture();
    options.standardError = pipe[1];
    DaemonProcess daemon(options);
    UnixHttp client = daemon.connect();
    for (int i = 0; i < 1000; ++i) {
        ASSERT_EQ(client.post("/v1/fixture/nothing").status, 204) << i;
    }
    ASSERT_EQ(client.post("/v1/fixture/flood", R"({"lines": 40, "bytes": 100000})").status, 204);
    // When the log is read again, it continues and reports how many events are missing.
    std::string text;
    EXPECT_TRUE(eventually([&] {
        char buffer[64 << 10];
        ::fcntl(pipe[0], F_SETFL, O_NONBLOCK);
        for (ssize_t count = 0; (count = ::read(pipe[0], buffer, sizeof buffer)) > 0;) {
            text.append(buffer, static_cast<std::size_t>(count));
        }
        return text.find("events were lost") != std::string::npos;
    })) << text.substr(text.size() - std::min<std::size_t>(text.size(), 500));
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.wait(), 0);
    ::close(pipe[0]);
    ::close(pipe[1]);
}

}  // namespace
}  // namespace adminhost::test
