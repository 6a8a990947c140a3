#pragma once

// Standard input, as it is asked for values.

#include <string>

namespace adminhost::ctl {

/// Whether standard input is a terminal.
[[nodiscard]] bool inputIsTerminal() noexcept;

/// The bytes of a file, or of standard input for "-"; at most 64 MiB. Throws Failure(usage) when it cannot be read, and
/// when standard input is asked for twice.
[[nodiscard]] std::string readSource(const std::string& path);

/// Asks for a secret on the terminal without showing what is typed. A signal that would end or stop the program puts
/// the terminal back first. Throws Failure(usage) when the input ends without a line.
[[nodiscard]] std::string askSecret(const std::string& key);

}  // namespace adminhost::ctl
