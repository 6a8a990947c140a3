#include "tests/support/ServerProcess.h"

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <stdexcept>
#include <thread>

#include <fcntl.h>
#include <netinet/in.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

extern char** environ;

namespace support {
namespace {

/// A descriptor that its destructor closes.
class Descriptor {
  public:
    explicit Descriptor(int number) : _number(number) {}
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;
    ~Descriptor() {
        if (_number >= 0) {
            close(_number);
        }
    }
    [[nodiscard]] int get() const { return _number; }

  private:
    int _number;
};

/// Starts the program with empty input and its output in the file.
pid_t spawn(const std::vector<std::string>& arguments, const std::filesystem::path& output) {
    std::vector<char*> argv;
    argv.reserve(arguments.size() + 1);
    for (const std::string& argument : arguments) {
        argv.push_back(const_cast<char*>(argument.c_str()));
    }
    argv.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_addopen(&actions, 1, output.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
    posix_spawn_file_actions_adddup2(&actions, 1, 2);
    pid_t pid = 0;
    const int error = posix_spawn(&pid, argv[0], &actions, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    if (error != 0) {
        throw std::runtime_error(arguments[0] + ": " + std::strerror(error));
    }
    return pid;
}

sockaddr_in loopback(int port) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    address.sin_port = htons(static_cast<std::uint16_t>(port));
    return address;
}

int bindTo(int socket, int port) {
    const sockaddr_in address = loopback(port);
    return bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address);
}

}  // namespace

bool ServerProcess::start(const std::vector<std::string>& arguments, const std::filesystem::path& output, int port) {
    std::vector<std::string> command{"/usr/bin/setpriv", "--pdeathsig", "KILL"};
    command.insert(command.end(), arguments.begin(), arguments.end());
    _pid = spawn(command, output);
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (std::chrono::steady_clock::now() < deadline) {
        if (waitpid(_pid, nullptr, WNOHANG) == _pid) {
            _pid = 0;
            return false;
        }
        if (accepts(port)) {
            return true;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    stop();
    return false;
}

void ServerProcess::stop() noexcept {
    if (_pid > 0) {
        kill(_pid, SIGKILL);
        while (waitpid(_pid, nullptr, 0) < 0 && errno == EINTR) {
        }
        _pid = 0;
    }
}

int freePort() {
    for (int attempt = 0; attempt < 100; ++attempt) {
        const Descriptor stream(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const Descriptor datagram(socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        sockaddr_in address{};
        socklen_t length = sizeof address;
        if (bindTo(stream.get(), 0) == 0 &&
            getsockname(stream.get(), reinterpret_cast<sockaddr*>(&address), &length) == 0 &&
            bindTo(datagram.get(), ntohs(address.sin_port)) == 0) {
            return ntohs(address.sin_port);
        }
    }
    throw std::runtime_error("no free port");
}

bool accepts(int port) {
    const Descriptor stream(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const sockaddr_in address = loopback(port);
    return connect(stream.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

std::filesystem::path createTemporaryDirectory(std::string_view name) {
    std::string pattern = std::filesystem::temp_directory_path() / (std::string(name) + ".XXXXXX");
    if (mkdtemp(pattern.data()) == nullptr) {
        throw std::runtime_error("mkdtemp: " + std::string(std::strerror(errno)));
    }
    return pattern;
}

std::string contentsOf(const std::filesystem::path& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

void writeFile(const std::filesystem::path& path, std::string_view text) {
    std::ofstream file(path, std::ios::binary);
    file << text;
    if (!file.flush()) {
        throw std::runtime_error("cannot write " + path.string());
    }
}

}  // namespace support
