#include "handler/LumioRequestHandler.h"
#include "platform/directory/LocalAccounts.h"
#include "tests/support/TemporaryRoot.h"
#include "tests/unit/resources/FixedDirectory.h"

#include <filesystem>
#include <fstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace lumio {
namespace {

namespace fs = std::filesystem;
using adminhost::Dictionary;
using adminhost::Value;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr std::string_view touchFile = "/shared/__adminhost_lumio_touch_file";
constexpr std::string_view tool = "/usr/bin/nimbo";

class Validation : public testing::Test {
  protected:
    void SetUp() override {
        fs::create_directory(root.path("/shared"));
        const std::string self = std::to_string(::geteuid());
        root.write("/etc/passwd", "grid:x:" + self + ":20::/var/empty:/bin/sh\nother:x:4711:20::/var/empty:/bin/sh\n" +
                                      "12345:x:" + self + ":20::/var/empty:/bin/sh\n");
        root.write("/etc/group", "staff:x:20:\n");
        root.writeTool(tool, "#!/bin/sh\necho called >> " + root.path("/calls").string() + "\nexit 9\n");
        adminhost::setDirectoryNodes({adminhost::localAccounts()});
    }
    /// Whatever the result, no test file is left, unless the test says so.
    void TearDown() override {
        EXPECT_EQ(fs::exists(fs::symlink_status(root.path(touchFile))), touchFileStays);
        adminhost::setDirectoryNodes({adminhost::localAccounts()});
    }

