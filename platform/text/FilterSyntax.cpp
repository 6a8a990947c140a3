#include "platform/text/FilterSyntax.h"

#include <algorithm>

namespace adminhost {
namespace {

constexpr std::size_t deepest = 100;

bool isLetter(char c) noexcept {
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
}

bool isDigit(char c) noexcept {
    return c >= '0' && c <= '9';
}

bool isHex(char c) noexcept {
    return isDigit(c) || (c >= 'a' && c <= 'f') || (c >= 'A' && c <= 'F');
}

bool isKeyCharacter(char c) noexcept {
    return isLetter(c) || isDigit(c) || c == '-';
}

/// The name or the number of an attribute or a matching rule.
bool isIdentifier(std::string_view text) noexcept {
    if (text.empty()) {
        return false;
    }
    if (isLetter(text.front())) {
        return std::all_of(text.begin(), text.end(), isKeyCharacter);
    }
    char before = '.';
    for (const char c : text) {
        if (c == '.' ? before == '.' : !isDigit(c)) {
            return false;
        }
        before = c;
    }
    return before != '.';
}

class FilterParser {
  public:
    explicit FilterParser(std::string_view text) noexcept : _text(text) {}

    std::optional<FilterProblem> run() {
        if (filter(0) && _at != _text.size()) {
            fail("the end of the filter");
        }
        return std::move(_problem);
    }

  private:
    [[nodiscard]] char next() const noexcept { return _at < _text.size() ? _text[_at] : '\0'; }

    bool fail(std::string_view expected) {
        _problem = FilterProblem{_at, std::string(expected)};
        return false;
    }
    bool pass(char c, std::string_view expected) {
        if (next() != c || _at == _text.size()) {
            return fail(expected);
        }
        ++_at;
        return true;
    }
    void skipBlanks() noexcept {
        while (next() == ' ' || next() == '\t' || next() == '\n') {
            ++_at;
        }
    }

    bool filter(std::size_t depth) {
        if (depth > deepest) {
            return fail("filters that are not nested as deep");
        }
        if (!pass('(', "an opening parenthesis")) {
            return false;
        }
        switch (next()) {
            case '&':
            case '|':
                ++_at;
                return list(depth);
            case '!':
                ++_at;
                skipBlanks();
                return filter(depth + 1) && pass(')', "a closing parenthesis");
            default:
                return item();
        }
    }

    bool list(std::size_t depth) {
        for (skipBlanks(); next() == '('; skipBlanks()) {
            if (!filter(depth + 1)) {
                return false;
            }
        }
        return pass(')', "a filter in parentheses, or a closing parenthesis");
    }

    bool item() {
        const std::size_t equals = _text.find_first_of("=()", _at);
        if (equals == std::string_view::npos || _text[equals] != '=') {
            return fail("an attribute, an equals sign and a value");
        }
        std::string_view left = _text.substr(_at, equals - _at);
        const bool extensible = left.ends_with(':');
        if (extensible || left.ends_with('~') || left.ends_with('<') || left.ends_with('>')) {
            left.remove_suffix(1);
        }
        if (!(extensible ? isRule(left) : isLdapAttribute(left))) {
            return fail("the name of an attribute");
        }
        const bool equality = equals == _at + left.size();
        _at = equals + 1;
        return value(equality);
    }

    /// The left side of ":=": an attribute, a rule, or both, and perhaps ":dn" between them.
    static bool isRule(std::string_view left) noexcept {
        const std::size_t colon = left.find(':');
        const std::string_view attribute = left.substr(0, colon);
        if (!attribute.empty() && !isLdapAttribute(attribute)) {
            return false;
        }
        if (colon == std::string_view::npos) {
            return !attribute.empty();
        }
        std::string_view rule = left.substr(colon + 1);
        if (rule == "dn") {
            return !attribute.empty();
        }
        if (rule.starts_with("dn:")) {
            rule.remove_prefix(3);
        }
        return isIdentifier(rule);
    }

    bool value(bool starsAllowed) {
        for (; next() != ')'; ++_at) {
            if (_at == _text.size()) {
                return fail("a closing parenthesis");
            }
            if (next() == '\0' || next() == '(' || (next() == '*' && !starsAllowed)) {
                return fail("\\00, \\28, \\29 or \\2a in place of this character");
            }
            if (next() == '\\') {
                if (_at + 2 >= _text.size() || !isHex(_text[_at + 1]) || !isHex(_text[_at + 2])) {
                    return fail("two hexadecimal digits after the backslash");
                }
                _at += 2;
            }
        }
        ++_at;
        return true;
    }

    std::string_view _text;
    std::size_t _at = 0;
    std::optional<FilterProblem> _problem;
};

}  // namespace

std::optional<FilterProblem> ldapFilterProblem(std::string_view filter) {
    return FilterParser(filter).run();
}

bool isLdapAttribute(std::string_view text) noexcept {
    const std::size_t options = text.find(';');
    if (!isIdentifier(text.substr(0, options))) {
        return false;
    }
    for (std::size_t at = options; at != std::string_view::npos;) {
        const std::size_t end = text.find(';', at + 1);
        const std::string_view option = text.substr(at + 1, end == std::string_view::npos ? end : end - at - 1);
        if (option.empty() || !std::all_of(option.begin(), option.end(), isKeyCharacter)) {
            return false;
        }
        at = end;
    }
    return true;
}

}  // namespace adminhost
