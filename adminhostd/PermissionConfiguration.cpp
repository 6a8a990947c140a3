#include "adminhostd/PermissionConfiguration.h"

#include <stdexcept>

#include <fmt/format.h>

namespace adminhost {
namespace {

using Entry = ConfigurationEntry;

constexpr std::string_view tables = "permission.";
constexpr std::string_view known[] = {"users", "groups", "classes"};
constexpr std::int64_t largestId = 0xffff'fffe;  ///< the next one means "no account"

/// Calls the function for each element of the list that the key must be; each is an entry of its own, with its place.
template <class Function>
void forEachElement(const Entry& entry, const toml::key& key, const char* expected, Function function) {
    const toml::array* list = entry.node().as_array();
    if (list == nullptr || list->empty()) {
        entry.fail(expected);
    }
    for (const toml::node& element : *list) {
        function(Entry(entry.file(), tables, key, element));
    }
}

std::vector<ConfiguredAccount> accounts(const Entry& entry, const toml::key& key) {
    constexpr const char* expected = "a list of names or numbers, and not empty";
    std::vector<ConfiguredAccount> list;
    forEachElement(entry, key, expected, [&](const Entry& element) {
        ConfiguredAccount account;
        account.place = placeText(element.file(), element.node().source().begin);
        if (const auto number = element.node().value_exact<std::int64_t>()) {
            if (*number < 0 || *number > largestId) {
                element.fail(expected);
            }
            account.id = static_cast<id_t>(*number);
        } else {
            account.name = element.node().value_exact<std::string>().value_or("");
            if (account.name.empty()) {
                element.fail(expected);
            }
        }
        list.push_back(std::move(account));
    });
    return list;
}

Rights classes(const Entry& entry, const toml::key& key) {
    Rights rights;
    forEachElement(entry, key, "a list of classes, and not empty",
                   [&](const Entry& element) { rights.add(element.choice<Right>(rightWords)); });
    return rights;
}

PermissionOptions permission(const std::string& file, const toml::table& table) {
    PermissionOptions read;
    for (const auto& [key, node] : table) {
        const Entry entry(file, tables, key, node);
        if (key == "users") {
            read.users = accounts(entry, key);
        } else if (key == "groups") {
            read.groups = accounts(entry, key);
        } else if (key == "classes") {
            read.rights = classes(entry, key);
        } else {
            entry.rejectAsUnknown(known);
        }
    }
    const auto lacks = [&](const char* what) {
        throw std::runtime_error(
            fmt::format("{}: \"permission\" lacks {}", placeText(file, table.source().begin), what));
    };
    if (read.users.empty() && read.groups.empty()) {
        lacks("\"users\" or \"groups\"");
    }
    if (!read.rights.any()) {
        lacks("\"classes\"");
    }
    return read;
}

}  // namespace

void readPermissions(const ConfigurationEntry& entry, std::vector<PermissionOptions>& permissions) {
    constexpr const char* expected = "a list of tables: [[permission]]";
    const toml::array* list = entry.node().as_array();
    if (list == nullptr) {
        entry.fail(expected);
    }
    for (const toml::node& element : *list) {
        const toml::table* table = element.as_table();
        if (table == nullptr) {
            entry.fail(expected);
        }
        permissions.push_back(permission(entry.file(), *table));
    }
}

}  // namespace adminhost
