#pragma once

// Runs a program of the test's own environment to its end, without a shell. Independent of the code under test.

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::test {

struct ProgramResult {
    int status = 0;  ///< exit status; 128 + number after a death by signal
    std::string output;
};

enum class Errors { pass, merge };  ///< standard error: to the test's own, or into the output

/// command[0] is looked up in PATH unless it has a slash. Standard input is the input, or the test's own without one.
/// Waits for the end of both the program and its output. Throws std::runtime_error if it cannot be started.
[[nodiscard]] ProgramResult runProgram(const std::vector<std::string>& command, Errors errors = Errors::pass,
                                       std::optional<std::string_view> input = std::nullopt);

/// Why this account cannot create user and mount namespaces, and what to allow; empty if it can. A test that needs them
/// fails with this text.
[[nodiscard]] std::string namespaceProblem();

}  // namespace adminhost::test
