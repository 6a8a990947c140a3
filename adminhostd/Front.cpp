#include "adminhostd/Front.h"

#include "adminhostd/RequestBody.h"
#include "adminhostd/Worker.h"
#include "platform/log/Log.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <functional>
#include <memory>

#include <fmt/format.h>
#include <fmt/ranges.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr const char* retrySeconds = "1";
constexpr std::size_t keptName = 100;  ///< bytes of an unknown name that are remembered and logged

HttpAnswer errorAnswer(unsigned status, std::string_view code, std::string_view message) {
    return {status, Dictionary{{"error", code}, {"message", message}}, {}};
}

HttpAnswer retryLater(std::string_view code, std::string_view message) {
    HttpAnswer answer = errorAnswer(503, code, message);
    answer.headers.emplace_back("Retry-After", retrySeconds);
    return answer;
}

bool permitted(const Peer& peer) {
    return peer.uid == 0 || peer.uid == ::geteuid();
}

std::string_view textAt(const Dictionary& dictionary, std::string_view key) {
    const std::string* text = dictionary.get(key).string();
    return text == nullptr ? std::string_view() : std::string_view(*text);
}

/// The names in a list of dictionaries, for a message.
std::string namesIn(const Value& list) {
    std::vector<std::string_view> names;
    if (const Array* array = list.array()) {
        for (const Value& element : *array) {
            names.push_back(textAt(*element.dictionary(), "name"));
        }
    }
    return names.empty() ? "none" : fmt::format("{}", fmt::join(names, ", "));
}

const Dictionary* elementNamed(const Value& list, std::string_view name) {
    if (const Array* array = list.array()) {
        for (const Value& element : *array) {
            if (element.dictionary() != nullptr && textAt(*element.dictionary(), "name") == name) {
                return element.dictionary();
            }
        }
    }
    return nullptr;
}

/// A list of dictionaries, each with a name.
bool isNamedList(const Value& list) {
    return list.array() != nullptr && std::all_of(list.array()->begin(), list.array()->end(), [](const Value& element) {
               return element.dictionary() != nullptr && element.dictionary()->get("name").string() != nullptr;
           });
}

/// What a worker says first is looked at as a whole: everything else here relies on its form.
bool isHello(const Dictionary& hello) {
    const Value& plugins = hello.get("plugins");
    return isNamedList(plugins) &&
           std::all_of(plugins.array()->begin(), plugins.array()->end(),
                       [](const Value& plugin) { return isNamedList(plugin.dictionary()->get("commands")); });
}

bool flag(const Dictionary& description, std::string_view key) {
    return description.get(key) == Value(true);
}

bool needs(const Dictionary& description, std::string_view name) {
    const Array* all = description.get("needs").array();
    return all != nullptr && std::find(all->begin(), all->end(), Value(name)) != all->end();
}

HttpAnswer findingsAnswer(const Value& findings, const Dictionary& first) {
    const std::size_t count = findings.array()->size();
    HttpAnswer answer = errorAnswer(422, "REQUEST_REFUSED",
                                    fmt::format("The request cannot be carried out. {}{}: {}.",
                                                count == 1 ? "" : fmt::format("The first of {} findings: ", count),
                                                textAt(first, "keyPath"), textAt(first, "rule")));
    answer.body->dictionary()->set("findings", findings);
    return answer;
}

/// Takes the worker's response out of its answer: a listing is large.
HttpAnswer answerFor(Dictionary& worker) {
    const auto response = [&] {
        Value* found = worker.find("response");
        return found == nullptr ? Value() : std::move(*found);
    };
    const std::string_view word = textAt(worker, "outcome");
    const std::string_view message = textAt(worker, "message");
    if (word == outcome::nothing) {
        return {204, std::nullopt, {}};
    }
    if (word == outcome::dictionary) {
        return {200, response(), {}};
    }
    if (word == outcome::error) {
        return {500, response(), {}};
    }
    const Array* findings = worker.get("findings").array();
    if (word == outcome::refused && findings != nullptr && !findings->empty() &&
        findings->front().dictionary() != nullptr) {
        return findingsAnswer(worker.get("findings"), *findings->front().dictionary());
    }
    if (word == outcome::changed) {
        return errorAnswer(412, "REVISION_CHANGED", "The settings have changed since they were read. Read them again.");
    }
    if (word == outcome::overrun) {
        return errorAnswer(504, "DEADLINE_EXCEEDED", "The command did not end in time and was stopped.");
    }
    if (word == outcome::unavailable) {
        return retryLater("WORKER_UNAVAILABLE", message);
    }
    if (word == outcome::stopping) {
        return retryLater("STOPPING", message);
    }
    if (word == outcome::abandoned) {
        return retryLater("CLIENT_GONE", message);
    }
    return errorAnswer(500, "WORKER_FAILED", message);
}

}  // namespace

