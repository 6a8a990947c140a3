#include "tests/support/Traced.h"

#include "platform/task/Task.h"

#include <algorithm>
#include <fstream>
#include <map>
#include <stdexcept>
#include <string_view>

#include <unistd.h>

namespace adminhost::test {
namespace {

constexpr const char* beginMark = "/adminhost-mark-begin";
constexpr const char* endMark = "/adminhost-mark-end";

/// The name of the call in a line "NAME(...", before which strace -f writes the process's id; empty for other lines.
std::string callOf(std::string_view line) {
    constexpr const char* digits = "0123456789";
    if (const std::size_t end = line.find_first_not_of(digits); end != 0 && end != std::string_view::npos) {
        line.remove_prefix(std::min(line.find_first_not_of(' ', end), line.size()));
    }
    const std::size_t end = line.find_first_not_of("abcdefghijklmnopqrstuvwxyz0123456789_");
    return std::string(end != std::string_view::npos && line[end] == '(' ? line.substr(0, end) : "");
}

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
    std::map<std::string, int> numbers;
    std::vector<TracedCall> calls;
    bool between = false;
    for (std::string line; std::getline(lines, line);) {
        const std::string name = callOf(line);
        if (name.empty()) {
            continue;
        }
        const int number = ++numbers[name];
        if (line.find(beginMark) != std::string::npos) {
            between = true;
        } else if (line.find(endMark) != std::string::npos) {
            return calls;
        } else if (between) {
            calls.push_back({name, number, line});
        }
    }
    throw std::runtime_error("the marks are not in " + log);
}

}  // namespace adminhost::test
