// adminhostd-front: started by the monitor, with the descriptors of FrontStart.h.

#include "adminhostd/ConfigurationCopy.h"
#include "adminhostd/Daemon.h"
#include "adminhostd/FrontStart.h"
#include "adminhostd/Options.h"
#include "adminhostd/ProcessStart.h"
#include "platform/files/FileDescriptor.h"

#include <cerrno>
#include <exception>
#include <iostream>
#include <string>
#include <utility>
#include <vector>

#include <sys/stat.h>

namespace {

bool isSocket(int descriptor) {
    struct stat status {};
    return ::fstat(descriptor, &status) == 0 && S_ISSOCK(status.st_mode);
}

}  // namespace

int main(int count, char** arguments) {
    if (!isSocket(adminhost::frontLink) || !isSocket(adminhost::frontListener)) {
        std::cerr << "adminhostd-front is started by adminhostd\n";
        return 2;
    }
    try {
        adminhost::startProcess();
        // First of all: a signal for the whole process group must not end a front that is starting.
        adminhost::FileDescriptor signals = adminhost::stopSignals();
        // Log lines have the daemon's name.
        static char name[] = "adminhostd";
        ::program_invocation_short_name = name;
        const std::vector<std::string> given(arguments, arguments + count);
        const auto optionsIn = [&](int descriptor) {
            const adminhost::FileDescriptor copy(descriptor);
            return adminhost::readOptionsWith(given, adminhost::configurationIn(copy.get()));
        };
        const adminhost::Options first = optionsIn(adminhost::frontFirstConfiguration);
        adminhost::Options options = optionsIn(adminhost::frontConfiguration);
        static_cast<void>(adminhost::keepFixedSettings(options, first));  // the monitor has logged them
        return adminhost::runDaemon(options, std::move(signals), adminhost::FileDescriptor(adminhost::frontLink),
                                    adminhost::FileDescriptor(adminhost::frontListener));
    } catch (const std::exception& error) {
        std::cerr << "adminhostd: " << error.what() << '\n';
        return 1;
    }
}
