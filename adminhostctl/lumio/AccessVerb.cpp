#include "adminhostctl/lumio/AccessVerb.h"

#include "adminhostctl/Connection.h"
#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/State.h"
#include "adminhostctl/desired/Writing.h"
#include "adminhostctl/lumio/ElementVerbs.h"

#include <algorithm>
#include <cctype>

namespace adminhost::ctl {
namespace {

/// The dictionaries of a list.
std::vector<Dictionary> dictionariesOf(const Value& list) {
    std::vector<Dictionary> all;
    for (const Value& element : list.array() == nullptr ? Array() : *list.array()) {
        if (element.dictionary() != nullptr) {
            all.push_back(*element.dictionary());
        }
    }
    return all;
}

/// The directory's entries with exactly this name or UUID. Throws Failure if the directory fails.
std::vector<Dictionary> entriesNamed(const Context& context, const std::string& name) {
    if (name.empty()) {
        return {};  // the address without a text lists everybody
    }
    const Value answer = context.service.get("/v1/directory?is=" + Connection::escaped(name));
    return dictionariesOf(answer.dictionary() == nullptr ? Value() : answer.dictionary()->get("entries"));
}

/// The person of that name or UUID, or the group: a group often has the name of its only member. Throws Failure(usage)
/// if there is none, or if several have the name.
Dictionary entryNamed(const Context& context, const std::string& name) {
    const std::vector<Dictionary> all = entriesNamed(context, name);
    for (const char* type : {"user", "group"}) {
        std::vector<const Dictionary*> found;
        for (const Dictionary& entry : all) {
            if (entry.text("type") == type) {
                found.push_back(&entry);
            }
        }
        if (found.empty() || (context.options.has(groupOption) && std::string_view(type) == "user")) {
            continue;
        }
        if (found.size() == 1) {
            return *found.front();
        }
        std::string identities;
        for (const Dictionary* entry : found) {
            identities.append("\n  ").append(entry->text("_id_")).append("  ").append(entry->text("node"));
        }
        throw usageError("several have the name " + name + "; use one of these instead:" + identities);
    }
    throw usageError(std::string("no ") + (context.options.has(groupOption) ? "group" : "person or group") +
                     " in the directory has the name or UUID " + name);
}

std::string upperCase(std::string_view word) {
    std::string text(word);
    std::transform(text.begin(), text.end(), text.begin(), [](unsigned char c) { return std::toupper(c); });
    return text;
}

/// How the entry may use an element: keys "everyone", "directly" and "through" (names of groups); empty if it may not.
Dictionary accessTo(const Element& element, const Dictionary& entry, const std::vector<Dictionary>& groups) {
    const auto isListed = [&](const Dictionary& one) {
        const std::string identity = upperCase(one.text("_id_"));
        return !identity.empty() && std::any_of(element.people.begin(), element.people.end(), [&](const auto& list) {
            return std::any_of(list.second.begin(), list.second.end(),
                               [&](const Person& person) { return upperCase(person.identity) == identity; });
        });
    };
    const bool everyone = element.fields.get("access_control_enabled") != Value(true);
    const bool directly = isListed(entry);
    Array through;
    for (const Dictionary& group : groups) {
        if (isListed(group)) {
            through.emplace_back(group.text("shortName"));
        }
    }
    if (!everyone && !directly && through.empty()) {
        return {};
    }
    return {{"everyone", everyone}, {"directly", directly}, {"through", std::move(through)}};
}

std::string accessText(const Dictionary& access) {
    std::string text = access.get("everyone") == Value(true) ? "open to everyone" : "";
    if (access.get("directly") == Value(true)) {
        text += std::string(text.empty() ? "" : ", ") + "in its list";
    }
    for (const Value& group : *access.get("through").array()) {
        text += (text.empty() ? "" : ", ") + std::string("through the group ") + *group.string();
    }
    return text;
}

std::string nameOf(const Element& element) {
    const std::string name = nameForPeople(element);
    return name.empty() ? element.identity : name;
}

}  // namespace

ExitStatus accessOf(const Context& context, std::span<const std::string> arguments) {
    const Dictionary entry = entryNamed(context, arguments.front());
    if (entry.text("type") == "user" && entry.get("groups").array() == nullptr) {
        throw Failure(ExitStatus::failed, "the directory node " + std::string(entry.text("node")) +
                                              " does not list the groups of people, so access through them is unknown");
    }
    const std::vector<Dictionary> groups = dictionariesOf(entry.get("groups"));
    const CurrentState current = readState(context);
    requireWhole(current);
    Array all;
    Table table({"", "name", "may be used"});
    for (const ListForm& list : current.form.lists()) {
        if (list.people.empty()) {
            continue;
        }
        for (const Element& element : elementsOf(current.state, list)) {
            Dictionary access = accessTo(element, entry, groups);
            if (access.empty()) {
                continue;
            }
            table.addRow({list.section, shown(nameOf(element)), shown(accessText(access))});
            access.set("section", list.section);
            access.set("identity", element.identity);
            access.set("name", element.label);
            all.emplace_back(std::move(access));
        }
    }
    if (context.options.format != Format::text) {
        writeValue(context, all, Description());
    } else if (all.empty()) {
        context.out << shown(entry.text("shortName")) << " may use none of them\n";
    } else {
        context.out << table.text(context.options.width, 0);
    }
    return ExitStatus::done;
}

}  // namespace adminhost::ctl
