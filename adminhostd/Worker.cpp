#include "adminhostd/Worker.h"

#include "adminhostd/DatabaseTool.h"
#include "adminhostd/Frame.h"
#include "adminhostd/PluginCall.h"
#include "adminhostd/PluginFile.h"
#include "adminhostd/PluginTrial.h"
#include "adminhostd/SettingsHistory.h"
#include "platform/directory/Entries.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/files/Path.h"
#include "platform/files/ReplaceFile.h"
#include "platform/log/Log.h"
#include "platform/task/Task.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <chrono>
#include <csignal>
#include <exception>
#include <map>
#include <vector>

#include <fmt/format.h>
#include <unistd.h>

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
            static_cast<void>(writeFrame(_descriptor, {FrameType::log, Value(event), {}}));
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
    static Value history(const LoadedPlugin& loaded);
    static Value performWith(const LoadedPlugin& loaded, std::string_view command, const Dictionary& order);
    [[nodiscard]] const LoadedPlugin* pluginNamed(std::string_view name) const;

    int _descriptor;
    ForwardingSink _sink;
    FrameReader _reader;
    std::vector<std::string> _languages;
    std::vector<LoadedPlugin> _plugins;
};

std::string textAt(const Dictionary& dictionary, std::string_view key) {
    const std::string* text = dictionary.get(key).string();
    return text == nullptr ? std::string() : *text;
}

constexpr std::string_view nameOf(Access access) noexcept {
    switch (access) {
        case Access::read:
            return "read";
        case Access::write:
            return "write";
        case Access::control:
            return "control";
        case Access::account:
            break;
    }
    return "account";
}

/// The command as clients see it.
Dictionary describe(const Command& command) {
    Dictionary described{{"name", command.name}};
    for (const DictionaryEntry& entry : command.description) {
        described.set(entry.key, entry.value);
    }
    described.set("name", command.name);
    described.set("access", nameOf(command.access));
    described.set("showsRevision", command.showsRevision);
    described.set("takesRevision", command.takesRevision);
    described.set("needs", Array(command.needs.begin(), command.needs.end()));
    if (command.deadline.count() > 0) {
        described.set("deadlineSeconds", command.deadline.count());
    }
    return described;
}

void Worker::load(const DiskPath& file, Array& plugins, Array& refused) {
    auto loaded = loadPlugin(file);
    std::string problem = loaded ? "" : textOf(loaded.error().description);
    if (loaded && pluginNamed(loaded->name) != nullptr) {
        problem = fmt::format("{}: a plug-in of the name \"{}\" is already loaded", file.text(), loaded->name);
    }
    if (loaded && problem.empty()) {
        const auto configured = callPlugin([&] { loaded->plugin->configure(_languages); });
        if (!configured) {
            problem = fmt::format("{} failed while it was configured: {}", file.text(),
                                  textOf(configured.error().description));
        }
    }
    if (!problem.empty()) {
        refused.emplace_back(Dictionary{{"file", file.text()}, {"reason", problem}});
        return;
    }
    Array commands;
    for (const Command& command : loaded->commands) {
        commands.emplace_back(describe(command));
    }
    plugins.emplace_back(Dictionary{{"name", loaded->name},
                                    {"version", loaded->version},
                                    {"file", file.text()},
                                    {"commands", std::move(commands)}});
    _plugins.push_back(*std::move(loaded));
}

const LoadedPlugin* Worker::pluginNamed(std::string_view name) const {
    const auto found =
        std::find_if(_plugins.begin(), _plugins.end(), [&](const LoadedPlugin& plugin) { return plugin.name == name; });
    return found == _plugins.end() ? nullptr : &*found;
}

