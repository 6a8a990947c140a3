// The test of the shared file system on one that is read-only, full or lies under a path that others can change.

#include "handler/LumioRequestHandler.h"
#include "platform/directory/LocalAccounts.h"
#include "tests/support/OwnMounts.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>
#include <optional>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {
namespace {

namespace fs = std::filesystem;
using adminhost::Dictionary;
using adminhost::Value;
using adminhost::test::Mount;

constexpr std::string_view touchFile = "/shared/__adminhost_lumio_touch_file";

class SharedFileSystem : public testing::Test {
  protected:
    void SetUp() override {
        // The only user id of the namespace is 0.
        root.write("/etc/passwd", "grid:x:0:0::/:/bin/sh\nabroad:x:4711:0::/:/bin/sh\n");
        root.write("/etc/group", "root:x:0:\n");
        adminhost::setDirectoryNodes({adminhost::localAccounts()});
    }
    [[nodiscard]] std::uint32_t outcome(const std::optional<std::string>& owner = std::nullopt) {
        return handler.validateSharedFilesystem("/shared", owner);
    }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    LumioRequestHandler handler;
};

TEST_F(SharedFileSystem, WithRoomPasses) {
    const Mount shared(root.path("/shared"));
    EXPECT_EQ(outcome(), 0U);
    EXPECT_EQ(outcome("grid"), 0U);
}

TEST_F(SharedFileSystem, ThatIsReadOnlyCannotHoldATestFile) {
    const Mount shared(root.path("/shared"));
    shared.makeReadOnly();
    EXPECT_EQ(outcome("grid"), 2U);
    EXPECT_EQ(handler.validateSettingsWithRequest({{"shared_filesystem", "/shared"}}).dictionary(),
              (Dictionary{{"command", "validateSettings"},
                          {"shared_filesystem_error", "kFilesystemNotWriteableError"},
                          {"shared_filesystem_error_detail", "Could not create a test file."}}));
}

TEST_F(SharedFileSystem, ThatIsFullCannotHoldATestFileAndKeepsNothingOfIt) {
    const Mount shared(root.path("/shared"));
    shared.fill();
    EXPECT_EQ(outcome("grid"), 2U);
    EXPECT_FALSE(fs::exists(root.path(touchFile)));
    shared.makeRoom();
    EXPECT_EQ(outcome("grid"), 0U);
}

TEST_F(SharedFileSystem, ThatDoesNotKeepThisOwnerFailsWithTheOwnersCode) {
    const Mount shared(root.path("/shared"));
    EXPECT_EQ(outcome("abroad"), 3U);
    EXPECT_FALSE(fs::exists(root.path(touchFile)));
}

TEST_F(SharedFileSystem, FreeSpaceIsThatOfTheMountedFileSystem) {
    const Mount shared(root.path("/shared"));
    EXPECT_EQ(LumioRequestHandler::getFreeSpaceOfSharedFileSystem("/shared"), 65536U);
    shared.fill();
    EXPECT_EQ(LumioRequestHandler::getFreeSpaceOfSharedFileSystem("/shared"), 0U);
    EXPECT_EQ(LumioRequestHandler::getFreeSpaceOfSharedFileSystem("/missing"), std::nullopt);
    EXPECT_EQ(LumioRequestHandler::getFreeSpaceOfSharedFileSystem(std::nullopt), std::nullopt);
}

}  // namespace
}  // namespace lumio
