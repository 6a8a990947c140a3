#pragma once

// Notes about commands that have begun to change something, for the case that the daemon is killed before their end is
// logged. The worker keeps them, because the front has no right to.
//
// A note is a file in a directory that no other account can enter, with what is known of the request and, as soon as
// they are reported, its changes. It exists from before the operation runs until the front has logged the end. What is
// left of an earlier worker is found by the next one that holds the lock for changes.

#include "adminhostd/Protocol.h"
#include "adminhostd/Redaction.h"
#include "platform/files/FileDescriptor.h"
#include "platform/files/Path.h"
#include "platform/framework/Report.h"

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

class BegunRequest {
  public:
    static constexpr std::string_view directory = "/var/lib/adminhostd/begun";
    static constexpr std::size_t noteMaximum = std::size_t{1} << 20U;  ///< bytes; further reports are not in the note

    /// Creates the note. `about` has no reports and no end yet.
    BegunRequest(const protocol::Unfinished& about, Redaction redaction);

    /// Why there is no note; empty if there is one. The request goes on: on a full disk, this one may make room.
    [[nodiscard]] const std::string& problem() const noexcept { return _problem; }

    void add(const Change& change);
    void add(const NotDone& part);
    /// Notes how the operation ended: "its operation was completed".
    void ended(std::string_view end);

    /// What earlier workers have left.
    struct Left {
        std::vector<protocol::Unfinished> notes;  ///< oldest first
        std::size_t ofLaterRelease = 0;           ///< notes that only a later release can read
    };
    /// Removes notes that cannot be read, except for those of a later release, which may be installed again.
    [[nodiscard]] static Left left();
    /// Removes the note about a request, if there is one.
    static void remove(std::string_view request);

  private:
    void append(Dictionary line);

    Redaction _redaction;
    FileDescriptor _file;
    std::size_t _bytes = 0;
    std::string _problem;
};

}  // namespace adminhost
