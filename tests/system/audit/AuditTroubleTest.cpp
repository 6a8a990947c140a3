// The audit when processes are killed, entries are forged, the journal is stuck or the disk is full.

#include "adminhostd/AuditJournal.h"
#include "adminhostd/Peer.h"
#include "adminhostd/UnitProcesses.h"
#include "tests/system/audit/AuditFixture.h"

#include <chrono>
#include <csignal>
#include <cstdint>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::Not;
using testing::SizeIs;

TEST_F(AuditTest, WriteThatFailsHalfwayIsRecordedWithExactlyWhatIsOnDisk) {
    const std::string id =
        daemon->connect().post("/v1/fixture/reportWrite", R"({"changes": 2, "crash": true})").headers.at("request-id");
    const auto entries = awaitEntries(id, 2);
    EXPECT_EQ(entries[1].text("event"), "ended");
    EXPECT_EQ(entries[1].text("result"), "WORKER_FAILED");
    EXPECT_EQ(entries[1].get("changes").array()->size(), 2U);
    // The next worker finds the note of the one that died, whose end has been logged already.
    EXPECT_EQ(daemon->connect().post("/v1/fixture/reportWrite", "{}").status, 204);
    EXPECT_TRUE(eventually([&] { return !fs::exists(root.disk("/var/lib/adminhostd/begun/" + id)); }));
    EXPECT_EQ(daemon->log().find("had begun"), std::string::npos) << daemon->log();
}

