// Front and worker keep no passwords of requests and answers in their memory.

#include "tests/system/host/Host.h"

#include <fstream>
#include <sstream>

#include <fcntl.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

/// The places of a text in the writable memory of a process; empty if it is not found. Only root may read that memory.
std::vector<std::string> placesOf(const std::string& text, pid_t pid) {
    std::vector<std::string> places;
    const std::string process = "/proc/" + std::to_string(pid);
    int memory = ::open((process + "/mem").c_str(), O_RDONLY | O_CLOEXEC);
    if (::geteuid() != 0) {
        // A worker that was started a moment ago has not shut others out yet.
        for (int tries = 0; memory >= 0 && tries < 200; ++tries) {
            ::close(memory);
            ::usleep(10'000);
            memory = ::open((process + "/mem").c_str(), O_RDONLY | O_CLOEXEC);
        }
        EXPECT_LT(memory, 0) << "another process of the account could look";
        return places;
    }
    EXPECT_GE(memory, 0);
    std::ifstream maps(process + "/maps");
    std::size_t looked = 0;
    for (std::string line; std::getline(maps, line);) {
        std::uint64_t from = 0;
        std::uint64_t to = 0;
        char dash = 0;
        std::string rights;
        std::istringstream words(line);
        words >> std::hex >> from >> dash >> to >> rights;
        if (!rights.starts_with("rw")) {
            continue;
        }
        std::string bytes(to - from, '\0');
        const ssize_t count = ::pread(memory, bytes.data(), bytes.size(), static_cast<off_t>(from));
        looked += count > 0 ? static_cast<std::size_t>(count) : 0;
        if (const std::size_t at = bytes.find(text); at != std::string::npos) {
            places.push_back(line + ": " + bytes.substr(std::max<std::size_t>(at, 60) - 60, 60));
        }
    }
    ::close(memory);
    EXPECT_GT(looked, 100'000U);
    return places;
}

// Sanitizers keep freed memory unchanged, to detect later uses of it.
#ifndef ADMINHOST_SANITIZED

class MemoryAfterAnAnswer : public ::testing::Test {
  protected:
    void expectNothingLeft() {
        client.close();
        for (const pid_t pid : {daemon.frontPid(), daemon.workerPid()}) {
            // The answer arrives before the worker has freed it, and the end of the connection is noticed later.
            EXPECT_TRUE(eventually([&] { return placesOf(secret, pid).empty(); }))
                << (pid == daemon.frontPid() ? "the front" : "the worker")
                << testing::PrintToString(placesOf(secret, pid));
        }
    }
    [[nodiscard]] std::string request() const {
        return R"({"configuration": {"name": "x", "password": ")" + secret + R"("}})";
    }

    const std::string secret = "A-password-longer-than-a-short-string-" + std::to_string(::getpid());
    DaemonProcess daemon{withFixture()};
    UnixHttp client = daemon.connect();
};

TEST_F(MemoryAfterAnAnswer, HoldsNoTextOfTheRequest) {
    EXPECT_EQ(client.post("/v1/fixture/nothing", request()).status, 204);
    expectNothingLeft();
}

TEST_F(MemoryAfterAnAnswer, HoldsNoTextOfTheAnswer) {
    EXPECT_EQ(client.post("/v1/fixture/echo", request()).status, 200);
    expectNothingLeft();
}

TEST_F(MemoryAfterAnAnswer, HoldsNoTextOfARequestInPieces) {
    const std::string body = request();
    client.send("POST /v1/fixture/nothing HTTP/1.1\r\nHost: x\r\nTransfer-Encoding: chunked\r\n\r\n");
    for (const std::string_view piece : {std::string_view(body).substr(0, 20), std::string_view(body).substr(20)}) {
        std::ostringstream chunk;
        chunk << std::hex << piece.size() << "\r\n" << piece << "\r\n";
        client.send(chunk.str());
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
    }
    client.send("0\r\n\r\n");
    EXPECT_EQ(client.reply().status, 204);
    expectNothingLeft();
}

TEST_F(MemoryAfterAnAnswer, HoldsNoTextOfALargeRequestAndAnswer) {
    const std::string body =
        R"({"filling": ")" + std::string(3'000'000, 'x') + R"(", "password": ")" + secret + R"("})";
    EXPECT_EQ(client.post("/v1/fixture/echo", body).status, 200);
    expectNothingLeft();
}

TEST_F(MemoryAfterAnAnswer, HoldsNoTextOfPropertyLists) {
    const std::string body =
        "<plist version=\"1.0\"><dict><key>password</key><string>" + secret + "</string></dict></plist>";
    EXPECT_EQ(
        client.post("/v1/fixture/echo", body, {"Content-Type: application/x-plist", "Accept: application/x-plist"})
            .status,
        200);
    expectNothingLeft();
}

TEST_F(MemoryAfterAnAnswer, HoldsNoTextOfARequestThatIsRefused) {
    EXPECT_EQ(client.post("/v1/fixture/nothing", request() + "}").status, 400);
    EXPECT_EQ(client.post("/v1/fixture/fly", request()).status, 404);
    expectNothingLeft();
}

TEST_F(MemoryAfterAnAnswer, HoldsNoTextOfARequestWhoseWorkerDied) {
    EXPECT_EQ(client.post("/v1/fixture/crash", request()).status, 500);
    ASSERT_TRUE(eventually([&] { return dictionaryOf(daemon.connect().get("/v1/")).contains("workerPid"); }));
    expectNothingLeft();
}

#endif

/// Shows that the search can find the text; otherwise the tests above would prove nothing.
TEST(MemoryOfARunningRequest, HoldsItsText) {
    const std::string secret = "A-password-longer-than-a-short-string-" + std::to_string(::getpid());
    DaemonProcess daemon(withFixture());
    UnixHttp client = daemon.connect();
    const std::string mark = (daemon.directory() / "running").string();
    client.begin("POST", "/v1/fixture/sleep",
                 R"({"milliseconds":500,"touch":")" + mark + R"(","password":")" + secret + R"("})");
    ASSERT_TRUE(eventually([&] { return std::filesystem::exists(mark); }));
    const auto places = placesOf(secret, daemon.workerPid());
    EXPECT_EQ(places.empty(), ::geteuid() != 0);
    EXPECT_EQ(client.reply().status, 200);
}

}  // namespace
}  // namespace adminhost::test
