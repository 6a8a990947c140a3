// adminhostd: the front of the daemon.

#include "adminhostd/Daemon.h"
#include "adminhostd/Places.h"

#include <exception>
#include <iostream>

#include <fcntl.h>
#include <unistd.h>

namespace {

/// A descriptor that we open must never take the place of a closed standard stream.
void openStandardStreams() {
    int descriptor = 0;
    do {
        descriptor = ::open("/dev/null", O_RDWR);
    } while (descriptor >= 0 && descriptor <= STDERR_FILENO);
    if (descriptor >= 0) {
        ::close(descriptor);
    }
}

}  // namespace

int main(int count, char** arguments) {
    try {
        openStandardStreams();
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
