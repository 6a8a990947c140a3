#include "tests/unit/handler/WriteSettingsFixture.h"

namespace lumio {
namespace {

using SetupMarker = WriteSettings;

TEST_F(SetupMarker, MarkerThatIsPresentIsLeftAloneAndNothingIsLogged) {
    root.write(marker, "old");
    (void)write({});
    EXPECT_EQ(root.read(marker), "old");
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(SetupMarker, MarkerAndItsDirectoryAreMade) {
    fs::remove_all(root.path("/var/lumio"));
    handler.markSetupDone();
    EXPECT_TRUE(handler.checkSetupDone());
    EXPECT_EQ(fs::file_size(root.path(marker)), 0U);
    struct stat status {};
    ASSERT_EQ(::stat(root.path("/var/lumio/server").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0755U);
    if (::geteuid() == 0) {
        EXPECT_EQ(status.st_uid, 0U);
        EXPECT_EQ(status.st_gid, 0U) << "a missing group wheel is group 0";
        EXPECT_THAT(log.lines, IsEmpty());
    } else {
        EXPECT_THAT(
            log.lines,
            Contains(StartsWith("adminhost_lumio: failed to create directory at path: /var/lumio/server, error: ")));
    }
}

TEST_F(SetupMarker, MarkerDirectoryBelongsToTheRootsGroupWheel) {
    fs::remove_all(root.path("/var/lumio"));
    root.write("/etc/group", "root:x:0:\nwheel:x:4711:\n");
    handler.markSetupDone();
    EXPECT_TRUE(handler.checkSetupDone());
    struct stat status {};
    ASSERT_EQ(::stat(root.path("/var/lumio/server").c_str(), &status), 0);
    if (::geteuid() == 0) {
        EXPECT_EQ(status.st_gid, 4711U);
        EXPECT_THAT(log.lines, IsEmpty());
    } else {
        // Only the superuser can change the owner of a directory.
        EXPECT_THAT(log.lines, testing::ElementsAre(HasSubstr("error: posix (1): cannot set the owner")));
    }
}

TEST_F(SetupMarker, ExistingMarkerDirectoryKeepsItsAttributes) {
    fs::permissions(root.path("/var/lumio/server"), fs::perms(0700));
    handler.markSetupDone();
    EXPECT_TRUE(handler.checkSetupDone());
    EXPECT_EQ(fs::status(root.path("/var/lumio/server")).permissions(), fs::perms(0700));
}

TEST_F(SetupMarker, MarkerThatCannotBeMadeIsLoggedAndTheStatusStaysZero) {
    fs::remove_all(root.path("/var/lumio"));
    root.write("/var/lumio", "a file where the directory belongs");
    EXPECT_EQ(write({}).get("writeStatus"), Value(0));
    ASSERT_EQ(log.lines.size(), 2U);
    EXPECT_THAT(log.lines[0],
                StartsWith("adminhost_lumio: failed to create directory at path: /var/lumio/server, error: "));
    EXPECT_EQ(log.lines[1], "adminhost_lumio: failed to create file at path: /var/lumio/server/.lumio_setup_done");
}

}  // namespace
}  // namespace lumio
