// Each system call of writing a property list fails once, fails always, and is the process's last one. The test program
// is also the writer: with --write it writes one list between two calls that mark the write in strace's log.

#include "platform/plist/PropertyList.h"
#include "tests/support/Traced.h"

#include <algorithm>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>
#include <map>
#include <set>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/xattr.h>
#include <unistd.h>

namespace {

using namespace adminhost;
namespace fs = std::filesystem;
using test::TracedCall;

/// A list of several pages, so that the bytes do not fit into one block.
Value listOf(const std::string& word) {
    Array array;
    for (int i = 0; i < 2000; ++i) {
        array.emplace_back(word + " " + std::to_string(i));
    }
    return Dictionary{{"word", word}, {"array", std::move(array)}};
}

int writeBetweenMarks(const char* path, const char* word) {
    const Value list = listOf(word);
    test::markBegin();
    const auto written = writePropertyList(list, HostPath(path));
    test::markEnd();
    if (!written) {
        std::cerr << written.error().description.value_or("no description");
    }
    return written ? 0 : 1;
}

class PlistFaults : public testing::TestWithParam<bool> {
  protected:
    void SetUp() override {
        std::string place = fs::temp_directory_path() / "faults-XXXXXX";
        ASSERT_NE(::mkdtemp(place.data()), nullptr);
        _dir = place;
        fs::create_directory(_dir / "files");
        _file = _dir / "files" / "a.plist";
        makeOld();
    }
    void TearDown() override { fs::remove_all(_dir); }

    /// The state before each write: a file with an attribute and a leftover, or nothing at all.
    void makeOld() const {
        for (const auto& entry : fs::directory_iterator(_dir / "files")) {
            fs::remove(entry);
        }
        if (hasOld()) {
            std::ofstream(_file, std::ios::binary) << xmlPropertyList(listOf("old")).value_or("");
            ASSERT_EQ(::setxattr(_file.c_str(), "user.note", "kept", 4, 0), 0);
            std::ofstream(leftover()) << "half";
        }
    }
    [[nodiscard]] static bool hasOld() { return GetParam(); }

    std::int32_t write(std::vector<std::string> options, const std::string& word) {
        options.emplace_back("-f");
        return test::runTraced(options, _dir / "log", {fs::read_symlink("/proc/self/exe"), "--write", _file, word},
                               _error);
    }

    /// The calls of an undisturbed write.
    std::vector<TracedCall> callsOfTheWay() {
        EXPECT_EQ(write({}, "new"), 0) << _error;
        std::vector<TracedCall> calls = test::callsBetweenMarks(_dir / "log");
        std::erase_if(calls, [](const TracedCall& call) { return isMemory(call.name); });
        return calls;
    }

    /// Calls of the memory allocator; the C library handles their failures.
    static bool isMemory(const std::string& name) {
        return std::set<std::string>{"brk", "mmap", "munmap", "mremap", "madvise", "mprotect", "futex"}.contains(name);
    }

    [[nodiscard]] fs::path leftover() const { return _dir / "files" / ".a.plist.adminhost-0123456789abcdef"; }

    /// The next write, undisturbed: it succeeds and leaves only the file.
    void writeAgain() const {
        EXPECT_TRUE(writePropertyList(listOf("newer"), HostPath(_file)));
        EXPECT_TRUE(holds("newer"));
        EXPECT_EQ(temporaries(), 0);
    }

    [[nodiscard]] bool holds(const std::string& word) const {
        std::ifstream file(_file, std::ios::binary);
        const std::string bytes{std::istreambuf_iterator<char>(file), {}};
        return bytes == xmlPropertyList(listOf(word));
    }
    [[nodiscard]] bool isOld() const { return hasOld() ? holds("old") : !fs::exists(_file); }
    [[nodiscard]] bool isNew() const {
        char note[8];
        return holds("new") && (!hasOld() || ::getxattr(_file.c_str(), "user.note", note, sizeof note) == 4);
    }
    [[nodiscard]] long temporaries() const {
        return std::count_if(fs::directory_iterator(_dir / "files"), fs::directory_iterator{},
                             [](const auto& entry) { return entry.path().filename() != "a.plist"; });
    }

