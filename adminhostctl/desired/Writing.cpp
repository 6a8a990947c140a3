#include "adminhostctl/desired/Writing.h"

#include "adminhostctl/Width.h"
#include "adminhostctl/desired/Toml.h"
#include "platform/value/ValueText.h"

namespace adminhost::ctl {
namespace {

/// The dictionary of an answer. Throws Failure if it is something else.
const Dictionary& dictionaryOf(const std::optional<Value>& answer) {
    if (!answer || answer->dictionary() == nullptr) {
        throw Failure(ExitStatus::failed, "the service did not return a dictionary");
    }
    return *answer->dictionary();
}

void showLine(std::ostream& out, const PlannedChange& change) {
    out << shown(change.entry) << ": " << change.from << " -> " << change.to;
}

void showLines(std::ostream& err, const char* heading, const std::vector<PlannedChange>& changes) {
    if (!changes.empty()) {
        err << "adminhostctl: " << heading << '\n';
    }
    for (const PlannedChange& change : changes) {
        err << "  ";
        showLine(err, change);
        err << '\n';
    }
}

void showFailed(std::ostream& err, const std::vector<FailedChange>& failed) {
    if (!failed.empty()) {
        err << "adminhostctl: these changes were not applied:\n";
    }
    for (const FailedChange& one : failed) {
        err << "  ";
        showLine(err, one.change);
        err << (one.reason.empty() ? "" : ": " + shownIndented(one.reason, 4)) << '\n';
    }
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

/// The plan for programs.
void writePlan(const Context& context, const Plan& plan) {
    Array changes;
    for (const PlannedChange& change : plan.changes) {
        changes.emplace_back(Dictionary{{"entry", change.entry}, {"from", change.from}, {"to", change.to}});
    }
    Array notes;
    for (const std::string& note : plan.notes) {
        notes.emplace_back(note);
    }
    writeValue(
        context,
        Dictionary{{"changes", std::move(changes)}, {"notes", std::move(notes)}, {"restart", !plan.restart.empty()}},
        Description());
}

/// The plans of one verb's writes. Text is printed at once; for programs, finish() prints them as one document.
class PlanOutput {
  public:
    explicit PlanOutput(const Context& context) noexcept : _context(context) {}

    void show(const Plan& plan) {
        if (_context.options.format == Format::text) {
            showPlan(_context, plan);
            return;
        }
        _shown = true;
        _all.changes.insert(_all.changes.end(), plan.changes.begin(), plan.changes.end());
        _all.notes.insert(_all.notes.end(), plan.notes.begin(), plan.notes.end());
        _all.restart.insert(_all.restart.end(), plan.restart.begin(), plan.restart.end());
    }
    void finish() const {
        if (_shown) {
            writePlan(_context, _all);
        }
    }

  private:
    const Context& _context;
    Plan _all;
    bool _shown = false;
};

/// One write and its outcome.
class PlannedWrite {
  public:
    PlannedWrite(const Context& context, const CurrentState& current, const Wanted& wanted, Plan plan,
                 PlanOutput& output)
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
        _output.show(_plan);
        if (after) {
            showLookedUp(_context, _current.form, _plan, *after);
        }
        const ExitStatus status = reportAnswered(_context, error);
        showFailed(_context.err, outcome.failed);
        showLines(_context.err, "it could not be determined whether these changes were applied:", outcome.undetermined);
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
        Plan applied;
        applied.changes = outcome.applied;
        applied.restart = outcome.applied.empty() ? std::vector<std::string>() : _plan.restart;
        if (!applied.changes.empty()) {
            _context.err << "these changes were applied:\n";
            _context.err.flush();
            _output.show(applied);
        }
        showFailed(_context.err, outcome.failed);
        showLines(_context.err, "it could not be determined whether these changes were applied:", outcome.undetermined);
        return !outcome.undetermined.empty()               ? ExitStatus::undetermined
               : !outcome.failed.empty()                   ? ExitStatus::failed
               : lost.status() == ExitStatus::undetermined ? ExitStatus::done
                                                           : lost.status();
    }

    const Context& _context;
    PlanOutput& _output;
    const CurrentState& _current;
    const Wanted& _wanted;
    Plan _plan;
    CommandRef _command;
};

ExitStatus carryOutWith(const Context& context, const Wanted& wanted, const CurrentState& current, PlanOutput& output) {
    Plan plan = planOf(current.form, wanted, current.state);
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
    return {std::move(form), std::move(state), answer.revision, std::move(unread), section};
}

CurrentState readSettings(const Context& context) {
    return readState(context, StateForm(context.service.stateCommand("write").description).settingsSection());
}

void requireWhole(const CurrentState& current) {
    std::string reasons;
    for (const ReportedGap& gap : current.unread) {
        reasons += "\n  " + gapText(gap);
    }
    if (!reasons.empty()) {
        throw Failure(ExitStatus::failed, "parts of the state could not be read:" + reasons);
    }
}

void showPlan(const Context& context, const Plan& plan) {
    if (context.options.format != Format::text) {
        writePlan(context, plan);
        return;
    }
    for (const PlannedChange& change : plan.changes) {
        showLine(context.out, change);
        context.out << '\n';
    }
    if (plan.changes.empty()) {
        context.out << "no change\n";
    } else if (!plan.restart.empty()) {
        context.out << "the service has to be restarted for this to take effect: adminhostctl ";
        for (std::size_t i = 0; i < plan.restart.size(); ++i) {
            context.out << (i == 0 ? "" : ", then ") << shown(plan.restart[i]);
        }
        context.out << '\n';
    }
    for (const std::string& note : plan.notes) {
        context.err << shown(note) << '\n';
    }
}

ExitStatus carryOut(const Context& context, const Wanted& wanted, const CurrentState& current) {
    PlanOutput output(context);
    try {
        const ExitStatus status = carryOutWith(context, wanted, current, output);
        output.finish();
        return status;
    } catch (const Failure&) {
        output.finish();
        throw;
    }
}

}  // namespace adminhost::ctl
