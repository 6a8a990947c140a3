#include "adminhostctl/desired/Writing.h"

#include "adminhostctl/Width.h"
#include "adminhostctl/desired/ChangeOutput.h"
#include "adminhostctl/desired/Toml.h"
#include "platform/value/ValueText.h"

#include <algorithm>

namespace adminhost::ctl {
namespace {

/// The dictionary of an answer. Throws Failure if it is something else.
const Dictionary& dictionaryOf(const std::optional<Value>& answer) {
    if (!answer || answer->dictionary() == nullptr) {
        throw Failure(ExitStatus::failed, "the service did not return a dictionary");
    }
    return *answer->dictionary();
}

std::string linesOf(const std::vector<ReportedGap>& gaps) {
    std::string lines;
    for (const ReportedGap& gap : gaps) {
        lines += "\n  " + shownIndented(gapText(gap), 4);
    }
    return lines;
}

/// Failures within a request that belong to none of its entries: of a directory node for instance, for which lists of
/// people are shortened, also those that the answer returns.
std::vector<ReportedGap> generalGaps(const RequestReport& report) {
    std::vector<ReportedGap> gaps;
    for (const ReportedGap& gap : report.notDone) {
        if (gap.keyPath.empty()) {
            gaps.push_back(gap);
        }
    }
    if (report.notDoneDropped > 0) {
        gaps.push_back(
            {"", "and " + std::to_string(report.notDoneDropped) + " more, which the daemon did not keep", ""});
    }
    return gaps;
}

/// Prints the names that the write has looked up, and the stored results.
void showLookedUp(const Context& context, const StateForm& form, const Plan& plan, const State& after) {
    for (const DescribedKey& key : form.settings()) {
        const std::string name = form.nameOf(key);
        const Value& written = plan.root.get(name);
        if (written.isNull() || !isLookedUp(key, written)) {
            continue;
        }
        const Value& stored = after.settings.get(name);
        context.err << form.settingsSection() << '.' << name << ": "
                    << (stored == written
                            ? "not found on the local network, stored as it is"
                            : "found on the local network, stored as " + tomlValue(stored).value_or("(not set)"))
                    << '\n';
    }
}

/// The commands that have to be run for the applied changes to take effect.
std::vector<std::string> restartOf(const StateForm& form, const std::vector<PlannedChange>& applied) {
    std::vector<std::string> commands;
    for (const PlannedChange& change : applied) {
        const DescribedKey* key = change.section == form.settingsSection() ? form.setting(change.key) : nullptr;
        for (const std::string& command : key != nullptr ? key->restart : std::vector<std::string>()) {
            if (std::find(commands.begin(), commands.end(), command) == commands.end()) {
                commands.push_back(command);
            }
        }
    }
    return commands;
}

/// Prints what the other settings of files that have moved are now.
void showMoved(const Context& context, const StateForm& form, const Plan& plan, const State& after) {
    std::string unset;
    std::size_t count = 0;
    for (const std::string& name : plan.movedAlong) {
        if (after.settings.get(name).isNull()) {
            unset += (unset.empty() ? "" : ", ") + name;
            ++count;
        }
    }
    if (plan.movedAlong.empty()) {
        return;
    }
    const std::size_t all = plan.movedAlong.size();
    context.err << form.settingsSection() << ": " << all
                << (all == 1 ? " setting is read from there now: " : " settings are read from there now: ")
                << (count == all ? "not set"
                    : count == 0 ? "set"
                                 : std::to_string(count) + " of them not set (" + shown(unset) + ")")
                << '\n';
}

/// One write and its outcome.
class PlannedWrite {
  public:
    PlannedWrite(const Context& context, const CurrentState& current, const Wanted& wanted, Plan plan,
                 ChangeOutput& output)
        : _context(context),
          _output(output),
          _current(current),
          _wanted(wanted),
          _plan(std::move(plan)),
          _command(context.service.stateCommand("write")) {}

