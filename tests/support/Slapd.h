#pragma once

// A temporary OpenLDAP server on free loopback ports and a local socket, with the suffix "dc=nimbo,dc=test". Everything
// is in a new temporary directory. Needs no privileges and never reads the machine's own configuration.
//
// The account that runs the test is its administrator over the local socket; with a password it is
// "cn=admin,dc=nimbo,dc=test", "adminpw".

#include "tests/support/ServerProcess.h"

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

namespace support {

class Slapd {
  public:
    enum class Schema {
        rfc2307,     ///< groups list logins
        rfc2307bis,  ///< groups list DNs too
    };
    struct Certificates {
        std::filesystem::path authority;
        std::filesystem::path certificate;
        std::filesystem::path key;
    };
    struct Options {
        Schema schema = Schema::rfc2307;
        std::optional<Certificates> certificates;  ///< for StartTLS and ldaps
        std::string global;                        ///< further lines of slapd.conf before the database
        std::string database;                      ///< and in the database
    };

    /// Starts the server and waits until it accepts connections. On failure, throws std::runtime_error with its output.
    explicit Slapd(Options options);
    Slapd() : Slapd(Options()) {}
    Slapd(const Slapd&) = delete;
    Slapd& operator=(const Slapd&) = delete;
    /// Kills the server and removes the directory.
    ~Slapd();

    /// Adds entries in LDIF, also with operational attributes such as entryUUID. Throws std::runtime_error on failure.
    void add(std::string_view ldif) const;
    /// Changes entries: LDIF with change types.
    void modify(std::string_view ldif) const;

    /// Kills the server; its content and its ports stay.
    void stop() noexcept { _server.stop(); }
    /// Starts it again on the same ports.
    void start();

    /// By number: libldap compares a certificate with the machine's own name if the address is "localhost".
    [[nodiscard]] std::string uri() const { return "ldap://127.0.0.1:" + std::to_string(_port); }
    [[nodiscard]] std::string secureUri() const { return "ldaps://127.0.0.1:" + std::to_string(_securePort); }
    /// By name, as Kerberos needs it.
    [[nodiscard]] std::string namedUri() const { return "ldap://localhost:" + std::to_string(_port); }
    [[nodiscard]] std::string localUri() const;
    [[nodiscard]] int port() const noexcept { return _port; }
    [[nodiscard]] const std::filesystem::path& directory() const noexcept { return _directory; }
    [[nodiscard]] pid_t pid() const noexcept { return _server.pid(); }

    static constexpr std::string_view suffix = "dc=nimbo,dc=test";

  private:
    void configure() const;
    [[nodiscard]] bool tryToStart();
    void apply(const char* tool, std::string_view ldif) const;

    Options _options;
    std::filesystem::path _directory;
    int _port = 0;
    int _securePort = 0;
    ServerProcess _server;
};

}  // namespace support
