#include "krb5/KRB5CredentialCache.h"

#include "krb5/LibraryText.h"

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <stdexcept>
#include <utility>

namespace lumio {
namespace {

/// A ticket that ends sooner than this is replaced.
constexpr std::uint32_t minimumSecondsLeft = 600;

/// A credentials record on the stack; frees its contents.
class CredentialContents {
  public:
    explicit CredentialContents(krb5_context context) noexcept : _context(context) {}
    CredentialContents(const CredentialContents&) = delete;
    CredentialContents& operator=(const CredentialContents&) = delete;
    ~CredentialContents() { krb5_free_cred_contents(_context, &_contents); }

    [[nodiscard]] krb5_creds& operator*() noexcept { return _contents; }
    [[nodiscard]] krb5_creds* operator->() noexcept { return &_contents; }

  private:
    krb5_context _context;
    krb5_creds _contents{};
};

/// The one copy of a password that the library needs for its terminator; wiped by the destructor.
class TerminatedPassword {
  public:
    explicit TerminatedPassword(std::string_view password) : _bytes(password.size() + 1, '\0') {
        std::ranges::copy(password, _bytes.begin());
    }
    TerminatedPassword(const TerminatedPassword&) = delete;
    TerminatedPassword& operator=(const TerminatedPassword&) = delete;
    ~TerminatedPassword() { explicit_bzero(_bytes.data(), _bytes.size()); }

    [[nodiscard]] const char* get() const noexcept { return _bytes.data(); }

