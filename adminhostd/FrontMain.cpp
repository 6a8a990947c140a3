// adminhostd: the front of the daemon.

#include "adminhostd/Daemon.h"
#include "adminhostd/Places.h"

#include <exception>
#include <iostream>

#include <fcntl.h>
#include <unistd.h>

namespace {

/// A descriptor that we open must never take the place of a closed standard stream, and what our parent left open is
/// nothing for the tools that we run: a service that they start would hold it for ever.
void tidyDescriptors() {
    int descriptor = 0;
    do {
        descriptor = ::open("/dev/null", O_RDWR);
    } while (descriptor >= 0 && descriptor <= STDERR_FILENO);
    if (descriptor >= 0) {
        ::close(descriptor);
    }
    ::close_range(STDERR_FILENO + 1, ~0U, CLOSE_RANGE_CLOEXEC);
}

}  // namespace

int main(int count, char** arguments) {
    try {
        tidyDescriptors();
        int status = 0;
        const auto options = adminhost::readOptions(count, arguments, status);
        if (!options) {
            return status;
        }
        return options->check ? adminhost::check(*options) : adminhost::runDaemon(*options);
    } catch (const std::exception& error) {
        std::cerr << "adminhostd: " << error.what() << '\n';
        return 1;
    }
}
