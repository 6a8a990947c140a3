// The keys of settings are in two places: in the code, by file, and in the descriptions that clients read.

#include "commands/CommandTable.h"
#include "handler/LumioRequestHandler.h"

#include <map>
#include <set>
#include <string>

#include <gtest/gtest.h>

namespace lumio {
namespace {

using adminhost::Dictionary;
using adminhost::Value;
using Keys = std::set<std::string>;

constexpr std::string_view prefix = "configuration.";

/// The described keys directly below the configuration, each with the file that its description names.
std::map<std::string, std::string> described(std::string_view command, std::string_view part) {
    std::map<std::string, std::string> keys;
    const Value all = describeCommands();
    for (const Value& one : *all.array()) {
        if (one.dictionary()->text("name") != command) {
            continue;
        }
        for (const Value& key : *one.dictionary()->get(part).array()) {
            const std::string path(key.dictionary()->text("path"));
            if (path.starts_with(prefix) && path.find_first_of(".[", prefix.size()) == std::string::npos) {
                keys[path.substr(prefix.size())] = key.dictionary()->text("file");
            }
        }
    }
    return keys;
}

Keys keysOf(const std::vector<std::string_view>& table) {
    return {table.begin(), table.end()};
}

TEST(DescribedSettings, EachFilesWrittenKeysAreThoseOfTheCode) {
    std::map<std::string, Keys> byFile;
    for (const auto& [key, file] : described("writeSettings", "keys")) {
        byFile[file].insert(key);
    }
    EXPECT_EQ(byFile["identity"], keysOf(LumioRequestHandler::identityPreferencesKeysToCopy()));
    EXPECT_EQ(byFile["member"], keysOf(LumioRequestHandler::memberPreferencesKeysToCopy()));
    Keys cluster = keysOf(LumioRequestHandler::clusterPreferencesKeysToCopy());
    cluster.insert("nimbo_client_password");
    EXPECT_EQ(byFile["cluster"], cluster);
    EXPECT_EQ(byFile[""], (Keys{"nimbo_controller_resolve_name", "workflows", "cameras", "properties"}));
}

TEST(DescribedSettings, ReadKeysAreThoseOfTheCodeAndWhatReadingDerives) {
    Keys expected{"default_shared_filesystem",
                  "nimbo_client_password_is_set",
                  "web_app_url",
                  "catalog_url",
                  "cameras",
                  "workflows",
                  "properties"};
    for (const auto& table :
         {LumioRequestHandler::identityPreferencesKeysToCopy(), LumioRequestHandler::memberPreferencesKeysToCopy(),
          LumioRequestHandler::clusterPreferencesKeysToCopy(), LumioRequestHandler::keysThatAreOnlyRead()}) {
        expected.insert(table.begin(), table.end());
    }
    Keys read;
    for (const auto& [key, file] : described("readSettings", "answer")) {
        read.insert(key);
    }
    EXPECT_EQ(read, expected);
}

}  // namespace
}  // namespace lumio
