#include "adminhostctl/Help.h"

#include "adminhostctl/Reading.h"
#include "adminhostctl/Similar.h"
#include "adminhostctl/Width.h"
#include "platform/json/Json.h"

#include <algorithm>
#include <array>
#include <utility>
#include <vector>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

/// Key paths are long and cannot be broken: each has a line of its own, with its meaning below.
std::string keyList(const std::vector<DescribedKey>& keys, std::size_t width) {
    constexpr std::size_t indent = 6;
    std::string text;
    for (const DescribedKey& key : keys) {
        std::string help = key.help;
        for (std::size_t i = 0; i < key.allowed.size(); ++i) {
            help += (i == 0 ? " One of " : ", ") + key.allowed[i] + (i + 1 == key.allowed.size() ? "." : "");
        }
        help += key.required ? " Required." : "";
        help += key.filledWith == "languages" ? " Without it, adminhostctl sends yours." : "";
        help += key.secret ? " Secret: " + key.path + "@FILE or " + key.path + "@-." : "";
        text += "  " + shown(key.path) + " (" + shown(typeText(key)) + (key.unit.empty() ? "" : ", ") +
                shown(key.unit) + ")\n";
        for (const std::string& line : wrapped(shown(help), width - indent)) {
            text.append(indent, ' ').append(line + '\n');
        }
    }
    return text;
}

void helpOfCommand(const Context& context, const std::string& name) {
    const CommandRef command = context.service.command(name, firstWords(context.verbs));
    const Description& description = command.description;
    if (context.options.names) {
        for (const DescribedKey& key : description.keys()) {
            context.out << key.path << (key.secret ? "@" : "=") << '\n';
        }
        return;
    }
    context.out << shown(description.name()) << ": " << shown(description.summary()) << "\n\n";
    for (const std::string& line : wrapped(shown(description.text()), context.options.width)) {
        context.out << line << '\n';
    }
    context.out << "\nadminhostctl " << shown(description.name())
                << " [KEY=TEXT | KEY:=JSON | KEY@FILE | KEY@-]... [--file FILE|-]\n";
    if (!description.keys().empty()) {
        context.out << "\nKeys:\n" << keyList(description.keys(), context.options.width);
    }
    if (!description.answerKeys().empty()) {
        context.out << "\nAnswer:\n" << keyList(description.answerKeys(), context.options.width);
    }
    if (!description.errors().empty()) {
        context.out << "\nErrors:\n" << Reading(Description(), context.options.width).text(description.errors());
    }
    context.out << "\nExample of a request (as with --file):\n"
                << shownJson(jsonOf(description.example().get("request"), true)) << '\n';
}

/// The text in lines that fit, the further ones indented.
std::string indentedBelow(const std::string& text, std::size_t width) {
    constexpr std::size_t indent = 4;
    std::string all;
    for (const std::string& line : wrapped(text, width - indent)) {
        all.append(all.empty() ? 0 : indent, ' ').append(line).append("\n");
    }
    return all;
}

std::string optionText(const Context& context, const VerbOption& option) {
    constexpr std::size_t column = 26;
    std::string name("  ");
    name.append(option.brief).append(option.brief.empty() ? "" : ", ").append(option.name);
    name.append(option.argument.empty() ? "" : " ").append(option.argument);
    return beside(name, option.help, {column, 6, context.options.width});
}

/// The options that the arguments of a verb name, with what they mean.
std::string optionList(const Context& context, const Verb& verb) {
    std::string text;
    for (const VerbOption& option : context.verbOptions) {
        text += belongsTo(option, verb) ? optionText(context, option) : "";
    }
    return text;
}

constexpr std::array common = {
    VerbOption{"--host", "HOST", "Ask the daemon of another machine, by ssh: USER@SERVER, or a host of ~/.ssh/config"},
    VerbOption{"--socket", "PATH", "The daemon's socket; without it that of ADMINHOST_SOCKET, or the usual one"},
    VerbOption{"--format", "FORMAT", "text for reading, json or plist for programs"},
    VerbOption{"--languages", "LIST",
               "Languages of names and descriptions, the preferred one first: de,fr; without it those of LANGUAGE, "
               "LC_ALL, LC_MESSAGES and LANG"},
    VerbOption{"--timeout", "SECONDS",
               "How long to wait for an answer; without it until 10 s after the daemon's deadline. The service stops "
               "before that"},
    VerbOption{"--help", "", "Describe the verb or the command", {}, "-h"},
    VerbOption{"--version", "", "Print the release"},
};

