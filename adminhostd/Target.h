#pragma once

// What the path of a request names.

#include <string>
#include <string_view>

namespace adminhost {

struct Target {
    enum class Kind {
        unknown,
        overview,
        plugin,
        command,
        request,
        directory,
        history,
        doctor,
        logs,
        events,
        metrics,
        audit
    };
    Kind kind = Kind::unknown;
    std::string plugin;
    std::string command;  ///< for a request its id, for a log its name

    /// Returns true if the worker serves it. Such requests are recorded in the log of requests.
    [[nodiscard]] bool isOperation() const noexcept {
        return kind == Kind::command || kind == Kind::directory || kind == Kind::history || kind == Kind::doctor ||
               kind == Kind::logs || kind == Kind::audit;
    }
};

[[nodiscard]] Target targetOf(std::string_view path);

}  // namespace adminhost
