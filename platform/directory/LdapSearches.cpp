// The searches of a connection.

#include "platform/directory/LdapConnection.h"
#include "platform/directory/LdapSearchBounds.h"

#include <algorithm>
#include <array>

#include <fmt/format.h>

namespace adminhost {
namespace {

LdapSearchBounds searchBounds;

char lower(char c) noexcept {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

bool equalNames(std::string_view a, std::string_view b) noexcept {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](char x, char y) { return lower(x) == lower(y); });
}

/// The library's control for a page of results.
class PageControl {
  public:
    PageControl() = default;
    PageControl(const PageControl&) = delete;
    PageControl& operator=(const PageControl&) = delete;
    ~PageControl() {
        if (_control != nullptr) {
            ::ldap_control_free(_control);
        }
    }
    [[nodiscard]] int create(LDAP* ldap, std::size_t size, const std::string& cookie) {
        berval value = bervalOf(cookie);
        // Not critical: a server that has no paging returns everything at once.
        return ::ldap_create_page_control(ldap, static_cast<ber_int_t>(size), &value, 0, &_control);
    }
    [[nodiscard]] LDAPControl* get() const noexcept { return _control; }

  private:
    LDAPControl* _control = nullptr;
};

struct FreeControls {
    void operator()(LDAPControl** controls) const noexcept { ::ldap_controls_free(controls); }
};
using Controls = std::unique_ptr<LDAPControl*, FreeControls>;

struct FreeBer {
    void operator()(BerElement* ber) const noexcept { ::ber_free(ber, 0); }
};

std::size_t sizeOf(const LdapEntry& entry) noexcept {
    std::size_t size = entry.dn.size();
    for (const auto& [name, values] : entry.attributes) {
        size += name.size();
        for (const std::string& value : values) {
            size += value.size();
        }
    }
    return size;
}

}  // namespace

void setLdapSearchBounds(const LdapSearchBounds& bounds) noexcept {
    searchBounds = bounds;
}

const std::vector<std::string>* LdapEntry::values(std::string_view attribute) const noexcept {
    for (const auto& [name, values] : attributes) {
        if (equalNames(name, attribute)) {
            return &values;
        }
    }
    return nullptr;
}

Result<int> LdapConnection::send(const LdapSearch& search, const std::string& cookie) {
    beginOperation();
    std::vector<char*> attributes;
    attributes.reserve(search.attributes.size() + 1);
    for (const std::string& attribute : search.attributes) {
        attributes.push_back(const_cast<char*>(attribute.c_str()));
    }
    attributes.push_back(nullptr);
    PageControl page;
    if (search.pageSize != 0) {
        if (const int status = page.create(_handle.get(), search.pageSize, cookie); status != LDAP_SUCCESS) {
            return failure(ldapError(status, what("search")));
        }
    }
    std::array<LDAPControl*, 2> controls{page.get(), nullptr};
    int id = 0;
    const int status =
        ::ldap_search_ext(_handle.get(), search.base.c_str(), search.scope, search.filter.c_str(), attributes.data(), 0,
                          page.get() == nullptr ? nullptr : controls.data(), nullptr, nullptr, LDAP_NO_LIMIT, &id);
    if (status != LDAP_SUCCESS) {
        return failure(ldapError(status, what("search"), _handle.get()));
    }
    return id;
}

LdapEntry LdapConnection::entryOf(LDAPMessage* message) {
    LdapEntry entry;
    BerElement* ber = nullptr;
    berval dn{};
    if (::ldap_get_dn_ber(_handle.get(), message, &ber, &dn) != LDAP_SUCCESS) {
        return entry;
    }
    const std::unique_ptr<BerElement, FreeBer> owned(ber);
    entry.dn = textOf(dn);
    berval name{};
    BerVarray values = nullptr;
    while (::ldap_get_attribute_ber(_handle.get(), message, ber, &name, &values) == LDAP_SUCCESS &&
           name.bv_val != nullptr) {
        auto& texts = entry.attributes.emplace_back(textOf(name), std::vector<std::string>()).second;
        for (const berval* value = values; value != nullptr && value->bv_val != nullptr; ++value) {
            texts.push_back(textOf(*value));
        }
        ::ber_memfree(values);  // the array; the values are in the message
        values = nullptr;
    }
    return entry;
}

