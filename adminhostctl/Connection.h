#pragma once

// HTTP over the daemon's Unix socket, or over ssh to the one of another machine.

#include "adminhostctl/Failure.h"
#include "adminhostctl/RemoteHost.h"

#include <chrono>
#include <memory>
#include <string>

namespace adminhost::ctl {

struct DaemonReply {
    long status = 0;
    std::string body;
    std::string requestId;  ///< the daemon's name for the request; empty if it gave none
    std::string revision;   ///< of the state that was read, from the ETag header; empty without that header
    bool notDone = false;   ///< parts of the request were not carried out, or were ignored
    long retryAfter = 0;    ///< seconds after which the daemon may accept the request; 0 without that header
};

/// The daemon was reached, and the connection ended before the answer: the request may have been carried out.
class LostConnection : public Failure {
  public:
    using Failure::Failure;
};

/// Headers of a request that may change something.
struct PostHeaders {
    std::string requestId{};  ///< a UUID of the client's choice; empty: the daemon chooses
    std::string
        revision{};  ///< the daemon refuses the request (412) unless this is the current one; empty: no condition
    std::string deadline{};  ///< seconds that its operation may take; empty: as long as the daemon allows
};

/// One connection, kept open between requests. Throws Unavailable when the daemon cannot be reached or does not answer
/// in time (notReachable), and Failure when the socket may not be opened (notPermitted). post() throws LostConnection
/// when the connection ends without an answer, the time is over or isInterrupted() becomes true before the answer.
class Connection {
  public:
    explicit Connection(std::string socketPath);
    /// To the daemon of another machine. Further failures are those of RemoteHost::connect().
    explicit Connection(std::unique_ptr<RemoteHost> host);
    ~Connection();
    Connection(Connection&&) noexcept;

    /// The path is the address below "http://host", each of its segments already escaped. The timeout is that of the
    /// whole exchange, without the time of a login that may ask for a password.
    [[nodiscard]] DaemonReply get(const std::string& path, std::chrono::milliseconds timeout);
    /// The same with the method DELETE.
    [[nodiscard]] DaemonReply remove(const std::string& path, std::chrono::milliseconds timeout);
    /// The body is JSON.
    [[nodiscard]] DaemonReply post(const std::string& path, const std::string& body, std::chrono::milliseconds timeout,
                                   const PostHeaders& headers = {});

    /// The path of the daemon's socket, or the host on which the daemon is running.
    [[nodiscard]] const std::string& place() const noexcept { return _host ? _host->host() : _socketPath; }
    [[nodiscard]] bool isRemote() const noexcept { return _host != nullptr; }
    /// How long logins have taken so far that may have asked for a password. No timeout has counted it.
    [[nodiscard]] std::chrono::steady_clock::duration loginTime() const noexcept { return _loginTime; }
    /// Escapes one segment of a path, or a value in its query.
    [[nodiscard]] static std::string escaped(const std::string& segment);

  private:
    class Transfer;
    class Sockets;
    struct Exchange;
    [[nodiscard]] DaemonReply send(const Exchange& exchange);
    /// Returns true if the library must use a new connection. Reduces the timeout of an exchange by the time of a login
    /// that asks for nothing.
    [[nodiscard]] bool connectToHost(std::chrono::milliseconds& timeout);
    [[noreturn]] void fail(const Exchange& exchange, int result) const;

    std::string _socketPath;            ///< empty: the daemon is on another machine
    std::unique_ptr<RemoteHost> _host;  ///< null: the daemon is on this machine
    std::unique_ptr<Sockets> _sockets;
    std::unique_ptr<Transfer> _transfer;  ///< last: it closes its sockets
    std::chrono::steady_clock::duration _loginTime{};
};

/// Throws the Failure for a daemon's socket that this process could not connect to, with the system's error number.
[[noreturn]] void throwNotConnected(const std::string& socketPath, int number, const std::string& why);

}  // namespace adminhost::ctl
