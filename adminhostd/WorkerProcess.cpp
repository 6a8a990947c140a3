#include "adminhostd/WorkerProcess.h"

#include "platform/task/StartChild.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

/// Bytes that are read in one go. A worker that sends without end must not keep the front from its clients.
constexpr std::size_t readMaximum = std::size_t{1} << 20U;

/// The worker's program: beside this one in a build, in the library directory next to ours when installed.
std::string workerProgram() {
    char buffer[4096];
    const ssize_t length = ::readlink("/proc/self/exe", buffer, sizeof buffer);
    const std::string self(buffer, length < 0 ? 0 : static_cast<std::size_t>(length));
    const std::string directory = self.substr(0, self.rfind('/') + 1);
    std::string beside = directory + "adminhostd-worker";
    return ::access(beside.c_str(), X_OK) == 0 ? beside : directory + "../lib/adminhostd/adminhostd-worker";
}

bool isReady(std::span<const pollfd> polled, int descriptor) noexcept {
    return std::any_of(polled.begin(), polled.end(),
                       [&](const pollfd& entry) { return entry.fd == descriptor && entry.revents != 0; });
}

}  // namespace

std::unique_ptr<WorkerProcess> WorkerProcess::start(bool outputToStandardError) {
    int ends[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
        return nullptr;
    }
    auto tools = ToolRegister::create();
    if (!tools) {
        errno = static_cast<int>(tools.error().code);
        return nullptr;
    }
    std::unique_ptr<WorkerProcess> worker(new WorkerProcess(*std::move(tools)));
    worker->_socket = FileDescriptor(ends[0]);
    const FileDescriptor other(ends[1]);
    ::fcntl(ends[0], F_SETFL, O_NONBLOCK);

    ChildPlan plan;
    plan.program = workerProgram();
    plan.arguments = {"adminhostd-worker"};
    plan.environment = processEnvironment();
    plan.descriptors = {-1, outputToStandardError ? STDERR_FILENO : STDOUT_FILENO, STDERR_FILENO, other.get(),
                        worker->_tools.descriptor()};
    plan.directory = "/";
    plan.fileModeMask = S_IWGRP | S_IWOTH;
    auto started = startChild(plan);
    if (!started) {
        errno = static_cast<int>(started.error().code);
        return nullptr;
    }
    worker->_pid = started->pid;
    worker->_process = std::move(started->exit);
    return worker;
}

WorkerProcess::~WorkerProcess() {
    if (_pid > 0 && !ending()) {
        kill();
        finish(100);
    }
}

void WorkerProcess::addTo(std::vector<pollfd>& entries) const {
    entries.push_back(
        {_closed ? -1 : _socket.get(), static_cast<short>(_unsent.empty() ? POLLIN : POLLIN | POLLOUT), 0});
    entries.push_back({_process.get(), POLLIN, 0});
}

bool WorkerProcess::mayConverse(std::span<const pollfd> polled) const noexcept {
    return !_closed && isReady(polled, _socket.get());
}

bool WorkerProcess::mayHaveEnded(std::span<const pollfd> polled) const noexcept {
    return _ending || !_process.isOpen() || isReady(polled, _process.get());
}

bool WorkerProcess::send(const Frame& frame) {
    auto bytes = encodeFrame(frame);
    if (!bytes) {
        return false;
    }
    *bytes += frame.bytes;
    if (_unsent.empty()) {
        _unsent = std::move(*bytes);
    } else {
        _unsent += *bytes;
    }
    write();
    return true;
}

void WorkerProcess::write() {
    while (_sent < _unsent.size()) {
        const ssize_t written = ::send(_socket.get(), _unsent.data() + _sent, _unsent.size() - _sent, MSG_NOSIGNAL);
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written < 0) {
            // Full, or closed: the end of the process is noticed separately.
            break;
        }
        _sent += static_cast<std::size_t>(written);
    }
    if (_sent == _unsent.size()) {
        std::string().swap(_unsent);
        _sent = 0;
    }
}

bool WorkerProcess::converse() {
    if (!_unsent.empty()) {
        write();
    }
    char buffer[64 << 10];
    std::size_t taken = 0;
    while (!_closed && taken < readMaximum) {
        const ssize_t count = ::recv(_socket.get(), buffer, sizeof buffer, 0);
        if (count > 0) {
            _reader.append({buffer, static_cast<std::size_t>(count)});
            ::explicit_bzero(buffer, static_cast<std::size_t>(count));
            taken += static_cast<std::size_t>(count);
            if (static_cast<std::size_t>(count) < sizeof buffer) {
                return false;
            }
        } else if (count == 0 || (errno != EINTR && errno != EAGAIN)) {
            _closed = true;
        } else if (errno == EAGAIN) {
            return false;
        }
    }
    return !_closed;
}

const std::optional<std::string>& WorkerProcess::ending() {
    if (_ending) {
        return _ending;
    }
    int status = 0;
    const pid_t waited = ::waitpid(_pid, &status, WNOHANG);
    if (waited < 0 && errno == ECHILD) {
        _ending = "ended, and the system does not know how";
    } else if (waited == _pid && WIFSIGNALED(status)) {
        _ending = fmt::format("was killed by signal {} ({})", WTERMSIG(status), ::strsignal(WTERMSIG(status)));
    } else if (waited == _pid) {
        _ending = fmt::format("ended with status {}", WEXITSTATUS(status));
    }
    if (_ending) {
        _tools.killRemaining();
    }
    return _ending;
}

void WorkerProcess::kill() noexcept {
    if (!_ending) {
        ::kill(_pid, SIGKILL);
    }
}

void WorkerProcess::finish(int milliseconds) {
    _socket.close();
    _closed = true;
    pollfd entry{_process.get(), POLLIN, 0};
    while (::poll(&entry, 1, milliseconds) < 0 && errno == EINTR) {
    }
    static_cast<void>(ending());
}

}  // namespace adminhost
