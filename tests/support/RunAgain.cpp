#include "tests/support/RunAgain.h"

#include <cstdlib>
#include <string>
#include <vector>

#include <unistd.h>

namespace adminhost::test {

void runAgainBelow(const char* script, int argc, char** argv) {
    std::string program = std::string(SOURCE_DIR "/tests/support/") + script;
    char self[4096] = "";
    if (::readlink("/proc/self/exe", self, sizeof self - 1) < 0) {
        std::abort();
    }
    std::vector<char*> command = {program.data(), self};
    command.insert(command.end(), argv + 1, argv + argc);
    command.push_back(nullptr);
    ::execv(program.c_str(), command.data());
    std::abort();
}

}  // namespace adminhost::test
