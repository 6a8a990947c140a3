#pragma once

#include "krb5/KRB5Object.h"

#include <functional>
#include <memory>
#include <optional>
#include <string>

namespace lumio {

/// A Kerberos name such as "host/server.example@REALM". Immutable.
///
/// A text that cannot be parsed gives an object without a native principal and with errorCode set: test it before use.
/// The texts are null on any failure and leave errorCode as it is.
class KRB5Principal : public KRB5Object {
  public:
    /// Parses the text; a missing realm becomes the context's default realm. Null only if the library gave neither a
    /// principal nor an error.
    [[nodiscard]] static std::unique_ptr<KRB5Principal> initWithString(const std::string& text,
                                                                       std::shared_ptr<KRB5Context> context);
    /// The same on a new context of its own, not on the default context.
    [[nodiscard]] static std::unique_ptr<KRB5Principal> initWithString(const std::string& text);
    /// Copies by way of the text. Null if the native principal (which may be null) has no text.
    [[nodiscard]] static std::unique_ptr<KRB5Principal> initWithNativePrincipal(krb5_const_principal nativePrincipal,
                                                                                std::shared_ptr<KRB5Context> context);
    [[nodiscard]] static std::unique_ptr<KRB5Principal> principalWithNativePrincipal(
        krb5_const_principal nativePrincipal, std::shared_ptr<KRB5Context> context);

    KRB5Principal(KRB5Principal&&) noexcept = default;

    /// The canonical text, special characters escaped.
    [[nodiscard]] std::optional<std::string> stringValue() const;
    [[nodiscard]] std::optional<std::string> description() const { return stringValue(); }

    /// Of the text, so that equal principals of different contexts have equal hashes.
    [[nodiscard]] std::size_t hash() const;
    /// Returns true if the texts are equal. A principal without text equals only itself.
    [[nodiscard]] bool isEqual(const KRB5Principal& other) const;
    friend bool operator==(const KRB5Principal& a, const KRB5Principal& b) { return a.isEqual(b); }

    /// Null also when the realm is empty.
    [[nodiscard]] std::optional<std::string> realm() const;
    /// The first component.
    [[nodiscard]] std::optional<std::string> name() const;
    /// The second component. Further ones are not exposed.
    [[nodiscard]] std::optional<std::string> instance() const;

    [[nodiscard]] krb5_principal nativePrincipal() const noexcept { return _nativePrincipal.get(); }

    // Convenience: made of the operations above only.

    /// "host/..."
    [[nodiscard]] bool isHostPrincipal() const;
    /// One component only.
    [[nodiscard]] bool isClientPrincipal() const;

  private:
    explicit KRB5Principal(std::shared_ptr<KRB5Context> context) noexcept;

    [[nodiscard]] std::optional<std::string> component(int index) const;

    PrincipalHandle _nativePrincipal;
};

}  // namespace lumio

template <>
struct std::hash<lumio::KRB5Principal> {
    std::size_t operator()(const lumio::KRB5Principal& principal) const { return principal.hash(); }
};
