#include "adminhostctl/Verb.h"

#include "adminhostctl/Reading.h"
#include "platform/json/Json.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/ValueText.h"

#include <algorithm>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

ExitStatus perform(const Context& context, Words words) {
    const CommandRef command = context.service.command(words.front());
    Dictionary base;
    if (!context.options.file.empty()) {
        base = parseRequest(context.sources.read(context.options.file), context.options.file);
    }
    const Dictionary request =
        buildRequest(command.description, std::move(base), {words.begin() + 1, words.end()}, context.sources);
    const auto answer = context.service.perform(command, request);
    if (!answer) {
        context.out << (context.options.format == Format::text ? "done\n" : "");
        return ExitStatus::done;
    }
    writeValue(context, *answer, command.description);
    return reportAnswered(context,
                          answer->dictionary() != nullptr ? errorOf(command.description, *answer->dictionary()) : "");
}

std::vector<std::string> splitWords(std::string_view words) {
    const std::size_t blank = words.find(' ');
    if (blank == std::string_view::npos) {
        return {std::string(words)};
    }
    return {std::string(words.substr(0, blank)), std::string(words.substr(blank + 1))};
}

}  // namespace

void writeValue(const Context& context, const Value& value, const Description& description, const std::string& path) {
    switch (context.options.format) {
        case Format::text:
            context.out << Reading(description, context.options.width).text(value, path);
            break;
        case Format::json:
            context.out << jsonOf(value, true) << '\n';
            break;
        case Format::plist: {
            Error error;
            const auto text = xmlPropertyList(value, &error);
            if (!text) {
                throw Failure(ExitStatus::answeredError, "a property list cannot carry the answer: " + textOf(error));
            }
            context.out << *text;
            break;
        }
    }
}

ExitStatus reportAnswered(const Context& context, const std::string& error) {
    if (error.empty()) {
        return ExitStatus::done;
    }
    context.err << "adminhostctl: the service answered an error: " << error << '\n';
    return ExitStatus::answeredError;
}

std::optional<std::string> wordAt(Words arguments, std::size_t index) {
    return index < arguments.size() ? std::optional(arguments[index]) : std::nullopt;
}

ExitStatus run(const Context& context, const std::vector<std::string>& words) {
    std::string known;
    for (const Verb& verb : context.verbs) {
        const std::vector<std::string> own = splitWords(verb.words);
        if (own.front() == words.front()) {
            known += (known.empty() ? "" : ", ") + std::string(verb.words);
        }
        if (own.size() > words.size() || !std::equal(own.begin(), own.end(), words.begin())) {
            continue;
        }
        const Words arguments = Words(words).subspan(own.size());
        if (arguments.size() < verb.least || arguments.size() > verb.most) {
            throw usageError("write adminhostctl " + std::string(verb.words) +
                             (verb.arguments.empty() ? "" : " " + std::string(verb.arguments)));
        }
        return verb.run(context, arguments);
    }
    if (!known.empty()) {
        throw usageError("there are " + known);
    }
    return perform(context, words);
}

}  // namespace adminhost::ctl
