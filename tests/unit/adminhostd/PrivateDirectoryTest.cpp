#include "adminhostd/PrivateDirectory.h"

#include <filesystem>
#include <fstream>
#include <string>
#include <system_error>

#include <gtest/gtest.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;

class PrivateDirectory : public testing::Test {
  protected:
    void SetUp() override {
        std::string place = fs::temp_directory_path() / "private-XXXXXX";
        ASSERT_NE(::mkdtemp(place.data()), nullptr);
        _parent = place;
    }
    void TearDown() override { fs::remove_all(_parent); }

    std::string _parent;
};

TEST_F(PrivateDirectory, IsClosedToOthersAndNewEachTime) {
    std::string first;
    std::string second;
    const FileDescriptor one = createPrivateDirectory(_parent, first);
    const FileDescriptor two = createPrivateDirectory(_parent, second);
    EXPECT_NE(first, second);
    EXPECT_EQ(fs::status(first).permissions(), fs::perms::owner_all);
    EXPECT_EQ(fs::path(first).parent_path(), _parent);
}

TEST_F(PrivateDirectory, IsRemovedWithItsContentOnceNobodyHoldsIt) {
    std::string path;
    FileDescriptor creator = createPrivateDirectory(_parent, path);
    fs::create_directory(path + "/tool");
    std::ofstream(path + "/tool/rc") << "x";
    FileDescriptor user = holdDirectory(path);
    ASSERT_TRUE(user.isOpen());
    removeAbandonedDirectories(_parent);
    EXPECT_TRUE(fs::exists(path));
    creator.close();
    removeAbandonedDirectories(_parent);
    EXPECT_TRUE(fs::exists(path + "/tool/rc"));
    user.close();
    removeAbandonedDirectories(_parent);
    EXPECT_FALSE(fs::exists(path));
    EXPECT_FALSE(holdDirectory(path).isOpen());
}

TEST_F(PrivateDirectory, NothingElseIsRemoved) {
    fs::create_directory(_parent + "/other");
    fs::create_directory(_parent + "/elsewhere");
    fs::create_symlink(_parent + "/elsewhere", _parent + "/adminhostd.linked");
    std::ofstream(_parent + "/adminhostd.sock") << "x";
    removeAbandonedDirectories(_parent);
    for (const char* name : {"/other", "/elsewhere", "/adminhostd.linked", "/adminhostd.sock"}) {
        EXPECT_TRUE(fs::exists(_parent + name)) << name;
    }
    removeAbandonedDirectories(_parent + "/missing");
}

TEST_F(PrivateDirectory, CannotBeCreatedInAMissingDirectory) {
    std::string path;
    EXPECT_THROW((void)createPrivateDirectory(_parent + "/missing", path), std::system_error);
}

}  // namespace
}  // namespace adminhost
