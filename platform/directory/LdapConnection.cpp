#include "platform/directory/LdapConnection.h"

#include "platform/crypto/Crypt.h"
#include "platform/directory/DirectoryRequest.h"
#include "platform/directory/LdapCertificate.h"
#include "platform/directory/LdapPassword.h"

#include <algorithm>

#include <fmt/format.h>
#include <sasl/sasl.h>
#include <sys/time.h>

namespace adminhost {
namespace {

using Clock = LdapConnection::Clock;

/// Without a configured file. The library's own default is in its configuration, which is not used.
constexpr const char* systemCertificates = "/etc/ssl/certs/ca-certificates.crt";

timeval timevalOf(Clock::duration time) noexcept {
    const auto left =
        std::max(std::chrono::duration_cast<std::chrono::microseconds>(time), std::chrono::microseconds(0));
    return {static_cast<time_t>(left.count() / 1'000'000), static_cast<suseconds_t>(left.count() % 1'000'000)};
}

/// The attributes of an entry to be added, as the library's array of pointers. They point into the map.
class Modifications {
  public:
    explicit Modifications(const std::map<std::string, std::vector<std::string>>& values) {
        _attributes.reserve(values.size());
        for (const auto& [name, texts] : values) {
            Attribute& attribute = _attributes.emplace_back();
            attribute.values.reserve(texts.size());
            for (const std::string& text : texts) {
                attribute.values.push_back(bervalOf(text));
            }
            for (berval& value : attribute.values) {
                attribute.pointers.push_back(&value);
            }
            attribute.pointers.push_back(nullptr);
            attribute.modification.mod_op = LDAP_MOD_ADD | LDAP_MOD_BVALUES;
            attribute.modification.mod_type = const_cast<char*>(name.c_str());
            attribute.modification.mod_bvalues = attribute.pointers.data();
        }
        for (Attribute& attribute : _attributes) {
            _pointers.push_back(&attribute.modification);
        }
        _pointers.push_back(nullptr);
    }
    [[nodiscard]] LDAPMod** get() noexcept { return _pointers.data(); }

