#include "platform/task/ToolRegister.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <csignal>
#include <string_view>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr std::size_t size = 4096;
constexpr pid_t claimed = -1;  ///< by a tool that has not entered its id yet
constexpr int stopTries = 20;  ///< milliseconds

std::atomic<ToolRegister*> registerOfProcess = nullptr;

tl::unexpected<Error> failed() {
    return failure(Error{"posix", errno, std::generic_category().message(errno)});
}

enum class ProcessState { gone, stopped, running };

/// The state of a process from /proc. One that is exiting counts as gone.
ProcessState stateOf(pid_t pid) noexcept {
    constexpr unsigned long isExiting = 0x4;  // PF_EXITING of the kernel
    constexpr int flagsAfterState = 7;
    std::array<char, 32> path{"/proc/"};
    char* const number = path.data() + std::string_view("/proc/").size();
    char* const end = std::to_chars(number, path.data() + path.size(), pid).ptr;
    std::string_view("/stat").copy(end, 5);
    const FileDescriptor file(::open(path.data(), O_RDONLY | O_CLOEXEC));
    std::array<char, 1024> buffer{};
    const ssize_t length = file.isOpen() ? ::read(file.get(), buffer.data(), buffer.size()) : -1;
    if (length <= 0) {
        return ProcessState::gone;
    }
    // PID (NAME) STATE PPID PGRP SESSION TTY TPGID FLAGS, where NAME may hold anything.
    std::string_view rest(buffer.data(), static_cast<std::size_t>(length));
    rest.remove_prefix(std::min(rest.size(), rest.rfind(')') + 2));
    const char state = rest.empty() ? 'X' : rest.front();
    for (int field = 1; field < flagsAfterState; ++field) {
        rest.remove_prefix(std::min(rest.size(), rest.find(' ') + 1));
    }
    unsigned long flags = isExiting;
    std::from_chars(rest.data(), rest.data() + rest.size(), flags);
    if (state == 'Z' || state == 'X' || (flags & isExiting) != 0) {
        return ProcessState::gone;
    }
    return state == 'T' || state == 't' ? ProcessState::stopped : ProcessState::running;
}

/// Kills the group of a process that has not exited. Stops the process first: otherwise it could exit between the check
/// and the signal, which would then hit the service that it has started.
void killGroup(pid_t pid) noexcept {
    if (::getpgid(pid) != pid || ::getsid(pid) != ::getsid(0) || stateOf(pid) == ProcessState::gone) {
        return;
    }
    ::kill(pid, SIGSTOP);
    ProcessState state = stateOf(pid);
    for (int tries = 0; state == ProcessState::running && tries < stopTries; ++tries) {
        ::usleep(1000);
        state = stateOf(pid);
    }
    // One that the kernel does not stop, because it waits for a dead mount, does not exit either.
    if (state != ProcessState::gone) {
        ::kill(-pid, SIGKILL);
    }
}

}  // namespace

Result<ToolRegister> ToolRegister::create() {
    FileDescriptor descriptor(::memfd_create("adminhost-tools", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    if (!descriptor.isOpen() || ::ftruncate(descriptor.get(), size) != 0 ||
        ::fcntl(descriptor.get(), F_ADD_SEALS, F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL) != 0) {
        return failed();
    }
    return open(std::move(descriptor));
}

Result<ToolRegister> ToolRegister::open(FileDescriptor descriptor) {
    struct stat status {};
    if (::fstat(descriptor.get(), &status) != 0) {
        return failed();
    }
    if (status.st_size != static_cast<off_t>(size)) {
        errno = EINVAL;
        return failed();
    }
    static_assert(sizeof(Places) <= size && std::atomic<std::int64_t>::is_always_lock_free);
    void* memory = ::mmap(nullptr, size, PROT_READ | PROT_WRITE, MAP_SHARED, descriptor.get(), 0);
    if (memory == MAP_FAILED) {
        return failed();
    }
    return ToolRegister(std::move(descriptor), static_cast<Places*>(memory));
}

ToolRegister::ToolRegister(ToolRegister&& other) noexcept
    : _descriptor(std::move(other._descriptor)), _places(std::exchange(other._places, nullptr)) {}

ToolRegister::~ToolRegister() {
    if (_places != nullptr) {
        ::munmap(static_cast<void*>(_places), size);
    }
}

std::atomic<pid_t>* ToolRegister::claim() noexcept {
    for (std::atomic<pid_t>& place : _places->tools) {
        pid_t free = 0;
        if (place.compare_exchange_strong(free, claimed)) {
            return &place;
        }
    }
    return nullptr;
}

void ToolRegister::killRemaining() noexcept {
    for (std::atomic<pid_t>& place : _places->tools) {
        const pid_t pid = place.exchange(0);
        if (pid > 1) {
            killGroup(pid);
        }
    }
}

void ToolRegister::setDeadline(std::optional<std::chrono::steady_clock::time_point> deadline) noexcept {
    _places->deadline = deadline ? deadline->time_since_epoch().count() : 0;
}

std::optional<std::chrono::steady_clock::time_point> ToolRegister::deadline() const noexcept {
    using Clock = std::chrono::steady_clock;
    const std::int64_t count = _places->deadline;
    return count == 0 ? std::nullopt : std::optional(Clock::time_point(Clock::duration(count)));
}

void setToolRegister(ToolRegister* toolRegister) noexcept {
    registerOfProcess = toolRegister;
}

ToolRegister* toolRegister() noexcept {
    return registerOfProcess;
}

}  // namespace adminhost
