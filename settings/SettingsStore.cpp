#include "settings/SettingsStore.h"

#include "platform/files/File.h"
#include "platform/plist/PropertyList.h"
#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"

#include <cerrno>
#include <chrono>
#include <thread>

#include <unicode/uchar.h>
#include <unicode/utf8.h>

namespace lumio {

using adminhost::Dictionary;
using adminhost::HostPath;

namespace {

constexpr std::size_t locationFileMaximum = std::size_t{1} << 20U;
constexpr std::size_t rememberedMaximum = std::size_t{64} << 10U;

std::optional<Dictionary> load(const HostPath& path) {
    auto value = adminhost::readPropertyList(adminhost::diskPath(path));
    if (!value || value->dictionary() == nullptr) {
        return std::nullopt;
    }
    return std::move(*value->dictionary());
}

std::optional<Dictionary> loadOrCached(const HostPath& path, const HostPath& cached) {
    // An entry that exists but cannot be loaded does not fall back to the cached copy.
    return load(adminhost::exists(adminhost::diskPath(path)) ? path : cached);
}

std::optional<std::string> identityText(const std::optional<Dictionary>& identity, std::string_view key) {
    if (!identity || !identity->contains(key)) {
        return std::nullopt;
    }
    return textOf(identity->get(key));
}

std::string sharedFilesystemOf(const std::optional<Dictionary>& identity) {
    return identityText(identity, "shared_filesystem").value_or(std::string(SettingsStore::defaultSharedFilesystem));
}

bool separates(UChar32 character) noexcept {
    switch (character) {
        case '\t':
        case '\n':
        case '\v':
        case '\f':
        case '\r':
        case 0x85:    // next line
        case 0x2028:  // line separator
        case 0x2029:  // paragraph separator
            return true;
        default:
            return u_charType(character) == U_SPACE_SEPARATOR;
    }
}

/// Returns the tokens of a text one by one. Every separator ends a token, so two in a row give an empty one.
class Tokens {
  public:
    explicit Tokens(std::string_view text) noexcept : _text(text) {}

    std::optional<std::string_view> next() noexcept {
        if (_done) {
            return std::nullopt;
        }
        const std::size_t begin = _at;
        while (_at < _text.size()) {
            const std::size_t end = _at;
            UChar32 character = 0;
            U8_NEXT(_text.data(), _at, _text.size(), character);
            if (separates(character)) {
                return _text.substr(begin, end - begin);
            }
        }
        _done = true;
        return _text.substr(begin);
    }

