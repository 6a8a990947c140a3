#include "tests/support/ServiceManager.h"

#include "tests/support/Program.h"
#include "tests/support/RunAgain.h"

#include <cstdlib>
#include <fstream>
#include <stdexcept>
#include <string_view>
#include <vector>

#include <unistd.h>

namespace adminhost::test {
namespace {

constexpr const char* kindVariable = "SERVICE_MANAGER";
constexpr const char* manager = "org.freedesktop.systemd1";
constexpr const char* managerPath = "/org/freedesktop/systemd1";

std::string checked(std::vector<std::string> command) {
    const ProgramResult result = runProgram(command, Errors::merge);
    if (result.status != 0) {
        throw std::runtime_error(command[0] + ' ' + command.back() + ": " + result.output);
    }
    return result.output;
}

/// Calls a method on the bus of the mock.
std::string call(std::vector<std::string> words) {
    words.insert(words.begin(),
                 {"busctl", std::string("--address=") + std::getenv("DBUS_SYSTEM_BUS_ADDRESS"), "call", manager});
    return checked(std::move(words));
}

std::string objectOf(const std::string& unit) {
    const std::string reply = call({managerPath, "org.freedesktop.systemd1.Manager", "LoadUnit", "s", unit});
    const std::size_t begin = reply.find('"') + 1;  // o "/org/..."
    return reply.substr(begin, reply.find('"', begin) - begin);
}

void systemctl(std::vector<std::string> words) {
    words.insert(words.begin(), "systemctl");
    checked(std::move(words));
}

}  // namespace

void enterServiceManager(int argc, char** argv) {
    if (std::getenv(kindVariable) == nullptr) {
        runAgainBelow("with-systemd", argc, argv);
    }
}

bool isRealServiceManager() {
    const char* kind = std::getenv(kindVariable);
    return kind != nullptr && std::string_view(kind) == "systemd";
}

void addUnit(const std::string& unit, const std::string& text) {
    if (!isRealServiceManager()) {
        call({managerPath, "org.freedesktop.DBus.Mock", "AddMockUnit", "s", unit});
        return;
    }
    std::ofstream("/run/systemd/system/" + unit) << text;
    systemctl({"daemon-reload"});
}

void addUnitAlias(const std::string& unit, const std::string& alias) {
    if (!isRealServiceManager()) {
        addUnit(alias, "");
        return;
    }
    if (::symlink(unit.c_str(), ("/run/systemd/system/" + alias).c_str()) != 0) {
        throw std::runtime_error("cannot link " + alias);
    }
    systemctl({"daemon-reload"});
}

void startUnit(const std::string& unit) {
    if (isRealServiceManager()) {
        systemctl({"start", "--no-block", unit});
    } else {
        call({managerPath, "org.freedesktop.systemd1.Manager", "StartUnit", "ss", unit, "replace"});
    }
}

void stopUnit(const std::string& unit) {
    if (isRealServiceManager()) {
        systemctl({"stop", "--no-block", unit});
    } else {
        call({managerPath, "org.freedesktop.systemd1.Manager", "StopUnit", "ss", unit, "replace"});
    }
}

void reloadUnit(const std::string& unit) {
    if (isRealServiceManager()) {
        systemctl({"reload", "--no-block", unit});
    }
}

bool reachState(const std::string& unit, const std::string& state) {
    if (!isRealServiceManager()) {
        call({objectOf(unit), "org.freedesktop.DBus.Mock", "UpdateProperties", "sa{sv}",
              "org.freedesktop.systemd1.Unit", "1", "ActiveState", "s", state});
        return true;
    }
    for (int i = 0; i < 1000; ++i) {
        if (runProgram({"systemctl", "show", "--property=ActiveState", "--value", unit}).output == state + '\n') {
            return true;
        }
        ::usleep(10'000);
    }
    return false;
}

}  // namespace adminhost::test
