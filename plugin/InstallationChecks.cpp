#include "plugin/InstallationChecks.h"

#include "krb5/KRB5Context.h"
#include "platform/crypto/Certificate.h"
#include "platform/crypto/Crypt.h"
#include "platform/files/File.h"
#include "platform/files/FileSystem.h"
#include "platform/task/Task.h"
#include "platform/task/TaskBounds.h"
#include "platform/text/IsoDate.h"
#include "platform/value/ValueText.h"
#include "resources/Property.h"
#include "settings/DatabaseAccess.h"
#include "settings/DatabaseTool.h"
#include "settings/SettingsStore.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <optional>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>

#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace lumio {

using adminhost::Diagnosis;
using adminhost::Dictionary;
using adminhost::HostPath;
using adminhost::textOf;
using Health = Diagnosis::Health;

namespace {

constexpr auto toolTime = std::chrono::seconds(2);
constexpr auto renewalTime = std::chrono::days(30);
constexpr std::uint64_t mebibyte = std::uint64_t{1} << 20U;
constexpr std::uint64_t littleSpace = 5120 * mebibyte;
constexpr std::uint64_t noSpace = 256 * mebibyte;
constexpr std::size_t pemMaximum = mebibyte;

Diagnosis ok(std::string name, std::string found) {
    return {Health::ok, std::move(name), std::move(found), ""};
}
Diagnosis warning(std::string name, std::string found, std::string fix) {
    return {Health::warning, std::move(name), std::move(found), std::move(fix)};
}
Diagnosis failed(std::string name, std::string found, std::string fix) {
    return {Health::failure, std::move(name), std::move(found), std::move(fix)};
}

std::string errorText(int number) {
    return std::generic_category().message(number);
}

/// The attributes of a file, or the system's error number. Links are followed.
struct FileFacts {
    struct stat status {};
    int error = 0;
};
FileFacts factsOf(const HostPath& path) {
    FileFacts facts;
    if (::stat(adminhost::diskPath(path).c_str(), &facts.status) != 0) {
        facts.error = errno;
    }
    return facts;
}

/// Only root, and the daemon's own account, can have put something else in the file's place.
bool isTrusted(const struct stat& status) {
    return (status.st_uid == 0 || status.st_uid == ::geteuid()) && (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

std::string ownerAndMode(const struct stat& status) {
    return fmt::format("it belongs to the user id {}, mode {:04o}", status.st_uid, status.st_mode & 07777U);
}

/// A tool of the service. It is not run.
Diagnosis toolCheck(const char* text, const char* package) {
    const HostPath path{std::string(text)};
    const std::string name = "tool " + path.text();
    const FileFacts facts = factsOf(path);
    if (facts.error != 0) {
        return failed(name, path.text() + ": " + errorText(facts.error) + '.',
                      fmt::format("install the package {}", package));
    }
    if (!S_ISREG(facts.status.st_mode) || (facts.status.st_mode & S_IXUSR) == 0) {
        return failed(name, path.text() + " is not an executable file.",
                      fmt::format("install the package {} again", package));
    }
    if (!isTrusted(facts.status)) {
        return failed(name, fmt::format("Others than root can change {}: {}.", path.text(), ownerAndMode(facts.status)),
                      fmt::format("chown root {0} && chmod go-w {0}", path.text()));
    }
    return ok(name, path.text() + " is executable and only root can change it.");
}

Diagnosis databaseToolCheck() {
    const std::string name = "database tool";
    const auto deadline = adminhost::taskDeadline();
    adminhost::setTaskDeadline(std::min(deadline, std::chrono::steady_clock::now() + toolTime));
    const adminhost::Probe probe = DatabaseTool().tryTool();
    adminhost::setTaskDeadline(deadline);
    if (probe.state == adminhost::Probe::State::usable) {
        return ok(name, "The database tool prints rows in the form that is read, and accepts double-quoted text.");
    }
    return {probe.state == adminhost::Probe::State::unknown ? Health::warning : Health::failure, name,
            probe.reason + '.', probe.fix};
}

Diagnosis startFileCheck() {
    const std::string name = "database tool's start file";
    if (const auto problem = DatabaseTool().startFileProblem()) {
        return failed(name, problem->reason + '.', problem->fix);
    }
    return ok(name, "The tool reads no .sqliterc of its account.");
}

Diagnosis databaseCheck() {
    const std::string name = "database";
    const HostPath database = SettingsStore::dbPath();
    if (!SettingsStore::dbPathExists()) {
        return warning(name, database.text() + " does not exist.", "start the service once, which creates it");
    }
    const auto access = DatabaseAccess::of(database);
    if (!access) {
        return failed(name, "The database tool does not run: " + access.error().reason + '.', access.error().fix);
    }
    const auto confinement = access->confine(adminhost::diskPath(HostPath("/usr/bin/sqlite3")));
    return ok(name, fmt::format("{} exists. The database tool runs as the user id {}, {}.", database.text(),
                                access->account() ? access->account()->user : ::geteuid(),
                                confinement && *confinement ? "confined to the database's directory"
                                                            : "not confined to the database's directory"));
}

Diagnosis directoryCheck(const std::string& name, const HostPath& path, const char* fix) {
    const FileFacts facts = factsOf(path);
    if (facts.error == ENOENT) {
        return warning(name, path.text() + " does not exist.", fix);
    }
    if (facts.error != 0 || !S_ISDIR(facts.status.st_mode)) {
        return failed(name, path.text() + ": " + errorText(facts.error != 0 ? facts.error : ENOTDIR) + '.', fix);
    }
    if (!isTrusted(facts.status)) {
        return warning(
            name, fmt::format("Others than root can create files in {}: {}.", path.text(), ownerAndMode(facts.status)),
            fmt::format("chown root {0} && chmod go-w {0}, unless the service needs it so", path.text()));
    }
    return ok(name, fmt::format("{} exists; {}.", path.text(), ownerAndMode(facts.status)));
}

Diagnosis settingsFileCheck(const std::string& name, const HostPath& path, const char* fixOfMissing) {
    const auto stored = SettingsStore::stored(path);
    if (!stored) {
        return failed(name, textOf(stored.error().description) + '.', "restore the file, or write the settings again");
    }
    if (!*stored) {
        return warning(name, path.text() + " does not exist.", fixOfMissing);
    }
    return ok(name, path.text() + " can be read.");
}

Diagnosis keyFileCheck(const std::string& sharedFilesystem) {
    const std::string name = "key file";
    const HostPath path(sharedFilesystem + "/Server/Secrets/kek.plist");
    const FileFacts facts = factsOf(path);
    if (facts.error != 0) {
        return failed(name, path.text() + ": " + errorText(facts.error) + ". Protected values cannot be used.",
                      "start the service once, which creates the file, or restore it");
    }
    if (!Property::encryptValue("a text")) {
        return failed(name, path.text() + " does not hold a usable key. Protected values cannot be used.",
                      "restore the file from a backup");
    }
    if ((facts.status.st_mode & (S_IRWXG | S_IRWXO)) != 0) {
        return warning(name, fmt::format("Others can read the key in {}: {}.", path.text(), ownerAndMode(facts.status)),
                       "chmod 600 " + path.text());
    }
    return ok(name, path.text() + " holds a usable key that only its owner can read.");
}

std::string dayOf(adminhost::Date date) {
    return adminhost::isoTextOf(date).substr(0, std::string_view("2026-01-31").size());
}

/// The certificate that the service shows to browsers.
Diagnosis certificateCheck(const Dictionary& member) {
    const std::string name = "certificate";
    const std::string file{member.text("ssl_certificate_file")};
    const std::string keyFile{member.text("ssl_certificate_key_file")};
    const std::string host{member.text("server_host")};
    if (file.empty() && keyFile.empty()) {
        return ok(name, "No certificate is set.");
    }
    if (file.empty() || keyFile.empty()) {
        return failed(name, "Only one of certificate and key is set.",
                      "set both ssl_certificate_file and ssl_certificate_key_file");
    }
    const HostPath keyPath(keyFile);
    const auto certificate = adminhost::readFile(adminhost::diskPath(HostPath(file)), pemMaximum);
    auto key = adminhost::readFile(adminhost::diskPath(keyPath), pemMaximum);
    if (!certificate || !key) {
        return failed(name, textOf((!certificate ? certificate : key).error().description) + '.',
                      "install the file, or correct the setting");
    }
    const adminhost::ScopedCleanse<std::string> wiped(*key);
    const auto facts = adminhost::examineCertificate(*certificate, *key, host);
    if (!facts) {
        return failed(name, fmt::format("{}, {}: {}.", file, keyFile, textOf(facts.error().description)),
                      "install a certificate and its key in PEM form, without a passphrase");
    }
    if (!facts->belongsToKey) {
        return failed(name, fmt::format("{} does not belong to the key in {}.", file, keyFile),
                      "install the certificate and the key that were issued together");
    }
    const auto now = std::chrono::floor<std::chrono::seconds>(std::chrono::system_clock::now());
    if (facts->notAfter <= now || facts->notBefore > now) {
        return failed(name,
                      fmt::format("{} is valid from {} to {}, so not today.", file, dayOf(facts->notBefore),
                                  dayOf(facts->notAfter)),
                      "renew the certificate, or correct the clock");
    }
    if (!host.empty() && !facts->fitsHost) {
        return failed(name, fmt::format("{} is not for the host name {}.", file, host),
                      "request a certificate for this host name, or correct server_host");
    }
    if (facts->notAfter - now < renewalTime) {
        return warning(name, fmt::format("{} ends on {}.", file, dayOf(facts->notAfter)), "renew the certificate");
    }
    if (const FileFacts attributes = factsOf(keyPath); (attributes.status.st_mode & S_IRWXO) != 0) {
        return warning(name,
                       fmt::format("Others can read the key in {}: {}.", keyFile, ownerAndMode(attributes.status)),
                       "chmod o= " + keyFile);
    }
    return ok(name, fmt::format("{} is valid until {}, fits the host name and belongs to the key.", file,
                                dayOf(facts->notAfter)));
}

Diagnosis realmCheck() {
    const std::string name = "Kerberos realm";
    const auto context = KRB5Context::context();
    if (!context || context->nativeContext() == nullptr) {
        return failed(name,
                      "The Kerberos configuration cannot be read" +
                          (context ? ": " + context->errorMessage() : std::string()) + '.',
                      "correct /etc/krb5.conf");
    }
    if (const auto realm = context->defaultRealm()) {
        return ok(name, "The default realm is " + *realm + '.');
    }
    return warning(name, "There is no default Kerberos realm. The grid controller cannot be checked without one.",
                   "set default_realm in /etc/krb5.conf if the service uses a grid");
}

Diagnosis freeSpaceCheck(const HostPath& path) {
    const std::string name = "free space";
    const auto free = adminhost::freeSpaceOf(adminhost::diskPath(path));
    if (!free) {
        return failed(name, "The shared file system " + path.text() + " cannot be examined.",
                      "mount the shared file system, or correct shared_filesystem");
    }
    const std::string found = fmt::format("{} MB are free on the shared file system.", *free / mebibyte);
    return *free < noSpace       ? failed(name, found, "remove recordings, or enlarge the file system")
           : *free < littleSpace ? warning(name, found, "remove recordings, or enlarge the file system")
                                 : ok(name, found);
}

}  // namespace

std::vector<Diagnosis> installationChecks() {
    constexpr const char* service = "of the service";
    std::vector<Diagnosis> checks;
    for (const char* tool : {"/usr/sbin/lumioctl", "/usr/bin/lumioconfig", "/usr/bin/nimbo",
                             "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_preferences",
                             "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_library"}) {
        checks.push_back(toolCheck(tool, service));
    }
    checks.push_back(toolCheck("/usr/bin/sqlite3", "sqlite3"));
    checks.push_back(databaseToolCheck());
    checks.push_back(startFileCheck());
    checks.push_back(realmCheck());
    checks.push_back(directoryCheck("state directory", HostPath(std::string(SettingsStore::stateDirectory)),
                                    "start the service once, which creates it"));
    checks.push_back(directoryCheck("log directory", HostPath("/Library/Logs/lumioserverd"),
                                    "start the service once, which creates it"));
    checks.push_back(settingsFileCheck("identity preferences", SettingsStore::identityPreferencesPath(),
                                       "set the service up (adminhostctl settings set)"));
    const HostPath shared(SettingsStore::sharedFilesystemPath());
    checks.push_back(
        directoryCheck("shared file system", shared, "mount the shared file system, or correct shared_filesystem"));
    checks.push_back(freeSpaceCheck(shared));
    checks.push_back(settingsFileCheck("cluster preferences", SettingsStore::clusterPreferencesPath(),
                                       "write the settings, or mount the shared file system"));
    checks.push_back(settingsFileCheck("member preferences", SettingsStore::memberPreferencesPath(),
                                       "write the settings, or mount the shared file system"));
    checks.push_back(settingsFileCheck("library information", SettingsStore::libraryInformationPath(),
                                       "start the service once, which creates it"));
    checks.push_back(keyFileCheck(shared.text()));
    checks.push_back(certificateCheck(SettingsStore::memberPreferences().value_or(Dictionary())));
    checks.push_back(databaseCheck());
    return checks;
}

}  // namespace lumio
