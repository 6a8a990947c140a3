#pragma once

// Runs a program below strace to find the system calls of one piece of work. A test can then make each of them fail, or
// be the process's last one.
//
// The program itself calls markBegin() before the work and markEnd() after it.

#include <cstdint>
#include <string>
#include <vector>

namespace adminhost::test {

void markBegin();
void markEnd();

/// The Nth call of a name in the process's life, as strace counts them for "inject=NAME:...:when=N".
struct TracedCall {
    std::string name;
    int number;
    std::string line;  ///< of strace's log
};

/// Runs a command (its program with its whole path) below strace, with these options of strace and its log in a file.
/// Returns the program's exit status, or 128 + the signal's number, and its output on standard error.
std::int32_t runTraced(const std::vector<std::string>& options, const std::string& log,
                       const std::vector<std::string>& command, std::string& errors);

/// The calls in such a log between the two marks. Throws std::runtime_error if a mark is missing.
[[nodiscard]] std::vector<TracedCall> callsBetweenMarks(const std::string& log);

}  // namespace adminhost::test
