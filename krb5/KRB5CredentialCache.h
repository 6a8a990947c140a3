#pragma once

#include "krb5/KRB5Credential.h"
#include "krb5/KRB5Keytab.h"
#include "krb5/KRB5Object.h"
#include "krb5/KRB5Principal.h"

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace lumio {

/// The system credential cache service. There is none on Linux: caches of this type cannot be opened.
inline constexpr const char* KRB5CredentialCacheAPIType = "API";
inline constexpr const char* KRB5CredentialCacheMemoryType = "MEMORY";
inline constexpr const char* KRB5CredentialCacheFileType = "FILE";

/// A cache of the tickets of one principal.
///
/// The typical sequence: initWithName with path, FILE and principal; acquireInitialCredentialIfNecessaryWithPassword;
/// let child processes use the cache; destroy().
///
/// Deliberately unlike the library's own functions:
/// - Listing ends the sequence only when starting it gave a cursor; the library crashes on a missing one.
/// - A cache that destroy() re-opened, and that this object has not initialised since, lists as empty with errorCode 0;
///   any other cache without a file keeps the library's KRB5_FCC_NOFILE.
/// - After a failed destroy() there is no native cache, and every operation returns null, false or an empty list.
class KRB5CredentialCache : public KRB5Object {
  public:
    /// Opens the cache and binds it to the principal. A cache that holds another principal's tickets, none at all or
    /// garbage is emptied for that. The type defaults to API. Without a name, the cache is named by the principal's
    /// text: for FILE, a file of that name below the current directory.
    /// Null on any failure, and always for API. Throws std::invalid_argument if name and principal are both null.
    [[nodiscard]] static std::unique_ptr<KRB5CredentialCache> initWithName(const std::optional<std::string>& name,
                                                                           const std::optional<std::string>& type,
                                                                           const KRB5Principal* principal,
                                                                           std::shared_ptr<KRB5Context> context);
    /// The same without a name.
    [[nodiscard]] static std::unique_ptr<KRB5CredentialCache> initWithType(const std::optional<std::string>& type,
                                                                           const KRB5Principal* principal,
                                                                           std::shared_ptr<KRB5Context> context);
    /// Opens the same cache once more; null means the library's default cache. The caller keeps the handle that it
    /// passes in. Null if the cache holds no principal.
    [[nodiscard]] static std::unique_ptr<KRB5CredentialCache> initWithNativeCredentialCache(
        krb5_ccache nativeCredentialCache, std::shared_ptr<KRB5Context> context);

    KRB5CredentialCache(KRB5CredentialCache&&) noexcept = default;

    /// Without the type: the path of a file cache.
    [[nodiscard]] std::optional<std::string> name() const;
    [[nodiscard]] std::optional<std::string> type() const;
    [[nodiscard]] std::unique_ptr<KRB5Principal> principal() const;
    /// Empties the cache unless it is bound to this principal already.
    void setPrincipal(const KRB5Principal& principal);

    /// The ticket-granting ticket of the cache's principal; null if there is none or on failure.
    [[nodiscard]] std::unique_ptr<KRB5Credential> initialCredential() const;
    /// Returns true if the principal (null: the cache's) has no ticket-granting ticket that lasts for another 600
    /// seconds. Returns false on failure, with errorCode set; that includes a ticket whose key type the library does
    /// not support.
    [[nodiscard]] bool initialCredentialAcquisitionIsNecessaryForPrincipal(const KRB5Principal* principal) const;

    /// Empties the cache, binds it to the principal (null: the cache's) and asks the KDC for a forwardable, proxiable
    /// ticket-granting ticket: with the password if there is one, else with the key of the keytab (null, or one that
    /// could not be opened: the library's default keytab). Read errorCode for the outcome; a failed request leaves an
    /// empty cache. Blocks as long as the library waits for the KDC.
    void acquireInitialCredentialWithPrincipal(const KRB5Principal* principal, const KRB5Keytab* keytab,
                                               std::optional<std::string_view> password);
    void acquireInitialCredentialWithPassword(std::string_view password);
    void acquireInitialCredentialWithKeytab(const KRB5Keytab* keytab);
    /// Acquires if necessary. Returns true if it was necessary, so if it was tried, not if it succeeded.
    bool acquireInitialCredentialIfNecessaryWithPrincipal(const KRB5Principal* principal, const KRB5Keytab* keytab,
                                                          std::optional<std::string_view> password);
    bool acquireInitialCredentialIfNecessaryWithPassword(std::string_view password);
    bool acquireInitialCredentialIfNecessaryWithKeytab(const KRB5Keytab* keytab);

    /// All credentials that can be read. errorCode is 0 after a complete listing.
    [[nodiscard]] std::vector<KRB5Credential> credentials() const;
    /// Removes the cache and re-opens it by its bare name, without the type: a memory cache becomes a file cache, and
    /// a file cache with a colon in its path cannot be re-opened.
    void destroy();

    [[nodiscard]] krb5_ccache nativeCredentialCache() const noexcept { return _nativeCredentialCache.get(); }

  private:
    explicit KRB5CredentialCache(std::shared_ptr<KRB5Context> context) noexcept;

    bool initialize(krb5_principal principal);
    /// A copy of the principal, or of the cache's if null; empty on failure, which is recorded.
    [[nodiscard]] PrincipalHandle clientFor(const KRB5Principal* principal) const;
    /// Records its status. On success the caller frees the contents of found.
    [[nodiscard]] bool findTicketGrantingTicket(krb5_const_principal client, krb5_creds& found) const;

    Handle<krb5_ccache, krb5_cc_close> _nativeCredentialCache;
    bool _reopenedByDestroy = false;
};

}  // namespace lumio
