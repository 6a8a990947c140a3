// The reports of changes of cameras and properties.

#include "platform/directory/DirectoryRequest.h"
#include "tests/support/CapturedReports.h"
#include "tests/unit/resources/AccessListsFixture.h"
#include "tests/unit/resources/FixedDirectory.h"
#include "tests/unit/resources/PropertyFixture.h"

#include <functional>

namespace lumio {
namespace {

using adminhost::Change;
using adminhost::NotDone;

Value undoOf(std::string_view list, Dictionary entry) {
    return Dictionary{{list, Array{std::move(entry)}}};
}

class CameraReports : public AccessLists {
  protected:
    void process(const Array& changes) { handler.processCameraChangesWithRequest(&changes); }
    adminhost::test::CapturedReports reports;
};

TEST_F(CameraReports, EachChangeOnDiskIsReportedWithItsUndo) {
    process({Dictionary{
        {"_id_", "C-7"},
        {"access_control_enabled", false},
        {"allowedUsersAndGroups", Array{Dictionary{{"type", "user"}, {"shortName", "bo"}, {"_newid_", true}},
                                        Dictionary{{"_id_", uuidOf("group:editors")}, {"_obsoleteid_", true}}}}}});
    EXPECT_THAT(
        reports.changes,
        ElementsAre(
            Change{"cameras", "C-7", "", "access_control_enabled", nullptr, false, false,
                   undoOf("cameras", {{"access_control_enabled", true}, {"_id_", "C-7"}}), true},
            Change{"cameras", "C-7", "", "users", nullptr, "bo", false,
                   undoOf("cameras", {{"_id_", "C-7"},
                                      {"allowedUsersAndGroups",
                                       Array{Dictionary{{"_id_", uuidOf("user:bo")}, {"_obsoleteid_", true}}}}})},
            Change{"cameras", "C-7", "", "groups", "editors", nullptr, false,
                   undoOf("cameras",
                          {{"_id_", "C-7"},
                           {"allowedUsersAndGroups",
                            Array{Dictionary{{"type", "group"}, {"shortName", "editors"}, {"_newid_", true}}}}})}));
    EXPECT_THAT(reports.parts, IsEmpty());
}

TEST_F(CameraReports, SwitchOfARecordThatWasNotReadIsUnverified) {
    process({Dictionary{{"_id_", "no such camera"}, {"access_control_enabled", true}}});
    ASSERT_EQ(reports.changes.size(), 1U);
    EXPECT_TRUE(reports.changes[0].unverified);
    const auto studio = Camera::initWithGUID("C-7");
    ASSERT_NE(studio->data(), nullptr);
    studio->setACLEnabled(false);
    ASSERT_EQ(reports.changes.size(), 2U);
    EXPECT_FALSE(reports.changes[1].unverified);
}

TEST_F(CameraReports, RemovalIsReportedAndCannotBeTakenBack) {
    process({Dictionary{{"_id_", "C-7"}, {"_obsoleteid_", true}}});
    EXPECT_THAT(reports.changes, ElementsAre(Change{"cameras", "C-7", "", "", "C-7", nullptr, false, nullptr}));
}

TEST_F(CameraReports, SkippedEntriesAreNamedByTheirKeyPaths) {
    process(
        {"text",
         Dictionary{{"_id_", "C-8"},
                    {"allowedUsersAndGroups",
                     Array{"text", Dictionary{{"type", "robot"}, {"shortName", "r"}, {"_newid_", true}},
                           Dictionary{{"_id_", "gone"}, {"_obsoleteid_", true}},
                           Dictionary{{"type", "user"}, {"shortName", "bo"}}}}},
         Dictionary{{"_id_", "C-8"}, {"allowedUsersAndGroups", Array{Dictionary{{"type", "user"}, {"_newid_", true}}}}},
         Dictionary{{"access_control_enabled", true}}});
    std::vector<std::string> paths;
    for (const NotDone& part : reports.parts) {
        paths.push_back(part.keyPath);
        EXPECT_FALSE(part.reason.empty());
    }
    EXPECT_THAT(paths, ElementsAre("configuration.cameras.0", "configuration.cameras.1.allowedUsersAndGroups.0",
                                   "configuration.cameras.1.allowedUsersAndGroups.1",
                                   "configuration.cameras.1.allowedUsersAndGroups.2",
                                   "configuration.cameras.2.allowedUsersAndGroups.0",
                                   "configuration.cameras.2.allowedUsersAndGroups",
                                   "configuration.cameras.3.access_control_enabled"));
    EXPECT_THAT(reports.changes, IsEmpty());
}

TEST_F(CameraReports, ToolThatFailsIsReportedWithItsWordsForEachEntryAndTheOthersAreApplied) {
    root.writeTool(tool, "#!/bin/sh\n[ \"$7\" = user ] || exit 0\necho out; echo 'no such user' >&2; exit 9\n");
    process({Dictionary{
        {"_id_", "C-7"},
        {"allowedUsersAndGroups", Array{Dictionary{{"type", "user"}, {"shortName", "x"}, {"_newid_", true}},
                                        Dictionary{{"type", "group"}, {"shortName", "editors"}, {"_newid_", true}}}}}});
    EXPECT_THAT(reports.parts,
                ElementsAre(NotDone{"configuration.cameras.0.allowedUsersAndGroups.0",
                                    "not added: the configuration tool failed with status 9", "no such user"}));
    ASSERT_EQ(reports.changes.size(), 1U);
    EXPECT_EQ(reports.changes[0].key, "groups");
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(CameraReports, FailedRemovalAndSwitchAreReportedOnce) {
    root.writeTool(tool, "#!/bin/sh\necho 'is recording' >&2; exit 3\n");
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\necho 'Error: busy' >&2; exit 5\n");
    process({Dictionary{{"_id_", "C-7"}, {"_obsoleteid_", true}},
             Dictionary{{"_id_", "C-8"}, {"access_control_enabled", true}}});
    EXPECT_THAT(reports.parts,
                ElementsAre(NotDone{"configuration.cameras.0",
                                    "not removed: the configuration tool failed with status 3", "is recording"},
                            NotDone{"configuration.cameras.1.access_control_enabled",
                                    "not changed: the database refused it", "Error: busy"}));
    EXPECT_THAT(reports.changes, IsEmpty());
}

const NotDone failedNode{
    "", "the directory node \"/Fixed\" failed: people and groups may be missing, and lists of them empty",
    "the directory is away"};

TEST_F(CameraReports, DirectoryNodeThatFailsIsReportedOnceInEachRequest) {
    allow(7, "A");
    allow(8, "B");
    useDirectory(std::nullopt);
    testing::internal::CaptureStdout();
    for (int i = 0; i < 2; ++i) {
        const adminhost::DirectoryRequestScope request(std::nullopt);
        EXPECT_EQ(allowed(*camera(0)), Array{});
        EXPECT_EQ(allowed(*camera(1)), Array{});
    }
    EXPECT_THAT(reports.parts, ElementsAre(failedNode, failedNode));
    EXPECT_THAT(testing::internal::GetCapturedStdout(),
                StartsWith("Tarn query error for users: the directory is away\n"));
}

TEST_F(CameraReports, DirectoryNodeThatCannotBeOpenedIsReported) {
    allow(8, "A");
    adminhost::setDirectoryNodes({adminhost::localAccounts(), {"/Broken", []() -> adminhost::OpenedDirectoryNode {
                                                                   return adminhost::failure(Error{"d", 1, "no key"});
                                                               }}});
    testing::internal::CaptureStdout();
    EXPECT_EQ(allowed(*camera(1)), Array{});
    (void)testing::internal::GetCapturedStdout();
    ASSERT_EQ(reports.parts.size(), 1U);
    EXPECT_THAT(reports.parts[0].reason, StartsWith("the directory node \"/Broken\" failed"));
    EXPECT_EQ(reports.parts[0].toolMessage, "no key");
}

constexpr const char* someUuid = "5F2C7D1E-0000-4000-8000-00000000000A";

TEST_F(CameraReports, RemovalThatAFailingDirectoryCannotResolveIsReported) {
    useDirectory(std::nullopt);
    process({Dictionary{{"_id_", "C-7"},
                        {"allowedUsersAndGroups", Array{Dictionary{{"_id_", someUuid}, {"_obsoleteid_", true}}}}}});
    EXPECT_THAT(reports.parts, ElementsAre(NotDone{"configuration.cameras.0.allowedUsersAndGroups.0",
                                                   "not removed: the directory failed", "the directory is away"}));
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(CameraReports, RemovalOfARecordWithoutANumericIdIsReported) {
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "anna", someUuid)});
    process({Dictionary{{"_id_", "C-7"},
                        {"allowedUsersAndGroups", Array{Dictionary{{"_id_", someUuid}, {"_obsoleteid_", true}}}}}});
    ASSERT_EQ(reports.parts.size(), 1U);
    EXPECT_EQ(reports.parts[0].reason,
              "not removed: the directory has no user or group with this UUID and a numeric id");
    EXPECT_THAT(calls(), IsEmpty());
}

class PropertyReports : public PropertyFixture {
  protected:
    void process(const Dictionary& entry) {
        const Array changes{entry};
        (void)handler.processPropertyChangesWithRequest(&changes);
    }
    LumioRequestHandler handler;
    adminhost::test::CapturedReports reports;
};

TEST_F(PropertyReports, ChangesOfAPropertyAreReportedWithTheirUndo) {
    process({{"_newid_", true}, {"name", "n"}, {"value", "v"}});
    process({{"_id_", "1"}, {"name", "m"}, {"value", "w"}});
    process({{"_id_", "1"}, {"name", "m"}, {"value", "w"}});
    process({{"_id_", "1"}, {"protect", true}});
    process({{"_id_", "1"}, {"value", "hidden"}});
    process({{"_id_", "1"}, {"_obsoleteid_", true}});
    EXPECT_THAT(reports.changes, ElementsAre(Change{"properties", "", "n", "", nullptr, "n", false, nullptr},
                                             Change{"properties", "1", "n", "name", "n", "m", false,
                                                    undoOf("properties", {{"_id_", "1"}, {"name", "n"}})},
                                             Change{"properties", "1", "n", "value", "v", "w", false,
                                                    undoOf("properties", {{"_id_", "1"}, {"value", "v"}})},
                                             Change{"properties", "1", "m", "protect", false, true, false,
                                                    undoOf("properties", {{"_id_", "1"}, {"protect", false}})},
                                             Change{"properties", "1", "m", "value", nullptr, nullptr, true, nullptr},
                                             Change{"properties", "1", "m", "value", nullptr, nullptr, true, nullptr},
                                             Change{"properties", "1", "", "", "1", nullptr, false, nullptr, true}));
    EXPECT_THAT(reports.parts, IsEmpty());
}

TEST_F(PropertyReports, RemovalByAnIdIsUnverifiedBecauseTheRowIsNotRead) {
    process({{"_id_", "77"}, {"_obsoleteid_", true}});
    EXPECT_THAT(reports.changes, ElementsAre(Change{"properties", "77", "", "", "77", nullptr, false, nullptr, true}));
    sql("insert into properties(id,name) values(1,'n')");
    std::optional<Error> error;
    EXPECT_EQ(Property::allPropertiesWithError(error)->front()->delete_(), std::nullopt);
    EXPECT_EQ(reports.changes.back(), (Change{"properties", "1", "n", "", "n", nullptr, false, nullptr, false}));
}

/// Notes what is stored at the moment of each announcement.
class StoredMeanwhile final : public adminhost::ReportSink {
  public:
    explicit StoredMeanwhile(std::function<std::string()> stored) : _stored(std::move(stored)) { setReportSink(this); }
    StoredMeanwhile(const StoredMeanwhile&) = delete;
    StoredMeanwhile& operator=(const StoredMeanwhile&) = delete;
    ~StoredMeanwhile() { adminhost::setReportSink(nullptr); }
    void changed(Change) override {}
    void notDone(NotDone) override {}
    void becomesSecret(const adminhost::SecretPart& part) override {
        noted.push_back(part.section + '.' + part.identity + '.' + part.key + ": " + _stored());
    }

