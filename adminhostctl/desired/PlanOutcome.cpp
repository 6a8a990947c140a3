#include "adminhostctl/desired/PlanOutcome.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/desired/Toml.h"
#include "platform/value/ValueText.h"

#include <algorithm>

namespace adminhost::ctl {
namespace {

bool isBelow(const std::string& path, const std::string& above) {
    return path.starts_with(above) && (path.size() == above.size() || path[above.size()] == '.');
}

std::string reasonOf(const ReportedGap& gap) {
    return gap.reason + (gap.toolMessage.empty() ? "" : " (" + gap.toolMessage + ")");
}

/// The report on the change, on a part of it or on something that contains it; null if there is none.
const ReportedGap* gapOf(const PlannedChange& change, const RequestReport& report) {
    for (const ReportedGap& gap : report.notDone) {
        if (!gap.keyPath.empty() && (isBelow(gap.keyPath, change.keyPath) || isBelow(change.keyPath, gap.keyPath))) {
            return &gap;
        }
    }
    return nullptr;
}

bool isReported(const StateForm& form, const PlannedChange& change, const RequestReport& report) {
    return std::any_of(report.changes.begin(), report.changes.end(), [&](const ReportedChange& one) {
        const bool isSetting = change.identity.empty();
        return one.key == change.key &&
               (isSetting ? one.section == form.settingsSection()
                          : one.section != form.settingsSection() && one.identity == change.identity);
    });
}

bool concernsPeople(const StateForm& form, const PlannedChange& change) {
    return !change.identity.empty() && std::any_of(form.lists().begin(), form.lists().end(),
                                                   [&](const ListForm& list) { return list.isPeople(change.key); });
}

/// Whether the daemon reports the change of this person, whose name is the end of the entry.
bool isPersonReported(const PlannedChange& change, const RequestReport& report) {
    return std::any_of(report.changes.begin(), report.changes.end(), [&](const ReportedChange& one) {
        const bool isRemoval = one.to.isNull();
        const std::string* name = (isRemoval ? one.from : one.to).string();
        return name != nullptr && one.key == change.key && one.identity == change.identity &&
               isRemoval == change.after.isNull() && change.entry.ends_with('.' + one.key + '.' + tomlKey(*name));
    });
}

/// The part of the desired state that can be compared with the state afterwards.
Wanted comparable(const StateForm& form, const Wanted& wanted, const Plan& plan, const State& before,
                  const State& after, bool answered) {
    Wanted visible = wanted;
    visible.secrets.clear();
    for (const DescribedKey& key : form.settings()) {
        const std::string name = form.nameOf(key);
        const Value& value = wanted.settings.get(name);
        // The stored value is the result of the lookup, which may differ from what was written.
        if (!value.isNull() && isLookedUp(key, value) &&
            (answered || !plan.root.contains(name) || after.settings.get(name) != before.settings.get(name))) {
            visible.settings.remove(name);
        }
    }
    for (const ListForm& list : form.lists()) {
        const auto elements = visible.elements.find(list.section);
        if (elements == visible.elements.end()) {
            continue;
        }
        for (WantedElement& element : elements->second) {
            element.writeSecret = false;
        }
        if (after.lists.count(list.section) > 0) {
            std::erase_if(elements->second, [&](const WantedElement& element) {
                return element.remove && findElement(after, list, element.name) == nullptr;
            });
        }
    }
    visible.lookUp = true;
    return visible;
}

}  // namespace

PlanOutcome outcomeOf(const StateForm& form, const Wanted& wanted, const Plan& plan, const State& before,
                      const std::optional<State>& after, bool answered, const RequestReport& report) {
    PlanOutcome outcome;
    std::vector<PlannedChange> remaining;
    bool isReadable = after.has_value();
    try {
        if (after) {
            remaining = planOf(form, comparable(form, wanted, plan, before, *after, answered), *after).changes;
        }
    } catch (const Failure&) {
        isReadable = false;  // an element is no longer there, or its section cannot be read
    }
    const bool isDone = report.state == RequestReport::State::done;
    for (const PlannedChange& change : plan.changes) {
        const auto still = std::find_if(remaining.begin(), remaining.end(),
                                        [&](const PlannedChange& one) { return one.entry == change.entry; });
        const ReportedGap* gap = gapOf(change, report);
        const DescribedKey* secret = change.identity.empty() ? form.secret(change.key) : nullptr;
        const auto fail = [&](const PlannedChange& what) {
            outcome.failed.push_back({what, gap != nullptr ? reasonOf(*gap) : ""});
        };
        const bool isPerson = concernsPeople(form, change);
        const bool isUnread = isPerson && after && after->peopleUnread;
        // A list without a person may be one for which the directory failed.
        const bool isRefused = (change.hidden || isPerson) && gap != nullptr;
        const bool lacksSecret =
            isReadable && secret != nullptr &&
            booleanOf(after->settings.get(secret->shownBy)) == wanted.secrets.at(change.key).empty();
        // The report on this change may be among those that the daemon did not keep.
        const bool isWhole = isDone && answered && report.notDoneDropped == 0;
        const bool isUnproven = change.hidden && !isWhole && !isReported(form, change, report);
        if (isUnread && gap == nullptr) {
            (isPersonReported(change, report) ? outcome.applied : outcome.undetermined).push_back(change);
        } else if (still != remaining.end()) {
            fail(*still);
        } else if (isRefused || lacksSecret) {
            fail(change);
        } else if (!isReadable || isUnproven) {
            outcome.undetermined.push_back(change);
        } else {
            outcome.applied.push_back(change);
        }
    }
    for (const PlannedChange& change : remaining) {
        const bool isPlanned = std::any_of(plan.changes.begin(), plan.changes.end(),
                                           [&](const PlannedChange& one) { return one.entry == change.entry; });
        if (!isPlanned && !(after->peopleUnread && concernsPeople(form, change))) {
            outcome.failed.push_back({change, ""});
        }
    }
    return outcome;
}

}  // namespace adminhost::ctl
