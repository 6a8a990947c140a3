#include "platform/files/Path.h"

#include <compare>
#include <filesystem>
#include <string>

#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace adminhost;

class Path : public testing::Test {
  protected:
    void TearDown() override { setSystemRoot("/"); }
};

TEST_F(Path, RootIsTheDisksAtFirst) {
    EXPECT_EQ(systemRoot(), "/");
    EXPECT_EQ(diskPath(HostPath("/var/lumio")).text(), "/var/lumio");
}

TEST_F(Path, AbsoluteHostPathLiesBelowTheRoot) {
    setSystemRoot("/srv/root");
    EXPECT_EQ(diskPath(HostPath("/var/lumio")).text(), "/srv/root/var/lumio");
    EXPECT_EQ(diskPath(HostPath("/")).text(), "/srv/root/");
}

TEST_F(Path, RelativeHostPathStaysAsItIsOnlyWhileTheRootIsTheDisks) {
    EXPECT_EQ(diskPath(HostPath("db/prod.sqlite3")).text(), "db/prod.sqlite3");
    EXPECT_EQ(diskPath(HostPath("../x")).text(), "../x");
    setSystemRoot("/srv/root");
    EXPECT_EQ(diskPath(HostPath("db/prod.sqlite3")).text(), "/srv/root/db/prod.sqlite3");
    EXPECT_EQ(diskPath(HostPath("")).text(), "");
}

TEST_F(Path, NoStepLeadsAboveTheRoot) {
    setSystemRoot("/srv/root");
    const auto on = [](const char* path) { return diskPath(HostPath(path)).text(); };
    EXPECT_EQ(on("/../etc/passwd"), "/srv/root/etc/passwd");
    EXPECT_EQ(on("../../etc"), "/srv/root/etc");
    EXPECT_EQ(on("/a/../../etc"), "/srv/root/a/../etc");
    EXPECT_EQ(on("a/./../../.."), "/srv/root/a/./..");
    EXPECT_EQ(on(".."), "/srv/root/");
    EXPECT_EQ(on("/..a/...//x"), "/srv/root/..a/...//x");
}

TEST_F(Path, TrailingSlashesOfTheRootAreDropped) {
    setSystemRoot("/srv/root//");
    EXPECT_EQ(systemRoot(), "/srv/root");
    EXPECT_EQ(diskPath(HostPath("/a")).text(), "/srv/root/a");
}

TEST_F(Path, RootOfNothingButSlashesIsTheDisks) {
    for (const char* root : {"/", "//", ""}) {
        setSystemRoot(root);
        EXPECT_EQ(systemRoot(), "/");
        EXPECT_EQ(diskPath(HostPath("/a")).text(), "/a");
    }
}

TEST_F(Path, PathsAreNotNormalised) {
    setSystemRoot("/srv/root");
    EXPECT_EQ(diskPath(HostPath("/a//b/../c/")).text(), "/srv/root/a//b/../c/");
}

TEST_F(Path, HostPathIsTheWayBack) {
    setSystemRoot("/srv/root");
    EXPECT_EQ(hostPath(DiskPath("/srv/root/var/lumio")).text(), "/var/lumio");
    EXPECT_EQ(hostPath(DiskPath("/srv/rooted/x")).text(), "/srv/rooted/x");
    EXPECT_EQ(hostPath(DiskPath("/srv/root")).text(), "/srv/root");
    EXPECT_EQ(hostPath(DiskPath("/etc/passwd")).text(), "/etc/passwd");
    EXPECT_EQ(hostPath(DiskPath("db/x")).text(), "db/x");
    setSystemRoot("/");
    EXPECT_EQ(hostPath(DiskPath("/etc/passwd")).text(), "/etc/passwd");
}

TEST_F(Path, ExistsFollowsLinks) {
    std::string place = std::filesystem::temp_directory_path() / "path-XXXXXX";
    ASSERT_NE(::mkdtemp(place.data()), nullptr);
    ASSERT_EQ(::symlink("missing", (place + "/link").c_str()), 0);
    EXPECT_TRUE(exists(DiskPath(place)));
    EXPECT_FALSE(exists(DiskPath(place + "/missing")));
    EXPECT_FALSE(exists(DiskPath(place + "/link")));
    EXPECT_FALSE(exists(DiskPath("")));
    EXPECT_FALSE(exists(DiskPath(place + std::string("\0x", 2)))) << "a path with a NUL names nothing";
    std::filesystem::create_directory(place + "/missing");
    EXPECT_TRUE(exists(DiskPath(place + "/link")));
    std::filesystem::remove_all(place);
}

TEST_F(Path, PlaceBelowTheSystemRootIsKnownAfterAllLinks) {
    namespace fs = std::filesystem;
    std::string place = fs::temp_directory_path() / "path-XXXXXX";
    ASSERT_NE(::mkdtemp(place.data()), nullptr);
    fs::create_directories(place + "/top/inner");
    fs::create_directories(place + "/topped");
    fs::create_directory_symlink(place + "/top", place + "/link");
    fs::create_directory_symlink("../topped", place + "/top/out");
    fs::create_directory_symlink(place + "/top/inner", place + "/top/in");
    ASSERT_EQ(::mkfifo((place + "/top/pipe").c_str(), 0000), 0);
    const auto isBelow = [&](const std::string& path) { return isBelowSystemRoot(DiskPath(place + path)); };
    for (const std::string& root : {place + "/top", place + "/link"}) {
        setSystemRoot(root);
        EXPECT_TRUE(isBelow("/top"));
        EXPECT_TRUE(isBelow("/top/inner"));
        EXPECT_TRUE(isBelow("/top/in"));
        EXPECT_TRUE(isBelow("/top/pipe")) << "it is not opened";
        EXPECT_FALSE(isBelow("/top/out"));
        EXPECT_FALSE(isBelow("/top/missing"));
        EXPECT_FALSE(isBelow("/topped"));
        EXPECT_FALSE(isBelow("/top/inner/../.."));
        EXPECT_FALSE(isBelow("/top" + std::string("\0x", 2)));
    }
    setSystemRoot("/");
    EXPECT_TRUE(isBelow("/topped"));
    EXPECT_FALSE(isBelow("/missing"));
    fs::remove_all(place);
}

TEST_F(Path, PathsCompareAsTheirTexts) {
    EXPECT_EQ(HostPath("/a"), HostPath("/a"));
    EXPECT_NE(HostPath("/a"), HostPath("/a/"));
    EXPECT_TRUE(std::is_lt(DiskPath("/a") <=> DiskPath("/b")));
}

}  // namespace
