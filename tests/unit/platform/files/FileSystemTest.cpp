#include "platform/files/FileSystem.h"
#include "tests/support/TemporaryRoot.h"

#include <ctime>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/statvfs.h>

namespace adminhost {
namespace {

class FileSystem : public testing::Test {
  protected:
    [[nodiscard]] DiskPath at(std::string_view path) const { return DiskPath(root.path(path).string()); }

    test::TemporaryRoot root;
};

TEST_F(FileSystem, FreeSpaceIsThatOfOrdinaryAccountsInBytes) {
    struct statvfs status {};
    ASSERT_EQ(::statvfs(root.path("").c_str(), &status), 0);
    const auto free = freeSpaceOf(at("/"));
    ASSERT_TRUE(free);
    // Others may write at the same time.
    constexpr double slack = 1e9;
    EXPECT_NEAR(static_cast<double>(*free), static_cast<double>(status.f_bavail) * static_cast<double>(status.f_frsize),
                slack);
    root.write("/file", "x");
    EXPECT_TRUE(freeSpaceOf(at("/file"))) << "of the file system that holds the file";
}

TEST_F(FileSystem, FreeSpaceOfAMissingPlaceIsNotKnown) {
    EXPECT_FALSE(freeSpaceOf(at("/missing")));
    EXPECT_FALSE(freeSpaceOf(DiskPath("")));
    EXPECT_FALSE(freeSpaceOf(DiskPath(std::string("/\0x", 3))));
}

TEST_F(FileSystem, CreationDateDoesNotFollowLaterWrites) {
    root.write("/file", "x");
    const std::time_t now = std::time(nullptr);
    const timespec old[2] = {{0, UTIME_OMIT}, {1'000'000, 0}};
    ASSERT_EQ(::utimensat(AT_FDCWD, at("/file").c_str(), old, 0), 0);
    const auto date = creationDateOf(at("/file"));
    ASSERT_TRUE(date);
    struct statx status {};
    ASSERT_EQ(::statx(AT_FDCWD, at("/file").c_str(), 0, STATX_BTIME, &status), 0);
    if ((status.stx_mask & STATX_BTIME) != 0) {
        EXPECT_NEAR(static_cast<double>(date->time_since_epoch().count()), static_cast<double>(now), 5);
    } else {
        EXPECT_EQ(date->time_since_epoch().count(), 1'000'000) << "the modification date is used instead";
    }
}

/// The process file system keeps no creation dates.
TEST_F(FileSystem, ModificationDateIsUsedWhereNoCreationDateIsKept) {
    struct statx status {};
    ASSERT_EQ(::statx(AT_FDCWD, "/proc/self/stat", 0, STATX_BTIME | STATX_MTIME, &status), 0);
    ASSERT_EQ(status.stx_mask & STATX_BTIME, 0U) << "choose another file for this test";
    const auto date = creationDateOf(DiskPath("/proc/self/stat"));
    ASSERT_TRUE(date);
    EXPECT_NEAR(static_cast<double>(date->time_since_epoch().count()), static_cast<double>(std::time(nullptr)), 5);
}

TEST_F(FileSystem, MissingFileHasNoCreationDate) {
    EXPECT_FALSE(creationDateOf(at("/missing")));
}

TEST_F(FileSystem, DirectoryIsADirectoryAlsoThroughALink) {
    root.write("/file", "x");
    std::filesystem::create_directory_symlink("/usr", root.path("/link"));
    std::filesystem::create_symlink("/nonexistent", root.path("/dangling"));
    EXPECT_TRUE(isDirectory(at("/")));
    EXPECT_TRUE(isDirectory(at("/link")));
    EXPECT_FALSE(isDirectory(at("/file")));
    EXPECT_FALSE(isDirectory(at("/missing")));
    EXPECT_FALSE(isDirectory(at("/dangling")));
    EXPECT_FALSE(isDirectory(DiskPath("")));
}

}  // namespace
}  // namespace adminhost
