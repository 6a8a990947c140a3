#include "tests/support/DaemonProcess.h"

#include "tests/support/Eventually.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <thread>

#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

constexpr auto patience = std::chrono::seconds(30);
constexpr auto step = std::chrono::milliseconds(5);

std::string readWhole(const std::filesystem::path& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), {}};
}

std::vector<char*> pointersTo(std::vector<std::string>& texts) {
    std::vector<char*> pointers;
    pointers.reserve(texts.size() + 1);
    for (std::string& text : texts) {
        pointers.push_back(text.data());
    }
    pointers.push_back(nullptr);
    return pointers;
}

}  // namespace

DaemonProcess::DaemonProcess(const Options& options) {
    std::string directory = (std::filesystem::temp_directory_path() / "daemon.XXXXXX").string();
    if (::mkdtemp(directory.data()) == nullptr) {
        throw std::runtime_error(std::string("cannot make a directory: ") + std::strerror(errno));
    }
    _directory = directory;
    _socket = options.socket.empty() ? (_directory / "socket").string() : options.socket;
    std::filesystem::create_directory(_directory / "tmp");
    std::ofstream(_directory / "config") << options.configuration;

    const std::string program = options.program.empty() ? DAEMON : options.program;
    std::vector<std::string> arguments{program, "--socket", socket(), "--config", _directory / "config",
                                       "--log", "stderr"};
    arguments.insert(arguments.end(), options.arguments.begin(), options.arguments.end());
    std::vector<std::string> environment = options.environment;
    environment.push_back("TMPDIR=" + (_directory / "tmp").string());
    for (char** variable = environ; *variable != nullptr; ++variable) {
        environment.emplace_back(*variable);  // the first of two definitions counts
    }
    if (std::find(arguments.begin(), arguments.end(), "--root") == arguments.end()) {
        // Nothing of this machine, except for the database tool.
        std::filesystem::create_directories(_directory / "root/etc");
        std::ofstream(_directory / "root/etc/passwd") << "root:x:0:0::/root:/bin/sh\n";
        std::ofstream(_directory / "root/etc/group") << "root:x:0:\n";
        std::filesystem::create_directories(_directory / "root/usr/bin");
        std::filesystem::create_symlink("/usr/bin/sqlite3", _directory / "root/usr/bin/sqlite3");
        arguments.insert(arguments.end(), {"--root", _directory / "root"});
    }
    posix_spawn_file_actions_t actions;
    ::posix_spawn_file_actions_init(&actions);
    if (options.standardError >= 0) {
        ::posix_spawn_file_actions_adddup2(&actions, options.standardError, STDERR_FILENO);
    } else {
        ::posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, (_directory / "log").c_str(),
                                           O_WRONLY | O_CREAT | O_APPEND, 0600);
    }
    rlimit before{};
    ::getrlimit(RLIMIT_NOFILE, &before);
    if (options.descriptors > 0) {
        const rlimit bound{options.descriptors, before.rlim_max};  // inherited, like ulimit -n in a shell
        ::setrlimit(RLIMIT_NOFILE, &bound);
    }
    const int failure = ::posix_spawn(&_pid, program.c_str(), &actions, nullptr, pointersTo(arguments).data(),
                                      pointersTo(environment).data());
    ::setrlimit(RLIMIT_NOFILE, &before);
    ::posix_spawn_file_actions_destroy(&actions);
    if (failure != 0) {
        _pid = -1;
        std::filesystem::remove_all(_directory);
        throw std::runtime_error("cannot start " + program + ": " + std::strerror(failure));
    }
    const auto bound = std::chrono::steady_clock::now() + patience;
    while (options.waitUntilReady) {
        try {
            connect().get("/v1/");
            return;
        } catch (const std::runtime_error&) {
            if (wait(std::chrono::milliseconds(0)) || std::chrono::steady_clock::now() > bound) {
                const std::string text = log();
                end();
                throw std::runtime_error("the daemon does not start: " + text);
            }
        }
        std::this_thread::sleep_for(step);
    }
}

DaemonProcess::~DaemonProcess() {
    end();
}

