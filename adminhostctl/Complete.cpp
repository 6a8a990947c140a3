#include "adminhostctl/Complete.h"

#include "adminhostctl/DirectoryNames.h"
#include "adminhostctl/Help.h"
#include "adminhostctl/Width.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <csignal>
#include <filesystem>
#include <set>
#include <system_error>

#include <sys/time.h>
#include <unistd.h>

namespace adminhost::ctl {
namespace {

/// Prints candidates that begin with the word, each once. Names that a terminal would act on are left out: a shell
/// prints what it offers.
class Candidates {
  public:
    Candidates(std::ostream& out, const std::string& word) : _out(out), _word(word) {}

    void offer(const std::string& text) {
        if (!text.empty() && text.starts_with(_word) && text.find('\n') == std::string::npos && shown(text) == text &&
            _offered.insert(text).second) {
            _out << text << '\n';
        }
    }
    void offerAll(const std::vector<std::string>& texts) {
        for (const std::string& text : texts) {
            offer(text);
        }
    }
    /// Files whose path follows the beginning ("@", "KEY@") of the word.
    void offerFiles(const std::string& beginning) {
        const std::string path = _word.substr(std::min(beginning.size(), _word.size()));
        const std::size_t slash = path.rfind('/');
        const std::string directory = slash == std::string::npos ? "" : path.substr(0, slash + 1);
        std::error_code error;
        std::filesystem::directory_iterator entry(directory.empty() ? "." : directory, error);
        std::vector<std::string> files;
        for (; !error && entry != std::filesystem::directory_iterator(); entry.increment(error)) {
            std::error_code ignored;
            files.push_back(beginning + directory + entry->path().filename().string() +
                            (entry->is_directory(ignored) ? "/" : ""));
        }
        std::sort(files.begin(), files.end());
        offerAll(files);
    }

