#include "krb5/KRB5KeytabEntry.h"

#include "krb5/LibraryText.h"
#include "platform/value/ValueText.h"

#include <array>
#include <utility>

namespace lumio {

KRB5KeytabEntry::KRB5KeytabEntry(std::shared_ptr<KRB5Context> context) noexcept : KRB5Object(std::move(context)) {}

KRB5KeytabEntry::KRB5KeytabEntry(KRB5KeytabEntry&& other) noexcept
    : KRB5Object(std::move(other)), _nativeKeytabEntry(std::exchange(other._nativeKeytabEntry, {})) {}

KRB5KeytabEntry::~KRB5KeytabEntry() {
    if (nativeContext() != nullptr) {
        krb5_free_keytab_entry_contents(nativeContext(), &_nativeKeytabEntry);
    }
}

std::unique_ptr<KRB5KeytabEntry> KRB5KeytabEntry::initWithNativeKeytabEntry(const krb5_keytab_entry& nativeKeytabEntry,
                                                                            std::shared_ptr<KRB5Context> context) {
    std::unique_ptr<KRB5KeytabEntry> entry(new KRB5KeytabEntry(std::move(context)));
    // The library crashes if it copies without a context or from a null principal.
    if (entry->nativeContext() == nullptr || nativeKeytabEntry.principal == nullptr) {
        return nullptr;
    }
    krb5_keytab_entry& copy = entry->_nativeKeytabEntry;
    copy.magic = nativeKeytabEntry.magic;
    copy.timestamp = nativeKeytabEntry.timestamp;
    copy.vno = nativeKeytabEntry.vno;
    if (!entry->record(krb5_copy_principal(entry->nativeContext(), nativeKeytabEntry.principal, &copy.principal)) ||
        !entry->record(krb5_copy_keyblock_contents(entry->nativeContext(), &nativeKeytabEntry.key, &copy.key))) {
        return nullptr;
    }
    return entry;
}

std::unique_ptr<KRB5Principal> KRB5KeytabEntry::principal() const {
    if (_nativeKeytabEntry.principal == nullptr) {
        recordMissingHandle();
        return nullptr;
    }
    UnparsedName unparsed(nativeContext());
    record(krb5_unparse_name(nativeContext(), _nativeKeytabEntry.principal, unparsed.receive()));
    const auto text = utf8TextOf(unparsed.get());
    return text ? KRB5Principal::initWithString(*text, context()) : nullptr;
}

adminhost::Date KRB5KeytabEntry::timestamp() const noexcept {
    return adminhost::Date(std::chrono::seconds(_nativeKeytabEntry.timestamp));
}

std::string KRB5KeytabEntry::enctypeString() const {
    std::array<char, 100> name{};
    // The status adds nothing to the empty buffer.
    static_cast<void>(krb5_enctype_to_string(_nativeKeytabEntry.key.enctype, name.data(), name.size()));
    if (name[0] == '\0') {
        return "enctype " + std::to_string(enctype());
    }
    name.back() = '\0';
    return name.data();
}

std::string KRB5KeytabEntry::description() const {
    const auto owner = principal();
    return "principal='" + adminhost::textOf(owner ? owner->description() : std::nullopt) + "' timestamp='" +
           adminhost::textOf(adminhost::Value(timestamp())) + "' vno='" + std::to_string(vno()) + "' enctype='" +
           enctypeString() + "'";
}

}  // namespace lumio
