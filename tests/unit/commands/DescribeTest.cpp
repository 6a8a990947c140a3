#include "commands/CommandTable.h"

#include <set>
#include <string_view>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using adminhost::Dictionary;
using adminhost::Value;

Dictionary describe(std::string_view name) {
    const Value all = lumio::describeCommands();
    for (const Value& command : *all.array()) {
        if (*command.dictionary()->get("name").string() == name) {
            return *command.dictionary();
        }
    }
    return {};
}

Dictionary keyOf(const Dictionary& command, const char* list, std::string_view path) {
    for (const Value& key : *command.get(list).array()) {
        if (*key.dictionary()->get("path").string() == path) {
            return *key.dictionary();
        }
    }
    return {};
}

TEST(CommandTable, HoldsEveryCommandOfThePlugInOnce) {
    std::vector<std::string_view> names;
    for (const auto& command : lumio::commands()) {
        names.push_back(command.name);
        EXPECT_EQ(lumio::findCommand(command.name), &command);
        EXPECT_FALSE(command.summary.empty()) << command.name;
    }
    EXPECT_THAT(names, testing::UnorderedElementsAreArray(std::set<std::string_view>(names.begin(), names.end())));
    EXPECT_THAT(names, testing::IsSupersetOf({"readSettings", "writeSettings", "getCameras"}));
    EXPECT_EQ(lumio::findCommand("readsettings"), nullptr);
    EXPECT_EQ(lumio::findCommand(""), nullptr);
}

TEST(CommandTable, DescriptionsAreInTheTablesOrder) {
    const Value all = lumio::describeCommands();
    ASSERT_NE(all.array(), nullptr);
    ASSERT_EQ(all.array()->size(), lumio::commands().size());
    for (std::size_t i = 0; i < all.array()->size(); ++i) {
        const Dictionary& described = *(*all.array())[i].dictionary();
        const lumio::CommandDescription& command = lumio::commands()[i];
        EXPECT_EQ(described.get("name"), Value(command.name));
        EXPECT_EQ(described.get("summary"), Value(command.summary));
        EXPECT_NE(described.get("example").dictionary(), nullptr);
    }
}

TEST(CommandTable, RevisionsAreReadBySettingsAndGuardTheirWriting) {
    EXPECT_TRUE(lumio::findCommand("readSettings")->showsRevision);
    EXPECT_TRUE(lumio::findCommand("writeSettings")->takesRevision);
    EXPECT_FALSE(lumio::findCommand("getCameras")->showsRevision);
}

TEST(CommandTable, OnlyCommandsThatChangeNothingAreOpenToReaders) {
    using adminhost::Access;
    for (const auto& command : lumio::commands()) {
        const bool reads = command.name.starts_with("get") || command.name.starts_with("read");
        EXPECT_EQ(command.access == Access::read, reads) << command.name;
    }
    EXPECT_EQ(lumio::findCommand("writeSettings")->access, Access::write);
    EXPECT_EQ(lumio::findCommand("stopService")->access, Access::control);
    EXPECT_EQ(lumio::findCommand("createNimboAccount")->access, Access::account);
}

TEST(CommandTable, CommandsSayWhatTheyNeedAndTheirOwnTimeLimit) {
    EXPECT_THAT(lumio::findCommand("readSettings")->needs, testing::ElementsAre("database"));
    EXPECT_THAT(lumio::findCommand("getState")->needs, testing::IsEmpty()) << "the state is shown without a database";
    EXPECT_EQ(lumio::findCommand("getState")->deadlineSeconds, 60);
    EXPECT_EQ(lumio::findCommand("validateSettings")->deadlineSeconds, 60);
    EXPECT_EQ(lumio::findCommand("readSettings")->deadlineSeconds, 0);
}

TEST(CommandTable, PasswordsAreSecret) {
    EXPECT_EQ(keyOf(describe("writeSettings"), "keys", "configuration.nimbo_client_password").get("secret"),
              Value(true));
    EXPECT_EQ(keyOf(describe("validateSettings"), "keys", "nimbo_client_password").get("secret"), Value(true));
    EXPECT_EQ(keyOf(describe("createNimboAccount"), "keys", "directoryPassword").get("secret"), Value(true));
    EXPECT_EQ(keyOf(describe("createNimboAccount"), "keys", "directoryNode").get("secret"), Value());
}

TEST(CommandTable, ClientsLearnHowToCompareAndWriteTheState) {
    EXPECT_EQ(describe("readSettings").get("state"), Value("read"));
    const Dictionary write = describe("writeSettings");
    EXPECT_EQ(write.get("state"), Value("write"));
    const Dictionary camera = keyOf(write, "keys", "configuration.cameras[]");
    EXPECT_EQ(camera.get("section"), Value("cameras"));
    EXPECT_EQ(camera.get("byIdentity"), Value(true));
    EXPECT_EQ(camera.get("removedBy"), Value("_obsoleteid_"));
    EXPECT_FALSE(camera.contains("addedBy")) << "the service adds cameras, not the administrator";
    const Dictionary person = keyOf(write, "keys", "configuration.cameras[].allowedUsersAndGroups[]");
    EXPECT_EQ(person.get("kinds"), Value(Dictionary{{"user", "users"}, {"group", "groups"}}));
    EXPECT_EQ(keyOf(write, "keys", "configuration.shared_filesystem").get("locates"),
              Value(adminhost::Array{"member", "cluster"}));
}

TEST(CommandTable, AnAnswerTakesOverTheKeysOfOtherAnswers) {
    EXPECT_EQ(keyOf(describe("readSettings"), "answer", "configuration.cameras[].created_at").get("type"),
              keyOf(describe("getCameras"), "answer", "cameras[].created_at").get("type"));
    EXPECT_EQ(keyOf(describe("writeSettings"), "answer", "configuration.workflows[].allowedUsersAndGroups[].type")
                  .get("type"),
              Value("text"));
    EXPECT_EQ(keyOf(describe("stopService"), "answer", "sharedFileSystemFreeSpace").get("unit"), Value("bytes"));
}

TEST(CommandTable, ASettingIsDescribedOnce) {
    const char* const path = "configuration.server_port";
    EXPECT_EQ(keyOf(describe("writeSettings"), "keys", path).get("help"),
              keyOf(describe("readSettings"), "answer", path).get("help"));
    EXPECT_EQ(keyOf(describe("writeSettings"), "keys", path).get("enteredAs"), Value("integer"));
}

TEST(CommandTable, ExamplesPassTheCheck) {
    const Value all = lumio::describeCommands();
    for (const Value& command : *all.array()) {
        const std::string& name = *command.dictionary()->get("name").string();
        EXPECT_THAT(lumio::checkRequest(name, *command.dictionary()->at("example.request").dictionary()),
                    testing::IsEmpty())
            << name;
    }
}

TEST(CommandTable, ExamplesCarryDates) {
    EXPECT_EQ(describe("getState").at("example.answer.startTime"),
              Value(adminhost::Date(std::chrono::seconds(1769846400))));
}

}  // namespace