void helpOfVerb(const Context& context, const Verb& verb) {
    context.out << indentedBelow(usageOf(verb), context.options.width);
    for (const std::string& line : wrapped(verb.summary, context.options.width - 2)) {
        context.out << "  " << line << '\n';
    }
    if (const std::string options = optionList(context, verb); !options.empty()) {
        context.out << "\nOptions:\n" << options;
    }
    context.out << "\nExamples:\n";
    for (const std::string_view example : verb.examples) {
        context.out << "  adminhostctl " << example << '\n';
    }
}

/// The arguments without options, and without a second way of giving them: "KEY [VALUE|@FILE|@-]".
std::string argumentsWithoutOptions(std::string_view arguments) {
    std::string plain;
    for (std::size_t at = 0; at < arguments.size();) {
        const bool isOption = arguments.substr(at).starts_with("[-");
        const std::size_t begin = at;
        int depth = 0;
        do {
            depth += arguments[at] == '[' ? 1 : arguments[at] == ']' ? -1 : 0;
            ++at;
        } while (at < arguments.size() && (depth > 0 || arguments[at] != ' '));
        const std::string_view word = arguments.substr(begin, at - begin);
        if (word == "|") {
            break;
        }
        if (!isOption) {
            plain.append(plain.empty() ? "" : " ").append(word);
        }
        at = std::min(arguments.find_first_not_of(' ', at), arguments.size());
    }
    return plain;
}

void helpOfAll(const Context& context) {
    std::vector<std::pair<std::string, std::string>> lines;
    std::size_t longest = 0;
    for (const Verb& verb : context.verbs) {
        const std::string arguments = argumentsWithoutOptions(verb.arguments);
        std::string words(verb.words);
        words.append(arguments.empty() ? "" : " ").append(arguments);
        lines.emplace_back(std::move(words), verb.summary);
        longest = std::max(longest, lines.back().first.size());
    }
    constexpr std::size_t widestColumn = 34;
    for (const char* usage :
         {"adminhostctl [OPTION]... VERB [ARGUMENT]...", "adminhostctl [OPTION]... COMMAND [KEY=TEXT]..."}) {
        context.out << indentedBelow(usage, context.options.width);
    }
    context.out << "\nVerbs:\n";
    for (const auto& [words, summary] : lines) {
        context.out << beside("  " + words, summary, {std::min(longest, widestColumn) + 4, 6, context.options.width});
    }
    context.out << "\nOptions of all verbs and commands:\n";
    for (const VerbOption& option : common) {
        context.out << optionText(context, option);
    }
    context.out << '\n';
    for (const char* text : {"\"adminhostctl VERB --help\" shows the options of a verb, and examples.",
                             "Every other word is a command of the service: \"adminhostctl commands\" lists them, "
                             "\"adminhostctl help COMMAND\" describes one."}) {
        for (const std::string& line : wrapped(text, context.options.width)) {
            context.out << line << '\n';
        }
    }
}

}  // namespace

std::span<const VerbOption> commonOptions() noexcept {
    return common;
}

std::string typeText(const DescribedKey& key) {
    const std::string type = key.enteredAs.empty() ? key.type : key.enteredAs;
    return type == "integer"                   ? "whole number"
           : type == "real"                    ? "number"
           : type == "boolean"                 ? "yes or no"
           : type == "scalar" || type == "any" ? "text"
                                               : type;
}

ExitStatus help(const Context& context, Words arguments) {
    if (arguments.empty()) {
        helpOfAll(context);
        return ExitStatus::done;
    }
    std::vector<const Verb*> described;
    for (const Verb& verb : context.verbs) {
        if (beginsWith(verb, arguments)) {
            described.push_back(&verb);
        }
    }
    if (described.empty() && arguments.size() > 1) {
        (void)verbOf(context.verbs, {arguments.begin(), arguments.end()});  // explains a second word that is wrong
    }
    if (described.empty()) {
        helpOfCommand(context, arguments.front());
    }
    for (const Verb* verb : described) {
        context.out << (verb == described.front() ? "" : "\n");
        helpOfVerb(context, *verb);
    }
    return ExitStatus::done;
}

}  // namespace adminhost::ctl
