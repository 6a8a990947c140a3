// The addresses that serve the plug-ins' log files.

#include "tests/system/host/Host.h"

#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <sys/stat.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using ::testing::Not;

class Logs : public ::testing::Test {
  protected:
    Logs() {
        fs::create_directories(directory());
        fs::permissions(directory(), fs::perms(0755));
        append("one\ntwo\n");
    }

    [[nodiscard]] fs::path directory() const { return daemon.directory() / "root/var/log/fixture"; }
    [[nodiscard]] fs::path file() const { return directory() / "fixture.log"; }
    void append(const std::string& text) const { std::ofstream(file(), std::ios::app) << text; }
    [[nodiscard]] HttpReply get(const std::string& rest) const { return daemon.connect().get("/v1/logs" + rest); }
    [[nodiscard]] Dictionary piece(const std::string& query = "") const { return dictionaryOf(get("/log" + query)); }
    static std::string bytesOf(const Dictionary& piece) {
        const Data* data = piece.get("data").data();
        return data == nullptr ? "(no data)" : std::string(data->begin(), data->end());
    }
    static std::string after(const Dictionary& piece) {
        return "?inode=" + std::to_string(piece.get("inode").unsignedInteger().value_or(0)) +
               "&offset=" + std::to_string(piece.get("next").unsignedInteger().value_or(0));
    }

    const DaemonProcess daemon{withFixture()};
};

TEST_F(Logs, ListHasNamesAndSizes) {
    const Dictionary answer = dictionaryOf(get(""));
    const Array* list = answer.get("logs").array();
    ASSERT_NE(list, nullptr);
    ASSERT_EQ(list->size(), 2U);
    const Dictionary& first = *(*list)[0].dictionary();
    EXPECT_EQ(first.text("name"), "log");
    EXPECT_EQ(first.text("plugin"), "fixture");
    EXPECT_EQ(first.text("path"), "/var/log/fixture/fixture.log");
    EXPECT_EQ(first.get("size"), Value(8));
    const Dictionary& second = *(*list)[1].dictionary();
    EXPECT_EQ(second.text("name"), "other");
    EXPECT_FALSE(second.contains("size")) << "it does not exist";
    EXPECT_FALSE(second.contains("problem"));
}

TEST_F(Logs, PieceFollowsTheFileThroughARotation) {
    const Dictionary first = piece();
    EXPECT_EQ(bytesOf(first), "one\ntwo\n");
    append("three\n");
    const Dictionary second = piece(after(first));
    EXPECT_EQ(bytesOf(second), "three\n");
    append("four\n");
    fs::rename(file(), directory() / "fixture.log.1");
    append("five\n");
    const Dictionary third = piece(after(second));
    EXPECT_EQ(bytesOf(third), "four\n");
    EXPECT_EQ(bytesOf(piece(after(third))), "five\n");
}

TEST_F(Logs, UnknownLogIs404AndNamesTheKnownOnes) {
    const HttpReply reply = get("/nolog");
    expectError(reply, 404, "UNKNOWN_LOG");
    EXPECT_THAT(reply.body, HasSubstr("Known logs: log, other."));
    expectError(get("/log?plugin=another"), 404, "UNKNOWN_LOG");
}

TEST_F(Logs, NameIsNeverAPath) {
    expectError(get("/../../../etc/passwd"), 404, "UNKNOWN_LOG");
    expectError(get("/%2e%2e%2ffixture.log"), 404, "UNKNOWN_LOG");
}

TEST_F(Logs, ArgumentThatIsNotANumberIs400) {
    expectError(get("/log?inode=x"), 400, "MALFORMED_ADDRESS");
    expectError(get("/log?offset=-1"), 400, "MALFORMED_ADDRESS");
}

TEST_F(Logs, FileThatSomeoneLinkedThereIsNotPrinted) {
    std::ofstream(daemon.directory() / "secret") << "top secret\n";
    fs::remove(file());
    fs::create_symlink(daemon.directory() / "secret", file());
    EXPECT_EQ(get("/log").status, 200) << "in a directory of root a link is the administrator's";
    fs::permissions(directory(), fs::perms(0777));
    const HttpReply reply = get("/log");
    expectError(reply, 500, "LOG_NOT_READABLE");
    EXPECT_THAT(reply.body, Not(HasSubstr("top secret")));
    EXPECT_THAT(get("").body, HasSubstr("is a link"));
    fs::remove(file());
    fs::create_hard_link(daemon.directory() / "secret", file());
    expectError(get("/log"), 500, "LOG_NOT_READABLE");
}

TEST_F(Logs, PipeIsRefusedAtOnce) {
    fs::remove(file());
    ASSERT_EQ(::mkfifo(file().c_str(), 0600), 0);
    expectError(get("/log"), 500, "LOG_NOT_READABLE");
}

TEST_F(Logs, FollowingLeavesTheLogOfRequestsAndTheSystemLogAsTheyAre) {
    const HttpReply first = get("/log");
    EXPECT_EQ(daemon.connect().get("/v1/requests/" + first.headers.at("request-id")).status, 200);
    EXPECT_TRUE(daemon.waitForLog("/logs by uid"));
    const std::string before = daemon.log();
    const HttpReply next = get("/log" + after(dictionaryOf(first)));
    EXPECT_EQ(next.status, 200);
    EXPECT_EQ(daemon.connect().get("/v1/requests/" + next.headers.at("request-id")).status, 404);
    EXPECT_EQ(daemon.log(), before);
}

TEST_F(Logs, AddressIsForReadingOnly) {
    expectError(daemon.connect().post("/v1/logs/log", "{}"), 405, "METHOD_NOT_ALLOWED");
    expectError(daemon.connect().post("/v1/doctor", "{}"), 405, "METHOD_NOT_ALLOWED");
}

}  // namespace
}  // namespace adminhost::test
