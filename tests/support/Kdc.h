#pragma once

// A temporary Kerberos realm: database, KDC on a free loopback port, client configuration. Everything is in a new
// temporary directory. Needs no privileges and never reads the machine's own configuration.

#include "tests/support/Environment.h"
#include "tests/support/ServerProcess.h"

#include <filesystem>
#include <string>
#include <string_view>

namespace support {

class Kdc {
  public:
    /// Creates the realm and waits until its KDC accepts connections. On failure, throws std::runtime_error with the
    /// output of the tools.
    explicit Kdc(std::string realm = "NIMBO.TEST");
    Kdc(const Kdc&) = delete;
    Kdc& operator=(const Kdc&) = delete;
    /// Kills the KDC and removes the directory.
    ~Kdc();

    /// Runs commands of kadmin.local(8), one a line ("addprinc -pw secret alice", "ktadd -k FILE host/x"). Throws
    /// std::runtime_error if one failed.
    void admin(std::string_view commands) const;

    [[nodiscard]] const std::string& realm() const noexcept { return _realm; }
    [[nodiscard]] const std::filesystem::path& directory() const noexcept { return _directory; }
    /// The client configuration file, to be named by KRB5_CONFIG.
    [[nodiscard]] std::filesystem::path configuration() const { return _directory / "krb5.conf"; }
    /// The environment for clients of the realm: all KRB5 variables, with caches and keytabs below the directory.
    [[nodiscard]] ScopedEnvironment::Changes environment() const;
    /// A client configuration for the realm, with its KDC at that loopback port and further lines in [libdefaults].
    [[nodiscard]] static std::string clientConfiguration(const std::string& realm, int port,
                                                         const std::string& libdefaults = {});

  private:
    void createDatabase() const;
    /// Returns true if the KDC serves. It does not if another program has got the port in the meantime.
    [[nodiscard]] bool start(int port);

    std::string _realm;
    std::filesystem::path _directory;
    ServerProcess _server;
};

}  // namespace support
