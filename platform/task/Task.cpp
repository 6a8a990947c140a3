#include "platform/task/Task.h"

#include "platform/files/FileDescriptor.h"
#include "platform/task/Child.h"
#include "platform/task/StartChild.h"
#include "platform/task/TaskBounds.h"
#include "platform/value/Text.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <ctime>
#include <system_error>
#include <utility>

#include <fmt/format.h>
#include <poll.h>
#include <pthread.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

using Clock = std::chrono::steady_clock;
using Environment = std::map<std::string, std::string>;

constexpr auto waitForDaemonsOutput = std::chrono::milliseconds(200);

std::atomic<Clock::time_point> taskDeadline = Clock::time_point::max();
std::atomic<std::size_t> outputBound = taskDefaultOutputBound;
Environment taskEnvironment;

/// Keeps SIGPIPE from this thread while a tool that may not read its input is written to.
class WithoutSigpipe {
  public:
    WithoutSigpipe() noexcept {
        sigset_t pending{};
        ::sigpending(&pending);
        _wasPending = ::sigismember(&pending, SIGPIPE) == 1;
        ::sigemptyset(&_sigpipe);
        ::sigaddset(&_sigpipe, SIGPIPE);
        ::pthread_sigmask(SIG_BLOCK, &_sigpipe, &_before);
    }
    WithoutSigpipe(const WithoutSigpipe&) = delete;
    WithoutSigpipe& operator=(const WithoutSigpipe&) = delete;
    ~WithoutSigpipe() {
        if (!_wasPending) {  // one that a broken pipe raised meanwhile is ours to take
            const timespec now{};
            while (::sigtimedwait(&_sigpipe, nullptr, &now) < 0 && errno == EINTR) {
            }
        }
        ::pthread_sigmask(SIG_SETMASK, &_before, nullptr);
    }

  private:
    sigset_t _sigpipe{};
    sigset_t _before{};
    bool _wasPending = false;
};

/// What arrives on one of the tool's streams.
class Capture {
  public:
    Capture(FileDescriptor& stream, std::size_t bound, bool kept) noexcept
        : _stream(stream), _bound(bound), _kept(kept) {}

    [[nodiscard]] bool isOpen() const noexcept { return _stream.isOpen(); }
    [[nodiscard]] int descriptor() const noexcept { return _stream.get(); }  ///< -1, which poll skips, after the end
    [[nodiscard]] bool isOverBound() const noexcept { return _count > _bound; }

    /// Reads once; closes the stream at its end.
    void readSome() {
        std::array<char, 65536> buffer;  // not initialised: read() fills what is used
        const ssize_t count = ::read(_stream.get(), buffer.data(), buffer.size());
        if (count > 0) {
            _count += static_cast<std::size_t>(count);
            if (_kept && !isOverBound()) {
                _bytes.append(buffer.data(), static_cast<std::size_t>(count));
            }
        } else if (count == 0 || (errno != EAGAIN && errno != EINTR)) {
            _stream.close();
        }
    }

    /// Reads what is in the pipe at this moment, however long that takes, and no more than that.
    void readWhatIsThere() {
        int waiting = 0;
        if (!isOpen() || ::ioctl(_stream.get(), FIONREAD, &waiting) != 0) {
            return;
        }
        const std::size_t until = _count + static_cast<std::size_t>(waiting);
        while (isOpen() && _count < until && !isOverBound()) {
            readSome();
        }
    }

    /// The text, with what is not UTF-8 replaced.
    [[nodiscard]] std::string takeText() { return isUtf8(_bytes) ? std::move(_bytes) : utf8Of(_bytes); }

  private:
    FileDescriptor& _stream;
    std::size_t _bound;
    bool _kept;
    std::string _bytes;
    std::size_t _count = 0;
};

/// Milliseconds for poll until the moment, rounded up so that the moment has passed afterwards; -1 for never.
int pollTimeout(Clock::time_point moment) noexcept {
    if (moment == Clock::time_point::max()) {
        return -1;
    }
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(moment - Clock::now()).count();
    return static_cast<int>(std::clamp<std::int64_t>(left, 0, 3'600'000));
}

/// Writes as much as the pipe takes; closes it when all is written or nobody reads it any more.
void writeSome(FileDescriptor& pipe, std::string_view& rest) noexcept {
    const ssize_t count = ::write(pipe.get(), rest.data(), rest.size());
    if (count > 0) {
        rest.remove_prefix(static_cast<std::size_t>(count));
    }
    if (rest.empty() || (count < 0 && errno != EAGAIN && errno != EINTR)) {
        pipe.close();
    }
}

