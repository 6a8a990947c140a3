#include "adminhostctl/Interrupt.h"

namespace adminhost::ctl {
namespace {

// A signal handler can only reach static storage.
volatile std::sig_atomic_t remembered = 0;
bool isGuarded = false;
void rememberSignal(int number) noexcept {
    remembered = number;
}

}  // namespace

InterruptGuard::InterruptGuard() noexcept {
    struct sigaction action {};
    action.sa_handler = &rememberSignal;
    isGuarded = true;
    // The first signal resets the handler, so that the second one ends the program.
    action.sa_flags = static_cast<int>(SA_RESETHAND);
    sigemptyset(&action.sa_mask);
    for (std::size_t i = 0; i < signals.size(); ++i) {
        sigaction(signals.at(i), nullptr, &_before.at(i));
        if (_before.at(i).sa_handler != SIG_IGN) {  // as nohup wants it
            sigaction(signals.at(i), &action, nullptr);
        }
    }
}

InterruptGuard::~InterruptGuard() {
    isGuarded = false;
    for (std::size_t i = 0; i < signals.size(); ++i) {
        sigaction(signals.at(i), &_before.at(i), nullptr);
    }
}

bool isInterrupted() noexcept {
    return isGuarded && remembered != 0;
}

void endIfInterrupted() noexcept {
    if (const int number = static_cast<int>(remembered); number != 0) {
        static_cast<void>(std::raise(number));
    }
}

}  // namespace adminhost::ctl
