#include "adminhostctl/Width.h"

#include "platform/text/Utf8.h"

#include <algorithm>
#include <clocale>
#include <cstdint>
#include <cwchar>

#include <fmt/format.h>

namespace adminhost::ctl {
namespace {

/// Widths are those of the C library's Unicode locale, whatever locale the program runs in.
class UnicodeLocale {
  public:
    UnicodeLocale() noexcept : _locale(::newlocale(LC_CTYPE_MASK, "C.UTF-8", nullptr)) {}
    ~UnicodeLocale() {
        if (_locale != nullptr) {
            ::freelocale(_locale);
        }
    }
    UnicodeLocale(const UnicodeLocale&) = delete;
    UnicodeLocale& operator=(const UnicodeLocale&) = delete;

    [[nodiscard]] std::size_t width(char32_t code) const noexcept {
        if (code < 0x80 || _locale == nullptr) {
            return 1;
        }
        const ::locale_t before = ::uselocale(_locale);
        const int width = ::wcwidth(static_cast<wchar_t>(code));
        ::uselocale(before);
        return width < 0 ? 1 : static_cast<std::size_t>(width);
    }

  private:
    ::locale_t _locale;
};

std::size_t widthOfCode(char32_t code) {
    static const UnicodeLocale locale;
    return locale.width(code);
}

bool isActedOn(char32_t code) noexcept {
    return code < 0x20 || (code >= 0x7F && code < 0xA0) || code == 0x061C || (code >= 0x200E && code <= 0x200F) ||
           (code >= 0x2028 && code <= 0x202E) || (code >= 0x2066 && code <= 0x2069);
}

template <typename Write>
std::string replaced(std::string_view text, const Write& write) {
    const std::string clean = utf8Of(text);
    std::string out;
    for (std::size_t at = 0; at < clean.size();) {
        const Utf8Character character = firstCharacterOf(std::string_view(clean).substr(at));
        // Line feeds and tabs are part of the layout of every format; those within values are escaped already.
        if (isActedOn(character.code) && character.code != '\n' && character.code != '\t') {
            out += write(static_cast<std::uint32_t>(character.code));
        } else {
            out.append(clean, at, character.size);
        }
        at += character.size;
    }
    return out;
}

/// Length of the longest prefix of at most so many columns; at least one character.
std::size_t fitting(std::string_view text, std::size_t width) {
    std::size_t at = 0;
    std::size_t used = 0;
    while (at < text.size()) {
        const Utf8Character character = firstCharacterOf(std::string_view(text).substr(at));
        const std::size_t more = widthOfCode(character.code);
        if (used + more > width && at > 0) {
            break;
        }
        used += more;
        at += character.size;
    }
    return at;
}

}  // namespace

std::string shown(std::string_view text) {
    const std::string clean = utf8Of(text);
    std::string out;
    for (std::size_t at = 0; at < clean.size();) {
        const Utf8Character character = firstCharacterOf(std::string_view(clean).substr(at));
        if (character.code != '\n' && isActedOn(character.code)) {
            out += character.code < 0x100 ? fmt::format("\\x{:02x}", static_cast<std::uint32_t>(character.code))
                                          : fmt::format("\\u{:04x}", static_cast<std::uint32_t>(character.code));
        } else {
            out.append(clean, at, character.size);
        }
        at += character.size;
    }
    return out;
}

std::string shownIndented(std::string_view text, std::size_t indent) {
    std::string out = shown(text);
    for (std::size_t at = out.find('\n'); at != std::string::npos; at = out.find('\n', at + 1)) {
        out.insert(at + 1, indent, ' ');
    }
    return out;
}

std::string shownJson(std::string_view json) {
    return replaced(json, [](std::uint32_t code) { return fmt::format("\\u{:04x}", code); });
}

std::string shownXml(std::string_view xml) {
    return replaced(xml, [](std::uint32_t code) { return fmt::format("&#x{:x};", code); });
}

std::size_t widthOf(std::string_view text) {
    std::size_t width = 0;
    for (std::size_t at = 0; at < text.size();) {
        const Utf8Character character = firstCharacterOf(std::string_view(text).substr(at));
        width += widthOfCode(character.code);
        at += character.size;
    }
    return width;
}

std::vector<std::string> wrapped(std::string_view text, std::size_t width) {
    std::vector<std::string> lines;
    do {
        std::size_t end = std::min(text.find('\n'), text.size());
        std::string_view line = text.substr(0, end);
        text.remove_prefix(std::min(end + 1, text.size()));
        while (widthOf(line) > width) {
            std::size_t cut = fitting(line, width);
            const std::size_t blank = line.rfind(' ', cut);
            const bool atBlank = blank != std::string_view::npos && blank > 0;
            cut = atBlank ? blank : cut;
            lines.emplace_back(line.substr(0, cut));
            line.remove_prefix(cut + (atBlank ? 1U : 0U));
        }
        lines.emplace_back(line);
    } while (!text.empty());
    return lines;
}

std::string beside(std::string_view name, std::string_view text, const TextPlace& place) {
    constexpr std::size_t least = 20;
    constexpr std::size_t gap = 2;
    const bool isNarrow = place.column + least > place.width;
    std::string all;
    const std::vector<std::string> names = wrapped(name, std::max(place.width, place.below + least) - place.below);
    for (const std::string& line : names) {
        all.append(all.empty() ? "" : "\n" + std::string(place.below, ' ')).append(line);
    }
    const std::size_t used = widthOf(names.back()) + (names.size() > 1 ? place.below : 0);
    std::size_t begin = place.column;
    if (name.find_first_not_of(' ') == std::string_view::npos) {
        begin = isNarrow ? place.below : place.column;
        all.assign(begin, ' ');
    } else if (isNarrow && used + gap + widthOf(text) <= place.width && text.find('\n') == std::string_view::npos) {
        begin = used + gap;
        all.append(gap, ' ');
    } else if (isNarrow || used + gap > place.column) {
        begin = isNarrow ? place.below : place.column;
        all.append(1, '\n').append(begin, ' ');
    } else {
        all.append(place.column - used, ' ');
    }
    bool isFirst = true;
    for (const std::string& line : wrapped(text, std::max(place.width, begin + least) - begin)) {
        all.append(isFirst ? 0 : begin, ' ').append(line);
        all.erase(all.find_last_not_of(' ') + 1);
        all += '\n';
        isFirst = false;
    }
    return all;
}

}  // namespace adminhost::ctl
