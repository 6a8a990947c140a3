#include "resources/StatementText.h"

#include "resources/Property.h"

#include <algorithm>
#include <array>

namespace lumio {
namespace {

constexpr std::size_t maximumText = 95'000;  // bytes; one argument has 128 KiB, and protection adds a good third
constexpr std::array<std::string_view, 3> rowNames = {"rowid", "oid", "_rowid_"};
constexpr std::string_view hidden = "(secret)";
/// Shorter secrets are found within ordinary words.
constexpr std::size_t telling = 6;

char lower(char c) noexcept {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

bool isWordCharacter(char c) noexcept {
    return (c >= '0' && c <= '9') || (lower(c) >= 'a' && lower(c) <= 'z') || static_cast<unsigned char>(c) >= 0x80;
}

bool equalWithoutCase(std::string_view a, std::string_view b) noexcept {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](char x, char y) { return lower(x) == lower(y); });
}

/// The text as the tool shows a statement: every kind of blank becomes a space.
std::string withBlanks(std::string_view text) {
    std::string shown(text);
    std::replace_if(
        shown.begin(), shown.end(),
        [](char c) { return c == '\n' || c == '\t' || c == '\r' || c == '\v' || c == '\f'; }, ' ');
    return shown;
}

void hideWhole(std::string& message, std::string_view secret) {
    for (std::size_t at = message.find(secret); at != std::string::npos; at = message.find(secret, at)) {
        const std::size_t end = at + secret.size();
        const bool alone =
            (at == 0 || !isWordCharacter(message[at - 1])) && (end == message.size() || !isWordCharacter(message[end]));
        if (alone || secret.size() >= telling) {
            message.replace(at, secret.size(), hidden);
            at += hidden.size();
        } else {
            ++at;
        }
    }
}

/// The line with the part hidden that an excerpt of the statement shares with [begin, end) of it.
std::string excerptWithoutSecret(const std::string& line, const std::string& statement, std::size_t begin,
                                 std::size_t end) {
    const std::size_t indent = std::min(line.find_first_not_of(' '), line.size());
    for (std::size_t skip = std::min<std::size_t>(indent, 2);; skip = indent) {
        const std::string_view excerpt = std::string_view(line).substr(skip);
        const std::size_t at = excerpt.empty() ? std::string::npos : statement.find(excerpt);
        if (at != std::string::npos) {
            const std::size_t from = std::max(at, begin);
            const std::size_t to = std::min(at + excerpt.size(), end);
            return from < to ? line.substr(0, skip + from - at) + std::string(hidden) + line.substr(skip + to - at)
                             : line;
        }
        if (skip == indent) {
            return line;
        }
    }
}

}  // namespace

std::optional<std::string> whyUnfitForStatement(std::string_view text) {
    if (text.find('"') != std::string_view::npos) {
        return "holds a double quote, which would end it within the statement";
    }
    if (text.find('\0') != std::string_view::npos) {
        return "holds a NUL, which no argument of a tool can carry";
    }
    if (text.size() > maximumText) {
        return "is longer than 95 kB, which no argument of a tool could carry";
    }
    const auto same = [&](std::string_view name) { return equalWithoutCase(name, text); };
    const std::vector<std::string>& columns = Property::tableColumnNames();
    if (std::any_of(columns.begin(), columns.end(), same) || std::any_of(rowNames.begin(), rowNames.end(), same)) {
        return "is the name of a column, which the database would read instead";
    }
    return std::nullopt;
}

std::string withoutSecret(std::string_view message, std::string_view secret, std::string_view statement) {
    std::string text(message);
    if (secret.empty()) {
        return text;
    }
    const std::string shownStatement = withBlanks(statement);
    const std::size_t begin = shownStatement.find('"' + withBlanks(secret) + '"') + 1;
    hideWhole(text, secret);
    hideWhole(text, withBlanks(secret));
    std::string result;
    for (std::size_t at = 0; at <= text.size();) {
        const std::size_t end = std::min(text.find('\n', at), text.size());
        const std::string line = text.substr(at, end - at);
        result += begin == 0 ? line : excerptWithoutSecret(line, shownStatement, begin, begin + secret.size());
        result += end < text.size() ? "\n" : "";
        at = end + 1;
    }
    return result;
}

}  // namespace lumio
