#include "platform/task/Task.h"
#include "tests/support/Environment.h"
#include "tests/unit/resources/AccessListsFixture.h"
#include "tests/unit/resources/FixedDirectory.h"

#include <chrono>
#include <filesystem>

namespace lumio {
namespace {

using AccessChanges = AccessLists;

TEST_F(AccessChanges, TwoAdditionsOfUsersRunTheToolOnce) {
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}}),
            Value(Dictionary{{"type", "user"}, {"shortName", "b"}, {"_newid_", 1}})});
    EXPECT_THAT(calls(),
                ElementsAre("--add_access --resource_type camera --resource_uuid C-7 --record_type user --shortname a "
                            "--shortname b "));
}

TEST_F(AccessChanges, EachWordIsAnArgumentOfItsOwn) {
    root.writeTool(tool, "#!/bin/sh\nprintf '%s\\n' \"$@\" >> " + root.path("/calls").string() + "\n");
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}}),
            Value(Dictionary{{"type", "user"}, {"shortName", "b c"}, {"_newid_", true}})});
    EXPECT_THAT(calls(), ElementsAre("--add_access", "--resource_type", "camera", "--resource_uuid", "C-7",
                                     "--record_type", "user", "--shortname", "a", "--shortname", "b c"));
}

TEST_F(AccessChanges, OnlyTheDatabaseToolGetsTheVariablesOfItsFiles) {
    const std::string record =
        "#!/bin/sh\nenv | grep ^XDG_CONFIG_HOME= >> " + root.path("/environment").string() + "\n";
    root.writeTool(tool, record + "echo configuration >> " + root.path("/environment").string() + "\n");
    root.writeTool("/usr/bin/sqlite3", record + "echo database >> " + root.path("/environment").string() +
                                           "\nexec /usr/bin/sqlite3 \"$@\"\n");
    const support::ScopedEnvironment account({{"XDG_CONFIG_HOME", std::nullopt}});
    adminhost::setToolFileVariables({{"XDG_CONFIG_HOME", "/private"}});
    Camera::initWithGUID("C-7")->setACLEnabled(false);
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}})});
    adminhost::setToolFileVariables({});
    EXPECT_EQ(root.read("/environment"), "XDG_CONFIG_HOME=/private\ndatabase\nconfiguration\n");
}

TEST_F(AccessChanges, AllFourKindsOfChangeRunInTheirOrder) {
    change({Value(Dictionary{{"_obsoleteid_", true}, {"_id_", uuidOf("group:editors")}}),
            Value(Dictionary{{"_obsoleteid_", true}, {"_id_", uuidOf("user:anna")}}),
            Value(Dictionary{{"type", "group"}, {"shortName", "g"}, {"_newid_", true}}),
            Value(Dictionary{{"type", "user"}, {"shortName", "u"}, {"_newid_", true}})});
    EXPECT_THAT(
        calls(),
        ElementsAre(
            StartsWith("--add_access --resource_type camera --resource_uuid C-7 --record_type user"),
            StartsWith("--add_access --resource_type camera --resource_uuid C-7 --record_type group"),
            "--remove_access --resource_type camera --resource_uuid C-7 --record_type user --shortname anna ",
            "--remove_access --resource_type camera --resource_uuid C-7 --record_type group --shortname editors "));
}

TEST_F(AccessChanges, RemovalsWhoseUuidsMapToNoLocalIdRunNoTool) {
    change({Value(Dictionary{{"_obsoleteid_", true}, {"_id_", uuidOf("user:gone")}}),
            Value(Dictionary{{"_obsoleteid_", true}, {"_id_", "garbage"}}), Value(Dictionary{{"_obsoleteid_", true}}),
            Value(Dictionary{{"_obsoleteid_", true}, {"_id_", 5}})});
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(AccessChanges, RemovalOfAnAccountWithoutANameIsSkipped) {
    for (const bool isUser : {true, false}) {
        const std::string uuid = uuidOf("user:bo");
        auto nameless = record(isUser ? "dsRecTypeStandard:Users" : "dsRecTypeStandard:Groups", "", uuid);
        nameless.attributes[std::string(isUser ? adminhost::directory::uniqueID
                                               : adminhost::directory::primaryGroupID)] = {"7"};
        useDirectory(std::vector{nameless});
        change({Value(Dictionary{{"_obsoleteid_", true}, {"_id_", uuid}})});
        EXPECT_THAT(calls(), IsEmpty());
    }
}

TEST_F(AccessChanges, EntryWithNeitherFlagAndEntryThatIsNoDictionaryAreIgnored) {
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}}), Value("text"), Value(Array{}),
            Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", "01"}}),
            Value(Dictionary{{"_id_", uuidOf("user:bo")}, {"_obsoleteid_", "01"}})});
    EXPECT_THAT(calls(), IsEmpty()) << "\"01\" is no true flag of an access-list entry";
}

