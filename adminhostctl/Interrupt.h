#pragma once

// Signals that would end the program while a write is under way.

#include <array>
#include <csignal>

namespace adminhost::ctl {

/// While it exists, the first SIGINT, SIGTERM or SIGHUP is only remembered, so that the program can still report what
/// was written. A second one of the same kind ends the program.
class InterruptGuard {
  public:
    InterruptGuard() noexcept;
    ~InterruptGuard();
    InterruptGuard(const InterruptGuard&) = delete;
    InterruptGuard& operator=(const InterruptGuard&) = delete;

  private:
    static constexpr std::array<int, 3> signals = {SIGINT, SIGTERM, SIGHUP};
    std::array<struct sigaction, 3> _before{};
};

/// Returns true if a signal has arrived since the current guard was created.
[[nodiscard]] bool isInterrupted() noexcept;

/// Ends the program by the remembered signal, so that its caller sees that signal. Returns if there was none.
void endIfInterrupted() noexcept;

}  // namespace adminhost::ctl
