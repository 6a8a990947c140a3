#pragma once

// Prints plans and the outcomes of writes: lines for people, one document for programs.

#include "adminhostctl/Verb.h"
#include "adminhostctl/desired/PlanOutcome.h"

#include <optional>
#include <string>
#include <vector>

namespace adminhost::ctl {

/// The changes of one verb, which may write twice. Each line for people ends in "applied", "FAILED: reason" or "not
/// determined"; a plan's has no ending. For programs, finish() prints one document:
///
///     {"changes": [{"section", "name", "key", "from", "to", "secret", "applied", "reason"}], "notes": [], "restart"}
///
/// A value that is not there has no key; "applied" is missing in a plan and where it is not determined.
class ChangeOutput {
  public:
    explicit ChangeOutput(const Context& context) noexcept : _context(context) {}

    /// Shows a plan that is not carried out, or that has nothing to carry out.
    void show(const Plan& plan);
    /// Shows what became of a plan. `restart` are the commands that have to be run.
    void show(const Plan& plan, const PlanOutcome& outcome, const std::vector<std::string>& restart);
    /// Prints the document, if the format has one and anything was shown.
    void finish() const;

  private:
    void showNotes(const std::vector<std::string>& notes);
    void showRestart(const std::vector<std::string>& restart);
    void add(const PlannedChange& change, std::optional<bool> applied, const std::string& reason);

    const Context& _context;
    bool _shown = false;
    Array _changes;
    Array _notes;
    bool _restart = false;
};

/// "SECTION.KEY: FROM -> TO".
[[nodiscard]] std::string lineOf(const PlannedChange& change);

}  // namespace adminhost::ctl
