#include "adminhostctl/lumio/ElementVerbs.h"

#include "adminhostctl/Complete.h"
#include "adminhostctl/Similar.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/State.h"
#include "adminhostctl/desired/Toml.h"
#include "adminhostctl/desired/Writing.h"
#include "adminhostctl/lumio/AccessVerb.h"
#include "adminhostctl/lumio/Listing.h"
#include "adminhostctl/lumio/People.h"
#include "platform/text/Uuid.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <cctype>

namespace adminhost::ctl {
namespace {

struct Listing {
    Array elements;
    std::vector<ReportedGap> unread;  ///< access lists that could not be read: they look empty
    std::string requestId;
};

/// The listing's answer. Throws Failure when the command returns an error.
Listing listingOf(const Context& context, const CommandRef& command, const ElementKind& kind) {
    const CommandAnswer answer = context.service.ask(command, {});
    const Dictionary* said = answer.value ? answer.value->dictionary() : nullptr;
    if (said == nullptr) {
        throw Failure(ExitStatus::failed, "the service did not return a dictionary");
    }
    const std::string error = errorOf(command.description, *said);
    const Array* list = said->get(kind.section).array();
    if (!error.empty() || list == nullptr) {
        const RequestReport report = context.service.report(answer.requestId);
        const std::string words = toolWordsOf(report.notDone);
        const std::string status = textOf(said->get("readStatus"));
        printLog(context, report);
        throw Failure(ExitStatus::failed,
                      std::string("the service does not list its ") + kind.section +
                          (words.empty() ? ": its database is missing or cannot be read" +
                                               (error.empty() ? std::string() : " (" + error + ")")
                                         : ": the database cannot be read: " + words +
                                               (words.ends_with(')') ? std::string() : " (" + status + ")")));
    }
    return {*list, context.service.gapsOf(answer), answer.requestId};
}

/// Prints what a listing could not read, after the rest of it; failed if there is something.
ExitStatus reportUnread(const Context& context, const Listing& listing) {
    context.err << (listing.unread.empty() ? "" : "adminhostctl: parts of the list could not be read:\n");
    for (const ReportedGap& gap : listing.unread) {
        context.err << "  " << shownIndented(gapText(gap), 4) << '\n';
    }
    if (listing.unread.empty()) {
        return ExitStatus::done;
    }
    printLog(context, context.service.report(listing.requestId));
    return ExitStatus::failed;
}

/// The name as a word for a shell.
std::string shellWord(const std::string& name) {
    const bool isPlain = !name.empty() && std::all_of(name.begin(), name.end(), [](unsigned char c) {
        return std::isalnum(c) != 0 || c == '_' || c == '-' || c == '.' || c == '/';
    });
    if (isPlain) {
        return name;
    }
    std::string word = "'";
    for (const char c : name) {
        word += c == '\'' ? std::string("'\\''") : std::string(1, c);
    }
    return word + '\'';
}

/// What the person may not expect of the change.
void addNotes(std::vector<std::string>& notes, const ElementKind& kind, const std::string& name, const Element& element,
              const WantedElement& wanted) {
    const Value& restricts = wanted.fields.get("access_control_enabled");
    const bool isEmpty = std::all_of(element.people.begin(), element.people.end(),
                                     [](const auto& people) { return people.second.empty(); });
    std::string note;
    if (!wanted.lists.empty() && element.fields.get("access_control_enabled") != Value(true)) {
        note = name + " is open to everyone; its list counts after \"adminhostctl " + kind.word + " access " +
               shellWord(name) + " on\"";
    } else if (restricts == Value(true) && isEmpty) {
        note = "the list of " + name + " is empty, so nobody may use it now; \"adminhostctl " + kind.word +
               " allow\" adds people";
    }
    if (!note.empty() && std::find(notes.begin(), notes.end(), note) == notes.end()) {
        notes.push_back(std::move(note));
    }
}

/// Changes elements that the person has named, each in the same ways, in one write. A way of its own for each person:
/// the service's tool, which is run once for each, refuses all names if it does not know one of them.
ExitStatus change(const Context& context, const ElementKind& kind, std::span<const std::string> names,
                  const std::vector<WantedElement>& ways) {
    const CurrentState current = readState(context, kind.section);
    requireWhole(current);
    const ListForm& list = current.form.list(kind.section);
    Wanted all;
    std::vector<std::string> notes;
    for (const std::string& name : names) {
        const Element* element = findByAnyName(current.state, list, name);
        if (element == nullptr) {
            throw notFound(kind, name, current.state, list);
        }
        const bool removes = std::any_of(ways.begin(), ways.end(), [](const WantedElement& way) { return way.remove; });
        if (removes && !isConfirmed(context, "The " + std::string(kind.word) + ' ' + tomlText(name) +
                                                 " is removed, which cannot be undone. Continue?")) {
            return ExitStatus::failed;
        }
        for (WantedElement wanted : ways) {
            addNotes(notes, kind, name, *element, wanted);
            wanted.name = element->identity;
            wanted.shownAs = name;
            all.elements[kind.section].push_back(std::move(wanted));
        }
    }
    const ExitStatus status = carryOut(context, all, current, Retry::ifUnchanged);
    for (const std::string& note : notes) {
        context.err << shown(note) << '\n';
    }
    return status;
}

}  // namespace

Failure notFound(const ElementKind& kind, const std::string& name, const State& state, const ListForm& list) {
    std::vector<std::string> names;
    for (const Element& element : elementsOf(state, list)) {
        names.push_back(nameForPeople(element));
    }
    return usageError(std::string(kind.word) + " not found: " + name + didYouMean(name, names) + "; \"adminhostctl " +
                      kind.word + " list\" shows the names");
}

ExitStatus listElements(const Context& context, const ElementKind& kind) {
    const CommandRef command = context.service.command(kind.listing);
    const Listing listing = listingOf(context, command, kind);
    const Array chosen = chosenElements(context, kind, command.description, listing.elements);
    if (!context.options.names) {
        writeElements(context, kind, command.description, chosen);
        return reportUnread(context, listing);
    }
    const StateForm form(context.service.stateCommand("write").description);
    const State state = stateOf(form, {{kind.section, chosen}});
    for (const Element& element : elementsOf(state, form.list(kind.section))) {
        const std::string name = nameForPeople(element);
        context.out << (name.empty() ? "" : shown(name) + '\n');
    }
    return reportUnread(context, listing);
}

std::vector<std::string> elementNames(const Context& context, const ElementKind& kind) {
    const bool hasAccess = std::string_view(kind.section) != "properties";
    const CommandAnswer answer =
        context.service.ask(context.service.command(hasAccess ? "getAccess" : kind.listing), {});
    std::vector<std::string> names;
    for (const Dictionary& one :
         dictionariesAt(answer.value.value_or(Value()), hasAccess ? "resources" : kind.section)) {
        if ((!hasAccess || one.text("section") == kind.section) && one.get("disabled") != Value(true)) {
            names.emplace_back(one.text(one.text("name").empty() ? "bundle_path" : "name"));
        }
    }
    return names;
}

ExitStatus showElement(const Context& context, const ElementKind& kind, const std::string& name) {
    const CommandRef command = context.service.command(kind.listing);
    const Listing listing = listingOf(context, command, kind);
    const StateForm form(context.service.stateCommand("write").description);
    const State state = stateOf(form, {{kind.section, listing.elements}});
    const ListForm& list = form.list(kind.section);
    const Element* element = findByAnyName(state, list, name);
    if (element == nullptr) {
        throw notFound(kind, name, state, list);
    }
    for (const Value& listed : listing.elements) {
        if (listed.dictionary() != nullptr && listed.dictionary()->get(list.identity) == Value(element->identity)) {
            writeElement(context, kind, command.description, *listed.dictionary());
        }
    }
    return reportUnread(context, listing);
}

ExitStatus allowPeople(const Context& context, const ElementKind& kind, std::span<const std::string> elements,
                       std::span<const std::string> people) {
    const bool groups = context.options.has(groupOption);
    std::vector<WantedElement> ways;
    for (const std::string& name : shortNamesOf(context, people, groups)) {
        WantedElement wanted;
        wanted.lists[groups ? "groups" : "users"] = {name};
        ways.push_back(std::move(wanted));
    }
    return change(context, kind, elements, ways);
}

ExitStatus denyPeople(const Context& context, const ElementKind& kind, std::span<const std::string> elements,
                      std::span<const std::string> people) {
    // An account that the directory does not know is only in the lists as the database has them.
    if (people.size() == 1 && elements.size() == 1 && uuidOf(people.front())) {
        const CurrentState current = readState(context, kind.section);
        const ListForm& list = current.form.list(kind.section);
        const Element* element = findByAnyName(current.state, list, elements.front());
        if (element == nullptr) {
            throw notFound(kind, elements.front(), current.state, list);
        }
        if (isUnknownEntry(context, people.front(), element->identity)) {
            return removeUnknown(context, people.front(), element->identity);
        }
    }
    const bool groups = context.options.has(groupOption);
    std::vector<WantedElement> ways;
    for (const std::string& name : people) {
        const std::vector<Dictionary> entries = entriesNamed(context, name);
        if (entries.empty()) {
            throw unknownName(context, groups ? "group" : "person or group", name);
        }
        if (groups) {
            (void)shortNamesOf(context, std::span(&name, 1), true);
        }
        WantedElement wanted;
        wanted.denied.push_back({groups ? "group" : "", std::string(entries.front().text("shortName")), ""});
        ways.push_back(std::move(wanted));
    }
    return change(context, kind, elements, ways);
}

ExitStatus switchAccess(const Context& context, const ElementKind& kind, const std::string& name,
                        const std::string& onOrOff) {
    const auto restricted = booleanOfText(onOrOff);
    if (!restricted) {
        throw usageError(std::string(kind.word) + " access: \"" + onOrOff + "\" is neither on nor off");
    }
    WantedElement wanted;
    wanted.fields.set("access_control_enabled", *restricted);
    return change(context, kind, std::span(&name, 1), {wanted});
}

ExitStatus removeElement(const Context& context, const ElementKind& kind, const std::string& name) {
    WantedElement wanted;
    wanted.remove = true;
    return change(context, kind, std::span(&name, 1), {wanted});
}

}  // namespace adminhost::ctl