    std::vector<std::string> noted;

  private:
    std::function<std::string()> _stored;
};

TEST_F(PropertyReports, ValueIsAnnouncedAsSecretBeforeItIsProtectedAndAlsoIfThatFails) {
    sql("insert into properties(id,name,value,protect) values(1,'a','v','f'),(2,'b','w','t')");
    StoredMeanwhile sink([&] { return sql("select value,protect from properties where id=1"); });
    process({{"_id_", "2"}, {"value", "other"}});
    process({{"_id_", "1"}, {"name", "c"}});
    process({{"_id_", "77"}, {"protect", true}});
    EXPECT_THAT(sink.noted, IsEmpty());
    process({{"_id_", "1"}, {"protect", true}});
    EXPECT_THAT(sink.noted, ElementsAre("properties.1.value: v|f\n"));
    sql("update properties set value='v',protect='f' where id=1;"
        "create trigger refuse before update on properties begin select raise(abort,'no'); end");
    process({{"_id_", "1"}, {"protect", true}, {"value", "x"}});
    EXPECT_EQ(sql("select protect from properties where id=1"), "f\n");
    EXPECT_EQ(sink.noted.size(), 2U);
}

TEST_F(PropertyReports, ValueThatBecomesProtectedIsReportedAsSecretOnceWhetherOrNotItIsSent) {
    sql("insert into properties(id,name,value,protect) values(1,'a','v','f'),(2,'b','w','f')");
    process({{"_id_", "1"}, {"protect", true}});
    process({{"_id_", "2"}, {"protect", true}, {"value", "x"}});
    process({{"_id_", "2"}, {"protect", false}});
    std::vector<std::string> keys;
    for (const Change& change : reports.changes) {
        keys.push_back(change.identity + '.' + change.key);
        EXPECT_EQ(change.secret, change.key == "value");
    }
    EXPECT_THAT(keys, ElementsAre("1.protect", "1.value", "2.protect", "2.value", "2.protect"));
}

TEST_F(PropertyReports, PartsThatWereNotDoneAreReportedOnceEach) {
    sql("insert into properties(id,name,value,protect) values(1,'a','v','f'),(2,'b','no cipher','t')");
    process({{"_id_", "77"}, {"value", "w"}});
    process({{"value", "w"}});
    process({{"_obsoleteid_", true}});
    process({{"_newid_", true}, {"name", "a"}});
    process({{"_id_", "2"}, {"protect", false}});
    std::filesystem::remove(root.path(keyPath));
    process({{"_id_", "1"}, {"protect", true}});
    process({{"_newid_", true}, {"name", "c"}, {"value", "hidden"}, {"protect", true}});
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\necho 'Error: busy' >&2; exit 5\n");
    process({{"_id_", "1"}, {"value", "w"}});
    process({{"_id_", "1"}, {"_obsoleteid_", true}});
    const std::string path = "configuration.properties.0";
    EXPECT_THAT(
        reports.parts,
        ElementsAre(NotDone{path, "not changed: property not found", ""},
                    NotDone{path, "not changed: the entry has no \"_id_\"", ""},
                    NotDone{path, "not removed: the entry has no \"_id_\"", ""},
                    NotDone{path + ".name", "not written: another property has this name", ""},
                    NotDone{path + ".protect", "not changed: the stored value cannot be deciphered", ""},
                    NotDone{path + ".protect", "not written: the value cannot be protected without a usable key", ""},
                    NotDone{path + ".value", "not written: the value cannot be protected without a usable key", ""},
                    NotDone{path, "not changed: the property cannot be read", "Error: busy"},
                    NotDone{path, "not removed: the database refused it", "Error: busy"}));
}

}  // namespace
}  // namespace lumio
