#include "krb5/KRB5Principal.h"

#include "krb5/LibraryText.h"

#include <utility>

namespace lumio {
namespace {

/// Components and realms carry a length and no terminator.
std::optional<std::string> utf8TextOf(const krb5_data& data) {
    const std::string_view bytes(data.data != nullptr ? data.data : "", data.data != nullptr ? data.length : 0);
    if (!adminhost::isUtf8(bytes)) {
        return std::nullopt;
    }
    return std::string(bytes);
}

}  // namespace

KRB5Principal::KRB5Principal(std::shared_ptr<KRB5Context> context) noexcept
    : KRB5Object(std::move(context)), _nativePrincipal(nativeContext()) {}

std::unique_ptr<KRB5Principal> KRB5Principal::initWithString(const std::string& text,
                                                             std::shared_ptr<KRB5Context> context) {
    std::unique_ptr<KRB5Principal> principal(new KRB5Principal(std::move(context)));
    if (principal->nativeContext() != nullptr) {
        principal->record(hasNul(text) ? EINVAL
                                       : krb5_parse_name(principal->nativeContext(), text.c_str(),
                                                         principal->_nativePrincipal.receive()));
    }
    if (principal->nativePrincipal() == nullptr && principal->errorCode() == 0) {
        return nullptr;
    }
    return principal;
}

std::unique_ptr<KRB5Principal> KRB5Principal::initWithString(const std::string& text) {
    return initWithString(text, KRB5Context::context());
}

std::unique_ptr<KRB5Principal> KRB5Principal::initWithNativePrincipal(krb5_const_principal nativePrincipal,
                                                                      std::shared_ptr<KRB5Context> context) {
    krb5_context native = context ? context->nativeContext() : nullptr;
    if (native == nullptr || nativePrincipal == nullptr) {
        return nullptr;
    }
    UnparsedName unparsed(native);
    if (krb5_unparse_name(native, nativePrincipal, unparsed.receive()) != 0) {
        return nullptr;
    }
    const auto text = utf8TextOf(unparsed.get());
    if (!text) {
        return nullptr;
    }
    return initWithString(*text, std::move(context));
}

std::unique_ptr<KRB5Principal> KRB5Principal::principalWithNativePrincipal(krb5_const_principal nativePrincipal,
                                                                           std::shared_ptr<KRB5Context> context) {
    return initWithNativePrincipal(nativePrincipal, std::move(context));
}

std::optional<std::string> KRB5Principal::stringValue() const {
    if (nativePrincipal() == nullptr) {
        return std::nullopt;
    }
    UnparsedName unparsed(nativeContext());
    if (krb5_unparse_name(nativeContext(), nativePrincipal(), unparsed.receive()) != 0) {
        return std::nullopt;
    }
    return utf8TextOf(unparsed.get());
}

std::size_t KRB5Principal::hash() const {
    return std::hash<std::string>{}(stringValue().value_or(std::string()));
}

bool KRB5Principal::isEqual(const KRB5Principal& other) const {
    if (this == &other) {
        return true;
    }
    const auto text = stringValue();
    return text && text == other.stringValue();
}

std::optional<std::string> KRB5Principal::realm() const {
    if (nativePrincipal() == nullptr || nativePrincipal()->realm.length == 0) {
        return std::nullopt;
    }
    return utf8TextOf(nativePrincipal()->realm);
}

std::optional<std::string> KRB5Principal::component(int index) const {
    if (nativePrincipal() == nullptr || nativePrincipal()->data == nullptr || nativePrincipal()->length <= index) {
        return std::nullopt;
    }
    return utf8TextOf(nativePrincipal()->data[index]);
}

std::optional<std::string> KRB5Principal::name() const {
    return component(0);
}

std::optional<std::string> KRB5Principal::instance() const {
    return component(1);
}

bool KRB5Principal::isHostPrincipal() const {
    return instance().has_value() && name() == "host";
}

bool KRB5Principal::isClientPrincipal() const {
    return !instance().has_value();
}

}  // namespace lumio
