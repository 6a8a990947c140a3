// Each system call with which a write of settings changes or opens something fails once, fails always, and is the
// process's last one. Afterwards each settings file is the whole old one or the whole new one, and after the next write
// there are no other files beside them.

#include "tests/integration/writefaults/Service.h"
#include "tests/support/Traced.h"

#include <csignal>
#include <cstdio>
#include <set>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {
namespace {

using testing::AnyOf;
using testing::IsEmpty;

struct Call : adminhost::test::TracedCall {
    bool changes;  ///< something on the disk; the other calls only open, read or close
};

/// The counts that are printed at the end.
struct Counts {
    int runs = 0;
    int refused = 0;
    int files = 0;
    int old = 0;
    int fresh = 0;    ///< the new one
    int started = 0;  ///< the new one without the old keys, because the old one could not be loaded
    int broken = 0;

    void print(const char* what) const {
        std::printf("%-22s %6d %8d %8d %6d %6d %13d %7d\n", what, runs, refused, files, old, fresh, started, broken);
    }
};

class WriteFaults : public testing::Test {
  protected:
    void SetUp() override {
        before = service.contents();
        ASSERT_EQ(service.writeAlone(), written) << service.said();
        after = service.contents();
        service.makeWithoutFiles();
        ASSERT_EQ(service.writeAlone(), written) << service.said();
        fromNothing = service.contents();
        ASSERT_EQ(before.size() + after.size() + fromNothing.size(), 9U);
        for (const std::string_view file : settingsFiles) {
            ASSERT_EQ((std::set{before[file], after[file], fromNothing[file]}.size()), 3U);
        }
        service.makeOld();
    }
    static void TearDownTestSuite() {
        std::printf("%-22s %6s %8s %8s %6s %6s %13s %7s\n", "fault", "runs", "refused", "files", "old", "new",
                    "from nothing", "broken");
        for (const auto& [name, count] : counts) {
            count.print(name.c_str());
        }
        static_cast<void>(std::fflush(stdout));
    }

    std::int32_t write(const std::vector<std::string>& options) { return service.writeTraced(options, logFile()); }
    [[nodiscard]] std::string logFile() const { return service.root.path("/strace").string(); }

    /// The calls between the two marks of an undisturbed write with which a file is opened, created, changed or closed.
    /// Not getrandom: the XML library ends the process when that fails, before anything is written.
    std::vector<Call> callsOfTheWay() {
        static const std::set<std::string> changing{
            "openat",    "write",    "fsync",     "fdatasync",    "fchmod",     "fchown",   "fchownat",
            "fsetxattr", "renameat", "renameat2", "rename",       "close",      "unlinkat", "unlink",
            "linkat",    "mkdir",    "mkdirat",   "fremovexattr", "flistxattr", "flock",    "newfstatat"};
        service.makeOld();
        EXPECT_EQ(write({}), written) << service.said();
        std::vector<Call> calls;
        for (adminhost::test::TracedCall& call : adminhost::test::callsBetweenMarks(logFile())) {
            if (changing.contains(call.name)) {
                const bool looks =
                    std::set<std::string>{"newfstatat", "close", "flock", "flistxattr"}.contains(call.name) ||
                    (call.name == "openat" && call.line.find("O_CREAT") == std::string::npos);
                calls.push_back({std::move(call), !looks});
            }
        }
        return calls;
    }

    /// Each file is the old one, the new one, or (after a load that failed) the new one without the old keys.
    void checkFiles(Counts& count) {
        ++count.runs;
        const Contents now = service.contents();
        EXPECT_EQ(now.size(), settingsFiles.size());
        for (const auto& [file, text] : now) {
            ++count.files;
            int& state = text == before[file]        ? count.old
                         : text == after[file]       ? count.fresh
                         : text == fromNothing[file] ? count.started
                                                     : count.broken;
            ++state;
            EXPECT_THAT(text, AnyOf(before[file], after[file], fromNothing[file])) << file;
        }
    }
    /// The next write, undisturbed.
    void checkNextWrite() {
        EXPECT_TRUE(service.writeHere());
        EXPECT_TRUE(service.marked());
        for (const std::string& name : service.others()) {
            // A list that could not be loaded counts as missing: it is kept beside the new one, and without the
            // identity list the member has no number.
            EXPECT_TRUE(name.find(".plist.unreadable-") != std::string::npos ||
                        name == "member_preferences_(null).plist")
                << name << " is left";
        }
        for (const auto& [file, text] : service.contents()) {
            EXPECT_THAT(text, AnyOf(after[file], fromNothing[file])) << file;
        }
    }

