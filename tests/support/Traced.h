#pragma once

// A program run below strace: which system calls it makes on the way that is looked at, so that each of them can be
// made to fail, or to be the process's last.
//
// The program itself marks the way with markBegin() and markEnd(); in between it does only what is looked at.

#include <cstdint>
#include <string>
#include <vector>

namespace adminhost::test {

void markBegin();
void markEnd();

/// The Nth call of a name in the process's life, as strace counts them: what "inject=NAME:...:when=N" means.
struct TracedCall {
    std::string name;
    int number;
    std::string line;  ///< of strace's log
};

/// Runs a command (its program with its whole path) below strace, with strace's options, its log going to a file. The
/// program's exit status, or 128 + the signal's number; what it wrote to standard error.
std::int32_t runTraced(const std::vector<std::string>& options, const std::string& log,
                       const std::vector<std::string>& command, std::string& errors);

/// The calls of such a log between the two marks. Throws std::runtime_error when a mark is missing.
[[nodiscard]] std::vector<TracedCall> callsBetweenMarks(const std::string& log);

}  // namespace adminhost::test
