#include "adminhostctl/RemoteHost.h"

#include "adminhostctl/Bridge.h"
#include "adminhostctl/Interrupt.h"
#include "adminhostctl/Width.h"
#include "platform/release/Release.h"
#include "platform/task/StartChild.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <string_view>
#include <utility>

#include <fcntl.h>
#include <fmt/format.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::ctl {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr int statusOfUsage = 2;  // "bridge" is not one of its words, or it rejects the other ones
constexpr int statusNotExecutable = 126;
constexpr int statusNotFound = 127;
constexpr int statusOfSsh = 255;
constexpr std::size_t longestText = std::size_t{64} << 10U;  ///< that start files of a shell may print
constexpr std::size_t longestSocketPath = sizeof(sockaddr_un::sun_path) - 1;
constexpr auto patience = milliseconds(2000);

/// The first ssh of PATH; empty if there is none. Relative directories do not count.
std::string findSsh() {
    const char* const path = std::getenv("PATH");
    std::string_view rest = path != nullptr ? path : "/usr/bin:/bin";
    while (!rest.empty()) {
        const std::size_t colon = rest.find(':');
        std::string program = std::string(rest.substr(0, colon)) + "/ssh";
        if (program.starts_with('/') && ::access(program.c_str(), X_OK) == 0) {
            return program;
        }
        rest.remove_prefix(colon == std::string_view::npos ? rest.size() : colon + 1);
    }
    return {};
}

bool isSafePath(std::string_view path) {
    // The shell of the other machine reads it.
    return path.starts_with('/') && std::all_of(path.begin(), path.end(), [](char c) {
               return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') ||
                      std::string_view("/._-+@%,=:").find(c) != std::string_view::npos;
           });
}

Failure sshFailure(const std::string& text) {
    return {ExitStatus::hostNotReachable, text};
}

/// Throws why ssh has ended with this status before it was connected.
[[noreturn]] void throwFailureOfSsh(const std::string& host, int status) {
    const std::string install = "install the release " ADMINHOST_RELEASE " there";
    switch (status) {
        case statusOfSsh:
            throw Unavailable(ExitStatus::hostNotReachable, host + " cannot be reached: ssh ended with status 255");
        case statusNotFound:
            throw sshFailure("adminhostctl is not found on " + host + "; " + install +
                             ", or add its directory to the PATH of a login without a terminal");
        case statusNotExecutable:
            throw sshFailure("adminhostctl on " + host + " cannot be executed; " + install);
        case statusOfUsage:
            throw sshFailure("adminhostctl on " + host +
                             " has no verb \"bridge\", or rejected its arguments: its release may be older; " +
                             install);
        case static_cast<int>(ExitStatus::notReachable):
            throw Unavailable(ExitStatus::notReachable, "the daemon of " + host + " cannot be reached");
        case static_cast<int>(ExitStatus::notPermitted):
            throw Failure(ExitStatus::notPermitted,
                          "permission denied by the daemon's socket on " + host + "; its group and root may use it");
        default:
            throw sshFailure(fmt::format("adminhostctl on {} could not be run: it ended with status {}", host, status));
    }
}

}  // namespace

RemoteHost::RemoteHost(Options options) : _options(std::move(options)) {
    const std::string& host = _options.host;
    const std::size_t at = host.rfind('@');
    if (host.empty() || host.starts_with('-') || (at != std::string::npos && host.substr(at + 1).starts_with('-'))) {
        throw usageError("--host: \"" + host + "\" is not the name of a host");
    }
    if (_options.socket && !isSafePath(*_options.socket)) {
        throw usageError(
            "--socket: with --host, the path must begin with / and have only letters, digits and /._-+@%,=:");
    }
    if (_options.socket && _options.socket->size() > longestSocketPath) {
        throw usageError(fmt::format("--socket: \"{}\" is too long for the path of a socket; use {} bytes at most",
                                     *_options.socket, longestSocketPath));
    }
}

RemoteHost::~RemoteHost() {
    const auto end = steady_clock::now() + patience;
    for (Ssh& ssh : _all) {
        waitFor(ssh, std::chrono::ceil<milliseconds>(end - steady_clock::now()));
    }
}

