#include "adminhostctl/desired/ChangeOutput.h"

#include "adminhostctl/Width.h"

#include <algorithm>

namespace adminhost::ctl {
namespace {

constexpr const char* noReason = "the service did not store it and reported no reason";
constexpr const char* undetermined = "not determined";

}  // namespace

std::string lineOf(const PlannedChange& change) {
    return shown(change.entry) + ": " + change.from + " -> " + change.to;
}

void ChangeOutput::add(const PlannedChange& change, std::optional<bool> applied, const std::string& reason) {
    Dictionary entry{{"section", change.section}, {"name", change.name}, {"key", change.key}};
    if (!change.identity.empty()) {
        entry.set("identity", change.identity);
    }
    for (const auto& [key, value] : {std::pair{"from", &change.before}, {"to", &change.after}}) {
        if (!value->isNull()) {
            entry.set(key, *value);
        }
    }
    entry.set("secret", change.secret);
    if (applied) {
        entry.set("applied", *applied);
    }
    if (!reason.empty()) {
        entry.set("reason", reason);
    }
    _changes.emplace_back(std::move(entry));
}

void ChangeOutput::showNotes(const std::vector<std::string>& notes) {
    for (const std::string& note : notes) {
        if (_context.options.format == Format::text) {
            _context.err << shown(note) << '\n';
        }
        _notes.emplace_back(note);
    }
}

void ChangeOutput::showRestart(const std::vector<std::string>& restart) {
    _restart = _restart || !restart.empty();
    if (restart.empty() || _context.options.format != Format::text) {
        return;
    }
    _context.out << "the service has to be restarted for this to take effect: adminhostctl ";
    for (std::size_t i = 0; i < restart.size(); ++i) {
        _context.out << (i == 0 ? "" : ", then ") << shown(restart[i]);
    }
    _context.out << '\n';
}

void ChangeOutput::show(const Plan& plan) {
    _shown = true;
    for (const PlannedChange& change : plan.changes) {
        if (_context.options.format == Format::text) {
            _context.out << lineOf(change) << '\n';
        }
        add(change, std::nullopt, "");
    }
    if (plan.changes.empty() && _context.options.format == Format::text) {
        _context.out << "no change\n";
    }
    showRestart(plan.restart);
    showNotes(plan.consequences);
    showNotes(plan.notes);
}

void ChangeOutput::show(const Plan& plan, const PlanOutcome& outcome, const std::vector<std::string>& restart) {
    _shown = true;
    const auto showOne = [&](const PlannedChange& change, std::optional<bool> applied, const std::string& reason) {
        if (_context.options.format == Format::text) {
            _context.out << lineOf(change) << ": "
                         << (!applied   ? undetermined
                             : *applied ? "applied"
                                        : "FAILED: " + shownIndented(reason, 4))
                         << '\n';
        }
        add(change, applied, reason);
    };
    const auto showFailed = [&](const PlannedChange& change, const FailedChange& failed) {
        const std::string reason = failed.reason.empty() ? noReason : failed.reason;
        // Another value than before is stored now.
        const bool differs = failed.change.from != change.from && failed.change.entry == change.entry;
        showOne(change, false, reason + (differs ? "; stored is " + failed.change.from : ""));
    };
    for (const PlannedChange& change : plan.changes) {
        const auto failed = std::find_if(outcome.failed.begin(), outcome.failed.end(),
                                         [&](const FailedChange& one) { return one.change.entry == change.entry; });
        const bool isApplied =
            std::find(outcome.applied.begin(), outcome.applied.end(), change) != outcome.applied.end();
        if (failed != outcome.failed.end()) {
            showFailed(change, *failed);
        } else {
            showOne(change, isApplied ? std::optional(true) : std::nullopt, isApplied ? "" : undetermined);
        }
    }
    for (const FailedChange& failed : outcome.failed) {
        const bool isPlanned = std::any_of(plan.changes.begin(), plan.changes.end(), [&](const PlannedChange& change) {
            return change.entry == failed.change.entry;
        });
        if (!isPlanned) {
            showFailed(failed.change, failed);
        }
    }
    showRestart(restart);
    showNotes(plan.notes);
}

void ChangeOutput::finish() const {
    if (_shown && _context.options.format != Format::text) {
        writeValue(_context, Dictionary{{"changes", _changes}, {"notes", _notes}, {"restart", _restart}},
                   Description());
    }
}

}  // namespace adminhost::ctl
