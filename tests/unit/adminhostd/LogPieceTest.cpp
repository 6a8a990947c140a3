#include "adminhostd/LogPiece.h"
#include "tests/support/TemporaryRoot.h"

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;

const HostPath log("/var/log/service/application.log");

class LogPieces : public ::testing::Test {
  protected:
    LogPieces() {
        root.write(log.text(), "first\nsecond\n");
        fs::permissions(directory(), fs::perms(0755));
    }

    [[nodiscard]] fs::path disk(const std::string& name) const { return directory() / name; }
    [[nodiscard]] fs::path directory() const { return root.path("/var/log/service"); }
    void shareDirectory() const { fs::permissions(directory(), fs::perms(0777)); }

    static LogPiece piece(std::uint64_t inode = 0, std::uint64_t offset = 0) {
        const auto read = readLogPiece(log, inode, offset);
        EXPECT_TRUE(read) << read.error().description.value_or("");
        return read.value_or(LogPiece());
    }
    static void expectRefused(std::int64_t number, const std::string& why) {
        const auto read = readLogPiece(log, 0, 0);
        ASSERT_FALSE(read);
        EXPECT_EQ(read.error().code, number);
        EXPECT_THAT(read.error().description.value_or(""), HasSubstr(log.text()));
        EXPECT_THAT(read.error().description.value_or(""), HasSubstr(why));
        const auto state = logFileState(log);
        ASSERT_FALSE(state);
        EXPECT_EQ(state.error().code, number);
    }
    void rotate() const { fs::rename(disk("application.log"), disk("application.log.1")); }
    static void append(const fs::path& file, const std::string& text) { std::ofstream(file, std::ios::app) << text; }

    const test::TemporaryRoot root;
};

TEST_F(LogPieces, PieceHasTheBytesFromTheOffsetAndWhereToGoOn) {
    const LogPiece whole = piece();
    EXPECT_EQ(whole.bytes, "first\nsecond\n");
    EXPECT_EQ(whole.offset, 0U);
    EXPECT_EQ(whole.next, 13U);
    EXPECT_EQ(whole.size, 13U);
    EXPECT_FALSE(whole.more || whole.gap || whole.missing);
    append(disk("application.log"), "third\n");
    EXPECT_EQ(piece(whole.inode, whole.next).bytes, "third\n");
    EXPECT_EQ(piece(whole.inode, 6).bytes, "second\nthird\n");
}

TEST_F(LogPieces, StateHasSizeAndInode) {
    const auto state = logFileState(log);
    ASSERT_TRUE(state && *state);
    EXPECT_EQ((*state)->size, 13U);
    EXPECT_EQ((*state)->inode, piece().inode);
}

TEST_F(LogPieces, LargeFileComesInPiecesOfOneMebibyte) {
    root.write(log.text(), std::string((1U << 20U) + 5, 'x'));
    const LogPiece first = piece();
    EXPECT_EQ(first.bytes.size(), 1U << 20U);
    EXPECT_TRUE(first.more);
    const LogPiece second = piece(first.inode, first.next);
    EXPECT_EQ(second.bytes, "xxxxx");
    EXPECT_FALSE(second.more);
}

TEST_F(LogPieces, MissingFileIsNotAnErrorAndKeepsThePlace) {
    fs::remove(disk("application.log"));
    const LogPiece found = piece(77, 5);
    EXPECT_TRUE(found.missing);
    EXPECT_EQ(found.inode, 77U);
    EXPECT_EQ(found.next, 5U);
    const auto state = logFileState(log);
    ASSERT_TRUE(state);
    EXPECT_FALSE(*state);
    fs::remove(directory());
    EXPECT_TRUE(piece().missing);
}

TEST_F(LogPieces, RotatedFileIsReadToItsEndAndTheNewOneFromItsBeginning) {
    const LogPiece before = piece();
    append(disk("application.log"), "late\n");
    rotate();
    append(disk("application.log"), "new\n");
    const LogPiece rest = piece(before.inode, before.next);
    EXPECT_EQ(rest.bytes, "late\n");
    EXPECT_EQ(rest.inode, before.inode);
    EXPECT_TRUE(rest.more) << "of the new file";
    const LogPiece fresh = piece(rest.inode, rest.next);
    EXPECT_EQ(fresh.bytes, "new\n");
    EXPECT_NE(fresh.inode, before.inode);
    EXPECT_FALSE(fresh.gap);
}

