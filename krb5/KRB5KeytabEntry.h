#pragma once

#include "krb5/KRB5Object.h"
#include "krb5/KRB5Principal.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <memory>
#include <string>

namespace lumio {

/// An owned copy of one entry of a keytab: a principal, a key and its version. Immutable.
class KRB5KeytabEntry : public KRB5Object {
  public:
    /// Copies the entry, principal and key included. Null if either copy fails or the entry has no principal.
    [[nodiscard]] static std::unique_ptr<KRB5KeytabEntry> initWithNativeKeytabEntry(
        const krb5_keytab_entry& nativeKeytabEntry, std::shared_ptr<KRB5Context> context);

    KRB5KeytabEntry(KRB5KeytabEntry&& other) noexcept;
    ~KRB5KeytabEntry();

    /// Null if it has no text.
    [[nodiscard]] std::unique_ptr<KRB5Principal> principal() const;
    /// When the key was created. The library's 32 bits are read as signed: a time after January 2038 becomes one before
    /// 1970.
    [[nodiscard]] adminhost::Date timestamp() const noexcept;
    /// The key version number.
    [[nodiscard]] std::int64_t vno() const noexcept { return _nativeKeytabEntry.vno; }
    [[nodiscard]] std::int64_t enctype() const noexcept { return _nativeKeytabEntry.key.enctype; }
    /// The library's name of the encryption type, "enctype N" if it knows none.
    [[nodiscard]] std::string enctypeString() const;
    [[nodiscard]] std::string description() const;

    /// The record inside this object, not a copy.
    [[nodiscard]] const krb5_keytab_entry& nativeKeytabEntry() const noexcept { return _nativeKeytabEntry; }
    [[nodiscard]] krb5_keytab_entry& nativeKeytabEntry() noexcept { return _nativeKeytabEntry; }

  private:
    explicit KRB5KeytabEntry(std::shared_ptr<KRB5Context> context) noexcept;

    krb5_keytab_entry _nativeKeytabEntry{};
};

}  // namespace lumio
