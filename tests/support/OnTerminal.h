#pragma once

// Runs something on a terminal of its own, as a person would.

#include "tests/support/Eventually.h"

#include <chrono>
#include <csignal>
#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <poll.h>
#include <pty.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

namespace adminhost::test {

/// A child process on a terminal of its own.
class OnTerminal {
  public:
    explicit OnTerminal(const std::function<int()>& program) {
        _pid = ::forkpty(&_terminal, nullptr, nullptr, nullptr);
        if (_pid == 0) {
            ::_exit(program());
        }
    }
    /// Runs a program.
    explicit OnTerminal(const std::vector<std::string>& command)
        : OnTerminal([&] {
              std::vector<char*> arguments;
              for (const std::string& word : command) {
                  arguments.push_back(const_cast<char*>(word.c_str()));
              }
              arguments.push_back(nullptr);
              ::execv(arguments[0], arguments.data());
              return 127;
          }) {}
    ~OnTerminal() {
        ::close(_terminal);
        if (!_waited) {
            ::kill(_pid, SIGKILL);
            ::waitpid(_pid, nullptr, 0);
        }
    }
    OnTerminal(const OnTerminal&) = delete;
    OnTerminal& operator=(const OnTerminal&) = delete;

    void type(const std::string& text) const {
        ASSERT_EQ(::write(_terminal, text.data(), text.size()), static_cast<ssize_t>(text.size()));
    }
    /// Reads what the terminal shows until the text has come, or the child has ended. Fails after 30 seconds.
    const std::string& showsUntil(const std::string& text) {
        const auto end = std::chrono::steady_clock::now() + patience;
        while (_shown.find(text) == std::string::npos) {
            const auto left = std::chrono::ceil<std::chrono::milliseconds>(end - std::chrono::steady_clock::now());
            pollfd waited{_terminal, POLLIN, 0};
            if (left.count() <= 0 || ::poll(&waited, 1, static_cast<int>(left.count())) == 0) {
                ADD_FAILURE() << "the terminal does not show \"" << text << "\": " << _shown;
                break;
            }
            char bytes[256];
            const ssize_t count = ::read(_terminal, bytes, sizeof bytes);
            if (count <= 0) {
                break;
            }
            _shown.append(bytes, static_cast<std::size_t>(count));
        }
        return _shown;
    }
    [[nodiscard]] bool echoes() const {
        termios now{};
        return ::tcgetattr(_terminal, &now) == 0 && (now.c_lflag & ECHO) != 0;
    }
    /// The child's status. It is killed if it does not end.
    [[nodiscard]] int wait() {
        int status = 0;
        if (!eventually([&] { return ::waitpid(_pid, &status, WNOHANG) == _pid; }, patience)) {
            ADD_FAILURE() << "it has not ended: " << _shown;
            ::kill(_pid, SIGKILL);
            ::waitpid(_pid, &status, 0);
        }
        _waited = true;
        return status;
    }

  private:
    static constexpr auto patience = std::chrono::seconds(30);

    int _terminal = -1;
    pid_t _pid = -1;
    bool _waited = false;
    std::string _shown;
};

}  // namespace adminhost::test
