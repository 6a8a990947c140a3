#include "tests/unit/platform/plist/PlistTestSupport.h"

#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace adminhost;

class PropertyListFile : public PlistTest {
  protected:
    [[nodiscard]] Error readError(const std::string& name) const {
        const auto value = readPropertyList(DiskPath(path(name)));
        EXPECT_FALSE(value);
        return value ? Error() : value.error();
    }
    void TearDown() override {
        setSystemRoot("/");
        PlistTest::TearDown();
    }
};

TEST_F(PropertyListFile, WrittenListIsReadAgain) {
    const Value value = Dictionary{{"shared_filesystem", "/Library/à"}, {"n", UINT64_MAX}};
    EXPECT_TRUE(writePropertyList(value, HostPath(path("a.plist"))));
    EXPECT_EQ(readPropertyList(DiskPath(path("a.plist"))), value);
    EXPECT_EQ(readBytes("a.plist"), xmlPropertyList(value));
}

TEST_F(PropertyListFile, IsWrittenBelowTheSystemRoot) {
    setSystemRoot(_dir);
    EXPECT_TRUE(writePropertyList(1, HostPath("/a.plist")));
    EXPECT_EQ(readPropertyList(diskPath(HostPath("/a.plist"))), Value(1));
    EXPECT_TRUE(std::filesystem::exists(path("a.plist")));
}

TEST_F(PropertyListFile, MissingFileIsAnErrorOfTheSystem) {
    const Error error = readError("missing");
    EXPECT_EQ(error.domain, "posix");
    EXPECT_EQ(error.code, ENOENT);
    EXPECT_THAT(error.description.value_or(""), testing::EndsWith("missing: No such file or directory"));
}

TEST_F(PropertyListFile, ContentErrorNamesFileAndPlace) {
    writeBytes("bad", "<plist>\n<dict>\n<key>a</key>\n</dict></plist>");
    EXPECT_EQ(readError("bad"),
              (Error{"propertyList", 1, path("bad") + ": line 4, column 1: the key \"a\" has no value"}));
    setSystemRoot(_dir);
    const auto value = readPropertyList(diskPath(HostPath("/bad")));
    ASSERT_FALSE(value);
    EXPECT_EQ(value.error().description, "/bad: line 4, column 1: the key \"a\" has no value");
}

TEST_F(PropertyListFile, NothingButRegularFilesIsRead) {
    ASSERT_EQ(::mkfifo(path("pipe").c_str(), 0600), 0);
    EXPECT_EQ(readError("pipe").code, EINVAL);  // and no waiting for a writer
    EXPECT_EQ(readError(".").code, EISDIR);
    EXPECT_FALSE(readPropertyList(DiskPath("/dev/zero")));
}

TEST_F(PropertyListFile, LinkToAFileIsRead) {
    ASSERT_TRUE(writePropertyList("x", HostPath(path("file"))));
    std::filesystem::create_symlink("file", path("link"));
    EXPECT_EQ(readPropertyList(DiskPath(path("link"))), Value("x"));
}

TEST_F(PropertyListFile, FileOf64MiBPassesAndOneByteMoreIsRefused) {
    const std::string list = "<plist><true/></plist>";
    writeBytes("big", list + std::string(plistMaximumSize - list.size(), ' '));
    EXPECT_EQ(readPropertyList(DiskPath(path("big"))), Value(true));
    writeBytes("sparse", list);
    ASSERT_EQ(::truncate(path("sparse").c_str(), static_cast<off_t>(plistMaximumSize) + 1), 0);
    EXPECT_EQ(readError("sparse").code, EFBIG);
    ASSERT_EQ(::truncate(path("sparse").c_str(), off_t{1} << 40U), 0);
    EXPECT_EQ(readError("sparse").code, EFBIG);
}

TEST_F(PropertyListFile, ValueThatCannotBeSerialisedLeavesTheOldFile) {
    ASSERT_TRUE(writePropertyList("old", HostPath(path("a.plist"))));
    const auto written = writePropertyList(Dictionary{{"k", Array{Value()}}}, HostPath(path("a.plist")));
    ASSERT_FALSE(written);
    EXPECT_EQ(written.error().description, "cannot serialise " + path("a.plist") + ": k.0: null cannot be written");
    EXPECT_EQ(readPropertyList(DiskPath(path("a.plist"))), Value("old"));
}

}  // namespace
