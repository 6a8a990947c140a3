#include "handler/LumioRequestHandler.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/directory/Uuid.h"
#include "platform/task/Task.h"
#include "resources/Camera.h"
#include "tests/support/TemporaryRoot.h"

#include <algorithm>
#include <cctype>
#include <chrono>
#include <filesystem>
#include <sstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {
namespace {

using adminhost::Array;
using adminhost::Dictionary;
using adminhost::DirectoryRecord;
using adminhost::Error;
using adminhost::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::StartsWith;

constexpr std::string_view database = "/Library/SorvaneProducer/Shared/Server/db.sqlite3";
constexpr std::string_view tool = "/usr/bin/lumioconfig";

std::string uuidOf(std::string_view name) {
    return adminhost::textOf(adminhost::nameBasedUuid(adminhost::localAccountsNamespace, name));
}

/// A directory that answers what it is given, whatever it is asked.
class FixedNode final : public adminhost::DirectoryNode {
  public:
    explicit FixedNode(std::optional<std::vector<DirectoryRecord>> records) : _records(std::move(records)) {}
    [[nodiscard]] const std::string& name() const noexcept override { return _name; }
    [[nodiscard]] std::optional<std::vector<DirectoryRecord>> records(const adminhost::DirectoryQuery&,
                                                                      Error* error) override {
        if (!_records && error != nullptr) {
            *error = Error{"directory", 9, "the directory is away"};
        }
        return _records;
    }

  private:
    std::string _name = "/Fixed";
    std::optional<std::vector<DirectoryRecord>> _records;
};

DirectoryRecord record(std::string_view type, std::string_view name, std::optional<std::string_view> uuid) {
    DirectoryRecord made;
    made.type = type;
    made.attributes[std::string(adminhost::directory::recordName)] = {std::string(name)};
    if (uuid) {
        made.attributes[std::string(adminhost::directory::generatedUID)] = {std::string(*uuid)};
    }
    return made;
}

class AccessLists : public testing::Test {
  protected:
    void SetUp() override {
        root.write("/etc/passwd",
                   "anna:x:1001:1001:Anna Berg,,,:/home/anna:/bin/sh\nbo:x:1002:1002::/home/bo:/bin/sh\n");
        root.write("/etc/group", "editors:x:2001:anna\n");
        root.sql(
            database,
            "create table cameras(id integer primary key,name,uuid,create_user_uuid,created_at,update_user_uuid,"
            "updated_at,last_recording_uuid,use_user_uuid,used_at,recording_status,access_control_enabled,disabled);"
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
    static void useDirectory(std::optional<std::vector<DirectoryRecord>> records) {
        adminhost::setDirectoryNodes(
            {{"/Fixed", [records = std::move(records)](Error*) { return std::make_unique<FixedNode>(records); }}});
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

TEST_F(AccessLists, DictionaryShowsNamesOfPeopleAndGroupsAndWhoUsesTheCamera) {
    allow(7, uuidOf("user:bo"));
    allow(7, uuidOf("group:editors"));
    const auto aula = camera();
    const Dictionary& shown = *aula->dictionary();
    EXPECT_EQ(shown.get("useUser"), Value("Anna Berg"));
    EXPECT_EQ(shown.get("access_control_enabled"), Value(true));
    EXPECT_EQ(*shown.get("allowedUsersAndGroups").array(), (Array{Value(Dictionary{{"shortName", "bo"},
                                                                                   {"longName", "bo"},
                                                                                   {"guid", uuidOf("user:bo")},
                                                                                   {"_id_", uuidOf("user:bo")},
                                                                                   {"type", "user"}}),
                                                                  Value(Dictionary{{"shortName", "editors"},
                                                                                   {"longName", "editors"},
                                                                                   {"guid", uuidOf("group:editors")},
                                                                                   {"_id_", uuidOf("group:editors")},
                                                                                   {"type", "group"}})}));
}

TEST_F(AccessLists, OfSeveralPeopleWithTheUuidOfWhoUsesItTheLastIsShown) {
    auto last = record("dsRecTypeStandard:Users", "last", "A");
    last.attributes[std::string(adminhost::directory::realName)] = {"Last One", "Other Name"};
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "first", "A"), last});
    EXPECT_EQ(camera()->dictionary()->get("useUser"), Value("Last One"));
    useDirectory(std::vector{last, record("dsRecTypeStandard:Users", "first", "A")});
    EXPECT_EQ(camera()->dictionary()->get("useUser"), Value("first")) << "no full name: the short one";
}

TEST_F(AccessLists, CameraThatNobodyUsesAsksForNoName) {
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "anybody", "A")});
    EXPECT_FALSE(camera(1)->dictionary()->contains("useUser"));
}

