// The statements of cameras and access lists, compared to the letter: they are part of the service's contract.

#include "tests/support/RecordedStatements.h"
#include "tests/unit/resources/AccessListsFixture.h"
#include "tests/unit/resources/FixedDirectory.h"

namespace lumio {
namespace {

class CameraStatements : public AccessLists {
  protected:
    void SetUp() override {
        AccessLists::SetUp();
        statements.emplace(root);
    }

    std::optional<adminhost::test::RecordedStatements> statements;
    std::optional<Error> error;
};

constexpr const char* listing =
    "select id,name,uuid,create_user_uuid,created_at,update_user_uuid,updated_at,last_recording_uuid,use_user_uuid,"
    "used_at,recording_status,access_control_enabled from cameras where (disabled != 't' OR disabled is NULL)";

TEST_F(CameraStatements, ListingCamerasSelectsTwelveColumnsOfTheEnabledOnes) {
    ASSERT_TRUE(Camera::allCamerasWithError(error));
    EXPECT_THAT(statements->take(), ElementsAre(listing));
}

TEST_F(CameraStatements, ListingCamerasForARequestQueriesTheAccessListOfEach) {
    (void)handler.getCamerasWithRequest({});
    // Several of these run at a time.
    const std::vector<std::string> taken = statements->take();
    ASSERT_FALSE(taken.empty());
    EXPECT_EQ(taken.front(), listing);
    EXPECT_THAT(
        taken,
        testing::UnorderedElementsAre(
            listing,
            "select record_uuid from access_control_entries where resource_type = 'Camera' and resource_id = '7'",
            "select record_uuid from access_control_entries where resource_type = 'Camera' and resource_id = '8'"));
}

TEST_F(CameraStatements, AccessListOfACameraWithoutARecordIsAskedForWithANullId) {
    (void)Camera::initWithGUID("C-7")->getUserAndGroupACLs();
    EXPECT_THAT(statements->take(), ElementsAre("select record_uuid from access_control_entries where resource_type = "
                                                "'Camera' and resource_id = '(null)'"));
}

TEST_F(CameraStatements, CountsCompareTheStatusInDoubleQuotesAndEndInASemicolon) {
    (void)Camera::getTotalCameraCount();
    (void)Camera::getOnlineCameraCount();
    (void)Camera::getRunningCameraCount();
    EXPECT_THAT(
        statements->take(),
        ElementsAre("select count(*) from cameras where (disabled != 't' OR disabled is NULL);",
                    "select count(*) from cameras where ((recording_status!=\"offline\") AND (disabled != 't' OR "
                    "disabled is NULL));",
                    "select count(*) from cameras where ((recording_status like \"capturing%\" OR "
                    "recording_status=\"paused\") AND (disabled != 't' OR disabled is NULL));"));
}

TEST_F(CameraStatements, LazyLoadSelectsTheRowByItsUuidInDoubleQuotes) {
    (void)Camera::initWithGUID("C-7")->data();
    EXPECT_THAT(statements->take(), ElementsAre("select * from cameras where uuid=\"C-7\""));
}

TEST_F(CameraStatements, AccessSwitchIsAnUpdateByUuid) {
    Camera::initWithGUID("C-7")->setACLEnabled(true);
    Camera::initWithGUID("C-7")->setACLEnabled(false);
    Camera::initWithGUID(std::nullopt)->setACLEnabled(true);
    EXPECT_THAT(statements->take(), ElementsAre("update cameras set access_control_enabled=\"t\" where uuid=\"C-7\"",
                                                "update cameras set access_control_enabled=\"f\" where uuid=\"C-7\""));
}

TEST_F(CameraStatements, AccessSwitchIsReadWithLeadingZerosAndWrittenBeforeTheAccessListChanges) {
    // Both tools write to one file, so their order shows.
    root.writeTool(tool,
                   "#!/bin/sh\nprintf 'lumioconfig %s\\036' \"$1\" >> '" + root.path("/statements").string() + "'\n");
    const Array changes{Dictionary{
        {"allowedUsersAndGroups", Array{Dictionary{{"type", "user"}, {"shortName", "bo"}, {"_newid_", true}}}},
        {"access_control_enabled", "01"},
        {"_id_", "C-8"}}};
    handler.processCameraChangesWithRequest(&changes);
    EXPECT_THAT(statements->take(), ElementsAre("update cameras set access_control_enabled=\"t\" where uuid=\"C-8\"",
                                                "lumioconfig --add_access"));
    EXPECT_EQ(root.sql(database, "select access_control_enabled from cameras where id=8"), "t\n");
}

TEST_F(CameraStatements, RemovedCameraRunsNoStatementOfItsOwn) {
    const Array changes{Dictionary{{"_id_", "C-8"}, {"_obsoleteid_", true}, {"access_control_enabled", true}}};
    handler.processCameraChangesWithRequest(&changes);
    EXPECT_THAT(statements->take(), IsEmpty());
}

TEST_F(CameraStatements, AllowedGroupsComparesItsTypeExactlyToo) {
    const auto aula = camera();
    aula->setData(Dictionary{
        {"allowedUsersAndGroups",
         Array{Dictionary{{"type", "User"}, {"shortName", "a"}}, Dictionary{{"type", "user"}, {"shortName", "b"}},
               Dictionary{{"type", "group"}, {"shortName", "c"}}, Dictionary{{"type", "Group"}, {"shortName", "d"}}}}});
    ASSERT_EQ(aula->allowedGroups().size(), 1U);
    EXPECT_EQ(aula->allowedGroups()[0].dictionary()->get("shortName"), Value("b"));
}

TEST_F(CameraStatements, FailingLazyLoadIsSilent) {
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\necho 'Error: busy' >&2\nexit 5\n");
    testing::internal::CaptureStdout();
    testing::internal::CaptureStderr();
    EXPECT_EQ(Camera::initWithGUID("C-7")->data(), nullptr);
    EXPECT_EQ(testing::internal::GetCapturedStdout(), "");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "");
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(CameraStatements, FailedCountsAreLoggedWithTheToolsWords) {
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nprintf 'Error: busy' >&2\nexit 5\n");
    EXPECT_EQ(Camera::getTotalCameraCount(), 0U);
    EXPECT_EQ(Camera::getOnlineCameraCount(), 0U);
    EXPECT_EQ(Camera::getRunningCameraCount(), 0U);
    const std::string rest = " camera count: sqliteQuery (5): Can't execute sqlite3 query: Error: busy";
    EXPECT_THAT(log.lines, ElementsAre("Error getting total" + rest, "Error getting online" + rest,
                                       "Error getting running" + rest));
}

}  // namespace
}  // namespace lumio
