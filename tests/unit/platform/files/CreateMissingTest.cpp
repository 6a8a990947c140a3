#include "platform/files/CreateMissing.h"

#include <cerrno>
#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;

class CreateMissing : public testing::Test {
  protected:
    void SetUp() override {
        std::string pattern = fs::temp_directory_path() / "make-XXXXXX";
        ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
        _directory = pattern;
        setSystemRoot(_directory);
    }
    void TearDown() override {
        setSystemRoot("/");
        fs::remove_all(_directory);
    }

    [[nodiscard]] DiskPath path(const std::string& name) const { return DiskPath(_directory / name); }
    [[nodiscard]] fs::perms modeOf(const std::string& name) const {
        return fs::status(_directory / name).permissions();
    }
    void writeGroups(const std::string& text) const {
        fs::create_directories(_directory / "etc");
        std::ofstream(_directory / "etc/group") << text;
    }

    fs::path _directory;
    const OwnerAndMode _mine{::geteuid(), ::getegid(), 0751};
};

TEST_F(CreateMissing, EveryMissingDirectoryGetsTheAttributesWhateverTheUmask) {
    const mode_t before = ::umask(0077);
    const auto created = createDirectories(path("a/b/c"), _mine);
    ::umask(before);
    EXPECT_TRUE(created);
    for (const char* name : {"a", "a/b", "a/b/c"}) {
        EXPECT_EQ(modeOf(name), fs::perms(0751)) << name;
    }
}

TEST_F(CreateMissing, DirectoryThatExistsKeepsItsOwn) {
    fs::create_directory(_directory / "a");
    fs::permissions(_directory / "a", fs::perms(0700));
    EXPECT_TRUE(createDirectories(path("a/b"), _mine));
    EXPECT_TRUE(createDirectories(path("a/b"), {::geteuid(), ::getegid(), 0700}));
    EXPECT_EQ(modeOf("a"), fs::perms(0700));
    EXPECT_EQ(modeOf("a/b"), fs::perms(0751));
}

TEST_F(CreateMissing, FileInTheWayIsAnErrorWithTheSystemsText) {
    ASSERT_TRUE(createEmptyFile(path("file")));
    for (const char* name : {"file", "file/below"}) {
        const auto created = createDirectories(path(name), _mine);
        ASSERT_FALSE(created) << name;
        EXPECT_EQ(created.error().code, ENOTDIR);
        EXPECT_EQ(created.error().description, "cannot create the directory: Not a directory");
    }
}

TEST_F(CreateMissing, OwnerIsSetByTheSuperuserAndForOthersAnErrorThatLeavesTheDirectory) {
    const auto created = createDirectories(path("a"), {4711, 4712, 0755});
    EXPECT_EQ(modeOf("a"), fs::perms(0755));
    struct stat status {};
    ASSERT_EQ(::stat(path("a").c_str(), &status), 0);
    if (::geteuid() == 0) {
        EXPECT_TRUE(created);
        EXPECT_EQ(status.st_uid, 4711U);
        EXPECT_EQ(status.st_gid, 4712U);
    } else {
        ASSERT_FALSE(created);
        EXPECT_EQ(created.error().description, "cannot set the owner: Operation not permitted");
        EXPECT_EQ(status.st_uid, ::geteuid());
    }
}

TEST_F(CreateMissing, EmptyFileIsCreatedOnceAndNeverThroughALink) {
    EXPECT_TRUE(createEmptyFile(path("file")));
    EXPECT_EQ(fs::file_size(_directory / "file"), 0U);
    std::ofstream(_directory / "file") << "text";
    EXPECT_EQ(createEmptyFile(path("file")).error().code, EEXIST);
    EXPECT_EQ(fs::file_size(_directory / "file"), 4U);
    fs::create_symlink("elsewhere", _directory / "link");
    EXPECT_EQ(createEmptyFile(path("link")).error().code, EEXIST);
    EXPECT_FALSE(fs::exists(_directory / "elsewhere"));
    EXPECT_THAT(*createEmptyFile(path("none/file")).error().description, HasSubstr("No such file or directory"));
}

TEST_F(CreateMissing, GroupIsFoundInTheAccountFilesBelowTheRoot) {
    EXPECT_EQ(groupIdOf("wheel"), std::nullopt) << "no file";
    writeGroups("root:x:0:\nbroken line\nwheelers:x:7:wheel\n");
    EXPECT_EQ(groupIdOf("wheel"), std::nullopt);
    writeGroups("root:x:0:\nbroken line\n:::\nwheel:x:4711:anna\nwheel:x:2:\n");
    EXPECT_EQ(groupIdOf("wheel"), 4711U);
}

TEST_F(CreateMissing, GroupBehindOneOfManyMembersIsFound) {
    std::string members;
    for (int i = 0; i < 50'000; ++i) {
        members += (i == 0 ? "member" : ",member") + std::to_string(i);
    }
    writeGroups("everyone:x:100:" + members + "\nwheel:x:4711:\n");
    EXPECT_EQ(groupIdOf("wheel"), 4711U);
}

}  // namespace
}  // namespace adminhost
