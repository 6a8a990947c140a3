#pragma once

// Verbs: the words that may follow "adminhostctl". Each room has a table of its own verbs and one of their options, and
// Main.cpp joins the tables. Every other word is a command of a plug-in.

#include "adminhostctl/DaemonClient.h"
#include "adminhostctl/Failure.h"
#include "adminhostctl/RequestArguments.h"

#include <array>
#include <cstddef>
#include <functional>
#include <map>
#include <optional>
#include <ostream>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::ctl {

enum class Format { text, json, plist };

// Options of verbs of several rooms.
inline constexpr std::string_view dryRunOption = "--dry-run";
inline constexpr std::string_view yesOption = "--yes";
inline constexpr std::string_view forceOption = "--force";

/// An option that some verbs of a room have.
struct VerbOption {
    std::string_view name;      ///< "--group"
    std::string_view argument;  ///< "FILE", "[GROUP]" if it may be left out; empty for none
    std::string_view help;
    std::string_view excludes = {};  ///< the name of an option that must not be given with it
    std::string_view brief = {};     ///< "-g"; empty for an option without a short form
    bool ofCommands = false;         ///< commands have it too
};

struct VerbOptions {
    Format format = Format::text;
    std::string file;        ///< of the whole request; empty for none
    bool names = false;      ///< only names, one a line, for completion
    std::size_t width = 80;  ///< columns of the terminal
    /// The verbs' own options that were given, by name, with their arguments.
    std::map<std::string, std::string, std::less<>> own;

    [[nodiscard]] bool has(std::string_view name) const { return own.contains(name); }
    /// The option's argument; empty if it was not given.
    [[nodiscard]] std::string argumentOf(std::string_view name) const {
        const auto found = own.find(name);
        return found == own.end() ? std::string() : found->second;
    }
};

struct Verb;

/// Everything that a verb uses.
struct Context {
    DaemonClient& service;
    const VerbOptions& options;
    const Sources& sources;
    std::ostream& out;
    std::ostream& err;
    std::span<const Verb> verbs;              ///< all of them
    std::span<const VerbOption> verbOptions;  ///< all of them
};

/// The arguments of a verb on a command line that is being completed.
struct TypedArguments {
    std::span<const std::string> before;  ///< the finished ones, without options
    const std::string& word;              ///< the beginning of the next one; may be empty
};

struct Verb {
    std::string_view words;      ///< "camera list"
    std::string_view arguments;  ///< for people: "NAME|UUID [--group]"; the verb has the options that are named here
    std::string_view summary;
    std::size_t least;  ///< how many arguments
    std::size_t most;
    ExitStatus (*run)(const Context& context, std::span<const std::string> arguments);
    std::array<std::string_view, 2> examples;  ///< without the program's name, for a shell
    /// What the next argument can be, for completion; null if it is not known, or a file. Candidates that do not begin
    /// with the typed word are dropped by the caller.
    std::vector<std::string> (*complete)(const Context& context, const TypedArguments& typed) = nullptr;
};

/// The first words of all verbs.
[[nodiscard]] std::vector<std::string> firstWords(std::span<const Verb> verbs);

/// Whether the words, which may be fewer than the verb's, are the beginning of the verb.
[[nodiscard]] bool beginsWith(const Verb& verb, std::span<const std::string> words);

/// Whether the arguments of the verb name the option.
[[nodiscard]] bool belongsTo(const VerbOption& option, const Verb& verb);

/// The verb at the beginning of the words; null if the first word is not one of a verb. Throws Failure(usage) if only
/// the second word is missing or wrong.
[[nodiscard]] const Verb* verbOf(std::span<const Verb> verbs, const std::vector<std::string>& words);

/// Writes a value in the requested format. In text format it is shown as the value at this path of the command's
/// answer. Throws Failure.
void writeValue(const Context& context, const Value& value, const Description& description,
                const std::string& path = {});

/// Prints the error of an answer (errorOf()) on standard error, with the reasons and the log lines of its request, and
/// returns failed; returns done if there is none.
[[nodiscard]] ExitStatus reportAnswered(const Context& context, const std::string& error, const CommandAnswer& answer);

/// Why the answer has an error: the words of the tool that failed, as far as the daemon reports them ("file is not a
/// database"); empty if it does not.
[[nodiscard]] std::string toolWordsOf(std::span<const ReportedGap> notDone);

/// Prints the log lines of the request, if there are any.
void printLog(const Context& context, const RequestReport& report);

/// "list.0: reason (words of the tool)".
[[nodiscard]] std::string gapText(const ReportedGap& gap);

/// Prints which parts of a request were not carried out, and why.
void printNotDone(const Context& context, const RequestReport& report);

/// Sends a request once. If its answer is missing, prints why and what became of the request, as reportLost() does,
/// sets the status and returns nullopt.
[[nodiscard]] std::optional<CommandAnswer> askOnce(const Context& context, const CommandRef& command,
                                                   const Dictionary& request, ExitStatus& status);

/// For --dry-run: lets the daemon check the request, which is not carried out, and prints that it would be accepted.
/// Throws Failure if it would be refused.
[[nodiscard]] ExitStatus checkOnly(const Context& context, const CommandRef& command, const Dictionary& request);

/// Prints on standard error why the answer to a request is missing, and its outcome: what the daemon reports as changed
/// and as not done, and the log lines. Does not send the request again. Returns the printed report.
RequestReport reportLost(const Context& context, const LostAnswer& lost);

/// Asks before something that cannot be undone. Returns true without asking if there is no terminal, with --yes, and
/// with --dry-run; prints that nothing was done if the reply is no.
[[nodiscard]] bool isConfirmed(const Context& context, const std::string& question);

/// The argument at the index; nullopt if fewer were given.
[[nodiscard]] std::optional<std::string> wordAt(std::span<const std::string> arguments, std::size_t index);

/// "adminhostctl settings get [KEY]".
[[nodiscard]] std::string usageOf(const Verb& verb);

/// The usage error for arguments that do not fit the verb with these words: "VERB: PROBLEM; usage: ...".
[[nodiscard]] Failure wrongUse(const Context& context, std::string_view words, const std::string& problem);

/// Runs the verb or command at the beginning of the words. Throws Failure.
[[nodiscard]] ExitStatus run(const Context& context, const std::vector<std::string>& words);

}  // namespace adminhost::ctl
