#pragma once

// The process ids of the tools that a process runs, and the deadline of its operation, in memory that it shares with
// its parent. If the process dies, its parent ends the tools from it.
//
// A tool enters its own id before it executes its program (StartChild.h). The id is removed when the exit of the tool
// is seen, before the tool is reaped: so an id in the register never belongs to another process while its owner lives.

#include "platform/files/FileDescriptor.h"
#include "platform/framework/Export.h"
#include "platform/value/Result.h"

#include <array>
#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <utility>

#include <sys/types.h>

namespace adminhost {

class ADMINHOST_EXPORT ToolRegister {
  public:
    static constexpr std::size_t capacity = 64;  ///< tools at the same time

    /// An empty one. Another process that inherits the descriptor and opens it has the same one.
    [[nodiscard]] static Result<ToolRegister> create();
    [[nodiscard]] static Result<ToolRegister> open(FileDescriptor descriptor);

    ToolRegister(ToolRegister&& other) noexcept;
    ToolRegister(const ToolRegister&) = delete;
    ToolRegister& operator=(const ToolRegister&) = delete;
    ToolRegister& operator=(ToolRegister&&) = delete;
    ~ToolRegister();

    [[nodiscard]] int descriptor() const noexcept { return _descriptor.get(); }

    /// A place for one tool, which is free again when it is 0; null if all are used.
    [[nodiscard]] std::atomic<pid_t>* claim() noexcept;

    /// After the death of the process that filled it: kills the process groups of the tools that are still running, and
    /// empties the register. A group whose first process has exited is left alone, because it is a service that the
    /// tool has started. Waits for at most some milliseconds for each tool.
    void killRemaining() noexcept;

    /// The deadline of the operation that the process runs; nullopt while it runs none.
    void setDeadline(std::optional<std::chrono::steady_clock::time_point> deadline) noexcept;
    [[nodiscard]] std::optional<std::chrono::steady_clock::time_point> deadline() const noexcept;

  private:
    struct Places {
        std::array<std::atomic<pid_t>, capacity> tools;
        std::atomic<std::int64_t> deadline;  ///< nanoseconds of the steady clock; 0: none
    };

    ToolRegister(FileDescriptor descriptor, Places* places) noexcept
        : _descriptor(std::move(descriptor)), _places(places) {}

    FileDescriptor _descriptor;
    Places* _places;
};

/// Tools that this process starts from now on are entered there; null for none. It must outlive them.
ADMINHOST_EXPORT void setToolRegister(ToolRegister* toolRegister) noexcept;
[[nodiscard]] ADMINHOST_EXPORT ToolRegister* toolRegister() noexcept;

}  // namespace adminhost
