#pragma once

// Answers as people read them: aligned keys, tables for lists of dictionaries, sizes, durations and dates as texts.

#include "adminhostctl/Description.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace adminhost::ctl {

/// Formats an answer. Units and headings come from the command's description. Keys that it does not describe are shown
/// according to their type.
class Reading {
  public:
    /// With columns, which are keys of its elements, a list that is the whole value is shown with these columns instead
    /// of those that the description names.
    Reading(const Description& description, std::size_t width, std::vector<std::string> columns = {}) noexcept
        : _description(description), _width(width), _columns(std::move(columns)) {}

    /// The text of the value at the path of the answer; "" is the whole answer. Ends in a line feed.
    [[nodiscard]] std::string text(const Value& value, const std::string& path = {}) const;

  private:
    void appendDictionary(std::string& text, const Dictionary& dictionary, const std::string& path,
                          std::size_t indent) const;
    void appendTable(std::string& text, const Array& rows, const std::string& path, std::size_t indent) const;
    [[nodiscard]] bool isPeople(const Value& value, const std::string& path) const;
    [[nodiscard]] bool isSection(const Value& value, const std::string& path) const;
    [[nodiscard]] std::string personAt(const Dictionary& entry, const std::string& path) const;
    [[nodiscard]] std::string cell(const Value& value, const std::string& path) const;

    const Description& _description;
    std::size_t _width;
    std::vector<std::string> _columns;
};

/// "4096 MB", "30 s": the number with the unit that the description gives it; empty without a number or a known unit. A
/// setting's number is shown as it is stored.
[[nodiscard]] std::string textWithUnit(const Value& value, const std::string& unit);
/// The word that people read and type for the unit of a setting ("MB" for "megabytes"); empty for other units.
[[nodiscard]] std::string_view wordOfUnit(std::string_view unit);
/// "1.2 TB": decimal units.
[[nodiscard]] std::string sizeText(std::uint64_t bytes);
/// "31 Jan 2026, 09:00", local time.
[[nodiscard]] std::string dateText(Date date);
/// "Anna Berg (user)" for a dictionary that the key describes as a person or group; empty for another one.
[[nodiscard]] std::string personText(const DescribedKey& element, const Dictionary& entry);

}  // namespace adminhost::ctl