Front::Front(OperationQueue::Settings settings, Array refused)
    : _refused(std::move(refused)),
      _queue(std::move(settings),
             {[this](const Dictionary& hello) { return welcome(hello); },
              [](const std::string& event) { logEvent(event); },
              [this](const Operation& operation, Dictionary answer) { finished(operation, std::move(answer)); }}) {}

bool Front::welcome(const Dictionary& hello) {
    if (!isHello(hello)) {
        return false;
    }
    _hello = hello;
    const Array none;
    const Array* others = hello.get("refused").array();
    for (const Array& refused : {std::cref(_refused), std::cref(others == nullptr ? none : *others)}) {
        for (const Value& plugin : refused) {
            const Dictionary* described = plugin.dictionary();
            logEvent(fmt::format("adminhostd: a plug-in is refused: {}",
                                 described == nullptr ? "" : textAt(*described, "reason")));
        }
    }
    if (hello.contains("databaseTool")) {
        logEvent(
            fmt::format("adminhostd: commands that need the database are refused: {}", textAt(hello, "databaseTool")));
    }
    logEvent(fmt::format("adminhostd: release " ADMINHOST_RELEASE " serves with the plug-ins {}",
                         namesIn(hello.get("plugins"))));
    return true;
}

Front::Address Front::addressOf(std::string_view path) {
    constexpr std::string_view root = "/v1";
    if (path == root) {
        path = "/v1/";
    }
    if (!path.starts_with("/v1/")) {
        return {};
    }
    path.remove_prefix(root.size() + 1);
    if (path.empty()) {
        return {Address::Kind::overview, {}, {}};
    }
    const std::size_t slash = path.find('/');
    const std::string_view first = path.substr(0, slash);
    const std::string_view second = slash == std::string_view::npos ? std::string_view() : path.substr(slash + 1);
    if (first == "requests") {
        return {second.empty() ? Address::Kind::unknown : Address::Kind::request, {}, second};
    }
    if (path == "directory") {
        return {Address::Kind::directory, {}, path};
    }
    if (second == "history") {
        return {Address::Kind::history, first, second};
    }
    return {second.empty() ? Address::Kind::plugin : Address::Kind::command, first, second};
}

const Dictionary* Front::pluginNamed(std::string_view name) const {
    return elementNamed(_hello.get("plugins"), name);
}

const Dictionary* Front::commandNamed(const Dictionary& plugin, std::string_view name) {
    return elementNamed(plugin.get("commands"), name);
}

std::optional<HttpAnswer> Front::refusal(const Exchange& exchange, const Address& address) const {
    using Kind = Address::Kind;
    if (!permitted(exchange.peer())) {
        return errorAnswer(403, "NOT_PERMITTED",
                           fmt::format("The account with uid {} may not use this daemon.", exchange.peer().uid));
    }
    if (address.kind == Kind::unknown) {
        return errorAnswer(404, "UNKNOWN_ADDRESS",
                           "Known addresses: /v1/, /v1/PLUGIN, /v1/PLUGIN/COMMAND, /v1/PLUGIN/history, /v1/directory, "
                           "/v1/requests/ID.");
    }
    if (address.kind == Kind::plugin || address.kind == Kind::command || address.kind == Kind::history) {
        const Dictionary* plugin = pluginNamed(address.plugin);
        if (plugin == nullptr && _hello.empty()) {
            return retryLater("WORKER_UNAVAILABLE", "No worker has started yet, so that no plug-in is known.");
        }
        if (plugin == nullptr) {
            return errorAnswer(404, "UNKNOWN_PLUGIN",
                               fmt::format("There is no plug-in \"{}\". Known plug-ins: {}.", address.plugin,
                                           namesIn(_hello.get("plugins"))));
        }
        if (address.kind == Kind::command && commandNamed(*plugin, address.command) == nullptr) {
            return errorAnswer(404, "UNKNOWN_COMMAND",
                               fmt::format("The plug-in \"{}\" has no command \"{}\". Known commands: {}.",
                                           address.plugin, address.command, namesIn(plugin->get("commands"))));
        }
    }
    if (address.kind == Kind::request && _history.find(address.command) == nullptr) {
        return errorAnswer(
            404, "UNKNOWN_REQUEST",
            fmt::format("The request \"{}\" is not among the latest {}.", address.command, History::length));
    }
    const bool post = address.kind == Kind::command;
    const bool allowed = post ? exchange.method() == "POST" : exchange.method() == "GET" || exchange.method() == "HEAD";
    if (!allowed) {
        HttpAnswer answer = errorAnswer(405, "METHOD_NOT_ALLOWED",
                                        fmt::format("This address is for {} only.", post ? "POST" : "GET and HEAD"));
        answer.headers.emplace_back("Allow", post ? "POST" : "GET, HEAD");
        return answer;
    }
    if (post && !bodyFormOf(exchange.header("Content-Type").value_or(""))) {
        return errorAnswer(415, "UNSUPPORTED_TYPE",
                           "A request's body is application/json (also when no type is given) or application/x-plist.");
    }
    return std::nullopt;
}

