#include "adminhostctl/lumio/LumioVerbs.h"

#include "adminhostctl/Complete.h"
#include "adminhostctl/desired/State.h"
#include "adminhostctl/desired/Toml.h"
#include "adminhostctl/desired/Writing.h"
#include "adminhostctl/lumio/AccessVerb.h"
#include "adminhostctl/lumio/ElementVerbs.h"
#include "adminhostctl/lumio/Listing.h"
#include "adminhostctl/lumio/People.h"

#include <algorithm>
#include <array>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

constexpr ElementKind camera{"camera", "cameras", "getCameras"};
constexpr ElementKind workflow{"workflow", "workflows", "getWorkflows"};
constexpr ElementKind property{"property", "properties", "getProperties"};

constexpr std::string_view protectOption = "--protect";
constexpr std::string_view noProtectOption = "--no-protect";

WantedElement wantedOf(const std::string& name) {
    return {name, {}, {}, {}, false, false};
}

ExitStatus changeProperty(const Context& context, WantedElement element, const CurrentState& current) {
    Wanted wanted;
    wanted.elements[property.section].push_back(std::move(element));
    return carryOut(context, wanted, current, Retry::ifUnchanged);
}

ExitStatus propertySet(const Context& context, Words arguments) {
    const CurrentState current = readState(context, property.section);
    requireWhole(current);
    const ListForm& list = current.form.list(property.section);
    const Element* stored = findElement(current.state, list, arguments.front());
    WantedElement wanted = wantedOf(arguments.front());
    wanted.writeSecret = true;
    const bool isProtected = stored != nullptr && stored->fields.get("protect") == Value(true);
    const bool protects = context.options.has(protectOption);
    const bool isGiven = protects || context.options.has(noProtectOption);
    const bool becomes = isGiven ? protects : isProtected;
    if (isGiven) {
        wanted.fields.set("protect", becomes);
    }
    // Without a value, the stored value is kept and only its protection changes.
    if (arguments.size() > 1 || stored == nullptr || becomes == isProtected) {
        DescribedKey key;
        key.path = "the value of " + tomlText(arguments.front());
        key.type = "text";
        key.secret = becomes;
        wanted.fields.set("value", textOfWord(key, wordAt(arguments, 1), context.sources));
    }
    return changeProperty(context, std::move(wanted), current);
}

ExitStatus propertyRemove(const Context& context, Words arguments) {
    const CurrentState current = readState(context, property.section);
    requireWhole(current);
    const ListForm& list = current.form.list(property.section);
    if (findElement(current.state, list, arguments.front()) == nullptr) {
        throw notFound(property, arguments.front(), current.state, list);
    }
    if (!isConfirmed(context, "The property " + tomlText(arguments.front()) + " is removed. Continue?")) {
        return ExitStatus::failed;
    }
    WantedElement removed = wantedOf(arguments.front());
    removed.remove = true;
    return changeProperty(context, std::move(removed), current);
}

template <const ElementKind& kind>
ExitStatus listVerb(const Context& context, Words) {
    return listElements(context, kind);
}
template <const ElementKind& kind>
ExitStatus showVerb(const Context& context, Words words) {
    return showElement(context, kind, words.front());
}
struct ElementsAndPeople {
    std::vector<std::string> elements;
    std::vector<std::string> people;
};

/// "ELEMENT NAME... [--group]", or "--group GROUP ELEMENT...".
ElementsAndPeople elementsAndPeople(const Context& context, const std::string& verb, Words words) {
    std::vector<std::string> all(words.begin(), words.end());
    if (std::string group = context.options.argumentOf(groupOption); !group.empty()) {
        const std::vector<Dictionary> entries = entriesNamed(context, group);
        if (std::any_of(entries.begin(), entries.end(),
                        [](const Dictionary& entry) { return entry.text("type") == "group"; }) ||
            all.size() > 1) {
            return {std::move(all), {std::move(group)}};
        }
        all.insert(all.begin(), std::move(group));  // "--group ELEMENT NAME"
    }
    if (all.size() < 2) {
        throw wrongUse(context, verb, "a name is missing");
    }
    return {{all.front()}, {all.begin() + 1, all.end()}};
}

