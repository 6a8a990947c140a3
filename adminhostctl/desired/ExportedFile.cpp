#include "adminhostctl/desired/ExportedFile.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/desired/DesiredFile.h"
#include "adminhostctl/desired/Toml.h"

#include <algorithm>
#include <optional>
#include <vector>

namespace adminhost::ctl {
namespace {

/// Text of a comment: one line.
std::string comment(const std::string& text) {
    return "# " + text + '\n';
}

std::string introduction(const StateForm& form) {
    std::string text =
        "# The desired state: \"adminhostctl plan FILE\" shows what would change, \"adminhostctl apply FILE\" changes "
        "it.\n"
        "# What is not listed stays as it is, unless a switch here says otherwise.\n"
        "# Settings in comments belong to the host that this file is from.\n"
        "\n";
    text += "[" + std::string(switchesTable) + "]\n";
    for (const std::string& name : form.switches()) {
        text += tomlKey(name) + " = false\n";
    }
    return text;
}

std::vector<std::string> labelsOf(const std::vector<Person>& people, std::string_view kind) {
    std::vector<std::string> labels;
    for (const Person& person : people) {
        if (person.kind == kind && !person.label.empty()) {
            labels.push_back(person.label);
        }
    }
    std::sort(labels.begin(), labels.end());
    labels.erase(std::unique(labels.begin(), labels.end()), labels.end());
    return labels;
}

std::string listText(const std::vector<std::string>& texts) {
    std::string list;
    for (const std::string& text : texts) {
        list += (list.empty() ? "" : ", ") + tomlText(text);
    }
    return '[' + list + ']';
}

/// The name of the element in a file: its label, or its identity if the label is not unique or is localized; nullopt if
/// neither can be used.
std::optional<std::string> nameOf(const State& state, const ListForm& list, const Element& element) {
    try {
        if (!list.localized && !element.label.empty() && findElement(state, list, element.label) == &element) {
            return element.label;
        }
    } catch (const Failure&) {
        // several have the label
    }
    // Two rows may have one identity; a file can name only the first.
    return list.byIdentity && findElement(state, list, element.identity) == &element ? std::optional(element.identity)
                                                                                     : std::nullopt;
}

void appendElement(std::string& text, const ListForm& list, const std::string& name, const Element& element) {
    text += "\n[" + tomlKey(list.section) + '.' + tomlKey(name) + "]\n";
    if (!element.label.empty() && name != element.label) {
        text += comment("name: " + tomlText(element.label));
    }
    for (std::size_t i = 0; element.label.empty() && i < element.otherNames.size(); ++i) {
        text += comment(list.otherNames[i] + ": " + tomlText(element.otherNames[i]));
    }
    for (const FieldForm& field : list.fields) {
        const Value& value = element.fields.get(field.key);
        if (isSecret(field, element)) {
            text += comment(tomlKey(field.inFile) + " = (secret)");
        } else if (const auto written = tomlValue(value)) {
            text += tomlKey(field.inFile) + " = " + *written + '\n';
        }
    }
    for (const PeopleForm& people : list.people) {
        for (const auto& [kind, inFile] : people.kinds) {
            text += tomlKey(inFile) + " = " + listText(labelsOf(element.people.at(people.key), kind)) + '\n';
        }
    }
}

void appendSection(std::string& text, const State& state, const ListForm& list) {
    std::vector<std::pair<std::string, const Element*>> sorted;
    for (const Element& element : elementsOf(state, list)) {
        sorted.emplace_back(nameOf(state, list, element).value_or(element.label), &element);
    }
    std::stable_sort(sorted.begin(), sorted.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
    for (const auto& [name, element] : sorted) {
        if (nameOf(state, list, *element)) {
            appendElement(text, list, name, *element);
        } else {
            text += '\n' + comment(tomlKey(list.section) + '.' + tomlKey(name) + ", " + element->identity +
                                   ": not managed here, other elements may have this name");
        }
    }
}

}  // namespace

std::string exportOf(const StateForm& form, const State& state) {
    std::string text = introduction(form);
    text += "\n[" + tomlKey(form.settingsSection()) + "]\n";
    for (const DescribedKey& key : form.settings()) {
        const std::string name = form.nameOf(key);
        const Value& value = state.settings.get(name);
        if (value.isNull()) {
            continue;
        }
        const auto written = tomlValue(value);
        text +=
            written
                ? (key.ofHost ? comment(tomlKey(name) + " = " + *written) : tomlKey(name) + " = " + *written + '\n')
                : comment(tomlKey(name) + ": a " + std::string(adminhost::nameOf(value.type())) + ", not managed here");
    }
    for (const ListForm& list : form.lists()) {
        appendSection(text, state, list);
    }
    return text;
}

}  // namespace adminhost::ctl
