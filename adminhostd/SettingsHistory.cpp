#include "adminhostd/SettingsHistory.h"

#include "adminhostd/HistoryFiles.h"
#include "platform/crypto/Digest.h"
#include "platform/files/File.h"
#include "platform/files/ReplaceFile.h"
#include "platform/log/Log.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <string>

#include <fmt/format.h>
#include <sys/random.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view aboutName = "about.plist";
constexpr std::string_view unfinished = "unfinished-";
constexpr std::string_view hidden = "(secret)";
constexpr std::string_view hiddenChange = "(secret) changed";

std::int64_t formatOf(const Dictionary& about) {
    return about.get("format").integer().value_or(std::int64_t{1});
}

void logNewer(std::size_t count) {
    if (count > 0) {
        logEvent(fmt::format(
            "adminhostd: {} entries of the history were written by a newer release; they are not shown", count));
    }
}

const Dictionary& dictionaryAt(const Dictionary& from, std::string_view key) {
    static const Dictionary empty;
    const Dictionary* found = from.get(key).dictionary();
    return found == nullptr ? empty : *found;
}

/// The change of each setting between two snapshots.
Array changesBetween(const Dictionary& before, const Dictionary& after, const std::vector<Setting>& settings) {
    Array changes;
    for (const Setting& setting : settings) {
        const std::string_view part = setting.secret ? "digests" : "settings";
        const Value& from = dictionaryAt(before, part).get(setting.key);
        const Value& to = dictionaryAt(after, part).get(setting.key);
        if (from == to) {
            continue;
        }
        Dictionary change{{"key", setting.key}};
        if (setting.secret) {
            change.set("secret", true);
        }
        if (!from.isNull()) {
            change.set("from", setting.secret ? Value(hidden) : from);
        }
        if (!to.isNull()) {
            change.set("to", setting.secret ? Value(hiddenChange) : to);
        }
        changes.emplace_back(std::move(change));
    }
    return changes;
}

/// The name of the copy of the settings file with this index.
std::string copyName(std::size_t file) {
    return std::to_string(file) + ".plist";
}

/// Copies the files that exist and can be read.
std::optional<Error> copy(const std::vector<HostPath>& files, const HostPath& entry, Array& kept) {
    for (std::size_t i = 0; i < files.size(); ++i) {
        if (!exists(diskPath(files[i]))) {
            continue;
        }
        const auto bytes = readFile(diskPath(files[i]), plistMaximumSize);
        if (!bytes) {
            // The operation that replaces an unreadable file keeps it; the entry has the other files.
            continue;
        }
        const std::string name = copyName(i);
        if (auto error = writePlainly(*bytes, below(entry, name))) {
            return error;
        }
        kept.emplace_back(Dictionary{{"path", files[i].text()}, {"name", name}});
    }
    return std::nullopt;
}

/// An entry's description, if the entry is complete. Nothing but the format is known of one of a newer release.
std::optional<Dictionary> wholeEntry(const HostPath& entry) {
    auto about = readDictionary(below(entry, aboutName));
    if (about && formatOf(*about) > SettingsHistory::format) {
        return about;
    }
    const Array* files = about ? about->get("files").array() : nullptr;
    for (std::size_t i = 0; files != nullptr && i < files->size(); ++i) {
        const Dictionary* file = (*files)[i].dictionary();
        const std::string* name = file == nullptr ? nullptr : file->get("name").string();
        if (name == nullptr || !exists(diskPath(below(entry, *name)))) {
            return std::nullopt;
        }
    }
    return about;
}

/// The settings of an entry of the first format, which had them only in the files. Each file contributes only the
/// settings that it stores: the same key in another file is not managed, and must not be restored as the setting.
Dictionary settingsOfFiles(const HostPath& entry, const Dictionary& about, const std::vector<Setting>& settings) {
    Dictionary values;
    const Array* files = about.get("files").array();
    for (std::size_t i = 0; files != nullptr && i < files->size(); ++i) {
        const std::string& name = *(*files)[i].dictionary()->get("name").string();
        const auto content = readDictionary(below(entry, name));
        for (const Setting& setting : settings) {
            if (content && name == copyName(setting.file) && content->contains(setting.key)) {
                values.set(setting.key, setting.secret ? Value(hidden) : content->get(setting.key));
            }
        }
    }
    return values;
}

Dictionary dictionaryOf(const Change& change) {
    Dictionary kept{
        {"section", change.section}, {"identity", change.identity}, {"name", change.name}, {"key", change.key}};
    for (const auto& [key, value] : {std::pair{"from", &change.from}, {"to", &change.to}, {"undo", &change.undo}}) {
        if (!value->isNull()) {
            kept.set(key, *value);
        }
    }
    kept.set("secret", change.secret);
    if (change.unverified) {
        kept.set("unverified", true);
    }
    return kept;
}

}  // namespace

