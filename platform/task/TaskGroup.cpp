#include "platform/task/TaskGroup.h"

#include "platform/task/Child.h"
#include "platform/task/StartChild.h"
#include "platform/task/TaskBounds.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <ctime>
#include <map>
#include <string_view>
#include <system_error>
#include <utility>

#include <fmt/format.h>
#include <pthread.h>
#include <sys/ioctl.h>
#include <unistd.h>

namespace adminhost {
namespace {

using namespace std::chrono_literals;

std::atomic<std::uint64_t> started = 0;

using Clock = TaskGroup::Clock;

constexpr auto waitForDaemonsOutput = 200ms;

/// A tool writes to a pipe in pieces of 4 kB. If each woke us, both sides would spend more time on that than on the
/// bytes. So after a piece of the output has been read, the next ones collect in the pipe for this long, unless they
/// fill it. The end of the tool is noticed at once.
constexpr auto collectingTime = 150us;
/// A reading of as many bytes shows that the tool writes faster than that.
constexpr std::size_t nearlyFull = std::size_t{32} << 10U;

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
        if (!_wasPending) {  // consume the one that a broken pipe raised meanwhile
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

/// The captured bytes of one of the tool's streams.
class Capture {
  public:
    /// `held` counts the bytes of the whole group. `grows` is called with all bytes so far.
    Capture(FileDescriptor& stream, bool kept, std::size_t& held, std::function<void(std::string_view)> grows = {})
        : _stream(stream), _kept(kept), _held(held), _grows(std::move(grows)) {}

    [[nodiscard]] bool isOpen() const noexcept { return _stream.isOpen(); }
    [[nodiscard]] int descriptor() const noexcept { return _stream.get(); }  ///< -1, which poll skips, after the end
    [[nodiscard]] std::size_t count() const noexcept { return _count; }

    /// Reads once, unless that exceeds the bound; closes the stream at its end. Returns the number of bytes.
    std::size_t readSome(std::size_t bound) {
        std::array<char, 65536> buffer;  // not initialised: read() fills the used part
        const ssize_t count = ::read(_stream.get(), buffer.data(), buffer.size());
        if (count > 0) {
            _count += static_cast<std::size_t>(count);
            _held += static_cast<std::size_t>(count);
            if (_kept && _held <= bound) {
                _bytes.append(buffer.data(), static_cast<std::size_t>(count));
                if (_grows) {
                    _grows(_bytes);
                }
            }
        } else if (count == 0 || (errno != EAGAIN && errno != EINTR)) {
            _stream.close();
        }
        return count > 0 ? static_cast<std::size_t>(count) : 0;
    }

    /// Reads the bytes that are in the pipe at this moment, however long that takes, and not more.
    void readWhatIsThere(std::size_t bound) {
        int waiting = 0;
        if (!isOpen() || ::ioctl(_stream.get(), FIONREAD, &waiting) != 0) {
            return;
        }
        const std::size_t until = _count + static_cast<std::size_t>(waiting);
        while (isOpen() && _count < until && _held <= bound) {
            readSome(bound);
        }
    }

    /// Drops the bytes.
    void release() noexcept {
        _held -= std::exchange(_count, 0);
        std::string().swap(_bytes);
    }

    /// The text, with bytes that are not UTF-8 replaced.
    [[nodiscard]] std::string takeText() { return isUtf8(_bytes) ? std::move(_bytes) : utf8Of(_bytes); }

  private:
    FileDescriptor& _stream;
    bool _kept;
    std::size_t& _held;
    std::function<void(std::string_view)> _grows;
    std::string _bytes;
    std::size_t _count = 0;
};

using TaskEnvironment = std::map<std::string, std::string>;

/// Returns true for variables that lead to the daemon's own credentials, sockets, tickets and directory servers. A
/// service that a tool starts would keep them for life.
bool isOnlyTheDaemons(std::string_view name) {
    return name == "CREDENTIALS_DIRECTORY" || name == "KRB5CCNAME" || name == "KRB5_CLIENT_KTNAME" ||
           name.starts_with("LISTEN_") || name.starts_with("LDAP");
}

/// This process's environment as far as it concerns tools, with the given variables in place of its own.
std::vector<std::string> environmentWith(const TaskEnvironment& added) {
    std::vector<std::string> all = processEnvironment();
    std::erase_if(all, [&](const std::string& entry) {
        const std::string name = entry.substr(0, entry.find('='));
        return isOnlyTheDaemons(name) || added.contains(name);
    });
    for (const auto& [name, value] : added) {
        all.emplace_back(name).append(1, '=').append(value);
    }
    return all;
}

ChildPlan childPlanOf(TaskPlan& plan) {
    ChildPlan child;
    child.program = plan.tool.text();
    child.arguments = std::move(plan.arguments);
    child.arguments.insert(child.arguments.begin(), child.program);
    child.environment = environmentWith(plan.environment);
    child.rights = std::move(plan.rights);
    child.noNewPrivileges = plan.noNewPrivileges;
    child.confinement = plan.confinement ? plan.confinement->descriptor() : -1;
    return child;
}

bool namesVariables(const TaskEnvironment& environment) {
    return std::none_of(environment.begin(), environment.end(), [](const auto& variable) {
        return variable.first.empty() || variable.first.find('=') != std::string::npos;
    });
}

}  // namespace

class TaskGroup::RunningTask {
  public:
    static constexpr std::size_t entryCount = 4;

