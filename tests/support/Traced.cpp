#include "tests/support/Traced.h"

#include "platform/task/Task.h"

#include <fstream>
#include <map>
#include <regex>
#include <stdexcept>

#include <unistd.h>

namespace adminhost::test {
namespace {

constexpr const char* beginMark = "/adminhost-mark-begin";
constexpr const char* endMark = "/adminhost-mark-end";

}  // namespace

void markBegin() {
    static_cast<void>(::access(beginMark, F_OK));
}

void markEnd() {
    static_cast<void>(::access(endMark, F_OK));
}

std::int32_t runTraced(const std::vector<std::string>& options, const std::string& log,
                       const std::vector<std::string>& command, std::string& errors) {
    std::vector<std::string> arguments{"-o", log};
    arguments.insert(arguments.end(), options.begin(), options.end());
    arguments.insert(arguments.end(), command.begin(), command.end());
    // A traced process cannot search for leaks.
    return launch_task_with_input_and_environment(DiskPath("/usr/bin/strace"), arguments, std::nullopt, nullptr,
                                                  &errors, {{"ASAN_OPTIONS", "detect_leaks=0"}});
}

std::vector<TracedCall> callsBetweenMarks(const std::string& log) {
    std::ifstream lines(log);
    const std::regex form("^(?:[0-9]+ +)?([a-z0-9_]+)\\(.*");  // with -f, the process's id comes first
    std::map<std::string, int> numbers;
    std::vector<TracedCall> calls;
    bool between = false;
    for (std::string line; std::getline(lines, line);) {
        std::smatch match;
        if (!std::regex_match(line, match, form)) {
            continue;
        }
        const int number = ++numbers[match[1]];
        if (line.find(beginMark) != std::string::npos) {
            between = true;
        } else if (line.find(endMark) != std::string::npos) {
            return calls;
        } else if (between) {
            calls.push_back({match[1], number, line});
        }
    }
    throw std::runtime_error("the marks are not in " + log);
}

}  // namespace adminhost::test
