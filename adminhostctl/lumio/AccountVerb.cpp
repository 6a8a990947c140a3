#include "adminhostctl/lumio/AccountVerb.h"

#include "adminhostctl/Width.h"
#include "adminhostctl/desired/DesiredVerbs.h"
#include "adminhostctl/desired/Writing.h"

#include <exception>
#include <optional>
#include <vector>

namespace adminhost::ctl {
namespace {

constexpr const char* usernameSetting = "nimbo_client_username";
constexpr const char* passwordSetting = "nimbo_client_password";
constexpr const char* controllerSetting = "nimbo_controller";

struct NewAccount {
    std::string name;
    std::string password;
};

std::string administratorsPassword(const Context& context, const std::string& administrator) {
    const std::string file = context.options.argumentOf(passwordFileOption);
    if (file.empty() || (file == "-" && context.sources.terminal)) {
        if (!context.sources.terminal) {
            throw usageError("the directory administrator's password is missing; --password-file gives it");
        }
        return context.sources.askKnown("password of " + administrator);
    }
    DescribedKey key;
    key.path = "the password of " + administrator;
    key.type = "text";
    key.secret = true;
    return textOfWord(key, '@' + file, context.sources);
}

/// Before anything is done: the password would be lost with a "no" afterwards.
bool isAgreed(const Context& context) {
    if (!context.options.has(saveOption) || context.options.has(yesOption)) {
        return true;
    }
    if (!context.sources.terminal) {
        throw usageError("--save asks before it writes the settings; without a terminal, --yes is needed");
    }
    return context.sources.confirm("An earlier account of this server is replaced, and the settings " +
                                   std::string(usernameSetting) + " and " + passwordSetting +
                                   " are overwritten. Continue?");
}

/// The account in the settings, compared afterwards as every other change is. Its password is shown as "(secret)".
/// Returns false if that fails: the password is then lost.
bool isSaved(const Context& context, const NewAccount& account, const CurrentState& current) {
    Wanted wanted;
    wanted.settings.set(usernameSetting, account.name);
    wanted.secrets[passwordSetting] = account.password;
    try {
        return carryOut(context, wanted, current) == ExitStatus::done;
    } catch (const std::exception& failure) {
        context.err << "adminhostctl: " << shownIndented(failure.what(), 4) << '\n';
        return false;
    }
}

/// The user's entry in the directory; nullopt if the directory does not find one.
std::optional<Dictionary> entryOf(const Context& context, const std::string& name) {
    const Value answer = context.service.get("/v1/directory?is=" + Connection::escaped(name));
    const Array* entries = answer.dictionary() == nullptr ? nullptr : answer.dictionary()->get("entries").array();
    for (const Value& entry : entries == nullptr ? Array{} : *entries) {
        if (entry.dictionary() != nullptr && entry.dictionary()->get("type") == Value("user")) {
            return *entry.dictionary();
        }
    }
    return std::nullopt;
}

/// Tries the account at the grid. Returns true if the grid accepts it; prints the log lines of the request otherwise.
/// Throws Failure if the trial itself failed.
bool isAccepted(const Context& context, const NewAccount& account, const std::string& controller) {
    const CommandRef command = context.service.command("validateSettings");
    const CommandAnswer answer = context.service.ask(
        command,
        {{usernameSetting, account.name}, {passwordSetting, account.password}, {controllerSetting, controller}});
    if (!answer.value || answer.value->dictionary() == nullptr) {
        throw Failure(ExitStatus::failed, "the service did not return a dictionary");
    }
    if (errorOf(command.description, *answer.value->dictionary()).empty()) {
        return true;
    }
    if (const std::vector<ReportedGap> gaps = context.service.gapsOf(answer); !gaps.empty()) {
        throw Failure(ExitStatus::failed, gapText(gaps.front()));
    }
    for (const std::string& line : context.service.report(answer.requestId).log) {
        context.err << "  " << shownIndented(line, 4) << '\n';
    }
    return false;
}

/// The first step that is left until the grid accepts the account; empty if it does.
std::string stepLeft(const Context& context, const NewAccount& account, const std::string& node) {
    const auto entry = entryOf(context, account.name);
    if (!entry) {
        return "the directory's search does not find the account: add the node " + node +
               " to the daemon's configuration ([[directory.node]])";
    }
    const std::string principal(entry->text("kerberosPrincipal"));
    if (principal.empty()) {
        return "the account has no Kerberos authority: create its principal on the Kerberos server with the account's "
               "password, and store it in the account's record, or name the node's realm in the daemon's configuration";
    }
    const Value controller = readSettingsSection(context).state.settings.get(controllerSetting);
    if (controller.string() == nullptr || controller.string()->empty()) {
        return "no grid controller is set, so the sign-in was not tried: adminhostctl settings set " +
               std::string(controllerSetting) + " HOST";
    }
    if (!isAccepted(context, account, *controller.string())) {
        return "the grid controller " + *controller.string() +
               " does not accept the account yet: if the Kerberos server does not use this directory, create the "
               "principal " +
               principal + " there with the account's password (kadmin: addprinc)";
    }
    return {};
}

void reportStep(const Context& context, const NewAccount& account, const std::string& node, bool saved) {
    std::string left;
    try {
        left = stepLeft(context, account, node);
    } catch (const Failure& failure) {
        left = "whether the account can sign in could not be checked: " + std::string(failure.what());
    }
    if (left.empty()) {
        context.err << "The grid accepts the account.\n";
        if (saved) {
            return;
        }
        left = "store the account: adminhostctl settings set " + std::string(usernameSetting) + ' ' + account.name +
               ", then adminhostctl settings set " + passwordSetting;
    }
    context.err << "Left to do: " << shown(left) << ".\n";
}

}  // namespace

ExitStatus accountCreate(const Context& context, std::span<const std::string> arguments) {
    const CommandRef command = context.service.command("createNimboAccount");
    const std::string password = administratorsPassword(context, arguments[1]);
    if (password.empty()) {
        throw usageError("the directory administrator's password is empty; nothing was sent");
    }
    const Dictionary request{
        {"directoryNode", arguments[0]}, {"directoryUsername", arguments[1]}, {"directoryPassword", password}};
    if (context.options.has(dryRunOption)) {
        return checkOnly(context, command, request);
    }
    if (!isAgreed(context)) {
        context.err << "Nothing was done.\n";
        return ExitStatus::failed;
    }
    // Before the account is created: its password would be lost if the state cannot be read.
    std::optional<CurrentState> current;
    if (context.options.has(saveOption)) {
        current = readSettingsSection(context);
    }
    ExitStatus status = ExitStatus::done;
    const auto answer = askOnce(context, command, request, status);
    if (!answer) {
        return status;
    }
    const Dictionary* said = answer->value ? answer->value->dictionary() : nullptr;
    if (said == nullptr) {
        throw Failure(ExitStatus::failed, "the service did not return a dictionary");
    }
    if (const std::string error = errorOf(command.description, *said); !error.empty()) {
        return reportAnswered(context, error, *answer);
    }
    const NewAccount account{std::string(said->text("username")), std::string(said->text("password"))};
    if (account.name.empty() || account.password.empty()) {
        throw Failure(ExitStatus::failed, "the service did not return the account's name and password");
    }
    if (current) {
        if (context.options.format == Format::text) {
            context.out << "created " << shown(account.name) << " in " << shown(arguments[0]) << '\n';
        }
        if (!isSaved(context, account, *current)) {
            context.err << "adminhostctl: the account was created, but its name and password were not stored; run "
                           "account create again\n";
            return ExitStatus::failed;
        }
    } else {
        writeValue(context, Dictionary{{"username", account.name}, {"password", account.password}},
                   command.description);
    }
    context.out.flush();
    reportStep(context, account, arguments[0], current.has_value());
    return ExitStatus::done;
}

}  // namespace adminhost::ctl
