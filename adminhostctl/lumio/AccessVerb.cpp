#include "adminhostctl/lumio/AccessVerb.h"

#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/StateForm.h"
#include "adminhostctl/desired/Toml.h"
#include "adminhostctl/lumio/Listing.h"
#include "adminhostctl/lumio/People.h"
#include "platform/text/Uuid.h"

#include <algorithm>

namespace adminhost::ctl {
namespace {

/// The answer of the command that lists every access list.
struct Overview {
    std::vector<Dictionary> resources;
    std::string revision;
};

Overview readOverview(const Context& context) {
    const CommandRef command = context.service.command("getAccess");
    const CommandAnswer answer = context.service.ask(command, {});
    const Dictionary* said = answer.value ? answer.value->dictionary() : nullptr;
    const std::string error = said == nullptr ? "" : errorOf(command.description, *said);
    if (said == nullptr || !error.empty() || said->get("resources").array() == nullptr) {
        std::string log;
        for (const std::string& line : context.service.report(answer.requestId).log) {
            log += "\n  " + line;
        }
        throw Failure(ExitStatus::failed, "parts of the state could not be read: the access lists" +
                                              (error.empty() ? "" : " (" + error + ")") +
                                              (log.empty() ? "" : "; log lines of the request:" + log));
    }
    return {dictionariesOf(said->get("resources")), answer.revision};
}

/// The person of that name or UUID, or the group: a group often has the name of its only member. An account that the
/// directory does not know has no type. Throws Failure(usage) if several have the name, or if neither the directory nor
/// a list has it.
Dictionary entryNamed(const Context& context, const std::string& name, const Overview& overview) {
    const std::vector<Dictionary> all = entriesNamed(context, name);
    for (const char* type : {"user", "group"}) {
        std::vector<Dictionary> found;
        for (const Dictionary& entry : all) {
            if (entry.text("type") == type) {
                found.push_back(entry);
            }
        }
        if (found.empty() || (context.options.has(groupOption) && std::string_view(type) == "user")) {
            continue;
        }
        if (found.size() > 1) {
            throw ambiguousName(name, found);
        }
        return found.front();
    }
    for (const Dictionary& resource : overview.resources) {
        for (const Dictionary& person : dictionariesOf(resource.get("allowedUsersAndGroups"))) {
            if (isSameUuid(person.text("_id_"), name) && !person.contains("type")) {
                return person;
            }
        }
    }
    throw unknownName(context, context.options.has(groupOption) ? "group" : "person or group", name);
}

bool isListed(const Dictionary& resource, const Dictionary& one) {
    const std::vector<Dictionary> people = dictionariesOf(resource.get("allowedUsersAndGroups"));
    return std::any_of(people.begin(), people.end(),
                       [&](const Dictionary& person) { return isSameUuid(person.text("_id_"), one.text("_id_")); });
}

/// How the entry may use the resource: keys "everyone", "directly" and "through" (names of groups); empty if it may
/// not.
Dictionary accessTo(const Dictionary& resource, const Dictionary& entry, const std::vector<Dictionary>& groups) {
    const bool everyone = resource.get("access_control_enabled") != Value(true);
    const bool directly = isListed(resource, entry);
    Array through;
    for (const Dictionary& group : groups) {
        if (isListed(resource, group)) {
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
    return text + (access.get("disabled") == Value(true) ? " (disabled)" : "");
}

std::string nameOf(const Dictionary& resource) {
    for (const char* key : {"name", "bundle_path", "_id_"}) {
        if (const std::string_view text = resource.text(key); !text.empty()) {
            return std::string(text);
        }
    }
    return {};
}

std::string nameOfEntry(const Dictionary& entry) {
    return std::string(entry.text(entry.contains("shortName") ? "shortName" : "_id_"));
}

/// One entry of a list that is to be removed.
struct Removal {
    Dictionary resource;
    std::string line;
};

std::vector<Removal> removalsOf(const Overview& overview, const Dictionary& entry, const std::string& element) {
    std::vector<Removal> removals;
    for (const Dictionary& resource : overview.resources) {
        if (!isListed(resource, entry) || (!element.empty() && !isSameUuid(resource.text("_id_"), element))) {
            continue;
        }
        const std::string kind = entry.text("type") == "user"    ? ".users."
                                 : entry.text("type") == "group" ? ".groups."
                                                                 : ".unknown.";
        removals.push_back({resource, std::string(resource.text("section")) + '.' + tomlKey(nameOf(resource)) + kind +
                                          tomlKey(nameOfEntry(entry)) + ": (allowed) -> (not allowed)"});
    }
    return removals;
}

/// The write that removes an entry that the directory knows from all its lists.
Dictionary requestOf(const Context& context, const CommandRef& write, const std::vector<Removal>& removals,
                     const Dictionary& entry) {
    const StateForm form(write.description);
    // The settings are the smallest part that the write can return.
    Dictionary request = context.service.stateCommand("read").description.partOf(form.settingsSection());
    Dictionary lists;
    for (const char* section : {"cameras", "workflows"}) {
        Array changes;
        for (const Removal& removal : removals) {
            if (removal.resource.text("section") == section) {
                changes.emplace_back(Dictionary{
                    {"_id_", removal.resource.get("_id_")},
                    {"allowedUsersAndGroups", Array{Dictionary{{"_obsoleteid_", true}, {"_id_", entry.get("_id_")}}}}});
            }
        }
        if (!changes.empty()) {
            lists.set(section, std::move(changes));
        }
    }
    request.set(form.root(), std::move(lists));
    return request;
}

std::string reasonsOf(const RequestReport& report) {
    std::string reasons;
    for (const ReportedGap& gap : report.notDone) {
        reasons +=
            (reasons.empty() ? "" : "; ") + gap.reason + (gap.toolMessage.empty() ? "" : " (" + gap.toolMessage + ")");
    }
    return reasons.empty() ? "the service reported no reason" : reasons;
}

/// Reads the lists again and prints each removal with its outcome.
ExitStatus showOutcome(const Context& context, const std::vector<Removal>& removals, const Dictionary& entry,
                       const RequestReport& report) {
    const Overview after = readOverview(context);
    ExitStatus status = ExitStatus::done;
    Array all;
    for (const Removal& removal : removals) {
        const bool isLeft =
            std::any_of(after.resources.begin(), after.resources.end(), [&](const Dictionary& resource) {
                return resource.get("_id_") == removal.resource.get("_id_") && isListed(resource, entry);
            });
        Dictionary one{{"section", removal.resource.get("section")},
                       {"name", nameOf(removal.resource)},
                       {"person", nameOfEntry(entry)},
                       {"applied", !isLeft}};
        if (isLeft) {
            status = ExitStatus::failed;
            one.set("reason", reasonsOf(report));
        }
        if (context.options.format == Format::text) {
            context.out << shown(removal.line) << ": "
                        << (isLeft ? "FAILED: " + shownIndented(reasonsOf(report), 4) : "applied") << '\n';
        }
        all.emplace_back(std::move(one));
    }
    if (context.options.format != Format::text) {
        writeValue(context, all, Description());
    }
    return status;
}

void showNoChange(const Context& context) {
    if (context.options.format == Format::text) {
        context.out << "no change\n";
    } else {
        writeValue(context, Array(), Description());
    }
}

/// Shows the entries at a terminal and asks whether they are to be removed.
bool isRevocationConfirmed(const Context& context, const std::vector<Removal>& removals, const Dictionary& entry) {
    const bool asks = context.sources.terminal && !context.options.has(yesOption) && !context.options.has(dryRunOption);
    if (asks && context.options.format == Format::text) {
        for (const Removal& removal : removals) {
            context.out << shown(removal.line) << '\n';
        }
        context.out.flush();
    }
    return isConfirmed(context, "All entries of " + shown(nameOfEntry(entry)) + " are removed. Continue?");
}

/// Throws Conflict unless all entries of the account that are left are among those that were to be removed.
void requireSameEntries(const std::vector<Removal>& before, const std::vector<Removal>& now) {
    for (const Removal& removal : now) {
        if (std::none_of(before.begin(), before.end(), [&](const Removal& one) {
                return one.resource.get("_id_") == removal.resource.get("_id_");
            })) {
            throw Conflict(removal.line + ": another client has added this entry; nothing was written");
        }
    }
}

/// Removes these entries in one write, and prints the outcome. Throws Conflict if another client has changed something
/// since they were read.
ExitStatus removeEntries(const Context& context, const Overview& overview, const std::vector<Removal>& removals,
                         const Dictionary& entry) {
    CommandRef command;
    Dictionary request;
    std::string revision;
    if (entry.contains("type")) {
        command = context.service.stateCommand("write");
        request = requestOf(context, command, removals, entry);
        revision = overview.revision;
    } else {
        command = context.service.command("removeAccess");
        request = {{"uuid", entry.get("_id_")}};
        Array resources;
        for (const Removal& removal : removals) {
            resources.emplace_back(removal.resource.get("_id_"));
        }
        request.set("resources", std::move(resources));
    }
    if (context.options.has(dryRunOption)) {
        if (context.options.format == Format::text) {
            for (const Removal& removal : removals) {
                context.out << shown(removal.line) << '\n';
            }
        }
        return checkOnly(context, command, request);
    }
    try {
        const CommandAnswer answer = context.service.ask(command, request, revision);
        return showOutcome(context, removals, entry, context.service.report(answer.requestId));
    } catch (const LostAnswer& lost) {
        const RequestReport report = reportLost(context, lost);
        if (report.state != RequestReport::State::done) {
            return ExitStatus::undetermined;
        }
        return showOutcome(context, removals, entry, report);
    }
}

/// Removes the entry from its lists, or from the list of one element. If another client has changed something since
/// they were read, reads again and tries again, three times at most, while the account has no other entries.
ExitStatus revoke(const Context& context, const Overview& overview, const Dictionary& entry,
                  const std::string& element) {
    constexpr int attempts = 3;
    const std::vector<Removal> all = removalsOf(overview, entry, element);
    if (all.empty()) {
        showNoChange(context);
        return ExitStatus::done;
    }
    if (element.empty() && !isRevocationConfirmed(context, all, entry)) {
        return ExitStatus::failed;
    }
    Overview current = overview;
    std::vector<Removal> removals = all;
    for (int attempt = 0;; ++attempt) {
        try {
            return removeEntries(context, current, removals, entry);
        } catch (const Conflict&) {
            if (attempt == attempts) {
                throw;
            }
        }
        current = readOverview(context);
        removals = removalsOf(current, entry, element);
        requireSameEntries(all, removals);
        if (removals.empty()) {
            showNoChange(context);
            context.err << "already so: another client has changed it\n";
            return ExitStatus::done;
        }
    }
}

}  // namespace

bool isUnknownEntry(const Context& context, const std::string& uuid, const std::string& element) {
    if (!uuidOf(uuid) || !entriesNamed(context, uuid).empty()) {
        return false;
    }
    const Overview overview = readOverview(context);
    return !removalsOf(overview, Dictionary{{"_id_", uuid}}, element).empty();
}

ExitStatus removeUnknown(const Context& context, const std::string& uuid, const std::string& element) {
    const Overview overview = readOverview(context);
    return revoke(context, overview, entryNamed(context, uuid, overview), element);
}

ExitStatus accessOf(const Context& context, std::span<const std::string> arguments) {
    const std::string group = context.options.argumentOf(groupOption);
    if (arguments.empty() == group.empty()) {
        throw wrongUse(context, "access", arguments.empty() ? "a name is missing" : "one name is enough");
    }
    const Overview overview = readOverview(context);
    const Dictionary entry = entryNamed(context, group.empty() ? arguments.front() : group, overview);
    if (context.options.has(revokeOption)) {
        return revoke(context, overview, entry, {});
    }
    if (entry.text("type") == "user" && entry.get("groups").array() == nullptr) {
        throw Failure(ExitStatus::failed, "the directory node " + std::string(entry.text("node")) +
                                              " does not list the groups of people, so access through them is unknown");
    }
    const bool isKnown = entry.contains("type");
    const std::vector<Dictionary> groups = dictionariesOf(entry.get("groups"));
    Array all;
    Table table({"", "name", "may be used"});
    for (const Dictionary& resource : overview.resources) {
        Dictionary access = accessTo(resource, entry, groups);
        // What is open to everyone is not open to an account that nobody can sign in with.
        if (access.empty() || (!isKnown && access.get("directly") != Value(true)) ||
            (context.options.has(restrictedOption) && access.get("everyone") == Value(true))) {
            continue;
        }
        access.set("section", resource.get("section"));
        access.set("identity", resource.get("_id_"));
        access.set("name", resource.get("name"));
        access.set("disabled", resource.get("disabled"));
        table.addRow({std::string(resource.text("section")), shown(nameOf(resource)), shown(accessText(access))});
        all.emplace_back(std::move(access));
    }
    if (context.options.format != Format::text) {
        writeValue(context, all, Description());
        return ExitStatus::done;
    }
    if (!isKnown) {
        context.err << shown(nameOfEntry(entry)) << " is not in the directory; \"adminhostctl access UUID "
                    << revokeOption << "\" removes its entries\n";
    }
    if (all.empty()) {
        context.out << shown(nameOfEntry(entry)) << " may use none of them\n";
    } else {
        context.out << table.text(context.options.width, 0);
    }
    return ExitStatus::done;
}

}  // namespace adminhost::ctl