std::optional<HttpAnswer> Front::head(const Exchange& exchange) {
    const Address address = addressOf(exchange.path());
    auto answer = refusal(exchange, address);
    const bool stranger = !permitted(exchange.peer());
    if (answer && (stranger || exchange.method() == "POST")) {
        // Who may not ask is logged, but must not push what others asked for out of the daemon's memory.
        const std::shared_ptr<RequestRecord> record = stranger ? History::begin(exchange) : _history.add(exchange);
        record->plugin = address.plugin.substr(0, keptName);
        record->command = address.command.substr(0, keptName);
        close(*record, *answer);
    }
    return answer;
}

void Front::serve(Exchange& exchange) {
    const Address address = addressOf(exchange.path());
    // Between head and body a new worker may have brought other plug-ins.
    if (auto answer = refusal(exchange, address)) {
        exchange.answer(std::move(*answer));
        return;
    }
    switch (address.kind) {
        case Address::Kind::command:
            operation(exchange, address);
            return;
        case Address::Kind::directory:
        case Address::Kind::history:
            query(exchange, address);
            return;
        case Address::Kind::plugin:
            exchange.answer({200, pluginNamed(address.plugin)->get("commands"), {}});
            return;
        case Address::Kind::request:
            exchange.answer({200, _history.find(address.command)->describe(), {}});
            return;
        case Address::Kind::overview:
        case Address::Kind::unknown:
            exchange.answer(overview());
            return;
    }
}

HttpAnswer Front::overview() const {
    Array plugins;
    if (const Array* loaded = _hello.get("plugins").array()) {
        for (const Value& element : *loaded) {
            const Dictionary& plugin = *element.dictionary();
            Array commands;
            for (const Value& command : *plugin.get("commands").array()) {
                commands.push_back(command.dictionary()->get("name"));
            }
            plugins.emplace_back(Dictionary{
                {"name", plugin.get("name")}, {"version", plugin.get("version")}, {"commands", std::move(commands)}});
        }
    }
    Array refused = _refused;
    if (const Array* others = _hello.get("refused").array()) {
        refused.insert(refused.end(), others->begin(), others->end());
    }
    Dictionary text{{"release", ADMINHOST_RELEASE}, {"plugins", std::move(plugins)}};
    text.set("refusedPlugins", refused.empty() ? Value() : Value(std::move(refused)));
    text.set("databaseToolProblem", _hello.get("databaseTool"));
    if (const Operation* running = _queue.running()) {
        Dictionary description = running->record->describe();
        description.remove("log");
        description.remove("state");
        text.set("running", std::move(description));
    }
    text.set("waiting", _queue.waiting());
    if (const auto pid = _queue.workerPid()) {
        text.set("workerPid", *pid);
    }
    return {200, std::move(text), {}};
}

