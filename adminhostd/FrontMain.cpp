// adminhostd: the front of the daemon.

#include "adminhostd/Daemon.h"
#include "adminhostd/ProcessStart.h"
#include "adminhostd/SelfCheck.h"

#include <exception>
#include <iostream>

int main(int count, char** arguments) {
    try {
        adminhost::startProcess();
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
