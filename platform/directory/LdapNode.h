#pragma once

// A directory node in an LDAP server.
//
// The node connects at its first query. All nodes opened from one source share one connection for look-ups, which is
// kept between requests and opened again once if the server went away. What a request may wait for, and what is kept
// for it, is in DirectoryRequest.h. Errors have the domain directory::ldapErrorDomain, LDAP's result code and the
// library's words. libldap's own files and environment variables are not used.
//
// A query without `maximum` fails if the server returns only a part (size limit). A referral is an error (code 10);
// continuation references are ignored, and aliases are not dereferenced.

#include "platform/directory/Directory.h"
#include "platform/files/Path.h"
#include "platform/framework/Export.h"
#include "platform/value/Result.h"

#include <chrono>
#include <map>
#include <optional>
#include <string>
#include <vector>

namespace adminhost {

struct ADMINHOST_EXPORT LdapNodeSettings {
    enum class Sasl { none, external, gssapi };
    enum class Verify { demand, never };
    enum class Schema { rfc2307, rfc2307bis, ad };
    enum class UuidForm {
        text,    ///< 36 characters
        binary,  ///< 16 bytes in the order of the text
        guid,    ///< 16 bytes, the first three fields little-endian
    };

    std::string name;
    std::vector<std::string> uris;  ///< ldap://, ldaps:// or ldapi://; tried in order
    std::string base;
    std::string userBase;     ///< empty: base
    std::string groupBase;    ///< empty: base
    std::string userFilter;   ///< RFC 4515; empty: by schema
    std::string groupFilter;  ///< RFC 4515; empty: by schema

    std::string bindDn;
    // At most one of the two. Both are read at each connect; one line end at the end is not part of the password.
    std::optional<HostPath> bindPasswordFile;      ///< must not be accessible to group or others
    std::string bindPasswordCredential;            ///< a file's name in the directory of credentials
    std::optional<DiskPath> credentialsDirectory;  ///< the service manager's, from the environment at the start

    Sasl sasl = Sasl::none;
    std::optional<HostPath> certFile;  ///< the client's certificate and key, PEM
    std::optional<HostPath> keyFile;
    std::optional<HostPath> keytab;  ///< needed for gssapi
    std::string principal;           ///< the client's; empty: the first one in the keytab

    bool startTls = false;
    std::optional<HostPath> caFile;  ///< PEM; without one, the system's certificates
    Verify verify = Verify::demand;

    Schema schema = Schema::rfc2307;
    std::optional<UuidForm> uuidForm;  ///< nullopt: by schema
    std::string kerberosRealm;         ///< the realm of accounts whose entry has no principal; empty: they have none
    // From RecordName, RealName, GeneratedUID, UniqueID, PrimaryGroupID, NFSHomeDirectory, UserShell, GroupMembership,
    // AuthenticationAuthority, KerberosPrincipal to the LDAP attribute, in place of the schema's.
    std::map<std::string, std::string> userMap;
    std::map<std::string, std::string> groupMap;
    std::chrono::seconds timeout{5};  ///< for each connect and each operation

    // Creation of accounts.
    std::string createBase;  ///< empty: userBase
    std::vector<std::string> objectClasses{"account", "posixAccount"};
    std::map<std::string, std::vector<std::string>> createAttributes;  ///< in values, %u is the account's name

    bool operator==(const LdapNodeSettings&) const = default;
};

/// Returns why the settings cannot be used: a filter, URI, DN or attribute that is malformed, or settings that exclude
/// each other. The description begins with the configuration's key. No file is read and no server asked.
[[nodiscard]] ADMINHOST_EXPORT Result<void> checkLdapNodeSettings(const LdapNodeSettings& settings);

/// The source of the node. The settings must have passed the check.
[[nodiscard]] ADMINHOST_EXPORT DirectoryNodeSource ldapNode(LdapNodeSettings settings);

}  // namespace adminhost