void DaemonProcess::end() {
    if (_pid > 0 && !_status) {
        const std::vector<pid_t> children = childrenOf(_pid);
        const pid_t front = frontPid();
        ::kill(_pid, SIGKILL);
        if (front > 0) {
            ::kill(front, SIGKILL);
        }
        wait();
        // A worker ends by itself when the socket pair is closed. One that is just starting creates its directories
        // first, below a root that would be removed already.
        for (int tries = 0; tries < 200 && std::any_of(children.begin(), children.end(), &isRunning); ++tries) {
            ::usleep(5'000);
        }
    }
    // One that is finishing a write may create and remove files meanwhile.
    std::error_code error;
    for (int tries = 0; std::filesystem::remove_all(_directory, error), error && tries < 500; ++tries) {
        ::usleep(10'000);
    }
}

pid_t DaemonProcess::frontPid() const {
    for (const pid_t pid : childrenOf(_pid)) {
        if (readWhole("/proc/" + std::to_string(pid) + "/comm").starts_with("adminhostd-fron")) {
            return pid;
        }
    }
    return -1;
}

pid_t DaemonProcess::workerPid() const {
    const std::string key = "\"workerPid\":";
    const auto end = std::chrono::steady_clock::now() + patience;
    do {
        const std::string text = connect().get("/v1/").body;
        if (const std::size_t at = text.find(key); at != std::string::npos) {
            return std::stoi(text.substr(at + key.size()));
        }
        std::this_thread::sleep_for(step);  // the monitor is starting it
    } while (std::chrono::steady_clock::now() < end);
    return -1;
}

std::string DaemonProcess::log() const {
    return readWhole(_directory / "log");
}

bool DaemonProcess::waitForLog(const std::string& text) const {
    const auto end = std::chrono::steady_clock::now() + patience;
    while (log().find(text) == std::string::npos) {
        if (std::chrono::steady_clock::now() > end) {
            return false;
        }
        std::this_thread::sleep_for(step);
    }
    return true;
}

bool DaemonProcess::waitForWaiting(unsigned count) const {
    const std::string text = "\"waiting\":" + std::to_string(count) + ',';
    return eventually([&] { return connect().get("/v1/").body.find(text) != std::string::npos; }, patience);
}

void DaemonProcess::signal(int number) const {
    ::kill(_pid, number);
}

std::optional<int> DaemonProcess::wait(std::chrono::milliseconds bound) {
    const auto end = std::chrono::steady_clock::now() + bound;
    while (!_status) {
        int status = 0;
        if (::waitpid(_pid, &status, WNOHANG) == _pid) {
            _status = WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
        } else if (std::chrono::steady_clock::now() >= end) {
            break;
        } else {
            std::this_thread::sleep_for(step);
        }
    }
    return _status;
}

bool isRunning(pid_t process) {
    const std::string text = readWhole("/proc/" + std::to_string(process) + "/stat");
    const std::size_t name = text.rfind(") ");
    return name != std::string::npos && text.substr(name + 2, 1) != "Z";
}

std::vector<pid_t> childrenOf(pid_t process) {
    const std::string self = std::to_string(process);
    std::ifstream file("/proc/" + self + "/task/" + self + "/children");
    std::vector<pid_t> children;
    for (pid_t pid = 0; file >> pid;) {
        children.push_back(pid);
    }
    return children;
}

std::size_t descriptorsOf(pid_t pid) {
    if (::geteuid() != 0 && ::access(("/proc/" + std::to_string(pid) + "/fd").c_str(), R_OK) != 0) {
        return 0;  // the daemon cannot be inspected; only root sees its descriptors
    }
    const std::filesystem::directory_iterator entries("/proc/" + std::to_string(pid) + "/fd");
    return static_cast<std::size_t>(std::distance(begin(entries), end(entries)));
}

std::size_t residentKilobytesOf(pid_t pid) {
    std::ifstream file("/proc/" + std::to_string(pid) + "/status");
    std::string word;
    while (file >> word) {
        if (word == "VmRSS:") {
            std::size_t kilobytes = 0;
            file >> kilobytes;
            return kilobytes;
        }
    }
    return 0;
}

}  // namespace adminhost::test
