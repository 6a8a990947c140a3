#pragma once

// A throw-away Kerberos realm: database, KDC on a free loopback port, client configuration. Everything lies in a new
// temporary directory. Needs no privileges and never reads the machine's own configuration.

#include "tests/support/Environment.h"

#include <filesystem>
#include <string>
#include <string_view>

#include <sys/types.h>

namespace support {

class Kdc {
  public:
    /// Creates the realm and waits until its KDC accepts connections. Throws std::runtime_error with what the tools
    /// said on failure.
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
    /// What clients of the realm need in their environment: all KRB5 variables, caches and keytabs below the directory.
    [[nodiscard]] ScopedEnvironment::Changes environment() const;
    /// A client configuration for the realm, with its KDC at that loopback port and further lines in [libdefaults].
    [[nodiscard]] static std::string clientConfiguration(const std::string& realm, int port,
                                                         const std::string& libdefaults = {});

  private:
    void createDatabase() const;
    /// Answers whether the KDC serves; it does not if another program took the port meanwhile.
    [[nodiscard]] bool start(int port);
    void stop() noexcept;

    std::string _realm;
    std::filesystem::path _directory;
    pid_t _pid = 0;
};

}  // namespace support
