#pragma once

// A log sink that queues events while its output does not accept them.

#include "platform/framework/Export.h"
#include "platform/log/Log.h"

#include <cstddef>
#include <deque>
#include <functional>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>

namespace adminhost {

/// A sink that writes through a function and queues what the function does not write. See Log.h for the contract.
class ADMINHOST_EXPORT QueuedSink final : public LogSink {
  public:
    static constexpr std::size_t maximum = std::size_t{1} << 20U;  ///< bytes in the queue

    enum class Outcome {
        written,
        later,   ///< the output is full, or not there at the moment
        failed,  ///< this text will never be written
    };
    /// What became of a text, and how many of its first bytes are written when the outcome is "later".
    struct Written {
        Outcome outcome;
        std::size_t bytes = 0;
    };
    /// Writes a text without blocking. The text is an event as logTextOf() returns it with a line feed at its end.
    using Write = std::function<Written(std::string_view)>;

    explicit QueuedSink(Write write) : _write(std::move(write)) {}

    void write(std::string_view event) noexcept override;
    bool flush() noexcept override;
    /// Events that were lost since the start of the process.
    [[nodiscard]] std::size_t lostInTotal() const noexcept;

  private:
    struct Queued {
        std::string text;        ///< the part that is not written yet
        std::size_t events = 1;  ///< that are lost with it
        bool isNumberOfLost = false;
    };

    void add(std::string_view event);
    void lose(std::size_t events) noexcept;
    void addNumberOfLost();
    bool drain();

    Write _write;
    mutable std::mutex _mutex;
    std::deque<Queued> _queue;
    std::size_t _bytes = 0;  ///< in the queue
    std::size_t _lostInTotal = 0;
    std::size_t _lost = 0;  ///< events that are not in the queue and whose number is not in it either
};

}  // namespace adminhost
