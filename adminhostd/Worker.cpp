#include "adminhostd/Worker.h"

#include "adminhostd/DatabaseTool.h"
#include "adminhostd/Frame.h"
#include "adminhostd/PluginFile.h"
#include "adminhostd/SettingsHistory.h"
#include "platform/directory/Entries.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/files/Path.h"
#include "platform/files/ReplaceFile.h"
#include "platform/log/Log.h"
#include "platform/task/Task.h"
#include "platform/value/Text.h"

#include <algorithm>
#include <chrono>
#include <csignal>
#include <exception>
#include <map>
#include <set>
#include <vector>

#include <fmt/format.h>

namespace adminhost {
namespace {

using Clock = std::chrono::steady_clock;

/// Hands every event to the front, which writes the system log and keeps the request's lines.
class ForwardingSink final : public LogSink {
  public:
    explicit ForwardingSink(int descriptor) : _descriptor(descriptor) {}
    void write(std::string_view event) noexcept override {
        try {
            // Lost only together with the front itself.
            static_cast<void>(writeFrame(_descriptor, FrameType::log, Value(event)));
        } catch (...) {
            return;
        }
    }

  private:
    int _descriptor;
};

class Worker {
  public:
    explicit Worker(int descriptor) : _descriptor(descriptor), _sink(descriptor) { setLogSink(_sink); }
    ~Worker() { setLogSink(standardErrorSink()); }
    Worker(const Worker&) = delete;
    Worker& operator=(const Worker&) = delete;

    int run();

  private:
    Value configure(const Dictionary& configuration);
    void load(const DiskPath& file, Array& plugins, Array& refused);
    void removeLeftovers() const;
    Value perform(const Dictionary& order);
    Value query(const Dictionary& order);
    static Value history(const Plugin& plugin);
    Value performWith(const Plugin& plugin, std::string_view command, const Dictionary& order);

