#include "adminhostd/PluginTrial.h"

#include "adminhostd/PluginFile.h"
#include "platform/files/FileDescriptor.h"
#include "platform/task/StartChild.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <system_error>

#include <fcntl.h>
#include <fmt/format.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

using Clock = std::chrono::steady_clock;

constexpr int resultDescriptor = 3;
constexpr std::size_t reasonMaximum = 4096;  ///< fits into a pipe that nobody reads yet
constexpr unsigned lonelySeconds = 60;       ///< after which a trial that nobody waits for ends
constexpr char usable = '+';
constexpr char unusable = '-';

/// One child process. The destructor ends and reaps it.
class Trial {
  public:
    explicit Trial(const DiskPath& file) : _file(file) {
        int ends[2];
        if (::pipe2(ends, O_CLOEXEC | O_NONBLOCK) != 0) {
            throw std::system_error(errno, std::generic_category(), "cannot try a plug-in");
        }
        _result = FileDescriptor(ends[0]);
        const FileDescriptor other(ends[1]);
        ChildPlan plan;
        plan.program = "/proc/self/exe";
        plan.arguments = {"adminhostd-worker", trialArgument, file.text()};
        plan.environment = processEnvironment();
        plan.descriptors = {-1, STDERR_FILENO, STDERR_FILENO, other.get()};
        auto child = startChild(plan);
        if (!child) {
            throw std::system_error(static_cast<int>(child.error().code), std::generic_category(),
                                    "cannot try a plug-in");
        }
        _child = *std::move(child);
    }
    Trial(Trial&& other) noexcept
        : _file(std::move(other._file)), _result(std::move(other._result)), _child(std::move(other._child)) {
        other._child.pid = 0;
    }
    Trial(const Trial&) = delete;
    Trial& operator=(const Trial&) = delete;
    Trial& operator=(Trial&&) = delete;
    ~Trial() { static_cast<void>(end()); }

    /// Why the file cannot be used.
    std::optional<std::string> finish(Clock::time_point until);

  private:
    /// Kills the process group, or what is left of it, and reaps the child. The group's number cannot be another's
    /// before the child is reaped; if that has happened elsewhere, no signal is sent.
    int end() {
        int status = 0;
        if (_child.pid > 0) {
            siginfo_t ignored{};
            if (::waitid(P_PIDFD, static_cast<id_t>(_child.exit.get()), &ignored, WEXITED | WNOHANG | WNOWAIT) == 0) {
                ::kill(-_child.pid, SIGKILL);
            }
            while (::waitpid(_child.pid, &status, 0) < 0 && errno == EINTR) {
            }
            _child.pid = 0;
        }
        return status;
    }

    DiskPath _file;
    FileDescriptor _result;
    StartedChild _child;
};

std::optional<std::string> Trial::finish(Clock::time_point until) {
    pollfd entry{_child.exit.get(), POLLIN, 0};
    int ready = 0;
    do {
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(until - Clock::now()).count();
        ready = ::poll(&entry, 1, static_cast<int>(std::max<std::int64_t>(left, 0)));
    } while (ready < 0 && errno == EINTR);
    const int status = end();
    if (ready == 0) {
        return fmt::format("{} did not finish loading in time and was ended; install another release of it",
                           _file.text());
    }
    char text[reasonMaximum];
    const ssize_t size = ::read(_result.get(), text, sizeof text);
    if (size > 0 && text[0] == usable) {
        return std::nullopt;
    }
    if (size > 0 && text[0] == unusable) {
        return std::string(text + 1, static_cast<std::size_t>(size) - 1);
    }
    return WIFSIGNALED(status)
               ? fmt::format("{} crashed while it was loaded, by signal {} ({}); install it again", _file.text(),
                             WTERMSIG(status), ::strsignal(WTERMSIG(status)))
               : fmt::format("{} ended its process with status {} while it was loaded; install another release of it",
                             _file.text(), WEXITSTATUS(status));
}

}  // namespace

std::vector<std::optional<std::string>> tryPlugins(const std::vector<DiskPath>& files,
                                                   std::chrono::milliseconds bound) {
    std::vector<Trial> trials;
    trials.reserve(files.size());
    for (const DiskPath& file : files) {
        trials.emplace_back(file);
    }
    const auto until = Clock::now() + bound;
    std::vector<std::optional<std::string>> reasons;
    reasons.reserve(trials.size());
    for (Trial& trial : trials) {
        reasons.push_back(trial.finish(until));
    }
    return reasons;
}

int serveTrial(const char* file) {
    // A worker that is killed in the meantime cannot end this process.
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    ::alarm(lonelySeconds);
    const rlimit none{0, 0};
    ::setrlimit(RLIMIT_CORE, &none);
    ::fcntl(resultDescriptor, F_SETFD, FD_CLOEXEC);
    for (const int signal : {SIGSEGV, SIGBUS, SIGFPE, SIGILL, SIGABRT}) {
        static_cast<void>(std::signal(signal, SIG_DFL));  // a checking build has handlers, which hide the signal
    }
    const auto loaded = loadPlugin(DiskPath(file));
    const std::string text = loaded ? std::string(1, usable) : unusable + textOf(loaded.error().description);
    const std::size_t size = std::min(text.size(), reasonMaximum);
    const bool sent = ::write(resultDescriptor, text.data(), size) == static_cast<ssize_t>(size);
    // Skips the destructors of the plug-in.
    ::_exit(sent ? 0 : 1);
}

}  // namespace adminhost
