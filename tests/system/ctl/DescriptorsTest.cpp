// The command line when it is started without standard descriptors.

#include <cstdlib>
#include <filesystem>
#include <string>

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;

TEST(CtlDescriptors, ClosedStandardDescriptorsAreTheNullDeviceAndNeverTheConnection) {
    std::string directory = (fs::temp_directory_path() / "ctl.XXXXXX").string();
    ASSERT_NE(::mkdtemp(directory.data()), nullptr);
    const std::string path = directory + "/socket";
    const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    ASSERT_EQ(::bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    ASSERT_EQ(::listen(listener, 1), 0);

    const pid_t child = ::fork();
    if (child == 0) {
        for (int i = 0; i < 3; ++i) {
            ::close(i);
        }
        const std::string program = std::string(BINARY_DIR) + "/bin/adminhostctl";
        ::execl(program.c_str(), program.c_str(), "--socket", path.c_str(), "getCameras", nullptr);
        ::_exit(127);
    }
    pollfd entry{listener, POLLIN, 0};
    ASSERT_EQ(::poll(&entry, 1, 10'000), 1) << "it connects";
    // While it waits for the answer, which never comes.
    for (int i = 0; i < 3; ++i) {
        std::error_code problem;
        EXPECT_EQ(fs::read_symlink("/proc/" + std::to_string(child) + "/fd/" + std::to_string(i), problem), "/dev/null")
            << i << problem.message();
    }
    ::close(listener);
    int status = 0;
    EXPECT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(WEXITSTATUS(status), 3) << "it ends as usual when the daemon is not reachable";
    fs::remove_all(directory);
}

}  // namespace
