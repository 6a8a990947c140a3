// adminhostd: the monitor, which starts the daemon's other programs.

#include "adminhostd/Monitor.h"
#include "adminhostd/ProcessStart.h"
#include "adminhostd/SelfCheck.h"

#include <exception>
#include <iostream>
#include <string>
#include <vector>

int main(int count, char** arguments) {
    try {
        adminhost::startProcess();
        int status = 0;
        const auto options = adminhost::readOptions(count, arguments, status);
        if (!options) {
            return status;
        }
        return options->check ? adminhost::check(*options)
                              : adminhost::runMonitor(*options, std::vector<std::string>(arguments, arguments + count));
    } catch (const std::exception& error) {
        std::cerr << "adminhostd: " << error.what() << '\n';
        return 1;
    }
}
