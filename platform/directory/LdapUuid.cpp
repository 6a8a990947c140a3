#include "platform/directory/LdapUuid.h"

#include <algorithm>
#include <cctype>

namespace adminhost {
namespace {

/// Reverses the bytes of the first three fields, which turns either order into the other.
Uuid swapped(Uuid uuid) {
    std::reverse(uuid.begin(), uuid.begin() + 4);
    std::swap(uuid[4], uuid[5]);
    std::swap(uuid[6], uuid[7]);
    return uuid;
}

}  // namespace

std::string ldapValueOf(const Uuid& uuid, LdapNodeSettings::UuidForm form) {
    if (form == LdapNodeSettings::UuidForm::text) {
        std::string text = textOf(uuid);
        std::transform(text.begin(), text.end(), text.begin(), [](unsigned char c) { return std::tolower(c); });
        return text;
    }
    const Uuid bytes = form == LdapNodeSettings::UuidForm::guid ? swapped(uuid) : uuid;
    return {bytes.begin(), bytes.end()};
}

std::optional<Uuid> uuidOfLdapValue(std::string_view value, LdapNodeSettings::UuidForm form) {
    if (form == LdapNodeSettings::UuidForm::text) {
        return uuidOf(value);
    }
    Uuid uuid{};
    if (value.size() != uuid.size()) {
        return std::nullopt;
    }
    std::copy(value.begin(), value.end(), uuid.begin());
    return form == LdapNodeSettings::UuidForm::guid ? swapped(uuid) : uuid;
}

}  // namespace adminhost
