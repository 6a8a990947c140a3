#include "handler/SettingsReports.h"

#include "platform/framework/Report.h"

#include <utility>

namespace lumio {

using adminhost::Dictionary;
using adminhost::Value;

namespace {

constexpr std::string_view section = "settings";

Value undoTo(std::string_view key, const Value& value) {
    Dictionary undo;
    undo.set(key, value);
    return undo;
}

}  // namespace

void reportSettingChanges(const SettingKeys& keys, const Dictionary& before, const Dictionary& after) {
    for (const std::string_view key : keys) {
        const Value& from = before.get(key);
        const Value& to = after.get(key);
        if (from == to) {
            continue;
        }
        adminhost::Change change;
        change.section = section;
        change.key = key;
        change.from = from;
        change.to = to;
        if (!from.isNull()) {  // no request removes a setting
            change.undo = undoTo(key, from);
        }
        adminhost::reportChange(std::move(change));
    }
}

void reportSecretChange(std::string_view key, const Dictionary& before, const Dictionary& after) {
    if (before.get(key) == after.get(key)) {
        return;
    }
    adminhost::Change change;
    change.section = section;
    change.key = key;
    change.secret = true;
    if (!before.contains(key)) {
        change.undo = undoTo(key, "");  // an empty text removes the stored one
    }
    adminhost::reportChange(std::move(change));
}

void reportSettingNotDone(std::string_view key, std::string reason, std::string words) {
    std::string path = "configuration";
    if (!key.empty()) {
        path.append(".").append(key);
    }
    adminhost::reportNotDone({std::move(path), std::move(reason), std::move(words)});
}

void reportSettingsNotDone(const SettingKeys& keys, const Dictionary& config, const std::string& reason,
                           const std::string& words) {
    for (const std::string_view key : keys) {
        if (config.contains(key)) {
            reportSettingNotDone(key, reason, words);
        }
    }
}

}  // namespace lumio