TEST_F(AccessLists, GroupDoesNotUseACamera) {
    root.sql(database, "update cameras set use_user_uuid='" + uuidOf("group:editors") + "'");
    EXPECT_FALSE(camera()->dictionary()->contains("useUser"));
}

TEST_F(AccessLists, ListedCamerasAccessSwitchIsTextUntilDictionaryMakesItABoolean) {
    const auto hall = camera(1);
    EXPECT_EQ(hall->data()->get("access_control_enabled"), Value("f"));
    EXPECT_EQ(hall->dictionary()->get("access_control_enabled"), Value(false));
    EXPECT_FALSE(hall->dictionary()->contains("useUser"));
    EXPECT_EQ(allowed(*hall), Array{});
}

TEST_F(AccessLists, DictionaryNeverExpandsTwice) {
    const auto aula = camera();
    EXPECT_EQ(aula->dictionary()->get("access_control_enabled"), Value(true));
    allow(7, uuidOf("user:bo"));
    EXPECT_EQ(aula->dictionary()->get("access_control_enabled"), Value(true));
    EXPECT_EQ(allowed(*aula), Array{});
}

class Expandable final : public Resource {
  public:
    using Resource::expandACLs;
    using Resource::getGroupDetailsForUUIDs;
    using Resource::readRow;
    [[nodiscard]] std::string_view resourceType() const noexcept override { return "camera"; }
};

TEST_F(AccessLists, ExpandingASecondTimeTurnsAStoredTrueIntoFalse) {
    Expandable resource;
    resource.readRow(Dictionary{{"id", "7"}, {"access_control_enabled", "t"}});
    resource.expandACLs();
    EXPECT_EQ(resource.data()->get("access_control_enabled"), Value(true));
    resource.expandACLs();
    EXPECT_EQ(resource.data()->get("access_control_enabled"), Value(false));
}

TEST_F(AccessLists, GroupLookUpFindsNoUsers) {
    EXPECT_EQ(Expandable::getGroupDetailsForUUIDs({uuidOf("user:bo"), uuidOf("group:editors")}).size(), 1U);
}

TEST_F(AccessLists, DictionaryOfACameraKnownOnlyByItsUuidLoadsNothingAndAsksForANullResource) {
    root.sql(database, "insert into access_control_entries values('" + uuidOf("user:bo") + "','Camera','(null)')");
    const auto aula = Camera::initWithGUID("C-7");
    EXPECT_EQ(aula->dictionary(), nullptr);
    EXPECT_THAT(aula->getUserAndGroupACLs(), ElementsAre(uuidOf("user:bo")));
}

TEST_F(AccessLists, AccessListIsTheRowsOfTypeAndIdInOrderWithDuplicates) {
    allow(7, "B");
    allow(7, "A");
    allow(8, "other camera");
    allow(7, "B");
    root.sql(database, "insert into access_control_entries values('other type','camera',7)");
    EXPECT_THAT(camera()->getUserAndGroupACLs(), ElementsAre("B", "A", "B"));
}

