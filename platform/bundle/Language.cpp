#include "platform/bundle/Language.h"

#include <algorithm>
#include <cctype>
#include <optional>
#include <unordered_map>

#include <unicode/locid.h>
#include <unicode/uloc.h>

namespace adminhost {
namespace {

struct LanguageTag {
    std::string canonical;  ///< all the given parts, in canonical spelling
    std::string language;
    std::string script;      ///< given or likely
    std::string region;      ///< given or likely
    bool hasRegion = false;  ///< given
};

/// Lower case, with single blanks for "_" and "-".
std::string plainName(std::string_view name) {
    std::string plain;
    for (const char c : name) {
        const bool blank = c == '_' || c == '-' || c == ' ';
        plain += blank ? ' ' : static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    }
    return plain;
}

/// English names that ICU's own list lacks, or that mean more than a language there.
constexpr std::pair<const char*, const char*> otherNames[] = {
    {"simplified chinese", "zh-Hans"},
    {"traditional chinese", "zh-Hant"},
    {"chinese (simplified)", "zh-Hans"},
    {"chinese (traditional)", "zh-Hant"},
    {"brazilian portuguese", "pt-BR"},
    {"portuguese (brazil)", "pt-BR"},
    {"european portuguese", "pt-PT"},
    {"portuguese (portugal)", "pt-PT"},
    {"british english", "en-GB"},
    {"american english", "en-US"},
    {"australian english", "en-AU"},
    {"canadian english", "en-CA"},
    {"canadian french", "fr-CA"},
    {"swiss french", "fr-CH"},
    {"swiss german", "de-CH"},
    {"austrian german", "de-AT"},
    {"mexican spanish", "es-MX"},
    {"latin american spanish", "es-419"},
    {"castilian", "es"},
    {"flemish", "nl-BE"},
    {"farsi", "fa"},
    {"moldavian", "ro-MD"},
    {"norwegian bokmal", "nb"},
};

/// Codes by the English names of languages. Built on the first use: most bundles and people name languages by codes.
const std::unordered_map<std::string, std::string>& codesByName() {
    static const std::unordered_map<std::string, std::string> codes = [] {
        std::unordered_map<std::string, std::string> made;
        for (const auto& [name, code] : otherNames) {
            made.emplace(name, code);
        }
        for (const char* const* language = uloc_getISOLanguages(); *language != nullptr; ++language) {
            UErrorCode status = U_ZERO_ERROR;
            UChar name[128];
            const int length = uloc_getDisplayLanguage(*language, "en", name, 128, &status);
            if (U_SUCCESS(status) && status != U_USING_DEFAULT_WARNING) {
                std::string text;
                icu::UnicodeString(name, length).toUTF8String(text);
                made.emplace(plainName(text), *language);
            }
        }
        return made;
    }();
    return codes;
}

/// A code begins with the two or three letters of its language; what follows begins with one of "-_.@". Names of three
/// letters are few, and ICU knows which of such texts are codes.
bool isCode(std::string_view text) {
    const std::size_t letters = std::min(text.find_first_of("-_.@"), text.size());
    const auto isLetter = [](char c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z'); };
    if (letters < 2 || letters > 3 || !std::all_of(text.begin(), text.begin() + static_cast<long>(letters), isLetter)) {
        return false;
    }
    return letters < text.size() || letters == 2 || *uloc_getISO3Language(plainName(text).c_str()) != '\0';
}

std::optional<LanguageTag> tagOf(std::string_view nameOrCode) {
    std::string code(nameOrCode);
    if (!isCode(nameOrCode)) {
        const auto found = codesByName().find(plainName(nameOrCode));
        if (found == codesByName().end()) {
            return std::nullopt;
        }
        code = found->second;
    }
    UErrorCode status = U_ZERO_ERROR;
    icu::Locale locale = icu::Locale::createCanonical(code.c_str());
    locale.canonicalize(status);
    if (U_FAILURE(status) || locale.isBogus() || *locale.getLanguage() == '\0') {
        return std::nullopt;
    }
    LanguageTag tag;
    // Norwegian without more is its written standard Bokmål.
    const std::string_view language = locale.getLanguage();
    tag.language = language == "no" ? "nb" : language;
    tag.canonical = tag.language + std::string(locale.getName() + language.size());
    tag.hasRegion = *locale.getCountry() != '\0';
    icu::Locale likely = locale;
    likely.addLikelySubtags(status);
    if (U_FAILURE(status)) {
        likely = locale;
    }
    tag.script = likely.getScript();
    tag.region = likely.getCountry();
    return tag;
}

struct Candidate {
    std::string spelling;
    std::optional<LanguageTag> tag;
};

std::vector<Candidate> candidatesOf(const std::vector<std::string>& localizations) {
    std::vector<Candidate> candidates;
    candidates.reserve(localizations.size());
    for (const std::string& localization : localizations) {
        candidates.push_back({localization, tagOf(localization)});
    }
    return candidates;
}

enum Rank { sameSpelling, sameTag, sameLikelyTag, withoutRegion, otherRegion, noMatch };

Rank rankOf(const Candidate& candidate, std::string_view spelling, const std::optional<LanguageTag>& wanted) {
    if (candidate.spelling == spelling) {
        return sameSpelling;
    }
    const std::optional<LanguageTag>& tag = candidate.tag;
    if (!tag || !wanted || tag->language != wanted->language || tag->script != wanted->script) {
        return noMatch;
    }
    if (tag->canonical == wanted->canonical) {
        return sameTag;
    }
    if (tag->region == wanted->region) {
        return sameLikelyTag;
    }
    return tag->hasRegion ? otherRegion : withoutRegion;
}

/// Appends those that are not yet in the list, up to the given rank.
void appendMatches(std::vector<std::string>& matches, const std::vector<Candidate>& candidates,
                   std::string_view spelling, Rank last) {
    const std::optional<LanguageTag> wanted = tagOf(spelling);
    std::vector<std::pair<Rank, const std::string*>> ranked;
    ranked.reserve(candidates.size());
    for (const Candidate& candidate : candidates) {
        ranked.emplace_back(rankOf(candidate, spelling, wanted), &candidate.spelling);
    }
    std::stable_sort(ranked.begin(), ranked.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
    for (const auto& [rank, localization] : ranked) {
        if (rank <= last && std::find(matches.begin(), matches.end(), *localization) == matches.end()) {
            matches.push_back(*localization);
        }
    }
}

}  // namespace

bool isLanguage(std::string_view nameOrCode) {
    return tagOf(nameOrCode).has_value();
}

std::vector<std::string> matchingLocalizations(const std::vector<std::string>& localizations,
                                               const std::vector<std::string>& preferredLanguages) {
    const std::vector<Candidate> candidates = candidatesOf(localizations);
    std::vector<std::string> matches;
    for (const std::string& language : preferredLanguages) {
        appendMatches(matches, candidates, language, otherRegion);
    }
    return matches;
}

std::vector<std::string> equivalentLocalizations(const std::vector<std::string>& localizations,
                                                 std::string_view nameOrCode) {
    std::vector<std::string> matches;
    appendMatches(matches, candidatesOf(localizations), nameOrCode, sameTag);
    return matches;
}

}  // namespace adminhost
