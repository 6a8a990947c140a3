#pragma once

// Reads values from files, standard input and the terminal.

#include <string>

namespace adminhost::ctl {

/// Whether standard input is a terminal.
[[nodiscard]] bool inputIsTerminal() noexcept;

/// Returns the bytes of a file, or of standard input for "-"; at most 64 MiB. Throws Failure(usage) when it cannot be
/// read, and when standard input is read a second time.
[[nodiscard]] std::string readSource(const std::string& path);

/// Asks twice for a secret on the terminal, without showing what is typed. A signal that ends or stops the program
/// restores the terminal first. Throws Failure(usage) when the input ends without a line, and when the two lines
/// differ.
[[nodiscard]] std::string askSecret(const std::string& key);

/// Asks once for a secret that exists already, in the same way.
[[nodiscard]] std::string askKnownSecret(const std::string& key);

/// Asks a question on the terminal, and returns true if the reply is "y" or "yes".
[[nodiscard]] bool confirm(const std::string& question);

}  // namespace adminhost::ctl