TEST_F(AccessLists, RowsOfTheAccessListWithoutAUuidAreSkipped) {
    // The empty line within the text ends its record, and what follows is a record without the column.
    root.sql(database, "insert into access_control_entries values('A' || char(10,10) || 'rest','Camera',7)");
    allow(7, "B");
    EXPECT_THAT(camera()->getUserAndGroupACLs(), ElementsAre("A", "B"));
}

TEST_F(AccessLists, FailedAccessListQueryIsLoggedAndEmpty) {
    const auto aula = camera();
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nprintf 'no table' >&2\nexit 3\n");
    EXPECT_THAT(aula->getUserAndGroupACLs(), IsEmpty());
    EXPECT_THAT(log.lines, ElementsAre("getUserAndGroupACLs SQL query returned error: sqliteQuery (3): Can't execute "
                                       "sqlite3 query: no table"));
}

TEST_F(AccessLists, UuidsThatNoLongerExistInTheDirectoryAreNotShown) {
    allow(7, uuidOf("user:gone"));
    allow(7, uuidOf("user:bo"));
    allow(7, "garbage");
    allow(7, "");
    const auto aula = camera();
    ASSERT_EQ(allowed(*aula).size(), 1U);
    EXPECT_EQ(allowed(*aula)[0].dictionary()->get("shortName"), Value("bo"));
}

TEST_F(AccessLists, UuidsAreFoundInAnyCaseAndShownAsTheDirectorySpellsThem) {
    std::string lower = uuidOf("user:bo");
    std::transform(lower.begin(), lower.end(), lower.begin(), [](unsigned char c) { return std::tolower(c); });
    allow(7, lower);
    const auto aula = camera();
    ASSERT_EQ(allowed(*aula).size(), 1U);
    EXPECT_EQ(allowed(*aula)[0].dictionary()->get("guid"), Value(uuidOf("user:bo")));
}

TEST_F(AccessLists, ThreeRecordsForTwoUuidsShowOneEntryForEachTheFirstOneKept) {
    allow(7, "A");
    allow(7, "B");
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "first", "A"),
                             record("dsRecTypeStandard:Groups", "twin", "A"),
                             record("dsRecTypeStandard:Users", "b", "B")});
    const auto aula = camera();
    ASSERT_EQ(allowed(*aula).size(), 2U);
    EXPECT_EQ(allowed(*aula)[0].dictionary()->get("shortName"), Value("first"));
    EXPECT_EQ(allowed(*aula)[1].dictionary()->get("shortName"), Value("b"));
}

TEST_F(AccessLists, DuplicatesAreFoundWhateverTheCaseOfTheirUuids) {
    allow(7, "AB");
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "first", "ab"),
                             record("dsRecTypeStandard:Groups", "twin", "AB")});
    const auto aula = camera();
    ASSERT_EQ(allowed(*aula).size(), 1U);
    EXPECT_EQ(allowed(*aula)[0].dictionary()->get("guid"), Value("ab"));
}

TEST_F(AccessLists, DuplicatesStayWhenTheDirectoryReturnsNoMoreEntriesThanUuids) {
    allow(7, "A");
    allow(7, "A");
    useDirectory(
        std::vector{record("dsRecTypeStandard:Users", "first", "A"), record("dsRecTypeStandard:Groups", "twin", "A")});
    EXPECT_EQ(allowed(*camera()).size(), 2U);
}

TEST_F(AccessLists, EntriesWithoutUuidAreDroppedOnlyTogetherWithDuplicates) {
    allow(7, "A");
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "nameless", std::nullopt)});
    EXPECT_EQ(allowed(*camera()).size(), 1U);
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "nameless", std::nullopt),
                             record("dsRecTypeStandard:Users", "a", "A")});
    const auto aula = camera();
    ASSERT_EQ(allowed(*aula).size(), 1U);
    EXPECT_EQ(allowed(*aula)[0].dictionary()->get("shortName"), Value("a"));
}

