// adminhostd-worker: started by the monitor, with the conversation as descriptor 3 and the register of tools as 4.

#include "adminhostd/PluginTrial.h"
#include "adminhostd/ProcessStart.h"
#include "adminhostd/Worker.h"
#include "platform/task/ToolRegister.h"

#include <cstdlib>
#include <exception>
#include <iostream>
#include <string_view>

#include <sys/stat.h>

int main(int count, char** arguments) {
    adminhost::startProcess();
    if (count == 3 && std::string_view(arguments[1]) == adminhost::trialArgument) {
        return adminhost::serveTrial(arguments[2]);
    }
    constexpr int conversation = 3;
    constexpr int tools = 4;
    struct stat status {};
    auto toolRegister = adminhost::ToolRegister::open(adminhost::FileDescriptor(tools));
    if (!toolRegister || ::fstat(conversation, &status) != 0 || !S_ISSOCK(status.st_mode)) {
        std::cerr << "adminhostd-worker is started by adminhostd\n";
        return 2;
    }
    adminhost::setToolRegister(&*toolRegister);
    ::unsetenv("NOTIFY_SOCKET");
    try {
        return adminhost::runWorker(conversation);
    } catch (const std::exception& error) {
        std::cerr << "adminhostd-worker: " << error.what() << '\n';
        return 1;
    }
}
