// adminhostctl: the service's command line, through its daemon. Only this file names all of its rooms: the generic
// client, the desired state and the verbs of this one service.

#include "adminhostctl/CallerLanguages.h"
#include "adminhostctl/Complete.h"
#include "adminhostctl/DaemonClient.h"
#include "adminhostctl/Failure.h"
#include "adminhostctl/GeneralVerbs.h"
#include "adminhostctl/Help.h"
#include "adminhostctl/Interrupt.h"
#include "adminhostctl/Prompt.h"
#include "adminhostctl/RequestArguments.h"
#include "adminhostctl/Verb.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/DesiredVerbs.h"
#include "adminhostctl/lumio/LumioVerbs.h"
#include "adminhostctl/lumio/ServiceVerbs.h"
#include "platform/files/StandardDescriptors.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cstdlib>
#include <iostream>
#include <sstream>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>
#include <sys/ioctl.h>
#include <unistd.h>

namespace {

using adminhost::ctl::ExitStatus;
using adminhost::ctl::Format;

constexpr const char* defaultSocket = "/run/adminhostd/adminhostd.sock";
constexpr std::size_t widthWithoutTerminal = 120;
constexpr std::chrono::milliseconds completionLimit(100);  ///< a person who presses the tab key does not wait longer

/// Columns of the terminal; COLUMNS, or a fixed number, where the output is not a terminal.
std::size_t outputWidth() {
    winsize size{};
    if (::isatty(STDOUT_FILENO) == 1 && ::ioctl(STDOUT_FILENO, TIOCGWINSZ, &size) == 0 && size.ws_col > 0) {
        return std::max<std::size_t>(size.ws_col, 40);
    }
    const char* const columns = std::getenv("COLUMNS");
    const unsigned long number = columns != nullptr ? std::strtoul(columns, nullptr, 10) : 0;
    return number >= 40 && number <= 10'000 ? number : widthWithoutTerminal;
}

int statusOf(ExitStatus status) {
    return static_cast<int>(status);
}

/// In the order in which help lists them.
std::vector<adminhost::ctl::Verb> allVerbs() {
    std::vector<adminhost::ctl::Verb> all;
    for (const auto& table : {adminhost::ctl::serviceVerbs(), adminhost::ctl::generalVerbs(),
                              adminhost::ctl::lumioVerbs(), adminhost::ctl::desiredVerbs()}) {
        all.insert(all.end(), table.begin(), table.end());
    }
    return all;
}

/// In the order in which help lists them.
std::vector<adminhost::ctl::VerbOption> allOptions() {
    std::vector<adminhost::ctl::VerbOption> all{
        {"--file",
         "FILE",
         "Read the request of a command from a file, JSON or property list; - is standard input",
         {},
         {},
         true},
        {"--names", "", "Print only names, one a line"},
        {"--clear", "", "Remove a stored secret: without this an empty secret is rejected", {}, {}, true},
    };
    for (const auto& table : {adminhost::ctl::generalOptions(), adminhost::ctl::lumioOptions(),
                              adminhost::ctl::serviceOptions(), adminhost::ctl::desiredOptions()}) {
        all.insert(all.end(), table.begin(), table.end());
    }
    return all;
}

/// The help of the verb or the command that the words begin with; further words are its arguments.
ExitStatus helpOf(const adminhost::ctl::Context& context, std::vector<std::string> words) {
    const bool isOfTwo =
        words.size() > 1 && std::any_of(context.verbs.begin(), context.verbs.end(), [&](const auto& verb) {
            return verb.words.find(' ') != std::string_view::npos &&
                   adminhost::ctl::beginsWith(verb, std::span(words).first(1));
        });
    words.resize(isOfTwo ? 2 : 1);
    return adminhost::ctl::help(context, words);
}

/// An excluded option must have been added before.
void addOption(CLI::App& app, const adminhost::ctl::VerbOption& option, adminhost::ctl::VerbOptions& options) {
    const std::string name(option.name);
    const std::string help(option.help);
    const std::string names = option.brief.empty() ? name : std::string(option.brief) + ',' + name;
    CLI::Option* const added =
        option.argument.empty()
            ? app.add_flag_callback(
                  names, [&options, name] { options.own[name]; }, help)
            : app.add_option_function<std::string>(
                     names, [&options, name](const std::string& text) { options.own[name] = text; }, help)
                  ->type_name(std::string(option.argument));
    if (option.argument.starts_with('[')) {
        added->expected(0, 1);
    }
    if (!option.excludes.empty()) {
        added->excludes(app.get_option(std::string(option.excludes)));
    }
}

/// The timeout that was given. Throws Failure(usage) if it is not a number of seconds.
std::optional<std::chrono::milliseconds> timeoutOf(const std::optional<std::string>& given) {
    if (!given) {
        return std::nullopt;
    }
    constexpr double most = 1'000'000;
    const std::string& text = *given;
    double seconds = 0;
    const auto [rest, error] = std::from_chars(text.data(), text.data() + text.size(), seconds);
    if (error != std::errc() || rest != text.data() + text.size() || !(seconds >= 0.001 && seconds <= most)) {
        throw adminhost::ctl::usageError("--timeout: \"" + text + "\" is not a number of seconds above 0");
    }
    return std::chrono::milliseconds(static_cast<long>(seconds * 1000));
}

int runMain(int count, char** words) {
    adminhost::ctl::VerbOptions options;
    std::string socket = defaultSocket;
    std::string format = "text";
    std::vector<std::string> rest;
    CLI::App app(
        "Administers the service through its daemon.\n\"adminhostctl help\" lists the verbs, \"adminhostctl "
        "commands\" the service's commands.",
        "adminhostctl");
    app.add_option("--socket", socket, "The daemon's socket")->envname("ADMINHOST_SOCKET")->type_name("PATH");
    app.add_option("--format", format, "Format of the answer: text (for reading), json or plist")
        ->check(CLI::IsMember({"text", "json", "plist"}))
        ->type_name("FORMAT");
    std::optional<std::string> languages;
    app.add_option("--languages", languages,
                   "Languages of names and descriptions, the preferred one first: de,fr (by default those of LANGUAGE, "
                   "LC_ALL, LC_MESSAGES and LANG)")
        ->type_name("LIST");
    std::optional<std::string> timeout;
    app.add_option("--timeout", timeout,
                   "Seconds to wait for an answer (by default until 10 s after the daemon's deadline); the service "
                   "stops before that")
        ->type_name("SECONDS");
    const std::vector<adminhost::ctl::VerbOption> verbOptions = allOptions();
    for (const adminhost::ctl::VerbOption& option : verbOptions) {
        addOption(app, option, options);
    }
    bool isHelp = false;
    app.set_help_flag();
    app.add_flag("-h,--help", isHelp, "Describe the verb or the command, or these options");
    app.add_option("words", rest, "A verb or a command, and its arguments: KEY=TEXT, KEY:=JSON, KEY@FILE or KEY@-")
        ->type_name("WORD");
    app.set_version_flag("--version", std::string("adminhostctl ") + ADMINHOST_RELEASE);
    try {
        app.parse(count, words);
    } catch (const CLI::ParseError& error) {
        std::ostringstream out;
        std::ostringstream err;
        const bool isVersion = app.exit(error, out, err) == 0;
        std::cout << out.str();
        std::cerr << adminhost::ctl::shown(err.str());  // it repeats words of the command line
        return isVersion ? statusOf(ExitStatus::done) : statusOf(ExitStatus::usage);
    }
    if (isHelp && rest.empty()) {
        std::cout << app.help();
        return statusOf(ExitStatus::done);
    }
    if (rest.empty()) {
        std::cerr << "adminhostctl: a verb or a command is missing; adminhostctl help lists them\n";
        return statusOf(ExitStatus::usage);
    }
    options.format = format == "json" ? Format::json : format == "plist" ? Format::plist : Format::text;
    options.width = outputWidth();
    options.file = options.argumentOf("--file");
    options.names = options.has("--names");
    const bool completes = rest.front() == "complete";
    if (completes) {
        rest.erase(rest.begin());
        const adminhost::ctl::CompletionTarget target = adminhost::ctl::completionTarget(rest);
        socket = target.socket.value_or(socket);
        languages = target.languages ? target.languages : languages;
        timeout = target.timeout ? target.timeout : timeout;
    }
    try {
        adminhost::ctl::DaemonClient service(
            socket, languages ? adminhost::ctl::languagesOfText(*languages) : adminhost::ctl::callerLanguages(),
            timeoutOf(timeout));
        const adminhost::ctl::Sources sources{&adminhost::ctl::readSource,
                                              &adminhost::ctl::askSecret,
                                              adminhost::ctl::inputIsTerminal(),
                                              options.has("--clear"),
                                              &adminhost::ctl::askKnownSecret,
                                              &adminhost::ctl::confirm,
                                              options.has(adminhost::ctl::forceOption)};
        const std::vector<adminhost::ctl::Verb> verbs = allVerbs();
        const adminhost::ctl::Context context{service, options, sources, std::cout, std::cerr, verbs, verbOptions};
        const ExitStatus status =
            completes ? adminhost::ctl::complete(context, rest, timeoutOf(timeout).value_or(completionLimit))
            : isHelp  ? helpOf(context, rest)
                      : adminhost::ctl::run(context, rest);
        std::cout.flush();
        adminhost::ctl::endIfInterrupted();
        if (!std::cout) {
            std::cerr << "adminhostctl: standard output cannot be written\n";
            return statusOf(ExitStatus::usage);
        }
        return statusOf(status);
    } catch (const adminhost::ctl::Failure& failure) {
        std::cout.flush();
        std::cerr << "adminhostctl: " << adminhost::ctl::shown(failure.what()) << '\n';
        adminhost::ctl::endIfInterrupted();
        return statusOf(failure.status());
    }
}

}  // namespace

int main(int count, char** words) {
    // Without this a password could be read from the connection's own socket.
    if (!adminhost::openStandardDescriptors()) {
        return statusOf(ExitStatus::failed);
    }
    try {
        return runMain(count, words);
    } catch (const std::exception& error) {
        std::cerr << "adminhostctl: " << adminhost::ctl::shown(error.what()) << '\n';
        return statusOf(ExitStatus::failed);
    }
}