TEST_F(AccessLists, FailingDirectoryIsToldOnStandardOutputAndTheListIsEmpty) {
    allow(7, "A");
    useDirectory(std::nullopt);
    testing::internal::CaptureStdout();
    const auto hall = camera(1);
    const auto aula = camera();
    EXPECT_EQ(allowed(*aula), Array{});
    // Asked twice: for who uses the camera, and for the list.
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "Tarn query error for users: the directory is away\nTarn query error for users: the directory is away\n");
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(AccessLists, MissingAccountFilesGiveAnEmptyList) {
    allow(7, uuidOf("user:bo"));
    std::filesystem::remove(root.path("/etc/passwd"));
    std::filesystem::remove(root.path("/etc/group"));
    testing::internal::CaptureStdout();
    EXPECT_EQ(allowed(*camera()), Array{});
    (void)testing::internal::GetCapturedStdout();
}

TEST_F(AccessLists, AllowedGroupsAnswersTheUserEntriesOnly) {
    allow(7, uuidOf("user:bo"));
    allow(7, uuidOf("group:editors"));
    const auto aula = camera();
    EXPECT_EQ(aula->allowedUsers(), Array{}) << "nothing is expanded yet";
    (void)aula->dictionary();
    ASSERT_EQ(aula->countOfAllowedGroups(), 1U);
    EXPECT_EQ(aula->allowedGroups(), aula->allowedUsers());
    EXPECT_EQ(aula->objectInAllowedGroupsAtIndex(0).dictionary()->get("shortName"), Value("bo"));
}

TEST_F(AccessLists, IndexOutOfRangeAnswersNull) {
    allow(7, uuidOf("user:bo"));
    const auto aula = camera();
    (void)aula->dictionary();
    EXPECT_EQ(aula->countOfAllowedUsers(), 1U);
    EXPECT_FALSE(aula->objectInAllowedUsersAtIndex(0).isNull());
    EXPECT_TRUE(aula->objectInAllowedUsersAtIndex(1).isNull());
    EXPECT_TRUE(aula->objectInAllowedGroupsAtIndex(99).isNull());
}

TEST_F(AccessLists, TypeWordsCompareExactlyInAllowedUsersAndWithoutCaseInChanges) {
    const auto aula = camera();
    aula->setData(Dictionary{{"allowedUsersAndGroups", Array{Value(Dictionary{{"type", "User"}}), Value("text")}}});
    EXPECT_EQ(aula->allowedUsers(), Array{});
    change({Value(Dictionary{{"type", "User"}, {"shortName", "bo"}, {"_newid_", true}}),
            Value(Dictionary{{"type", "GROUP"}, {"shortName", "editors"}, {"_newid_", "yes"}})});
    EXPECT_THAT(
        calls(),
        ElementsAre(
            "--add_access --resource_type camera --resource_uuid C-7 --record_type user --shortname bo ",
            "--add_access --resource_type camera --resource_uuid C-7 --record_type group --shortname editors "));
}

TEST_F(AccessLists, TwoAdditionsOfUsersRunTheToolOnce) {
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}}),
            Value(Dictionary{{"type", "user"}, {"shortName", "b"}, {"_newid_", 1}})});
    EXPECT_THAT(calls(),
                ElementsAre("--add_access --resource_type camera --resource_uuid C-7 --record_type user --shortname a "
                            "--shortname b "));
}

TEST_F(AccessLists, EachWordIsAnArgumentOfItsOwn) {
    root.writeTool(tool, "#!/bin/sh\nprintf '%s\\n' \"$@\" >> " + root.path("/calls").string() + "\n");
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}}),
            Value(Dictionary{{"type", "user"}, {"shortName", "b c"}, {"_newid_", true}})});
    EXPECT_THAT(calls(), ElementsAre("--add_access", "--resource_type", "camera", "--resource_uuid", "C-7",
                                     "--record_type", "user", "--shortname", "a", "--shortname", "b c"));
}