TEST_F(AccessChanges, UnknownTypeOfAnAdditionIsIgnoredAndNotTriedAsARemoval) {
    change(
        {Value(Dictionary{{"type", "robot"}, {"_newid_", true}, {"_obsoleteid_", true}, {"_id_", uuidOf("user:bo")}})});
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(AccessChanges, AdditionWithoutShortNameEndsTheOperationBeforeAnyRun) {
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}}),
            Value(Dictionary{{"type", "user"}, {"_newid_", true}})});
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(AccessChanges, EmptyListAndMissingUuidChangeNothing) {
    change({});
    Array entries{Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}})};
    Camera::initWithGUID(std::nullopt)->changeACLsWithRequest(&entries);
    Camera::initWithGUID("C-7")->changeACLsWithRequest(nullptr);
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(AccessChanges, FailingOrMissingConfigurationToolIsNotDetected) {
    root.writeTool(tool, "#!/bin/sh\nexit 9\n");
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}})});
    std::filesystem::remove(root.path(tool));
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}})});
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(AccessChanges, HangingConfigurationToolEndsWithTheRequestsDeadlineAndNoFurtherRun) {
    root.writeTool(tool, "#!/bin/sh\necho \"$1\" >> " + root.path("/calls").string() + "\nexec sleep 600\n");
    adminhost::setTaskDeadline(std::chrono::steady_clock::now() + std::chrono::milliseconds(500));
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}}),
            Value(Dictionary{{"type", "group"}, {"shortName", "b"}, {"_newid_", true}})});
    const auto removal = Camera::initWithGUID("C-7")->delete_();
    adminhost::setTaskDeadline(std::nullopt);
    EXPECT_THAT(calls(), ElementsAre("--add_access"));
    EXPECT_EQ(removal, (Error{"adminhost_lumio", -1, std::nullopt}));
}

TEST_F(AccessChanges, AccessSwitchIsWrittenToTheDatabaseAndNotToTheRecord) {
    const auto hall = camera(1);
    EXPECT_FALSE(hall->aclEnabled());
    hall->setACLEnabled(true);
    EXPECT_EQ(root.sql(database, "select access_control_enabled from cameras where id=8"), "t\n");
    EXPECT_FALSE(hall->aclEnabled()) << "the record is not touched, and is what is asked";
    const auto known = Camera::initWithGUID("C-8");
    known->setACLEnabled(true);
    EXPECT_TRUE(known->aclEnabled());
    known->setACLEnabled(false);
    EXPECT_FALSE(known->aclEnabled());
    EXPECT_EQ(root.sql(database, "select access_control_enabled from cameras where id=8"), "f\n");
}

TEST_F(AccessChanges, AccessSwitchThatCannotBeWrittenIsDroppedSilently) {
    root.sql(database, "drop table cameras");
    const auto known = Camera::initWithGUID("C-8");
    known->setACLEnabled(true);
    EXPECT_FALSE(known->aclEnabled());
    Camera::initWithGUID(std::nullopt)->setACLEnabled(true);
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(AccessChanges, AclEnabledLooksAtTheRecordItHasAndLoadsNone) {
    EXPECT_FALSE(Camera::initWithGUID("C-7")->aclEnabled());
    EXPECT_TRUE(camera()->aclEnabled());
}

}  // namespace
}  // namespace lumio
