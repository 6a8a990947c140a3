#include "adminhostctl/Description.h"

namespace adminhost::ctl {
namespace {

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
    description.path = key->text("path");
    description.type = key->text("type");
    description.enteredAs = key->text("enteredAs");
    description.filledWith = key->text("filledWith");
    description.unit = key->text("unit");
    description.column = key->text("column");
    description.help = key->text("help");
    description.defaultKey = key->text("defaultKey");
    description.secret = key->get("secret").boolean().value_or(false);
    description.required = key->get("required").boolean().value_or(false);
    description.allowed = textsAt(*key, "allowed");
    description.minimum = key->get("minimum").integer();
    description.maximum = key->get("maximum").integer();
    description.title = textsAt(*key, "title");
    description.kind = key->text("kind");
    description.section = key->text("section");
    description.file = key->text("file");
    description.locates = textsAt(*key, "locates");
    description.ofHost = key->get("ofHost").boolean().value_or(false);
    description.restart = textsAt(*key, "restart");
    description.lookedUp = key->text("lookedUp");
    description.shownBy = key->text("shownBy");
    description.identity = key->text("identity");
    description.label = key->text("label");
    description.byIdentity = key->get("byIdentity").boolean().value_or(false);
    description.localized = key->get("localized").boolean().value_or(false);
    description.otherNames = textsAt(*key, "otherNames");
    description.addedBy = key->text("addedBy");
    description.removedBy = key->text("removedBy");
    description.unlisted = key->text("unlisted");
    description.inFile = key->text("inFile");
    description.secretIf = key->text("secretIf");
    if (const Dictionary* kinds = key->get("kinds").dictionary()) {
        for (const DictionaryEntry& kind : *kinds) {
            description.kinds.emplace_back(kind.key, kinds->text(kind.key));
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
    : _name(command.text("name")),
      _summary(command.text("summary")),
      _text(command.text("description")),
      _changes(command.get("access") != Value("read")),
      _state(command.text("state")) {
    if (const auto limit = command.get("deadlineSeconds").integer()) {
        _deadline = std::chrono::seconds(*limit);
    }
    if (const Array* trials = command.get("trials").array()) {
        for (const Value& element : *trials) {
            if (const Dictionary* trial = element.dictionary()) {
                _trials.push_back({std::string(trial->text("name")), textsAt(*trial, "needs"), textsAt(*trial, "uses"),
                                   std::string(trial->text("error")), std::string(trial->text("detail"))});
            }
        }
    }
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
