#include "handler/DictionaryText.h"
#include "handler/LumioRequestHandler.h"
#include "platform/crypto/Crypt.h"
#include "platform/directory/Directory.h"
#include "platform/files/FileSystem.h"
#include "platform/files/NewFile.h"
#include "platform/log/Log.h"

#include <charconv>
#include <limits>
#include <string>

namespace lumio {

using adminhost::Dictionary;
using adminhost::HostPath;
using adminhost::Response;

namespace {

constexpr std::string_view touchFile = "/__adminhost_lumio_touch_file";
constexpr std::string_view touchFileContent = "This file should not be sticking around.\n";

enum CheckedStep : std::uint32_t { usable = 0, notADirectory = 1, notCreated = 2, ownerNotSet = 3, notRemoved = 4 };

/// The user id of an account, as the directory has it. A name of digits only is a name too.
std::optional<uid_t> userIdOf(const std::string& name) {
    const auto ids = LumioRequestHandler::getAttribute(adminhost::directory::uniqueID, name);
    if (!ids || ids->empty()) {
        return std::nullopt;
    }
    const std::string& text = ids->front();
    uid_t id = 0;
    const auto [end, status] = std::from_chars(text.data(), text.data() + text.size(), id);
    const bool isWhole = status == std::errc() && end == text.data() + text.size();
    // The largest number is not an id: it means "unchanged" to the system.
    return isWhole && id != std::numeric_limits<uid_t>::max() ? std::optional(id) : std::nullopt;
}

/// The words for an outcome other than usable.
void describe(std::uint32_t outcome, const std::optional<std::string>& owner, Dictionary& answer) {
    constexpr std::string_view errorKey = "shared_filesystem_error";
    constexpr std::string_view detailKey = "shared_filesystem_error_detail";
    if (outcome == notADirectory) {
        answer.set(errorKey, "kFilesystemNotExistsError");
        return;
    }
    answer.set(errorKey, "kFilesystemNotWriteableError");
    if (outcome == notCreated) {
        answer.set(detailKey, "Could not create a test file.");
    } else if (outcome == ownerNotSet) {
        answer.set(detailKey,
                   "Able to create a test file as root. Can't change owner to " + owner.value_or(std::string()));
    } else if (outcome == notRemoved) {
        // Speaks of the owner also if there was none to set. That is deliberate.
        answer.set(detailKey, "Able to create a test file and set file owner. Can't delete the test file.");
    }
}

}  // namespace

std::uint32_t LumioRequestHandler::validateSharedFilesystem(const std::string& path,
                                                            const std::optional<std::string>& owner) {
    if (!adminhost::isDirectory(adminhost::diskPath(HostPath(path)))) {
        return notADirectory;
    }
    const HostPath place(path + std::string(touchFile));
    auto file = adminhost::NewFile::create(adminhost::diskPath(place), touchFileContent);
    if (!file) {
        return notCreated;
    }
    if (owner) {
        const std::optional<uid_t> id = userIdOf(*owner);
        if (!id || file->setOwner(*id)) {
            static_cast<void>(file->remove());  // the owner is what is reported
            return ownerNotSet;
        }
    }
    return file->remove() ? notRemoved : usable;
}

Response LumioRequestHandler::validateSettingsWithRequest(const Dictionary& request) {
    const auto path = textIn(request, "shared_filesystem");
    const auto username = textIn(request, "nimbo_client_username");
    const auto controller = textIn(request, "nimbo_controller");
    const std::string_view password = request.text("nimbo_client_password");

    Dictionary answer{{"command", "validateSettings"}};
    if (path) {
        const std::uint32_t outcome = validateSharedFilesystem(*path, username);
        if (outcome != usable) {
            adminhost::logEvent("adminhost_lumio: validateSharedFilesystem result: " + std::to_string(outcome));
            describe(outcome, username, answer);
        }
    }
    const bool complete = username && !username->empty() && controller && !controller->empty() && !password.empty();
    if (complete && checkNimboController(*controller, *username, password, nullptr) != 0) {
        answer.set("nimbo_controller_error", "kNimboControllerCheckFailedError");
    }
    return answer;
}

}  // namespace lumio