    int _descriptor;
    ForwardingSink _sink;
    FrameReader _reader;
    std::vector<const Plugin*> _plugins;
};

std::string textAt(const Dictionary& dictionary, std::string_view key) {
    const std::string* text = dictionary.get(key).string();
    return text == nullptr ? std::string() : *text;
}

/// Whether the front can serve commands that are described like this. "history" is an address of the front's own.
bool namesCommands(const Value& commands) {
    std::set<std::string> names;
    const auto named = [&](const Value& command) {
        const std::string name = command.dictionary() == nullptr ? "" : textAt(*command.dictionary(), "name");
        return !name.empty() && name != "history" && names.insert(name).second;
    };
    return commands.array() != nullptr && std::all_of(commands.array()->begin(), commands.array()->end(), named);
}

void Worker::load(const DiskPath& file, Array& plugins, Array& refused) {
    std::string problem;
    const Plugin* plugin = loadPlugin(file, problem);
    if (plugin != nullptr && std::any_of(_plugins.begin(), _plugins.end(), [&](const Plugin* other) {
            return std::string_view(other->name) == plugin->name;
        })) {
        problem = fmt::format("{}: a plug-in of the name \"{}\" is already loaded", file.text(), plugin->name);
        plugin = nullptr;
    }
    Value commands = plugin == nullptr ? Value() : plugin->describe();
    if (plugin != nullptr && !namesCommands(commands)) {
        problem = fmt::format("{} does not describe its commands, each with a name of its own", file.text());
        plugin = nullptr;
    }
    if (plugin == nullptr) {
        refused.emplace_back(Dictionary{{"file", file.text()}, {"reason", problem}});
        return;
    }
    _plugins.push_back(plugin);
    plugins.emplace_back(Dictionary{{"name", plugin->name},
                                    {"version", plugin->version},
                                    {"file", file.text()},
                                    {"commands", std::move(commands)}});
}

Value Worker::configure(const Dictionary& configuration) {
    setSystemRoot(textAt(configuration, "root"));
    if (configuration.contains("languages")) {
        setUserDefault("BrennLanguages", configuration.get("languages"));
    }
    if (const std::string uuids = textAt(configuration, "accountUuids"); !uuids.empty()) {
        setDirectoryNodes({localAccounts(HostPath(uuids))});
    }
    std::map<std::string, std::string> environment;
    if (const Dictionary* variables = configuration.get("environment").dictionary()) {
        for (const DictionaryEntry& variable : *variables) {
            environment.emplace(variable.key, *variable.value.string());
        }
    }
    setTaskEnvironment(std::move(environment));

    Array plugins;
    Array refused;
    if (const Array* files = configuration.get("plugins").array()) {
        for (const Value& file : *files) {
            load(DiskPath(*file.string()), plugins, refused);
        }
    }
    Dictionary hello{{"plugins", std::move(plugins)}, {"refused", std::move(refused)}};
    setTaskDeadline(Clock::now() + std::chrono::seconds(5));
    if (const auto problem = databaseToolProblem()) {
        hello.set("databaseTool", *problem);
    }
    return hello;
}

/// Of workers that were killed in the middle of a write.
void Worker::removeLeftovers() const {
    for (const Plugin* plugin : _plugins) {
        if (plugin->settingsFiles == nullptr) {
            continue;
        }
        for (const HostPath& file : plugin->settingsFiles()) {
            adminhost::removeLeftovers(file);
        }
        removeUnfinishedHistory(historyDirectory(plugin->name));
    }
}

Value Worker::performWith(const Plugin& plugin, std::string_view command, const Dictionary& order) {
    const Dictionary nothing;
    const Dictionary* given = order.get("request").dictionary();
    const Dictionary& request = given == nullptr ? nothing : *given;

    if (std::vector<Finding> findings = plugin.check(command, request); !findings.empty()) {
        Array list;
        for (Finding& finding : findings) {
            list.emplace_back(Dictionary{{"keyPath", std::move(finding.keyPath)},
                                         {"rule", std::move(finding.rule)},
                                         {"advice", std::move(finding.advice)}});
        }
        return Dictionary{{"outcome", outcome::refused}, {"findings", std::move(list)}};
    }
    const auto deadline =
        Clock::now() + std::chrono::milliseconds(order.get("milliseconds").integer().value_or(std::int64_t{0}));
    setTaskDeadline(deadline);
    if (const Array* revisions = order.get("ifMatch").array()) {
        const std::string revision = plugin.revision();
        if (std::find(revisions->begin(), revisions->end(), Value(revision)) == revisions->end()) {
            return Dictionary{{"outcome", outcome::changed}, {"revision", revision}};
        }
    }
    const Dictionary* about = order.get("keep").dictionary();
    if (about != nullptr && plugin.settingsFiles != nullptr) {
        // A full disk must not keep an administrator from settings that may mend it: the write goes on.
        if (const auto error = keepHistory(historyDirectory(plugin.name), plugin.settingsFiles(), *about)) {
            logEvent("adminhostd: the settings before this write could not be kept: " + textOf(*error));
        }
    }
    Response response = plugin.perform(command, request);
    Dictionary answer;
    if (order.get("wantsRevision") == Value(true) && response.kind() != Response::Kind::error) {
        answer.set("revision", plugin.revision());
    }
    // A tool that was killed at the deadline makes an answer that misleads: only the overrun is told.
    if (Clock::now() >= deadline) {
        return Dictionary{{"outcome", outcome::overrun}};
    }
    switch (response.kind()) {
        case Response::Kind::nothing:
            answer.set("outcome", outcome::nothing);
            break;
        case Response::Kind::dictionary:
            answer.set("outcome", outcome::dictionary);
            break;
        case Response::Kind::error:
            answer.set("outcome", outcome::error);
            break;
    }
    answer.set("response", std::move(response.dictionary()));
    return answer;
}

/// The settings' history, narrowed to the keys that the plug-in describes as written.
Value Worker::history(const Plugin& plugin) {
    constexpr std::string_view prefix = "configuration.";
    std::vector<std::string> keys;
    std::vector<std::string> secrets;
    const Value described = plugin.describe();
    for (const Value& command : *described.array()) {
        const Array* commandKeys = command.dictionary()->get("keys").array();
        if (command.dictionary()->get("revisionGuard") != Value(true) || commandKeys == nullptr) {
            continue;
        }
        for (const Value& key : *commandKeys) {
            const std::string path = textAt(*key.dictionary(), "path");
            if (path.starts_with(prefix) && path.find_first_of(".[", prefix.size()) == std::string::npos) {
                keys.push_back(path.substr(prefix.size()));
                if (key.dictionary()->get("secret") == Value(true)) {
                    secrets.push_back(keys.back());
                }
            }
        }
    }
    Dictionary response;
    response.set("history", readHistory(historyDirectory(plugin.name), keys, secrets));
    return Dictionary{{"outcome", outcome::dictionary}, {"response", std::move(response)}};
}

Value Worker::query(const Dictionary& order) {
    constexpr std::size_t limit = 50;
    if (textAt(order, "query") == "history") {
        const std::string name = textAt(order, "plugin");
        const auto found =
            std::find_if(_plugins.begin(), _plugins.end(), [&](const Plugin* plugin) { return name == plugin->name; });
        if (found == _plugins.end()) {
            return Dictionary{{"outcome", outcome::broken}, {"message", "The plug-in \"" + name + "\" is not loaded."}};
        }
        return history(**found);
    }
    Error error;
    const std::string is = textAt(order, "is");
    std::optional<Array> entries =
        is.empty() ? directoryEntries(textAt(order, "match"), limit, &error) : directoryEntriesOf(is, &error);
    if (!entries) {
        return Dictionary{{"outcome", outcome::error},
                          {"response", Dictionary{{"error", "DIRECTORY_UNAVAILABLE"}, {"message", textOf(error)}}}};
    }
    Dictionary response;
    response.set("entries", std::move(*entries));
    return Dictionary{{"outcome", outcome::dictionary}, {"response", std::move(response)}};
}

Value Worker::perform(const Dictionary& order) {
    const std::string name = textAt(order, "plugin");
    const auto found =
        std::find_if(_plugins.begin(), _plugins.end(), [&](const Plugin* plugin) { return name == plugin->name; });
    try {
        if (order.contains("query")) {
            return query(order);
        }
        if (found != _plugins.end()) {
            return performWith(**found, textAt(order, "command"), order);
        }
        return Dictionary{{"outcome", outcome::broken}, {"message", "The plug-in \"" + name + "\" is not loaded."}};
    } catch (const std::exception& exception) {
        return Dictionary{{"outcome", outcome::broken}, {"message", exception.what()}};
    }
}

int Worker::run() {
    // A signal for the whole group or service is the front's to act on: the running operation is to end in peace.
    for (const int signal : {SIGTERM, SIGINT, SIGHUP, SIGPIPE}) {
        static_cast<void>(std::signal(signal, SIG_IGN));
    }
    prepareForTasks();
    for (;;) {
        const auto frame = readFrame(_descriptor, _reader);
        if (!frame) {
            return 0;
        }
        const Dictionary* payload = frame->payload.dictionary();
        if (payload == nullptr) {
            return 1;
        }
        bool sent = false;
        if (frame->type == FrameType::configure) {
            if (textAt(*payload, "build") != ADMINHOST_BUILD_IDENTITY) {
                logEvent("adminhostd: the worker is of another release than the daemon; restart the daemon");
                return 1;
            }
            sent = writeFrame(_descriptor, FrameType::hello, configure(*payload));
            // Only now: a shared file system that hangs may hold up requests, never the start.
            removeLeftovers();
        } else if (frame->type == FrameType::perform) {
            sent = writeFrame(_descriptor, FrameType::answer, perform(*payload));
            setTaskDeadline(std::nullopt);
            if (!sent) {
                const char* message = "The answer is too large to be sent.";
                sent = writeFrame(_descriptor, FrameType::answer,
                                  Dictionary{{"outcome", outcome::broken}, {"message", message}});
            }
        }
        if (!sent) {
            return 1;
        }
    }
}

}  // namespace

int runWorker(int descriptor) {
    return Worker(descriptor).run();
}

}  // namespace adminhost
