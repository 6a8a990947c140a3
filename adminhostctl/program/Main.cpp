// adminhostctl: the service's command line, through its daemon. Only this file names all of its rooms: the generic
// client, the desired state and the verbs of this one service.

#include "adminhostctl/CallerLanguages.h"
#include "adminhostctl/Complete.h"
#include "adminhostctl/Connection.h"
#include "adminhostctl/DaemonClient.h"
#include "adminhostctl/Failure.h"
#include "adminhostctl/GeneralVerbs.h"
#include "adminhostctl/Help.h"
#include "adminhostctl/Interrupt.h"
#include "adminhostctl/Prompt.h"
#include "adminhostctl/RemoteHost.h"
#include "adminhostctl/RequestArguments.h"
#include "adminhostctl/Similar.h"
#include "adminhostctl/Verb.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/DesiredVerbs.h"
#include "adminhostctl/lumio/LumioVerbs.h"
#include "adminhostctl/lumio/ServiceVerbs.h"
#include "adminhostctl/lumio/VerbExamples.h"
#include "platform/files/FileDescriptor.h"
#include "platform/files/StandardDescriptors.h"
#include "platform/release/Release.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cstdlib>
#include <iostream>
#include <memory>
#include <optional>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include <CLI/CLI.hpp>
#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

