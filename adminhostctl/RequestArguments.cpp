#include "adminhostctl/RequestArguments.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/Similar.h"
#include "platform/json/Json.h"
#include "platform/plist/PropertyList.h"
#include "platform/text/IsoDate.h"
#include "platform/text/LocalDate.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <charconv>
#include <cstdio>
#include <ctime>
#include <limits>
#include <optional>
#include <set>
#include <span>

namespace adminhost::ctl {
namespace {

enum class Form { text, json, file };

struct Argument {
    std::string key;
    Form form;
    std::string value;
};

Argument parseArgument(const std::string& word) {
    const std::size_t at = word.find_first_of("=@");
    if (at == std::string::npos || at == 0 || word.starts_with(":=")) {
        throw usageError("\"" + word + "\" is not KEY=TEXT, KEY:=JSON, KEY@FILE or KEY@-");
    }
    if (word[at] == '@') {
        return {word.substr(0, at), Form::file, word.substr(at + 1)};
    }
    if (word[at - 1] == ':') {
        return {word.substr(0, at - 1), Form::json, word.substr(at + 1)};
    }
    return {word.substr(0, at), Form::text, word.substr(at + 1)};
}

/// One step of a key path: a dictionary's key, or the number of a list's element.
struct Step {
    std::string text;
    std::optional<std::size_t> index;
};

std::vector<Step> stepsOf(const std::string& key) {
    std::vector<Step> steps;
    std::size_t begin = 0;
    while (true) {
        const std::size_t dot = key.find('.', begin);
        steps.push_back({key.substr(begin, dot - begin), std::nullopt});
        if (steps.back().text.empty()) {
            throw usageError("\"" + key + "\" is not a key path");
        }
        if (dot == std::string::npos) {
            return steps;
        }
        begin = dot + 1;
    }
}

std::optional<std::size_t> indexOf(const std::string& segment) {
    std::size_t index = 0;
    const char* const end = segment.data() + segment.size();
    const auto result = std::from_chars(segment.data(), end, index);
    return result.ec == std::errc() && result.ptr == end ? std::optional(index) : std::nullopt;
}

/// The path as descriptions write it ("list.0.name" is "list[].name"); marks
/// the steps that are elements of a list.
std::string describedPath(const Description& command, std::vector<Step>& steps) {
    std::string path;
    for (Step& step : steps) {
        const DescribedKey* above = command.key(path);
        const auto index = above != nullptr && above->type == "list" ? indexOf(step.text) : std::nullopt;
        if (index) {
            step.index = index;
            path += "[]";
        } else {
            path += (path.empty() ? "" : ".") + step.text;
        }
    }
    return path;
}

/// Whether a key above the path accepts any value.
bool isBelowAny(const Description& command, const std::string& path) {
    for (std::size_t at = path.find_last_of(".["); at != std::string::npos && at > 0;
         at = path.find_last_of(".[", at - 1)) {
        const DescribedKey* above = command.key(path.substr(0, at));
        if (above != nullptr && above->type == "any") {
            return true;
        }
    }
    return false;
}

void store(Value& node, std::span<const Step> steps, Value value, const std::string& key) {
    if (steps.empty()) {
        node = std::move(value);
        return;
    }
    const Step& step = steps.front();
    if (node.isNull()) {
        node = step.index ? Value(Array{}) : Value(Dictionary{});
    }
    if (Array* array = node.array(); array != nullptr && step.index) {
        if (*step.index > array->size()) {
            throw usageError(key + ": the list has " + std::to_string(array->size()) + " elements; " + step.text +
                             " is neither one of them nor the next");
        }
        if (*step.index == array->size()) {
            array->emplace_back();
        }
        store((*array)[*step.index], steps.subspan(1), std::move(value), key);
        return;
    }
    Dictionary* dictionary = node.dictionary();
    if (dictionary == nullptr || step.index) {
        throw usageError(key + ": " + step.text + " is not in a " + (step.index ? "list" : "dictionary"));
    }
    if (Value* below = dictionary->find(step.text)) {
        store(*below, steps.subspan(1), std::move(value), key);
        return;
    }
    Value below;
    store(below, steps.subspan(1), std::move(value), key);
    dictionary->set(step.text, std::move(below));
}

/// The key path of a secret in a value of the command line; empty if there is none.
std::string secretIn(const Description& command, const Value& value, const std::string& path) {
    if (const DescribedKey* key = command.key(path); key != nullptr && key->secret) {
        return path;
    }
    if (const Dictionary* dictionary = value.dictionary()) {
        for (const DictionaryEntry& entry : *dictionary) {
            std::string found = secretIn(command, entry.value, path.empty() ? entry.key : path + '.' + entry.key);
            if (!found.empty()) {
                return found;
            }
        }
    } else if (const Array* array = value.array()) {
        for (const Value& element : *array) {
            std::string found = secretIn(command, element, path + "[]");
            if (!found.empty()) {
                return found;
            }
        }
    }
    return {};
}

std::string lowered(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return text;
}

template <typename Number>
std::optional<Value> numberOf(const std::string& text) {
    Number number{};
    const char* const end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, number);
    return !text.empty() && result.ec == std::errc() && result.ptr == end ? std::optional<Value>(number) : std::nullopt;
}

/// The text without the unit at its end. Throws Failure(usage) if it ends in another unit.
std::string withoutUnit(const DescribedKey& key, const std::string& text) {
    const std::size_t end = text.find_first_not_of("+-.0123456789");
    const std::size_t word = text.find_first_not_of(" \t", std::min(end, text.size()));
    const std::string_view unit = wordOfUnit(key.unit);
    if (end == 0 || word == std::string::npos || unit.empty()) {
        return text;
    }
    const std::string given = lowered(text.substr(word));
    if (given == lowered(std::string(unit)) || given == key.unit || given + 's' == key.unit) {
        return text.substr(0, end);
    }
    throw usageError(key.path + ": \"" + text + "\" is not a number of " + key.unit + " (" + std::string(unit) + ")");
}

Value parseStructure(std::string_view bytes, const std::string& from) {
    const std::size_t begin = bytes.find_first_not_of(" \t\r\n");
    auto value = begin != std::string_view::npos && bytes[begin] == '<' ? parsePropertyList(bytes) : parseJson(bytes);
    if (!value) {
        throw usageError(from + ": " + value.error().description.value_or("cannot be read"));
    }
    return std::move(*value);
}

bool isStructure(const DescribedKey& key) {
    return key.type == "list" || key.type == "dictionary";
}

std::string withoutLineEnd(std::string text) {
    if (text.ends_with('\n')) {
        text.pop_back();
        if (text.ends_with('\r')) {
            text.pop_back();
        }
    }
    return text;
}

/// As valueOfText(), and throws Failure(usage) for a value outside its range.
Value sensibleValueOf(const DescribedKey& key, const std::string& text, const Sources& sources) {
    Value value = valueOfText(key, text);
    if (const std::string problem = rangeProblem(key, value); !sources.force && !problem.empty()) {
        throw usageError(key.path + ": " + text + ' ' + problem + "; --force writes it nevertheless");
    }
    return value;
}

/// The value of a text that was read. An empty secret is rejected, because it would remove the stored one by mistake
/// (when standard input is /dev/null).
Value notEmpty(const DescribedKey& key, const std::string& text, const Sources& sources) {
    if (key.secret && text.empty() && !sources.clear) {
        throw usageError(key.path + ": the value is empty; use --clear to remove the stored one");
    }
    return sensibleValueOf(key, text, sources);
}

Value valueOfFile(const DescribedKey& key, const std::string& path, const Sources& sources) {
    if (path.empty()) {
        throw usageError(key.path + ": the name of a file is missing after \"@\"; - is standard input");
    }
    if (path == "-" && key.secret && sources.terminal) {
        return notEmpty(key, sources.ask(key.path), sources);
    }
    std::string bytes = sources.read(path);
    if (key.type == "data") {
        return Data(bytes.begin(), bytes.end());
    }
    if (isStructure(key)) {
        return parseStructure(bytes, path);
    }
    if (!isUtf8(bytes)) {
        throw usageError(path + ": not UTF-8 text");
    }
    return notEmpty(key, withoutLineEnd(std::move(bytes)), sources);
}

/// didYouMean() for a key of the command.
std::string suggestion(const Description& command, const std::string& key) {
    std::vector<std::string> known;
    for (const DescribedKey& described : command.keys()) {
        known.push_back(described.path);
    }
    return didYouMean(key, known);
}

}  // namespace

