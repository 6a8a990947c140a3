#include "krb5/KRB5Context.h"

#include "krb5/KRB5CredentialCache.h"
#include "krb5/KRB5Keytab.h"
#include "krb5/LibraryText.h"
#include "platform/text/Utf8.h"

#include <cerrno>
#include <cstdlib>

#include <gssapi/gssapi_krb5.h>

namespace lumio {

std::shared_ptr<KRB5Context> KRB5Context::init() {
    std::shared_ptr<KRB5Context> context(new KRB5Context);
    context->_errorCode = krb5_init_context(&context->_nativeContext);
    if (context->_nativeContext == nullptr && context->_errorCode == 0) {
        return nullptr;
    }
    return context;
}

std::shared_ptr<KRB5Context> KRB5Context::context() {
    return init();
}

std::shared_ptr<KRB5Context> KRB5Context::defaultContext() {
    // Never freed on purpose: objects of static life may still hold handles made with it.
    static const auto* const theContext = new std::shared_ptr<KRB5Context>(init());
    return *theContext;
}

KRB5Context::~KRB5Context() {
    if (_nativeContext != nullptr) {
        krb5_free_context(_nativeContext);
    }
}

std::optional<std::string> KRB5Context::defaultRealm() const {
    if (_nativeContext == nullptr) {
        return std::nullopt;
    }
    Handle<char*, krb5_free_default_realm> realm(_nativeContext);
    _errorCode = krb5_get_default_realm(_nativeContext, realm.receive());
    return utf8TextOf(realm.get());
}

void KRB5Context::setDefaultRealm(const std::string& realm) {
    if (_nativeContext == nullptr) {
        _errorCode = _errorCode != 0 ? _errorCode : EINVAL;
        return;
    }
    _errorCode = hasNul(realm) ? EINVAL : krb5_set_default_realm(_nativeContext, realm.c_str());
}

std::unique_ptr<KRB5Keytab> KRB5Context::defaultKeytab() {
    if (_nativeContext == nullptr) {
        return nullptr;
    }
    return KRB5Keytab::initWithName(std::nullopt, std::nullopt, shared_from_this());
}

void KRB5Context::setDefaultKeytab(const KRB5Keytab* keytab) const {
    if (keytab == nullptr) {
        unsetenv("KRB5_KTNAME");
        return;
    }
    setenv("KRB5_KTNAME", keytab->description().c_str(), 1);
}

std::unique_ptr<KRB5CredentialCache> KRB5Context::defaultCredentialCache() {
    if (_nativeContext == nullptr) {
        return nullptr;
    }
    return KRB5CredentialCache::initWithNativeCredentialCache(nullptr, shared_from_this());
}

void KRB5Context::setDefaultCredentialCache(const KRB5CredentialCache* cache) {
    if (_nativeContext == nullptr) {
        return;
    }
    const auto name = cache != nullptr ? cache->name() : std::nullopt;
    _errorCode = krb5_cc_set_default_name(_nativeContext, name ? name->c_str() : nullptr);
}

std::uint32_t KRB5Context::setDefaultGSSCredentialCache(const KRB5CredentialCache* cache) {
    const auto name = cache != nullptr ? cache->name() : std::nullopt;
    OM_uint32 minor = 0;
    return gss_krb5_ccache_name(&minor, name ? name->c_str() : nullptr, nullptr);
}

std::string KRB5Context::messageOf(krb5_context nativeContext, std::int64_t code) {
    // Without a context the library falls back to its static tables.
    const Handle<const char*, krb5_free_error_message> message(
        nativeContext, krb5_get_error_message(nativeContext, static_cast<krb5_error_code>(code)));
    return message.get() != nullptr ? adminhost::utf8Of(message.get()) : std::string();
}

}  // namespace lumio
