#pragma once

// The service's state files, settings, database and tools, and asking for its state.

#include "handler/LumioRequestHandler.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/service/ServiceState.h"
#include "resources/Property.h"
#include "tests/support/CapturedReports.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace lumio {

class StateTest : public testing::Test {
  protected:
    using Dictionary = adminhost::Dictionary;
    using Value = adminhost::Value;

    static constexpr std::string_view identityFile = "/Library/Preferences/com.brenn.lumioserverd.plist";
    static constexpr std::string_view clusterFile = "/shared/Server/cluster_preferences.plist";
    static constexpr std::string_view statusFile = "/var/lumio/server/.lumioserverd_startup_status.plist";
    static constexpr std::string_view pidFile = "/var/run/lumioserverd.pid";
    static constexpr std::string_view marker = "/var/lumio/server/.lumio_setup_done";
    static constexpr std::string_view database = "/shared/Server/db.sqlite3";
    static constexpr std::string_view controlTool = "/usr/sbin/lumioctl";
    static constexpr std::string_view gridTool = "/usr/bin/nimbo";
    static constexpr const char* password = "planted-grid-secret";

    void SetUp() override {
        adminhost::setServiceManager(adminhost::ServiceManager::pidFile);
        adminhost::setDirectoryNodes({adminhost::localAccounts()});
        std::filesystem::create_directories(root.path("/var/lumio/server"));
        root.write("/etc/passwd", "grid:x:" + std::to_string(::geteuid()) + ":20::/var/empty:/bin/sh\n");
        root.write("/etc/group", "wheel:x:" + std::to_string(::getegid()) + ":\n");
        record(controlTool, 0);
        record(gridTool, 9);
    }
    void TearDown() override {
        adminhost::setDirectoryNodes({adminhost::localAccounts()});
        EXPECT_FALSE(log.contains(password));
    }

    /// A tool that records its name and arguments in /calls and ends with the status.
    void record(std::string_view tool, int status) const {
        root.writeTool(tool, "#!/bin/sh\necho " + std::string(tool) + " \"$@\" >> " + root.path("/calls").string() +
                                 "\nexit " + std::to_string(status) + "\n");
    }
    [[nodiscard]] std::string calls() const { return root.read("/calls"); }

    /// The service is running: this process takes its place.
    void run() const { root.write(pidFile, std::to_string(::getpid()) + "\n"); }
    void startupStatus(const std::string& element) const {
        root.writePropertyList(statusFile, "<key>error</key>" + element);
    }
    void identity(std::optional<std::string_view> path = "/shared") const {
        root.writePropertyList(identityFile,
                               path ? "<key>shared_filesystem</key><string>" + std::string(*path) + "</string>" : "");
        std::filesystem::create_directories(root.path("/shared/Server"));
    }
    /// The cluster preferences; the password is stored in its protected form.
    void cluster(std::optional<std::string_view> controller, std::optional<std::string_view> username,
                 std::optional<std::string_view> plainPassword) const {
        std::string content;
        const auto add = [&](std::string_view key, const std::optional<std::string_view>& value) {
            if (value) {
                content += "<key>" + std::string(key) + "</key><string>" + std::string(*value) + "</string>";
            }
        };
        add("nimbo_controller", controller);
        add("nimbo_client_username", username);
        if (plainPassword) {
            root.writePropertyList("/shared/Server/Secrets/kek.plist",
                                   "<key>lumio_secret</key><string>AAECAwQFBgcICQoLDA0ODw==</string>");
            const auto stored = Property::encryptValue(std::string(*plainPassword));
            ASSERT_TRUE(stored);
            add("nimbo_client_password", *stored);
        }
        root.writePropertyList(clusterFile, content);
    }
    void makeDatabase() const {
        root.sql(
            database,
            "create table cameras(id integer primary key,recording_status,disabled);"
            "create table jobs(id integer primary key,nimbo_job_id,nimbo_job_status);"
            "insert into cameras(recording_status,disabled) values('offline','f'),('capturing','f'),('paused','f'),"
            "('idle',null),('capturing','t');"
            "insert into jobs(nimbo_job_id,nimbo_job_status) values('1','Running'),('2','Finished'),('3','Running'),"
            "(null,'Pending');");
    }

    [[nodiscard]] Dictionary state(const Dictionary& request = {}) {
        const auto response = handler.getStateWithRequest(request);
        EXPECT_EQ(response.kind(), adminhost::Response::Kind::dictionary);
        return response.dictionary();
    }
    [[nodiscard]] Dictionary details() { return state({{"variant", "withDetails"}}); }
    [[nodiscard]] static std::vector<std::string> keysOf(const Dictionary& dictionary) {
        std::vector<std::string> keys;
        for (const auto& entry : dictionary) {
            keys.push_back(entry.key);
        }
        return keys;
    }
    [[nodiscard]] static Dictionary base(std::string_view word) {
        return {{"state", word}, {"readWriteSettingsVersion", 1}, {"setStateVersion", 1}};
    }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    adminhost::test::CapturedReports reports;
    LumioRequestHandler handler;
};

}  // namespace lumio