void Front::operation(Exchange& exchange, const Address& address) {
    const Dictionary& description = *commandNamed(*pluginNamed(address.plugin), address.command);
    Operation operation{&exchange, _history.add(exchange), {}};
    RequestRecord& record = *operation.record;
    record.plugin = address.plugin;
    record.command = address.command;
    const auto refuse = [&](HttpAnswer answer) {
        close(record, answer);
        exchange.answer(std::move(answer));
    };

    BodyProblem problem;
    auto request = requestOf(exchange.body(), *bodyFormOf(exchange.header("Content-Type").value_or("")), problem);
    exchange.dropBody();
    if (!request) {
        return refuse(problem.tooManyValues ? errorAnswer(413, "BODY_TOO_LARGE", problem.text)
                                            : errorAnswer(400, "MALFORMED_BODY", problem.text));
    }
    const auto ifMatch = exchange.header("If-Match");
    auto revisions = revisionsOf(ifMatch.value_or("*"));
    if (ifMatch && (!revisions || !flag(description, "takesRevision"))) {
        return refuse(errorAnswer(400, "PRECONDITION_NOT_UNDERSTOOD",
                                  "If-Match must list quoted revisions, and is for commands that depend on the "
                                  "revision only."));
    }
    if (_hello.contains("databaseTool") && needs(description, "database")) {
        return refuse(
            errorAnswer(500, "SQLITE_TOOL_UNUSABLE",
                        fmt::format("The command needs the database tool, and {}. The daemon tries it when it starts.",
                                    textAt(_hello, "databaseTool"))));
    }
    if (_queue.full()) {
        return refuse(retryLater("TOO_MANY_WAITING", fmt::format("{} requests wait already.", _queue.waiting())));
    }
    operation.order.set("plugin", address.plugin);
    operation.order.set("command", address.command);
    operation.order.set("request", std::move(*request));
    operation.order.set("wantsRevision", flag(description, "showsRevision"));
    if (flag(description, "takesRevision")) {
        // Whatever depends on the revision replaces settings, and these are kept first.
        operation.order.set("keep", Dictionary{{"when", record.received},
                                               {"who", fmt::format("uid {}", record.peer.uid)},
                                               {"command", record.command},
                                               {"request", record.id}});
    }
    if (revisions && !revisions->empty()) {
        operation.order.set("ifMatch", std::move(*revisions));
    }
    _queue.add(std::move(operation));
}

void Front::query(Exchange& exchange, const Address& address) {
    Operation operation{&exchange, _history.add(exchange), {}};
    operation.record->plugin = address.plugin;
    operation.record->command = address.command;
    if (_queue.full()) {
        HttpAnswer answer = retryLater("TOO_MANY_WAITING", fmt::format("{} requests wait already.", _queue.waiting()));
        close(*operation.record, answer);
        exchange.answer(std::move(answer));
        return;
    }
    operation.order.set("query", address.command);
    operation.order.set("plugin", address.plugin);
    for (const char* argument : {"match", "is"}) {
        const std::string_view text = exchange.argument(argument);
        if (!isUtf8(text)) {
            HttpAnswer answer =
                errorAnswer(400, "MALFORMED_ADDRESS", fmt::format("The text of \"{}\" is not UTF-8.", argument));
            close(*operation.record, answer);
            exchange.answer(std::move(answer));
            return;
        }
        operation.order.set(argument, text);
    }
    _queue.add(std::move(operation));
}

void Front::finished(const Operation& operation, Dictionary answer) {
    HttpAnswer http = answerFor(answer);
    const std::string_view revision = textAt(answer, "revision");
    if (http.status < 300 && !revision.empty()) {
        http.headers.emplace_back("ETag", fmt::format("\"{}\"", revision));
    }
    close(*operation.record, http);
    operation.exchange->answer(std::move(http));
}

void Front::close(RequestRecord& record, const HttpAnswer& answer) {
    const std::chrono::duration<double, std::milli> duration = std::chrono::steady_clock::now() - record.arrival;
    record.milliseconds = duration.count();
    record.state = RequestRecord::State::done;
    record.status = answer.status;
    if (answer.status >= 400 && answer.body && answer.body->dictionary() != nullptr) {
        record.error = textAt(*answer.body->dictionary(), "error");
    }
    // Names from an address come from the client: only printable ones may reach the log.
    std::string name = record.plugin + "/" + record.command;
    for (char& c : name) {
        c = c < 0x21 || c > 0x7e ? '?' : c;
    }
    logEvent(fmt::format("adminhostd: request {} {} by uid {} pid {}: {}{}{} in {:.1f} ms", record.id, name,
                         record.peer.uid, record.peer.pid, record.status, record.error.empty() ? "" : " ", record.error,
                         record.milliseconds));
}

}  // namespace adminhost
