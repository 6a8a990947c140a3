#include "platform/directory/LdapKerberos.h"

#include "platform/directory/Directory.h"

#include <cstdint>
#include <ctime>
#include <optional>

#include <fmt/format.h>
#include <gssapi/gssapi_krb5.h>
#include <krb5.h>
#include <ldap.h>

namespace adminhost {
namespace {

constexpr krb5_timestamp renewedBefore = 600;  ///< seconds

/// Seconds until then. Kerberos' times are 32 bits wide and wrap around in 2038; their differences stay right.
krb5_timestamp secondsUntil(krb5_timestamp end) noexcept {
    return static_cast<krb5_timestamp>(static_cast<std::uint32_t>(end) -
                                       static_cast<std::uint32_t>(std::time(nullptr)));
}

struct FreeContext {
    void operator()(krb5_context context) const noexcept { ::krb5_free_context(context); }
};
using Context = std::unique_ptr<_krb5_context, FreeContext>;

Context newContext() {
    krb5_context context = nullptr;
    return ::krb5_init_context(&context) == 0 ? Context(context) : Context();
}

}  // namespace

/// Everything that belongs to one ticket; its parts are released in the order that the library needs.
struct KerberosCredential::State {
    Context context = newContext();
    krb5_keytab keytab = nullptr;
    krb5_principal principal = nullptr;
    krb5_ccache cache = nullptr;
    gss_cred_id_t credential = GSS_C_NO_CREDENTIAL;
    krb5_timestamp end = 0;
    std::string keytabName;
    std::string principalName;

    State() = default;
    State(const State&) = delete;
    State& operator=(const State&) = delete;
    ~State() {
        OM_uint32 minor = 0;
        if (credential != GSS_C_NO_CREDENTIAL) {
            ::gss_release_cred(&minor, &credential);
        }
        if (cache != nullptr) {
            ::krb5_cc_destroy(context.get(), cache);
        }
        if (principal != nullptr) {
            ::krb5_free_principal(context.get(), principal);
        }
        if (keytab != nullptr) {
            ::krb5_kt_close(context.get(), keytab);
        }
    }

    [[nodiscard]] std::optional<Error> failed(krb5_error_code code, const char* action) const {
        if (code == 0) {
            return std::nullopt;
        }
        const char* words = ::krb5_get_error_message(context.get(), code);
        // LDAP has no codes for Kerberos; its library reports a failure on this side in this way.
        Error error{directory::ldapErrorDomain, LDAP_LOCAL_ERROR,
                    fmt::format("{}: {}", action, words == nullptr ? "unknown Kerberos error" : words)};
        ::krb5_free_error_message(context.get(), words);
        return error;
    }

    [[nodiscard]] krb5_error_code findPrincipal() {
        if (!principalName.empty()) {
            return ::krb5_parse_name(context.get(), principalName.c_str(), &principal);
        }
        krb5_kt_cursor cursor = nullptr;
        if (const krb5_error_code code = ::krb5_kt_start_seq_get(context.get(), keytab, &cursor); code != 0) {
            return code;
        }
        krb5_keytab_entry entry{};
        krb5_error_code code = ::krb5_kt_next_entry(context.get(), keytab, &entry, &cursor);
        if (code == 0) {
            code = ::krb5_copy_principal(context.get(), entry.principal, &principal);
            ::krb5_free_keytab_entry_contents(context.get(), &entry);
        }
        ::krb5_kt_end_seq_get(context.get(), keytab, &cursor);
        return code;
    }

    [[nodiscard]] krb5_error_code obtainTicket() {
        krb5_creds creds{};
        krb5_error_code code =
            ::krb5_get_init_creds_keytab(context.get(), &creds, principal, keytab, 0, nullptr, nullptr);
        if (code != 0) {
            return code;
        }
        end = creds.times.endtime;
        code = ::krb5_cc_new_unique(context.get(), "MEMORY", nullptr, &cache);
        if (code == 0) {
            code = ::krb5_cc_initialize(context.get(), cache, creds.client);
        }
        if (code == 0) {
            code = ::krb5_cc_store_cred(context.get(), cache, &creds);
        }
        ::krb5_free_cred_contents(context.get(), &creds);
        return code;
    }

    [[nodiscard]] Result<void> obtain(const std::string& keytabFile) {
        if (!context) {
            return failure({directory::ldapErrorDomain, LDAP_LOCAL_ERROR, "Kerberos' configuration cannot be read"});
        }
        if (const auto error = failed(::krb5_kt_resolve(context.get(), keytabName.c_str(), &keytab), "keytab")) {
            return failure(*error);
        }
        if (const auto error = failed(findPrincipal(), keytabFile.c_str())) {
            return failure(*error);
        }
        if (const auto error = failed(obtainTicket(), "no Kerberos ticket")) {
            return failure(*error);
        }
        OM_uint32 minor = 0;
        const OM_uint32 major = ::gss_krb5_import_cred(&minor, cache, nullptr, nullptr, &credential);
        if (GSS_ERROR(major)) {
            return failure(failed(static_cast<krb5_error_code>(minor), "the Kerberos ticket cannot be used")
                               .value_or(Error{directory::ldapErrorDomain, LDAP_LOCAL_ERROR,
                                               "the Kerberos ticket cannot be used"}));
        }
        return {};
    }
};

KerberosCredential::KerberosCredential() = default;
KerberosCredential::~KerberosCredential() = default;

Result<void*> KerberosCredential::use(const DiskPath& keytab, const std::string& principal) {
    const std::string name = "FILE:" + keytab.text();
    if (!_state || _state->keytabName != name || _state->principalName != principal ||
        secondsUntil(_state->end) <= renewedBefore) {
        _state = std::make_unique<State>();
        _state->keytabName = name;
        _state->principalName = principal;
        if (const auto obtained = _state->obtain(keytab.text()); !obtained) {
            _state.reset();
            return failure(obtained.error());
        }
    }
    return _state->credential;
}

std::string defaultKerberosRealm() {
    const Context context = newContext();
    char* realm = nullptr;
    if (!context || ::krb5_get_default_realm(context.get(), &realm) != 0) {
        return {};
    }
    std::string text = realm;
    ::krb5_free_default_realm(context.get(), realm);
    return text;
}

}  // namespace adminhost
