#include "adminhostd/PluginLogs.h"

#include "adminhostd/LogPiece.h"
#include "adminhostd/PluginCall.h"
#include "adminhostd/WorkerAnswer.h"
#include "platform/log/Log.h"
#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <string>
#include <utility>

#include <fmt/format.h>

namespace adminhost {
namespace {

/// A log file, and the plug-in that names it.
struct NamedLog {
    std::string plugin;
    LogFile log;
};

/// The logs of all plug-ins. A plug-in that fails to name its logs has none.
std::vector<NamedLog> logsOf(const std::vector<LoadedPlugin>& plugins) {
    std::vector<NamedLog> all;
    for (const LoadedPlugin& loaded : plugins) {
        auto logs = callPlugin([&] { return loaded.plugin->logs(); });
        if (!logs) {
            logEvent(fmt::format("adminhostd: the plug-in {} failed to name its log files: {}", loaded.name,
                                 textOf(logs.error().description)));
            continue;
        }
        for (LogFile& log : *logs) {
            all.push_back({loaded.name, std::move(log)});
        }
    }
    return all;
}

Dictionary described(const NamedLog& named) {
    Dictionary log{{"name", utf8Of(named.log.name)}, {"plugin", named.plugin}, {"path", utf8Of(named.log.path.text())}};
    const auto state = logFileState(named.log.path);
    if (!state) {
        log.set("problem", textOf(state.error().description));
    } else if (*state) {
        log.set("size", (*state)->size);
        log.set("inode", (*state)->inode);
    }
    return log;
}

Dictionary described(const NamedLog& named, LogPiece piece) {
    Dictionary answer{{"name", utf8Of(named.log.name)}, {"plugin", named.plugin}};
    answer.set("missing", piece.missing);
    answer.set("inode", piece.inode);
    answer.set("offset", piece.offset);
    answer.set("next", piece.next);
    answer.set("size", piece.size);
    answer.set("more", piece.more);
    answer.set("gap", piece.gap);
    answer.set("data", Data(piece.bytes.begin(), piece.bytes.end()));
    return answer;
}

}  // namespace

protocol::Answer logAnswer(const std::vector<LoadedPlugin>& plugins, const protocol::ReadLog& order) {
    const std::vector<NamedLog> logs = logsOf(plugins);
    if (order.name.empty()) {
        Array all;
        for (const NamedLog& named : logs) {
            all.emplace_back(described(named));
        }
        return written(protocol::Outcome::answered, Dictionary{{"logs", std::move(all)}}, order.form);
    }
    const auto found = std::find_if(logs.begin(), logs.end(), [&](const NamedLog& named) {
        return named.log.name == order.name && (order.plugin.empty() || named.plugin == order.plugin);
    });
    if (found == logs.end()) {
        std::string names;
        for (const NamedLog& named : logs) {
            names += (names.empty() ? "" : ", ") + utf8Of(named.log.name);
        }
        protocol::Answer answer;
        answer.outcome = protocol::Outcome::absent;
        answer.error = "UNKNOWN_LOG";
        answer.message = fmt::format("log not found: {}. Known logs: {}.", order.name, names.empty() ? "none" : names);
        return answer;
    }
    auto piece = readLogPiece(found->log.path, order.inode, order.offset);
    if (!piece) {
        return errorAnswer("LOG_NOT_READABLE", textOf(piece.error().description), order.form);
    }
    return written(protocol::Outcome::answered, described(*found, *std::move(piece)), order.form);
}

}  // namespace adminhost