    fs::path _dir;
    fs::path _file;
    std::string _error;
};

TEST_P(PlistFaults, WayHasTheCallsThatMakeAWriteAtomicAndDurable) {
    std::map<std::string, int> counts;
    std::vector<std::string> order;
    for (const TracedCall& call : callsOfTheWay()) {
        ++counts[call.name];
        if (call.name == "fsync" || call.name == "renameat") {
            order.push_back(call.name);
        }
    }
    EXPECT_EQ(order, (std::vector<std::string>{"fsync", "renameat", "fsync"}));
    EXPECT_EQ(counts["fchmod"], 1);
    EXPECT_GE(counts["write"], 1);
    EXPECT_EQ(counts["fsetxattr"], hasOld() ? 1 : 0);
    EXPECT_TRUE(isNew());
}

TEST_P(PlistFaults, EachCallThatFailsLeavesTheOldFileOrTheNewOneWhole) {
    int failed = 0;
    int injected = 0;
    bool leftoverMayStay = hasOld();  // until its removal has been done; a failure before that is not the write's
    for (const TracedCall& call : callsOfTheWay()) {
        for (const char* code : {"ENOSPC", "EIO", "EROFS", "EACCES"}) {
            for (const char* again : {"", "+"}) {
                makeOld();
                SCOPED_TRACE(call.line + " fails with " + code + again);
                const std::int32_t status =
                    write({"--seccomp-bpf", "-e", "trace=" + call.name, "-e",
                           "inject=" + call.name + ":error=" + code + ":when=" + std::to_string(call.number) + again},
                          "new");
                ++injected;
                ASSERT_TRUE(status == 0 || status == 1) << status << _error;
                failed += status;
                if (status == 0) {
                    EXPECT_TRUE(isNew());
                } else if (_error.find("cannot flush the directory after replacing") == 0) {
                    EXPECT_TRUE(isNew());
                } else {
                    EXPECT_TRUE(isOld());
                    // A writer that cannot write at all cannot report the reason either.
                    EXPECT_NE(_error.find(_file.string() + ": ") != std::string::npos,
                              call.name == "write" && *again != 0)
                        << _error;
                }
                EXPECT_EQ(temporaries(), leftoverMayStay && fs::exists(leftover()) ? 1 : 0);
                writeAgain();
            }
        }
        leftoverMayStay = leftoverMayStay && call.name != "unlinkat";
    }
    EXPECT_GE(injected, 8 * 15);
    EXPECT_GE(failed, 8 * 8);
}

TEST_P(PlistFaults, ProcessKilledAtEachCallLeavesTheOldFileOrTheNewOneWhole) {
    int old = 0;
    int fresh = 0;
    int leftovers = 0;
    for (const TracedCall& call : callsOfTheWay()) {
        makeOld();
        SCOPED_TRACE(call.line);
        EXPECT_EQ(write({"-e", "inject=" + call.name + ":signal=SIGKILL:when=" + std::to_string(call.number)}, "new"),
                  128 + SIGKILL);
        EXPECT_TRUE(isOld() || isNew());
        (isOld() ? old : fresh)++;
        leftovers += temporaries() > 0 ? 1 : 0;
        writeAgain();
    }
    EXPECT_GE(old, 10);
    EXPECT_GE(fresh, 1);
    EXPECT_GE(leftovers, 4);
}

INSTANTIATE_TEST_SUITE_P(Plist, PlistFaults, testing::Bool(),
                         [](const auto& parameter) { return parameter.param ? "ReplacingAFile" : "MakingAFile"; });

}  // namespace

int main(int argc, char** argv) {
    if (argc == 4 && std::string(argv[1]) == "--write") {
        return writeBetweenMarks(argv[2], argv[3]);
    }
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
