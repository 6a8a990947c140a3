#pragma once

// Values from files, standard input and people.

#include <string>

namespace adminhost::ctl {

/// Whether standard input is a terminal.
[[nodiscard]] bool inputIsTerminal() noexcept;

/// The bytes of a file, or of standard input for "-"; at most 64 MiB. Throws Failure(usage) when it cannot be read, and
/// when standard input is asked for twice.
[[nodiscard]] std::string readSource(const std::string& path);

/// Asks for a secret on the terminal, and once more, without showing what is typed. A signal that would end or stop the
/// program restores the terminal first. Throws Failure(usage) when the input ends without a line, and when the two
/// lines differ.
[[nodiscard]] std::string askSecret(const std::string& key);

}  // namespace adminhost::ctl