  private:
    std::string_view _text;
    std::size_t _at = 0;
    bool _done = false;
};

/// The database value of the production section. Only the words count; indentation and nesting are ignored.
std::optional<std::string_view> productionDatabase(std::string_view text) {
    Tokens tokens(text);
    bool inProduction = false;
    while (const std::optional<std::string_view> token = tokens.next()) {
        if (!inProduction) {
            inProduction = *token == "production:";
        } else if (*token == "development:") {
            return std::nullopt;
        } else if (*token == "database:") {
            return tokens.next();
        }
    }
    return std::nullopt;
}

}  // namespace

std::string SettingsStore::sharedFilesystemPath() {
    // Each request asks several times, to find the database. The file is read each time, but parsed only if its content
    // is another one than the last time.
    struct LastRead {
        std::string bytes;
        std::string path;
    };
    thread_local std::optional<LastRead> last;
    auto bytes = adminhost::readFile(adminhost::diskPath(identityPreferencesPath()), adminhost::plistMaximumSize);
    if (!bytes) {
        return sharedFilesystemOf(std::nullopt);
    }
    if (last && last->bytes == *bytes) {
        return last->path;
    }
    const auto value = adminhost::parsePropertyList(*bytes);
    const Dictionary* identity = value ? value->dictionary() : nullptr;
    std::string path = sharedFilesystemOf(identity == nullptr ? std::nullopt : std::optional(*identity));
    last = bytes->size() > rememberedMaximum ? std::nullopt : std::optional(LastRead{*std::move(bytes), path});
    return path;
}

std::optional<std::string> SettingsStore::memberUUID() {
    return identityText(identityPreferences(), "member_uuid");
}

HostPath SettingsStore::identityPreferencesPath() {
    return HostPath("/Library/Preferences/com.brenn.lumioserverd.plist");
}

HostPath SettingsStore::libraryInformationPath() {
    return HostPath(sharedFilesystemPath() + "/lumioserverd.plist");
}

HostPath SettingsStore::memberPreferencesPath() {
    return memberPreferencesPath(identityPreferences());
}

HostPath SettingsStore::memberPreferencesPath(const std::optional<Dictionary>& identity) {
    // Without a member UUID the name holds "(null)", and no such file is normally found.
    return HostPath(sharedFilesystemOf(identity) + "/Server/member_preferences_" +
                    adminhost::textOf(identityText(identity, "member_uuid")) + ".plist");
}

HostPath SettingsStore::clusterPreferencesPath() {
    return clusterPreferencesPath(identityPreferences());
}

HostPath SettingsStore::clusterPreferencesPath(const std::optional<Dictionary>& identity) {
    return HostPath(sharedFilesystemOf(identity) + "/Server/cluster_preferences.plist");
}

HostPath SettingsStore::cachedMemberPreferencesPath() {
    return HostPath(std::string(stateDirectory) + "/cached_member_preferences.plist");
}

HostPath SettingsStore::cachedClusterPreferencesPath() {
    return HostPath(std::string(stateDirectory) + "/cached_cluster_preferences.plist");
}

adminhost::Result<std::optional<Dictionary>> SettingsStore::stored(const HostPath& path) {
    auto value = adminhost::readPropertyList(adminhost::diskPath(path));
    if (value && value->dictionary() != nullptr) {
        return std::move(*value->dictionary());
    }
    if (value) {
        return adminhost::failure({"posix", EINVAL, "cannot read " + path.text() + ": not a dictionary"});
    }
    const adminhost::Error& error = value.error();
    if (error.domain == "posix" && (error.code == ENOENT || error.code == ENOTDIR)) {
        return std::nullopt;
    }
    return adminhost::failure(std::move(value.error()));
}

adminhost::Result<std::optional<Dictionary>> SettingsStore::storedIdentity() {
    constexpr int looks = 3;
    auto identity = stored(identityPreferencesPath());
    for (int look = 1; !identity && look < looks; ++look) {
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        identity = stored(identityPreferencesPath());
    }
    return identity;
}

std::optional<Dictionary> SettingsStore::identityPreferences() {
    return load(identityPreferencesPath());
}

std::optional<Dictionary> SettingsStore::libraryInformation() {
    return load(libraryInformationPath());
}

std::optional<Dictionary> SettingsStore::memberPreferences() {
    return loadOrCached(memberPreferencesPath(), cachedMemberPreferencesPath());
}

std::optional<Dictionary> SettingsStore::clusterPreferences() {
    return loadOrCached(clusterPreferencesPath(), cachedClusterPreferencesPath());
}

HostPath SettingsStore::dbPath() {
    const HostPath location(std::string(stateDirectory).append("/database.yml"));
    const auto text = adminhost::readFile(adminhost::diskPath(location), locationFileMaximum);
    if (text && adminhost::isUtf8(*text)) {
        std::string_view value = productionDatabase(*text).value_or("");
        if (value.size() > 1 && value.front() == '"' && value.back() == '"') {
            value = value.substr(1, value.size() - 2);
        }
        if (!value.empty()) {
            return HostPath(std::string(value));
        }
    }
    return HostPath(sharedFilesystemPath() + "/Server/db.sqlite3");
}

bool SettingsStore::dbPathExists() {
    return adminhost::exists(adminhost::diskPath(dbPath()));
}

}  // namespace lumio
