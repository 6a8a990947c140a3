#pragma once

#include "tests/support/Program.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <csignal>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {

/// A program that is running in the background; output and messages together. A wait that takes a minute fails.
class RunningProgram {
  public:
    explicit RunningProgram(const std::vector<std::string>& command) {
        std::array<int, 2> ends{};
        EXPECT_EQ(::pipe(ends.data()), 0);
        _pid = ::fork();
        if (_pid == 0) {
            ::dup2(ends[1], STDOUT_FILENO);
            ::dup2(ends[1], STDERR_FILENO);
            ::close(ends[0]);
            ::close(ends[1]);
            std::vector<const char*> arguments;
            for (const std::string& word : command) {
                arguments.push_back(word.c_str());
            }
            arguments.push_back(nullptr);
            ::execvp(arguments[0], const_cast<char**>(arguments.data()));
            ::_exit(127);
        }
        ::close(ends[1]);
        _output = ends[0];
    }
    ~RunningProgram() {
        if (_pid > 0) {
            ::kill(_pid, SIGKILL);
            ::waitpid(_pid, nullptr, 0);
        }
        ::close(_output);
    }
    RunningProgram(const RunningProgram&) = delete;
    RunningProgram& operator=(const RunningProgram&) = delete;

    void signal(int number) const { ::kill(_pid, number); }
    /// Reads its output until the text has come.
    void waitFor(const std::string& text) {
        const auto end = std::chrono::steady_clock::now() + patience;
        while (_text.find(text) == std::string::npos) {
            ASSERT_EQ(readSome(end), Read::some)
                << "without \"" << text << "\" it has ended, or printed only: " << _text;
        }
    }
    /// Its whole output and its status; 128 + number if a signal ended it. It is killed if it does not end.
    ProgramResult wait() {
        const auto end = std::chrono::steady_clock::now() + patience;
        Read read = Read::some;
        while (read == Read::some) {
            read = readSome(end);
        }
        if (read == Read::late) {
            ADD_FAILURE() << "it has not ended: " << _text;
            ::kill(_pid, SIGKILL);
        }
        ProgramResult result;
        result.output = _text;
        int status = 0;
        EXPECT_EQ(::waitpid(_pid, &status, 0), _pid);
        _pid = -1;
        result.status = WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
        return result;
    }

  private:
    enum class Read { some, ended, late };
    static constexpr auto patience = std::chrono::seconds(60);

    Read readSome(std::chrono::steady_clock::time_point end) {
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(end - std::chrono::steady_clock::now()).count();
        pollfd waited{_output, POLLIN, 0};
        if (left <= 0 || ::poll(&waited, 1, static_cast<int>(left)) <= 0) {
            return Read::late;
        }
        std::array<char, 4096> bytes{};
        const ssize_t count = ::read(_output, bytes.data(), bytes.size());
        _text.append(bytes.data(), static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
        return count > 0 ? Read::some : Read::ended;
    }

    pid_t _pid = -1;
    int _output = -1;
    std::string _text;
};

}  // namespace adminhost::test
