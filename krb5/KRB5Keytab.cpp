#include "krb5/KRB5Keytab.h"

#include "krb5/LibraryText.h"
#include "platform/value/ValueText.h"

#include <array>
#include <cstring>
#include <unordered_set>
#include <utility>

namespace lumio {

KRB5Keytab::KRB5Keytab(std::shared_ptr<KRB5Context> context) noexcept
    : KRB5Object(std::move(context)), _nativeKeytab(nativeContext()) {}

std::unique_ptr<KRB5Keytab> KRB5Keytab::initWithName(const std::optional<std::string>& name,
                                                     const std::optional<std::string>& type,
                                                     std::shared_ptr<KRB5Context> context) {
    const std::string keytabType = type.value_or(KRB5KeytabFileType);
    if (!name && keytabType != KRB5KeytabFileType) {
        return nullptr;
    }
    std::unique_ptr<KRB5Keytab> keytab(new KRB5Keytab(std::move(context)));
    krb5_context native = keytab->nativeContext();
    if (native == nullptr) {
        return keytab;
    }
    if (name) {
        const std::string fullName = keytabType + ":" + *name;
        keytab->record(hasNul(fullName) ? EINVAL
                                        : krb5_kt_resolve(native, fullName.c_str(), keytab->_nativeKeytab.receive()));
    } else {
        keytab->record(krb5_kt_default(native, keytab->_nativeKeytab.receive()));
    }
    if (keytab->nativeKeytab() == nullptr && keytab->errorCode() == 0) {
        return nullptr;
    }
    return keytab;
}

std::optional<std::string> KRB5Keytab::name() const {
    // The library crashes on a null keytab here, in type, walk and the changes below.
    if (nativeKeytab() == nullptr) {
        recordMissingHandle();
        return std::nullopt;
    }
    std::array<char, 1100> buffer{};
    record(krb5_kt_get_name(nativeContext(), nativeKeytab(), buffer.data(), buffer.size()));
    const std::string_view text(buffer.data(), strnlen(buffer.data(), buffer.size()));
    if (text.empty()) {
        return std::nullopt;
    }
    const auto colon = text.find(':');
    return std::string(colon == std::string_view::npos ? text : text.substr(colon + 1));
}

std::optional<std::string> KRB5Keytab::type() const {
    const char* type = nativeKeytab() != nullptr ? krb5_kt_get_type(nativeContext(), nativeKeytab()) : nullptr;
    return type != nullptr ? std::optional<std::string>(type) : std::nullopt;
}

std::string KRB5Keytab::description() const {
    return adminhost::textOf(type()) + ":" + adminhost::textOf(name());
}

template <class Visit>
void KRB5Keytab::walk(Visit visit) const {
    if (nativeKeytab() == nullptr) {
        recordMissingHandle();
        return;
    }
    krb5_kt_cursor cursor = nullptr;
    bool more = record(krb5_kt_start_seq_get(nativeContext(), nativeKeytab(), &cursor));
    while (more) {
        krb5_keytab_entry entry{};
        more = record(krb5_kt_next_entry(nativeContext(), nativeKeytab(), &entry, &cursor)) && visit(entry);
        krb5_free_keytab_entry_contents(nativeContext(), &entry);
    }
    if (cursor != nullptr) {
        // Its status is not recorded: callers see the one that ended the walk.
        static_cast<void>(krb5_kt_end_seq_get(nativeContext(), nativeKeytab(), &cursor));
    }
}

std::vector<KRB5KeytabEntry> KRB5Keytab::entries() const {
    std::vector<KRB5KeytabEntry> entries;
    walk([&](const krb5_keytab_entry& native) {
        if (auto entry = KRB5KeytabEntry::initWithNativeKeytabEntry(native, context())) {
            entries.push_back(std::move(*entry));
        }
        return true;
    });
    return entries;
}

std::vector<KRB5Principal> KRB5Keytab::principals() const {
    std::vector<KRB5Principal> principals;
    // Principals are equal when their texts are, so the texts tell which ones are new without a search of the list.
    std::unordered_set<std::string> seen;
    walk([&](const krb5_keytab_entry& native) {
        UnparsedName unparsed(nativeContext());
        if (!record(krb5_unparse_name(nativeContext(), native.principal, unparsed.receive()))) {
            return false;
        }
        const auto text = utf8TextOf(unparsed.get());
        if (text && seen.insert(*text).second) {
            if (auto principal = KRB5Principal::initWithString(*text, context())) {
                principals.push_back(std::move(*principal));
            }
        }
        return true;
    });
    return principals;
}

void KRB5Keytab::addEntry(const KRB5KeytabEntry& entry) {
    if (nativeKeytab() == nullptr) {
        recordMissingHandle();
        return;
    }
    // The library's parameter is a non-const pointer, but it only reads the record, here and in removeEntry.
    krb5_keytab_entry native = entry.nativeKeytabEntry();
    record(native.principal != nullptr ? krb5_kt_add_entry(nativeContext(), nativeKeytab(), &native) : EINVAL);
}

void KRB5Keytab::removeEntry(const KRB5KeytabEntry& entry) {
    if (nativeKeytab() == nullptr) {
        recordMissingHandle();
        return;
    }
    krb5_keytab_entry native = entry.nativeKeytabEntry();
    record(native.principal != nullptr ? krb5_kt_remove_entry(nativeContext(), nativeKeytab(), &native) : EINVAL);
}

bool KRB5Keytab::containsEntry(const KRB5KeytabEntry& entry) const {
    const auto principal = entry.principal();
    if (nativeKeytab() == nullptr || principal == nullptr || principal->nativePrincipal() == nullptr) {
        return false;
    }
    krb5_keytab_entry found{};
    if (krb5_kt_get_entry(nativeContext(), nativeKeytab(), principal->nativePrincipal(),
                          static_cast<krb5_kvno>(entry.vno()), static_cast<krb5_enctype>(entry.enctype()),
                          &found) != 0) {
        return false;
    }
    krb5_free_keytab_entry_contents(nativeContext(), &found);
    return true;
}

}  // namespace lumio
