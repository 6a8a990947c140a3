#include "adminhostd/ProcessStart.h"

#include "platform/files/StandardDescriptors.h"

#include <csignal>
#include <cstdlib>

#include <sys/prctl.h>
#include <unistd.h>

namespace adminhost {
namespace {

/// Changes ignored signals only, because only that can be inherited. A handler is the sanitizer's own.
void resetSignals() noexcept {
    struct sigaction standard {};
    standard.sa_handler = SIG_DFL;
    for (int number = 1; number < NSIG; ++number) {
        struct sigaction inherited {};
        if (::sigaction(number, nullptr, &inherited) == 0 && inherited.sa_handler == SIG_IGN) {
            ::sigaction(number, &standard, nullptr);
        }
    }
    sigset_t none{};
    ::sigemptyset(&none);
    ::sigprocmask(SIG_SETMASK, &none, nullptr);
}

void tidyDescriptors() noexcept {
    if (!openStandardDescriptors()) {
        ::_exit(EXIT_FAILURE);  // there is nowhere to report why
    }
    ::close_range(STDERR_FILENO + 1, ~0U, CLOSE_RANGE_CLOEXEC);
}

}  // namespace

void startProcess() noexcept {
#ifndef ADMINHOST_SANITIZED  // the search for leaks inspects its own process
    // Not a limit on core files, which the started service would inherit.
    ::prctl(PR_SET_DUMPABLE, 0);
#endif
    resetSignals();
    tidyDescriptors();
}

}  // namespace adminhost