/// Moves bytes both ways until the child has exited and its streams are read. False when a stream is over the bound.
bool converse(Child& child, std::string_view input, Capture& output, Capture& error, Clock::time_point deadline) {
    if (input.empty()) {
        child.input.close();
    }
    bool exited = false;
    Clock::time_point until = deadline;
    while (!exited || output.isOpen() || error.isOpen()) {
        std::array<pollfd, 4> watched{{{output.descriptor(), POLLIN, 0},
                                       {error.descriptor(), POLLIN, 0},
                                       {exited ? -1 : child.exit.get(), POLLIN, 0},
                                       {child.input.get(), POLLOUT, 0}}};
        // A failed or timed-out call leaves every revents 0.
        (void)::poll(watched.data(), watched.size(), pollTimeout(until));
        if (watched[0].revents != 0) {
            output.readSome();
        }
        if (watched[1].revents != 0) {
            error.readSome();
        }
        if (watched[3].revents != 0) {
            writeSome(child.input, input);
        }
        if (watched[2].revents != 0) {
            exited = true;
            child.input.close();
            output.readWhatIsThere();
            error.readWhatIsThere();
            until = Clock::now() + waitForDaemonsOutput;
        }
        if (output.isOverBound() || error.isOverBound()) {
            if (!exited) {
                child.kill();
            }
            return false;
        }
        if (Clock::now() >= until) {  // looked at after reading too: a stream that never falls silent must not last
            if (exited) {
                break;
            }
            child.kill();
            until = Clock::time_point::max();  // its exit comes now
        }
    }
    return true;
}

/// This process's environment with the variables of the two maps in place of its own, the second before the first.
std::vector<std::string> environmentWith(const Environment& first, const Environment& second) {
    Environment added = second;
    added.insert(first.begin(), first.end());
    std::vector<std::string> all = processEnvironment();
    std::erase_if(all, [&](const std::string& entry) { return added.contains(entry.substr(0, entry.find('='))); });
    for (const auto& [name, value] : added) {
        all.emplace_back(name).append(1, '=').append(value);
    }
    return all;
}

}  // namespace

std::int32_t launch_task(const DiskPath& tool, const std::vector<std::string>& arguments, std::string* output,
                         std::string* error) {
    return launch_task_with_input_and_environment(tool, arguments, std::nullopt, output, error, {});
}

std::int32_t launch_task_with_input(const DiskPath& tool, const std::vector<std::string>& arguments,
                                    const std::optional<std::string>& input, std::string* output, std::string* error) {
    return launch_task_with_input_and_environment(tool, arguments, input, output, error, {});
}

std::int32_t launch_task_with_input_and_environment(const DiskPath& tool, const std::vector<std::string>& arguments,
                                                    const std::optional<std::string>& input, std::string* output,
                                                    std::string* error,
                                                    const std::map<std::string, std::string>& environment) {
    const auto fail = [&](std::string_view text) {
        if (output != nullptr) {
            output->clear();
        }
        if (error != nullptr) {
            *error = utf8Of(fmt::format("{}: {}", hostPath(tool).text(), text));
        }
        return -1;
    };
    const Clock::time_point deadline = taskDeadline.load();
    if (Clock::now() >= deadline) {
        return fail("not started: the time allowed for the request is over");
    }
    const auto nameless = [](const auto& variable) {
        return variable.first.empty() || variable.first.find('=') != std::string::npos;
    };
    if (std::any_of(environment.begin(), environment.end(), nameless)) {
        return fail(std::generic_category().message(EINVAL));
    }
    Child child;
    if (const int number =
            child.start(tool.text(), arguments, environmentWith(taskEnvironment, environment), input.has_value());
        number != 0) {
        return fail(std::generic_category().message(number));
    }
    const std::size_t bound = outputBound.load();
    Capture capturedOutput(child.output, bound, output != nullptr);
    Capture capturedError(child.error, bound, error != nullptr);
    bool withinBound = false;
    if (input) {
        const WithoutSigpipe guard;
        withinBound = converse(child, *input, capturedOutput, capturedError, deadline);
    } else {
        withinBound = converse(child, {}, capturedOutput, capturedError, deadline);
    }
    const std::int32_t status = child.wait();
    if (!withinBound) {
        return fail(fmt::format("stopped: it wrote more than {} bytes", bound));
    }
    if (output != nullptr) {
        *output = capturedOutput.takeText();
    }
    if (error != nullptr) {
        *error = capturedError.takeText();
    }
    return status;
}

void prepareForTasks() noexcept {
    ::umask(022);
    [[maybe_unused]] const int moved = ::chdir("/");  // should even that fail, tools run where the daemon was started
    struct sigaction standard {};
    standard.sa_handler = SIG_DFL;
    ::sigaction(SIGCHLD, &standard, nullptr);
}

void setTaskDeadline(std::optional<std::chrono::steady_clock::time_point> deadline) noexcept {
    taskDeadline = deadline.value_or(Clock::time_point::max());
}

void setTaskEnvironment(std::map<std::string, std::string> environment) {
    taskEnvironment = std::move(environment);
}

void setTaskOutputBound(std::size_t bytes) noexcept {
    outputBound = bytes;
}

}  // namespace adminhost
