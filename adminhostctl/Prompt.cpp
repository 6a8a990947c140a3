#include "adminhostctl/Prompt.h"

#include "adminhostctl/Failure.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <memory>

#include <poll.h>
#include <termios.h>
#include <unistd.h>

namespace adminhost::ctl {
namespace {

constexpr std::size_t maximumSize = std::size_t{64} << 20U;

struct CloseSource {
    void operator()(std::FILE* file) const noexcept { static_cast<void>(std::fclose(file)); }
};

// A signal handler can only reach static storage.
volatile std::sig_atomic_t caughtSignal = 0;
void remember(int number) noexcept {
    caughtSignal = number;
}

/// While it exists, signals that would end or stop the program are blocked, and waitForInput() remembers them instead.
/// They are blocked outside of that function too, because a signal just before a blocking read would not interrupt the
/// read.
class SignalGuard {
  public:
    SignalGuard() noexcept {
        caughtSignal = 0;
        struct sigaction action {};
        action.sa_handler = &remember;
        sigemptyset(&action.sa_mask);
        sigset_t held;
        sigemptyset(&held);
        for (const int number : signals) {
            sigaddset(&held, number);
        }
        sigprocmask(SIG_BLOCK, &held, &_maskBefore);
        for (std::size_t i = 0; i < signals.size(); ++i) {
            sigaction(signals.at(i), &action, &_before.at(i));
        }
    }
    ~SignalGuard() {
        for (std::size_t i = 0; i < signals.size(); ++i) {
            sigaction(signals.at(i), &_before.at(i), nullptr);
        }
        sigprocmask(SIG_SETMASK, &_maskBefore, nullptr);
    }
    SignalGuard(const SignalGuard&) = delete;
    SignalGuard& operator=(const SignalGuard&) = delete;

    /// Waits until standard input can be read; false when a signal came instead.
    [[nodiscard]] bool waitForInput() const noexcept {
        pollfd input{STDIN_FILENO, POLLIN, 0};
        return ::ppoll(&input, 1, nullptr, &_maskBefore) > 0 && caughtSignal == 0;
    }

  private:
    static constexpr std::array<int, 5> signals = {SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGTSTP};
    std::array<struct sigaction, 5> _before{};
    sigset_t _maskBefore{};
};

/// While it exists, the terminal does not show what is typed.
class EchoGuard {
  public:
    EchoGuard() noexcept : _changed(tcgetattr(STDIN_FILENO, &_before) == 0) {
        termios silent = _before;
        silent.c_lflag &= ~static_cast<tcflag_t>(ECHO);
        silent.c_lflag |= ECHONL;
        _changed = _changed && tcsetattr(STDIN_FILENO, TCSAFLUSH, &silent) == 0;
    }
    ~EchoGuard() {
        if (_changed) {
            tcsetattr(STDIN_FILENO, TCSAFLUSH, &_before);
        }
    }
    EchoGuard(const EchoGuard&) = delete;
    EchoGuard& operator=(const EchoGuard&) = delete;

    [[nodiscard]] bool changed() const noexcept { return _changed; }

  private:
    termios _before{};
    bool _changed;
};

}  // namespace

bool inputIsTerminal() noexcept {
    return ::isatty(STDIN_FILENO) == 1;
}

std::string readSource(const std::string& path) {
    const bool isInput = path == "-";
    static bool inputWasRead = false;
    if (isInput && inputWasRead) {
        throw usageError("standard input can be read only once; use a file for the other value");
    }
    inputWasRead = inputWasRead || isInput;
    const std::unique_ptr<std::FILE, CloseSource> opened(isInput ? nullptr : std::fopen(path.c_str(), "rbe"));
    std::FILE* const file = isInput ? stdin : opened.get();
    if (file == nullptr) {
        throw usageError(path + ": " + std::strerror(errno));
    }
    std::string bytes;
    std::array<char, 65536> buffer{};
    while (const std::size_t count = std::fread(buffer.data(), 1, buffer.size(), file)) {
        bytes.append(buffer.data(), count);
        if (bytes.size() > maximumSize) {
            throw usageError((isInput ? "standard input" : path) + " is larger than 64 MiB");
        }
    }
    if (std::ferror(file) != 0) {
        throw usageError((isInput ? "standard input" : path) + ": " + std::strerror(errno));
    }
    return bytes;
}

namespace {

std::string askOnce(const std::string& key, const std::string& question) {
    std::string line;
    bool ended = false;
    {
        const SignalGuard signals;
        const EchoGuard echo;
        if (!echo.changed()) {
            throw usageError(key + ": the terminal cannot hide what is typed; use @FILE");
        }
        static_cast<void>(!::write(STDERR_FILENO, question.data(), question.size()));
        char c = 0;
        while (!ended && c != '\n') {
            ended = !signals.waitForInput() || ::read(STDIN_FILENO, &c, 1) != 1;
            if (!ended && c != '\n') {
                line.push_back(c);
            }
        }
    }
    if (const int number = caughtSignal; number != 0) {
        // The terminal is restored; now the signal can have its effect.
        static_cast<void>(std::raise(number));
        throw usageError("interrupted");
    }
    if (ended && line.empty()) {
        throw usageError(key + ": no value was typed");
    }
    return line;
}

}  // namespace

std::string askSecret(const std::string& key) {
    const std::string first = askOnce(key, key + ": ");
    if (askOnce(key, key + " again: ") != first) {
        throw usageError(key + ": the two values differ; nothing was sent");
    }
    return first;
}

std::string askKnownSecret(const std::string& key) {
    return askOnce(key, key + ": ");
}

bool confirm(const std::string& question) {
    const std::string text = question + " [y/N] ";
    static_cast<void>(!::write(STDERR_FILENO, text.data(), text.size()));
    std::string reply;
    char c = 0;
    while (::read(STDIN_FILENO, &c, 1) == 1 && c != '\n') {
        reply.push_back(c);
    }
    return reply == "y" || reply == "Y" || reply == "yes";
}

}  // namespace adminhost::ctl
