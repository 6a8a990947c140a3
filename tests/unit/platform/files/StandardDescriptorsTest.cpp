#include "platform/files/StandardDescriptors.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

/// Runs the function in a child whose standard descriptors of the set (a bit each) are closed. Returns the set of those
/// that are /dev/null afterwards, or -1 when something else has changed.
int nullDescriptorsAfter(unsigned closed) {
    const pid_t child = ::fork();
    if (child == 0) {
        struct stat before[3]{};
        struct stat null {};
        ::stat("/dev/null", &null);
        const int other = ::open("/", O_RDONLY | O_DIRECTORY);
        for (int i = 0; i < 3; ++i) {
            ::dup2(other, i);
            ::fstat(i, &before[i]);
        }
        for (int i = 0; i < 3; ++i) {
            if ((closed >> static_cast<unsigned>(i) & 1U) != 0) {
                ::close(i);
            }
        }
        if (!adminhost::openStandardDescriptors()) {
            ::_exit(100);
        }
        int result = 0;
        for (int i = 0; i < 3; ++i) {
            struct stat status {};
            if (::fstat(i, &status) != 0) {
                ::_exit(101);
            }
            const bool isNull = S_ISCHR(status.st_mode) && status.st_rdev == null.st_rdev;
            const bool isBefore = status.st_dev == before[i].st_dev && status.st_ino == before[i].st_ino;
            if (!isNull && !isBefore) {
                ::_exit(102);
            }
            result |= isNull ? 1 << i : 0;
        }
        ::_exit(result);
    }
    int status = 0;
    ::waitpid(child, &status, 0);
    return WIFEXITED(status) && WEXITSTATUS(status) < 8 ? WEXITSTATUS(status) : -1;
}

TEST(StandardDescriptors, ClosedOnesBecomeTheNullDeviceAndOpenOnesStay) {
    for (unsigned closed = 0; closed < 8; ++closed) {
        EXPECT_EQ(nullDescriptorsAfter(closed), static_cast<int>(closed)) << closed;
    }
}

}  // namespace
