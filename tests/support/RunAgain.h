#pragma once

namespace adminhost::test {

/// Executes this program again with the same arguments below a script of tests/support, which prepares what the tests
/// need. Aborts if that fails.
[[noreturn]] void runAgainBelow(const char* script, int argc, char** argv);

}  // namespace adminhost::test
