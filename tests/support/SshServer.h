#pragma once

// A temporary SSH server on a free loopback port, and the user's side of it: a configuration of ssh that knows the
// server as the host "studio", with a key of its own. Everything is in a new temporary directory, except for /run/sshd,
// which the server needs as root: it is created if it is missing, and removed again. The login is that of the account
// that runs the test, without a password. Another account than root needs user and mount namespaces, in which it gets a
// shell (the account "nobody" has none).
//
// ssh finds the user's files by the account, not by HOME. So toolDirectory() has an "ssh" that runs the real one with
// the configuration of this directory, and records its calls. It belongs at the beginning of PATH.

#include "tests/support/ServerProcess.h"

#include <filesystem>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace support {

class SshServer {
  public:
    /// Starts the server and waits until it accepts connections. On failure, throws std::runtime_error with its output.
    SshServer();
    SshServer(const SshServer&) = delete;
    SshServer& operator=(const SshServer&) = delete;
    /// Kills the server with its sessions, and removes the directory.
    ~SshServer();

    static constexpr std::string_view host = "studio";

    [[nodiscard]] std::filesystem::path toolDirectory() const { return _directory / "tools"; }
    /// Installs a shell script as a program of the server's machine. A login finds it before the programs of the
    /// system.
    void installThere(const std::string& name, const std::string& script) const;
    /// Removes a program from the server's machine.
    void removeThere(const std::string& name) const { std::filesystem::remove(_directory / "there" / name); }

    /// Each call of ssh: its arguments, joined by blanks.
    [[nodiscard]] std::vector<std::string> calls() const;
    /// What standard input was in each call of ssh ("socket:[123]").
    [[nodiscard]] std::vector<std::string> inputs() const;

    /// Adds lines to the user's configuration of this host.
    void configure(const std::string& lines) const;
    /// From now on the user does not know the server's key.
    void forgetHostKey() const { writeFile(_directory / "known_hosts", ""); }
    /// From now on the server does not know the user's key.
    void forgetUserKey() const { writeFile(_directory / "authorized_keys", ""); }
    /// From now on the server knows the user's key again.
    void knowUserKey() const { writeFile(_directory / "authorized_keys", contentsOf(_directory / "user_key.pub")); }
    /// Encrypts the user's key.
    void setPassphrase(const std::string& passphrase) const;

    /// Kills the server's processes of all sessions, so that their connections break.
    void breakSessions() const;
    /// Kills the server with its sessions; its port stays.
    void stop();
    /// Starts it again on the same port.
    void start();
    /// What the server has logged.
    [[nodiscard]] std::string log() const { return contentsOf(_directory / "sshd.out"); }

  private:
    class RunDirectory;
    void prepare() const;
    [[nodiscard]] bool tryToStart();

    std::filesystem::path _directory;
    std::unique_ptr<RunDirectory> _runDirectory;
    int _port = 0;
    ServerProcess _server;
};

}  // namespace support
