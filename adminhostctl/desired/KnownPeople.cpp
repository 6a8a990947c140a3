#include "adminhostctl/desired/KnownPeople.h"

#include "adminhostctl/DirectoryNames.h"
#include "adminhostctl/Failure.h"

#include <algorithm>
#include <map>
#include <utility>

namespace adminhost::ctl {
namespace {

/// Looks names up, each once.
class DirectoryLookup {
  public:
    explicit DirectoryLookup(const Context& context) noexcept : _context(context) {}

    /// Why the name cannot be in the people's list of this kind; empty if it can.
    [[nodiscard]] std::string problem(const PeopleForm& people, const std::string& kind, const std::string& name) {
        const auto [known, isNew] = _problems.try_emplace({kind, name});
        if (isNew) {
            known->second = find(people, kind, name);
        }
        return known->second;
    }

  private:
    [[nodiscard]] std::string find(const PeopleForm& people, const std::string& kind, const std::string& name) const {
        std::vector<Dictionary> found;
        std::string other;
        for (const Dictionary& entry : entriesNamed(_context, name)) {
            if (entry.text("shortName") != name) {
                other = "write the short name " + std::string(entry.text("shortName"));  // it is a UUID
            } else if (entry.text("type") == kind) {
                found.push_back(entry);
            } else {
                const std::string type(entry.text("type"));
                const auto list = std::find_if(people.kinds.begin(), people.kinds.end(),
                                               [&](const auto& one) { return one.first == type; });
                other = name + " is a " + std::string(wordOfType(type)) +
                        (list == people.kinds.end() ? std::string() : ": write it in " + list->second);
            }
        }
        return found.size() == 1  ? std::string()
               : found.size() > 1 ? ambiguousName(name, found).what()
               : !other.empty()   ? other
                                  : unknownName(_context, wordOfType(kind), name).what();
    }

    const Context& _context;
    std::map<std::pair<std::string, std::string>, std::string> _problems;
};

bool isListed(const Element* element, const PeopleForm& people, const std::string& kind, const std::string& name) {
    if (element == nullptr) {
        return false;
    }
    const auto present = element->people.find(people.key);
    return present != element->people.end() &&
           std::any_of(present->second.begin(), present->second.end(),
                       [&](const Person& person) { return person.kind == kind && person.label == name; });
}

/// A name in a file, and the list that it is in.
struct ListedName {
    const PeopleForm& people;
    std::string kind;
    std::string name;
    std::string place;
};

std::vector<ListedName> namesOf(const ListForm& list, const WantedElement& element) {
    std::vector<ListedName> all;
    for (const PeopleForm& people : list.people) {
        for (const auto& [kind, inFile] : people.kinds) {
            const auto names = element.lists.find(inFile);
            const auto places = element.places.find(inFile);
            for (std::size_t i = 0; names != element.lists.end() && i < names->second.size(); ++i) {
                all.push_back({people, kind, names->second[i], places->second.at(i)});
            }
        }
    }
    return all;
}

}  // namespace

void requireKnownPeople(const Context& context, const StateForm& form, const Wanted& wanted, const State& state) {
    DirectoryLookup directory(context);
    std::string problems;
    for (const auto& [section, elements] : wanted.elements) {
        const ListForm& list = form.list(section);
        for (const WantedElement& element : elements) {
            const Element* const present = findElement(state, list, element.name);
            for (const ListedName& one : namesOf(list, element)) {
                const std::string problem = isListed(present, one.people, one.kind, one.name)
                                                ? ""
                                                : directory.problem(one.people, one.kind, one.name);
                problems += problem.empty() ? "" : (problems.empty() ? "" : "\n") + one.place + ": " + problem;
            }
        }
    }
    if (!problems.empty()) {
        throw usageError(problems);
    }
}

}  // namespace adminhost::ctl
