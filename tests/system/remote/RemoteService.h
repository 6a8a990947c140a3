#pragma once

// The sample service on the "other" machine: this build's daemon is reached through a real SSH server on loopback.

#include "tests/support/SshServer.h"
#include "tests/system/apply/ControlledService.h"

#include <string>
#include <vector>

namespace adminhost::test {

class RemoteService : public ControlledService {
  protected:
    RemoteService() { installCommandLine(); }

    void installCommandLine(const std::string& before = {}) const {
        server.installThere("adminhostctl",
                            before + "ADMINHOST_SOCKET='" + daemon.socket() + "' exec '" + program() + "' \"$@\"\n");
    }
    /// The command line with --host, and without a terminal that ssh could ask on.
    [[nodiscard]] std::vector<std::string> remoteCommand(std::vector<std::string> words) const {
        words.insert(words.begin(), {"/usr/bin/setsid", "--wait", "/usr/bin/env", "-u", "ADMINHOST_SOCKET",
                                     "PATH=" + server.toolDirectory().string() + ":/usr/bin:/bin", program(), "--host",
                                     std::string(support::SshServer::host)});
        return words;
    }
    /// Output and messages together.
    [[nodiscard]] ProgramResult remote(const std::vector<std::string>& words, const std::string& input = {}) const {
        return runProgram(remoteCommand(words), Errors::merge, input);
    }
    [[nodiscard]] static std::string program() { return std::string(BINARY_DIR) + "/bin/adminhostctl"; }

    support::SshServer server;
};

}  // namespace adminhost::test
