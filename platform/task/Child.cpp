#include "platform/task/Child.h"

#include <cerrno>
#include <csignal>

#include <fcntl.h>
#include <spawn.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

class SpawnAttributes {
  public:
    SpawnAttributes() noexcept : _failure(::posix_spawnattr_init(&_attributes)) {}
    SpawnAttributes(const SpawnAttributes&) = delete;
    SpawnAttributes& operator=(const SpawnAttributes&) = delete;
    ~SpawnAttributes() { ::posix_spawnattr_destroy(&_attributes); }

    /// A process group of its own, no signal blocked, every signal at its default. The system's error number.
    int set() noexcept {
        sigset_t none{};
        sigset_t all{};
        ::sigemptyset(&none);
        ::sigfillset(&all);
        note(::posix_spawnattr_setsigmask(&_attributes, &none));
        note(::posix_spawnattr_setsigdefault(&_attributes, &all));
        note(::posix_spawnattr_setpgroup(&_attributes, 0));
        note(::posix_spawnattr_setflags(&_attributes,
                                        POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETPGROUP));
        return _failure;
    }
    [[nodiscard]] const posix_spawnattr_t* get() const noexcept { return &_attributes; }

  private:
    void note(int failure) noexcept { _failure = _failure != 0 ? _failure : failure; }

    posix_spawnattr_t _attributes{};
    int _failure;
};

class SpawnActions {
  public:
    SpawnActions() noexcept : _failure(::posix_spawn_file_actions_init(&_actions)) {}
    SpawnActions(const SpawnActions&) = delete;
    SpawnActions& operator=(const SpawnActions&) = delete;
    ~SpawnActions() { ::posix_spawn_file_actions_destroy(&_actions); }

    /// The three standard streams and no other descriptor. input is -1 for /dev/null.
    int set(int input, int output, int error) noexcept {
        note(input < 0 ? ::posix_spawn_file_actions_addopen(&_actions, STDIN_FILENO, "/dev/null", O_RDONLY, 0)
                       : ::posix_spawn_file_actions_adddup2(&_actions, input, STDIN_FILENO));
        note(::posix_spawn_file_actions_adddup2(&_actions, output, STDOUT_FILENO));
        note(::posix_spawn_file_actions_adddup2(&_actions, error, STDERR_FILENO));
        // All of ours are close-on-exec; this is for those that a library opened without it.
        note(::posix_spawn_file_actions_addclosefrom_np(&_actions, STDERR_FILENO + 1));
        return _failure;
    }
    [[nodiscard]] const posix_spawn_file_actions_t* get() const noexcept { return &_actions; }

  private:
    void note(int failure) noexcept { _failure = _failure != 0 ? _failure : failure; }

    posix_spawn_file_actions_t _actions{};
    int _failure;
};

/// A descriptor above the standard streams: a process that was started with one of them closed would otherwise get
/// pipe ends in their places, and setting up the child's streams would overwrite one end with another.
bool liftAboveStandardStreams(FileDescriptor& descriptor) noexcept {
    if (descriptor.get() > STDERR_FILENO) {
        return true;
    }
    descriptor = FileDescriptor(::fcntl(descriptor.get(), F_DUPFD_CLOEXEC, STDERR_FILENO + 1));
    return descriptor.isOpen();
}

/// A close-on-exec pipe of which our end does not block; the other end does, as tools expect.
int makePipe(FileDescriptor& readEnd, FileDescriptor& writeEnd, bool oursIsRead) noexcept {
    int ends[2];
    if (::pipe2(ends, O_CLOEXEC) != 0) {
        return errno;
    }
    readEnd = FileDescriptor(ends[0]);
    writeEnd = FileDescriptor(ends[1]);
    const bool done = liftAboveStandardStreams(readEnd) && liftAboveStandardStreams(writeEnd) &&
                      ::fcntl((oursIsRead ? readEnd : writeEnd).get(), F_SETFL, O_NONBLOCK) == 0;
    return done ? 0 : errno;
}

/// The null-terminated vector of the exec family. It points into the texts and does not change them.
std::vector<char*> pointersTo(const std::string* first, const std::vector<std::string>& texts) {
    std::vector<char*> pointers;
    pointers.reserve(texts.size() + 2);
    if (first != nullptr) {
        pointers.push_back(const_cast<char*>(first->c_str()));
    }
    for (const std::string& text : texts) {
        pointers.push_back(const_cast<char*>(text.c_str()));
    }
    pointers.push_back(nullptr);
    return pointers;
}

bool holdsNul(const std::vector<std::string>& texts) noexcept {
    for (const std::string& text : texts) {
        if (text.find('\0') != std::string::npos) {
            return true;
        }
    }
    return false;
}

}  // namespace

Child::~Child() {
    kill();
    (void)wait();
}

int Child::start(const std::string& tool, const std::vector<std::string>& arguments,
                 const std::vector<std::string>& environment, bool withInput) {
    if (!tool.starts_with('/') || tool.find('\0') != std::string::npos || holdsNul(arguments) ||
        holdsNul(environment)) {
        return EINVAL;
    }
    FileDescriptor childInput;
    FileDescriptor childOutput;
    FileDescriptor childError;
    if (const int failure = withInput ? makePipe(childInput, input, false) : 0; failure != 0) {
        return failure;
    }
    if (const int failure = makePipe(output, childOutput, true); failure != 0) {
        return failure;
    }
    if (const int failure = makePipe(error, childError, true); failure != 0) {
        return failure;
    }
    SpawnAttributes attributes;
    if (const int failure = attributes.set(); failure != 0) {
        return failure;
    }
    SpawnActions actions;
    if (const int failure = actions.set(childInput.get(), childOutput.get(), childError.get()); failure != 0) {
        return failure;
    }
    const std::vector<char*> argumentPointers = pointersTo(&tool, arguments);
    const std::vector<char*> environmentPointers = pointersTo(nullptr, environment);
    pid_t pid = 0;
    if (const int failure = ::posix_spawn(&pid, tool.c_str(), actions.get(), attributes.get(), argumentPointers.data(),
                                          environmentPointers.data());
        failure != 0) {
        return failure;
    }
    _pid = pid;
    // The C library declares its wrapper without C linkage.
    exit = FileDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
    return exit.isOpen() ? 0 : errno;
}

void Child::kill() noexcept {
    if (_pid > 0) {
        ::kill(-_pid, SIGKILL);
    }
}

std::int32_t Child::wait() noexcept {
    if (_pid <= 0) {
        return -1;
    }
    int status = 0;
    pid_t waited = 0;
    do {
        waited = ::waitpid(_pid, &status, 0);
    } while (waited < 0 && errno == EINTR);
    _pid = 0;
    if (waited < 0) {
        return -1;
    }
    return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

}  // namespace adminhost
