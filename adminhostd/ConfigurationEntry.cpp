#include "adminhostd/ConfigurationEntry.h"

#include <cmath>
#include <stdexcept>

#include <fmt/format.h>
#include <fmt/ranges.h>

namespace adminhost {
namespace {

constexpr double longest = 86'400;  ///< seconds

}  // namespace

std::string placeText(const std::string& file, const toml::source_position& place) {
    return place ? fmt::format("{}, line {}, column {}", file, place.line, place.column) : file;
}

void ConfigurationEntry::fail(std::string_view expected) const {
    reject(fmt::format("must be {}", expected));
}

void ConfigurationEntry::reject(std::string_view problem) const {
    throw std::runtime_error(
        fmt::format("{}: \"{}{}\" {}", placeText(_file, _node.source().begin), _tables, key(), problem));
}

void ConfigurationEntry::rejectAsUnknown(std::span<const std::string_view> known) const {
    throw std::runtime_error(fmt::format("{}: unknown key \"{}{}\"; known keys: {}",
                                         placeText(_file, _key.source().begin), _tables, key(),
                                         fmt::join(known, ", ")));
}

std::string ConfigurationEntry::text() const {
    const auto value = _node.value_exact<std::string>();
    return value ? *value : (fail("a text"), std::string());
}

std::string ConfigurationEntry::name() const {
    std::string value = text();
    return !value.empty() ? value : (fail("a text that is not empty"), std::string());
}

std::vector<std::string> ConfigurationEntry::texts() const {
    constexpr const char* expected = "a list of texts";
    std::vector<std::string> list;
    const toml::array* array = _node.as_array();
    if (array == nullptr) {
        fail(expected);
    }
    for (const toml::node& element : *array) {
        const auto value = element.value_exact<std::string>();
        if (!value) {
            fail(expected);
        }
        list.push_back(*value);
    }
    return list;
}

bool ConfigurationEntry::boolean() const {
    const auto value = _node.value_exact<bool>();
    return value ? *value : (fail("true or false"), false);
}

double ConfigurationEntry::seconds() const {
    const auto value = _node.is_number() ? _node.value<double>() : std::nullopt;
    if (!value || !std::isfinite(*value) || *value <= 0 || *value > longest) {
        fail("a number of seconds, above 0 and at most 86400");
    }
    return *value;
}

std::int64_t ConfigurationEntry::wholeNumber(std::int64_t least, std::int64_t most) const {
    const auto value = _node.value_exact<std::int64_t>();
    if (!value || *value < least || *value > most) {
        fail(fmt::format("a whole number from {} to {}", least, most));
    }
    return *value;
}

void ConfigurationEntry::forEach(std::string_view tables,
                                 const std::function<void(const ConfigurationEntry&)>& function) const {
    const toml::table* table = _node.as_table();
    if (table == nullptr) {
        fail("a table");
    }
    for (const auto& [key, node] : *table) {
        function(ConfigurationEntry(_file, tables, key, node));
    }
}

}  // namespace adminhost