RemoteHost::Ssh RemoteHost::start(FileDescriptor& ours) {
    const std::string program = findSsh();
    if (program.empty()) {
        throw sshFailure("ssh is not installed; install the package openssh-client");
    }
    std::array<int, 2> sockets{};
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, sockets.data()) != 0) {
        throw sshFailure(std::string("ssh cannot be started: ") + std::strerror(errno));
    }
    ours = FileDescriptor(sockets[0]);
    const FileDescriptor theirs(sockets[1]);
    // Not our standard error: ssh would change its mode, and what it prints is checked for control characters.
    std::array<int, 2> messages{};
    if (::pipe2(messages.data(), O_CLOEXEC) != 0) {
        throw sshFailure(std::string("ssh cannot be started: ") + std::strerror(errno));
    }
    Ssh ssh;
    ssh.messages = FileDescriptor(messages[0]);
    const FileDescriptor writer(messages[1]);
    ::fcntl(ssh.messages.get(), F_SETFL, O_NONBLOCK);

    ChildPlan plan;
    plan.program = program;
    plan.arguments = {"ssh", "-T"};
    if (!_options.asks) {
        plan.arguments.insert(plan.arguments.end(), {"-o", "BatchMode=yes"});
    }
    if (_options.connectTimeout) {
        plan.arguments.insert(plan.arguments.end(),
                              {"-o", fmt::format("ConnectTimeout={}", _options.connectTimeout->count())});
    }
    plan.arguments.insert(plan.arguments.end(), {"--", _options.host, "adminhostctl"});
    if (_options.socket) {
        plan.arguments.insert(plan.arguments.end(), {"--socket", *_options.socket});
    }
    plan.arguments.emplace_back("bridge");
    plan.environment = processEnvironment();
    plan.descriptors = {theirs.get(), theirs.get(), writer.get()};
    plan.ownGroup = false;  // so that ssh can ask on the terminal
    auto started = startChild(plan);
    if (!started) {
        throw sshFailure(program + " cannot be started: " + started.error().description.value_or("unknown error"));
    }
    ssh.pid = started->pid;
    ssh.exit = std::move(started->exit);
    ssh.socket = ours.get();
    return ssh;
}

RemoteHost::Connected RemoteHost::connect(Milliseconds limit) {
    std::erase_if(_all, [&](Ssh& ssh) { return ssh.closed && waitFor(ssh, milliseconds(0)); });
    FileDescriptor ours;
    Ssh& ssh = _all.emplace_back(start(ours));
    Connected connected;
    try {
        connected.login = awaitGreeting(ssh, limit);
    } catch (...) {
        ours.close();
        ssh.closed = true;
        throw;
    }
    connected.socket = ours.release();
    return connected;
}

steady_clock::duration RemoteHost::awaitGreeting(Ssh& ssh, Milliseconds limit) {
    const auto start = steady_clock::now();
    auto end = start + limit;
    bool hasBegun = false;
    bool mayAsk = _options.asks;
    steady_clock::duration login{};
    std::string line;
    std::size_t size = 0;
    while (size < longestText) {
        std::array<pollfd, 2> waited{pollfd{ssh.socket, POLLIN, 0},
                                     pollfd{ssh.messages.isOpen() ? ssh.messages.get() : -1, POLLIN, 0}};
        const auto left = std::chrono::ceil<milliseconds>(end - steady_clock::now());
        if (!mayAsk && left <= milliseconds(0)) {
            this->end(ssh);
            throw Unavailable(hasBegun ? ExitStatus::notReachable : ExitStatus::hostNotReachable,
                              fmt::format("{}{} has not answered within {:g} s", hasBegun ? "the daemon of " : "",
                                          _options.host, std::chrono::duration<double>(limit).count()));
        }
        const auto pause = mayAsk ? milliseconds(1000) : std::min(left, milliseconds(1000));
        static_cast<void>(::poll(waited.data(), waited.size(), static_cast<int>(pause.count())));
        if (isInterrupted()) {
            this->end(ssh);
            throw Failure(ExitStatus::failed, "interrupted; nothing was sent");
        }
        if (waited[1].revents != 0) {
            passMessages(ssh);
        }
        if (waited[0].revents == 0) {
            continue;
        }
        char c = 0;  // one at a time: what follows the greeting is the daemon's
        const ssize_t count = ::recv(ssh.socket, &c, 1, MSG_DONTWAIT);
        if (count < 0 && (errno == EAGAIN || errno == EINTR)) {
            continue;
        }
        if (count <= 0) {
            if (!waitFor(ssh, patience)) {
                this->end(ssh);
            }
            throwFailureOfSsh(_options.host, ssh.status.value_or(statusOfSsh));
        }
        ++size;
        line.push_back(c);
        if (c == '\n') {
            // A start file may have printed text without a line end before it, such as a terminal's title.
            if (line.ends_with(bridgeGreeting)) {
                return mayAsk ? steady_clock::now() - start : login;
            }
            if (line.ends_with(bridgeBegin)) {
                hasBegun = true;
                if (std::exchange(mayAsk, false)) {
                    login = steady_clock::now() - start;
                    end = steady_clock::now() + limit;
                }
            }
            line.clear();
        }
    }
    this->end(ssh);
    throw sshFailure(_options.host +
                     " prints other text before adminhostctl is run; its shell's start files must not "
                     "print anything in a login without a terminal");
}