  private:
    std::vector<char> _bytes;
};

}  // namespace

KRB5CredentialCache::KRB5CredentialCache(std::shared_ptr<KRB5Context> context) noexcept
    : KRB5Object(std::move(context)), _nativeCredentialCache(nativeContext()) {}

std::unique_ptr<KRB5CredentialCache> KRB5CredentialCache::initWithName(const std::optional<std::string>& name,
                                                                       const std::optional<std::string>& type,
                                                                       const KRB5Principal* principal,
                                                                       std::shared_ptr<KRB5Context> context) {
    if (!name && principal == nullptr) {
        throw std::invalid_argument("at least one of name and principal must be set");
    }
    const std::string cacheType = type.value_or(KRB5CredentialCacheAPIType);
    // This system has no credential cache service to search, or to create a cache in.
    if (cacheType == KRB5CredentialCacheAPIType) {
        return nullptr;
    }
    std::unique_ptr<KRB5CredentialCache> cache(new KRB5CredentialCache(std::move(context)));
    const auto cacheName = name ? name : principal->stringValue();
    if (cache->nativeContext() == nullptr || !cacheName) {
        return nullptr;
    }
    const std::string fullName = cacheType + ":" + *cacheName;
    if (hasNul(fullName) || !cache->record(krb5_cc_resolve(cache->nativeContext(), fullName.c_str(),
                                                           cache->_nativeCredentialCache.receive()))) {
        return nullptr;
    }
    if (principal != nullptr) {
        cache->setPrincipal(*principal);
    }
    if (cache->nativeCredentialCache() == nullptr || cache->errorCode() != 0) {
        return nullptr;
    }
    return cache;
}

std::unique_ptr<KRB5CredentialCache> KRB5CredentialCache::initWithType(const std::optional<std::string>& type,
                                                                       const KRB5Principal* principal,
                                                                       std::shared_ptr<KRB5Context> context) {
    return initWithName(std::nullopt, type, principal, std::move(context));
}

std::unique_ptr<KRB5CredentialCache> KRB5CredentialCache::initWithNativeCredentialCache(
    krb5_ccache nativeCredentialCache, std::shared_ptr<KRB5Context> context) {
    krb5_context native = context ? context->nativeContext() : nullptr;
    if (native == nullptr) {
        return nullptr;
    }
    Handle<krb5_ccache, krb5_cc_close> defaultCache(native);
    krb5_ccache source = nativeCredentialCache;
    if (source == nullptr) {
        if (krb5_cc_default(native, defaultCache.receive()) != 0) {
            return nullptr;
        }
        source = defaultCache.get();
    }
    const char* name = krb5_cc_get_name(native, source);
    const char* type = krb5_cc_get_type(native, source);
    PrincipalHandle bound(native);
    if (name == nullptr || type == nullptr || krb5_cc_get_principal(native, source, bound.receive()) != 0) {
        return nullptr;
    }
    const auto principal = KRB5Principal::principalWithNativePrincipal(bound.get(), context);
    return principal ? initWithName(name, type, principal.get(), std::move(context)) : nullptr;
}

std::optional<std::string> KRB5CredentialCache::name() const {
    const char* name =
        nativeCredentialCache() != nullptr ? krb5_cc_get_name(nativeContext(), nativeCredentialCache()) : nullptr;
    return name != nullptr ? std::optional<std::string>(name) : std::nullopt;
}

std::optional<std::string> KRB5CredentialCache::type() const {
    const char* type =
        nativeCredentialCache() != nullptr ? krb5_cc_get_type(nativeContext(), nativeCredentialCache()) : nullptr;
    return type != nullptr ? std::optional<std::string>(type) : std::nullopt;
}

std::unique_ptr<KRB5Principal> KRB5CredentialCache::principal() const {
    if (nativeCredentialCache() == nullptr) {
        return nullptr;
    }
    PrincipalHandle bound(nativeContext());
    if (!record(krb5_cc_get_principal(nativeContext(), nativeCredentialCache(), bound.receive()))) {
        return nullptr;
    }
    return KRB5Principal::principalWithNativePrincipal(bound.get(), context());
}

bool KRB5CredentialCache::initialize(krb5_principal principal) {
    if (!record(krb5_cc_initialize(nativeContext(), nativeCredentialCache(), principal))) {
        return false;
    }
    _reopenedByDestroy = false;
    return true;
}

void KRB5CredentialCache::setPrincipal(const KRB5Principal& principal) {
    if (nativeCredentialCache() == nullptr) {
        return;
    }
    // The library crashes if it compares or initialises with a null principal.
    if (principal.nativePrincipal() == nullptr) {
        record(EINVAL);
        return;
    }
    PrincipalHandle bound(nativeContext());
    if (record(krb5_cc_get_principal(nativeContext(), nativeCredentialCache(), bound.receive())) &&
        krb5_principal_compare(nativeContext(), bound.get(), principal.nativePrincipal()) != 0) {
        return;
    }
    // Whatever the reason: no cache yet, another principal, or contents that cannot be read.
    initialize(principal.nativePrincipal());
}

PrincipalHandle KRB5CredentialCache::clientFor(const KRB5Principal* principal) const {
    PrincipalHandle client(nativeContext());
    if (principal == nullptr) {
        record(krb5_cc_get_principal(nativeContext(), nativeCredentialCache(), client.receive()));
    } else if (principal->nativePrincipal() == nullptr) {
        record(EINVAL);  // the library crashes copying it
    } else {
        record(krb5_copy_principal(nativeContext(), principal->nativePrincipal(), client.receive()));
    }
    return client;
}

bool KRB5CredentialCache::findTicketGrantingTicket(krb5_const_principal client, krb5_creds& found) const {
    CredentialContents match(nativeContext());
    const krb5_data& realm = client->realm;
    return record(krb5_copy_principal(nativeContext(), client, &match->client)) &&
           record(krb5_build_principal_ext(nativeContext(), &match->server, realm.length, realm.data,
                                           static_cast<unsigned int>(KRB5_TGS_NAME_SIZE), KRB5_TGS_NAME, realm.length,
                                           realm.data, 0)) &&
           record(krb5_cc_retrieve_cred(nativeContext(), nativeCredentialCache(), KRB5_TC_SUPPORTED_KTYPES, &*match,
                                        &found));
}

std::unique_ptr<KRB5Credential> KRB5CredentialCache::initialCredential() const {
    if (nativeCredentialCache() == nullptr) {
        return nullptr;
    }
    const PrincipalHandle client = clientFor(nullptr);
    CredentialContents found(nativeContext());
    if (client.get() == nullptr || !findTicketGrantingTicket(client.get(), *found)) {
        return nullptr;
    }
    return KRB5Credential::initWithNativeCredential(&*found, context());
}

bool KRB5CredentialCache::initialCredentialAcquisitionIsNecessaryForPrincipal(const KRB5Principal* principal) const {
    if (nativeCredentialCache() == nullptr) {
        return false;
    }
    const PrincipalHandle client = clientFor(principal);
    if (client.get() == nullptr) {
        return false;
    }
    CredentialContents found(nativeContext());
    if (!findTicketGrantingTicket(client.get(), *found)) {
        if (errorCode() == KRB5_CC_NOTFOUND || errorCode() == KRB5_FCC_NOFILE) {
            record(0);
            return true;
        }
        return false;
    }
    krb5_timestamp now = 0;
    if (!record(krb5_timeofday(nativeContext(), &now))) {
        return false;
    }
    // Signed 32 bits like the library's times; the sum wraps as they do.
    return static_cast<std::int32_t>(static_cast<std::uint32_t>(now) + minimumSecondsLeft) > found->times.endtime;
}

void KRB5CredentialCache::acquireInitialCredentialWithPrincipal(const KRB5Principal* principal,
                                                                const KRB5Keytab* keytab,
                                                                std::optional<std::string_view> password) {
    if (nativeCredentialCache() == nullptr) {
        return;
    }
    const PrincipalHandle client = clientFor(principal);
    // Emptied before the request, so that a failed one never leaves a former ticket behind.
    if (client.get() == nullptr || !initialize(client.get())) {
        return;
    }
    krb5_get_init_creds_opt options;
    krb5_get_init_creds_opt_init(&options);
    krb5_get_init_creds_opt_set_forwardable(&options, 1);
    krb5_get_init_creds_opt_set_proxiable(&options, 1);

    CredentialContents acquired(nativeContext());
    if (password && hasNul(*password)) {
        record(EINVAL);  // the library would try the part before the NUL
    } else if (password) {
        const TerminatedPassword terminated(*password);
        record(krb5_get_init_creds_password(nativeContext(), &*acquired, client.get(), terminated.get(), nullptr,
                                            nullptr, 0, nullptr, &options));
    } else {
        record(krb5_get_init_creds_keytab(nativeContext(), &*acquired, client.get(),
                                          keytab != nullptr ? keytab->nativeKeytab() : nullptr, 0, nullptr, &options));
    }
    if (errorCode() == 0) {
        // Not recorded: errorCode is the outcome of the request. If the ticket could not be stored, the cache shows
        // that acquisition is still necessary.
        static_cast<void>(krb5_cc_store_cred(nativeContext(), nativeCredentialCache(), &*acquired));
    }
}

void KRB5CredentialCache::acquireInitialCredentialWithPassword(std::string_view password) {
    acquireInitialCredentialWithPrincipal(principal().get(), nullptr, password);
}

void KRB5CredentialCache::acquireInitialCredentialWithKeytab(const KRB5Keytab* keytab) {
    acquireInitialCredentialWithPrincipal(principal().get(), keytab, std::nullopt);
}

bool KRB5CredentialCache::acquireInitialCredentialIfNecessaryWithPrincipal(const KRB5Principal* principal,
                                                                           const KRB5Keytab* keytab,
                                                                           std::optional<std::string_view> password) {
    const bool necessary = initialCredentialAcquisitionIsNecessaryForPrincipal(principal);
    if (necessary) {
        acquireInitialCredentialWithPrincipal(principal, keytab, password);
    }
    return necessary;
}

bool KRB5CredentialCache::acquireInitialCredentialIfNecessaryWithPassword(std::string_view password) {
    return acquireInitialCredentialIfNecessaryWithPrincipal(principal().get(), nullptr, password);
}

bool KRB5CredentialCache::acquireInitialCredentialIfNecessaryWithKeytab(const KRB5Keytab* keytab) {
    return acquireInitialCredentialIfNecessaryWithPrincipal(principal().get(), keytab, std::nullopt);
}

std::vector<KRB5Credential> KRB5CredentialCache::credentials() const {
    std::vector<KRB5Credential> credentials;
    if (nativeCredentialCache() == nullptr) {
        return credentials;
    }
    krb5_cc_cursor cursor = nullptr;
    if (!record(krb5_cc_start_seq_get(nativeContext(), nativeCredentialCache(), &cursor)) && _reopenedByDestroy &&
        errorCode() == KRB5_FCC_NOFILE) {
        record(0);  // a cache that was destroyed here is empty, not in error
    } else if (errorCode() == 0) {
        bool more = true;
        while (more) {
            CredentialContents native(nativeContext());
            more = record(krb5_cc_next_cred(nativeContext(), nativeCredentialCache(), &cursor, &*native));
            if (more) {
                auto credential = KRB5Credential::initWithNativeCredential(&*native, context());
                if (credential->nativeCredential() != nullptr) {
                    credentials.push_back(std::move(*credential));
                }
            }
        }
        if (errorCode() == KRB5_CC_END) {
            record(0);
        }
    }
    if (cursor != nullptr) {
        static_cast<void>(krb5_cc_end_seq_get(nativeContext(), nativeCredentialCache(), &cursor));
    }
    return credentials;
}

void KRB5CredentialCache::destroy() {
    const auto bareName = name();
    if (!bareName) {
        return;
    }
    // The library frees the handle even when it fails.
    if (!record(krb5_cc_destroy(nativeContext(), _nativeCredentialCache.release()))) {
        return;
    }
    record(krb5_cc_resolve(nativeContext(), bareName->c_str(), _nativeCredentialCache.receive()));
    if (errorCode() == 0 && nativeCredentialCache() == nullptr) {
        record(KRB5KRB_ERR_GENERIC);
    }
    _reopenedByDestroy = nativeCredentialCache() != nullptr;
}

}  // namespace lumio
