#include "adminhostd/HistoryFiles.h"

#include "platform/files/File.h"
#include "platform/files/FileDescriptor.h"
#include "platform/plist/PropertyList.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <filesystem>
#include <string>

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;

bool isAbout(const Dictionary& kept, const SecretPart& part) {
    return kept.get("section") == Value(part.section) && kept.get("identity") == Value(part.identity) &&
           kept.get("key") == Value(part.key);
}

}  // namespace

HostPath below(const HostPath& directory, std::string_view name) {
    return HostPath(directory.text() + '/' + std::string(name));
}

HostPath historyDirectoryOf(std::string_view plugin) {
    return HostPath("/var/lib/adminhostd/history/" + std::string(plugin));
}

HostPath resourcesOf(const HostPath& directory) {
    return below(directory, "resources");
}

HostPath entryOf(const HostPath& directory, std::uint64_t number) {
    return below(directory, fmt::format("{:08}", number));
}

HostPath resourceEntryOf(const HostPath& directory, std::uint64_t number) {
    return below(directory, fmt::format("{:08}.plist", number));
}

OwnerAndMode historyOwner() {
    return {::geteuid(), ::getegid(), 0700};
}

std::vector<std::uint64_t> numbersIn(const HostPath& directory) {
    std::vector<std::uint64_t> numbers;
    std::error_code error;
    for (fs::directory_iterator at(diskPath(directory).text(), error), end; !error && at != end; at.increment(error)) {
        const std::string name = at->path().filename();
        std::uint64_t number = 0;
        const auto [rest, failure] = std::from_chars(name.data(), name.data() + name.size(), number);
        const std::string_view behind(rest, static_cast<std::size_t>(name.data() + name.size() - rest));
        if (failure == std::errc() && (behind.empty() || behind == ".plist")) {
            numbers.push_back(number);
        }
    }
    std::sort(numbers.begin(), numbers.end());
    return numbers;
}

std::uint64_t nextAfter(const std::vector<std::uint64_t>& numbers) {
    return numbers.empty() ? 1 : numbers.back() + 1;
}

void removeAll(const HostPath& path) {
    std::error_code ignored;
    fs::remove_all(diskPath(path).text(), ignored);
}

Error stepFailed(const char* step, const std::error_code& code) {
    return Error{"posix", code.value(), std::string(step) + ": " + code.message()};
}

std::optional<Error> writePlainly(std::string_view bytes, const HostPath& path) {
    const auto failed = [] {
        return stepFailed("cannot write the entry", std::error_code(errno, std::generic_category()));
    };
    // The mode keeps a copy of the directory private too.
    FileDescriptor file(::open(diskPath(path).text().c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_NOFOLLOW | O_CLOEXEC,
                               S_IRUSR | S_IWUSR));
    if (!file.isOpen() || ::fchmod(file.get(), S_IRUSR | S_IWUSR) != 0) {
        return failed();
    }
    while (!bytes.empty()) {
        const ssize_t written = ::write(file.get(), bytes.data(), bytes.size());
        if (written < 0 && errno != EINTR) {
            return failed();
        }
        bytes.remove_prefix(written < 0 ? 0 : static_cast<std::size_t>(written));
    }
    if (const int number = file.close(); number != 0) {
        return stepFailed("cannot write the entry", std::error_code(number, std::generic_category()));
    }
    return std::nullopt;
}

std::optional<Error> writePlainly(const Dictionary& dictionary, const HostPath& path) {
    const auto text = xmlPropertyList(dictionary);
    return text ? writePlainly(*text, path) : text.error();
}

std::optional<Error> replacePlainly(const Dictionary& dictionary, const HostPath& path) {
    const HostPath fresh(path.text() + ".new");
    if (auto error = writePlainly(dictionary, fresh)) {
        return error;
    }
    std::error_code error;
    fs::rename(diskPath(fresh).text(), diskPath(path).text(), error);
    return error ? std::optional(stepFailed("cannot replace the entry", error)) : std::nullopt;
}

std::optional<Dictionary> readDictionary(const HostPath& path) {
    auto value = readPropertyList(diskPath(path));
    return value && value->dictionary() != nullptr ? std::optional(std::move(*value->dictionary())) : std::nullopt;
}

bool hideIn(Array& changes, const std::vector<SecretPart>& secret) {
    bool hid = false;
    for (Value& change : changes) {
        Dictionary* kept = change.dictionary();
        if (kept == nullptr || kept->get("secret") == Value(true) ||
            std::none_of(secret.begin(), secret.end(), [&](const SecretPart& part) { return isAbout(*kept, part); })) {
            continue;
        }
        for (const std::string_view key : {"from", "to"}) {
            if (kept->contains(key)) {
                kept->set(key, "(secret)");
            }
        }
        kept->remove("undo");
        kept->set("secret", true);
        hid = true;
    }
    return hid;
}

}  // namespace adminhost