  private:
    std::ostream& _out;
    const std::string& _word;
    std::set<std::string> _offered;
};

extern "C" void endCompletion(int /*signal*/) {
    ::_exit(0);
}

/// From now on the process ends when the limit has passed.
void startLimit(std::chrono::milliseconds limit) {
    struct sigaction action {};
    action.sa_handler = &endCompletion;
    ::sigaction(SIGALRM, &action, nullptr);
    itimerval timer{};
    timer.it_value.tv_sec = limit.count() / 1000;
    timer.it_value.tv_usec = static_cast<suseconds_t>(limit.count() % 1000 * 1000);
    ::setitimer(ITIMER_REAL, &timer, nullptr);
}

/// The name of the option's argument; empty if it has none, or if the word is not an option.
std::string_view argumentOf(const Context& context, const std::string& word) {
    for (const VerbOption& option : commonOptions()) {
        if (option.name == word) {
            return option.argument;
        }
    }
    for (const VerbOption& option : context.verbOptions) {
        if (option.name == word || (!option.brief.empty() && option.brief == word)) {
            return option.argument;
        }
    }
    return {};
}

/// The words before the last one without options and their arguments.
std::vector<std::string> plainWords(const Context& context, std::span<const std::string> words) {
    std::vector<std::string> plain;
    for (std::size_t i = 0; i + 1 < words.size(); ++i) {
        const std::string_view argument = argumentOf(context, words[i]);
        if (!words[i].starts_with('-') || words[i] == "-") {
            plain.push_back(words[i]);
        } else if (!argument.empty() && !argument.starts_with('[')) {
            ++i;
        }
    }
    return plain;
}

const Verb* verbAt(const Context& context, const std::vector<std::string>& plain) {
    for (const Verb& verb : context.verbs) {
        const std::size_t own = verb.words.find(' ') == std::string_view::npos ? 1 : 2;
        if (plain.size() >= own && beginsWith(verb, std::span(plain).first(own))) {
            return &verb;
        }
    }
    return nullptr;
}

void offerOptions(const Context& context, const Verb* verb, bool isCommand, Candidates& candidates) {
    for (const VerbOption& option : commonOptions()) {
        candidates.offer(std::string(option.name));
    }
    for (const VerbOption& option : context.verbOptions) {
        if (verb != nullptr ? belongsTo(option, *verb) : !isCommand || option.ofCommands) {
            candidates.offer(std::string(option.name));
        }
    }
}

/// Keys of a command, and the values of a key that has only some.
void offerKeys(const Context& context, const std::string& name, const std::string& word, Candidates& candidates) {
    const std::size_t at = word.find_first_of("=@");
    const std::string key = word.substr(0, std::min(at, word.size()));
    if (at != std::string::npos && word[at] == '@') {
        candidates.offerFiles(key + '@');
        return;
    }
    const CommandRef command = context.service.command(name);
    for (const DescribedKey& one : command.description.keys()) {
        if (at == std::string::npos) {
            candidates.offer(std::string(one.path).append(one.secret ? "@" : "="));
        } else if (one.path == key) {
            for (const std::string& value : valuesOf(one)) {
                candidates.offer(std::string(key).append("=").append(value));
            }
        }
    }
}

void offerCommands(const Context& context, Candidates& candidates) {
    for (const PluginInfo& plugin : context.service.plugins()) {
        for (const Description& command : plugin.commands) {
            candidates.offer(command.name());
        }
    }
}

void offerArgument(const Context& context, const Verb& verb, std::span<const std::string> before,
                   const std::string& word, Candidates& candidates) {
    if (verb.arguments.starts_with("FILE") || verb.arguments.starts_with("[FILE]")) {
        candidates.offerFiles("");
    } else if (word.starts_with('@')) {
        candidates.offerFiles("@");
    }
    if (verb.complete != nullptr && before.size() < verb.most) {
        candidates.offerAll(verb.complete(context, {before, word}));
    }
}

}  // namespace

CompletionTarget completionTarget(std::span<const std::string> words) {
    CompletionTarget target;
    for (std::size_t i = 0; i < words.size(); ++i) {
        for (const auto& [name, place] : {std::pair<std::string, std::optional<std::string>*>{"--host", &target.host},
                                          {"--socket", &target.socket},
                                          {"--languages", &target.languages},
                                          {"--timeout", &target.timeout}}) {
            if (words[i] == name && i + 1 < words.size()) {
                *place = words[i + 1];
            } else if (words[i].starts_with(name + '=')) {
                *place = words[i].substr(name.size() + 1);
            }
        }
    }
    return target;
}

std::vector<Dictionary> dictionariesAt(const Value& answer, std::string_view list) {
    std::vector<Dictionary> all;
    const Array* elements = answer.dictionary() == nullptr ? nullptr : answer.dictionary()->get(list).array();
    for (const Value& element : elements == nullptr ? Array() : *elements) {
        if (element.dictionary() != nullptr) {
            all.push_back(*element.dictionary());
        }
    }
    return all;
}

std::vector<std::string> textsOf(const Value& answer, std::string_view list, std::string_view key) {
    std::vector<std::string> texts;
    for (const Dictionary& element : dictionariesAt(answer, list)) {
        if (element.contains(key)) {
            texts.push_back(textOf(element.get(key)));
        }
    }
    return texts;
}

std::vector<std::string> valuesOf(const DescribedKey& key) {
    const std::string& type = key.enteredAs.empty() ? key.type : key.enteredAs;
    return key.allowed.empty() && type == "boolean" ? std::vector<std::string>{"yes", "no"} : key.allowed;
}

std::vector<std::string> peopleNames(const Context& context, const TypedArguments& typed) {
    std::vector<std::string> names;
    for (const Dictionary& entry : entriesBeginning(context, typed.word)) {
        names.emplace_back(entry.text("shortName"));
    }
    return names;
}

ExitStatus complete(const Context& context, std::span<const std::string> words, std::chrono::milliseconds limit) {
    const std::string word = words.empty() ? std::string() : words.back();
    const std::vector<std::string> plain = plainWords(context, words);
    const Verb* verb = verbAt(context, plain);
    Candidates candidates(context.out, word);
    const std::string before = words.size() > 1 ? words[words.size() - 2] : std::string();
    const std::string_view argument = argumentOf(context, before);
    startLimit(limit);
    try {
        if (argument == "FILE" || argument == "PATH") {
            candidates.offerFiles("");
        } else if (argument == "FORMAT") {
            candidates.offerAll({"text", "json", "plist"});
        } else if (argument == "NAME" || argument == "[GROUP]") {
            const bool isGroup = argument == "[GROUP]";
            for (const Dictionary& entry : entriesBeginning(context, word)) {
                if (!isGroup || entry.text("type") == "group") {
                    candidates.offer(std::string(entry.text("shortName")));
                }
            }
        } else if (!argument.empty()) {
            return ExitStatus::done;
        } else if (word.starts_with('-')) {
            offerOptions(context, verb, verb == nullptr && !plain.empty(), candidates);
        } else if (verb != nullptr) {
            const std::size_t own = verb->words.find(' ') == std::string_view::npos ? 1 : 2;
            if (verb->words == "help") {
                candidates.offerAll(firstWords(context.verbs));
                context.out.flush();
                offerCommands(context, candidates);
            }
            offerArgument(context, *verb, std::span(plain).subspan(own), word, candidates);
        } else if (plain.empty()) {
            candidates.offerAll(firstWords(context.verbs));
            context.out.flush();
            offerCommands(context, candidates);
        } else {
            bool isVerb = false;
            for (const Verb& other : context.verbs) {
                if (beginsWith(other, std::span(plain).first(1))) {
                    isVerb = true;
                    if (plain.size() == 1) {
                        candidates.offer(std::string(other.words.substr(plain.front().size() + 1)));
                    }
                }
            }
            if (!isVerb) {
                offerKeys(context, plain.front(), word, candidates);
            }
        }
    } catch (const Failure&) {
        // Left out: a message would disturb the line that is being typed.
    }
    context.out.flush();
    return ExitStatus::done;
}

}  // namespace adminhost::ctl