TEST_F(AccessLists, AllFourKindsOfChangeRunInTheirOrder) {
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

TEST_F(AccessLists, RemovalsWhoseUuidsMapToNoLocalIdRunNoTool) {
    change({Value(Dictionary{{"_obsoleteid_", true}, {"_id_", uuidOf("user:gone")}}),
            Value(Dictionary{{"_obsoleteid_", true}, {"_id_", "garbage"}}), Value(Dictionary{{"_obsoleteid_", true}}),
            Value(Dictionary{{"_obsoleteid_", true}, {"_id_", 5}})});
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(AccessLists, RemovalOfAnAccountWithoutANameIsSkipped) {
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

TEST_F(AccessLists, EntryWithNeitherFlagAndEntryThatIsNoDictionaryAreIgnored) {
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}}), Value("text"), Value(Array{}),
            Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", "01"}}),
            Value(Dictionary{{"_id_", uuidOf("user:bo")}, {"_obsoleteid_", "01"}})});
    EXPECT_THAT(calls(), IsEmpty()) << "\"01\" is no true flag of an access-list entry";
}

TEST_F(AccessLists, UnknownTypeOfAnAdditionIsIgnoredAndNotTriedAsARemoval) {
    change(
        {Value(Dictionary{{"type", "robot"}, {"_newid_", true}, {"_obsoleteid_", true}, {"_id_", uuidOf("user:bo")}})});
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(AccessLists, AdditionWithoutShortNameEndsTheOperationBeforeAnyRun) {
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}}),
            Value(Dictionary{{"type", "user"}, {"_newid_", true}})});
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(AccessLists, EmptyListAndMissingUuidChangeNothing) {
    change({});
    Array entries{Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}})};
    Camera::initWithGUID(std::nullopt)->changeACLsWithRequest(&entries);
    Camera::initWithGUID("C-7")->changeACLsWithRequest(nullptr);
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(AccessLists, FailingOrMissingConfigurationToolIsNotDetected) {
    root.writeTool(tool, "#!/bin/sh\nexit 9\n");
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}})});
    std::filesystem::remove(root.path(tool));
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}})});
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(AccessLists, HangingConfigurationToolEndsWithTheRequestsDeadlineAndNoFurtherRun) {
    root.writeTool(tool, "#!/bin/sh\necho \"$1\" >> " + root.path("/calls").string() + "\nexec sleep 600\n");
    adminhost::setTaskDeadline(std::chrono::steady_clock::now() + std::chrono::milliseconds(500));
    change({Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}}),
            Value(Dictionary{{"type", "group"}, {"shortName", "b"}, {"_newid_", true}})});
    const auto removal = Camera::initWithGUID("C-7")->delete_();
    adminhost::setTaskDeadline(std::nullopt);
    EXPECT_THAT(calls(), ElementsAre("--add_access"));
    EXPECT_EQ(removal, (Error{"adminhost_lumio", -1, std::nullopt}));
}

TEST_F(AccessLists, AccessSwitchIsWrittenToTheDatabaseAndNotToTheRecord) {
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

TEST_F(AccessLists, AccessSwitchThatCannotBeWrittenIsDroppedSilently) {
    root.sql(database, "drop table cameras");
    const auto known = Camera::initWithGUID("C-8");
    known->setACLEnabled(true);
    EXPECT_FALSE(known->aclEnabled());
    Camera::initWithGUID(std::nullopt)->setACLEnabled(true);
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(AccessLists, AclEnabledLooksAtTheRecordItHasAndLoadsNone) {
    EXPECT_FALSE(Camera::initWithGUID("C-7")->aclEnabled());
    EXPECT_TRUE(camera()->aclEnabled());
}

TEST_F(AccessLists, RemovalRunsTheToolWithTheUuid) {
    EXPECT_EQ(Camera::initWithGUID("C-7")->delete_(), std::nullopt);
    EXPECT_THAT(calls(), ElementsAre("--remove_camera C-7 "));
}

TEST_F(AccessLists, RemovalAnswersTheToolsExitStatus) {
    root.writeTool(tool, "#!/bin/sh\nexit 3\n");
    EXPECT_EQ(Camera::initWithGUID("C-7")->delete_(), (Error{"adminhost_lumio", 3, std::nullopt}));
}

TEST_F(AccessLists, CameraChangesAreAppliedInOrderAndRemovedCamerasAreNotChangedOtherwise) {
    const Array changes{
        Value(Dictionary{{"_id_", "C-7"},
                         {"_obsoleteid_", "01"},
                         {"access_control_enabled", false},
                         {"allowedUsersAndGroups",
                          Array{Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}})}}}),
        Value("text"),
        Value(Dictionary{{"_id_", "C-8"}, {"access_control_enabled", "true"}, {"allowedUsersAndGroups", Array{}}})};
    EXPECT_EQ(handler.processCameraChangesWithRequest(&changes).kind(), adminhost::Response::Kind::nothing);
    EXPECT_THAT(calls(), ElementsAre("--remove_camera C-7 "));
    EXPECT_EQ(root.sql(database, "select access_control_enabled from cameras order by id"), "t\nt\n");
}

