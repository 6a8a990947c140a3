#pragma once

// The daemon of another machine, over ssh.
//
// Each connection is one ssh that runs "adminhostctl bridge" there, with the user's own configuration, agent and known
// hosts. It has one end of a socket pair as standard input and output; so it never reads ours.

#include "adminhostctl/Failure.h"
#include "platform/files/FileDescriptor.h"

#include <chrono>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include <sys/types.h>

namespace adminhost::ctl {

class RemoteHost {
  public:
    using Milliseconds = std::chrono::milliseconds;

    struct Options {
        std::string host;                     ///< "USER@SERVER" or whatever else ssh accepts as a destination
        std::optional<std::string> socket{};  ///< the daemon's socket there, if it is not the usual one
        bool asks = false;                    ///< ssh may ask for passwords on the terminal
        std::optional<std::chrono::seconds> connectTimeout{};  ///< how long ssh may try to reach the machine
    };

    /// A socket that is connected with the daemon.
    struct Connected {
        int socket = -1;
        std::chrono::steady_clock::duration login{};  ///< how long ssh may have waited for a password
    };

    /// Throws Failure(usage) if the host or the socket's path is not usable.
    explicit RemoteHost(Options options);
    RemoteHost(const RemoteHost&) = delete;
    RemoteHost& operator=(const RemoteHost&) = delete;
    /// Waits two seconds at most for what is closed. A process of ssh that other programs share goes on without us.
    ~RemoteHost();

    [[nodiscard]] const std::string& host() const noexcept { return _options.host; }
    [[nodiscard]] bool asks() const noexcept { return _options.asks; }

    /// Starts ssh, and connects a socket with the daemon there. The caller ends it with close(). Throws Unavailable if
    /// the machine (hostNotReachable) or its daemon (notReachable) cannot be reached in time, and Failure with the
    /// reason if it has no usable adminhostctl. The login of an ssh that may ask has no limit: the limit begins with
    /// its end.
    [[nodiscard]] Connected connect(Milliseconds limit);
    /// Returns false if the connection has ended, or if the socket is not one of connect().
    [[nodiscard]] bool isConnected(int socket) const noexcept;
    void close(int socket) noexcept;
    /// Gives the socket another number, in place of the descriptor that has it; reading and writing it no longer wait.
    /// Returns false if that fails.
    [[nodiscard]] bool move(int socket, int number) noexcept;
    /// After a failure: waits for the end of the ssh of a socket that is closed, or ends it after the limit. Returns
    /// its exit status, 128 + number after a signal; nullopt if it had to be ended.
    [[nodiscard]] std::optional<int> statusOf(int socket, Milliseconds limit);
    /// Prints what ssh and the other machine have written on standard error, each line once.
    void passMessages();

  private:
    struct Ssh {
        pid_t pid = 0;
        FileDescriptor exit;      ///< readable when it has exited
        FileDescriptor messages;  ///< its standard error
        std::string line{};       ///< of its messages, not yet complete
        int socket = -1;          ///< our end; the caller closes it
        bool closed = false;
        std::optional<int> status{};
    };
    [[nodiscard]] Ssh start(FileDescriptor& ours);
    /// Returns how long ssh may have waited for a password.
    [[nodiscard]] std::chrono::steady_clock::duration awaitGreeting(Ssh& ssh, Milliseconds limit);
    /// Returns true if it has exited within the limit.
    bool waitFor(Ssh& ssh, Milliseconds limit);
    void end(Ssh& ssh);
    void passMessages(Ssh& ssh);

    Options _options;
    std::vector<Ssh> _all;
    std::set<std::string> _printed;
};

}  // namespace adminhost::ctl