bool RemoteHost::isConnected(int socket) const noexcept {
    pollfd waited{socket, POLLIN | POLLRDHUP, 0};
    return std::any_of(_all.begin(), _all.end(), [&](const Ssh& ssh) { return !ssh.closed && ssh.socket == socket; }) &&
           ::poll(&waited, 1, 0) == 0;
}

void RemoteHost::close(int socket) noexcept {
    for (Ssh& ssh : _all) {
        if (!ssh.closed && ssh.socket == socket) {
            ssh.closed = true;
        }
    }
    ::close(socket);
}

bool RemoteHost::move(int socket, int number) noexcept {
    if (::fcntl(socket, F_SETFL, O_NONBLOCK) != 0 || ::dup3(socket, number, O_CLOEXEC) < 0) {
        return false;
    }
    ::close(socket);
    for (Ssh& ssh : _all) {
        if (!ssh.closed && ssh.socket == socket) {
            ssh.socket = number;
        }
    }
    return true;
}

std::optional<int> RemoteHost::statusOf(int socket, Milliseconds limit) {
    // The latest one: numbers of closed sockets are used again.
    const auto found = std::find_if(_all.rbegin(), _all.rend(), [&](const Ssh& ssh) { return ssh.socket == socket; });
    if (found == _all.rend()) {
        return std::nullopt;
    }
    if (!waitFor(*found, limit)) {
        end(*found);
        return std::nullopt;
    }
    return found->status;
}

bool RemoteHost::waitFor(Ssh& ssh, Milliseconds limit) {
    const auto end = steady_clock::now() + limit;
    while (!ssh.status) {
        std::array<pollfd, 2> waited{pollfd{ssh.exit.get(), POLLIN, 0},
                                     pollfd{ssh.messages.isOpen() ? ssh.messages.get() : -1, POLLIN, 0}};
        const auto left = std::max(std::chrono::ceil<milliseconds>(end - steady_clock::now()), milliseconds(0));
        const int ready = ::poll(waited.data(), waited.size(), static_cast<int>(left.count()));
        passMessages(ssh);
        int status = 0;
        if (waited[0].revents != 0 && ::waitpid(ssh.pid, &status, 0) == ssh.pid) {
            ssh.status = WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
            passMessages(ssh);
        } else if (ready == 0 && left == milliseconds(0)) {
            return false;
        }
    }
    return true;
}

void RemoteHost::end(Ssh& ssh) {
    for (const int number : {SIGTERM, SIGKILL}) {
        if (!ssh.status) {
            ::kill(ssh.pid, number);
            waitFor(ssh, patience);
        }
    }
}

void RemoteHost::passMessages() {
    for (Ssh& ssh : _all) {
        passMessages(ssh);
    }
}

void RemoteHost::passMessages(Ssh& ssh) {
    std::array<char, 4096> bytes{};
    ssize_t count = 0;
    const auto printLine = [&] {
        while (!ssh.line.empty() && ssh.line.back() == '\r') {
            ssh.line.pop_back();
        }
        // Every connection has the same banner, and often the same failure.
        if (!ssh.line.empty() && _printed.insert(ssh.line).second) {
            std::cerr << shown(ssh.line) << '\n';
        }
        ssh.line.clear();
    };
    while (ssh.messages.isOpen() && (count = ::read(ssh.messages.get(), bytes.data(), bytes.size())) > 0) {
        for (const char c : std::string_view(bytes.data(), static_cast<std::size_t>(count))) {
            if (c == '\n' || ssh.line.size() == bytes.size()) {
                printLine();
            }
            if (c != '\n') {
                ssh.line.push_back(c);
            }
        }
    }
    if (ssh.messages.isOpen() && count == 0) {
        printLine();
        ssh.messages.close();
    }
}

}  // namespace adminhost::ctl
