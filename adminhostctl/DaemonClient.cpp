#include "adminhostctl/DaemonClient.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/Width.h"
#include "platform/json/Json.h"
#include "platform/value/ValueText.h"

#include <algorithm>

namespace adminhost::ctl {
namespace {

constexpr long statusOk = 200;
constexpr long statusNoContent = 204;
constexpr long statusForbidden = 403;
constexpr long statusInternal = 500;

std::string textAt(const Dictionary& dictionary, std::string_view key) {
    const std::string* text = dictionary.get(key).string();
    return text != nullptr ? shown(*text) : std::string();
}

std::string findingsText(const Value& findings) {
    std::string text;
    if (const Array* array = findings.array()) {
        for (const Value& element : *array) {
            if (const Dictionary* finding = element.dictionary()) {
                text += "\n  " + textAt(*finding, "keyPath") + ": " + textAt(*finding, "rule");
                const std::string advice = textAt(*finding, "advice");
                text += advice.empty() ? "" : " (" + advice + ")";
            }
        }
    }
    return text;
}

std::string logText(const std::vector<std::string>& lines) {
    std::string text = lines.empty() ? "" : "\nlog lines of the request:";
    for (const std::string& line : lines) {
        text += "\n  " + shown(line);
    }
    return text;
}

std::string joined(const std::vector<PluginInfo>& plugins) {
    std::string text;
    for (const PluginInfo& plugin : plugins) {
        for (const Description& command : plugin.commands) {
            text += (text.empty() ? "" : ", ") + command.name();
        }
    }
    return text;
}

/// Whether a value under a status or error key means failure.
bool isSet(const Value& value) {
    if (const auto number = value.integer()) {
        return *number != 0;
    }
    return !value.isNull();
}

}  // namespace

Value DaemonClient::get(const std::string& path) {
    const DaemonReply answer = _connection.get(path);
    if (answer.status != statusOk) {
        fail(answer);
    }
    Error error;
    auto value = parseJson(answer.body, &error);
    if (!value) {
        throw Failure(ExitStatus::answeredError, "the daemon's answer cannot be read: " + textOf(error));
    }
    return std::move(*value);
}

void DaemonClient::fail(const DaemonReply& answer) {
    const ExitStatus status = answer.status == statusForbidden ? ExitStatus::notPermitted : ExitStatus::answeredError;
    const auto body = parseJson(answer.body);
    const Dictionary* said = body ? body->dictionary() : nullptr;
    if (said == nullptr) {
        throw Failure(status, "the daemon answered HTTP status " + std::to_string(answer.status));
    }
    std::string message = textAt(*said, "message");
    const std::string code = textAt(*said, "error");
    message = message.empty() ? code : message + (code.empty() ? "" : " (" + code + ")");
    message += findingsText(said->get("findings"));
    if (answer.status == statusInternal && !answer.requestId.empty()) {
        message += logText(logLines(answer.requestId));
    }
    throw Failure(status, message);
}

Value DaemonClient::overview() {
    return get("/v1/");
}

const std::vector<PluginInfo>& DaemonClient::plugins() {
    if (!_plugins) {
        std::vector<PluginInfo> plugins;
        const Value all = overview();
        const Array* list = all.dictionary() != nullptr ? all.dictionary()->get("plugins").array() : nullptr;
        for (const Value& entry : list != nullptr ? *list : Array{}) {
            const std::string* name =
                entry.dictionary() != nullptr ? entry.dictionary()->get("name").string() : nullptr;
            if (name == nullptr) {
                continue;
            }
            PluginInfo plugin{*name, {}};
            const Value described = get("/v1/" + Connection::escaped(*name));
            const Array* commands =
                described.dictionary() != nullptr ? described.dictionary()->get("commands").array() : described.array();
            for (const Value& command : commands != nullptr ? *commands : Array{}) {
                if (command.dictionary() != nullptr) {
                    plugin.commands.emplace_back(*command.dictionary());
                }
            }
            plugins.push_back(std::move(plugin));
        }
        _plugins = std::move(plugins);
    }
    return *_plugins;
}

CommandRef DaemonClient::command(const std::string& name) {
    const std::size_t slash = name.find('/');
    const std::string wanted = slash == std::string::npos ? name : name.substr(slash + 1);
    std::vector<CommandRef> found;
    for (const PluginInfo& plugin : plugins()) {
        if (slash != std::string::npos && plugin.name != name.substr(0, slash)) {
            continue;
        }
        for (const Description& command : plugin.commands) {
            if (command.name() == wanted) {
                found.push_back({plugin.name, command});
            }
        }
    }
    if (found.size() == 1) {
        return found.front();
    }
    if (plugins().empty()) {
        throw Failure(ExitStatus::answeredError, "the daemon has loaded no plug-in; adminhostctl status says more");
    }
    if (found.empty()) {
        throw usageError("there is no command " + shown(name) + "; there are " + joined(plugins()));
    }
    throw usageError("several plug-ins have a command " + wanted + "; write " + found.front().plugin + '/' + wanted);
}

CommandAnswer DaemonClient::ask(const CommandRef& command, const Dictionary& request, const std::string& revision) {
    const DaemonReply answer = _connection.post(
        "/v1/" + Connection::escaped(command.plugin) + '/' + Connection::escaped(command.description.name()),
        jsonOf(request), revision);
    if (answer.status == statusNoContent) {
        return {std::nullopt, answer.requestId, answer.revision};
    }
    if (answer.status != statusOk) {
        fail(answer);
    }
    Error error;
    auto value = parseJson(answer.body, &error);
    if (!value) {
        throw Failure(ExitStatus::answeredError, "the answer cannot be read: " + textOf(error));
    }
    return {std::move(value), answer.requestId, answer.revision};
}

std::vector<std::string> DaemonClient::logLines(const std::string& requestId) {
    const DaemonReply answer = _connection.get("/v1/requests/" + Connection::escaped(requestId));
    const auto record = answer.status == statusOk ? parseJson(answer.body) : std::nullopt;
    const Dictionary* dictionary = record ? record->dictionary() : nullptr;
    const Array* log = dictionary != nullptr ? dictionary->get("log").array() : nullptr;
    std::vector<std::string> lines;
    for (const Value& line : log != nullptr ? *log : Array{}) {
        lines.push_back(textOf(line));
    }
    return lines;
}

std::string errorOf(const Description& command, const Dictionary& answer) {
    std::vector<std::string> keys = {"readStatus", "writeStatus"};
    for (const Value& error : command.errors()) {
        const std::string* key = error.dictionary() != nullptr ? error.dictionary()->get("key").string() : nullptr;
        if (key != nullptr && std::find(keys.begin(), keys.end(), *key) == keys.end()) {
            keys.push_back(*key);
        }
    }
    std::string text;
    for (const std::string& key : keys) {
        const Value& value = answer.get(key);
        if (isSet(value)) {
            text += (text.empty() ? "" : ", ") + key + " is " + shown(textOf(value));
        }
    }
    return text;
}

}  // namespace adminhost::ctl
