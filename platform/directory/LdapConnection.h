#pragma once

// One connection to an LDAP server, and the operations on it.
//
// Every wait is bounded by the settings' time-out and by directoryDeadline(). After an error for which isUnreachable()
// holds the connection must not be used again: the library might connect anew, without TLS and signing in.

#include "platform/directory/LdapKerberos.h"
#include "platform/directory/LdapLibrary.h"
#include "platform/directory/LdapNode.h"
#include "platform/directory/LdapWaitLimit.h"
#include "platform/value/Result.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace adminhost {

struct LdapEntry {
    std::string dn;
    std::vector<std::pair<std::string, std::vector<std::string>>> attributes;  ///< with their options

    /// The values of an attribute, whose name is compared without regard to case; null if the entry lacks it.
    [[nodiscard]] const std::vector<std::string>* values(std::string_view attribute) const noexcept;
};

struct LdapSearch {
    std::string base;
    int scope = LDAP_SCOPE_SUBTREE;
    std::string filter;
    std::vector<std::string> attributes;
    std::size_t pageSize = 0;  ///< 0: not paged
};

/// Receives the entries of a search; returns false to end it, which is a success.
using LdapEntrySink = std::function<bool(LdapEntry entry)>;

struct LdapSignIn {
    std::string dn;
    std::string password;
};

class LdapConnection {
  public:
    using Clock = std::chrono::steady_clock;

    /// Tries the servers in order, until the end, and binds: as the user if there is one, else as the settings state.
    /// A server that refuses to bind is the last one tried; one that refuses TLS is not. With a sign-in, a server to
    /// which the password would go in clear text is refused (code 13) before anything is sent to it.
    [[nodiscard]] static Result<std::unique_ptr<LdapConnection>> open(const LdapNodeSettings& settings,
                                                                      KerberosCredential& credential,
                                                                      const LdapSignIn* signIn, Clock::time_point end);

    /// More than the bounds (LdapSearchBounds.h), and pages without an end, are failures.
    [[nodiscard]] Result<void> search(const LdapSearch& search, const LdapEntrySink& sink);
    /// Two searches that are not paged, sent at once. The sinks receive all entries.
    [[nodiscard]] Result<void> searchBoth(const LdapSearch& first, const LdapEntrySink& firstSink,
                                          const LdapSearch& second, const LdapEntrySink& secondSink);

    [[nodiscard]] Result<void> add(const std::string& dn,
                                   const std::map<std::string, std::vector<std::string>>& values);
    [[nodiscard]] Result<void> remove(const std::string& dn);
    /// The password-modify operation (RFC 3062). Refused (code 13) if the password would go in clear text.
    [[nodiscard]] Result<void> setPassword(const std::string& dn, std::string_view password);

  private:
    /// What a search has brought so far.
    struct Collected {
        std::size_t entries = 0;
        std::size_t bytes = 0;
    };

    LdapConnection(const LdapNodeSettings& settings, std::string uri) : _settings(settings), _uri(std::move(uri)) {}

    [[nodiscard]] Result<void> connect();
    [[nodiscard]] Result<void> useCertificates();
    /// Replaces the error of a failed connect by a reason why the server's certificate is not trusted, if there is one.
    void explain(Error& error) const;
    [[nodiscard]] Result<void> bind(KerberosCredential& credential, const LdapSignIn* signIn);
    [[nodiscard]] Result<void> bindSimple(const std::string& dn, std::string_view password);
    [[nodiscard]] Result<void> bindExternal();
    [[nodiscard]] Result<void> bindKerberos(KerberosCredential& credential);

    [[nodiscard]] std::string what(std::string_view action) const;
    /// True if nobody on the way can read what is sent: TLS, or a local socket.
    [[nodiscard]] bool isProtected() const noexcept;
    /// When the operation that begins now must have ended. No wait lasts longer.
    Clock::time_point beginOperation() noexcept;
    /// The next message of the operation, or all of them.
    [[nodiscard]] Result<LdapMessage> receive(int id, int all, Clock::time_point end, std::string_view action);
    /// Waits for the result of an operation whose sending returned the status.
    [[nodiscard]] Result<void> finish(int status, int id, Clock::time_point end, std::string_view action);
    [[nodiscard]] Result<int> send(const LdapSearch& search, const std::string& cookie);
    /// Receives the entries of one search or page; the cookie of the next page, empty after the last. Nullopt if the
    /// sink ended it.
    [[nodiscard]] Result<std::optional<std::string>> collect(int id, const LdapEntrySink& sink, Collected& collected);
    [[nodiscard]] tl::unexpected<Error> tooMuch() const;
    [[nodiscard]] LdapEntry entryOf(LDAPMessage* message);

    LdapNodeSettings _settings;
    std::string _uri;
    Clock::time_point _openEnd = Clock::time_point::max();  ///< while it is being opened
    LdapWaitLimit _waitLimit;
    LdapHandle _handle;
};

}  // namespace adminhost
