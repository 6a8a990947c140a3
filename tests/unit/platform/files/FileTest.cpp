#include "platform/files/File.h"

#include <cerrno>
#include <filesystem>
#include <fstream>

#include <gtest/gtest.h>
#include <sys/stat.h>

namespace adminhost {
namespace {

Error errorOf(const Result<std::string>& result) {
    return result ? Error{"none", 0, "no error"} : result.error();
}

class ReadFile : public testing::Test {
  protected:
    void SetUp() override {
        std::string pattern = testing::TempDir() + "readfile.XXXXXX";
        ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
        _directory = pattern;
    }
    void TearDown() override { std::filesystem::remove_all(_directory); }

    std::filesystem::path _directory;
};

TEST_F(ReadFile, AnswersAllBytesUpToTheMaximumAndNotOneMore) {
    const DiskPath path(_directory / "f");
    std::ofstream(path.text()) << std::string("ab\0c", 4);
    EXPECT_EQ(readFile(path, 4), std::string("ab\0c", 4));
    EXPECT_EQ(errorOf(readFile(path, 3)).code, EFBIG);
}

TEST_F(ReadFile, EmptyFileIsEmptyText) {
    std::ofstream(_directory / "f");
    EXPECT_EQ(readFile(DiskPath(_directory / "f"), 10), "");
}

TEST_F(ReadFile, MissingFileDirectoryAndPipeAreErrorsThatNameThePath) {
    EXPECT_EQ(errorOf(readFile(DiskPath(_directory / "none"), 10)).code, ENOENT);
    EXPECT_NE(errorOf(readFile(DiskPath(_directory / "none"), 10)).description->find("none"), std::string::npos);
    EXPECT_EQ(errorOf(readFile(DiskPath(_directory), 10)).code, EISDIR);
    ASSERT_EQ(::mkfifo((_directory / "pipe").c_str(), 0600), 0);
    EXPECT_EQ(errorOf(readFile(DiskPath(_directory / "pipe"), 10)).code, EINVAL);
}

TEST_F(ReadFile, ErrorNamesThePathAsTheAdministratorKnowsIt) {
    setSystemRoot(_directory);
    const Error error = errorOf(readFile(diskPath(HostPath("/etc/none")), 10));
    setSystemRoot("/");
    EXPECT_EQ(error.description, "cannot read /etc/none: No such file or directory");
}

TEST_F(ReadFile, PathWithANulNamesNoFile) {
    std::ofstream(_directory / "f") << "text";
    EXPECT_EQ(errorOf(readFile(DiskPath((_directory / "f").string() + std::string("\0x", 2)), 10)).code, EINVAL);
}

TEST_F(ReadFile, FilesWithoutASizeAreReadToTheirEnd) {
    const auto status = readFile(DiskPath("/proc/self/status"), 1U << 20U);
    ASSERT_TRUE(status);
    EXPECT_NE(status->find("Name:"), std::string::npos);
}

}  // namespace
}  // namespace adminhost
