#include "adminhostctl/desired/State.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/desired/Toml.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <cctype>

namespace adminhost::ctl {
namespace {

/// The value under the key as a text, whatever its type; empty if there is none.
std::string convertedText(const Dictionary& dictionary, std::string_view key) {
    const Value& value = dictionary.get(key);
    return value.isNull() ? std::string() : textOf(value);
}

bool sameInAnyCase(const std::string& a, const std::string& b) {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                      [](unsigned char x, unsigned char y) { return std::tolower(x) == std::tolower(y); });
}

std::vector<Person> peopleOf(const PeopleForm& form, const Dictionary& listed) {
    std::vector<Person> people;
    const Array* entries = listed.get(form.key).array();
    for (const Value& entry : entries != nullptr ? *entries : Array{}) {
        if (const Dictionary* person = entry.dictionary()) {
            people.push_back({convertedText(*person, form.kind), convertedText(*person, form.label),
                              convertedText(*person, form.identity)});
        }
    }
    return people;
}

Element elementOf(const ListForm& list, const Dictionary& listed) {
    Element element{convertedText(listed, list.identity), convertedText(listed, list.label), {}, {}};
    for (const FieldForm& field : list.fields) {
        if (field.boolean) {
            element.fields.set(field.key, booleanOf(listed.get(field.key)));
        }
    }
    for (const FieldForm& field : list.fields) {
        if (!field.boolean && listed.contains(field.key) && !isSecret(field, element)) {
            element.fields.set(field.key, convertedText(listed, field.key));
        }
    }
    for (const PeopleForm& people : list.people) {
        element.people[people.key] = peopleOf(people, listed);
    }
    for (const std::string& key : list.otherNames) {
        element.otherNames.push_back(convertedText(listed, key));
    }
    return element;
}

/// The element with the identity, if people may use it, or else the only one that has the name.
template <typename HasName>
const Element* find(const State& state, const ListForm& list, const std::string& name, const HasName& hasName) {
    const Element* found = nullptr;
    std::string identities;
    int count = 0;
    for (const Element& element : elementsOf(state, list)) {
        if (list.byIdentity && sameInAnyCase(element.identity, name)) {
            return &element;
        }
        if (hasName(element)) {
            found = &element;
            identities += "\n  " + element.identity;
            for (const std::string& other : element.otherNames) {
                identities += other.empty() ? "" : "  " + other;
            }
            ++count;
        }
    }
    if (count > 1) {
        throw usageError(list.section + ": several have the name " + tomlText(name) +
                         (list.byIdentity ? "; use one of these instead:" : "; remove all but one of these:") +
                         identities);
    }
    return found;
}

}  // namespace

State stateOf(const StateForm& form, const Dictionary& root) {
    State state;
    for (const DictionaryEntry& entry : root) {
        if (entry.value.array() == nullptr || form.setting(entry.key) != nullptr) {
            state.settings.set(entry.key, entry.value);
        }
    }
    for (const ListForm& list : form.lists()) {
        const Array* elements = root.get(list.key).array();
        if (elements == nullptr) {
            continue;
        }
        std::vector<Element>& all = state.lists[list.section];
        for (const Value& element : *elements) {
            if (element.dictionary() != nullptr && !convertedText(*element.dictionary(), list.identity).empty()) {
                all.push_back(elementOf(list, *element.dictionary()));
            }
        }
    }
    return state;
}

bool isSecret(const FieldForm& field, const Element& element) {
    return !field.secretIf.empty() && element.fields.get(field.secretIf).boolean().value_or(false);
}

const std::vector<Element>& elementsOf(const State& state, const ListForm& list) {
    const auto found = state.lists.find(list.section);
    if (found == state.lists.end()) {
        throw Failure(ExitStatus::failed,
                      "the service does not list its " + list.section + ": its database is missing or cannot be read");
    }
    return found->second;
}

const Element* findElement(const State& state, const ListForm& list, const std::string& name) {
    return find(state, list, name, [&](const Element& element) { return !list.localized && element.label == name; });
}

std::string nameForPeople(const Element& element) {
    std::string name = element.label;
    for (const std::string& other : element.otherNames) {
        name = name.empty() ? other : name;
    }
    return name;
}

const Element* findByAnyName(const State& state, const ListForm& list, const std::string& name) {
    return find(state, list, name, [&](const Element& element) {
        return !name.empty() &&
               (element.label == name ||
                std::find(element.otherNames.begin(), element.otherNames.end(), name) != element.otherNames.end());
    });
}

}  // namespace adminhost::ctl
