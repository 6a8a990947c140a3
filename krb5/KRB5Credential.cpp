#include "krb5/KRB5Credential.h"

#include "platform/value/ValueText.h"

#include <utility>

namespace lumio {
namespace {

adminhost::Date dateOf(krb5_timestamp timestamp) {
    return adminhost::Date(std::chrono::seconds(timestamp));
}

std::string textOf(const std::unique_ptr<KRB5Principal>& principal) {
    return adminhost::textOf(principal ? principal->description() : std::nullopt);
}

std::string textOf(const std::optional<adminhost::Date>& date) {
    return adminhost::textOf(date ? adminhost::Value(*date) : adminhost::Value());
}

}  // namespace

KRB5Credential::KRB5Credential(const krb5_creds* nativeCredential, std::shared_ptr<KRB5Context> context)
    : _context(std::move(context)), _nativeCredential(_context ? _context->nativeContext() : nullptr) {
    if (nativeCredential == nullptr || _context == nullptr || _context->nativeContext() == nullptr) {
        return;
    }
    // The library crashes copying a record without them.
    if (nativeCredential->client == nullptr || nativeCredential->server == nullptr) {
        return;
    }
    krb5_creds* copy = nullptr;
    if (krb5_copy_creds(_context->nativeContext(), nativeCredential, &copy) == 0) {
        *_nativeCredential.receive() = copy;
    }
}

std::unique_ptr<KRB5Credential> KRB5Credential::initWithNativeCredential(const krb5_creds* nativeCredential,
                                                                         std::shared_ptr<KRB5Context> context) {
    return std::unique_ptr<KRB5Credential>(new KRB5Credential(nativeCredential, std::move(context)));
}

std::unique_ptr<KRB5Principal> KRB5Credential::clientPrincipal() const {
    return nativeCredential() != nullptr
               ? KRB5Principal::principalWithNativePrincipal(nativeCredential()->client, _context)
               : nullptr;
}

std::unique_ptr<KRB5Principal> KRB5Credential::serverPrincipal() const {
    return nativeCredential() != nullptr
               ? KRB5Principal::principalWithNativePrincipal(nativeCredential()->server, _context)
               : nullptr;
}

std::optional<adminhost::Date> KRB5Credential::startTime() const {
    if (nativeCredential() == nullptr) {
        return std::nullopt;
    }
    const krb5_ticket_times& times = nativeCredential()->times;
    return dateOf(times.starttime != 0 ? times.starttime : times.authtime);
}

std::optional<adminhost::Date> KRB5Credential::endTime() const {
    if (nativeCredential() == nullptr) {
        return std::nullopt;
    }
    return dateOf(nativeCredential()->times.endtime);
}

std::optional<adminhost::Date> KRB5Credential::renewUntil() const {
    if (nativeCredential() == nullptr) {
        return std::nullopt;
    }
    return dateOf(nativeCredential()->times.renew_till);
}

std::string KRB5Credential::description() const {
    return "client='" + textOf(clientPrincipal()) + "' server='" + textOf(serverPrincipal()) + "' start='" +
           textOf(startTime()) + "' end='" + textOf(endTime()) + "' renew='" + textOf(renewUntil()) + "'";
}

}  // namespace lumio