template <const ElementKind& kind>
ExitStatus allowVerb(const Context& context, Words words) {
    const auto [elements, people] = elementsAndPeople(context, kind.word + std::string(" allow"), words);
    return allowPeople(context, kind, elements, people);
}
template <const ElementKind& kind>
ExitStatus denyVerb(const Context& context, Words words) {
    const auto [elements, people] = elementsAndPeople(context, kind.word + std::string(" deny"), words);
    return denyPeople(context, kind, elements, people);
}
template <const ElementKind& kind>
ExitStatus accessVerb(const Context& context, Words words) {
    return switchAccess(context, kind, words.front(), words[1]);
}

ExitStatus cameraRemove(const Context& context, Words words) {
    return removeElement(context, camera, words.front());
}

// Completion

std::vector<std::string> propertyNames(const Context& context, const TypedArguments& typed) {
    return typed.before.empty() ? elementNames(context, property) : std::vector<std::string>();
}

/// What follows the name of an element.
enum class Then { nothing, people, onOrOff };

template <const ElementKind& kind, Then then>
std::vector<std::string> elementsThen(const Context& context, const TypedArguments& typed) {
    if (typed.before.empty()) {
        return elementNames(context, kind);
    }
    if constexpr (then == Then::people) {
        std::vector<std::string> names = peopleNames(context, typed);
        // After "--group GROUP" all words are elements, and a name is seldom both.
        for (std::string& name : elementNames(context, kind)) {
            names.push_back(std::move(name));
        }
        return names;
    } else if constexpr (then == Then::onOrOff) {
        return {"on", "off"};
    } else {
        return {};
    }
}

