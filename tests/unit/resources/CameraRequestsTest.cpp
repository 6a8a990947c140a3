#include "tests/unit/resources/AccessListsFixture.h"

namespace lumio {
namespace {

using CameraRequests = AccessLists;

TEST_F(CameraRequests, RemovalRunsTheToolWithTheUuid) {
    EXPECT_EQ(Camera::initWithGUID("C-7")->delete_(), std::nullopt);
    EXPECT_THAT(calls(), ElementsAre("--remove_camera C-7 "));
}

TEST_F(CameraRequests, RemovalAnswersTheToolsExitStatus) {
    root.writeTool(tool, "#!/bin/sh\nexit 3\n");
    EXPECT_EQ(Camera::initWithGUID("C-7")->delete_(), (Error{"adminhost_lumio", 3, std::nullopt}));
}

TEST_F(CameraRequests, CameraChangesAreAppliedInOrderAndRemovedCamerasAreNotChangedOtherwise) {
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

TEST_F(CameraRequests, CameraRemovalThatFailsIsLoggedAndTheNextEntryIsProcessed) {
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

TEST_F(CameraRequests, AdditionWithoutShortNameDoesNotKeepTheNextCameraFromItsChanges) {
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

TEST_F(CameraRequests, NullAndEmptyChangesDoNothing) {
    const Array empty;
    handler.processCameraChangesWithRequest(nullptr);
    handler.processCameraChangesWithRequest(&empty);
    EXPECT_THAT(calls(), IsEmpty());
}

TEST_F(CameraRequests, GetCamerasListsEveryCameraWithItsAccessList) {
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

TEST_F(CameraRequests, FailedListingAnswersOnlyItsCode) {
    root.sql(database, "drop table cameras");
    EXPECT_EQ(handler.getCamerasWithRequest({}).dictionary(), (Dictionary{{"readStatus", 1}}));
}

}  // namespace
}  // namespace lumio