SettingsHistory::SettingsHistory(std::string_view plugin, std::vector<Setting> settings)
    : _directory(historyDirectoryOf(plugin)), _resources(resourcesOf(_directory)), _settings(std::move(settings)) {}

Result<std::string> SettingsHistory::digestKey() const {
    constexpr std::size_t size = 32;
    const HostPath file = below(_directory, "digest.key");
    if (auto key = readFile(diskPath(file), size); key && key->size() == size) {
        return *std::move(key);
    }
    std::string key(size, '\0');
    if (::getrandom(key.data(), key.size(), 0) != static_cast<ssize_t>(size)) {
        return failure(stepFailed("no random bytes", std::error_code(errno, std::generic_category())));
    }
    if (auto written = replaceFile(key, file, 0600); !written) {
        return failure(std::move(written.error()));
    }
    return key;
}

Result<Dictionary> SettingsHistory::snapshotOf(const Dictionary& values) const {
    Dictionary settings;
    Dictionary digests;
    for (const Setting& setting : _settings) {
        const Value* value = values.find(setting.key);
        if (value == nullptr) {
            continue;
        }
        settings.set(setting.key, setting.secret ? Value(hidden) : *value);
        if (setting.secret) {
            const auto key = digestKey();
            if (!key) {
                return failure(key.error());
            }
            digests.set(setting.key, keyedDigestOf(*key, textOf(*value)));
        }
    }
    return Dictionary{{"settings", std::move(settings)}, {"digests", std::move(digests)}};
}

Result<std::uint64_t> SettingsHistory::add(const std::vector<HostPath>& files, Dictionary about) const {
    std::vector<std::uint64_t> numbers = numbersIn(_directory);
    const std::uint64_t number = nextAfter(numbers);
    const HostPath making = below(_directory, std::string(unfinished) + std::to_string(number));
    if (auto created = createDirectories(diskPath(making), historyOwner()); !created) {
        return failure(std::move(created.error()));
    }
    Array kept;
    std::optional<Error> error = copy(files, making, kept);
    about.set("format", format);
    about.set("files", std::move(kept));
    if (!error) {
        error = writePlainly(about, below(making, aboutName));
    }
    if (!error) {
        std::error_code code;
        fs::rename(diskPath(making).text(), diskPath(entryOf(_directory, number)).text(), code);
        if (code) {
            error = stepFailed("cannot name the entry", code);
        }
    }
    if (error) {
        removeAll(making);
        return failure(*std::move(error));
    }
    numbers.push_back(number);
    for (std::size_t i = 0; i + settingsMaximum < numbers.size(); ++i) {
        removeAll(entryOf(_directory, numbers[i]));
    }
    return number;
}

std::optional<Error> SettingsHistory::keepOutsideEdit(const Dictionary& snapshot, const Dictionary& about) const {
    const std::vector<std::uint64_t> numbers = numbersIn(_directory);
    const auto last =
        numbers.empty() ? std::nullopt : readDictionary(below(entryOf(_directory, numbers.back()), aboutName));
    if (!last || formatOf(*last) != format || last->get("after").dictionary() == nullptr) {
        return std::nullopt;
    }
    const Dictionary& after = dictionaryAt(*last, "after");
    Array changes = changesBetween(after, snapshot, _settings);
    if (changes.empty()) {
        return std::nullopt;
    }
    Dictionary edit{{"when", about.get("when")}, {"who", "outside the daemon"}, {"outside", true}};
    edit.set("settings", after.get("settings"));
    edit.set("digests", after.get("digests"));
    edit.set("after", snapshot);
    edit.set("changes", std::move(changes));
    const auto added = add({}, std::move(edit));
    return added ? std::nullopt : std::optional(added.error());
}

Result<std::uint64_t> SettingsHistory::keep(const std::vector<HostPath>& files, const Dictionary& values,
                                            const Dictionary& about) const {
    if (auto created = createDirectories(diskPath(_directory), historyOwner()); !created) {
        return failure(std::move(created.error()));
    }
    removeUnfinished();
    const auto snapshot = snapshotOf(values);
    if (!snapshot) {
        return failure(snapshot.error());
    }
    if (auto error = keepOutsideEdit(*snapshot, about)) {
        return failure(*std::move(error));
    }
    Dictionary entry = about;
    for (const DictionaryEntry& part : *snapshot) {
        entry.set(part.key, part.value);
    }
    return add(files, std::move(entry));
}

