#include "adminhostd/SettingsHistory.h"

#include "platform/files/CreateMissing.h"
#include "platform/files/File.h"
#include "platform/plist/PropertyList.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <filesystem>
#include <fstream>
#include <string>

#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view aboutName = "about.plist";
constexpr std::string_view unfinished = "unfinished-";

HostPath below(const HostPath& directory, std::string_view name) {
    return HostPath(directory.text() + '/' + std::string(name));
}

/// The numbers of the entries, in order. What else lies in the directory is none.
std::vector<std::uint64_t> numbersIn(const HostPath& directory) {
    std::vector<std::uint64_t> numbers;
    std::error_code error;
    for (fs::directory_iterator at(diskPath(directory).text(), error), end; !error && at != end; at.increment(error)) {
        const std::string name = at->path().filename();
        std::uint64_t number = 0;
        const auto [rest, failure] = std::from_chars(name.data(), name.data() + name.size(), number);
        if (failure == std::errc() && rest == name.data() + name.size()) {
            numbers.push_back(number);
        }
    }
    std::sort(numbers.begin(), numbers.end());
    return numbers;
}

void removeAll(const HostPath& path) {
    std::error_code ignored;
    fs::remove_all(diskPath(path).text(), ignored);
}

Error failure(const char* step, const std::error_code& code) {
    return Error{"posix", code.value(), std::string(step) + ": " + code.message()};
}

/// Writes a file of a new entry. It is not flushed: an entry that a power cut spoils is left out when it is read, and
/// no administrator waits for the disk.
std::optional<Error> writePlainly(std::string_view bytes, const HostPath& path) {
    std::ofstream file(diskPath(path).text(), std::ios::binary);
    file << bytes;
    file.close();
    if (!file) {
        return failure("cannot write the entry", std::error_code(errno, std::generic_category()));
    }
    return std::nullopt;
}

/// Copies the files and writes what is known about the entry.
std::optional<Error> fill(const HostPath& entry, const std::vector<HostPath>& files, Dictionary about) {
    Array kept;
    for (std::size_t i = 0; i < files.size(); ++i) {
        if (!exists(diskPath(files[i]))) {
            continue;
        }
        Error error;
        const auto bytes = readFile(diskPath(files[i]), plistMaximumSize, &error);
        if (!bytes) {
            // What nobody can read is kept by whoever replaces it; the other files still have their entry.
            continue;
        }
        const std::string name = std::to_string(i) + ".plist";
        if (auto failed = writePlainly(*bytes, below(entry, name))) {
            return failed;
        }
        kept.emplace_back(Dictionary{{"path", files[i].text()}, {"name", name}});
    }
    about.set("files", std::move(kept));
    Error error;
    const auto text = xmlPropertyList(about, &error);
    return text ? writePlainly(*text, below(entry, aboutName)) : error;
}

}  // namespace

HostPath historyDirectory(std::string_view plugin) {
    return HostPath("/var/lib/adminhostd/history/" + std::string(plugin));
}

std::optional<Error> keepHistory(const HostPath& directory, const std::vector<HostPath>& files,
                                 const Dictionary& about) {
    const OwnerAndMode mine{::geteuid(), ::getegid(), 0700};
    if (auto error = createDirectories(diskPath(directory), mine)) {
        return error;
    }
    removeUnfinishedHistory(directory);
    std::vector<std::uint64_t> numbers = numbersIn(directory);
    const std::uint64_t number = numbers.empty() ? 1 : numbers.back() + 1;
    const HostPath making = below(directory, std::string(unfinished) + std::to_string(number));
    if (auto failed = createDirectories(diskPath(making), mine)) {
        return failed;
    }
    std::optional<Error> failed = fill(making, files, about);
    if (!failed) {
        std::error_code error;
        fs::rename(diskPath(making).text(), diskPath(below(directory, fmt::format("{:08}", number))).text(), error);
        if (error) {
            failed = failure("cannot name the entry", error);
        }
    }
    if (failed) {
        removeAll(making);
        return failed;
    }
    numbers.push_back(number);
    for (std::size_t i = 0; i + historyMaximum < numbers.size(); ++i) {
        removeAll(below(directory, fmt::format("{:08}", numbers[i])));
    }
    return std::nullopt;
}

void removeUnfinishedHistory(const HostPath& directory) {
    std::error_code error;
    for (fs::directory_iterator at(diskPath(directory).text(), error), end; !error && at != end; at.increment(error)) {
        const std::string name = at->path().filename();
        if (name.starts_with(unfinished)) {
            removeAll(below(directory, name));
        }
    }
}

Array readHistory(const HostPath& directory, const std::vector<std::string>& keys,
                  const std::vector<std::string>& secrets) {
    Array entries;
    for (const std::uint64_t number : numbersIn(directory)) {
        const HostPath entry = below(directory, fmt::format("{:08}", number));
        const auto about = readPropertyList(diskPath(below(entry, aboutName)));
        if (!about || about->dictionary() == nullptr) {
            continue;
        }
        Dictionary settings;
        // Entries of earlier releases have only the files.
        const Dictionary* values = about->dictionary()->get("settings").dictionary();
        for (const std::string& key : keys) {
            if (const Value* value = values == nullptr ? nullptr : values->find(key)) {
                settings.set(key, *value);
            }
        }
        const Array* files = values != nullptr ? nullptr : about->dictionary()->get("files").array();
        for (std::size_t i = 0; files != nullptr && i < files->size(); ++i) {
            const Dictionary* file = (*files)[i].dictionary();
            const std::string* name = file == nullptr ? nullptr : file->get("name").string();
            const auto content = name == nullptr ? std::nullopt : readPropertyList(diskPath(below(entry, *name)));
            if (!content || content->dictionary() == nullptr) {
                continue;
            }
            for (const std::string& key : keys) {
                if (const Value* value = content->dictionary()->find(key)) {
                    const bool secret = std::find(secrets.begin(), secrets.end(), key) != secrets.end();
                    settings.set(key, secret ? Value("(secret)") : *value);
                }
            }
        }
        Dictionary shown = *about->dictionary();
        shown.remove("files");
        shown.set("number", number);
        shown.set("settings", std::move(settings));
        entries.emplace_back(std::move(shown));
    }
    return entries;
}

}  // namespace adminhost
