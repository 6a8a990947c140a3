#include "adminhostctl/desired/Writing.h"

#include "adminhostctl/Width.h"
#include "adminhostctl/desired/Toml.h"
#include "platform/value/ValueText.h"

namespace adminhost::ctl {
namespace {

constexpr std::string_view restartAdvice =
    "the service has to be restarted for this to take effect: adminhostctl stopService, then startService";

Array changesValue(std::span<const PlannedChange> changes) {
    Array all;
    for (const PlannedChange& change : changes) {
        all.emplace_back(Dictionary{{"entry", change.entry}, {"from", change.from}, {"to", change.to}});
    }
    return all;
}

/// The dictionary of an answer that has to be one.
const Dictionary& dictionaryOf(const std::optional<Value>& answer) {
    if (!answer || answer->dictionary() == nullptr) {
        throw Failure(ExitStatus::answeredError, "the service answered no dictionary");
    }
    return *answer->dictionary();
}

const Dictionary& configurationOf(const Dictionary& answer) {
    const Dictionary* configuration = answer.get("configuration").dictionary();
    if (configuration == nullptr) {
        throw Failure(ExitStatus::answeredError, "the service answered no configuration");
    }
    return *configuration;
}

void showLine(std::ostream& out, const PlannedChange& change) {
    out << shown(change.entry) << ": " << change.from << " -> " << change.to << '\n';
}

void sayResolved(const Context& context, const Wanted& wanted, const State& after) {
    const Value& name = wanted.settings.get(controllerKey);
    if (!wanted.lookUpController || name.string() == nullptr || !isLookedUp(*name.string())) {
        return;
    }
    const Value& stored = after.settings.get(controllerKey);
    context.err << (stored == name ? "the name was not found on the local network and is stored as it stands"
                                   : "the name was resolved to " + tomlValue(stored).value_or("nothing"))
                << '\n';
}

}  // namespace

const DescribedKey* settingKey(const Description& writeSettings, const std::string& name) {
    if (name.find_first_of(".[") != std::string::npos) {
        return nullptr;
    }
    const DescribedKey* key = writeSettings.key("configuration." + name);
    // The lists have verbs of their own, and a boolean there is an order, not a setting.
    return key != nullptr && !key->secret && (key->type == "text" || key->type == "scalar") ? key : nullptr;
}

CurrentState readState(const Context& context) {
    const CommandAnswer answer = context.service.ask(context.service.command("readSettings"), {});
    return {stateOf(configurationOf(dictionaryOf(answer.value))), answer.revision};
}

void showPlan(const Context& context, const Plan& plan) {
    if (context.options.format != Format::text) {
        Array notes;
        for (const std::string& note : plan.notes) {
            notes.emplace_back(note);
        }
        writeValue(context,
                   Dictionary{{"changes", changesValue(plan.changes)}, {"notes", notes}, {"restart", plan.restart}},
                   Description());
        return;
    }
    for (const PlannedChange& change : plan.changes) {
        showLine(context.out, change);
    }
    if (plan.changes.empty()) {
        context.out << "no change\n";
    } else if (plan.restart) {
        context.out << restartAdvice << '\n';
    }
    for (const std::string& note : plan.notes) {
        context.err << shown(note) << '\n';
    }
}

ExitStatus carryOut(const Context& context, const Wanted& wanted, const CurrentState& current) {
    Plan plan = planOf(wanted, current.state);
    if (plan.changes.empty()) {
        showPlan(context, plan);
        return ExitStatus::done;
    }
    const CommandRef command = context.service.command("writeSettings");
    const CommandAnswer answer =
        context.service.ask(command, {{"configuration", plan.configuration}}, current.revision);
    const Dictionary& said = dictionaryOf(answer.value);
    const std::string error = errorOf(command.description, said);
    const std::vector<std::string> log = context.service.logLines(answer.requestId);
    // Without a configuration nothing is known to have taken.
    const Dictionary* read = said.get("configuration").dictionary();
    const State after = read != nullptr ? stateOf(*read) : State();
    const std::vector<PlannedChange> failed = changesNotTaken(wanted, plan, current.state, after, error.empty(), log);

    plan.restart = booleanOf(said.get("needsRecycleOrRestart"));
    showPlan(context, plan);
    sayResolved(context, wanted, after);
    if (error.empty() && failed.empty()) {
        return ExitStatus::done;
    }
    if (!error.empty()) {
        context.err << "adminhostctl: the service answered an error: " << error << '\n';
    }
    if (!failed.empty()) {
        context.err << "adminhostctl: these changes did not take:\n";
        for (const PlannedChange& change : failed) {
            context.err << "  ";
            showLine(context.err, change);
        }
    }
    context.err << (log.empty() ? "the request logged nothing\n" : "log lines of the request:\n");
    for (const std::string& line : log) {
        context.err << "  " << shown(line) << '\n';
    }
    return ExitStatus::answeredError;
}

}  // namespace adminhost::ctl
