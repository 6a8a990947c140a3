#include "adminhostctl/DaemonClient.h"

#include "adminhostctl/Interrupt.h"
#include "adminhostctl/Similar.h"
#include "adminhostctl/Width.h"
#include "platform/json/Json.h"
#include "platform/release/Release.h"
#include "platform/text/Uuid.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <chrono>
#include <thread>

#include <fmt/format.h>

namespace adminhost::ctl {
namespace {

constexpr long statusOk = 200;
constexpr long statusNoContent = 204;
constexpr long statusForbidden = 403;
constexpr long statusRevisionChanged = 412;
constexpr long statusInternal = 500;
constexpr long statusUnavailable = 503;
constexpr long statusTimeout = 504;

using std::chrono::seconds;

/// Of requests that the daemon answers from memory.
constexpr auto quickTimeout = seconds(30);
/// What the daemon needs to stop an operation and to answer.
constexpr auto margin = seconds(10);
constexpr auto usualDeadline = seconds(300);
constexpr int repeats = 3;
/// The number of the daemon's interface that this program was written for. Additions do not raise it.
constexpr std::int64_t interfaceNeeded = 1;

constexpr const char* overviewPath = "/v1/";
constexpr const char* requestsPath = "/v1/requests/";

/// The deadline to send so that the operation has ended before the timeout.
std::string deadlineBefore(std::chrono::milliseconds timeout) {
    const auto whole = std::chrono::ceil<seconds>(timeout);
    return std::to_string(std::max<std::int64_t>(1, whole > 2 * margin ? (whole - margin).count() : whole.count() / 2));
}

std::string shownText(const Dictionary& dictionary, std::string_view key) {
    return shown(dictionary.text(key));
}

std::string findingsText(const Value& findings) {
    std::string text;
    if (const Array* array = findings.array()) {
        for (const Value& element : *array) {
            if (const Dictionary* finding = element.dictionary()) {
                text += "\n  " + shownText(*finding, "keyPath") + ": " + shownText(*finding, "rule");
                const std::string advice = shownText(*finding, "advice");
                text += advice.empty() ? "" : " (" + advice + ")";
            }
        }
    }
    return text;
}

Failure unknownCommand(const std::string& name, const std::vector<PluginInfo>& plugins,
                       std::vector<std::string> known) {
    std::string list;
    for (const PluginInfo& plugin : plugins) {
        for (const Description& command : plugin.commands) {
            known.push_back(command.name());
            list += (list.empty() ? "" : ", ") + command.name();
        }
    }
    return usageError("command not found: " + name + didYouMean(name, known) + "; the commands are " + list);
}

std::uint64_t countAt(const Dictionary& dictionary, std::string_view key) {
    return static_cast<std::uint64_t>(std::max<std::int64_t>(dictionary.get(key).integer().value_or(0), 0));
}

std::vector<const Dictionary*> dictionariesAt(const Dictionary& dictionary, std::string_view key) {
    std::vector<const Dictionary*> all;
    if (const Array* array = dictionary.get(key).array()) {
        for (const Value& element : *array) {
            if (const Dictionary* one = element.dictionary()) {
                all.push_back(one);
            }
        }
    }
    return all;
}

/// The message of an error answer, with its findings.
std::string messageOf(const DaemonReply& reply) {
    const auto body = parseJson(reply.body);
    const Dictionary* said = body ? body->dictionary() : nullptr;
    if (said == nullptr) {
        return "the daemon returned HTTP status " + std::to_string(reply.status);
    }
    const std::string message = shownText(*said, "message");
    const std::string code = shownText(*said, "error");
    // The message of a rejected request repeats the first finding.
    if (const std::string findings = findingsText(said->get("findings")); !findings.empty()) {
        return "the request was rejected, and nothing was changed (" + code + "):" + findings;
    }
    return message.empty() ? code : message + (code.empty() ? "" : " (" + code + ")");
}

std::string commandPath(const CommandRef& command) {
    return "/v1/" + Connection::escaped(command.plugin) + '/' + Connection::escaped(command.description.name());
}

Failure noPlugin() {
    return {ExitStatus::failed, "the daemon has loaded no plug-in; adminhostd --check shows why"};
}

/// Whether a value under a status or error key means failure.
bool isSet(const Value& value) {
    if (const auto number = value.integer()) {
        return *number != 0;
    }
    return !value.isNull();
}

}  // namespace

DaemonClient::Milliseconds DaemonClient::timeoutOf(std::optional<seconds> deadline) {
    if (_timeout) {
        return *_timeout;
    }
    if (!deadline) {
        if (!_deadline) {
            static_cast<void>(overview());
        }
        deadline = _deadline;
    }
    return deadline.value_or(usualDeadline) + margin;
}

template <typename Send>
DaemonReply DaemonClient::patiently(Milliseconds timeout, const Send& send) {
    const auto end = std::chrono::steady_clock::now() + timeout - _connection.loginTime();
    const auto left = [&] {
        return std::chrono::ceil<Milliseconds>(end + _connection.loginTime() - std::chrono::steady_clock::now());
    };
    for (int repeat = 0;; ++repeat) {
        DaemonReply reply = send(left());
        const auto pause = seconds(reply.retryAfter);
        if (reply.status != statusUnavailable || pause == seconds(0) || repeat == repeats || pause >= left()) {
            return reply;
        }
        std::this_thread::sleep_for(pause);
        if (isInterrupted()) {
            throw Failure(ExitStatus::failed, "interrupted; nothing was sent");
        }
    }
}

void DaemonClient::refuseOlderDaemon() {
    if (isRemote() && !_isChecked) {
        static_cast<void>(overview());
    }
}

Value DaemonClient::get(const std::string& path) {
    if (path != overviewPath) {
        refuseOlderDaemon();
    }
    const bool isQuick = path == overviewPath || path.starts_with(requestsPath);
    const Milliseconds timeout = _timeout ? *_timeout : isQuick ? Milliseconds(quickTimeout) : timeoutOf(std::nullopt);
    const DaemonReply answer = patiently(timeout, [&](Milliseconds left) { return _connection.get(path, left); });
    if (answer.status != statusOk) {
        fail(answer);
    }
    auto value = parseJson(answer.body);
    if (!value) {
        throw Failure(ExitStatus::failed, "the daemon's answer cannot be read: " + textOf(value.error()));
    }
    return std::move(*value);
}

void DaemonClient::fail(const DaemonReply& reply) {
    std::string message = messageOf(reply);
    if (reply.status == statusInternal && !reply.requestId.empty()) {
        message += logText(report(reply.requestId).log);
    }
    if (reply.status == statusUnavailable) {
        throw Unavailable(ExitStatus::failed, message);
    }
    throw Failure(reply.status == statusForbidden ? ExitStatus::notPermitted : ExitStatus::failed, message);
}

Value DaemonClient::overview() {
    Value overview = get(overviewPath);
    const Dictionary said = overview.dictionary() != nullptr ? *overview.dictionary() : Dictionary();
    if (said.get("interface").integer().value_or(interfaceNeeded) < interfaceNeeded) {
        throw Failure(
            ExitStatus::failed,
            fmt::format("the daemon at {} has the release {}, which is too old for this adminhostctl; install "
                        "the release " ADMINHOST_RELEASE " there",
                        place(), shownText(said, "release")));
    }
    const auto deadline = said.get("deadlineSeconds").integer();
    _deadline = deadline ? seconds(*deadline) : usualDeadline;
    _isChecked = true;
    return overview;
}

void DaemonClient::cancel(const std::string& requestId) {
    refuseOlderDaemon();
    const std::string path = requestsPath + Connection::escaped(requestId);
    const DaemonReply reply = _connection.remove(path, _timeout.value_or(quickTimeout));
    if (reply.status < statusOk || reply.status >= 300) {
        fail(reply);
    }
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

CommandRef DaemonClient::command(const std::string& name, const std::vector<std::string>& others) {
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
        throw noPlugin();
    }
    if (found.empty()) {
        throw unknownCommand(name, plugins(), others);
    }
    throw usageError("several plug-ins have a command " + wanted + "; use " + found.front().plugin + '/' + wanted);
}

CommandRef DaemonClient::stateCommand(std::string_view state) {
    std::vector<CommandRef> found;
    for (const PluginInfo& plugin : plugins()) {
        for (const Description& command : plugin.commands) {
            if (command.state() == state) {
                found.push_back({plugin.name, command});
            }
        }
    }
    if (found.size() == 1) {
        return found.front();
    }
    if (plugins().empty()) {
        throw noPlugin();
    }
    throw usageError(found.empty() ? "no plug-in of the daemon has a state that can be compared and written"
                                   : "several plug-ins have a state that can be written; use their commands");
}

CommandAnswer DaemonClient::ask(const CommandRef& command, Dictionary request, const std::string& revision) {
    refuseOlderDaemon();
    if (_languages) {
        addLanguages(request, command.description, *_languages);
    }
    const std::string path = commandPath(command);
    const std::string body = jsonOf(request);
    PostHeaders headers{"", revision, ""};
    const auto send = [&](Milliseconds left) {
        // The daemon accepts each id once.
        headers.requestId = textOf(randomUuid());
        headers.deadline = deadlineBefore(left);
        return _connection.post(path, body, left, headers);
    };
    const Milliseconds timeout = timeoutOf(command.description.deadline());
    DaemonReply reply;
    try {
        if (command.description.changes()) {
            const InterruptGuard guard;
            reply = patiently(timeout, send);
        } else {
            reply = patiently(timeout, send);
        }
    } catch (const LostConnection& lost) {
        if (!command.description.changes()) {
            throw Unavailable(ExitStatus::notReachable, lost.what());
        }
        throw LostAnswer(lost.status(), lost.what(), headers.requestId);
    }
    const std::string id = reply.requestId.empty() ? headers.requestId : reply.requestId;
    if (reply.status == statusNoContent) {
        return {std::nullopt, id, reply.revision, reply.notDone};
    }
    if (reply.status != statusOk) {
        if (command.description.changes() && (reply.status == statusInternal || reply.status == statusTimeout)) {
            throw LostAnswer(ExitStatus::failed, messageOf(reply), id);
        }
        if (reply.status == statusRevisionChanged) {
            throw Conflict(messageOf(reply));
        }
        fail(reply);
    }
    auto value = parseJson(reply.body);
    if (!value) {
        throw Failure(ExitStatus::failed, "the answer cannot be read: " + textOf(value.error()));
    }
    return {*std::move(value), id, reply.revision, reply.notDone};
}

void DaemonClient::check(const CommandRef& command, const Dictionary& request) {
    refuseOlderDaemon();
    const std::string path = commandPath(command) + "?check=1";
    const std::string body = jsonOf(request);
    const DaemonReply reply = patiently(timeoutOf(command.description.deadline()), [&](Milliseconds left) {
        return _connection.post(path, body, left, {"", "", deadlineBefore(left)});
    });
    if (reply.status != statusOk) {
        fail(reply);
    }
}

RequestReport DaemonClient::report(const std::string& requestId) {
    RequestReport report;
    DaemonReply reply;
    try {
        reply = _connection.get(requestsPath + Connection::escaped(requestId),
                                std::min(_timeout.value_or(margin), Milliseconds(margin)));
    } catch (const Failure&) {
        report.state = RequestReport::State::notReachable;
        return report;
    }
    const Value record = reply.status == statusOk ? parseJson(reply.body).value_or(Value()) : Value();
    const Dictionary* said = record.dictionary();
    if (said == nullptr) {
        return report;
    }
    const std::string_view state = said->text("state");
    report.state = state == "waiting"   ? RequestReport::State::waiting
                   : state == "running" ? RequestReport::State::running
                   : state == "done"    ? RequestReport::State::done
                                        : RequestReport::State::unknown;
    for (const Dictionary* change : dictionariesAt(*said, "changes")) {
        report.changes.push_back({std::string(change->text("section")), std::string(change->text("identity")),
                                  std::string(change->text("name")), std::string(change->text("key")),
                                  change->get("from"), change->get("to"),
                                  change->get("secret").boolean().value_or(false),
                                  change->get("unverified").boolean().value_or(false)});
    }
    for (const Dictionary* gap : dictionariesAt(*said, "notDone")) {
        report.notDone.push_back({std::string(gap->text("keyPath")), std::string(gap->text("reason")),
                                  std::string(gap->text("toolMessage"))});
    }
    report.changesDropped = countAt(*said, "changesDropped");
    report.notDoneDropped = countAt(*said, "notDoneDropped");
    const Array* log = said->get("log").array();
    for (const Value& line : log != nullptr ? *log : Array{}) {
        report.log.push_back(textOf(line));
    }
    return report;
}

std::vector<ReportedGap> DaemonClient::gapsOf(const CommandAnswer& answer) {
    if (!answer.notDone) {
        return {};
    }
    std::vector<ReportedGap> gaps = report(answer.requestId).notDone;
    if (gaps.empty()) {
        gaps.push_back({"", "the daemon no longer has the reasons of the request " + answer.requestId, ""});
    }
    return gaps;
}

RequestReport DaemonClient::settledReport(const std::string& requestId) {
    constexpr auto patience = std::chrono::seconds(10);
    constexpr auto pause = std::chrono::milliseconds(100);
    const auto end = std::chrono::steady_clock::now() + patience - _connection.loginTime();
    while (true) {
        RequestReport found = report(requestId);
        const bool settled = found.state == RequestReport::State::done || found.state == RequestReport::State::unknown;
        if (settled || std::chrono::steady_clock::now() >= end + _connection.loginTime()) {
            return found;
        }
        // Each attempt over ssh is a login.
        const bool isFarAway = isRemote() && found.state == RequestReport::State::notReachable;
        std::this_thread::sleep_for(isFarAway ? std::chrono::milliseconds(2000) : pause);
    }
}

void addLanguages(Dictionary& request, const Description& command, const std::vector<std::string>& languages) {
    for (const DescribedKey& key : command.keys()) {
        if (key.filledWith != "languages" || key.path.find('[') != std::string::npos) {
            continue;
        }
        Dictionary* above = &request;
        std::string_view name = key.path;
        for (std::size_t dot = name.find('.'); above != nullptr && dot != std::string_view::npos;
             dot = name.find('.')) {
            if (!above->contains(name.substr(0, dot))) {
                above->set(name.substr(0, dot), Dictionary());
            }
            // A request that has something else there is the service's to reject.
            above = above->find(name.substr(0, dot))->dictionary();
            name.remove_prefix(dot + 1);
        }
        if (above != nullptr && !above->contains(name)) {
            above->set(name, Array(languages.begin(), languages.end()));
        }
    }
}

std::string logText(const std::vector<std::string>& lines) {
    std::string text = lines.empty() ? "" : "\nlog lines of the request:";
    for (const std::string& line : lines) {
        text += "\n  " + shownIndented(line, 4);
    }
    return text;
}

std::string errorOf(const Description& command, const Dictionary& answer) {
    std::vector<std::string> keys;
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
