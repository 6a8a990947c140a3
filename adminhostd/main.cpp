// adminhostd: the front, or with --worker, as the front starts it, a worker.

#include "adminhostd/Daemon.h"
#include "adminhostd/Places.h"
#include "adminhostd/Worker.h"

#include <cstdlib>
#include <exception>
#include <iostream>
#include <string_view>

#include <fcntl.h>
#include <unistd.h>

namespace {

constexpr int workerDescriptor = 3;

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
        if (count == 2 && std::string_view(arguments[1]) == "--worker") {
            ::fcntl(workerDescriptor, F_SETFD, FD_CLOEXEC);
            ::unsetenv("NOTIFY_SOCKET");
            return adminhost::runWorker(workerDescriptor);
        }
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
