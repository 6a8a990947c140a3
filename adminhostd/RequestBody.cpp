#include "adminhostd/RequestBody.h"

#include "platform/json/Json.h"
#include "platform/plist/PropertyList.h"

#include <algorithm>
#include <charconv>
#include <cstdint>
#include <system_error>

#include <fmt/format.h>
#include <strings.h>

namespace adminhost {
namespace {

std::string_view trimmed(std::string_view text) {
    constexpr const char* blanks = " \t";
    const std::size_t first = text.find_first_not_of(blanks);
    return first == std::string_view::npos ? std::string_view()
                                           : text.substr(first, text.find_last_not_of(blanks) - first + 1);
}

bool same(std::string_view a, std::string_view b) {
    return a.size() == b.size() && ::strncasecmp(a.data(), b.data(), a.size()) == 0;
}

/// Returns true if lists and dictionaries are nested deeper than that. The readers bound the recursion.
bool isDeeper(const Value& value, std::size_t depth) {
    if (const Array* array = value.array()) {
        return depth == 0 ||
               std::any_of(array->begin(), array->end(), [&](const Value& one) { return isDeeper(one, depth - 1); });
    }
    if (const Dictionary* dictionary = value.dictionary()) {
        return depth == 0 || std::any_of(dictionary->begin(), dictionary->end(), [&](const DictionaryEntry& entry) {
                   return isDeeper(entry.value, depth - 1);
               });
    }
    return false;
}

}  // namespace

std::optional<BodyForm> bodyFormOf(std::string_view contentType) {
    const std::size_t semicolon = contentType.find(';');
    const std::string_view type = trimmed(contentType.substr(0, semicolon));
    std::string_view parameters = semicolon == std::string_view::npos ? "" : contentType.substr(semicolon + 1);
    while (!parameters.empty()) {
        const std::size_t end = std::min(parameters.find(';'), parameters.size());
        const std::string_view parameter = trimmed(parameters.substr(0, end));
        parameters.remove_prefix(std::min(end + 1, parameters.size()));
        const std::size_t equals = std::min(parameter.find('='), parameter.size());
        if (same(parameter.substr(0, equals), "charset")) {
            std::string_view charset = parameter.substr(std::min(equals + 1, parameter.size()));
            if (charset.size() >= 2 && charset.front() == '"' && charset.back() == '"') {
                charset = charset.substr(1, charset.size() - 2);
            }
            if (!same(charset, "utf-8")) {
                return std::nullopt;
            }
        }
    }
    if (type.empty() || same(type, "application/json")) {
        return BodyForm::json;
    }
    return same(type, "application/x-plist") ? std::optional(BodyForm::propertyList) : std::nullopt;
}

tl::expected<Dictionary, BodyProblem> requestOf(std::string_view body, BodyForm form, const BodyBounds& bounds) {
    using Kind = BodyProblem::Kind;
    const auto refused = [](Kind kind, std::string text) {
        return tl::unexpected<BodyProblem>(BodyProblem{kind, std::move(text)});
    };
    if (body.empty()) {
        return Dictionary();
    }
    auto value = form == BodyForm::json ? parseJson(body, bounds.values) : parsePropertyList(body, bounds.values);
    if (!value) {
        const Error& error = value.error();
        const bool isTooMany = error.code == (form == BodyForm::json ? jsonTooManyValues : plistTooManyValues);
        return refused(isTooMany ? Kind::tooManyValues : Kind::malformed,
                       error.description.value_or("The body cannot be read."));
    }
    if (value->dictionary() == nullptr) {
        return refused(
            Kind::malformed,
            fmt::format("line 1, column 1: a request is a dictionary, not a value of type {}", nameOf(value->type())));
    }
    if (isDeeper(*value, bounds.depth)) {
        return refused(Kind::tooDeep,
                       fmt::format("Lists and dictionaries of a request may be nested {} deep at most.", bounds.depth));
    }
    return std::move(*value->dictionary());
}

bool prefersPropertyList(std::string_view accept) {
    double list = 0;
    double json = 0;
    double other = 0;  // of a range such as "*/*", for types that are not named themselves
    bool jsonIsNamed = false;
    while (!accept.empty()) {
        const std::size_t end = std::min(accept.find(','), accept.size());
        std::string_view parameters = accept.substr(0, end);
        accept.remove_prefix(std::min(end + 1, accept.size()));
        const std::string_view type = trimmed(parameters.substr(0, parameters.find(';')));
        double weight = 1;
        while (parameters.find(';') != std::string_view::npos) {
            parameters.remove_prefix(parameters.find(';') + 1);
            const std::string_view parameter = trimmed(parameters.substr(0, parameters.find(';')));
            if (parameter.size() > 2 && same(parameter.substr(0, 2), "q=")) {
                std::from_chars(parameter.data() + 2, parameter.data() + parameter.size(), weight);
            }
        }
        if (same(type, "application/x-plist")) {
            // If it is named second with the same weight, it is the second choice.
            list = jsonIsNamed && weight <= json ? 0 : weight;
        } else if (same(type, "application/json")) {
            json = weight;
            jsonIsNamed = true;
        } else if (same(type, "*/*") || same(type, "application/*")) {
            other = std::max(other, weight);
        }
    }
    return list > 0 && list >= (jsonIsNamed ? json : other);
}

std::optional<std::uint64_t> numberOf(std::string_view argument) {
    std::uint64_t number = 0;
    const char* const end = argument.data() + argument.size();
    const auto [rest, failure] = std::from_chars(argument.data(), end, number);
    return argument.empty() || (failure == std::errc() && rest == end) ? std::optional(number) : std::nullopt;
}

std::optional<std::chrono::seconds> deadlineOf(std::string_view requestDeadline) {
    constexpr std::uint64_t longest = 1'000'000;
    const std::string_view digits = trimmed(requestDeadline);
    std::uint64_t seconds = 0;
    const auto [rest, failure] = std::from_chars(digits.data(), digits.data() + digits.size(), seconds);
    if (failure == std::errc::result_out_of_range && rest == digits.data() + digits.size()) {
        seconds = longest;
    } else if (failure != std::errc() || rest != digits.data() + digits.size() || seconds == 0) {
        return std::nullopt;
    }
    return std::chrono::seconds(std::min(seconds, longest));
}

std::optional<std::vector<std::string>> revisionsOf(std::string_view ifMatch) {
    std::vector<std::string> revisions;
    ifMatch = trimmed(ifMatch);
    if (ifMatch == "*") {
        return revisions;
    }
    if (ifMatch.empty()) {
        return std::nullopt;  // a condition that cannot be checked must not be treated as none
    }
    while (!ifMatch.empty()) {
        const std::size_t end = ifMatch.find('"', 1);
        if (ifMatch.front() != '"' || end == std::string_view::npos) {
            return std::nullopt;
        }
        revisions.emplace_back(ifMatch.substr(1, end - 1));
        ifMatch = trimmed(ifMatch.substr(end + 1));
        if (!ifMatch.empty()) {
            if (ifMatch.front() != ',') {
                return std::nullopt;
            }
            ifMatch = trimmed(ifMatch.substr(1));
        }
    }
    return revisions;
}

}  // namespace adminhost
