#include "platform/directory/LdapFilter.h"

#include "platform/directory/LdapLibrary.h"

#include <new>

namespace adminhost {
namespace {

std::string escaped(std::string_view value) {
    if (value.empty()) {
        return {};
    }
    berval in = bervalOf(value);
    berval out{};
    if (::ldap_bv2escaped_filter_value(&in, &out) != 0) {
        throw std::bad_alloc();
    }
    std::string text = textOf(out);
    ::ber_memfree(out.bv_val);
    return text;
}

std::string combined(char operation, std::span<const std::string> filters) {
    if (filters.size() == 1) {
        return filters.front();
    }
    std::string text{'(', operation};
    for (const std::string& filter : filters) {
        text += filter;
    }
    text += ')';
    return text;
}

}  // namespace

bool isLdapFilter(const std::string& filter) {
    startLdapLibrary();
    LDAP* created = nullptr;
    if (filter.empty() || ::ldap_create(&created) != LDAP_SUCCESS) {
        return false;
    }
    const LdapHandle handle(created);
    std::string text = filter;
    berval encoded{};
    const bool valid = ::ldap_create_assertion_control_value(handle.get(), text.data(), &encoded) == LDAP_SUCCESS;
    ::ber_memfree(encoded.bv_val);
    return valid;
}

std::string filterEqual(std::string_view attribute, std::string_view value) {
    std::string text("(");
    text.append(attribute).append("=").append(escaped(value)).append(")");
    return text;
}

std::string filterBeginning(std::string_view attribute, std::string_view value) {
    std::string text("(");
    text.append(attribute).append("=").append(escaped(value)).append("*)");
    return text;
}

std::string filterAny(std::span<const std::string> filters) {
    return combined('|', filters);
}

std::string filterAll(std::span<const std::string> filters) {
    return combined('&', filters);
}

}  // namespace adminhost
