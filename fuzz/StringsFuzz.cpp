// Strings tables: a rejected table has a reason, and an accepted one, written in quoted-text form, reads back as the
// same table.

#include "platform/bundle/StringsTable.h"

#include <cstdlib>
#include <string>

namespace {

using namespace adminhost;

bool writeText(std::string& out, const std::string& text) {
    out += '"';
    for (const char c : text) {
        if (c == '\0') {
            return false;
        }
        if (c == '"' || c == '\\') {
            out += '\\';
        }
        out += c;
    }
    out += '"';
    return true;
}

bool writeEntries(std::string& out, const Dictionary& dictionary, int depth);

/// Returns false if only the other forms can hold the value.
bool writeValue(std::string& out, const Value& value, int depth) {
    if (depth > stringsTableMaximumDepth) {
        return false;
    }
    if (value.string() != nullptr) {
        return writeText(out, *value.string());
    }
    if (value.dictionary() != nullptr) {
        out += '{';
        const bool good = writeEntries(out, *value.dictionary(), depth + 1);
        out += '}';
        return good;
    }
    if (value.array() != nullptr) {
        out += '(';
        for (const Value& element : *value.array()) {
            if (!writeValue(out, element, depth + 1)) {
                return false;
            }
            out += ',';
        }
        out += ')';
        return true;
    }
    if (value.data() != nullptr) {
        constexpr const char* digits = "0123456789abcdef";
        out += '<';
        for (const std::uint8_t byte : *value.data()) {
            out += digits[byte >> 4U];
            out += digits[byte & 15U];
        }
        out += '>';
        return true;
    }
    return false;
}

bool writeEntries(std::string& out, const Dictionary& dictionary, int depth) {
    for (const DictionaryEntry& entry : dictionary) {
        if (!writeText(out, entry.key)) {
            return false;
        }
        out += '=';
        if (!writeValue(out, entry.value, depth)) {
            return false;
        }
        out += ';';
    }
    return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const auto table = parseStringsTable({reinterpret_cast<const char*>(data), size});
    if (!table) {
        if (table.error().description.value_or("").empty()) {
            std::abort();
        }
        return 0;
    }
    std::string text;
    if (writeEntries(text, *table, 1) && parseStringsTable(text) != table) {
        std::abort();
    }
    return 0;
}
