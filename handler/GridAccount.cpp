#include "handler/DictionaryText.h"
#include "handler/LumioRequestHandler.h"
#include "platform/crypto/Crypt.h"
#include "platform/directory/Directory.h"
#include "platform/framework/Report.h"
#include "platform/log/Log.h"

#include <cstdlib>
#include <memory>
#include <string>
#include <utility>

namespace lumio {

using adminhost::Dictionary;
using adminhost::DirectoryAttributes;
using adminhost::DirectoryNode;
using adminhost::DirectoryQuery;
using adminhost::Error;
using adminhost::Response;
using adminhost::Result;

namespace directory = adminhost::directory;

namespace {

constexpr std::int64_t ownErrorCode = 1;
constexpr std::uint64_t firstUserId = 1025;
constexpr std::size_t mostOfOneId = 250;  ///< records that a query for a user id returns

/// The three texts that a request needs; all of them are there.
struct Order {
    std::string_view node;
    std::string_view username;
    std::string_view password;
};

/// What was created.
struct NewAccount {
    std::string name;
    std::string password;
};

Error ownError(std::string description) {
    return {"", ownErrorCode, std::move(description)};
}

/// The order, or the message for the first key that is missing. A value that is not a text counts as missing.
Result<Order> orderIn(const Dictionary& request) {
    Order order;
    for (const auto& [key, place] :
         {std::pair("directoryNode", &order.node), std::pair("directoryUsername", &order.username),
          std::pair("directoryPassword", &order.password)}) {
        if (request.get(key).string() == nullptr) {
            return adminhost::failure(ownError(std::string(key) + " is missing"));
        }
        *place = request.text(key);
    }
    return order;
}

/// The name of this server's account: always the same one, unless the library has no UUID of the server.
std::string accountName() {
    const Dictionary library = SettingsStore::libraryInformation().value_or(Dictionary());
    std::string uuid = textIn(library, "server_uuid").value_or("");
    if (uuid.empty()) {
        uuid = adminhost::makeUUIDString();
        adminhost::logEvent("adminhost_lumio: Sorvane Producer using uuid '" + uuid +
                            "' because the server_uuid could not be determined.");
    }
    return "sorvanenimbo_" + uuid;
}

DirectoryQuery usersWith(std::string_view attribute, std::string value, std::size_t maximum) {
    DirectoryQuery query;
    query.recordTypes = {std::string(directory::users)};
    query.attribute = attribute;
    query.values = {std::move(value)};
    query.attributes = {std::string(directory::recordName)};
    query.maximum = maximum;
    return query;
}

void reportAccount(const std::string& name, bool isThere) {
    adminhost::Change change;
    change.section = "accounts";
    change.identity = name;
    change.name = name;
    (isThere ? change.to : change.from) = name;
    adminhost::reportChange(std::move(change));
}

/// Removes an earlier account of the name, so that the new one is not mixed with it.
Result<void> removeAccount(DirectoryNode& node, const std::string& name) {
    const auto found = node.records(usersWith(directory::recordName, name, 1));
    if (!found) {
        return adminhost::failure(found.error());
    }
    if (found->empty()) {
        return {};
    }
    if (auto deleted = node.deleteRecord(directory::users, name); !deleted) {
        return deleted;
    }
    reportAccount(name, false);
    return {};
}

/// The first user id, from 1025, that no user record of the node has. An error that the server itself returned counts
/// as "not found". Errors of its own have negative codes in a back end: it does not know, and this fails.
Result<std::uint64_t> freeUserId(DirectoryNode& node) {
    for (std::uint64_t id = firstUserId;; ++id) {
        const auto found = node.records(usersWith(directory::uniqueID, std::to_string(id), mostOfOneId));
        if (!found && found.error().code < 0) {
            return adminhost::failure(found.error());
        }
        if (!found || found->empty()) {
            return id;
        }
    }
}

/// 20 printable characters from "!" to "}", none of them white space.
std::string randomPassword() {
    constexpr std::size_t length = 20;
    constexpr std::uint32_t first = '!';
    constexpr std::uint32_t count = '}' - '!' + 1;
    std::string password;
    password.reserve(length);
    while (password.size() < length) {
        password += static_cast<char>(::arc4random() % count + first);
    }
    return password;
}

/// Creates the record and sets its password, which is returned.
Result<std::string> createAccount(DirectoryNode& node, const std::string& name, std::uint64_t userId) {
    const DirectoryAttributes attributes{{std::string(directory::realName), {name}},
                                         {std::string(directory::homeDirectory), {"/var/empty"}},
                                         {std::string(directory::userShell), {"/bin/bash"}},
                                         {std::string(directory::uniqueID), {std::to_string(userId)}},
                                         {std::string(directory::primaryGroupID), {"20"}}};
    const auto created = node.createRecord(directory::users, name, attributes);
    if (!created) {
        return adminhost::failure(created.error());
    }
    reportAccount(name, true);
    if (!*created) {
        return adminhost::failure(ownError("unknown record creation error"));
    }
    std::string password = randomPassword();
    if (const auto set = node.setPassword(directory::users, name, password); !set) {
        adminhost::cleanse(password.data(), password.size());
        return adminhost::failure(set.error());
    }
    return password;
}

Result<NewAccount> carryOut(const Order& order) {
    const auto node = adminhost::DirectorySession::defaultSession().openNode(order.node);
    if (!node) {
        return adminhost::failure(node.error());
    }
    const auto authenticated = (*node)->authenticate(order.username, order.password);
    if (!authenticated) {
        return adminhost::failure(authenticated.error());
    }
    if (!*authenticated) {
        return adminhost::failure(ownError("unknown authentication error"));
    }
    std::string name = accountName();
    // Before the search for an id, so that the id of the earlier account counts as free.
    if (const auto removed = removeAccount(**node, name); !removed) {
        return adminhost::failure(removed.error());
    }
    const auto userId = freeUserId(**node);
    if (!userId) {
        return adminhost::failure(userId.error());
    }
    auto password = createAccount(**node, name, *userId);
    if (!password) {
        return adminhost::failure(password.error());
    }
    return NewAccount{std::move(name), *std::move(password)};
}

}  // namespace

Response LumioRequestHandler::createNimboAccountWithRequest(const Dictionary& request) {
    Dictionary answer{{"command", "createNimboAccount"}};
    const auto order = orderIn(request);
    auto account = order ? carryOut(*order) : Result<NewAccount>(adminhost::failure(order.error()));
    if (account) {
        answer.set("username", std::move(account->name));
        answer.set("password", std::move(account->password));
    } else {
        answer.set("errorCode", account.error().code);
        answer.set("error", account.error().description.value_or(""));
    }
    return answer;
}

}  // namespace lumio
