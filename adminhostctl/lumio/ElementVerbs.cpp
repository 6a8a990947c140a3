#include "adminhostctl/lumio/ElementVerbs.h"

#include "adminhostctl/Similar.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/State.h"
#include "adminhostctl/desired/Writing.h"

namespace adminhost::ctl {
namespace {

struct Listing {
    Array elements;
    std::vector<ReportedGap> unread;  ///< access lists that could not be read: they look empty
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
        throw Failure(ExitStatus::failed, std::string("the service does not list its ") + kind.section +
                                              ": its database is missing or cannot be read" +
                                              (error.empty() ? "" : " (" + error + ")"));
    }
    return {*list, context.service.gapsOf(answer)};
}

/// Prints what a listing could not read, after the rest of it; failed if there is something.
ExitStatus reportUnread(const Context& context, const Listing& listing) {
    context.err << (listing.unread.empty() ? "" : "adminhostctl: parts of the list could not be read:\n");
    for (const ReportedGap& gap : listing.unread) {
        context.err << "  " << shownIndented(gapText(gap), 4) << '\n';
    }
    return listing.unread.empty() ? ExitStatus::done : ExitStatus::failed;
}

/// Changes one element, which the person has named.
ExitStatus change(const Context& context, const ElementKind& kind, const std::string& name, WantedElement wanted) {
    const CurrentState current = readState(context, kind.section);
    requireWhole(current);
    const Element* element = findByAnyName(current.state, current.form.list(kind.section), name);
    if (element == nullptr) {
        throw notFound(kind, name, current.state, current.form.list(kind.section));
    }
    wanted.name = element->identity;
    wanted.shownAs = name;
    Wanted all;
    all.elements[kind.section].push_back(std::move(wanted));
    return carryOut(context, all, current);
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
    if (!context.options.names) {
        writeValue(context, listing.elements, command.description, kind.section);
        return reportUnread(context, listing);
    }
    const StateForm form(context.service.stateCommand("write").description);
    const State state = stateOf(form, {{kind.section, listing.elements}});
    for (const Element& element : elementsOf(state, form.list(kind.section))) {
        const std::string name = nameForPeople(element);
        context.out << (name.empty() ? "" : shown(name) + '\n');
    }
    return reportUnread(context, listing);
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
            writeValue(context, listed, command.description, std::string(kind.section) + "[]");
        }
    }
    return reportUnread(context, listing);
}

ExitStatus allowPeople(const Context& context, const ElementKind& kind, const std::string& name,
                       std::span<const std::string> people) {
    WantedElement wanted;
    wanted.lists[context.options.has(groupOption) ? "groups" : "users"] =
        std::vector<std::string>(people.begin(), people.end());
    return change(context, kind, name, std::move(wanted));
}

ExitStatus denyPeople(const Context& context, const ElementKind& kind, const std::string& name,
                      std::span<const std::string> people) {
    WantedElement wanted;
    for (const std::string& person : people) {
        wanted.denied.push_back({context.options.has(groupOption) ? "group" : "", person, ""});
    }
    return change(context, kind, name, std::move(wanted));
}

ExitStatus switchAccess(const Context& context, const ElementKind& kind, const std::string& name,
                        const std::string& onOrOff) {
    if (onOrOff != "on" && onOrOff != "off") {
        throw usageError(std::string(kind.word) + " access: \"" + onOrOff + "\" is neither on nor off");
    }
    WantedElement wanted;
    wanted.fields.set("access_control_enabled", onOrOff == "on");
    return change(context, kind, name, std::move(wanted));
}

ExitStatus removeElement(const Context& context, const ElementKind& kind, const std::string& name) {
    WantedElement wanted;
    wanted.remove = true;
    return change(context, kind, name, std::move(wanted));
}

}  // namespace adminhost::ctl