TEST_F(AuditTest, KilledDaemonLeavesABeginningWhoseEndTheNextStartReports) {
    auto client = daemon->connect();
    const std::string id = beginWrite(client, 60'000);
    killAll();
    start();
    EXPECT_TRUE(daemon->waitForLog("request " + id + " fixture/reportWrite by uid 0 (root)")) << daemon->log();
    EXPECT_THAT(daemon->log(), HasSubstr("had begun when the daemon ended; its operation was interrupted, changes: 2 "
                                         "(cameras Studio users: (not set) -> anna; settings port: 80 -> 443)"));
    const auto entries = awaitEntries(id, 2);
    EXPECT_EQ(entries[0].text("event"), "begun");
    EXPECT_EQ(entries[1].text("event"), "unfinished");
    EXPECT_EQ(entries[1].get("changes").array()->size(), 2U);
    EXPECT_TRUE(eventually([&] { return fs::is_empty(root.disk("/var/lib/adminhostd/begun")); })) << "reported once";
    std::cout << journalctl({"--output=cat", "ADMINHOST_REQUEST=" + id})
              << ctl({"audit", "--key", "settings.port"}).output;
}

TEST_F(AuditTest, WorkerThatFinishesWithoutItsFrontNotesTheEnd) {
    auto client = daemon->connect();
    const std::string id = beginWrite(client, 300);
    for (const pid_t process : childrenOf(daemon->pid())) {
        std::ifstream file("/proc/" + std::to_string(process) + "/comm");
        std::string name;
        std::getline(file, name);
        if (name.starts_with("adminhostd-fro")) {
            ::kill(process, SIGKILL);
        }
    }
    ASSERT_TRUE(daemon->waitForLog("had begun when the daemon ended")) << daemon->log();
    const auto entries = awaitEntries(id, 2);
    EXPECT_EQ(entries[1].text("result"), "its operation was completed");
}

TEST_F(AuditTest, PlantedSecretIsInNoEvent) {
    const std::string id = daemon->connect()
                               .post("/v1/fixture/reportWrite", R"({"password": "hunter2", "text": "hunter2"})")
                               .headers.at("request-id");
    daemon->connect().post("/v1/fixture/hunter2", "{}");
    daemon->connect().post("/v1/hunter2/echo", "{}");
    const auto entries = awaitEntries(id, 2);
    EXPECT_THAT(jsonOf(entries[1]), HasSubstr("configuration.(secret)"));
    EXPECT_THAT(journalctl({"--output=export"}), Not(HasSubstr("hunter2")));
    EXPECT_THAT(daemon->log(), Not(HasSubstr("hunter2")));
}

TEST_F(AuditTest, ForgedEntryOfAnotherAccountIsInTheJournalButNotShown) {
    const std::string id = "f0f0f0f0-0000-4000-8000-" + fmt::format("{:012x}", ::getpid());
    const std::string genuine = daemon->connect().post("/v1/fixture/echo").headers.at("request-id");
    EXPECT_EQ(test::runAs({test::anna}, "/",
                          [&] {
                              const std::string forged =
                                  "MESSAGE_ID=0438a259a6154df7a1b771a3b0377388\nMESSAGE=forged\n"
                                  "SYSLOG_IDENTIFIER=adminhostd\n_UID=0\n_SYSTEMD_UNIT=adminhostd.service\n"
                                  "ADMINHOST_EVENT=ended\nADMINHOST_COMMAND=writeSettings\n"
                                  "ADMINHOST_UID=0\nADMINHOST_USER=root\nADMINHOST_REQUEST=" +
                                  id + "\n";
                              return test::runProgram({"logger", "--journald"}, test::Errors::merge, forged).status;
                          }),
              0);
    ASSERT_TRUE(
        eventually([&] { return journalctl({"ADMINHOST_REQUEST=" + id}).find("forged") != std::string::npos; }));
    awaitEntries(genuine, 1);
    EXPECT_THAT(entriesOf(id), SizeIs(0));
    const std::string shown = ctl({"--format", "json", "audit"}).output;
    EXPECT_THAT(shown, HasSubstr(genuine));
    EXPECT_THAT(shown, Not(HasSubstr(id)));
    std::cout << "In the journal:\n"
              << journalctl({"--output=verbose", "ADMINHOST_REQUEST=" + id}) << "Of it, \"adminhostctl audit\" shows "
              << entriesOf(id).size() << " entries.\n";
}

TEST_F(AuditTest, RefusalsOfOneAccountAreBoundedAndCounted) {
    for (int i = 0; i < 30; ++i) {
        EXPECT_EQ(test::connectAs({test::anna}, daemon->socket()).get("/v1/").status, 403);
    }
    const std::string last = daemon->connect().post("/v1/fixture/echo").headers.at("request-id");
    ASSERT_TRUE(daemon->waitForLog(last));
    const std::string log = daemon->log();
    std::size_t refusals = 0;
    for (std::size_t at = 0; (at = log.find("/overview by uid 20001 (anna)", at)) != std::string::npos; ++at) {
        ++refusals;
    }
    EXPECT_EQ(refusals, 20U);
    EXPECT_EQ(test::connectAs({test::cora}, daemon->socket()).get("/v1/").status, 403);
    EXPECT_TRUE(daemon->waitForLog("by uid 20003 (cora)")) << "another account has a bound of its own";
}

TEST_F(AuditTest, WaitingRequestsOfOneAccountAreBoundedAndOthersGoOn) {
    auto writer = daemon->connect();
    beginWrite(writer, 1000);
    std::vector<test::UnixHttp> waiting;
    for (int i = 0; i < 2; ++i) {
        waiting.push_back(test::connectAs({test::bert}, daemon->socket()));
        waiting.back().begin("POST", "/v1/fixture/echo", fmt::format("{{\"n\": {}}}", i));
    }
    ASSERT_TRUE(eventually([&] { return dictionaryOf(daemon->connect().get("/v1/")).get("waiting") == Value(2); }));
    const test::HttpReply refused = test::connectAs({test::bert}, daemon->socket()).post("/v1/fixture/echo", "{}");
    EXPECT_EQ(refused.status, 503);
    EXPECT_EQ(dictionaryOf(refused).text("error"), "TOO_MANY_WAITING_OF_ACCOUNT");
    EXPECT_EQ(dictionaryOf(refused).text("message"),
              "2 requests of this account wait already; wait for their answers.");
    EXPECT_TRUE(refused.headers.contains("retry-after"));
    std::ofstream(daemon->directory() / "config")
        << "queue_limit_per_account = 3\n[[permission]]\nusers = [\"bert\"]\nclasses = [\"read\"]\n";
    daemon->signal(SIGHUP);
    ASSERT_TRUE(daemon->waitForLog("the configuration has been read again"));
    waiting.push_back(test::connectAs({test::bert}, daemon->socket()));
    waiting.back().begin("POST", "/v1/fixture/echo", "{\"n\": 2}");
    EXPECT_TRUE(eventually([&] { return dictionaryOf(daemon->connect().get("/v1/")).get("waiting") == Value(3); }));
    EXPECT_EQ(daemon->connect().post("/v1/fixture/echo", "{}").status, 200) << "root has no such bound";
    for (auto& client : waiting) {
        EXPECT_EQ(client.reply().status, 200);
    }
    EXPECT_EQ(test::connectAs({test::bert}, daemon->socket()).post("/v1/fixture/echo", "{}").status, 200);
}

TEST_F(AuditTest, EntryOfAnotherUnitIsNotShown) {
    const auto start = static_cast<std::uint64_t>(std::time(nullptr));
    const std::string genuine = daemon->connect().post("/v1/fixture/echo").headers.at("request-id");
    awaitEntries(genuine, 1);
    const auto shownOf = [&](const std::string& unit) {
        protocol::ReadAudit order;
        order.since = start;
        order.milliseconds = 10'000;
        const protocol::Answer answer = auditAnswer(order, ::geteuid(), unit);
        EXPECT_EQ(answer.outcome, protocol::Outcome::answered) << answer.message;
        return answer.bytes;
    };
    EXPECT_THAT(shownOf(unitOf(controlGroupOf(daemon->pid()))), HasSubstr(genuine));
    EXPECT_THAT(shownOf("another.service"), Not(HasSubstr(genuine)));
}

TEST_F(AuditTest, WorkerShowsEntriesOfItsOwnUnitOnly) {
    const std::string groups = std::getenv("JOURNAL_GROUPS");
    if (groups.empty()) {
        // Only root can create a unit. In whatever unit this account runs, its own entries are shown.
        ASSERT_NE(std::string(std::getenv("JOURNAL_KIND")), "root") << "mount cgroup2 must be permitted";
        const std::string id = daemon->connect().post("/v1/fixture/echo").headers.at("request-id");
        EXPECT_THAT(awaitEntries(id, 1), SizeIs(1));
        return;
    }
    const auto enter = [](const std::string& group) {
        std::ofstream file(group + "/cgroup.procs");
        file << ::getpid() << std::flush;
        return file.good();
    };
    fs::create_directory(groups + "/adminhostd.service");
    ASSERT_TRUE(enter(groups + "/adminhostd.service"));
    daemon.reset();
    start();
    ASSERT_TRUE(enter("/sys/fs/cgroup"));
    const std::string id = daemon->connect().post("/v1/fixture/echo").headers.at("request-id");
    awaitEntries(id, 1);
    EXPECT_THAT(journalctl({"--output=verbose", "ADMINHOST_REQUEST=" + id}),
                HasSubstr("_SYSTEMD_UNIT=adminhostd.service"));
    const std::string forged = fmt::format("{}-forged", id);
    const auto written =
        test::runProgram({"logger", "--journald"}, test::Errors::merge,
                         "MESSAGE_ID=0438a259a6154df7a1b771a3b0377388\nMESSAGE=forged\nADMINHOST_EVENT=ended\n"
                         "ADMINHOST_REQUEST=" +
                             forged + "\n");
    ASSERT_EQ(written.status, 0);
    ASSERT_TRUE(
        eventually([&] { return journalctl({"ADMINHOST_REQUEST=" + forged}).find("forged") != std::string::npos; }));
    EXPECT_THAT(entriesOf(forged), SizeIs(0)) << "of the same account, but of no unit";
    daemon.reset();
}

TEST_F(AuditTest, ReadingAfterAPlaceThatTheJournalHasRemovedReportsAGapAndEverythingThatIsLeft) {
    awaitEntries(daemon->connect().post("/v1/fixture/echo").headers.at("request-id"), 1);
    const std::string place(page("").text("next"));
    ASSERT_NE(place, "");
    const auto archived = [] {
        std::vector<fs::path> files;
        for (const auto& file : fs::recursive_directory_iterator("/run/log/journal")) {
            if (file.path().filename().string().starts_with("system@")) {
                files.push_back(file.path());
            }
        }
        return files;
    };
    pid_t journald = 0;
    std::ifstream("/run/journald.pid") >> journald;
    ::kill(journald, SIGUSR2);  // rotates the files
    ASSERT_TRUE(eventually([&] { return !archived().empty(); }, std::chrono::seconds(30)));
    std::vector<std::string> left;
    for (int i = 0; i < 3; ++i) {
        left.push_back(daemon->connect().post("/v1/fixture/echo").headers.at("request-id"));
        awaitEntries(left.back(), 1);
    }
    for (const fs::path& file : archived()) {
        fs::remove(file);
    }
    const Dictionary rest = page("after=" + place);
    EXPECT_EQ(rest.get("gap"), Value(true));
    std::vector<std::string> found;
    for (const Value& entry : *rest.get("entries").array()) {
        if (entry.dictionary()->text("command") == "echo") {
            found.emplace_back(entry.dictionary()->text("request"));
        }
    }
    EXPECT_EQ(found, left);
}

/// A journal that does not read what it is sent.
class StuckJournal {
  public:
    StuckJournal() {
        std::ifstream("/run/journald.pid") >> _pid;
        ::kill(_pid, SIGSTOP);
    }
    StuckJournal(const StuckJournal&) = delete;
    StuckJournal& operator=(const StuckJournal&) = delete;
    ~StuckJournal() { ::kill(_pid, SIGCONT); }

  private:
    pid_t _pid = 0;
};

TEST_F(AuditTest, EndOfAChangeThatTheJournalHasNotReadIsReportedByTheNextStart) {
    const std::string id = fmt::format("01234567-89ab-cdef-0124-{:012x}", ++ids + ::getpid() * 1000LL);
    const std::string note = root.disk("/var/lib/adminhostd/begun/" + id);
    auto client = daemon->connect();
    {
        const StuckJournal stuck;
        for (int i = 0; i < 1000; ++i) {  // more than its socket holds
            ASSERT_EQ(client.post("/v1/fixture/nothing").status, 204);
        }
        EXPECT_EQ(client.post("/v1/fixture/reportWrite", R"({"changes": 1})", {"Request-Id: " + id}).status, 204);
        ASSERT_EQ(client.post("/v1/fixture/echo").status, 200) << "the worker has read all that it was sent before";
        EXPECT_TRUE(fs::exists(note)) << "its end is only in the daemon's memory";
        killAll();
    }
    start();
    const auto entries = awaitEntries(id, 1);
    EXPECT_EQ(entries[0].text("event"), "unfinished");
    EXPECT_EQ(entries[0].text("result"), "its operation was completed");
    EXPECT_TRUE(eventually([&] { return !fs::exists(note); }));
}

TEST_F(AuditTest, NoteIsRemovedOnceAStuckJournalReadsAgain) {
    const std::string id = fmt::format("01234567-89ab-cdef-0125-{:012x}", ++ids + ::getpid() * 1000LL);
    const std::string note = root.disk("/var/lib/adminhostd/begun/" + id);
    auto client = daemon->connect();
    {
        const StuckJournal stuck;
        for (int i = 0; i < 1000; ++i) {
            ASSERT_EQ(client.post("/v1/fixture/nothing").status, 204);
        }
        EXPECT_EQ(client.post("/v1/fixture/reportWrite", R"({"changes": 1})", {"Request-Id: " + id}).status, 204);
        ASSERT_EQ(client.post("/v1/fixture/echo").status, 200);
        EXPECT_TRUE(fs::exists(note));
    }
    EXPECT_TRUE(eventually([&] { return !fs::exists(note); })) << "without another request";
    EXPECT_THAT(awaitEntries(id, 2), SizeIs(2));
}

std::string findingOf(const test::DaemonProcess& daemon, std::string_view name) {
    const Dictionary answer = dictionaryOf(daemon.connect().get("/v1/doctor"));
    for (const Value& check : *answer.get("checks").array()) {
        if (check.dictionary()->text("name") == name) {
            return fmt::format("{}: {}", check.dictionary()->text("state"), check.dictionary()->text("found"));
        }
    }
    return {};
}

TEST_F(AuditTest, JournalThatIsStuckStopsNoRequestAndLostEventsAreAFinding) {
    EXPECT_EQ(findingOf(*daemon, "audit"), "ok: Who does what is recorded in the journal.");
    {
        const StuckJournal stuck;
        auto client = daemon->connect();
        for (int i = 0; i < 4000; ++i) {
            ASSERT_EQ(client.post("/v1/fixture/nothing").status, 204);
        }
        EXPECT_THAT(findingOf(*daemon, "audit"),
                    HasSubstr(" events could not be written since the daemon was started."));
    }
    EXPECT_TRUE(eventually([&] {
        const std::string id = daemon->connect().post("/v1/fixture/echo").headers.at("request-id");
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        return journalctl({"ADMINHOST_REQUEST=" + id}).find(id) != std::string::npos;
    })) << "once the journal reads again, events arrive again";
}

TEST_F(AuditTest, FreeSpaceOfTheJournalIsChecked) {
    const std::string finding = findingOf(*daemon, "free space, journal");
    EXPECT_THAT(finding, HasSubstr(" are free for /run/log/journal, "));
    fs::create_directory("/var/log/journal");
    const std::string kept = findingOf(*daemon, "free space, journal");
    fs::remove("/var/log/journal");
    EXPECT_THAT(kept, HasSubstr(" are free for /var/log/journal, ")) << "where the journal is kept over a start";
}

TEST_F(AuditTest, FullDiskOfTheJournalIsAFinding) {
    fs::create_directory("/var/log/journal");
    std::string finding;
    {
        const test::Mount disk("/var/log/journal");
        disk.fill();
        finding = findingOf(*daemon, "free space, journal");
    }
    fs::remove("/var/log/journal");
    EXPECT_THAT(finding, HasSubstr("failure: 0 MB are free for /var/log/journal"));
    EXPECT_THAT(finding, HasSubstr("The journal drops events."));
}

TEST_F(AuditTest, FullDiskStopsNoChangeAndIsAFinding) {
    const test::Mount disk(root.disk("/var/lib/adminhostd"));
    disk.fill();
    const test::HttpReply reply = daemon->connect().post("/v1/fixture/reportWrite", R"({"changes": 1})");
    EXPECT_EQ(reply.status, 204) << reply.body;
    EXPECT_THAT(findingOf(*daemon, "audit"),
                testing::AllOf(HasSubstr("warning: "), HasSubstr("1 commands began without a note")));
    EXPECT_EQ(awaitEntries(reply.headers.at("request-id"), 2)[1].get("changes").array()->size(), 1U);
}

TEST_F(AuditTest, WithoutAJournalEventsAreLinesAndReadingSaysSo) {
    fs::rename("/run/systemd/journal/socket", "/run/systemd/journal/moved");
    // The daemon's socket is connected to the moved one still: another daemon finds none.
    daemon.reset();
    start();
    const std::string id = daemon->connect().post("/v1/fixture/echo").headers.at("request-id");
    EXPECT_TRUE(daemon->waitForLog("adminhostd: request " + id + " fixture/echo by uid 0 (root)"));
    const test::HttpReply reply = daemon->connect().get("/v1/audit");
    const std::string finding = findingOf(*daemon, "audit");
    const test::ProgramResult shown = ctl({"audit"});
    fs::rename("/run/systemd/journal/moved", "/run/systemd/journal/socket");
    EXPECT_EQ(reply.status, 500);
    EXPECT_THAT(reply.body, HasSubstr("AUDIT_NOT_READABLE"));
    EXPECT_THAT(reply.body, HasSubstr("systemd-journald does not run on this machine"));
    EXPECT_THAT(finding, HasSubstr("because systemd-journald does not run"));
    EXPECT_NE(shown.status, 0);
    EXPECT_THAT(shown.output, HasSubstr("systemd-journald does not run on this machine"));
}

}  // namespace
}  // namespace adminhost
