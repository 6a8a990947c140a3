#pragma once

// Two cameras, two people and a group, and a configuration tool that records its arguments.

#include "handler/LumioRequestHandler.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/directory/NameBasedUuid.h"
#include "resources/Camera.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/ServiceTables.h"
#include "tests/support/TemporaryRoot.h"

#include <sstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {

using adminhost::Array;
using adminhost::Dictionary;
using adminhost::Error;
using adminhost::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::StartsWith;

constexpr std::string_view database = "/Library/SorvaneProducer/Shared/Server/db.sqlite3";
constexpr std::string_view tool = "/usr/bin/lumioconfig";

inline std::string uuidOf(std::string_view name) {
    return adminhost::textOf(adminhost::nameBasedUuid(adminhost::localAccountsNamespace, name));
}
class AccessLists : public testing::Test {
  protected:
    void SetUp() override {
        root.write("/etc/passwd",
                   "anna:x:1001:1001:Anna Berg,,,:/home/anna:/bin/sh\nbo:x:1002:1002::/home/bo:/bin/sh\n");
        root.write("/etc/group", "editors:x:2001:anna\n");
        root.sql(database,
                 adminhost::test::camerasTable +
                     "create table access_control_entries(record_uuid text,resource_type text,resource_id integer);"
                     "insert into cameras(id,name,uuid,use_user_uuid,access_control_enabled) values"
                     "(7,'Aula','C-7','" +
                     uuidOf("user:anna") + "','t'),(8,'Hall','C-8','','f');");
        root.writeTool(tool, "#!/bin/sh\nfor a in \"$@\"; do printf '%s ' \"$a\"; done >> " +
                                 root.path("/calls").string() + "\necho >> " + root.path("/calls").string() + "\n");
        adminhost::setDirectoryNodes({adminhost::localAccounts()});
    }
    void TearDown() override { adminhost::setDirectoryNodes({adminhost::localAccounts()}); }

    void allow(int camera, const std::string& uuid) const {
        root.sql(database,
                 "insert into access_control_entries values('" + uuid + "','Camera'," + std::to_string(camera) + ")");
    }
    [[nodiscard]] std::unique_ptr<Camera> camera(std::size_t index = 0) const {
        std::optional<Error> error;
        auto cameras = Camera::allCamerasWithError(error);
        return std::move(cameras->at(index));
    }
    [[nodiscard]] Array allowed(Resource& resource) const {
        const Array* list = resource.dictionary()->get("allowedUsersAndGroups").array();
        EXPECT_NE(list, nullptr);
        return list == nullptr ? Array() : *list;
    }
    [[nodiscard]] std::vector<std::string> calls() const {
        std::vector<std::string> lines;
        std::istringstream text(root.read("/calls"));
        for (std::string line; std::getline(text, line);) {
            lines.push_back(line);
        }
        return lines;
    }
    void change(const Array& entries) const { Camera::initWithGUID("C-7")->changeACLsWithRequest(&entries); }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    LumioRequestHandler handler;
};

}  // namespace lumio
