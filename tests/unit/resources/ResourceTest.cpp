#include "resources/Camera.h"
#include "resources/Resource.h"
#include "tests/support/ServiceTables.h"
#include "tests/support/TemporaryRoot.h"

#include <cstdlib>
#include <ctime>

#include <gtest/gtest.h>

namespace lumio {
namespace {

using adminhost::Dictionary;
using adminhost::Value;

constexpr std::string_view database = "/Library/SorvaneProducer/Shared/Server/db.sqlite3";

class ResourceTest : public testing::Test {
  protected:
    void SetUp() override {
        ::setenv("TZ", "UTC", 1);
        ::tzset();
        root.sql(
            database,
            adminhost::test::camerasTable +
                "insert into cameras(name,uuid,created_at,recording_status,access_control_enabled,disabled) values"
                "('A','U-A','2026-01-31 08:00:00','offline','f','f'),('B','U-B','garbage','capturing','t',NULL),"
                "('C','U-C',NULL,'paused','t',NULL),('D','U-D',NULL,'idle','f','t'),('twin','U-T',NULL,NULL,NULL,'t'),"
                "('twin','U-T',NULL,NULL,NULL,'t');");
    }
    void TearDown() override { ::unsetenv("TZ"); }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    std::optional<adminhost::Error> error;
};

TEST_F(ResourceTest, RowBecomesARecordWithDatesAndIdentity) {
    const auto camera = Camera::initWithDictionary(
        Dictionary{{"uuid", "U"}, {"created_at", "2026-01-31 08:00:00"}, {"updated_at", "never"}, {"used_at", 5}});
    const Dictionary* record = camera->dictionary();
    ASSERT_NE(record, nullptr);
    EXPECT_EQ(record->get("_id_"), Value("U"));
    EXPECT_EQ(record->get("created_at"), Value(adminhost::Date(std::chrono::seconds(1769846400))));
    EXPECT_EQ(record->get("updated_at"), Value("never"));
    EXPECT_EQ(record->get("used_at"), Value(5));
}

TEST_F(ResourceTest, AQueryWritesTheErrorOnlyIfItFails) {
    error = adminhost::Error{"earlier", 77, std::nullopt};
    EXPECT_TRUE(Camera::querySorvaneDatabase<Dictionary>("select 1", error));
    EXPECT_EQ(error, (adminhost::Error{"earlier", 77, std::nullopt}));
    EXPECT_FALSE(Camera::querySorvaneDatabase<Dictionary>("select * from missing", error));
    EXPECT_EQ(error->domain, "sqliteQuery");
}

TEST_F(ResourceTest, RowWithoutUuidHasNoIdentity) {
    const auto camera = Camera::initWithDictionary(Dictionary{{"id", "1"}});
    EXPECT_FALSE(camera->data()->contains("_id_"));
    EXPECT_EQ(camera->guid(), std::nullopt);
}

TEST_F(ResourceTest, ResourceWithDictionaryIsAlwaysAPlainResource) {
    const std::unique_ptr<Resource> resource = Camera::resourceWithDictionary(Dictionary{{"uuid", "U"}});
    EXPECT_EQ(resource->resourceType(), "");
    EXPECT_TRUE(resource->description().starts_with("Resource - guid: (null), \n"));
    EXPECT_EQ(resource->guid(), "U");
}

TEST_F(ResourceTest, DescriptionOfAResourceMadeByUuidShowsANullRecordAndLoadsNothing) {
    const auto camera = Camera::initWithGUID("U-A");
    EXPECT_EQ(camera->description(), "Camera - guid: U-A, \n(null)");
}

TEST_F(ResourceTest, BaseClassMakesItsOwnObjects) {
    EXPECT_EQ(Resource::init()->description(), "Resource - guid: (null), \n(null)");
    EXPECT_EQ(Resource::initWithGUID("U-A")->description(), "Resource - guid: U-A, \n(null)");
    const auto rows = Resource::querySorvaneDatabase("select uuid,created_at from cameras where uuid='U-A'", error);
    ASSERT_TRUE(rows);
    ASSERT_EQ(rows->size(), 1U);
    EXPECT_EQ(rows->front()->resourceType(), "");
    EXPECT_EQ(rows->front()->guid(), "U-A");
    EXPECT_TRUE(rows->front()->data()->get("created_at").date());
}

TEST_F(ResourceTest, ReceivingClassIsTheResultClass) {
    const auto rows = Camera::querySorvaneDatabase("select uuid from cameras where uuid='U-A'", error);
    ASSERT_TRUE(rows);
    EXPECT_EQ(rows->front()->resourceType(), "camera");
    const auto none = Camera::querySorvaneDatabase("select uuid from cameras where uuid='none'", error);
    ASSERT_TRUE(none);
    EXPECT_TRUE(none->empty());
    EXPECT_EQ(error, std::nullopt);
    EXPECT_FALSE(Camera::querySorvaneDatabase("select uuid from missing", error));
    EXPECT_EQ(error->domain, "sqliteQuery");
}

TEST_F(ResourceTest, DescriptionPrintsTheGuidFieldAsItStands) {
    const auto camera = Camera::initWithDictionary(Dictionary{{"uuid", "U"}});
    EXPECT_TRUE(camera->description().starts_with("Camera - guid: (null), \n{\n    uuid = U;\n"));
    EXPECT_EQ(camera->guid(), "U");
    EXPECT_TRUE(camera->description().starts_with("Camera - guid: U, \n"));
}

TEST_F(ResourceTest, GuidThatWasGivenCountsBeforeTheRecords) {
    const auto camera = Camera::initWithGUID("U-A");
    camera->setData(Dictionary{{"uuid", "U-B"}});
    EXPECT_EQ(camera->guid(), "U-A");
    camera->setGuid(std::nullopt);
    EXPECT_EQ(camera->guid(), "U-B");
    camera->setData(std::nullopt);
    EXPECT_EQ(camera->guid(), "U-B") << "once asked for, it is kept";
}

TEST_F(ResourceTest, DataLoadsTheRawRowOnFirstUse) {
    const auto camera = Camera::initWithGUID("U-A");
    const Dictionary* record = camera->data();
    ASSERT_NE(record, nullptr);
    EXPECT_EQ(record->get("name"), Value("A"));
    EXPECT_EQ(record->get("created_at"), Value("2026-01-31 08:00:00"));
    EXPECT_FALSE(record->contains("_id_"));
}

TEST_F(ResourceTest, DataStaysNullUnlessExactlyOneRowComesBackAndTriesAgain) {
    EXPECT_EQ(Camera::initWithGUID("U-T")->data(), nullptr);
    EXPECT_EQ(Camera::initWithGUID(std::nullopt)->data(), nullptr);
    const auto camera = Camera::initWithGUID("U-N");
    EXPECT_EQ(camera->data(), nullptr);
    root.sql(database, "insert into cameras(name,uuid) values('N','U-N')");
    EXPECT_NE(camera->data(), nullptr);
    EXPECT_TRUE(log.lines.empty());
}

TEST_F(ResourceTest, DataOfAPlainResourceFindsNoTable) {
    Resource resource;
    resource.setGuid("U-A");
    EXPECT_EQ(resource.data(), nullptr);
}

TEST_F(ResourceTest, SetDataReplacesAndClearsTheRecord) {
    const auto camera = Camera::initWithGUID("none");
    camera->setData(Dictionary{{"a", 1}});
    EXPECT_EQ(*camera->data(), (Dictionary{{"a", 1}}));
    camera->setData(std::nullopt);
    EXPECT_EQ(camera->data(), nullptr);
}

TEST_F(ResourceTest, BaseDeleteDoesNothingAndReportsNoError) {
    Resource resource;
    EXPECT_EQ(resource.delete_(), std::nullopt);
    Resource::initialize();
    EXPECT_EQ(resource.data(), nullptr);
}

TEST_F(ResourceTest, ListsEnabledCamerasWithTwelveColumnsAndTheAccessSwitchAsText) {
    const auto cameras = Camera::allCamerasWithError(error);
    ASSERT_TRUE(cameras);
    ASSERT_EQ(cameras->size(), 3U);
    const Dictionary& a = *(*cameras)[0]->data();
    std::vector<std::string> keys;
    for (const auto& entry : a) {
        keys.push_back(entry.key);
    }
    EXPECT_EQ(keys, (std::vector<std::string>{"id", "name", "uuid", "create_user_uuid", "created_at",
                                              "update_user_uuid", "updated_at", "last_recording_uuid", "use_user_uuid",
                                              "used_at", "recording_status", "access_control_enabled", "_id_"}));
    EXPECT_EQ(a.get("access_control_enabled"), Value("f"));
    EXPECT_EQ((*cameras)[1]->data()->get("created_at"), Value("garbage"));
}

TEST_F(ResourceTest, ListingFailureIsNothingWithTheError) {
    root.sql(database, "drop table cameras");
    EXPECT_FALSE(Camera::allCamerasWithError(error));
    EXPECT_EQ(error->domain, "sqliteQuery");
}

TEST_F(ResourceTest, CountsOfCamerasTotalOnlineAndRunning) {
    EXPECT_EQ(Camera::getTotalCameraCount(), 3U);
    EXPECT_EQ(Camera::getOnlineCameraCount(), 2U);
    EXPECT_EQ(Camera::getRunningCameraCount(), 2U);
    EXPECT_TRUE(log.lines.empty());
}

TEST_F(ResourceTest, CameraWhoseDisabledIsNullCountsAsEnabled) {
    root.sql(database, "delete from cameras where name!='B'");
    EXPECT_EQ(Camera::getTotalCameraCount(), 1U);
}

TEST_F(ResourceTest, CapturingMatchesAnyTextThatBeginsWithItInAnyCase) {
    root.sql(database, "update cameras set recording_status='Capturing_1' where name='A'");
    EXPECT_EQ(Camera::getRunningCameraCount(), 3U);
}

TEST_F(ResourceTest, CameraWithoutRecordingStatusIsNotOnline) {
    root.sql(database, "update cameras set recording_status=NULL where name='B'");
    EXPECT_EQ(Camera::getOnlineCameraCount(), 1U);
    EXPECT_EQ(Camera::getTotalCameraCount(), 3U);
}

TEST_F(ResourceTest, CountThatFailsIsLoggedAndZero) {
    root.sql(database, "drop table cameras");
    EXPECT_EQ(Camera::getTotalCameraCount(), 0U);
    EXPECT_EQ(Camera::getOnlineCameraCount(), 0U);
    EXPECT_EQ(Camera::getRunningCameraCount(), 0U);
    ASSERT_EQ(log.lines.size(), 3U);
    EXPECT_TRUE(
        log.lines[0].starts_with("Error getting total camera count: sqliteQuery (1): Can't execute sqlite3 query: "));
    EXPECT_TRUE(log.lines[1].starts_with("Error getting online camera count: "));
    EXPECT_TRUE(log.lines[2].starts_with("Error getting running camera count: "));
}

}  // namespace
}  // namespace lumio
