#pragma once

#include "platform/files/FileDescriptor.h"
#include "platform/framework/Export.h"
#include "platform/log/QueuedSink.h"

#include <string>
#include <string_view>
#include <utility>

namespace adminhost {

/// The client's side of a syslog socket. The C library's syslog() waits for a reader that is stuck; this does not.
class ADMINHOST_EXPORT SystemLog {
  public:
    /// Connects when the first text is written, and again after the reader was restarted.
    explicit SystemLog(std::string path) : _path(std::move(path)) {}

    /// Writes one message: facility daemon, priority notice, the program's name, and the text without its line feed.
    [[nodiscard]] QueuedSink::Written write(std::string_view text);

  private:
    [[nodiscard]] bool connect();

    std::string _path;
    FileDescriptor _socket;
};

}  // namespace adminhost
