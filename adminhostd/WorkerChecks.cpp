#include "adminhostd/WorkerChecks.h"

#include "adminhostd/PluginCall.h"
#include "platform/directory/Directory.h"
#include "platform/directory/DirectoryRequest.h"
#include "platform/dnssd/AvahiDaemon.h"
#include "platform/files/Path.h"
#include "platform/service/ServiceState.h"
#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <string>
#include <utility>

namespace adminhost {
namespace {

using Health = Diagnosis::Health;

constexpr auto avahiBound = std::chrono::seconds(2);
constexpr auto directoryBound = std::chrono::seconds(10);  ///< for all nodes together
constexpr std::size_t comparedNames = 200;                 ///< people of a node that are looked up in the others

Diagnosis avahiCheck() {
    if (const auto problem = avahiProblem(avahiBound)) {
        return {Health::warning, "local names", "Names on the local network cannot be looked up: " + *problem + ".",
                "start the Avahi daemon if names that end in .local are used (systemctl enable --now avahi-daemon)"};
    }
    return {Health::ok, "local names", "Names on the local network can be looked up: the Avahi daemon replies.", ""};
}

/// Any unit will do: only the manager's reply counts.
Diagnosis serviceManagerCheck() {
    if (serviceManager() == ServiceManager::pidFile) {
        return {Health::ok, "service manager", "Whether the service is running is read from its pid file.", ""};
    }
    if (const auto state = serviceIsRunning(HostPath("adminhostd.plist")); !state) {
        return {
            Health::failure, "service manager",
            "systemd does not reply: " + textOf(state.error().description) + ". The service is taken to be stopped.",
            "start the system bus (systemctl start dbus), or set service_manager to \"pidfile\" in the "
            "configuration where no systemd runs"};
    }
    return {Health::ok, "service manager", "systemd replies on the system bus.", ""};
}

/// The short names of people in a node: those of them that are among the names, or the first ones if there are none.
Result<std::vector<std::string>> peopleIn(const DirectoryNodeSource& source, std::vector<std::string> names) {
    auto node = source.open();
    if (!node) {
        return failure(node.error());
    }
    DirectoryQuery query;
    query.recordTypes = {std::string(directory::users)};
    query.attribute = directory::recordName;
    query.match = names.empty() ? DirectoryQuery::Match::beginsWith : DirectoryQuery::Match::equal;
    query.values = names.empty() ? std::vector<std::string>{""} : std::move(names);
    query.attributes = {std::string(directory::recordName)};
    query.maximum = comparedNames;
    const auto records = (*node)->records(query);
    if (!records) {
        return failure(records.error());
    }
    std::vector<std::string> found;
    for (const DirectoryRecord& record : *records) {
        if (const std::string* name = record.first(directory::recordName)) {
            found.push_back(*name);
        }
    }
    return found;
}

/// People of one name in two nodes: only the first node's person is found by name.
Diagnosis samePeopleCheck(const std::vector<DirectoryNodeSource>& nodes) {
    std::string same;
    for (std::size_t i = 0; i < nodes.size(); ++i) {
        const auto names = peopleIn(nodes[i], {});
        for (std::size_t j = i + 1; names && !names->empty() && j < nodes.size(); ++j) {
            const auto again = peopleIn(nodes[j], *names);
            for (const std::string& name : again ? *again : std::vector<std::string>()) {
                same += (same.empty() ? "" : ", ") + name + " (" + nodes[i].name + " and " + nodes[j].name + ")";
            }
        }
    }
    if (!same.empty()) {
        return {Health::warning, "people in two directory nodes",
                "These people are in two nodes: " + same + ". By name, the first node's person is found.",
                "rename or remove one of the two"};
    }
    return {Health::ok, "people in two directory nodes", "No person was found in two nodes.", ""};
}

std::vector<Diagnosis> directoryChecks() {
    const DirectoryRequestScope request(directoryBound);
    const std::vector<DirectoryNodeSource>& nodes = DirectorySession::defaultSession().nodes();
    const std::vector<UnreachableNode> unreachable = unreachableDirectoryNodes();
    std::vector<Diagnosis> checks;
    std::vector<DirectoryNodeSource> reachable;
    for (const DirectoryNodeSource& node : nodes) {
        const auto found = std::find_if(unreachable.begin(), unreachable.end(),
                                        [&](const UnreachableNode& one) { return one.name == node.name; });
        if (found == unreachable.end()) {
            reachable.push_back(node);
            checks.push_back({Health::ok, "directory " + node.name, "The node replies.", ""});
        } else {
            checks.push_back(
                {Health::failure, "directory " + node.name,
                 "The node cannot be used: " + utf8Of(found->reason) + ". People and groups cannot be found.",
                 "check the server and the node's entry in the daemon's configuration"});
        }
    }
    if (reachable.size() > 1) {
        checks.push_back(samePeopleCheck(reachable));
    }
    return checks;
}

}  // namespace

std::vector<Diagnosis> workerChecks() {
    std::vector<Diagnosis> checks{serviceManagerCheck(), avahiCheck()};
    for (Diagnosis& check : directoryChecks()) {
        checks.push_back(std::move(check));
    }
    return checks;
}

std::vector<Diagnosis> checksOf(const LoadedPlugin& loaded) {
    auto checks = callPlugin([&] { return loaded.plugin->diagnose(); });
    if (!checks) {
        return {{Diagnosis::Health::failure, loaded.name,
                 "The plug-in failed while it checked the installation: " + textOf(checks.error().description),
                 "see the daemon's log, and report it to the plug-in's maker"}};
    }
    for (Diagnosis& check : *checks) {
        check = {check.health, loaded.name + '/' + utf8Of(check.name), utf8Of(check.found), utf8Of(check.fix)};
    }
    return *std::move(checks);
}
}  // namespace adminhost
