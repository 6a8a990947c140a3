#pragma once

// A state as the service returns it, in the form that changes are derived from.

#include "adminhostctl/desired/StateForm.h"
#include "platform/value/Value.h"

#include <map>
#include <optional>
#include <string>
#include <vector>

namespace adminhost::ctl {

/// An entry of a list of people. The service lists only those that the directory knows.
struct Person {
    std::string kind;  ///< "user", "group"
    std::string label;
    std::string identity;

    friend bool operator==(const Person& a, const Person& b) = default;
};

/// An element of a section.
struct Element {
    std::string identity;
    std::string label;
    Dictionary fields;                                  ///< texts and booleans by their key; a secret text is absent
    std::map<std::string, std::vector<Person>> people;  ///< by the key of the list
    std::vector<std::string> otherNames{};              ///< in the order of their keys; empty for a missing one

    friend bool operator==(const Element& a, const Element& b) = default;
};

struct State {
    Dictionary settings;  ///< all plain values, also those that cannot be written
    /// By section, in the service's order. A section is missing if the service did not list it, because its database is
    /// missing or cannot be read.
    std::map<std::string, std::vector<Element>> lists;
    bool peopleUnread = false;  ///< the lists of people may lack some, because the directory failed for instance
};

/// Builds the state from an answer. Elements without identity are left out; a value of an unexpected type counts as
/// missing.
[[nodiscard]] State stateOf(const StateForm& form, const Dictionary& root);

/// Whether the text of the field is a secret of this element.
[[nodiscard]] bool isSecret(const FieldForm& field, const Element& element);

/// The elements of a section. Throws Failure(failed) if the service did not list the section.
[[nodiscard]] const std::vector<Element>& elementsOf(const State& state, const ListForm& list);

/// The element that a file means by the name: the one with this identity, in upper or lower case (if people may use
/// identities), or else with this label (unless labels are localized). Null if there is none. Throws Failure if several
/// have the label (usage) or the section is not listed (failed).
[[nodiscard]] const Element* findElement(const State& state, const ListForm& list, const std::string& name);

/// The label of the element, else the first of its other names that is not empty; empty if it has none.
[[nodiscard]] std::string nameForPeople(const Element& element);

/// The element that a person means by the name: as above, but also by a localized label and by its other names.
[[nodiscard]] const Element* findByAnyName(const State& state, const ListForm& list, const std::string& name);

}  // namespace adminhost::ctl