namespace {

using adminhost::ctl::ExitStatus;
using adminhost::ctl::Format;

constexpr const char* defaultSocket = "/run/adminhostd/adminhostd.sock";
constexpr const char* unreachableSocket = "/dev/null";
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
    adminhost::ctl::addExamples(all);
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

/// The help of the verb or the command that the words begin with, whose further words are its arguments; of everything
/// without words.
ExitStatus helpOf(const adminhost::ctl::Context& context, std::vector<std::string> words) {
    const bool isOfTwo =
        words.size() > 1 && std::any_of(context.verbs.begin(), context.verbs.end(), [&](const auto& verb) {
            return verb.words.find(' ') != std::string_view::npos &&
                   adminhost::ctl::beginsWith(verb, std::span(words).first(1));
        });
    words.resize(std::min<std::size_t>(words.size(), isOfTwo ? 2 : 1));
    return adminhost::ctl::help(context, words);
}

/// An excluded option must have been added before.
void addOption(CLI::App& app, const adminhost::ctl::VerbOption& option, adminhost::ctl::VerbOptions& options) {
    const std::string name(option.name);
    const std::string names = option.brief.empty() ? name : std::string(option.brief) + ',' + name;
    CLI::Option* const added =
        option.argument.empty() ? app.add_flag_callback(names, [&options, name] { options.own[name]; })
                                : app.add_option_function<std::string>(
                                         names, [&options, name](const std::string& text) { options.own[name] = text; })
                                      ->type_name(std::string(option.argument));
    if (option.argument.starts_with('[')) {
        added->expected(0, 1);
    }
    if (!option.excludes.empty()) {
        added->excludes(app.get_option(std::string(option.excludes)));
    }
}

/// What is wrong with the options of the command line.
std::string problemOf(const CLI::ParseError& error, const CLI::App& app) {
    std::string text = error.what();
    if (dynamic_cast<const CLI::ExtrasError*>(&error) != nullptr) {
        const std::vector<std::string> unknown = app.remaining();
        std::vector<std::string> known;
        for (const CLI::Option* option : app.get_options()) {
            for (const std::string& name : option->get_lnames()) {
                known.push_back("--" + name);
            }
        }
        const std::string& first = unknown.empty() ? text : unknown.front();
        const std::string similar = adminhost::ctl::didYouMean(first, known);
        return "option not found: " + first +
               (similar.empty() ? "; a word that begins with a hyphen and is no option follows \"--\"" : similar);
    }
    const std::string name = text.substr(0, text.find(':'));
    const CLI::Option* const option = name.starts_with('-') ? app.get_option_no_throw(name) : nullptr;
    if (dynamic_cast<const CLI::ArgumentMismatch*>(&error) != nullptr && option != nullptr) {
        return option->count() > 1 ? name + " was given twice" : name + " needs " + option->get_type_name();
    }
    if (dynamic_cast<const CLI::ExcludesError*>(&error) != nullptr) {
        const std::size_t between = text.find(" excludes ");
        return between == std::string::npos
                   ? text
                   : text.substr(0, between) + " and " + text.substr(between + 10) + " do not go together";
    }
    return text;
}

/// Throws Failure(usage) if it is not the name of a format.
Format formatOf(const std::string& text) {
    for (const auto& [name, format] :
         {std::pair{"text", Format::text}, {"json", Format::json}, {"plist", Format::plist}}) {
        if (text == name) {
            return format;
        }
    }
    throw adminhost::ctl::usageError("--format: \"" + text + "\" is none of text, json, plist");
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

/// Whether a program in the foreground of this process's terminal can ask there.
bool canAsk() {
    const adminhost::FileDescriptor terminal(::open("/dev/tty", O_RDWR | O_CLOEXEC | O_NOCTTY));
    return terminal.isOpen() && ::tcgetpgrp(terminal.get()) == ::getpgrp();
}

/// Throws Failure(usage) if the host or the socket's path is not usable.
adminhost::ctl::Connection connectionTo(const std::optional<std::string>& host,
                                        const std::optional<std::string>& socket,
                                        std::optional<std::chrono::milliseconds> timeout) {
    if (!host) {
        const char* const usual = std::getenv("ADMINHOST_SOCKET");
        return adminhost::ctl::Connection(socket.value_or(usual != nullptr && *usual != 0 ? usual : defaultSocket));
    }
    adminhost::ctl::RemoteHost::Options options{*host, socket, canAsk()};
    if (timeout) {
        options.connectTimeout = std::chrono::ceil<std::chrono::seconds>(*timeout);
    }
    return adminhost::ctl::Connection(std::make_unique<adminhost::ctl::RemoteHost>(std::move(options)));
}

int runMain(int count, char** words) {
    adminhost::ctl::VerbOptions options;
    std::optional<std::string> socket;
    std::optional<std::string> host;
    std::string format = "text";
    std::vector<std::string> rest;
    CLI::App app;  // the help is our own (Help.h)
    app.add_option("--host", host)->type_name("HOST");
    app.add_option("--socket", socket)->type_name("PATH");
    app.add_option("--format", format)->type_name("FORMAT");
    std::optional<std::string> languages;
    app.add_option("--languages", languages)->type_name("LIST");
    std::optional<std::string> timeout;
    app.add_option("--timeout", timeout)->type_name("SECONDS");
    const std::vector<adminhost::ctl::VerbOption> verbOptions = allOptions();
    for (const adminhost::ctl::VerbOption& option : verbOptions) {
        addOption(app, option, options);
    }
    bool isHelp = false;
    app.set_help_flag();
    app.add_flag("-h,--help", isHelp);
    app.add_option("words", rest)->type_name("WORD");
    app.set_version_flag("--version", std::string("adminhostctl ") + ADMINHOST_RELEASE);
    try {
        app.parse(count, words);
    } catch (const CLI::ParseError& error) {
        std::ostringstream out;
        std::ostringstream err;
        const bool isVersion = app.exit(error, out, err) == 0;
        std::cout << out.str();
        if (!isVersion) {
            // It repeats words of the command line.
            std::cerr << "adminhostctl: " << adminhost::ctl::shown(problemOf(error, app)) << '\n';
        }
        return isVersion ? statusOf(ExitStatus::done) : statusOf(ExitStatus::usage);
    }
    if (rest.empty() && !isHelp) {
        std::cerr << "adminhostctl: a verb or a command is missing; adminhostctl help lists them\n";
        return statusOf(ExitStatus::usage);
    }
    options.width = outputWidth();
    options.file = options.argumentOf("--file");
    options.names = options.has("--names");
    const bool completes = !rest.empty() && rest.front() == "complete";
    if (completes) {
        rest.erase(rest.begin());
        const adminhost::ctl::CompletionTarget target = adminhost::ctl::completionTarget(rest);
        socket = target.socket ? target.socket : socket;
        if (host || target.host) {  // a key that is pressed for completion starts no login
            host.reset();
            socket = unreachableSocket;
        }
        languages = target.languages ? target.languages : languages;
        timeout = target.timeout ? target.timeout : timeout;
    }
    try {
        options.format = formatOf(format);
        adminhost::ctl::DaemonClient service(
            connectionTo(host, socket, timeoutOf(timeout)),
            languages ? adminhost::ctl::languagesOfText(*languages) : adminhost::ctl::callerLanguages(),
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
