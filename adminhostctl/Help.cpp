#include "adminhostctl/Help.h"

#include "adminhostctl/Reading.h"
#include "adminhostctl/Similar.h"
#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "platform/json/Json.h"

#include <algorithm>

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

/// The options that the arguments of a verb name, with what they mean.
std::string optionList(const Context& context, const Verb& verb) {
    constexpr std::size_t column = 26;
    std::string text;
    for (const VerbOption& option : context.verbOptions) {
        if (!belongsTo(option, verb)) {
            continue;
        }
        std::string name(option.brief);
        name.append(name.empty() ? "" : ", ").append(option.name);
        name.append(option.argument.empty() ? "" : " ").append(option.argument);
        std::string line = "  " + name;
        line.append(line.size() + 2 > column ? "\n" + std::string(column, ' ')
                                             : std::string(column - line.size(), ' '));
        for (const std::string& part :
             wrapped(option.help, context.options.width - std::min(context.options.width / 2, column))) {
            text += line + part + '\n';
            line = std::string(column, ' ');
        }
    }
    return text;
}

void helpOfVerb(const Context& context, const Verb& verb) {
    context.out << "adminhostctl " << verb.words << (verb.arguments.empty() ? "" : " ") << verb.arguments << '\n';
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

void helpOfAll(const Context& context) {
    Table table({"verb", "", "meaning"});
    for (const Verb& verb : context.verbs) {
        table.addRow({std::string(verb.words), std::string(verb.arguments), std::string(verb.summary)});
    }
    context.out << table.text(context.options.width, 0)
                << "\n\"adminhostctl VERB --help\" shows a verb's options and examples.\n"
                   "Every other word is a command of the service: adminhostctl commands lists them,\n"
                   "adminhostctl help COMMAND describes one.\n";
}

}  // namespace

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