constexpr std::array table = {
    Verb{"camera list",
         "[--match GLOB] [--status STATUS] [--allowed NAME] [--restricted] [--sort COLUMN] [--columns LIST] [--wide] "
         "[--names]",
         "List the cameras and who may use them",
         0,
         0,
         &listVerb<camera>,
         {{"camera list", "camera list --status 'capturing*' --sort 'last used'"}}},
    Verb{"camera show",
         "NAME|UUID",
         "Show everything about a camera",
         1,
         1,
         &showVerb<camera>,
         {{"camera show 'Lecture hall 1'", "--format json camera show Roof"}},
         &elementsThen<camera, Then::nothing>},
    Verb{"camera allow",
         "CAMERA NAME... [--group] | --group GROUP CAMERA... [--dry-run]",
         "Allow users, or groups, to use a camera",
         1,
         1000,
         &allowVerb<camera>,
         {{"camera allow 'Lecture hall 1' anna ben", "camera allow --group studio 'Main hall' Roof"}},
         &elementsThen<camera, Then::people>},
    Verb{"camera deny",
         "CAMERA NAME... [--group] | --group GROUP CAMERA... [--dry-run]",
         "Remove users and groups from a camera's list",
         1,
         1000,
         &denyVerb<camera>,
         {{"camera deny 'Lecture hall 1' anna", "camera deny --group studio 'Main hall' Roof"}},
         &elementsThen<camera, Then::people>},
    Verb{"camera access",
         "CAMERA on|off [--dry-run]",
         "Restrict a camera to its list, or open it to everyone",
         2,
         2,
         &accessVerb<camera>,
         {{"camera access Roof on", "camera access Roof off --dry-run"}},
         &elementsThen<camera, Then::onOrOff>},
    Verb{"camera remove",
         "CAMERA [--yes] [--dry-run]",
         "Remove a camera from the service",
         1,
         1,
         &cameraRemove,
         {{"camera remove Roof", "camera remove 0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1E01 --yes"}},
         &elementsThen<camera, Then::nothing>},
    Verb{"workflow list",
         "[--match GLOB] [--allowed NAME] [--restricted] [--sort COLUMN] [--columns LIST] [--wide] [--names]",
         "List the workflows and who may use them",
         0,
         0,
         &listVerb<workflow>,
         {{"workflow list", "workflow list --allowed anna --columns name,allowed --wide"}}},
    Verb{"workflow show",
         "NAME|UUID|PATH",
         "Show everything about a workflow",
         1,
         1,
         &showVerb<workflow>,
         {{"workflow show 'Publish to Catalog'", "workflow show Workflows/Archive.workflow"}},
         &elementsThen<workflow, Then::nothing>},
    Verb{"workflow allow",
         "WORKFLOW NAME... [--group] | --group GROUP WORKFLOW... [--dry-run]",
         "Allow users, or groups, to use a workflow",
         1,
         1000,
         &allowVerb<workflow>,
         {{"workflow allow 'Publish to Catalog' anna ben", "workflow allow --group studio 'Audio Episode' Archive"}},
         &elementsThen<workflow, Then::people>},
    Verb{"workflow deny",
         "WORKFLOW NAME... [--group] | --group GROUP WORKFLOW... [--dry-run]",
         "Remove users and groups from a workflow's list",
         1,
         1000,
         &denyVerb<workflow>,
         {{"workflow deny 'Publish to Catalog' anna", "workflow deny --group studio 'Audio Episode' Archive"}},
         &elementsThen<workflow, Then::people>},
    Verb{"workflow access",
         "WORKFLOW on|off [--dry-run]",
         "Restrict a workflow to its list, or open it to everyone",
         2,
         2,
         &accessVerb<workflow>,
         {{"workflow access Archive on", "workflow access Archive off"}},
         &elementsThen<workflow, Then::onOrOff>},
    Verb{"access",
         "NAME|UUID [--group] [--restricted] [--revoke [--yes] [--dry-run]]",
         "Show what a person or a group may use, or remove it from all lists",
         0,
         1,
         &accessOf,
         {{"access anna --restricted", "access --group studio --revoke"}},
         &peopleNames},
    Verb{"property list",
         "[--match GLOB] [--sort COLUMN] [--columns LIST] [--wide] [--names]",
         "List the workflow properties",
         0,
         0,
         &listVerb<property>,
         {{"property list", "property list --match 'mail_*' --sort name"}}},
    Verb{"property set",
         "NAME [VALUE|@FILE|@-] [--protect|--no-protect] [--dry-run]",
         "Add or change a property",
         1,
         2,
         &propertySet,
         {{"property set watermark left", "property set mail_password @password.txt --protect"}},
         &propertyNames},
    Verb{"property remove",
         "NAME [--yes] [--dry-run]",
         "Remove a property",
         1,
         1,
         &propertyRemove,
         {{"property remove watermark", "property remove mail_password"}},
         &propertyNames},
};

constexpr std::array options = {
    VerbOption{groupOption, "[GROUP]",
               "The names are names of groups; with allow and deny, also: one group for all cameras or workflows that "
               "follow"},
    VerbOption{revokeOption, "", "Show the entries of the person or group itself, and remove them from all lists"},
    VerbOption{matchOption, "GLOB", "Only those whose name matches the pattern, in any case"},
    VerbOption{statusOption, "STATUS", "Only those with this status, which may be a pattern"},
    VerbOption{allowedOption, "NAME", "Only those that this person or group may use"},
    VerbOption{restrictedOption, "", "Only those that are restricted to their list, and not open to everyone"},
    VerbOption{sortOption, "COLUMN", "In the order of this column"},
    VerbOption{columnsOption, "LIST", "Show these columns, separated by commas"},
    VerbOption{wideOption, "", "Show long lists in full, and do not fit the table to the terminal"},
    VerbOption{protectOption, "", "Store the value encrypted"},
    VerbOption{noProtectOption, "", "Store the value unencrypted", protectOption},
};

}  // namespace

std::span<const Verb> lumioVerbs() noexcept {
    return table;
}
std::span<const VerbOption> lumioOptions() noexcept {
    return options;
}

}  // namespace adminhost::ctl