  private:
    struct Attribute {
        std::vector<berval> values;
        std::vector<berval*> pointers;
        LDAPMod modification{};
    };
    std::vector<Attribute> _attributes;
    std::vector<LDAPMod*> _pointers;
};

struct Negotiation {
    void* credential = nullptr;
    int status = LDAP_SUCCESS;
};

/// Called by the library as soon as it has begun to negotiate; not earlier can it be given the credential. Every
/// question of the mechanism (authorisation name and the like) gets the empty reply, which means its default.
int giveCredential(LDAP* ldap, unsigned /*flags*/, void* defaults, void* questions) {
    auto* negotiation = static_cast<Negotiation*>(defaults);
    negotiation->status = ::ldap_set_option(ldap, LDAP_OPT_X_SASL_GSS_CREDS, negotiation->credential);
    for (auto* question = static_cast<sasl_interact_t*>(questions); question->id != SASL_CB_LIST_END; ++question) {
        question->result = "";
        question->len = 0;
    }
    return negotiation->status == LDAP_OPT_SUCCESS ? LDAP_SUCCESS : LDAP_LOCAL_ERROR;
}

}  // namespace

std::string LdapConnection::what(std::string_view action) const {
    return fmt::format("{}: {}", _uri, action);
}

Clock::time_point LdapConnection::beginOperation() noexcept {
    const Clock::time_point end = std::min({Clock::now() + _settings.timeout, directoryDeadline(), _openEnd});
    _waitLimit.set(end);
    return end;
}

bool LdapConnection::isProtected() const noexcept {
    return ::ldap_is_ldapi_url(_uri.c_str()) != 0 || (_handle && ::ldap_tls_inplace(_handle.get()) != 0);
}

Result<std::unique_ptr<LdapConnection>> LdapConnection::open(const LdapNodeSettings& settings,
                                                             KerberosCredential& credential, const LdapSignIn* signIn,
                                                             Clock::time_point end) {
    startLdapLibrary();
    Error error = ldapError(LDAP_PARAM_ERROR, "no server is configured");
    for (const std::string& uri : settings.uris) {
        if (signIn != nullptr && !settings.startTls && ::ldap_is_ldap_url(uri.c_str()) != 0 &&
            ::ldap_is_ldaps_url(uri.c_str()) == 0 && ::ldap_is_ldapi_url(uri.c_str()) == 0) {
            error = ldapError(LDAP_CONFIDENTIALITY_REQUIRED, uri,
                              "the password would be sent in clear text; set starttls or use ldaps");
            continue;
        }
        // The constructor is private, so make_unique cannot call it.
        std::unique_ptr<LdapConnection> connection(new LdapConnection(settings, uri));
        connection->_openEnd = end;
        if (const auto connected = connection->connect(); !connected) {
            error = connected.error();
            connection->explain(error);
            continue;
        }
        if (const auto bound = connection->bind(credential, signIn); !bound) {
            error = bound.error();
            if (isUnreachable(error.code)) {
                continue;
            }
            break;  // the other servers have the same accounts: trying a wrong password there too might lock the
                    // account
        }
        connection->_openEnd = Clock::time_point::max();
        return connection;
    }
    return failure(std::move(error));
}

Result<void> LdapConnection::connect() {
    const auto begin = Clock::now();
    const auto connectEnd = std::min({begin + _settings.timeout, directoryDeadline(), _openEnd});
    if (connectEnd <= begin) {
        return failure(ldapError(LDAP_TIMEOUT, _uri, "the time for the directory is used up"));
    }
    LDAP* created = nullptr;
    if (const int status = ::ldap_initialize(&created, _uri.c_str()); status != LDAP_SUCCESS) {
        return failure(ldapError(status, _uri));
    }
    _handle.reset(created);
    const int version = LDAP_VERSION3;
    const int never = LDAP_DEREF_NEVER;
    const timeval limit = timevalOf(connectEnd - begin);
    ::ldap_set_option(created, LDAP_OPT_PROTOCOL_VERSION, &version);
    ::ldap_set_option(created, LDAP_OPT_DEREF, &never);
    ::ldap_set_option(created, LDAP_OPT_REFERRALS, LDAP_OPT_OFF);
    ::ldap_set_option(created, LDAP_OPT_RESTART, LDAP_OPT_ON);
    // The server is named as in the configuration: a reverse look-up could be forged.
    ::ldap_set_option(created, LDAP_OPT_X_SASL_NOCANON, LDAP_OPT_ON);
    ::ldap_set_option(created, LDAP_OPT_NETWORK_TIMEOUT, &limit);
    ::ldap_set_option(created, LDAP_OPT_TIMEOUT, &limit);
    _waitLimit.set(connectEnd);
    _waitLimit.applyTo(created);
    if (auto used = useCertificates(); !used) {
        return used;
    }
    if (const int status = ::ldap_connect(created); status != LDAP_SUCCESS) {
        return failure(ldapError(status, _uri, created));
    }
    if (_settings.startTls && !isProtected()) {
        if (const int status = ::ldap_start_tls_s(created, nullptr, nullptr); status != LDAP_SUCCESS) {
            return failure(ldapError(status, what("TLS cannot be started"), created));
        }
    }
    return {};
}

void LdapConnection::explain(Error& error) const {
    const bool usesTls = _settings.startTls || ::ldap_is_ldaps_url(_uri.c_str()) != 0;
    if (!usesTls || _settings.verify == LdapNodeSettings::Verify::never || _waitLimit.end() <= Clock::now() ||
        !isUnreachable(error.code)) {
        return;
    }
    // Connects once more to see the certificate. Nothing is sent on this connection.
    LdapNodeSettings settings = _settings;
    settings.verify = LdapNodeSettings::Verify::never;
    settings.certFile.reset();  // not for a server that is not trusted
    settings.keyFile.reset();
    LdapConnection unverified(settings, _uri);
    unverified._openEnd = _waitLimit.end();
    berval certificate{};
    if (!unverified.connect() ||
        ::ldap_get_option(unverified._handle.get(), LDAP_OPT_X_TLS_PEERCERT, &certificate) != LDAP_OPT_SUCCESS) {
        return;
    }
    const std::string bytes = textOf(certificate);
    ::ber_memfree(certificate.bv_val);
    LDAPURLDesc* parsed = nullptr;
    if (::ldap_url_parse(_uri.c_str(), &parsed) != LDAP_URL_SUCCESS) {
        return;
    }
    const LdapUrl owned(parsed);
    const std::string authorities = _settings.caFile ? diskPath(*_settings.caFile).text() : systemCertificates;
    if (const std::string problem = certificateProblem(bytes, parsed->lud_host, authorities); !problem.empty()) {
        error.description = fmt::format("{}: {}", _uri, problem);
    }
}

Result<void> LdapConnection::useCertificates() {
    LDAP* const ldap = _handle.get();
    const auto setFile = [&](int option, const std::optional<HostPath>& file) -> Result<void> {
        if (!file) {
            return {};
        }
        const int status = ::ldap_set_option(ldap, option, diskPath(*file).c_str());
        return status == LDAP_OPT_SUCCESS ? Result<void>() : failure(ldapError(LDAP_LOCAL_ERROR, file->text()));
    };
    const int verify =
        _settings.verify == LdapNodeSettings::Verify::never ? LDAP_OPT_X_TLS_NEVER : LDAP_OPT_X_TLS_DEMAND;
    ::ldap_set_option(ldap, LDAP_OPT_X_TLS_REQUIRE_CERT, &verify);
    if (_settings.verify == LdapNodeSettings::Verify::demand && !_settings.caFile) {
        ::ldap_set_option(ldap, LDAP_OPT_X_TLS_CACERTFILE, systemCertificates);
    }
    for (const auto& [option, file] : {std::pair(LDAP_OPT_X_TLS_CACERTFILE, _settings.caFile),
                                       std::pair(LDAP_OPT_X_TLS_CERTFILE, _settings.certFile),
                                       std::pair(LDAP_OPT_X_TLS_KEYFILE, _settings.keyFile)}) {
        if (auto set = setFile(option, file); !set) {
            return set;
        }
    }
    if (::ldap_is_ldaps_url(_uri.c_str()) == 0 && !_settings.startTls) {
        return {};
    }
    const int client = 0;
    if (::ldap_set_option(ldap, LDAP_OPT_X_TLS_NEWCTX, &client) != LDAP_OPT_SUCCESS) {
        return failure(ldapError(LDAP_LOCAL_ERROR, _uri, "the certificate files cannot be used"));
    }
    return {};
}

Result<void> LdapConnection::bind(KerberosCredential& credential, const LdapSignIn* signIn) {
    if (signIn != nullptr) {
        // Checked once more, now that the connection is there: what the address promised is not enough.
        if (!isProtected()) {
            return failure(ldapError(LDAP_CONFIDENTIALITY_REQUIRED, _uri, "the password would be sent in clear text"));
        }
        return bindSimple(signIn->dn, signIn->password);
    }
    switch (_settings.sasl) {
        case LdapNodeSettings::Sasl::external:
            return bindExternal();
        case LdapNodeSettings::Sasl::gssapi:
            return bindKerberos(credential);
        case LdapNodeSettings::Sasl::none:
            break;
    }
    if (_settings.bindDn.empty()) {
        return bindSimple({}, {});
    }
    auto password = ldapBindPassword(_settings);
    if (!password) {
        return failure(password.error());
    }
    const ScopedCleanse wipePassword(*password);
    return bindSimple(_settings.bindDn, *password);
}

Result<void> LdapConnection::bindSimple(const std::string& dn, std::string_view password) {
    berval secret = bervalOf(password);
    const auto end = beginOperation();
    int id = 0;
    const int status = ::ldap_sasl_bind(_handle.get(), dn.c_str(), LDAP_SASL_SIMPLE, &secret, nullptr, nullptr, &id);
    return finish(status, id, end, dn.empty() ? "anonymous bind" : "bind as " + dn);
}

Result<void> LdapConnection::bindExternal() {
    berval nobody = bervalOf("");
    const auto end = beginOperation();
    int id = 0;
    const int status = ::ldap_sasl_bind(_handle.get(), nullptr, "EXTERNAL", &nobody, nullptr, nullptr, &id);
    return finish(status, id, end, "bind with EXTERNAL");
}

Result<void> LdapConnection::bindKerberos(KerberosCredential& credential) {
    constexpr std::string_view action = "bind with GSSAPI";
    const auto used = credential.use(diskPath(*_settings.keytab), _settings.principal);
    if (!used) {
        return failure(used.error());
    }
    LDAP* const ldap = _handle.get();
    if (isProtected()) {
        // TLS protects the connection already; some servers refuse a second layer.
        ::ldap_set_option(ldap, LDAP_OPT_X_SASL_SECPROPS, "maxssf=0");
    }
    // The exchange with the KDC is not bounded by the time-outs, so each message of the server has the whole time.
    Negotiation negotiation{*used};
    LdapMessage last;
    const char* mechanism = nullptr;
    int status = LDAP_SASL_BIND_IN_PROGRESS;
    while (status == LDAP_SASL_BIND_IN_PROGRESS) {
        int id = 0;
        _waitLimit.set(Clock::time_point::max());
        status = ::ldap_sasl_interactive_bind(ldap, nullptr, "GSSAPI", nullptr, nullptr, LDAP_SASL_QUIET,
                                              &giveCredential, &negotiation, last.get(), &mechanism, &id);
        if (status != LDAP_SASL_BIND_IN_PROGRESS) {
            break;
        }
        auto message = receive(id, LDAP_MSG_ALL, std::min(Clock::now() + _settings.timeout, _openEnd), action);
        if (!message) {
            return failure(message.error());
        }
        last = *std::move(message);
    }
    return status == LDAP_SUCCESS ? Result<void>() : failure(ldapError(status, what(action), ldap));
}

Result<LdapMessage> LdapConnection::receive(int id, int all, Clock::time_point end, std::string_view action) {
    _waitLimit.set(end);
    timeval wait = timevalOf(end - Clock::now());
    LDAPMessage* message = nullptr;
    const int type = ::ldap_result(_handle.get(), id, all, &wait, &message);
    if (type > 0) {
        return LdapMessage(message);
    }
    if (type == 0) {
        ::ldap_abandon_ext(_handle.get(), id, nullptr, nullptr);
        const bool usedUp = isDirectoryTimeUsedUp();
        return failure(ldapError(LDAP_TIMEOUT, what(action),
                                 usedUp ? std::string_view("the time for the directory is used up")
                                        : std::string_view("the server does not respond")));
    }
    int status = LDAP_SERVER_DOWN;
    ::ldap_get_option(_handle.get(), LDAP_OPT_RESULT_CODE, &status);
    return failure(ldapError(status, what(action), _handle.get()));
}

Result<void> LdapConnection::finish(int status, int id, Clock::time_point end, std::string_view action) {
    if (status != LDAP_SUCCESS) {
        return failure(ldapError(status, what(action), _handle.get()));
    }
    const auto message = receive(id, LDAP_MSG_ALL, end, action);
    if (!message) {
        return failure(message.error());
    }
    int code = LDAP_OTHER;
    char* words = nullptr;
    const int parsed = ::ldap_parse_result(_handle.get(), message->get(), &code, nullptr, &words, nullptr, nullptr, 0);
    const LdapText owned(words);
    if (parsed != LDAP_SUCCESS || code != LDAP_SUCCESS) {
        return failure(ldapError(parsed != LDAP_SUCCESS ? parsed : code, what(action), words == nullptr ? "" : words));
    }
    return {};
}

Result<void> LdapConnection::add(const std::string& dn, const std::map<std::string, std::vector<std::string>>& values) {
    Modifications modifications(values);
    const auto end = beginOperation();
    int id = 0;
    const int status = ::ldap_add_ext(_handle.get(), dn.c_str(), modifications.get(), nullptr, nullptr, &id);
    return finish(status, id, end, "add " + dn);
}

Result<void> LdapConnection::remove(const std::string& dn) {
    const auto end = beginOperation();
    int id = 0;
    const int status = ::ldap_delete_ext(_handle.get(), dn.c_str(), nullptr, nullptr, &id);
    return finish(status, id, end, "delete " + dn);
}

Result<void> LdapConnection::setPassword(const std::string& dn, std::string_view password) {
    if (!isProtected()) {
        return failure(ldapError(LDAP_CONFIDENTIALITY_REQUIRED, _uri, "the password would be sent in clear text"));
    }
    berval user = bervalOf(dn);
    berval secret = bervalOf(password);
    const auto end = beginOperation();
    int id = 0;
    const int status = ::ldap_passwd(_handle.get(), &user, nullptr, &secret, nullptr, nullptr, &id);
    return finish(status, id, end, "set the password of " + dn);
}

}  // namespace adminhost
