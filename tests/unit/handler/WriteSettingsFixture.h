#pragma once

// The service's settings files, its two setup scripts and its key file, and writing settings to them.

#include "handler/LumioRequestHandler.h"
#include "platform/plist/PropertyList.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/ServiceTables.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace lumio {

namespace fs = std::filesystem;
using adminhost::Array;
using adminhost::Dictionary;
using adminhost::Response;
using adminhost::Value;
using testing::Contains;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

constexpr std::string_view preferencesScript =
    "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_preferences";
constexpr std::string_view libraryScript = "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_library";
constexpr std::string_view identityFile = "/Library/Preferences/com.brenn.lumioserverd.plist";
constexpr std::string_view memberFile = "/shared/Server/member_preferences_M.plist";
constexpr std::string_view clusterFile = "/shared/Server/cluster_preferences.plist";
constexpr std::string_view database = "/shared/Server/db.sqlite3";
constexpr std::string_view marker = "/var/lumio/server/.lumio_setup_done";
constexpr std::string_view plainPassword = "planted-secret-7261";
class WriteSettings : public testing::Test {
  protected:
    void SetUp() override {
        root.writeTool(preferencesScript, "#!/bin/sh\nexit 0\n");
        root.writeTool(libraryScript, "#!/bin/sh\nexit 0\n");
        root.writePropertyList(identityFile,
                               "<key>shared_filesystem</key><string>/shared</string><key>member_uuid</key>"
                               "<string>M</string><key>kept</key><string>identity</string>");
        root.writePropertyList(memberFile,
                               "<key>server_port</key><integer>8170</integer><key>kept</key><string>member</string>");
        root.writePropertyList(clusterFile,
                               "<key>nimbo_client_username</key><string>grid</string><key>nimbo_controller</key>"
                               "<string>grid.example</string><key>kept</key><string>cluster</string>");
        root.writePropertyList("/shared/Server/Secrets/kek.plist",
                               "<key>lumio_secret</key><string>AAECAwQFBgcICQoLDA0ODw==</string>");
        // Only the superuser can set owners, so the directory exists already, with the account of the tests as its
        // owner.
        fs::create_directories(root.path("/var/lumio/server"));
    }

    Dictionary write(Dictionary configuration, std::optional<std::string_view> variant = "getConfig") {
        Dictionary request{{"configuration", std::move(configuration)}};
        if (variant) {
            request.set("optionalArguments", Dictionary{{"variant", *variant}});
        }
        const Response response = handler.writeSettingsWithRequest(request);
        EXPECT_EQ(response.kind(), Response::Kind::dictionary);
        EXPECT_EQ(response.dictionary().get("readStatus"), Value(0));
        return response.dictionary();
    }
    [[nodiscard]] Dictionary file(std::string_view path) const {
        const auto value = adminhost::readPropertyList(adminhost::DiskPath(root.path(path)));
        return value && value->dictionary() != nullptr ? *value->dictionary() : Dictionary{{"unreadable", true}};
    }
    /// The inodes of the settings files: the inode of a file changes when it is replaced.
    [[nodiscard]] std::vector<ino_t> inodes() const {
        std::vector<ino_t> numbers;
        for (const std::string_view path : {identityFile, clusterFile, memberFile}) {
            struct stat status {};
            EXPECT_EQ(::stat(root.path(path).c_str(), &status), 0) << path;
            numbers.push_back(status.st_ino);
        }
        return numbers;
    }
    void makeDatabase() const {
        root.sql(database, adminhost::test::serviceTables +
                               "insert into cameras(name,uuid,access_control_enabled) values('Aula','C-1','f');"
                               "insert into workflows(uuid,bundle_path,disabled) values('W-1','Lecture.bundle','f');"
                               "insert into properties(name,value,protect) values('p','old','f');");
    }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    LumioRequestHandler handler;
};

}  // namespace lumio