TEST_F(AccessLists, CameraRemovalThatFailsIsLoggedAndTheNextEntryIsProcessed) {
    root.writeTool(tool, "#!/bin/sh\nexit 3\n");
    const Array changes{Value(Dictionary{{"_id_", "C-7"}, {"_obsoleteid_", true}}),
                        Value(Dictionary{{"_obsoleteid_", true}}),
                        Value(Dictionary{{"_id_", "C-8"}, {"access_control_enabled", true}})};
    handler.processCameraChangesWithRequest(&changes);
    EXPECT_THAT(log.lines,
                ElementsAre("adminhost_lumio: could not delete camera with uuid: C-7, error: adminhost_lumio (3)",
                            "adminhost_lumio: could not delete camera with uuid: (null), error: adminhost_lumio (-1)"));
    EXPECT_EQ(root.sql(database, "select access_control_enabled from cameras where id=8"), "t\n");
}

TEST_F(AccessLists, AdditionWithoutShortNameDoesNotKeepTheNextCameraFromItsChanges) {
    const Array changes{
        Value(Dictionary{{"_id_", "C-7"},
                         {"allowedUsersAndGroups", Array{Value(Dictionary{{"type", "user"}, {"_newid_", true}})}}}),
        Value(Dictionary{{"_id_", "C-8"},
                         {"allowedUsersAndGroups",
                          Array{Value(Dictionary{{"type", "user"}, {"shortName", "bo"}, {"_newid_", true}})}}})};
    handler.processCameraChangesWithRequest(&changes);
    EXPECT_THAT(
        calls(),
        ElementsAre("--add_access --resource_type camera --resource_uuid C-8 --record_type user --shortname bo "));
}

TEST_F(AccessLists, NullAndEmptyChangesDoNothing) {
    const Array empty;
    handler.processCameraChangesWithRequest(nullptr);
    handler.processCameraChangesWithRequest(&empty);
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(AccessLists, GetCamerasListsEveryCameraWithItsAccessList) {
    allow(8, uuidOf("user:bo"));
    const adminhost::Response response = handler.getCamerasWithRequest({});
    const Array& cameras = *response.dictionary().get("cameras").array();
    ASSERT_EQ(cameras.size(), 2U);
    EXPECT_EQ(cameras[0].dictionary()->get("allowedUsersAndGroups"), Value(Array{}));
    EXPECT_EQ(cameras[1].dictionary()->get("allowedUsersAndGroups").array()->size(), 1U);
    EXPECT_EQ(response.dictionary().get("command"), Value("getCameras"));
    EXPECT_EQ(response.dictionary().get("readStatus"), Value(0));
    EXPECT_EQ(response.dictionary().size(), 3U);
}

TEST_F(AccessLists, FailedListingAnswersOnlyItsCode) {
    root.sql(database, "drop table cameras");
    EXPECT_EQ(handler.getCamerasWithRequest({}).dictionary(), (Dictionary{{"readStatus", 1}}));
}

}  // namespace
}  // namespace lumio