TEST_F(LogPieces, OldFileIsReadAsLongAsTheNewOneIsMissingOrEmpty) {
    const LogPiece before = piece();
    rotate();
    append(disk("application.log.1"), "still\n");
    const LogPiece missing = piece(before.inode, before.next);
    EXPECT_EQ(missing.bytes, "still\n");
    EXPECT_FALSE(missing.more);
    append(disk("application.log"), "");
    append(disk("application.log.1"), "written\n");
    const LogPiece end = piece(missing.inode, missing.next);
    EXPECT_EQ(end.bytes, "written\n");
    EXPECT_EQ(piece(end.inode, end.next).inode, before.inode) << "more may be written to it";
}

TEST_F(LogPieces, FileThatWasRemovedLeavesAGap) {
    const LogPiece before = piece();
    rotate();
    append(disk("application.log"), "new\n");
    fs::remove(disk("application.log.1"));
    const LogPiece fresh = piece(before.inode, before.next);
    EXPECT_EQ(fresh.bytes, "new\n");
    EXPECT_TRUE(fresh.gap);
}

TEST_F(LogPieces, FileOfAnotherNameIsNotTakenForTheRotatedOne) {
    const LogPiece before = piece();
    append(disk("application.log"), "hidden\n");
    fs::rename(disk("application.log"), disk("secret"));
    append(disk("application.log"), "new\n");
    const LogPiece fresh = piece(before.inode, before.next);
    EXPECT_EQ(fresh.bytes, "new\n");
    EXPECT_TRUE(fresh.gap);
}

TEST_F(LogPieces, FileThatWasEmptiedIsReadFromItsBeginningWithAGap) {
    const LogPiece before = piece();
    fs::resize_file(disk("application.log"), 0);
    append(disk("application.log"), "again\n");
    const LogPiece fresh = piece(before.inode, before.next);
    EXPECT_EQ(fresh.bytes, "again\n");
    EXPECT_TRUE(fresh.gap);
}

TEST_F(LogPieces, LinkIsFollowedWhereOnlyRootCouldHaveCreatedIt) {
    rotate();
    fs::create_symlink("application.log.1", disk("application.log"));
    EXPECT_EQ(piece().bytes, "first\nsecond\n");
}

TEST_F(LogPieces, LinkInADirectoryOfOthersIsNotFollowed) {
    root.write("/etc/secret", "top secret\n");
    fs::remove(disk("application.log"));
    fs::create_symlink(root.path("/etc/secret"), disk("application.log"));
    shareDirectory();
    expectRefused(ELOOP, "is a link");
}

TEST_F(LogPieces, LinkOnTheWayThroughADirectoryOfOthersIsNotFollowed) {
    fs::rename(directory(), root.path("/var/log/elsewhere"));
    fs::create_directory_symlink("elsewhere", directory());
    EXPECT_EQ(piece().bytes, "first\nsecond\n");
    fs::permissions(root.path("/var/log"), fs::perms(0777));
    expectRefused(ELOOP, "is a link");
}

TEST_F(LogPieces, SecondNameOfAFileIsRefusedWhereOthersCouldHaveCreatedIt) {
    fs::create_hard_link(disk("application.log"), root.path("/var/log/other"));
    EXPECT_EQ(piece().bytes, "first\nsecond\n");
    shareDirectory();
    expectRefused(EMLINK, "has several names");
}

TEST_F(LogPieces, PipeIsRefusedAndNotWaitedFor) {
    fs::remove(disk("application.log"));
    ASSERT_EQ(::mkfifo(disk("application.log").c_str(), 0600), 0);
    expectRefused(EINVAL, "is not a regular file");
}

TEST_F(LogPieces, DirectoryIsRefused) {
    fs::remove(disk("application.log"));
    fs::create_directory(disk("application.log"));
    expectRefused(EINVAL, "is not a regular file");
}

TEST_F(LogPieces, RotatedFileWithTheNameOfALinkIsNotFollowed) {
    const LogPiece before = piece();
    append(disk("application.log"), "hidden\n");
    fs::rename(disk("application.log"), root.path("/etc-secret"));
    append(disk("application.log"), "new\n");
    fs::create_symlink(root.path("/etc-secret"), disk("application.log.1"));
    EXPECT_EQ(piece(before.inode, before.next).bytes, "new\n");
}

}  // namespace
}  // namespace adminhost