std::optional<Error> SettingsHistory::complete(std::uint64_t number, const Dictionary& values) const {
    const HostPath file = below(entryOf(_directory, number), aboutName);
    auto about = readDictionary(file);
    auto snapshot = snapshotOf(values);
    if (!about || !snapshot) {
        return snapshot ? stepFailed("the entry cannot be read", std::make_error_code(std::errc::io_error))
                        : snapshot.error();
    }
    Array changes = changesBetween(*about, *snapshot, _settings);
    if (changes.empty()) {
        removeAll(entryOf(_directory, number));
        return std::nullopt;
    }
    about->set("changes", std::move(changes));
    about->set("after", *std::move(snapshot));
    return replacePlainly(*about, file);
}

std::optional<Error> SettingsHistory::hideFormerValues(const std::vector<SecretPart>& secret) const {
    std::optional<Error> failed;
    for (const std::uint64_t number : secret.empty() ? std::vector<std::uint64_t>() : numbersIn(_resources)) {
        const HostPath file = resourceEntryOf(_resources, number);
        auto entry = readDictionary(file);
        Value* list = entry ? entry->find("changes") : nullptr;
        if (list == nullptr || list->array() == nullptr || !hideIn(*list->array(), secret)) {
            continue;
        }
        if (auto error = replacePlainly(*entry, file)) {
            error->description = "the former values of a secret stay in the history: " + textOf(error->description);
            failed = std::move(error);
        }
    }
    return failed;
}

std::optional<Error> SettingsHistory::keepResources(const std::vector<Change>& changes, const Dictionary& about,
                                                    std::uint64_t dropped) const {
    std::vector<SecretPart> secret;
    Array kept;
    for (const Change& change : changes) {
        if (change.secret && !change.identity.empty()) {
            secret.push_back({change.section, change.identity, change.key});
        }
        if (change.section != "settings") {
            kept.emplace_back(dictionaryOf(change));
        }
    }
    std::optional<Error> notHidden = hideFormerValues(secret);
    if (kept.empty() && dropped == 0) {
        return notHidden;
    }
    // The same request may have set a plain value first.
    static_cast<void>(hideIn(kept, secret));
    for (const HostPath& directory : {_directory, _resources}) {
        if (auto created = createDirectories(diskPath(directory), historyOwner()); !created) {
            return std::move(created.error());
        }
    }
    std::vector<std::uint64_t> numbers = numbersIn(_resources);
    const std::uint64_t number = nextAfter(numbers);
    Dictionary entry = about;
    entry.set("format", format);
    entry.set("changes", std::move(kept));
    if (dropped > 0) {
        entry.set("changesDropped", dropped);
    }
    if (auto error = replacePlainly(entry, resourceEntryOf(_resources, number))) {
        return notHidden ? notHidden : error;
    }
    numbers.push_back(number);
    for (std::size_t i = 0; i + resourcesMaximum < numbers.size(); ++i) {
        removeAll(resourceEntryOf(_resources, numbers[i]));
    }
    return notHidden;
}

Array SettingsHistory::settingsEntries() const {
    Array entries;
    std::size_t newer = 0;
    for (const std::uint64_t number : numbersIn(_directory)) {
        const HostPath entry = entryOf(_directory, number);
        auto about = wholeEntry(entry);
        if (!about || formatOf(*about) > format) {
            newer += about ? 1U : 0U;
            continue;
        }
        Dictionary settings;
        if (formatOf(*about) == 1 && about->get("settings").dictionary() == nullptr) {
            settings = settingsOfFiles(entry, *about, _settings);
        } else {
            for (const Setting& setting : _settings) {
                if (const Value* value = dictionaryAt(*about, "settings").find(setting.key)) {
                    settings.set(setting.key, *value);
                }
            }
        }
        for (const std::string_view key : {"files", "format", "digests", "after", "settings"}) {
            about->remove(key);
        }
        about->set("number", number);
        about->set("settings", std::move(settings));
        entries.emplace_back(*std::move(about));
    }
    logNewer(newer);
    return entries;
}

Array SettingsHistory::resourceEntries() const {
    Array entries;
    std::size_t newer = 0;
    for (const std::uint64_t number : numbersIn(_resources)) {
        auto entry = readDictionary(resourceEntryOf(_resources, number));
        if (!entry || formatOf(*entry) > format) {
            newer += entry ? 1U : 0U;
            continue;
        }
        entry->remove("format");
        entry->set("number", number);
        entries.emplace_back(*std::move(entry));
    }
    logNewer(newer);
    return entries;
}

void SettingsHistory::removeUnfinished() const {
    std::error_code error;
    for (fs::directory_iterator at(diskPath(_directory).text(), error), end; !error && at != end; at.increment(error)) {
        const std::string name = at->path().filename();
        if (name.starts_with(unfinished)) {
            removeAll(below(_directory, name));
        }
    }
}

}  // namespace adminhost
