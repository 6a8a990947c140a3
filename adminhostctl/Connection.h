#pragma once

// HTTP over the daemon's Unix socket.

#include "adminhostctl/Failure.h"

#include <memory>
#include <string>

namespace adminhost::ctl {

struct DaemonReply {
    long status = 0;
    std::string body;
    std::string requestId;  ///< the daemon's name for the request; empty if it gave none
    std::string revision;   ///< of the state that was read, from the ETag header; empty without that header
    bool notDone = false;   ///< parts of the request were not carried out, or were ignored
};

/// The daemon was reached, and the connection ended before the answer: the request may have been carried out.
class LostConnection : public Failure {
  public:
    using Failure::Failure;
};

/// Headers of a request that may change something.
struct PostHeaders {
    std::string requestId;  ///< a UUID of the client's choice; empty: the daemon chooses
    std::string revision;  ///< the daemon refuses the request (412) unless this is the current one; empty: no condition
};

/// One connection, kept open between requests. Throws Unavailable when the daemon cannot be reached (notReachable), and
/// Failure when the
/// socket may not be opened (notPermitted). post() throws LostConnection when the connection ends without an answer or
/// isInterrupted() becomes true before the answer. There is no time limit here, because the daemon limits requests.
class Connection {
  public:
    explicit Connection(std::string socketPath);
    ~Connection();
    Connection(Connection&&) noexcept;
    Connection& operator=(Connection&&) noexcept;

    /// The path is the address below "http://host", each of its segments already escaped.
    [[nodiscard]] DaemonReply get(const std::string& path);
    /// The body is JSON.
    [[nodiscard]] DaemonReply post(const std::string& path, const std::string& body, const PostHeaders& headers = {});

    [[nodiscard]] const std::string& socketPath() const noexcept { return _socketPath; }
    /// Escapes one segment of a path, or a value in its query.
    [[nodiscard]] static std::string escaped(const std::string& segment);

  private:
    class Transfer;
    [[nodiscard]] DaemonReply send(const std::string& path, const std::string* body, const PostHeaders& headers);

    std::string _socketPath;
    std::unique_ptr<Transfer> _transfer;
};

}  // namespace adminhost::ctl
