#include "handler/LumioRequestHandler.h"
#include "krb5/KRB5CredentialCache.h"
#include "krb5/KRB5Principal.h"
#include "platform/directory/Directory.h"
#include "platform/plist/PropertyList.h"
#include "platform/task/Task.h"

#include <memory>
#include <string>
#include <utility>

#include <sys/stat.h>
#include <unistd.h>

namespace lumio {

using adminhost::DiskPath;
using adminhost::HostPath;

namespace {

constexpr std::int32_t reachable = 0;
constexpr std::int32_t noPrincipal = 1;
constexpr std::int32_t noGrid = 2;
constexpr std::int32_t noTicketNeeded = 3;

/// The fields of a text, which a character separates. Empty ones are kept.
std::vector<std::string> fieldsOf(std::string_view text, char separator) {
    std::vector<std::string> fields;
    for (;;) {
        const std::size_t end = text.find(separator);
        fields.emplace_back(text.substr(0, end));
        if (end == std::string_view::npos) {
            return fields;
        }
        text.remove_prefix(end + 1);
    }
}

/// The principal in the first Kerberos authority of an account; later ones are never tried.
std::optional<std::string> principalIn(const std::vector<std::string>& authorities) {
    constexpr std::size_t kind = 1;
    constexpr std::size_t principal = 3;
    for (const std::string& authority : authorities) {
        std::vector<std::string> fields = fieldsOf(authority, ';');
        if (fields.size() > kind && fields[kind] == "Kerberosv5") {
            return fields.size() > principal ? std::optional(std::move(fields[principal])) : std::nullopt;
        }
    }
    return std::nullopt;
}

/// The cache file of one check. Nothing of it is left when the object ends.
class CacheFile {
  public:
    CacheFile() : _path(adminhost::diskPath(LumioRequestHandler::credentialCachePath())) {
        struct stat status {};
        // The library would open the file that a link names, and overwrite its bytes.
        if (::lstat(_path.c_str(), &status) == 0 && !S_ISREG(status.st_mode)) {
            remove();
        }
    }
    CacheFile(const CacheFile&) = delete;
    CacheFile& operator=(const CacheFile&) = delete;
    ~CacheFile() { remove(); }

    [[nodiscard]] const DiskPath& path() const noexcept { return _path; }

  private:
    /// A file that does not exist, or whose directory is missing, is what is wanted.
    void remove() const noexcept { static_cast<void>(::unlink(_path.c_str())); }

    DiskPath _path;
};

bool listsGrid(const std::string& output) {
    const auto list = adminhost::parsePropertyList(output);
    const adminhost::Dictionary* dictionary = list ? list->dictionary() : nullptr;
    const adminhost::Array* grids = dictionary == nullptr ? nullptr : dictionary->get("gridList").array();
    return grids != nullptr && !grids->empty();
}

}  // namespace

HostPath LumioRequestHandler::credentialCachePath() {
    return HostPath("/var/lumio/server/adminhostd_krb_cc");
}

std::optional<std::vector<std::string>> LumioRequestHandler::getAttribute(std::string_view attribute,
                                                                          const std::string& username) {
    adminhost::DirectoryQuery query;
    query.recordTypes = {std::string(adminhost::directory::users)};
    query.attribute = adminhost::directory::recordName;
    query.values = {username};
    query.attributes = {std::string(attribute)};
    query.maximum = 1;
    // Which error it was is deliberately not reported.
    const auto records = adminhost::searchDirectory(query);
    if (!records || records->empty() || records->front().values(attribute).empty()) {
        return std::nullopt;
    }
    return records->front().values(attribute);
}

std::int32_t LumioRequestHandler::checkNimboController(const std::string& controller, const std::string& username,
                                                       std::string_view password, std::string* error) {
    static const HostPath tool("/usr/bin/nimbo");
    if (error != nullptr) {
        error->clear();
    }
    const auto authorities = getAttribute(adminhost::directory::authenticationAuthority, username);
    const auto name = authorities ? principalIn(*authorities) : std::nullopt;
    if (!name) {
        return noPrincipal;
    }
    const CacheFile file;
    const auto principal = KRB5Principal::initWithString(*name);
    // A name that cannot be parsed, or a directory that is missing, gives no cache.
    const auto cache = principal ? KRB5CredentialCache::initWithName(file.path().text(), KRB5CredentialCacheFileType,
                                                                     principal.get(), principal->context())
                                 : nullptr;
    if (!cache || !cache->acquireInitialCredentialIfNecessaryWithPassword(password)) {
        if (cache) {
            cache->destroy();
        }
        return noTicketNeeded;
    }
    // Whether a ticket was acquired is deliberately not looked at: without one, the tool fails with a status of its
    // own, which becomes the result.
    std::string output;
    const std::int32_t status = adminhost::launch_task_with_input_and_environment(
        adminhost::diskPath(tool), {"-h", controller, "-auth", "Kerberos", "-f", "xml", "-grid", "list"}, std::nullopt,
        &output, error, {{"KRB5CCNAME", "FILE:" + file.path().text()}});
    cache->destroy();
    if (status != 0) {
        return status;
    }
    return listsGrid(output) ? reachable : noGrid;
}

}  // namespace lumio
