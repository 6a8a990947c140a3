#pragma once

#include "krb5/Handle.h"
#include "krb5/KRB5Context.h"
#include "krb5/KRB5Principal.h"
#include "platform/value/Value.h"

#include <memory>
#include <optional>
#include <string>

namespace lumio {

/// An owned copy of one credential of a cache: a client's ticket for a service, with its times. Immutable.
///
/// It has no error code: if the record could not be copied, every accessor of the object returns null. The library's
/// 32-bit times are read as signed.
class KRB5Credential {
  public:
    /// Always returns an object. If the record is null or cannot be copied (one without client or server), the object
    /// has no record.
    [[nodiscard]] static std::unique_ptr<KRB5Credential> initWithNativeCredential(const krb5_creds* nativeCredential,
                                                                                  std::shared_ptr<KRB5Context> context);

    KRB5Credential(KRB5Credential&&) noexcept = default;

    [[nodiscard]] std::unique_ptr<KRB5Principal> clientPrincipal() const;
    [[nodiscard]] std::unique_ptr<KRB5Principal> serverPrincipal() const;
    /// The time of authentication when the record has no start time.
    [[nodiscard]] std::optional<adminhost::Date> startTime() const;
    [[nodiscard]] std::optional<adminhost::Date> endTime() const;
    /// 1970-01-01 for a ticket that cannot be renewed.
    [[nodiscard]] std::optional<adminhost::Date> renewUntil() const;
    [[nodiscard]] std::string description() const;

    [[nodiscard]] krb5_creds* nativeCredential() const noexcept { return _nativeCredential.get(); }
    [[nodiscard]] const std::shared_ptr<KRB5Context>& context() const noexcept { return _context; }

  private:
    KRB5Credential(const krb5_creds* nativeCredential, std::shared_ptr<KRB5Context> context);

    std::shared_ptr<KRB5Context> _context;  // first, so that it outlives the record
    Handle<krb5_creds*, krb5_free_creds> _nativeCredential;
};

}  // namespace lumio
