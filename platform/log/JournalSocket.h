#pragma once

// Entries of the journal with fields of their own, written without blocking.

#include "platform/files/FileDescriptor.h"
#include "platform/framework/Export.h"
#include "platform/log/Log.h"

#include <chrono>
#include <cstddef>
#include <deque>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>

namespace adminhost {

/// The client's side of the journal's own socket. The service manager's library would wait for a journal that is stuck;
/// this queues up to 1 MiB.
class ADMINHOST_EXPORT JournalSocket {
  public:
    static constexpr std::size_t queueMaximum = std::size_t{1} << 20U;    ///< bytes
    static constexpr std::size_t entryMaximum = std::size_t{128} << 10U;  ///< bytes; the socket accepts some more

    /// `pause`: while no journal listens, it is looked for once in this time.
    explicit JournalSocket(std::string path, std::chrono::milliseconds pause = std::chrono::seconds(1))
        : _path(std::move(path)), _pause(pause) {}

    /// Writes or queues an entry. Returns false if no journal listens at the path; then the entry is not lost, but the
    /// caller's.
    [[nodiscard]] bool write(std::string_view message, const LogFields& fields);
    /// Tries to write what is queued; returns true when nothing is left.
    bool flush();
    /// Returns true if a journal listens at the path.
    [[nodiscard]] bool isThere();
    /// Entries that were lost since the start: the queue was full, the entry too large, or the journal ended.
    [[nodiscard]] std::size_t lostInTotal() const;

  private:
    enum class Sent { yes, later, never, nobodyListens };
    [[nodiscard]] bool connect();
    [[nodiscard]] Sent send(const std::string& datagram);
    [[nodiscard]] bool drain();

    std::string _path;
    mutable std::mutex _mutex;
    FileDescriptor _socket;
    std::chrono::milliseconds _pause;
    std::chrono::steady_clock::time_point _lookFrom;  ///< when the journal is looked for again
    std::deque<std::string> _queue;
    std::size_t _bytes = 0;
    std::size_t _lost = 0;
};

/// The datagram of an entry: a line "FIELD=value" for each field, or, for a value with a line feed, the name, a line
/// feed, the value's size in 64 bits (least significant byte first) and the value.
[[nodiscard]] ADMINHOST_EXPORT std::string journalDatagramOf(std::string_view message, const LogFields& fields);

}  // namespace adminhost
