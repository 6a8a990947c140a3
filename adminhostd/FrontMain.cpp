// adminhostd-front: started by the monitor, with the conversation with it as descriptor 3 and the listening socket
// as 4.

#include "adminhostd/Daemon.h"
#include "adminhostd/FrontStart.h"
#include "adminhostd/Options.h"
#include "adminhostd/ProcessStart.h"
#include "platform/files/FileDescriptor.h"

#include <cerrno>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <string>

#include <sys/stat.h>

namespace {

bool isSocket(int descriptor) {
    struct stat status {};
    return ::fstat(descriptor, &status) == 0 && S_ISSOCK(status.st_mode);
}

}  // namespace

int main(int count, char** arguments) {
    const char* const tools = std::getenv(adminhost::toolDirectoryVariable);
    if (tools == nullptr || !isSocket(adminhost::frontLink) || !isSocket(adminhost::frontListener)) {
        std::cerr << "adminhostd-front is started by adminhostd\n";
        return 2;
    }
    try {
        adminhost::startProcess();
        // Log lines have the daemon's name.
        static char name[] = "adminhostd";
        ::program_invocation_short_name = name;
        const std::string toolDirectory = tools;
        ::unsetenv(adminhost::toolDirectoryVariable);
        int status = 0;
        const auto options = adminhost::readOptions(count, arguments, status);
        if (!options) {
            return status;
        }
        return adminhost::runDaemon(*options, adminhost::FileDescriptor(adminhost::frontLink),
                                    adminhost::FileDescriptor(adminhost::frontListener), toolDirectory);
    } catch (const std::exception& error) {
        std::cerr << "adminhostd: " << error.what() << '\n';
        return 1;
    }
}
