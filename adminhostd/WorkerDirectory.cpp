#include "adminhostd/WorkerDirectory.h"

#include "platform/directory/DirectoryRequest.h"
#include "platform/directory/Entries.h"
#include "platform/directory/LdapNode.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <cstdlib>
#include <iterator>
#include <utility>

#include <fmt/format.h>

namespace adminhost {
namespace {

/// Where a key of the node is in the configuration; the node's own place if the key is not set.
std::string placeOf(const DirectoryNodeOptions& node, const std::string& key) {
    const auto found = node.places.find(key);
    const auto own = node.places.find("");
    return found != node.places.end() ? found->second : own != node.places.end() ? own->second : std::string();
}

DirectoryNodeSource failingNode(std::string name, Error error) {
    return {std::move(name), [error = std::move(error)]() -> OpenedDirectoryNode { return failure(error); }};
}

}  // namespace

std::vector<std::string> configureDirectory(const protocol::Configure& configuration) {
    const std::optional<HostPath> uuids =
        configuration.accountUuids.empty() ? std::nullopt : std::optional(HostPath(configuration.accountUuids));
    if (configuration.directory.empty()) {
        setDirectoryNodes({localAccounts(uuids)});
        return {};
    }
    std::vector<std::string> problems;
    std::vector<DirectoryNodeSource> nodes;
    const char* credentials = std::getenv("CREDENTIALS_DIRECTORY");
    for (const DirectoryNodeOptions& node : configuration.directory) {
        LdapNodeSettings settings = node.settings;
        if (node.local) {
            nodes.push_back(localAccounts(uuids, settings.kerberosRealm, settings.name));
            continue;
        }
        if (credentials != nullptr) {
            settings.credentialsDirectory = DiskPath(credentials);
        }
        if (const auto checked = checkLdapNodeSettings(settings); !checked) {
            // The description begins with the key.
            const std::string problem = checked.error().description.value_or("the settings cannot be used");
            problems.push_back(fmt::format("{}: the directory node \"{}\" cannot be used: {}",
                                           placeOf(node, problem.substr(0, problem.find_first_of(" :"))), settings.name,
                                           problem));
            nodes.push_back(failingNode(settings.name, checked.error()));
            continue;
        }
        nodes.push_back(ldapNode(std::move(settings)));
    }
    setDirectoryNodes(std::move(nodes));
    return problems;
}

std::vector<std::string> unreachableNodes() {
    std::vector<std::string> texts;
    for (const UnreachableNode& node : unreachableDirectoryNodes(std::chrono::seconds(5))) {
        texts.push_back(fmt::format("the directory node \"{}\" cannot be reached: {}", node.name, node.reason));
    }
    return texts;
}

Result<Array> accountsFor(const protocol::FindAccounts& order) {
    constexpr std::size_t limit = 50;
    if (order.is.empty()) {
        return directoryEntries(order.match, limit);
    }
    Result<Array> entries = directoryEntriesOf(order.is);
    for (std::size_t i = 0; entries && i < entries->size(); ++i) {
        Dictionary& person = *(*entries)[i].dictionary();
        if (person.text("type") != "user") {
            continue;
        }
        const auto all = directoryGroupsOf(person.text(person.contains("guid") ? "guid" : "shortName"));
        if (!all && all.error().domain == directory::errorDomain && all.error().code == directory::notSupported) {
            continue;  // the node knows no groups of people
        }
        if (!all) {
            return failure(all.error());
        }
        // Another node may have somebody with the same name or UUID, and groups of its own.
        Array groups;
        std::copy_if(all->begin(), all->end(), std::back_inserter(groups),
                     [&](const Value& group) { return group.dictionary()->get("node") == person.get("node"); });
        person.set("groups", std::move(groups));
    }
    return entries;
}

std::optional<std::chrono::milliseconds> directoryBudget(const Command* command, std::chrono::milliseconds configured) {
    return command != nullptr && command->access == Access::account ? std::nullopt : std::optional(configured);
}

}  // namespace adminhost