    [[nodiscard]] Dictionary validate(const Dictionary& request) {
        const auto response = handler.validateSettingsWithRequest(request);
        EXPECT_EQ(response.kind(), adminhost::Response::Kind::dictionary);
        EXPECT_EQ(response.dictionary().get("command"), Value("validateSettings"));
        return response.dictionary();
    }
    [[nodiscard]] static Dictionary answer(std::optional<std::string_view> error = {},
                                           std::optional<std::string_view> detail = {}) {
        Dictionary expected{{"command", "validateSettings"}};
        if (error) {
            expected.set("shared_filesystem_error", *error);
        }
        if (detail) {
            expected.set("shared_filesystem_error_detail", *detail);
        }
        return expected;
    }
    [[nodiscard]] std::string logged(int code) const {
        return "adminhost_lumio: validateSharedFilesystem result: " + std::to_string(code);
    }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    LumioRequestHandler handler;
    bool touchFileStays = false;
};

TEST_F(Validation, EmptyRequestChecksNothing) {
    EXPECT_EQ(validate({}), answer());
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(Validation, DirectoryWithoutAUsernamePassesWithoutChangingAnOwner) {
    EXPECT_EQ(validate({{"shared_filesystem", "/shared"}}), answer());
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(Validation, DirectoryAndAnOwnerThatCanBeSetPass) {
    EXPECT_EQ(validate({{"shared_filesystem", "/shared"}, {"nimbo_client_username", "grid"}}), answer());
    EXPECT_EQ(handler.validateSharedFilesystem("/shared", "grid"), 0U);
}

TEST_F(Validation, MissingPathRegularFileAndEmptyPathDoNotExist) {
    root.write("/file", "x");
    for (const char* path : {"/missing", "/file", "", "/file/below"}) {
        log.lines.clear();
        EXPECT_EQ(validate({{"shared_filesystem", path}, {"nimbo_client_username", "grid"}}),
                  answer("kFilesystemNotExistsError"))
            << path;
        EXPECT_THAT(log.lines, ElementsAre(logged(1)));
    }
    EXPECT_EQ(root.read("/file"), "x");
}

TEST_F(Validation, TestFileThatCannotBeCreatedIsNotWriteable) {
    fs::create_directory(root.path(touchFile));
    EXPECT_EQ(validate({{"shared_filesystem", "/shared"}}),
              answer("kFilesystemNotWriteableError", "Could not create a test file."));
    EXPECT_THAT(log.lines, ElementsAre(logged(2)));
    EXPECT_TRUE(fs::is_directory(root.path(touchFile))) << "a directory of that name is left";
    touchFileStays = true;
}

TEST_F(Validation, UnknownOwnerCannotBeSetAndNoTestFileIsLeft) {
    EXPECT_EQ(validate({{"shared_filesystem", "/shared"}, {"nimbo_client_username", "nobody here"}}),
              answer("kFilesystemNotWriteableError",
                     "Able to create a test file as root. Can't change owner to nobody here"));
    EXPECT_THAT(log.lines, ElementsAre(logged(3)));
}

TEST_F(Validation, EmptyUsernameIsAnOwnerThatCannotBeSet) {
    EXPECT_EQ(validate({{"shared_filesystem", "/shared"}, {"nimbo_client_username", ""}}),
              answer("kFilesystemNotWriteableError", "Able to create a test file as root. Can't change owner to "));
    EXPECT_THAT(log.lines, ElementsAre(logged(3)));
}

TEST_F(Validation, OwnerOfDigitsOnlyIsAnAccountName) {
    EXPECT_EQ(handler.validateSharedFilesystem("/shared", "12345"), 0U);
    EXPECT_EQ(handler.validateSharedFilesystem("/shared", std::to_string(::geteuid())), 3U) << "not a user id";
}

TEST_F(Validation, OwnerIsTheFirstRecordThatTheDirectoryFinds) {
    const auto node = [](const std::string& name, const std::string& id) {
        DirectoryRecord person = record(adminhost::directory::users, "twice", std::nullopt);
        person.attributes[std::string(adminhost::directory::uniqueID)] = {id};
        return adminhost::DirectoryNodeSource{
            name, [person] { return std::make_unique<FixedNode>(std::vector<DirectoryRecord>{person}); }};
    };
    const std::string self = std::to_string(::geteuid());
    adminhost::setDirectoryNodes({node("/A", self), node("/B", "not a number")});
    EXPECT_EQ(handler.validateSharedFilesystem("/shared", "twice"), 0U);
    adminhost::setDirectoryNodes({node("/B", "not a number"), node("/A", self)});
    EXPECT_EQ(handler.validateSharedFilesystem("/shared", "twice"), 3U);
    for (const char* id : {"-1", "4294967295", "99999999999", "", " 0", "0x0"}) {
        adminhost::setDirectoryNodes({node("/A", id)});
        EXPECT_EQ(handler.validateSharedFilesystem("/shared", "twice"), 3U) << "user id " << id;
    }
}

TEST_F(Validation, DirectoryThatFailsMeansThatTheOwnerCannotBeSet) {
    fs::remove(root.path("/etc/passwd"));
    EXPECT_EQ(handler.validateSharedFilesystem("/shared", "grid"), 3U);
}

TEST_F(Validation, OwnerOfTheTestFileIsTheAccountsUserId) {
    if (::geteuid() != 0) {
        EXPECT_EQ(handler.validateSharedFilesystem("/shared", "other"), 3U) << "only the superuser can do that";
        return;
    }
    EXPECT_EQ(handler.validateSharedFilesystem("/shared", "other"), 0U);
}

TEST_F(Validation, TestFileThatExistsIsReplacedAndALinkIsNotFollowed) {
    root.write(touchFile, "old");
    EXPECT_EQ(handler.validateSharedFilesystem("/shared", std::nullopt), 0U);
    root.write("/precious", "old");
    fs::create_symlink(root.path("/precious"), root.path(touchFile));
    EXPECT_EQ(handler.validateSharedFilesystem("/shared", "grid"), 0U);
    EXPECT_EQ(root.read("/precious"), "old");
}

TEST_F(Validation, PathThatEndsInASlashNamesTheSameFile) {
    root.write(touchFile, "old");
    EXPECT_EQ(validate({{"shared_filesystem", "/shared/"}}), answer());
}

TEST_F(Validation, SharedFileSystemMayBeALinkToADirectory) {
    fs::create_directory_symlink(root.path("/shared"), root.path("/link"));
    EXPECT_EQ(validate({{"shared_filesystem", "/link"}}), answer());
    fs::create_symlink("/nonexistent", root.path("/dangling"));
    EXPECT_EQ(validate({{"shared_filesystem", "/dangling"}}), answer("kFilesystemNotExistsError"));
}

TEST_F(Validation, GridIsCheckedOnlyWithThreeValuesThatAreNotEmpty) {
    const Dictionary whole{{"nimbo_client_username", "grid"},
                           {"nimbo_client_password", "planted-secret"},
                           {"nimbo_controller", "grid.example"}};
    for (const char* key : {"nimbo_client_username", "nimbo_client_password", "nimbo_controller"}) {
        for (const Value& replacement : {Value(), Value(""), Value(5)}) {
            Dictionary request = whole;
            request.set(key, replacement);
            EXPECT_EQ(validate(request), answer()) << key;
        }
    }
    Dictionary expected = answer();
    expected.set("nimbo_controller_error", "kNimboControllerCheckFailedError");
    EXPECT_EQ(validate(whole), expected) << "the account has no Kerberos authority";
    EXPECT_FALSE(fs::exists(root.path("/calls")));
    EXPECT_FALSE(log.contains("planted-secret"));
}

TEST_F(Validation, GridIsCheckedAlsoIfTheSharedFileSystemFails) {
    Dictionary expected = answer("kFilesystemNotExistsError");
    expected.set("nimbo_controller_error", "kNimboControllerCheckFailedError");
    const Dictionary given = validate({{"shared_filesystem", "/missing"},
                                       {"nimbo_client_username", "grid"},
                                       {"nimbo_client_password", "planted-secret"},
                                       {"nimbo_controller", "grid.example"}});
    EXPECT_EQ(given, expected);
    std::vector<std::string> keys;
    for (const auto& entry : given) {
        keys.push_back(entry.key);
    }
    EXPECT_THAT(keys, ElementsAre("command", "shared_filesystem_error", "nimbo_controller_error"));
}

TEST_F(Validation, ValuesThatAreNotTextsCountAsMissing) {
    EXPECT_EQ(validate({{"shared_filesystem", 5}}), answer());
    EXPECT_EQ(validate({{"shared_filesystem", "/shared"}, {"nimbo_client_username", 5}}), answer());
}

}  // namespace
}  // namespace lumio
