#include "platform/files/File.h"
#include "platform/files/Path.h"
#include "platform/service/Managers.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <ctime>
#include <optional>
#include <string_view>
#include <system_error>

#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

using std::chrono::nanoseconds;

constexpr std::size_t pidFileMaximum = 4096;
constexpr std::size_t processFileMaximum = std::size_t{64} << 10U;
/// Process starts are known in ticks, and files are dated with the kernel's coarse clock: both are up to 10 ms early.
constexpr nanoseconds tolerance = std::chrono::milliseconds(100);

nanoseconds durationOf(const timespec& time) noexcept {
    return std::chrono::seconds(time.tv_sec) + nanoseconds(time.tv_nsec);
}

nanoseconds now(clockid_t clock) noexcept {
    timespec time{};
    static_cast<void>(::clock_gettime(clock, &time));
    return durationOf(time);
}

template <class Number>
std::optional<Number> numberIn(std::string_view text) {
    constexpr std::string_view blanks = " \t\r\n";
    text.remove_prefix(std::min(text.find_first_not_of(blanks), text.size()));
    text = text.substr(0, text.find_last_not_of(blanks) + 1);
    Number number{};
    const auto [end, status] = std::from_chars(text.data(), text.data() + text.size(), number);
    return status == std::errc() && end == text.data() + text.size() ? std::optional(number) : std::nullopt;
}

struct ProcessStatus {
    char state = 0;         ///< 'R', 'S', 'Z', ...
    nanoseconds started{};  ///< since the machine was started
};

/// Reads "PID (NAME) STATE PARENT ... STARTTIME ...". The name may contain any character.
std::optional<ProcessStatus> statusOf(pid_t pid) {
    const auto text = readFile(DiskPath("/proc/" + std::to_string(pid) + "/stat"), processFileMaximum);
    const std::size_t end = text ? text->rfind(')') : std::string::npos;
    if (end == std::string::npos || text->size() < end + 3) {
        return std::nullopt;
    }
    constexpr int startIndex = 19;  // the state has index 0
    std::string_view fields = std::string_view(*text).substr(end + 2);
    ProcessStatus status;
    status.state = fields.front();
    for (int i = 0; i < startIndex; ++i) {
        const std::size_t blank = fields.find(' ');
        if (blank == std::string_view::npos) {
            return std::nullopt;
        }
        fields.remove_prefix(blank + 1);
    }
    const auto ticks = numberIn<std::int64_t>(fields.substr(0, fields.find(' ')));
    if (!ticks) {
        return std::nullopt;
    }
    status.started = nanoseconds(std::chrono::seconds(1)) / ::sysconf(_SC_CLK_TCK) * *ticks;
    return status;
}

}  // namespace

Result<bool> pidFileNamesRunningProcess(const std::string& unit) {
    const std::string_view name = std::string_view(unit).substr(0, unit.rfind('.'));
    const HostPath file("/var/run/" + std::string(name.substr(name.rfind('.') + 1)) + ".pid");
    struct stat attributes {};
    const auto text = readFile(diskPath(file), pidFileMaximum);
    if (!text && text.error().code == ENOENT) {
        return false;
    }
    if (!text) {
        return failure(text.error());
    }
    const auto pid = numberIn<pid_t>(*text);
    if (!pid || *pid <= 0) {
        return failure({"posix", EINVAL, file.text() + " does not hold a process id"});
    }
    const auto process = statusOf(*pid);
    if (!process || process->state == 'Z' || process->state == 'X' ||
        ::stat(diskPath(file).c_str(), &attributes) != 0) {
        return false;
    }
    // The clock of process starts does not follow changes of the date, so the distance of the two clocks is taken now.
    const nanoseconds started = now(CLOCK_REALTIME) - now(CLOCK_BOOTTIME) + process->started;
    return started <= durationOf(attributes.st_mtim) + tolerance;
}

}  // namespace adminhost