    RunningTask(TaskPlan plan, std::size_t bound, std::size_t& held)
        : _tool(plan.tool),
          _bound(bound),
          _held(held),
          _output(_child.output, plan.keepsOutput, held, std::move(plan.outputGrows)),
          _error(_child.error, plan.keepsError, held),
          _input(plan.input.value_or("")),
          _rest(_input),
          _until(taskDeadline()) {
        if (Clock::now() >= _until) {
            fail("not started: the time allowed for the request is over");
            return;
        }
        if (!plan.refusal.empty()) {
            fail(plan.refusal);
            return;
        }
        const int number =
            !namesVariables(plan.environment) ? EINVAL : _child.start(childPlanOf(plan), plan.input.has_value());
        if (number != 0) {
            fail(std::generic_category().message(number));
            return;
        }
        ++started;
        if (_rest.empty()) {
            _child.input.close();
        }
    }
    RunningTask(const RunningTask&) = delete;
    RunningTask& operator=(const RunningTask&) = delete;
    ~RunningTask() {
        _output.release();
        _error.release();
    }

    [[nodiscard]] bool ended() const noexcept { return _ended; }
    /// The latest moment of the next call of serve().
    [[nodiscard]] Clock::time_point due() const noexcept {
        return _collectsUntil ? std::min(*_collectsUntil, _until) : _until;
    }

    void addTo(std::vector<pollfd>& entries) const {
        entries.push_back({_collectsUntil ? -1 : _output.descriptor(), POLLIN, 0});
        entries.push_back({_error.descriptor(), POLLIN, 0});
        entries.push_back({_exited ? -1 : _child.exit.get(), POLLIN, 0});
        entries.push_back({_child.input.get(), POLLOUT, 0});
    }

    /// Moves bytes both ways, until the child has exited and its streams are read.
    void serve(const pollfd* ready) {
        if (ready[0].revents != 0 || (_collectsUntil && Clock::now() >= *_collectsUntil)) {
            _collectsUntil.reset();
            const std::size_t count = _output.readSome(_bound);
            if (count > 0 && count < nearlyFull && !_exited) {
                _collectsUntil = Clock::now() + collectingTime;
            }
        }
        if (ready[1].revents != 0 && _held <= _bound) {
            _error.readSome(_bound);
        }
        if (ready[3].revents != 0) {
            writeSome();
        }
        if (ready[2].revents != 0) {
            _exited = true;
            _collectsUntil.reset();
            _child.noteExit();
            _child.input.close();
            _output.readWhatIsThere(_bound);
            _error.readWhatIsThere(_bound);
            _until = Clock::now() + waitForDaemonsOutput;
        }
        if (_held > _bound) {
            stopForItsOutput();
        } else if (_exited && !_output.isOpen() && !_error.isOpen()) {
            finish();
        } else if (Clock::now() >=
                   _until) {  // checked after reading too: a stream that never falls silent must not last
            if (_exited) {
                finish();
            } else {
                _child.kill();
                _until = Clock::time_point::max();  // its exit comes now
            }
        }
    }