Value Worker::configure(const Dictionary& configuration) {
    setSystemRoot(textAt(configuration, "root"));
    if (const Array* languages = configuration.get("languages").array()) {
        for (const Value& language : *languages) {
            _languages.push_back(*language.string());
        }
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
        std::vector<DiskPath> paths;
        for (const Value& file : *files) {
            paths.emplace_back(*file.string());
        }
        const auto reasons = tryPlugins(paths);
        for (std::size_t i = 0; i < paths.size(); ++i) {
            if (reasons[i]) {
                refused.emplace_back(Dictionary{{"file", paths[i].text()}, {"reason", *reasons[i]}});
            } else {
                load(paths[i], plugins, refused);
            }
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
    for (const LoadedPlugin& loaded : _plugins) {
        const auto files = callPlugin([&] { return loaded.plugin->settingsFiles(); });
        const auto others = callPlugin([&] { return loaded.plugin->leftovers(); });
        if (!files || !others) {
            logEvent(fmt::format("adminhostd: the plug-in {} failed to name what interrupted operations left: {}",
                                 loaded.name, textOf((files ? others : files).error().description)));
            continue;
        }
        for (const HostPath& file : *files) {
            adminhost::removeLeftovers(file);
        }
        for (const HostPath& file : *others) {
            static_cast<void>(::unlink(diskPath(file).c_str()));
        }
        removeUnfinishedHistory(historyDirectory(loaded.name));
    }
}

Value Worker::performWith(const LoadedPlugin& loaded, std::string_view command, const Dictionary& order) {
    const Dictionary nothing;
    const Dictionary* given = order.get("request").dictionary();
    const Dictionary& request = given == nullptr ? nothing : *given;
    Plugin& plugin = *loaded.plugin;
    const auto failed = [&](const Error& error) {
        logEvent(fmt::format("adminhostd: {}/{} failed: {}", loaded.name, command, textOf(error.description)));
        const char* message = "The operation failed inside the plug-in. The log lines of this request give the reason.";
        return Dictionary{{"outcome", outcome::error},
                          {"response", Dictionary{{"error", "INTERNAL_ERROR"}, {"message", message}}}};
    };

    auto findings = callPlugin([&] { return plugin.check(command, request); });
    if (!findings) {
        return failed(findings.error());
    }
    if (!findings->empty()) {
        Array list;
        for (Finding& finding : *findings) {
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
        const auto revision = callPlugin([&] { return plugin.revision(); });
        if (!revision) {
            return failed(revision.error());
        }
        if (std::find(revisions->begin(), revisions->end(), Value(*revision)) == revisions->end()) {
            return Dictionary{{"outcome", outcome::changed}, {"revision", *revision}};
        }
    }
    if (const Dictionary* about = order.get("keep").dictionary()) {
        // A full disk must not keep an administrator from settings that may fix it: the write goes on.
        const auto files = callPlugin([&] { return plugin.settingsFiles(); });
        const auto error = files ? keepHistory(historyDirectory(loaded.name), *files, *about) : files.error();
        if (error) {
            logEvent("adminhostd: the settings before this write could not be kept: " + textOf(*error));
        }
    }
    auto response = callPlugin([&] { return plugin.perform(command, request); });
    if (!response) {
        return failed(response.error());
    }
    Dictionary answer;
    if (order.get("wantsRevision") == Value(true) && response->kind() != Response::Kind::error) {
        if (auto revision = callPlugin([&] { return plugin.revision(); })) {
            answer.set("revision", *std::move(revision));
        } else {
            logEvent(fmt::format("adminhostd: {} failed to give its revision: {}", loaded.name,
                                 textOf(revision.error().description)));
        }
    }
    // A tool that was killed at the deadline makes an answer that misleads: only the overrun is reported.
    if (Clock::now() >= deadline) {
        return Dictionary{{"outcome", outcome::overrun}};
    }
    switch (response->kind()) {
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
    answer.set("response", std::move(response->dictionary()));
    return answer;
}

/// The settings' history, narrowed to the keys that the plug-in names.
Value Worker::history(const LoadedPlugin& loaded) {
    const auto settings = callPlugin([&] { return loaded.plugin->settingKeys(); });
    if (!settings) {
        return Dictionary{{"outcome", outcome::broken}, {"message", textOf(settings.error().description)}};
    }
    std::vector<std::string> keys;
    std::vector<std::string> secrets;
    for (const Setting& setting : *settings) {
        keys.push_back(setting.key);
        if (setting.secret) {
            secrets.push_back(setting.key);
        }
    }
    Dictionary response;
    response.set("history", readHistory(historyDirectory(loaded.name), keys, secrets));
    return Dictionary{{"outcome", outcome::dictionary}, {"response", std::move(response)}};
}

Value Worker::query(const Dictionary& order) {
    constexpr std::size_t limit = 50;
    if (textAt(order, "query") == "history") {
        const std::string name = textAt(order, "plugin");
        const LoadedPlugin* found = pluginNamed(name);
        if (found == nullptr) {
            return Dictionary{{"outcome", outcome::broken}, {"message", "The plug-in \"" + name + "\" is not loaded."}};
        }
        return history(*found);
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
    try {
        if (order.contains("query")) {
            return query(order);
        }
        if (const LoadedPlugin* found = pluginNamed(name)) {
            return performWith(*found, textAt(order, "command"), order);
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
            if (textAt(*payload, "build") != ADMINHOST_RELEASE ", " ADMINHOST_BUILD_IDENTITY) {
                logEvent("adminhostd: the worker is of another release than the daemon; restart the daemon");
                return 1;
            }
            sent = writeFrame(_descriptor, {FrameType::hello, configure(*payload), {}});
            // Only now: a shared file system that hangs may hold up requests, never the start.
            removeLeftovers();
        } else if (frame->type == FrameType::perform) {
            sent = writeFrame(_descriptor, {FrameType::answer, perform(*payload), {}});
            setTaskDeadline(std::nullopt);
            if (!sent) {
                const char* message = "The answer is too large to be sent.";
                sent =
                    writeFrame(_descriptor,
                               {FrameType::answer, Dictionary{{"outcome", outcome::broken}, {"message", message}}, {}});
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