tl::unexpected<Error> LdapConnection::tooMuch() const {
    return failure(ldapError(
        LDAP_SIZELIMIT_EXCEEDED, what("search"),
        fmt::format("the server sends more than {} entries or {} bytes", searchBounds.entries, searchBounds.bytes)));
}

Result<std::optional<std::string>> LdapConnection::collect(int id, const LdapEntrySink& sink, Collected& collected) {
    const Clock::time_point end = beginOperation();
    while (true) {
        const auto message = receive(id, LDAP_MSG_ONE, end, "search");
        if (!message) {
            return failure(message.error());
        }
        const int type = ::ldap_msgtype(message->get());
        if (type == LDAP_RES_SEARCH_ENTRY) {
            LdapEntry entry = entryOf(message->get());
            ++collected.entries;
            collected.bytes += sizeOf(entry);
            const bool isTooMuch = collected.entries > searchBounds.entries || collected.bytes > searchBounds.bytes;
            if (isTooMuch || !sink(std::move(entry))) {
                ::ldap_abandon_ext(_handle.get(), id, nullptr, nullptr);
                return isTooMuch ? tooMuch() : Result<std::optional<std::string>>(std::optional<std::string>());
            }
            continue;
        }
        if (type != LDAP_RES_SEARCH_RESULT) {
            continue;  // a continuation reference: other servers are not asked
        }
        int code = LDAP_OTHER;
        char* words = nullptr;
        LDAPControl** received = nullptr;
        const int parsed =
            ::ldap_parse_result(_handle.get(), message->get(), &code, nullptr, &words, nullptr, &received, 0);
        const LdapText ownedWords(words);
        const Controls controls(received);
        if (parsed != LDAP_SUCCESS || code != LDAP_SUCCESS) {
            return failure(
                ldapError(parsed != LDAP_SUCCESS ? parsed : code, what("search"), words == nullptr ? "" : words));
        }
        LDAPControl* const page = ::ldap_control_find(LDAP_CONTROL_PAGEDRESULTS, received, nullptr);
        berval cookie{};
        ber_int_t estimate = 0;
        if (page == nullptr ||
            ::ldap_parse_pageresponse_control(_handle.get(), page, &estimate, &cookie) != LDAP_SUCCESS) {
            return std::optional(std::string());
        }
        std::string next = textOf(cookie);
        ::ber_memfree(cookie.bv_val);
        return std::optional(std::move(next));
    }
}

Result<void> LdapConnection::search(const LdapSearch& search, const LdapEntrySink& sink) {
    std::string cookie;
    Collected collected;
    for (;;) {
        const std::size_t before = collected.entries;
        const auto id = send(search, cookie);
        if (!id) {
            return failure(id.error());
        }
        auto next = collect(*id, sink, collected);
        if (!next) {
            return failure(next.error());
        }
        if (next->value_or("").empty()) {
            return {};
        }
        // Some servers use one cookie for all pages. Without entries too, the search would not end.
        if (**next == cookie && collected.entries == before) {
            return failure(ldapError(LDAP_LOCAL_ERROR, what("search"), "the server sends the same empty page again"));
        }
        cookie = **std::move(next);
    }
}

Result<void> LdapConnection::searchBoth(const LdapSearch& first, const LdapEntrySink& firstSink,
                                        const LdapSearch& second, const LdapEntrySink& secondSink) {
    const auto firstId = send(first, {});
    if (!firstId) {
        return failure(firstId.error());
    }
    const auto secondId = send(second, {});
    if (!secondId) {
        return failure(secondId.error());
    }
    Collected ofFirst;
    Collected ofSecond;
    if (const auto collected = collect(*firstId, firstSink, ofFirst); !collected) {
        ::ldap_abandon_ext(_handle.get(), *secondId, nullptr, nullptr);
        return failure(collected.error());
    }
    if (const auto collected = collect(*secondId, secondSink, ofSecond); !collected) {
        return failure(collected.error());
    }
    return {};
}

}  // namespace adminhost
