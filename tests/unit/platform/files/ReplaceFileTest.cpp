#include "platform/files/FilePlace.h"
#include "platform/files/ReplaceFile.h"

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <sys/xattr.h>
#include <unistd.h>

namespace {

using namespace adminhost;
namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::UnorderedElementsAre;

class ReplaceFile : public testing::Test {
  protected:
    void SetUp() override {
        std::string place = fs::temp_directory_path() / "replace-XXXXXX";
        ASSERT_NE(::mkdtemp(place.data()), nullptr);
        _dir = place;
    }
    void TearDown() override {
        setSystemRoot("/");
        fs::remove_all(_dir);
    }

    [[nodiscard]] std::string path(const std::string& name = "file") const { return _dir / name; }
    void write(const std::string& name, const std::string& bytes, mode_t mode = 0644) const {
        std::ofstream(path(name)) << bytes;
        ASSERT_EQ(::chmod(path(name).c_str(), mode), 0);
    }
    [[nodiscard]] std::string read(const std::string& name = "file") const {
        std::ifstream file(path(name));
        return {std::istreambuf_iterator<char>(file), {}};
    }
    [[nodiscard]] struct stat statusOf(const std::string& name = "file") const {
        struct stat status {};
        EXPECT_EQ(::lstat(path(name).c_str(), &status), 0);
        return status;
    }
    [[nodiscard]] mode_t modeOf(const std::string& name = "file") const { return statusOf(name).st_mode & 07777U; }
    [[nodiscard]] std::set<std::string> names() const {
        std::set<std::string> all;
        for (const auto& entry : fs::directory_iterator(_dir)) {
            all.insert(entry.path().filename());
        }
        return all;
    }
    [[nodiscard]] Result<void> replace(std::string_view bytes, const std::string& name = "file") const {
        return replaceFile(bytes, HostPath(path(name)));
    }
    static std::string attribute(const std::string& path, const char* name) {
        char value[256];
        const ssize_t size = ::getxattr(path.c_str(), name, value, sizeof value);
        return size < 0 ? std::string("none") : std::string(value, static_cast<std::size_t>(size));
    }

