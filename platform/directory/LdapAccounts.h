#pragma once

// Changes in an LDAP server by an administrator who has signed in: accounts are created, deleted and given passwords.

#include "platform/directory/LdapLookUps.h"

#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

/// One administrator's sign-in. It ends with the object, or with the request in which it began.
class LdapAccounts {
  public:
    explicit LdapAccounts(std::shared_ptr<LdapLookUps> lookUps) : _lookUps(std::move(lookUps)) {}
    LdapAccounts(const LdapAccounts&) = delete;
    LdapAccounts& operator=(const LdapAccounts&) = delete;
    ~LdapAccounts();

    /// The administrator's connection; null before the sign-in and after its end.
    [[nodiscard]] std::shared_ptr<LdapConnection> connection() const noexcept { return _signedIn.lock(); }

    /// A DN is bound as it is. Any other name is that of the one entry with this name, whatever its classes; if there
    /// is none, or several, the code is 49, as for a wrong password. An empty password is 53 without asking the server,
    /// because some servers would accept it as an anonymous bind.
    [[nodiscard]] Result<bool> signIn(std::string_view name, std::string_view password);

    /// Only users. Returns nullopt if the node does not find the entry that it has created.
    [[nodiscard]] Result<std::optional<DirectoryRecord>> create(std::string_view name,
                                                                const DirectoryAttributes& attributes);
    [[nodiscard]] Result<void> remove(std::string_view type, std::string_view name);
    [[nodiscard]] Result<void> setPassword(std::string_view type, std::string_view name, std::string_view password);

  private:
    [[nodiscard]] Result<std::string> dnOfAdministrator(std::string_view name);
    /// The DN of the only record with the name.
    [[nodiscard]] Result<std::string> dnOf(LdapConnection& connection, std::string_view type, std::string_view name);
    [[nodiscard]] Result<std::shared_ptr<LdapConnection>> needed() const;
    void end() noexcept;

    std::shared_ptr<LdapLookUps> _lookUps;
    std::weak_ptr<LdapConnection> _signedIn;
    std::shared_ptr<LdapConnection> _outsideRequest;  ///< keeps it if there is no request that does
};

}  // namespace adminhost
