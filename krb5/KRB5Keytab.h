#pragma once

#include "krb5/KRB5KeytabEntry.h"
#include "krb5/KRB5Object.h"
#include "krb5/KRB5Principal.h"

#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace lumio {

inline constexpr const char* KRB5KeytabFileType = "FILE";
inline constexpr const char* KRB5KeytabWritableFileType = "WRFILE";

/// A key table: the keys of services and unattended clients.
///
/// A keytab that could not be opened is an object without a native keytab and with errorCode set.
/// The library writes file keytabs of either type, and reports a WRFILE keytab's type as FILE.
class KRB5Keytab : public KRB5Object {
  public:
    /// Opens "TYPE:NAME" (the file need not exist yet); the type defaults to FILE. Without a name, FILE opens the
    /// library's default keytab, and no other type, not even WRFILE, opens anything. Null if no keytab was opened and
    /// there was no error.
    [[nodiscard]] static std::unique_ptr<KRB5Keytab> initWithName(const std::optional<std::string>& name,
                                                                  const std::optional<std::string>& type,
                                                                  std::shared_ptr<KRB5Context> context);

    KRB5Keytab(KRB5Keytab&&) noexcept = default;

    /// Without the type: the path of a file keytab. A name of more than 1,099 bytes (type included) is returned cut,
    /// with the library's status recorded.
    [[nodiscard]] std::optional<std::string> name() const;
    [[nodiscard]] std::optional<std::string> type() const;
    /// "TYPE:NAME"
    [[nodiscard]] std::string description() const;

    /// All entries that can be read. errorCode is never 0 afterwards: it is the status that ended the walk, KRB5_KT_END
    /// after a complete one. Judge by the list.
    [[nodiscard]] std::vector<KRB5KeytabEntry> entries() const;
    /// Each principal once, in order of first appearance; time grows linearly with the entries. errorCode as above.
    [[nodiscard]] std::vector<KRB5Principal> principals() const;

    void addEntry(const KRB5KeytabEntry& entry);
    void removeEntry(const KRB5KeytabEntry& entry);
    /// Returns true if there is a key of that principal, version and encryption type. Leaves errorCode as it is.
    [[nodiscard]] bool containsEntry(const KRB5KeytabEntry& entry) const;

    [[nodiscard]] krb5_keytab nativeKeytab() const noexcept { return _nativeKeytab.get(); }

  private:
    explicit KRB5Keytab(std::shared_ptr<KRB5Context> context) noexcept;

    /// Calls visit with each entry until the keytab ends, a read fails, or visit returns false.
    template <class Visit>
    void walk(Visit visit) const;

    Handle<krb5_keytab, krb5_kt_close> _nativeKeytab;
};

}  // namespace lumio
