#pragma once

// One key of the configuration file, with typed access to its value. Every mistake is a std::runtime_error with the
// file, the line, the column, what is wrong, and what is expected.

#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <toml++/toml.h>

namespace adminhost {

class ConfigurationEntry {
  public:
    /// The names are those of the tables that the key is in: "directory.node.". All must outlive the entry.
    ConfigurationEntry(const std::string& file, std::string_view tables, const toml::key& key, const toml::node& node)
        : _file(file), _tables(tables), _key(key), _node(node) {}

    [[nodiscard]] std::string_view key() const noexcept { return _key.str(); }
    [[nodiscard]] const std::string& file() const noexcept { return _file; }
    [[nodiscard]] const toml::node& node() const noexcept { return _node; }

    /// Throws: the value must be what is expected.
    [[noreturn]] void fail(std::string_view expected) const;
    /// Throws: anything else that is wrong with the value.
    [[noreturn]] void reject(std::string_view problem) const;
    /// Throws: the key is not one of those that are known.
    [[noreturn]] void rejectAsUnknown(std::span<const std::string_view> known) const;

    [[nodiscard]] std::string text() const;
    /// A text that is not empty.
    [[nodiscard]] std::string name() const;
    [[nodiscard]] std::vector<std::string> texts() const;
    [[nodiscard]] bool boolean() const;
    /// Above 0 and at most a day.
    [[nodiscard]] double seconds() const;
    [[nodiscard]] std::int64_t wholeNumber(std::int64_t least, std::int64_t most) const;
    /// The value that belongs to one of the words.
    template <class T, class Words = std::initializer_list<std::pair<std::string_view, T>>>
    [[nodiscard]] T choice(const Words& words) const {
        const std::optional<std::string> text = _node.value_exact<std::string>();
        std::string expected;
        for (const auto& [word, value] : words) {
            if (text == word) {
                return value;
            }
            expected.append(expected.empty() ? "\"" : " or \"").append(word).append(1, '"');
        }
        fail(expected);
    }
    /// Calls the function for each key of the table that the value must be.
    void forEach(std::string_view tables, const std::function<void(const ConfigurationEntry&)>& function) const;

  private:
    const std::string& _file;
    std::string_view _tables;
    const toml::key& _key;
    const toml::node& _node;
};

/// "FILE, line 3, column 7".
[[nodiscard]] std::string placeText(const std::string& file, const toml::source_position& place);

}  // namespace adminhost
