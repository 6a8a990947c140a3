#pragma once

// The worker's part of the audit: notes about its changes, and the conversation with the front about them.

#include "adminhostd/BegunRequest.h"
#include "adminhostd/ForwardingSink.h"
#include "adminhostd/Frame.h"
#include "adminhostd/PluginFile.h"
#include "adminhostd/Protocol.h"

#include <optional>
#include <set>
#include <string>

namespace adminhost {

class ChangeNotes {
  public:
    /// The conversation with the front, and the sink of the operations' reports.
    ChangeNotes(int descriptor, FrameReader& reader, ForwardingSink& sink)
        : _descriptor(descriptor), _reader(reader), _sink(sink) {}

    /// Sends the front the notes of earlier workers. Only in a worker that holds the lock for changes: then none of
    /// them is still running.
    void reportUnfinished();
    /// Notes that an operation is about to change something, and waits until the front has logged that. Returns false
    /// if the front has ended; then the operation must not run.
    [[nodiscard]] bool begin(const LoadedPlugin& loaded, const protocol::Perform& order);
    /// The operation has ended. Does nothing if none has begun.
    void end(protocol::Outcome outcome);
    /// The front has logged the end.
    void recorded(const protocol::Recorded& message);

  private:
    [[nodiscard]] bool awaitProceed(const std::string& request);

    int _descriptor;
    FrameReader& _reader;
    ForwardingSink& _sink;
    std::optional<BegunRequest> _note;  ///< about the operation that is running
    std::set<std::string> _reported;    ///< requests that the front knows, until their notes are removed
    bool _laterReleaseLogged = false;
};

}  // namespace adminhost
