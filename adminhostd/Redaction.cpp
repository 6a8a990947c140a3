#include "adminhostd/Redaction.h"

#include "platform/json/Json.h"
#include "platform/text/Base64Text.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <functional>

namespace adminhost {
namespace {

/// Calls the function for each value at the path, with the dictionary that holds it.
void forEachAt(const Dictionary& dictionary, std::string_view path,
               const std::function<void(const Dictionary&, const Value&)>& function) {
    const std::size_t dot = path.find('.');
    std::string_view key = path.substr(0, dot);
    const bool list = key.ends_with("[]");
    if (list) {
        key.remove_suffix(2);
    }
    const Value& value = dictionary.get(key);
    if (dot == std::string_view::npos) {
        function(dictionary, value);  // of a list, all of it
        return;
    }
    const auto descend = [&](const Value& inner) {
        if (inner.dictionary() != nullptr) {
            forEachAt(*inner.dictionary(), path.substr(dot + 1), function);
        }
    };
    if (!list) {
        descend(value);
    } else if (value.array() != nullptr) {
        std::for_each(value.array()->begin(), value.array()->end(), descend);
    }
}

/// The text of a single value; the bytes of data; empty for null.
std::string plainTextOf(const Value& value) {
    const Data* data = value.data();
    return data != nullptr ? std::string(data->begin(), data->end()) : value.isNull() ? std::string() : textOf(value);
}

std::string withDoubledQuotes(std::string_view text) {
    std::string doubled;
    for (const char c : text) {
        doubled.append(c == '\'' ? 2 : 1, c);
    }
    return doubled;
}

/// Adds the texts of a value, in all their forms.
void add(const Value& value, std::vector<std::string>& secrets) {
    if (const Array* array = value.array()) {
        std::for_each(array->begin(), array->end(), [&](const Value& element) { add(element, secrets); });
        return;
    }
    if (const Dictionary* dictionary = value.dictionary()) {
        std::for_each(dictionary->begin(), dictionary->end(),
                      [&](const DictionaryEntry& entry) { add(entry.value, secrets); });
        return;
    }
    const std::string plain = plainTextOf(value);
    if (plain.empty()) {
        return;
    }
    const std::string json = jsonOf(plain);
    const std::vector<std::uint8_t> bytes(plain.begin(), plain.end());
    secrets.insert(secrets.end(),
                   {plain, withDoubledQuotes(plain), json.substr(1, json.size() - 2), base64TextOf(bytes)});
}

}  // namespace

Redaction::Redaction(const Command& command, const Dictionary& request) {
    const Array* keys = command.description.get("keys").array();
    for (const Value& element : keys == nullptr ? Array() : *keys) {
        const Dictionary* key = element.dictionary();
        if (key == nullptr) {
            continue;
        }
        const std::string_view path = key->text("path");
        const std::string_view condition = key->text("secretIf");  // a key beside it
        const bool secret = key->get("secret") == Value(true);
        if (!secret && condition.empty()) {
            continue;
        }
        (secret ? _secretKeys : _conditionalKeys).emplace(path.substr(path.rfind('.') + 1));
        forEachAt(request, path, [&](const Dictionary& owner, const Value& value) {
            const bool known = secret || owner.contains(condition);
            if (secret || !known || booleanOf(owner.get(condition))) {
                add(value, _secrets);
            }
            if (known && (secret || booleanOf(owner.get(condition)))) {
                add(value, _certain);
            }
        });
    }
    for (Secrets* secrets : {&_secrets, &_certain}) {
        std::sort(secrets->begin(), secrets->end(),
                  [](const std::string& a, const std::string& b) { return a.size() > b.size(); });
    }
}

std::string Redaction::replacedIn(std::string_view text, const Secrets& secrets) {
    std::string redacted;
    while (!text.empty()) {
        const auto found = std::find_if(secrets.begin(), secrets.end(),
                                        [&](const std::string& secret) { return text.starts_with(secret); });
        if (found == secrets.end()) {
            redacted += text.front();
            text.remove_prefix(1);
        } else {
            redacted += mark;
            text.remove_prefix(found->size());
        }
    }
    return redacted;
}

Value Redaction::replaced(const Value& value, const Secrets& secrets) {
    if (const Array* array = value.array()) {
        Array redacted;
        for (const Value& element : *array) {
            redacted.push_back(replaced(element, secrets));
        }
        return redacted;
    }
    if (const Dictionary* dictionary = value.dictionary()) {
        Dictionary redacted;
        for (const DictionaryEntry& entry : *dictionary) {
            redacted.set(replacedIn(entry.key, secrets), replaced(entry.value, secrets));
        }
        return redacted;
    }
    const std::string plain = plainTextOf(value);
    std::string shown = replacedIn(plain, secrets);
    return shown == plain ? value : value.string() != nullptr ? Value(std::move(shown)) : Value(mark);
}

Dictionary Redaction::report(const Dictionary& report) const {
    Dictionary redacted;
    const std::string_view key = report.text("key");
    const bool secret = report.get("secret") == Value(true) || _secretKeys.contains(key);
    // The operation knows whether the stored element makes this value a secret. It has said that it does not.
    const bool open = !secret && report.contains("secret") && _conditionalKeys.contains(key);
    for (const DictionaryEntry& entry : report) {
        const bool shows = entry.key == "from" || entry.key == "to";
        if (entry.key == "secret" || entry.key == "unverified") {
            redacted.set(entry.key, entry.value);  // flags
        } else if (entry.key != "undo" && !(secret && shows)) {
            redacted.set(entry.key, replaced(entry.value, open && shows ? _certain : _secrets));
        }
    }
    if (secret) {
        redacted.set("secret", true);
    }
    return redacted;
}

}  // namespace adminhost
