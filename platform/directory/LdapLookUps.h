#pragma once

// The look-ups of all LDAP nodes that were opened from one source: they share settings and one connection.

#include "platform/directory/LdapConnection.h"
#include "platform/directory/LdapMapping.h"

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace adminhost {

class LdapLookUps {
  public:
    explicit LdapLookUps(LdapNodeSettings settings) : _settings(std::move(settings)), _mapping(_settings) {}

    [[nodiscard]] const LdapNodeSettings& settings() const noexcept { return _settings; }
    [[nodiscard]] const LdapMapping& mapping() const noexcept { return _mapping; }

    [[nodiscard]] Result<std::vector<DirectoryRecord>> records(const DirectoryQuery& query);
    [[nodiscard]] Result<void> reach(std::chrono::milliseconds limit);
    /// A connection of its own on which this user has signed in.
    [[nodiscard]] Result<std::unique_ptr<LdapConnection>> signIn(const LdapSignIn& user);

    /// Runs reading work on the connection, which is opened if there is none. If the server went away since the last
    /// work, opens it again and runs the work once more. A failure to reach the server counts for the whole request.
    template <class T>
    [[nodiscard]] Result<T> run(const std::function<Result<T>(LdapConnection&)>& work) {
        const bool wasOpen = _kept != nullptr;
        if (auto opened = open(); !opened) {
            return failure(opened.error());
        }
        Result<T> result = work(*_kept);
        if (!result && wasOpen && wentAway(result.error())) {
            _kept.reset();
            if (auto opened = open(); !opened) {
                return failure(opened.error());
            }
            result = work(*_kept);
        }
        if (!result) {
            note(result.error());
        }
        return result;
    }

  private:
    using Clock = LdapConnection::Clock;

    [[nodiscard]] Result<void> open(Clock::time_point end = Clock::time_point::max());
    [[nodiscard]] static bool wentAway(const Error& error) noexcept;
    /// Closes the connection after an error that makes it unusable.
    void note(const Error& error);

    LdapNodeSettings _settings;
    LdapMapping _mapping;
    KerberosCredential _credential;
    std::unique_ptr<LdapConnection> _kept;
};

}  // namespace adminhost