    fs::path _dir;
    const std::string _leftover = ".file.adminhost-0123456789abcdef";
};

TEST_F(ReplaceFile, NewFileIs0644WhateverTheUmask) {
    const mode_t before = ::umask(077);
    EXPECT_TRUE(replace("bytes"));
    ::umask(before);
    EXPECT_EQ(read(), "bytes");
    EXPECT_EQ(modeOf(), 0644U);
    EXPECT_THAT(names(), ElementsAre("file"));
}

TEST_F(ReplaceFile, ModeOfTheOldFileIsKept) {
    for (const mode_t mode : {0600U, 0640U, 0666U, 0755U, 0444U}) {
        fs::remove(path());
        write("file", "old", mode);
        EXPECT_TRUE(replace("new"));
        EXPECT_EQ(read(), "new");
        EXPECT_EQ(modeOf(), mode);
    }
}

TEST_F(ReplaceFile, OwnerOfTheOldFileIsKept) {
    write("file", "old", 0640);
    // Only the superuser may change owners; a file of another user keeps its owner.
    const bool given = ::chown(path().c_str(), 33, 44) == 0;
    const struct stat before = statusOf();
    EXPECT_EQ(before.st_uid, given ? 33 : ::geteuid());
    EXPECT_TRUE(replace("new"));
    EXPECT_EQ(statusOf().st_uid, before.st_uid);
    EXPECT_EQ(statusOf().st_gid, before.st_gid);
    EXPECT_EQ(modeOf(), 0640U);
    EXPECT_NE(statusOf().st_ino, before.st_ino);
}

TEST_F(ReplaceFile, ExtendedAttributesAreKept) {
    write("file", "old");
    ASSERT_EQ(::setxattr(path().c_str(), "user.note", "kept\0x", 6, 0), 0) << "needs a file system with attributes";
    EXPECT_TRUE(replace("new"));
    EXPECT_EQ(attribute(path(), "user.note"), std::string("kept\0x", 6));
    EXPECT_EQ(read(), "new");
}

/// The binary form of: user::rw-, user:33:r--, group::---, mask::r--, other::---
const std::string accessListBytes(
    "\2\0\0\0"
    "\1\0\6\0\xFF\xFF\xFF\xFF"
    "\2\0\4\0\x21\0\0\0"
    "\4\0\0\0\xFF\xFF\xFF\xFF"
    "\x10\0\4\0\xFF\xFF\xFF\xFF"
    "\x20\0\0\0\xFF\xFF\xFF\xFF",
    44);

TEST_F(ReplaceFile, AccessControlListIsKept) {
    write("file", "old", 0600);
    ASSERT_EQ(::setxattr(path().c_str(), "system.posix_acl_access", accessListBytes.data(), accessListBytes.size(), 0),
              0)
        << "needs a file system with access control lists";
    const mode_t mode = modeOf();
    EXPECT_TRUE(replace("new"));
    EXPECT_EQ(attribute(path(), "system.posix_acl_access"), accessListBytes);
    EXPECT_EQ(modeOf(), mode);
}

TEST_F(ReplaceFile, ListThatTheDirectoryGivesNewFilesDoesNotReachAFileWithoutOne) {
    write("file", "old", 0640);
    ASSERT_EQ(::setxattr(_dir.c_str(), "system.posix_acl_default", accessListBytes.data(), accessListBytes.size(), 0),
              0)
        << "needs a file system with access control lists";
    EXPECT_TRUE(replace("new"));
    EXPECT_EQ(attribute(path(), "system.posix_acl_access"), "none");
    EXPECT_EQ(modeOf(), 0640U);
}

TEST_F(ReplaceFile, LinkInTheFilesPlaceIsReplacedAndItsTargetUntouched) {
    write("target", "target", 0600);
    fs::create_symlink("target", path());
    EXPECT_TRUE(replace("new"));
    EXPECT_TRUE(S_ISREG(statusOf().st_mode));
    EXPECT_EQ(modeOf(), 0644U);
    EXPECT_EQ(read("target"), "target");
    EXPECT_EQ(read(), "new");
}

TEST_F(ReplaceFile, OtherNamesOfTheFileKeepTheOldBytes) {
    write("file", "old");
    fs::create_hard_link(path(), path("other"));
    EXPECT_TRUE(replace("new"));
    EXPECT_EQ(read("other"), "old");
}

TEST_F(ReplaceFile, DirectoryInTheFilesPlaceIsAnError) {
    fs::create_directory(path());
    const auto written = replace("new");
    ASSERT_FALSE(written);
    EXPECT_EQ(written.error(), (Error{"posix", EISDIR, "cannot replace " + path() + ": Is a directory"}));
    EXPECT_THAT(names(), ElementsAre("file"));
}

TEST_F(ReplaceFile, PipeInTheFilesPlaceIsAnErrorAndNotWaitedFor) {
    ASSERT_EQ(::mkfifo(path().c_str(), 0600), 0);
    const auto written = replace("new");
    ASSERT_FALSE(written);
    EXPECT_EQ(written.error().code, EINVAL);
    EXPECT_THAT(names(), ElementsAre("file"));
}

TEST_F(ReplaceFile, MissingDirectoryIsAnErrorThatNamesTheHostPath) {
    setSystemRoot(_dir);
    const auto written = replaceFile("new", HostPath("/Server/cluster_preferences.plist"));
    ASSERT_FALSE(written);
    EXPECT_EQ(written.error(),
              (Error{"posix", ENOENT,
                     "cannot open the directory of /Server/cluster_preferences.plist: No such file or directory"}));
}

TEST_F(ReplaceFile, PathsThatNameNoFileAreErrors) {
    for (const std::string bad : {"/", "", "/tmp/", "/tmp/..", "/tmp/."}) {
        const auto written = replaceFile("x", HostPath(bad));
        ASSERT_FALSE(written) << bad;
        EXPECT_EQ(written.error().code, EINVAL) << bad;
    }
    EXPECT_FALSE(replaceFile("x", HostPath(std::string("/tmp/a\0b", 8))));
}

TEST_F(ReplaceFile, FileInTheDirectorysPlaceIsAnError) {
    write("file", "old");
    const auto written = replace("new", "file/name");
    ASSERT_FALSE(written);
    EXPECT_EQ(written.error().code, ENOTDIR);
    EXPECT_EQ(read(), "old");
}

TEST_F(ReplaceFile, NameTooLongForItsTemporaryFileIsAnError) {
    const auto written = replace("new", std::string(250, 'x'));
    ASSERT_FALSE(written);
    EXPECT_EQ(written.error().code, ENAMETOOLONG);
    EXPECT_THAT(written.error().description.value_or(""), testing::StartsWith("cannot create temporary file for "));
    EXPECT_TRUE(names().empty());
}

TEST_F(ReplaceFile, FullDiskLeavesTheOldFileAndNoTemporary) {
    write("file", "old", 0600);
    const pid_t pid = ::fork();
    if (pid == 0) {  // a bound on the size of files cuts a write short as a full disk does
        (void)::signal(SIGXFSZ, SIG_IGN);
        const rlimit limit{100'000, 100'000};
        ::setrlimit(RLIMIT_FSIZE, &limit);
        const auto written = replace(std::string(1'000'000, 'x'));
        const std::string expected = "cannot write temporary file for " + path() + ": File too large";
        ::_exit(!written && written.error().code == EFBIG && written.error().description == expected ? 0 : 1);
    }
    int status = -1;
    ASSERT_EQ(::waitpid(pid, &status, 0), pid);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(read(), "old");
    EXPECT_THAT(names(), ElementsAre("file"));
}

TEST_F(ReplaceFile, LeftoversOfKilledWritersAreRemoved) {
    write("file", "old");
    write(_leftover, "half", 0600);
    EXPECT_TRUE(replace("new"));
    EXPECT_THAT(names(), ElementsAre("file"));
}

TEST_F(ReplaceFile, LeftoversAreRemovedWithoutAWriteTooAndTheFileStays) {
    write("file", "old");
    write(_leftover, "half", 0600);
    removeLeftovers(HostPath(path()));
    EXPECT_THAT(names(), ElementsAre("file"));
    EXPECT_EQ(read(), "old");
    removeLeftovers(HostPath(path("missing/file")));
}

TEST_F(ReplaceFile, LeftoversOfOtherFilesAndLikeNamesStay) {
    const std::set<std::string> others = {".other.adminhost-0123456789abcdef", ".file.adminhost-0123456789abcde",
                                          ".file.adminhost-0123456789abcdeg", "file.adminhost-0123456789abcdef",
                                          ".file.adminhost-0123456789abcdef0"};
    for (const std::string& name : others) {
        write(name, "x");
    }
    EXPECT_TRUE(replace("new"));
    std::set<std::string> expected = others;
    expected.insert("file");
    EXPECT_EQ(names(), expected);
}

TEST_F(ReplaceFile, TemporaryFileOfALivingWriterStays) {
    write(_leftover, "being written", 0600);
    const int writer = ::open(path(_leftover).c_str(), O_WRONLY | O_CLOEXEC);
    ASSERT_EQ(::flock(writer, LOCK_EX), 0);
    EXPECT_TRUE(replace("new"));
    EXPECT_THAT(names(), UnorderedElementsAre("file", _leftover));
    ::close(writer);
    EXPECT_TRUE(replace("newer"));
    EXPECT_THAT(names(), ElementsAre("file"));
}

TEST_F(ReplaceFile, WritersAtTheSameTimeNeverTakeEachOthersFilesForLeftovers) {
    constexpr int writers = 4;
    constexpr int times = 300;
    std::atomic<int> failures = 0;
    std::vector<std::thread> threads;
    threads.reserve(writers);
    for (int writer = 0; writer < writers; ++writer) {
        threads.emplace_back([&, bytes = std::string(5000, static_cast<char>('a' + writer))] {
            for (int i = 0; i < times; ++i) {
                failures += replace(bytes) ? 0 : 1;
            }
        });
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(failures, 0);
    EXPECT_THAT(names(), ElementsAre("file"));
    EXPECT_EQ(read(), std::string(5000, read().front())) << "one writer's bytes, nothing mixed";
}

TEST_F(ReplaceFile, LinkNamedLikeALeftoverHarmsNothing) {
    write("target", "target");
    fs::create_symlink("target", path(_leftover));
    EXPECT_TRUE(replace("new"));
    EXPECT_EQ(read("target"), "target");
}

TEST_F(ReplaceFile, LinkOnTheWayIsFollowedWhereOnlyWeCanHavePutIt) {
    fs::create_directory(path("real"));
    fs::create_symlink("real", path("relative"));
    fs::create_symlink(path("real"), path("absolute"));
    EXPECT_TRUE(replace("1", "relative/file"));
    EXPECT_EQ(read("real/file"), "1");
    EXPECT_TRUE(replace("2", "absolute/../real//./file"));
    EXPECT_EQ(read("real/file"), "2");
}

TEST_F(ReplaceFile, LinkOnTheWayInADirectoryThatOthersMayWriteIsRefused) {
    fs::create_directory(path("shared"));
    fs::create_directory(path("elsewhere"));
    fs::create_symlink(path("elsewhere"), path("shared/Server"));
    for (const mode_t mode : {0777U, 0775U, 01777U}) {
        ASSERT_EQ(::chmod(path("shared").c_str(), mode), 0);
        const auto written = replace("x", "shared/Server/file");
        ASSERT_FALSE(written);
        EXPECT_EQ(written.error().code, ELOOP);
    }
    EXPECT_TRUE(fs::is_empty(path("elsewhere")));
    ASSERT_EQ(::chmod(path("shared").c_str(), 0755), 0);
    EXPECT_TRUE(replace("x", "shared/Server/file"));
}

TEST_F(ReplaceFile, LinksInACircleAreAnError) {
    fs::create_symlink("b", path("a"));
    fs::create_symlink("a", path("b"));
    const auto written = replace("x", "a/file");
    ASSERT_FALSE(written);
    EXPECT_EQ(written.error().code, ELOOP);
}

TEST_F(ReplaceFile, RelativePathIsBelowTheCurrentDirectory) {
    const fs::path before = fs::current_path();
    fs::current_path(_dir);
    fs::create_directory("sub");
    const auto plain = replaceFile("1", HostPath("file"));
    const auto below = replaceFile("2", HostPath("sub/file"));
    fs::current_path(before);
    EXPECT_TRUE(plain);
    EXPECT_TRUE(below);
    EXPECT_EQ(read(), "1");
    EXPECT_EQ(read("sub/file"), "2");
}

TEST_F(ReplaceFile, NoDescriptorIsLeft) {
    const auto open = [] { return std::distance(fs::directory_iterator("/proc/self/fd"), fs::directory_iterator{}); };
    const auto before = open();
    EXPECT_TRUE(replace("1"));
    EXPECT_TRUE(replace("2"));
    EXPECT_FALSE(replace("3", "missing/file"));
    EXPECT_FALSE(replace("3", "file/file"));
    EXPECT_EQ(open(), before);
}

TEST_F(ReplaceFile, UnreadableFileIsKeptBesideUnderADatedNameAndStaysInPlace) {
    write("file", "garbage", 0640);
    const auto kept = keepUnreadable(HostPath(path()));
    ASSERT_TRUE(kept);
    EXPECT_THAT(kept->text(), testing::StartsWith(path() + ".unreadable-2"));
    EXPECT_THAT(kept->text().substr(path().size()),
                testing::MatchesRegex("[.]unreadable-[0-9]{4}-[0-9]{2}-[0-9]{2}T[0-9]{6}Z"));
    EXPECT_EQ(read(fs::path(kept->text()).filename()), "garbage");
    EXPECT_EQ(read(), "garbage");
    EXPECT_TRUE(replace("new"));
    EXPECT_EQ(modeOf(), 0640U);
    EXPECT_EQ(read(fs::path(kept->text()).filename()), "garbage");
}

TEST_F(ReplaceFile, SeveralUnreadableFilesAreAllKept) {
    std::set<std::string> kept;
    for (int i = 0; i < 5; ++i) {
        write("file", "garbage " + std::to_string(i));
        const auto name = keepUnreadable(HostPath(path()));
        ASSERT_TRUE(name);
        kept.insert(name->text());
        EXPECT_EQ(read(fs::path(name->text()).filename()), "garbage " + std::to_string(i));
        fs::remove(path());
    }
    EXPECT_EQ(kept.size(), 5U);
}

TEST_F(ReplaceFile, UnreadableLinkIsKeptAsALink) {
    fs::create_symlink("nowhere", path());
    const auto kept = keepUnreadable(HostPath(path()));
    ASSERT_TRUE(kept);
    EXPECT_EQ(fs::read_symlink(kept->text()), "nowhere");
}

TEST_F(ReplaceFile, NothingOrADirectoryCannotBeKept) {
    const auto missing = keepUnreadable(HostPath(path()));
    ASSERT_FALSE(missing);
    EXPECT_EQ(missing.error(), (Error{"posix", ENOENT, "cannot look at " + path() + ": No such file or directory"}));
    fs::create_directory(path());
    const auto directory = keepUnreadable(HostPath(path()));
    ASSERT_FALSE(directory);
    EXPECT_EQ(directory.error().code, EISDIR);
    EXPECT_THAT(names(), ElementsAre("file"));
}

}  // namespace
