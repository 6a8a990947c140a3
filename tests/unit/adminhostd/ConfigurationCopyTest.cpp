#include "adminhostd/ConfigurationCopy.h"

#include <cerrno>
#include <stdexcept>
#include <string>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

namespace adminhost {
namespace {

TEST(ConfigurationCopy, HoldsPathAndTextAndCanBeReadMoreThanOnce) {
    const std::string large(100'000, '#');
    for (const ConfigurationText& text : {ConfigurationText{"/etc/a.toml", "log = \"syslog\"\n"},
                                          {"/a", ""},
                                          {"", ""},
                                          {"/large", large + '\0' + large}}) {
        const FileDescriptor copy = sealedCopyOf(text);
        for (int i = 0; i < 2; ++i) {
            const ConfigurationText read = configurationIn(copy.get());
            EXPECT_EQ(read.path, text.path);
            EXPECT_EQ(read.text, text.text);
        }
    }
}

TEST(ConfigurationCopy, CannotBeChangedByAnyoneWhoHasIt) {
    const FileDescriptor copy = sealedCopyOf({"/etc/a.toml", "queue_limit = 5\n"});
    EXPECT_EQ(::pwrite(copy.get(), "x", 1, 0), -1);
    EXPECT_EQ(errno, EPERM);
    EXPECT_EQ(::ftruncate(copy.get(), 3), -1);
    EXPECT_EQ(::ftruncate(copy.get(), 4096), -1);
    EXPECT_EQ(::mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_SHARED, copy.get(), 0), MAP_FAILED);
    const FileDescriptor again(::open(("/proc/self/fd/" + std::to_string(copy.get())).c_str(), O_RDWR | O_CLOEXEC));
    EXPECT_EQ(::write(again.get(), "x", 1), -1);
    EXPECT_EQ(configurationIn(copy.get()).text, "queue_limit = 5\n");
}

TEST(ConfigurationCopy, AnythingElseIsAnError) {
    const FileDescriptor empty(::memfd_create("empty", MFD_CLOEXEC));
    EXPECT_THROW(static_cast<void>(configurationIn(empty.get())), std::runtime_error);
    EXPECT_THROW(static_cast<void>(configurationIn(-1)), std::runtime_error);
}

}  // namespace
}  // namespace adminhost