    ExitStatus perform() {
        CommandAnswer answer;
        try {
            answer = _context.service.ask(_command, request(), _current.revision);
        } catch (const LostAnswer& lost) {
            return afterLost(lost);
        }
        const Dictionary& said = dictionaryOf(answer.value);
        const std::string error = errorOf(_command.description, said);
        RequestReport report = _context.service.report(answer.requestId);
        if (report.notDone.empty()) {
            report.notDone = _context.service.gapsOf(answer);
        }
        const std::vector<ReportedGap> gaps = generalGaps(report);
        std::optional<State> after;
        if (const Dictionary* root = said.get(_current.form.root()).dictionary()) {
            after = stateOf(_current.form, *root);
            after->peopleUnread = !gaps.empty();
        }
        const PlanOutcome outcome =
            outcomeOf(_current.form, _wanted, _plan, _current.state, after, error.empty(), report);
        _output.show(_plan, outcome, restartOf(_current.form, outcome.applied));
        _context.out.flush();
        if (after) {
            showLookedUp(_context, _current.form, _plan, *after);
            showMoved(_context, _current.form, _plan, *after);
        }
        if (!error.empty()) {
            _context.err << "adminhostctl: the service returned an error: " << error << '\n';
        }
        const ExitStatus status = error.empty() ? ExitStatus::done : ExitStatus::failed;
        if (status == ExitStatus::done && outcome.failed.empty() && outcome.undetermined.empty()) {
            return ExitStatus::done;
        }
        if (!gaps.empty()) {
            _context.err << "adminhostctl: other failures within the request:" << linesOf(gaps) << '\n';
        }
        _context.err << (report.log.empty() ? "the request logged nothing\n" : "log lines of the request:\n");
        for (const std::string& line : report.log) {
            _context.err << "  " << shownIndented(line, 4) << '\n';
        }
        return status == ExitStatus::done && outcome.failed.empty() ? ExitStatus::undetermined : ExitStatus::failed;
    }

  private:
    /// The write, which returns only the section that was read before: the others may be much larger.
    [[nodiscard]] Dictionary request() const {
        Dictionary request{{_current.form.root(), _plan.root}};
        for (const DictionaryEntry& entry :
             _context.service.stateCommand("read").description.partOf(_current.section)) {
            if (_command.description.key(entry.key) != nullptr) {
                request.set(entry.key, entry.value);
            }
        }
        return request;
    }
    /// Nothing is sent again: reading and the daemon's report show what was written.
    ExitStatus afterLost(const LostAnswer& lost) {
        const RequestReport report = reportLost(_context, lost);
        std::optional<State> after;
        // While the request is running, reading would only wait for it, and the state is not final.
        if (report.state == RequestReport::State::done || report.state == RequestReport::State::unknown) {
            try {
                CurrentState current = readState(_context, _current.section);
                if (current.unread.empty()) {
                    after = std::move(current.state);
                } else {
                    _context.err << "adminhostctl: parts of the state could not be read:" << linesOf(current.unread)
                                 << '\n';
                }
            } catch (const Failure& failure) {
                _context.err << "adminhostctl: reading back: " << shown(failure.what()) << '\n';
            }
        }
        PlanOutcome outcome = outcomeOf(_current.form, _wanted, _plan, _current.state, after, false, report);
        _output.show(_plan, outcome, restartOf(_current.form, outcome.applied));
        return !outcome.undetermined.empty()               ? ExitStatus::undetermined
               : !outcome.failed.empty()                   ? ExitStatus::failed
               : lost.status() == ExitStatus::undetermined ? ExitStatus::done
                                                           : lost.status();
    }