std::optional<bool> booleanOfText(const std::string& text) {
    constexpr std::array yes = {"yes", "true", "on", "y", "t", "1", "enable", "enabled"};
    constexpr std::array no = {"no", "false", "off", "n", "f", "0", "disable", "disabled"};
    const std::string word = lowered(text);
    return std::find(yes.begin(), yes.end(), word) != yes.end() ? std::optional(true)
           : std::find(no.begin(), no.end(), word) != no.end()  ? std::optional(false)
                                                                : std::nullopt;
}

std::string rangeProblem(const DescribedKey& key, const Value& value) {
    const std::string unit(wordOfUnit(key.unit));
    const auto bound = [&](std::int64_t number) { return std::to_string(number) + (unit.empty() ? "" : " " + unit); };
    if (const auto number = value.isInteger() ? value.integer().value_or(std::numeric_limits<std::int64_t>::max())
                                              : std::optional<std::int64_t>()) {
        return key.minimum && *number < *key.minimum   ? "is below " + bound(*key.minimum)
               : key.maximum && *number > *key.maximum ? "is above " + bound(*key.maximum)
                                                       : "";
    }
    const std::string* text = value.string();
    if (text == nullptr || key.allowed.empty() ||
        std::find(key.allowed.begin(), key.allowed.end(), *text) != key.allowed.end()) {
        return {};
    }
    std::string words;
    for (const std::string& word : key.allowed) {
        words += (words.empty() ? "" : ", ") + word;
    }
    return "is not one of " + words;
}

