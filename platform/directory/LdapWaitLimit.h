#pragma once

// A bound on every wait of a connection, also where the library itself would wait for ever: in a TLS handshake, or for
// the second half of a message.

#include <chrono>

#include <ldap.h>

namespace adminhost {

class LdapWaitLimit {
  public:
    using Clock = std::chrono::steady_clock;

    LdapWaitLimit() = default;
    LdapWaitLimit(const LdapWaitLimit&) = delete;
    LdapWaitLimit& operator=(const LdapWaitLimit&) = delete;
    ~LdapWaitLimit() = default;

    /// Reading and writing fail from this moment on.
    void set(Clock::time_point end) noexcept { _end = end; }
    [[nodiscard]] Clock::time_point end() const noexcept { return _end; }

    /// Applies to all sockets that the handle connects. The object must exist longer than the handle.
    void applyTo(LDAP* handle) noexcept;

  private:
    Clock::time_point _end = Clock::time_point::max();
    ldap_conncb _whenConnected{};
};

}  // namespace adminhost