    void failEach(const char* again) {
        const std::array codes{"ENOSPC", "EIO", "EROFS", "EACCES"};
        const std::vector<Call> calls = callsOfTheWay();
        EXPECT_GE(calls.size(), 60U);
        for (const Call& call : calls) {
            for (std::size_t i = 0; i < codes.size(); ++i) {
                const std::string code = codes[i];
                if (!call.changes &&
                    (call.number % 4 != 0 || static_cast<std::size_t>(call.number / 4) % codes.size() != i)) {
                    continue;  // only a sample of the calls is tested
                }
                service.makeOld();
                SCOPED_TRACE(call.line.substr(0, 300) + " fails with " + code + again);
                const std::int32_t status =
                    write({"-e", "trace=" + call.name, "-e",
                           "inject=" + call.name + ":error=" + code + ":when=" + std::to_string(call.number) + again});
                ASSERT_TRUE(status == written || status == refused || status == otherStatus)
                    << status << service.said();
                Counts& count = counts[std::string("call fails ") + (*again == 0 ? "once" : "for ever")];
                count.refused += status == written ? 0 : 1;
                checkFiles(count);
                if (status == refused && !(call.name == "write" && *again != 0)) {  // else it cannot report why
                    EXPECT_NE(service.said().find(".plist: "), std::string::npos) << "names path and reason";
                }
                if (status == written && call.changes) {
                    for (const auto& [file, text] : service.contents()) {
                        EXPECT_NE(text, before[file]) << file;
                    }
                }
                checkNextWrite();
            }
        }
    }

    Service service;
    Contents before;
    Contents after;
    Contents fromNothing;
    inline static std::map<std::string, Counts> counts;
};

TEST_F(WriteFaults, WayWritesThreeFilesEachFlushedBeforeItIsRenamed) {
    std::vector<std::string> order;
    for (const Call& call : callsOfTheWay()) {
        if (call.name == "fsync" || call.name == "renameat") {
            order.push_back(call.name);
        }
    }
    EXPECT_EQ(order, (std::vector<std::string>{"fsync", "renameat", "fsync", "fsync", "renameat", "fsync", "fsync",
                                               "renameat", "fsync", "fsync"}))
        << "the last is the marker's";
}

TEST_F(WriteFaults, EachCallThatFailsOnceLeavesEveryFileOldOrNewAndWhole) {
    failEach("");
    EXPECT_GE(counts["call fails once"].refused, 60);
}

TEST_F(WriteFaults, EachCallThatAlwaysFailsLeavesEveryFileOldOrNewAndWhole) {
    failEach("+");
    EXPECT_GE(counts["call fails for ever"].refused, 60);
}

TEST_F(WriteFaults, ProcessKilledAtEachCallLeavesEveryFileOldOrNewAndWhole) {
    int leftovers = 0;
    Counts& count = counts["process is killed"];
    for (const Call& call : callsOfTheWay()) {
        if (!call.changes && call.number % 4 != 0) {
            continue;  // the disk is as it was at the call before
        }
        service.makeOld();
        SCOPED_TRACE(call.line);
        ASSERT_EQ(write({"-e", "inject=" + call.name + ":signal=SIGKILL:when=" + std::to_string(call.number)}),
                  128 + SIGKILL);
        checkFiles(count);
        leftovers += service.others().empty() ? 0 : 1;
        checkNextWrite();
        EXPECT_THAT(service.contents(), after) << "what a load failed to read is not the matter here";
        EXPECT_THAT(service.others(), IsEmpty());
    }
    EXPECT_GE(leftovers, 9) << "three files, each killed with its temporary file there";
    EXPECT_EQ(count.started, 0);
    EXPECT_GT(count.old, 0);
    EXPECT_GT(count.fresh, 0);
}

TEST_F(WriteFaults, OneFailedReadOfTheIdentityPreferencesMovesAndMisplacesNothing) {
    int reads = 0;
    for (const Call& call : callsOfTheWay()) {
        if (call.name != "openat" || call.changes || call.line.find(identityFile) == std::string::npos) {
            continue;
        }
        ++reads;
        service.makeOld();
        SCOPED_TRACE(call.line);
        EXPECT_EQ(write({"-e", "trace=openat", "-e", "inject=openat:error=EIO:when=" + std::to_string(call.number)}),
                  written)
            << service.said();
        EXPECT_EQ(service.contents(), after);
        EXPECT_THAT(service.others(), IsEmpty());
    }
    EXPECT_GE(reads, 3);
}

TEST_F(WriteFaults, WriteOfNoBytesIsAFailureAndNotALoop) {
    for (const Call& call : callsOfTheWay()) {
        if (call.name != "write") {
            continue;
        }
        service.makeOld();
        EXPECT_EQ(write({"-e", "inject=write:retval=0:when=" + std::to_string(call.number)}), refused);
        checkFiles(counts["write takes nothing"]);
        checkNextWrite();
    }
    EXPECT_GE(counts["write takes nothing"].runs, 3);
}

TEST_F(WriteFaults, ShortWriteThatCannotGoOnLeavesTheOldFileWhole) {
    for (const char* bytes : {"0", "1", "4096", "20000"}) {
        service.makeOld();
        SCOPED_TRACE(bytes);
        EXPECT_EQ(service.writeAlone(bytes), refused);
        EXPECT_EQ(service.contents(), before);
        EXPECT_THAT(service.others(), IsEmpty());
        checkFiles(counts["write is cut short"]);
        checkNextWrite();
    }
}

}  // namespace
}  // namespace lumio

int main(int argc, char** argv) {
    if (argc >= 3 && std::string(argv[1]) == "--write") {
        return lumio::writeBetweenMarks({argv + 2, argv + argc});
    }
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
