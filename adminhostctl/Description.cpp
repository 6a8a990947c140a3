#include "adminhostctl/Description.h"

namespace adminhost::ctl {
namespace {

std::string textAt(const Dictionary& dictionary, std::string_view key) {
    const std::string* text = dictionary.get(key).string();
    return text != nullptr ? *text : std::string();
}

}  // namespace

void Description::Keys::add(const Value& described) {
    const Dictionary* key = described.dictionary();
    if (key == nullptr) {
        return;
    }
    DescribedKey description;
    description.path = textAt(*key, "path");
    description.type = textAt(*key, "type");
    description.enteredAs = textAt(*key, "enteredAs");
    description.unit = textAt(*key, "unit");
    description.column = textAt(*key, "column");
    description.help = textAt(*key, "help");
    description.secret = key->get("secret").boolean().value_or(false);
    description.required = key->get("required").boolean().value_or(false);
    if (const Array* allowed = key->get("allowed").array()) {
        for (const Value& word : *allowed) {
            if (const std::string* text = word.string()) {
                description.allowed.push_back(*text);
            }
        }
    }
    index.emplace(description.path, all.size());
    all.push_back(std::move(description));
}

const DescribedKey* Description::Keys::find(std::string_view path) const noexcept {
    const auto found = index.find(std::string(path));
    return found == index.end() ? nullptr : &all[found->second];
}

Description::Description(const Dictionary& command)
    : _name(textAt(command, "name")), _summary(textAt(command, "summary")), _text(textAt(command, "description")) {
    if (const Array* keys = command.get("keys").array()) {
        for (const Value& key : *keys) {
            _keys.add(key);
        }
    }
    if (const Array* keys = command.get("answer").array()) {
        for (const Value& key : *keys) {
            _answer.add(key);
        }
    }
    if (const Array* errors = command.get("errors").array()) {
        _errors = *errors;
    }
    if (const Dictionary* example = command.get("example").dictionary()) {
        _example = *example;
    }
}

}  // namespace adminhost::ctl