Value valueOfText(const DescribedKey& key, const std::string& given) {
    const std::string& type = key.enteredAs.empty() ? key.type : key.enteredAs;
    const std::string text = type == "integer" || type == "real" ? withoutUnit(key, given) : given;
    if (isStructure(key) || type == "data") {
        throw usageError(key.path + ": the value is " + (type == "data" ? "data" : "a " + type) + "; use " + key.path +
                         (type == "data" ? "@FILE" : ":=JSON or " + key.path + "@FILE"));
    }
    std::optional<Value> value;
    std::string wanted;
    if (type == "integer") {
        value = numberOf<std::int64_t>(text);
        if (!value) {
            value = numberOf<std::uint64_t>(text);
        }
        wanted = "a whole number";
    } else if (type == "real") {
        value = numberOf<double>(text);
        wanted = "a number";
    } else if (type == "boolean") {
        if (const auto boolean = booleanOfText(text)) {
            value = *boolean;
        }
        wanted = "yes or no";
    } else if (type == "date") {
        const auto date = dateOfText(text);
        value = date ? std::optional<Value>(*date) : std::nullopt;
        wanted = "a date such as \"2026-01-31 08:00\"";
    } else {
        value = text;
    }
    if (!value) {
        throw usageError(key.path + ": \"" + text + "\" is not " + wanted);
    }
    return std::move(*value);
}

Value valueOfWord(const DescribedKey& key, const std::optional<std::string>& word, const Sources& sources) {
    if (!word && key.secret && sources.clear) {
        return "";
    }
    if (word && word->starts_with('@')) {
        return valueOfFile(key, word->substr(1), sources);
    }
    if (key.secret && word) {
        throw usageError(key.path +
                         ": a secret is not accepted on the command line, which others can read; use @FILE, or " +
                         "@- to be asked");
    }
    if (!word && !(key.secret && sources.terminal)) {
        throw usageError(key.path + ": the value is missing; use " +
                         (key.secret ? "@FILE or @-" : "TEXT, @FILE or @-"));
    }
    return word ? sensibleValueOf(key, *word, sources) : notEmpty(key, sources.ask(key.path), sources);
}

std::string textOfWord(const DescribedKey& key, const std::optional<std::string>& word, const Sources& sources) {
    const Value value = valueOfWord(key, word, sources);
    return value.string() != nullptr ? *value.string() : std::string();
}

Dictionary parseRequest(std::string_view bytes, const std::string& from) {
    Value value = parseStructure(bytes, from);
    Dictionary* dictionary = value.dictionary();
    if (dictionary == nullptr) {
        throw usageError(from + ": a request is a dictionary, not a " + std::string(nameOf(value.type())));
    }
    return std::move(*dictionary);
}

Dictionary buildRequest(const Description& command, Dictionary base, const std::vector<std::string>& arguments,
                        const Sources& sources) {
    Value request(std::move(base));
    std::set<std::string> given;
    for (const std::string& word : arguments) {
        const Argument argument = parseArgument(word);
        if (!given.insert(argument.key).second) {
            throw usageError(argument.key + ": given twice");
        }
        std::vector<Step> steps = stepsOf(argument.key);
        const std::string path = describedPath(command, steps);
        const DescribedKey* key = command.key(path);
        DescribedKey any;
        if (key == nullptr && isBelowAny(command, path)) {
            any.path = argument.key;
            key = &any;
        }
        if (key == nullptr && argument.form != Form::json) {
            throw usageError(command.name() + " has no key " + argument.key + suggestion(command, argument.key) +
                             "; adminhostctl help " + command.name() + " lists its keys, " + argument.key +
                             ":=JSON sends it nevertheless");
        }
        Value value;
        if (argument.form == Form::file) {
            value = valueOfFile(*key, argument.value, sources);
        } else {
            value = argument.form == Form::json ? parseStructure(argument.value, argument.key) : Value(argument.value);
            if (const std::string secret = secretIn(command, value, path); !secret.empty()) {
                throw usageError(
                    secret + ": a secret is not accepted on the command line, which others can read; use " +
                    argument.key + (secret == path ? "@FILE, or " + argument.key + "@- to be asked" : "@FILE"));
            }
            if (argument.form == Form::text) {
                value = sensibleValueOf(*key, argument.value, sources);
            }
        }
        if (value.isNull()) {
            throw usageError(argument.key + ": null is not a value; omit the key instead");
        }
        store(request, steps, std::move(value), argument.key);
    }
    return std::move(*request.dictionary());
}

std::optional<Date> dateOfText(const std::string& text) {
    if (const auto date = isoDateOf(text)) {
        return date;
    }
    for (const char* const rest : {"", ":00", " 00:00:00"}) {
        if (const auto date = localDateOf(text + rest)) {
            return date;
        }
    }
    return std::nullopt;
}

}  // namespace adminhost::ctl
