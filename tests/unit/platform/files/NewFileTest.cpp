#include "platform/files/NewFile.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view name = "/shared/touch";

class NewFiles : public testing::Test {
  protected:
    void SetUp() override { fs::create_directory(root.path("/shared")); }

    [[nodiscard]] DiskPath at(std::string_view path) const { return DiskPath(root.path(path).string()); }
    [[nodiscard]] struct stat attributes(std::string_view path) const {
        struct stat status {};
        EXPECT_EQ(::lstat(at(path).c_str(), &status), 0) << path;
        return status;
    }

    test::TemporaryRoot root;
};

TEST_F(NewFiles, HoldsTheBytesWithTheUsualMode) {
    ASSERT_TRUE(NewFile::create(at(name), "content\n"));
    EXPECT_EQ(root.read(name), "content\n");
    EXPECT_EQ(attributes(name).st_mode, S_IFREG | 0644U);
}

TEST_F(NewFiles, ReplacesAnExistingFileWithoutWritingToIt) {
    root.write(name, "old");
    fs::create_hard_link(root.path(name), root.path("/other"));
    ASSERT_TRUE(NewFile::create(at(name), "new"));
    EXPECT_EQ(root.read(name), "new");
    EXPECT_EQ(root.read("/other"), "old");
}

TEST_F(NewFiles, ReplacesALinkWithoutFollowingIt) {
    root.write("/precious", "old");
    fs::create_symlink(root.path("/precious"), root.path(name));
    const auto file = NewFile::create(at(name), "new");
    ASSERT_TRUE(file);
    EXPECT_TRUE(S_ISREG(attributes(name).st_mode));
    EXPECT_EQ(root.read("/precious"), "old");
}

TEST_F(NewFiles, LeavesADirectoryOfThatNameAndFails) {
    fs::create_directory(root.path(name));
    const auto file = NewFile::create(at(name), "new");
    ASSERT_FALSE(file);
    EXPECT_THAT(file.error().description.value_or(""), testing::StartsWith("cannot remove the old file: "));
    EXPECT_TRUE(fs::is_directory(root.path(name)));
}

TEST_F(NewFiles, FailsInAMissingDirectory) {
    EXPECT_FALSE(NewFile::create(at("/missing/touch"), "new"));
    EXPECT_FALSE(NewFile::create(DiskPath(""), "new"));
}

TEST_F(NewFiles, OwnerIsSetOnTheFileItselfAndNotOnWhatHasItsName) {
    const auto file = NewFile::create(at(name), "new");
    ASSERT_TRUE(file);
    fs::rename(root.path(name), root.path("/moved"));
    root.write("/precious", "old");
    fs::create_symlink(root.path("/precious"), root.path(name));
    constexpr uid_t owner = 4711;
    const auto error = file->setOwner(owner);
    if (::geteuid() == 0) {
        EXPECT_FALSE(error);
        EXPECT_EQ(attributes("/moved").st_uid, owner);
        EXPECT_EQ(attributes("/moved").st_gid, attributes("/precious").st_gid) << "the group stays";
    } else {
        ASSERT_TRUE(error);
        EXPECT_EQ(error->code, EPERM) << "only the superuser can give a file away";
    }
    EXPECT_EQ(attributes("/precious").st_uid, ::geteuid());
}

TEST_F(NewFiles, OwnOwnerCanBeSet) {
    const auto file = NewFile::create(at(name), "new");
    ASSERT_TRUE(file);
    EXPECT_FALSE(file->setOwner(::geteuid()));
}

TEST_F(NewFiles, IsRemoved) {
    auto file = NewFile::create(at(name), "new");
    ASSERT_TRUE(file);
    EXPECT_FALSE(file->remove());
    EXPECT_FALSE(fs::exists(root.path(name)));
    const auto again = file->remove();
    ASSERT_TRUE(again);
    EXPECT_EQ(again->code, ENOENT);
}

TEST_F(NewFiles, ThatBecameADirectoryIsNotRemoved) {
    auto file = NewFile::create(at(name), "new");
    ASSERT_TRUE(file);
    fs::remove(root.path(name));
    fs::create_directory(root.path(name));
    EXPECT_TRUE(file->remove());
    EXPECT_TRUE(fs::is_directory(root.path(name)));
}

}  // namespace
}  // namespace adminhost
