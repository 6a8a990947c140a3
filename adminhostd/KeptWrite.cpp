#include "adminhostd/KeptWrite.h"

#include "adminhostd/PluginCall.h"
#include "platform/framework/Report.h"
#include "platform/log/Log.h"
#include "platform/value/ValueText.h"

#include <utility>

namespace adminhost {
namespace {

void reportNoEntry(const Error& error) {
    logEvent("adminhostd: the settings before this write could not be kept: " + textOf(error));
    reportNotDone({"", "the write has no entry in the history", textOf(error.description)});
}

Result<Dictionary> settingsOf(const LoadedPlugin& loaded) {
    return callPlugin([&] { return loaded.plugin->settings(); });
}

}  // namespace

Result<SettingsHistory> historyOf(const LoadedPlugin& loaded) {
    auto settings = callPlugin([&] { return loaded.plugin->settingKeys(); });
    return settings ? Result<SettingsHistory>(SettingsHistory(loaded.name, *std::move(settings)))
                    : failure(settings.error());
}

void KeptWrite::begin() {
    const auto history = historyOf(_loaded);
    const auto files = callPlugin([&] { return _loaded.plugin->settingsFiles(); });
    const auto settings = settingsOf(_loaded);
    if (!history || !files || !settings) {
        reportNoEntry(!history ? history.error() : !files ? files.error() : settings.error());
        return;
    }
    const auto entry = history->keep(*files, *settings, _about);
    if (!entry) {
        reportNoEntry(entry.error());
        return;
    }
    _entry = *entry;
}

void KeptWrite::complete(const ReportedChanges& changes) const {
    if (!_entry && changes.kept.empty()) {
        return;
    }
    const auto history = historyOf(_loaded);
    if (!history) {
        reportNoEntry(history.error());
        return;
    }
    if (const auto error = history->keepResources(changes.kept, _about, changes.droppedOfResources)) {
        logEvent("adminhostd: the history of this write is incomplete: " + textOf(*error));
        reportNotDone({"", "the history of this write is incomplete", textOf(error->description)});
    }
    if (!_entry) {
        return;
    }
    const auto settings = settingsOf(_loaded);
    const auto error = settings ? history->complete(*_entry, *settings) : settings.error();
    if (error) {
        logEvent("adminhostd: what this write changed could not be added to its entry of the history: " +
                 textOf(*error));
    }
}

}  // namespace adminhost
