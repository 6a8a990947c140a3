#include "adminhostctl/Description.h"

namespace adminhost::ctl {
namespace {

std::string textAt(const Dictionary& dictionary, std::string_view key) {
    const std::string* text = dictionary.get(key).string();
    return text != nullptr ? *text : std::string();
}

std::vector<std::string> textsAt(const Dictionary& dictionary, std::string_view key) {
    std::vector<std::string> texts;
    const Array* array = dictionary.get(key).array();
    for (const Value& element : array != nullptr ? *array : Array{}) {
        if (const std::string* text = element.string()) {
            texts.push_back(*text);
        }
    }
    return texts;
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
    description.allowed = textsAt(*key, "allowed");
    description.title = textsAt(*key, "title");
    description.kind = textAt(*key, "kind");
    description.section = textAt(*key, "section");
    description.file = textAt(*key, "file");
    description.locates = textsAt(*key, "locates");
    description.restart = textsAt(*key, "restart");
    description.lookedUp = textAt(*key, "lookedUp");
    description.shownBy = textAt(*key, "shownBy");
    description.identity = textAt(*key, "identity");
    description.label = textAt(*key, "label");
    description.byIdentity = key->get("byIdentity").boolean().value_or(false);
    description.addedBy = textAt(*key, "addedBy");
    description.removedBy = textAt(*key, "removedBy");
    description.unlisted = textAt(*key, "unlisted");
    description.inFile = textAt(*key, "inFile");
    description.secretIf = textAt(*key, "secretIf");
    if (const Dictionary* kinds = key->get("kinds").dictionary()) {
        for (const DictionaryEntry& kind : *kinds) {
            description.kinds.emplace_back(kind.key, textAt(*kinds, kind.key));
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
    : _name(textAt(command, "name")),
      _summary(textAt(command, "summary")),
      _text(textAt(command, "description")),
      _changes(command.get("access") != Value("read")),
      _state(textAt(command, "state")) {
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
    if (const Dictionary* parts = command.get("parts").dictionary()) {
        _parts = *parts;
    }
    if (const Dictionary* example = command.get("example").dictionary()) {
        _example = *example;
    }
}

Dictionary Description::partOf(const std::string& section) const {
    const Dictionary* request = _parts.get(section).dictionary();
    return request != nullptr ? *request : Dictionary();
}

}  // namespace adminhost::ctl