    TaskResult result() { return std::move(_result); }

  private:
    /// Writes as much as fits into the pipe; closes it when all is written or nobody reads it any more.
    void writeSome() {
        const WithoutSigpipe guard;
        const ssize_t count = ::write(_child.input.get(), _rest.data(), _rest.size());
        if (count > 0) {
            _rest.remove_prefix(static_cast<std::size_t>(count));
        }
        if (_rest.empty() || (count < 0 && errno != EAGAIN && errno != EINTR)) {
            _child.input.close();
        }
    }

    void stopForItsOutput() {
        const bool alone = _output.count() + _error.count() > _bound;
        if (!_exited) {
            _child.kill();
        }
        (void)_child.wait();
        fail(alone ? fmt::format("stopped: it wrote more than {} bytes", _bound)
                   : fmt::format("stopped: it and the tools beside it wrote more than {} bytes", _bound));
    }

    void finish() {
        _result.status = _child.wait();
        _result.output = _output.takeText();
        _result.error = _error.takeText();
        close();
    }

    void fail(std::string_view text) {
        _output.release();
        _error.release();
        _result = {-1, {}, utf8Of(fmt::format("{}: {}", hostPath(_tool).text(), text))};
        close();
    }

    void close() noexcept {
        _child.input.close();
        _child.output.close();
        _child.error.close();
        _child.exit.close();
        _ended = true;
    }

    DiskPath _tool;
    std::size_t _bound;
    std::size_t& _held;
    Child _child;
    Capture _output;
    Capture _error;
    std::string _input;
    std::string_view _rest;
    Clock::time_point _until;  ///< the deadline; after the exit, the end of the wait for a daemon's output
    std::optional<Clock::time_point> _collectsUntil;  ///< the output is not polled until then
    bool _exited = false;
    bool _ended = false;
    TaskResult _result;
};

std::uint64_t startedTasks() noexcept {
    return started;
}

TaskGroup::TaskGroup() noexcept : _bound(taskOutputBound()) {}

TaskGroup::~TaskGroup() = default;

TaskGroup::Id TaskGroup::start(TaskPlan plan) {
    _tasks.push_back(std::make_unique<RunningTask>(std::move(plan), _bound, _held));
    return _tasks.size() - 1;
}

void TaskGroup::addTo(std::vector<pollfd>& entries) const {
    for (const auto& task : _tasks) {
        if (task && !task->ended()) {
            task->addTo(entries);
        }
    }
}

std::optional<Clock::time_point> TaskGroup::due() const {
    Clock::time_point earliest = Clock::time_point::max();
    for (const auto& task : _tasks) {
        if (task && !task->ended()) {
            earliest = std::min(earliest, task->due());
        }
    }
    return earliest == Clock::time_point::max() ? std::nullopt : std::optional(earliest);
}

void TaskGroup::serve() {
    serveFor(Clock::duration::zero());
}

void TaskGroup::wait() {
    const auto moment = due();
    serveFor(moment ? std::optional(*moment - Clock::now()) : std::nullopt);
}

bool TaskGroup::ended(Id id) const {
    return _tasks.at(id)->ended();
}

TaskResult TaskGroup::collect(Id id) {
    while (!_tasks.at(id)->ended()) {
        wait();
    }
    const std::unique_ptr<RunningTask> task = std::move(_tasks.at(id));
    return task->result();
}

void TaskGroup::serveFor(std::optional<Clock::duration> time) {
    _entries.clear();
    addTo(_entries);
    const auto left = std::clamp<Clock::duration>(time.value_or(0s), 0s, 1h);
    const auto seconds = std::chrono::floor<std::chrono::seconds>(left);
    const timespec bound{seconds.count(), std::chrono::nanoseconds(left - seconds).count()};
    // A failed or timed-out call leaves every revents 0.
    (void)::ppoll(_entries.data(), _entries.size(), time ? &bound : nullptr, nullptr);
    const pollfd* ready = _entries.data();
    for (const auto& task : _tasks) {
        if (task && !task->ended()) {
            task->serve(std::exchange(ready, ready + RunningTask::entryCount));
        }
    }
}

}  // namespace adminhost