    const Context& _context;
    ChangeOutput& _output;
    const CurrentState& _current;
    const Wanted& _wanted;
    Plan _plan;
    CommandRef _command;
};

ExitStatus carryOutWith(const Context& context, const Wanted& wanted, const CurrentState& current,
                        ChangeOutput& output) {
    Plan plan = planOf(current.form, wanted, current.state);
    if (context.options.has(dryRunOption)) {
        return showOnly(context, current, plan);
    }
    if (plan.changes.empty()) {
        output.show(plan);
        return ExitStatus::done;
    }
    Wanted settings = wanted;
    settings.elements.clear();
    settings.removeUnlisted.clear();
    Plan first = planOf(current.form, settings, current.state);
    if (!plan.moves || first.changes.size() == plan.changes.size()) {
        return PlannedWrite(context, current, wanted, std::move(plan), output).perform();
    }
    // The new files may refer to another database, in which the identity belongs to another element.
    const ExitStatus status = PlannedWrite(context, current, settings, std::move(first), output).perform();
    if (status != ExitStatus::done) {
        return status;
    }
    Wanted elements = wanted;
    elements.settings = {};
    elements.secrets.clear();
    const CurrentState moved = readState(context);
    requireWhole(moved);
    Plan second = planOf(moved.form, elements, moved.state);
    if (second.changes.empty()) {
        return ExitStatus::done;
    }
    return PlannedWrite(context, moved, elements, std::move(second), output).perform();
}

/// Whether an element that is removed as a whole is as it was.
bool isSameElement(const PlannedChange& removal, const CurrentState& before, const CurrentState& now) {
    const auto find = [&](const CurrentState& current) {
        const std::vector<Element>& all = elementsOf(current.state, current.form.list(removal.section));
        return std::find_if(all.begin(), all.end(),
                            [&](const Element& element) { return element.identity == removal.identity; });
    };
    if (removal.identity.empty()) {
        return true;  // it is added
    }
    return *find(before) == *find(now);
}

/// Returns false if nothing is left to be changed. Throws Conflict if something that is to be changed is no longer as
/// it was, or if that cannot be determined.
bool requireUnchanged(const Wanted& wanted, const CurrentState& before, const CurrentState& now) {
    const Plan old = planOf(before.form, wanted, before.state);
    const Plan plan = planOf(now.form, wanted, now.state);
    for (const PlannedChange& change : plan.changes) {
        const auto same = std::find(old.changes.begin(), old.changes.end(), change);
        const bool isSame = same != old.changes.end() && same->identity == change.identity;
        if (!isSame || !(change.key.empty() ? isSameElement(change, before, now) : true)) {
            throw Conflict(change.entry + ": another client has changed it, it is " + change.from +
                           " now; nothing was written");
        }
        if (change.secret && !change.before.isNull()) {
            throw Conflict(change.entry +
                           ": another client has changed something since the state was read, and a stored secret "
                           "cannot be compared; nothing was written");
        }
    }
    return !plan.changes.empty();
}

}  // namespace

CurrentState readState(const Context& context, const std::string& section) {
    StateForm form(context.service.stateCommand("write").description);
    const CommandRef command = context.service.stateCommand("read");
    const CommandAnswer answer = context.service.ask(command, command.description.partOf(section));
    const Dictionary* root = dictionaryOf(answer.value).get(form.root()).dictionary();
    if (root == nullptr) {
        throw Failure(ExitStatus::failed, "the service did not return its " + form.root());
    }
    State state = stateOf(form, *root);
    std::vector<ReportedGap> unread = context.service.gapsOf(answer);
    std::vector<std::string> log;
    if (!unread.empty()) {
        log = context.service.report(answer.requestId).log;
    }
    return {std::move(form), std::move(state), answer.revision, std::move(unread), section, std::move(log)};
}

CurrentState readSettingsSection(const Context& context) {
    return readState(context, StateForm(context.service.stateCommand("write").description).settingsSection());
}

void requireWhole(const CurrentState& current) {
    if (current.unread.empty()) {
        return;
    }
    // A section that is not even listed as empty: the service could not read its database at all.
    const bool lacksSection =
        std::any_of(current.form.lists().begin(), current.form.lists().end(), [&](const auto& list) {
            return (current.section.empty() || current.section == list.section) &&
                   !current.state.lists.contains(list.section);
        });
    const std::string words = lacksSection ? toolWordsOf(current.unread) : "";
    throw Failure(ExitStatus::failed, (words.empty() ? "" : "the database cannot be read: " + words + '\n') +
                                          "parts of the state could not be read:" + linesOf(current.unread) +
                                          logText(current.log));
}

ExitStatus showOnly(const Context& context, const CurrentState& current, const Plan& plan) {
    if (!plan.root.empty()) {
        context.service.check(context.service.stateCommand("write"), {{current.form.root(), plan.root}});
    }
    ChangeOutput output(context);
    output.show(plan);
    output.finish();
    return ExitStatus::done;
}

ExitStatus carryOut(const Context& context, const Wanted& wanted, const CurrentState& current, Retry retry) {
    constexpr int attempts = 3;
    ChangeOutput output(context);
    std::optional<CurrentState> again;
    try {
        for (int attempt = 0;; ++attempt) {
            try {
                const ExitStatus status = carryOutWith(context, wanted, again ? *again : current, output);
                output.finish();
                return status;
            } catch (const Conflict&) {
                if (retry == Retry::never || attempt == attempts) {
                    throw;
                }
                again = readState(context, current.section);
                requireWhole(*again);
                if (!requireUnchanged(wanted, current, *again)) {
                    context.err << "already so: another client has changed it\n";
                }
            }
        }
    } catch (const Failure&) {
        output.finish();
        throw;
    }
}

}  // namespace adminhost::ctl
