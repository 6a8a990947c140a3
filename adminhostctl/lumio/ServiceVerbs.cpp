#include "adminhostctl/lumio/ServiceVerbs.h"

#include "adminhostctl/lumio/AccountVerb.h"
#include "adminhostctl/lumio/StatusVerb.h"

#include <array>
#include <string>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

/// Sends a command without arguments and reports that it has been carried out.
ExitStatus control(const Context& context, const std::string& name, const char* done) {
    const CommandRef command = context.service.command(name);
    if (context.options.has(dryRunOption)) {
        return checkOnly(context, command, {});
    }
    ExitStatus status = ExitStatus::done;
    const auto answer = askOnce(context, command, {}, status);
    if (!answer) {
        return status;
    }
    if (context.options.format == Format::text) {
        context.out << done << '\n';
    } else if (answer->value) {
        writeValue(context, *answer->value, command.description);
    }
    const Dictionary* dictionary = answer->value ? answer->value->dictionary() : nullptr;
    return reportAnswered(context, dictionary == nullptr ? "" : errorOf(command.description, *dictionary), *answer);
}

ExitStatus start(const Context& context, Words) {
    return control(context, "startService", "The service has been started.");
}

ExitStatus stop(const Context& context, Words) {
    return control(context, "stopService", "The service has been stopped.");
}

/// The command is kept for clients that send it. Its success must not be read as a restart.
ExitStatus recycle(const Context& context, Words) {
    return control(context, "recycleService",
                   "Nothing was done: recycleService does nothing. To restart the service, run \"adminhostctl stop\" "
                   "and then \"adminhostctl start\".");
}

constexpr std::array verbsOfTheService = {
    Verb{"status",
         "",
         "Show the service's state, and the daemon's",
         0,
         0,
         &serviceStatus,
         {{"status", "--format json status"}}},
    Verb{"start", "[--dry-run]", "Start the service", 0, 0, &start, {{"start", "start --dry-run"}}},
    Verb{"stop", "[--dry-run]", "Stop the service", 0, 0, &stop, {{"stop", "stop --dry-run"}}},
    Verb{"recycleService",
         "[--dry-run]",
         "Do nothing: stop and start restart the service",
         0,
         1,
         &recycle,
         {{"recycleService", "recycleService --format json"}}},
    Verb{"account create",
         "NODE ADMINISTRATOR [--password-file FILE] [--save [--yes]] [--dry-run]",
         "Create the grid account in a directory node",
         2,
         2,
         &accountCreate,
         {{"account create /Example diradmin",
           "account create /Example diradmin --password-file admin.txt --save --yes"}}},
};

constexpr std::array optionsOfTheService = {
    VerbOption{saveOption, "", "Write the account's name and password into the settings"},
};

}  // namespace

std::span<const VerbOption> serviceOptions() noexcept {
    return optionsOfTheService;
}

std::span<const Verb> serviceVerbs() noexcept {
    return verbsOfTheService;
}

}  // namespace adminhost::ctl
