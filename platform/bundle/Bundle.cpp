#include "platform/bundle/Bundle.h"

#include "platform/bundle/Language.h"
#include "platform/files/File.h"

#include <algorithm>
#include <filesystem>
#include <system_error>

namespace adminhost {
namespace {

namespace fs = std::filesystem;

/// More entries than any bundle has, so that a directory that others fill cannot delay a request for long.
constexpr std::size_t maximumEntries = 4096;

/// Drops the error: texts are shown without their translation if a table cannot be read.
std::optional<Dictionary> valueOf(Result<Dictionary> table) {
    return table ? std::optional(std::move(*table)) : std::nullopt;
}

bool isDirectory(const fs::path& path) {
    std::error_code error;
    return fs::is_directory(path, error);
}

}  // namespace

const std::vector<Bundle::Localization>& Bundle::listed() const {
    if (_localizations) {
        return *_localizations;
    }
    std::vector<Localization> all;
    const fs::path directory = diskPath(_path).text();
    for (const fs::path& place : {directory / "Contents/Resources", directory / "Resources", directory}) {
        std::error_code error;
        std::size_t seen = 0;
        for (fs::directory_iterator entry(place, error), end; !error && entry != end && seen < maximumEntries;
             entry.increment(error), ++seen) {
            std::error_code failed;
            std::string name = entry->path().stem().string();
            DiskPath path(entry->path().string());
            if (isLanguage(name) && entry->is_directory(failed) && isBelowSystemRoot(path)) {
                all.push_back({std::move(name), std::move(path)});
            }
        }
    }
    std::stable_sort(all.begin(), all.end(),
                     [](const Localization& a, const Localization& b) { return a.name < b.name; });
    return _localizations.emplace(std::move(all));
}

std::optional<Bundle> Bundle::open(const HostPath& path) {
    if (path.text().empty() || !isDirectory(diskPath(path).text())) {
        return std::nullopt;
    }
    return Bundle(path);
}

std::vector<std::string> Bundle::localizations() const {
    std::vector<std::string> names;
    for (const Localization& localization : listed()) {
        if (names.empty() || names.back() != localization.name) {
            names.push_back(localization.name);
        }
    }
    return names;
}

std::optional<DiskPath> Bundle::stringsTable(std::string_view table, std::string_view localization) const {
    for (const Localization& candidate : listed()) {
        if (candidate.name == localization) {
            DiskPath path(candidate.directory.text() + "/" + std::string(table) + ".strings");
            if (isBelowSystemRoot(path)) {
                return path;
            }
        }
    }
    return std::nullopt;
}

Result<Dictionary> readStringsTable(const DiskPath& path) {
    return readFile(path, stringsTableMaximumSize).and_then([](const std::string& bytes) {
        return parseStringsTable(bytes);
    });
}

std::optional<Dictionary> localizedTable(const Bundle& bundle, std::string_view table,
                                         const std::vector<std::string>& preferredLanguages) {
    const std::vector<std::string> localizations = bundle.localizations();
    for (const std::string& localization : matchingLocalizations(localizations, preferredLanguages)) {
        if (const auto path = bundle.stringsTable(table, localization)) {
            return valueOf(readStringsTable(*path));
        }
    }
    for (const std::string& localization : equivalentLocalizations(localizations, "English")) {
        if (const auto path = bundle.stringsTable(table, localization)) {
            return valueOf(readStringsTable(*path));
        }
    }
    return std::nullopt;
}

}  // namespace adminhost
