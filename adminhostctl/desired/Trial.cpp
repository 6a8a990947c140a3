#include "adminhostctl/desired/Trial.h"

#include "adminhostctl/RequestArguments.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/DesiredVerbs.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <optional>
#include <string>
#include <vector>

namespace adminhost::ctl {
namespace {

bool isEmpty(const Value& value) {
    return value.isNull() || (value.string() != nullptr && value.string()->empty());
}

/// The request with all values that are known.
Dictionary requestOf(const Context& context, const Description& command, const Wanted& wanted,
                     const CurrentState& current) {
    Dictionary request;
    for (const DescribedKey& key : command.keys()) {
        if (const auto secret = wanted.secrets.find(key.path); secret != wanted.secrets.end()) {
            request.set(key.path, secret->second);
        } else if (key.secret) {
            if (context.options.has(passwordFileOption)) {
                const std::string file = context.options.argumentOf(passwordFileOption);
                request.set(key.path, textOfWord(key, '@' + file, context.sources));
            }
        } else {
            const Value& value = wanted.settings.get(key.path);
            request.set(key.path, value.isNull() ? current.state.settings.get(key.path) : value);
        }
    }
    return request;
}

bool dependsOn(const Trial& trial, const Wanted& wanted) {
    const auto isWanted = [&](const std::string& key) {
        return wanted.settings.contains(key) || wanted.secrets.count(key) != 0;
    };
    return std::any_of(trial.needs.begin(), trial.needs.end(), isWanted) ||
           std::any_of(trial.uses.begin(), trial.uses.end(), isWanted);
}

/// Why the trial cannot be made; empty if it can.
std::string obstacle(const Description& command, const Trial& trial, const Wanted& wanted, const Dictionary& request) {
    if (!dependsOn(trial, wanted)) {
        return "it does not depend on this setting";
    }
    std::string reasons;
    for (const std::string& need : trial.needs) {
        if (isEmpty(request.get(need))) {
            const DescribedKey* key = command.key(need);
            const bool known = wanted.secrets.count(need) != 0 || key == nullptr || !key->secret;
            reasons += (reasons.empty() ? "" : ", ") + need +
                       (known ? " is not set" : " is stored but cannot be read; --password-file gives it");
        }
    }
    return reasons;
}

/// What a trial that was made has found; empty if it has passed.
std::string failureOf(const Trial& trial, const Dictionary& answer) {
    const Value& error = answer.get(trial.error);
    if (error.isNull()) {
        return {};
    }
    const std::string detail(trial.detail.empty() ? std::string_view() : answer.text(trial.detail));
    return textOf(error) + (detail.empty() ? "" : ": " + detail);
}

}  // namespace

std::set<std::string> settingsTriedWith(const Context& context, const std::string& name) {
    std::set<std::string> together;
    for (const PluginInfo& plugin : context.service.plugins()) {
        for (const Description& command : plugin.commands) {
            for (const Trial& trial : command.trials()) {
                if (std::find(trial.needs.begin(), trial.needs.end(), name) != trial.needs.end()) {
                    together.insert(trial.needs.begin(), trial.needs.end());
                }
            }
        }
    }
    return together;
}

bool passTrials(const Context& context, const Wanted& wanted, const CurrentState& current) {
    const CommandRef command = context.service.stateCommand("try");
    Dictionary request = requestOf(context, command.description, wanted, current);
    std::vector<const Trial*> made;
    for (const Trial& trial : command.description.trials()) {
        const std::string why = obstacle(command.description, trial, wanted, request);
        if (why.empty()) {
            made.push_back(&trial);
        } else {
            context.err << shown(trial.name) << ": not tried: " << shown(why) << '\n';
        }
    }
    if (made.empty()) {
        return true;
    }
    // A key that only another trial needs would cause that trial to be made.
    Dictionary needed;
    for (const Trial* trial : made) {
        for (const auto& keys : {trial->needs, trial->uses}) {
            for (const std::string& key : keys) {
                needed.set(key, request.get(key));
            }
        }
    }
    const CommandAnswer answer = context.service.ask(command, needed);
    if (!answer.value || answer.value->dictionary() == nullptr) {
        throw Failure(ExitStatus::failed, "the service did not return a dictionary");
    }
    bool passed = true;
    for (const Trial* trial : made) {
        const std::string failure = failureOf(*trial, *answer.value->dictionary());
        passed = passed && failure.empty();
        context.err << shown(trial->name) << ": " << (failure.empty() ? "passed" : "failed: " + shown(failure)) << '\n';
    }
    for (const ReportedGap& gap : context.service.gapsOf(answer)) {
        context.err << "  " << shownIndented(gapText(gap), 4) << '\n';
    }
    if (!passed) {
        for (const std::string& line : context.service.report(answer.requestId).log) {
            context.err << "  " << shownIndented(line, 4) << '\n';
        }
    }
    return passed;
}

}  // namespace adminhost::ctl
