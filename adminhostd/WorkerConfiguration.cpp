#include "adminhostd/WorkerConfiguration.h"

#include "adminhostd/FrontRights.h"
#include "adminhostd/Login.h"
#include "adminhostd/ToolConfiguration.h"
#include "platform/framework/BuildNote.h"
#include "platform/release/Release.h"
#include "platform/text/EnvironmentLanguages.h"

#include <cstdint>
#include <stdexcept>
#include <vector>

#include <unistd.h>

namespace adminhost {
namespace {

std::vector<std::string> textsOf(const Array& list) {
    std::vector<std::string> texts;
    for (const Value& value : list) {
        if (value.string() != nullptr) {
            texts.push_back(*value.string());
        }
    }
    return texts;
}

uid_t accountOfFront(const Options& options) {
    try {
        const auto account = frontAccount(options);
        return account ? account->user : ::geteuid();
    } catch (const std::runtime_error&) {
        return noLogin;  // nobody's: the front reports that the account does not exist, and does not start
    }
}

}  // namespace

protocol::Configure workerConfiguration(const Options& options, const PluginSelection& plugins,
                                        const std::string& toolConfiguration) {
    protocol::Configure configuration;
    configuration.build = ADMINHOST_RELEASE ", " ADMINHOST_BUILD_IDENTITY;
    configuration.root = options.root;
    for (const DiskPath& file : plugins.files) {
        configuration.plugins.push_back(file.text());
    }
    configuration.refused = plugins.refused;
    configuration.languages = options.languages ? textsOf(*options.languages) : languagesOfEnvironment();
    configuration.accountUuids = options.accountUuids;
    configuration.serviceManager = options.serviceManager;
    configuration.directory = options.directory.nodes;
    configuration.directoryMilliseconds = static_cast<std::uint64_t>(options.directory.budget.count());
    // The worker must not learn this from the front, which could have it show what another account has written.
    configuration.frontAccount = accountOfFront(options);
    configuration.toolEnvironment = {{toolConfigurationVariable, toolConfiguration}};
    return configuration;
}

}  // namespace adminhost
