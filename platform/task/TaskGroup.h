#pragma once

// Several tools at once, from one thread: start them, wait or poll, collect their results in any order.
//
// Everything that Task.h states about one tool applies to each: its descriptors, its environment, the daemon that it
// may leave behind, and the deadline, which is that of the process at the moment of the start. One bound applies to all
// bytes that the group has read and that were not collected yet. A tool that exceeds it is killed with its process
// group and fails; its bytes are dropped, and the others go on.

#include "platform/files/Path.h"
#include "platform/framework/Export.h"
#include "platform/task/Confinement.h"
#include "platform/task/StartChild.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <poll.h>

namespace adminhost {

struct ADMINHOST_EXPORT TaskPlan {
    DiskPath tool;
    std::vector<std::string> arguments;  ///< without the tool itself
    std::optional<std::string> input = std::nullopt;
    std::map<std::string, std::string> environment = {};  ///< added to the daemon's
    bool keepsOutput = true;                              ///< otherwise it is read and dropped
    bool keepsError = true;
    /// Called with everything that the tool has written to its standard output so far, whenever more of it has been
    /// read: the output can be used while the tool is still writing. Bytes that are not UTF-8 are still among it. What
    /// was passed does not count if the tool fails.
    std::function<void(std::string_view)> outputGrows = {};
    std::optional<ChildRights> rights = std::nullopt;          ///< without them, the tool runs as the daemon does
    bool noNewPrivileges = false;                              ///< as in ChildPlan
    std::shared_ptr<const Confinement> confinement = nullptr;  ///< null: not confined
    std::string refusal = {};                                  ///< why the tool must not be started, if so
};

struct ADMINHOST_EXPORT TaskResult {
    std::int32_t status = -1;  ///< as launch_task returns it
    std::string output;
    std::string error;
};

class ADMINHOST_EXPORT TaskGroup {
  public:
    using Clock = std::chrono::steady_clock;
    using Id = std::size_t;

    TaskGroup() noexcept;
    TaskGroup(const TaskGroup&) = delete;
    TaskGroup& operator=(const TaskGroup&) = delete;
    /// Kills the tools that are still running, with their process groups.
    ~TaskGroup();

    /// Starts a tool. One that cannot be started has ended with status -1.
    [[nodiscard]] Id start(TaskPlan plan);

    /// Adds the descriptors to poll. When one is ready, call serve().
    void addTo(std::vector<pollfd>& entries) const;
    /// The latest moment of the next call of serve(), if there is one.
    [[nodiscard]] std::optional<Clock::time_point> due() const;
    /// Does everything that can be done without waiting.
    void serve();
    /// Waits until there is something to serve, and serves it. At least one tool must not have ended.
    void wait();

    /// True once the tool has ended and its output has been read: collect() does not wait.
    [[nodiscard]] bool ended(Id id) const;
    /// Waits until the tool has ended, serves the others meanwhile, and returns its result. Once for each tool.
    [[nodiscard]] TaskResult collect(Id id);

  private:
    class RunningTask;

    /// Waits for so long at most, nullopt for ever, and serves what is ready then.
    void serveFor(std::optional<Clock::duration> time);

    std::size_t _bound;
    std::size_t _held = 0;                             ///< bytes read and not collected
    std::vector<std::unique_ptr<RunningTask>> _tasks;  ///< by id; null when collected
    std::vector<pollfd> _entries;
};

}  // namespace adminhost
