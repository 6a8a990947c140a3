// The check of the grid controller with a real KDC. The stand-in for the grid tool asks the KDC for a service ticket
// with the cache that it is given, and fails with a status of its own if it cannot.

#include "handler/LumioRequestHandler.h"
#include "platform/task/Task.h"
#include "platform/task/TaskBounds.h"
#include "tests/support/CapturedReports.h"
#include "tests/support/Kdc.h"
#include "tests/support/MemoryDirectory.h"
#include "tests/support/Program.h"
#include "tests/support/TemporaryRoot.h"

#include <chrono>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace lumio {
namespace {

namespace fs = std::filesystem;
using adminhost::Dictionary;
using adminhost::Value;
using adminhost::test::runProgram;
using support::ScopedEnvironment;
using testing::HasSubstr;
using testing::Not;

constexpr const char* password = "planted grid secret";
constexpr const char* controller = "grid.example.org";
constexpr std::string_view cacheFile = "/var/lumio/server/adminhostd_krb_cc";
constexpr std::string_view tool = "/usr/bin/nimbo";
constexpr std::int32_t noServiceTicket = 11;  ///< the stand-in's status if the KDC does not give it a ticket
constexpr std::int32_t killed = 128 + 9;

support::Kdc& realm() {
    static const std::unique_ptr<support::Kdc> kdc = [] {
        auto started = std::make_unique<support::Kdc>();
        const std::string with = std::string("addprinc -pw \"") + password + "\" ";
        started->admin(with + "grid\n" + with + "+requires_preauth careful\n" + with + "-expire yesterday expired\n" +
                       with + "-pwexpire yesterday oldpassword\n" + with + "-allow_tix locked\n" + with +
                       "-maxlife 10seconds short\naddprinc -randkey nimbo/grid.example.org\n");
        return started;
    }();
    return *kdc;
}

class GridCheck : public testing::Test {
  protected:
    void SetUp() override {
        fs::create_directories(root.path("/var/lumio/server"));
        const std::string in = root.path("").string();
        root.writeTool(tool, "#!/bin/sh\nprintf '%s\\n' \"$@\" >" + in + "/arguments\nenv >" + in +
                                 "/environment\necho run >>" + in + "/runs\n[ ! -f " + in + "/behaviour ] || . " + in +
                                 "/behaviour\n/usr/bin/kvno -q nimbo/grid.example.org >/dev/null || exit 11\ncat " +
                                 in + "/list\n");
        root.write("/list",
                   "<plist version=\"1.0\"><dict><key>gridList</key><array><string>0</string></array></dict>"
                   "</plist>");
        for (const char* user : {"grid", "careful", "expired", "oldpassword", "locked", "short", "unknown"}) {
            nodes.addUser(user, "1", {authorityOf(user)});
        }
    }
    /// After every check, no ticket is left, and the password is nowhere.
    void TearDown() override {
        EXPECT_FALSE(fs::exists(fs::symlink_status(root.path(cacheFile))));
        EXPECT_FALSE(log.contains(password));
        EXPECT_TRUE(log.lines.empty()) << "nothing is logged here: " << log.lines.front();
        for (const char* file : {"/arguments", "/environment"}) {
            EXPECT_THAT(root.read(file), Not(HasSubstr(password)));
        }
        for (const auto& entry : fs::recursive_directory_iterator(root.path(""))) {
            if (entry.is_regular_file() && !entry.is_symlink() && entry.path() != root.path("/behaviour")) {
                EXPECT_THAT(root.read(entry.path().string().substr(root.path("").string().size())),
                            Not(HasSubstr(password)))
                    << entry.path();
            }
        }
        adminhost::setTaskDeadline(std::nullopt);
        adminhost::setTaskOutputBound(adminhost::taskDefaultOutputBound);
    }

    [[nodiscard]] static std::string authorityOf(const std::string& user) {
        return ";Kerberosv5;;" + user + "@NIMBO.TEST;NIMBO.TEST;";
    }
    [[nodiscard]] std::int32_t check(const std::string& user = "grid", std::string_view given = password) {
        error = "from before";
        return handler.checkNimboController(controller, user, given, &error);
    }
    [[nodiscard]] bool hasRun() const { return !root.read("/runs").empty(); }
    /// Shell commands that the stand-in runs before it asks the KDC.
    void behave(std::string_view commands) const { root.write("/behaviour", commands); }
    /// A ticket in the cache file, from Kerberos's own tool.
    void leaveTicketOf(const std::string& principal) const {
        const auto made = runProgram({"/usr/bin/kinit", "-c", "FILE:" + root.path(cacheFile).string(), principal},
                                     adminhost::test::Errors::merge, std::string(password) + "\n");
        ASSERT_EQ(made.status, 0) << made.output;
    }

    ScopedEnvironment environment{realm().environment()};
    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    adminhost::test::MemoryDirectory nodes;
    LumioRequestHandler handler;
    std::string error;
};

TEST_F(GridCheck, IsZeroWhenTheToolListsAGridWithTheTicket) {
    EXPECT_EQ(check(), 0);
    EXPECT_EQ(root.read("/arguments"), "-h\ngrid.example.org\n-auth\nKerberos\n-f\nxml\n-grid\nlist\n");
    EXPECT_THAT(root.read("/environment"), HasSubstr("\nKRB5CCNAME=FILE:" + root.path(cacheFile).string() + "\n"));
    EXPECT_EQ(error, "");
    EXPECT_EQ(check("careful"), 0) << "with preauthentication";
}

TEST_F(GridCheck, CacheIsReadableForItsOwnerOnlyWhileTheToolIsRunning) {
    behave("stat -c %a \"${KRB5CCNAME#FILE:}\" >" + root.path("/mode").string());
    EXPECT_EQ(check(), 0);
    EXPECT_EQ(root.read("/mode"), "600\n");
}

TEST_F(GridCheck, AccountWithoutAKerberosAuthorityIs1AndNeitherCacheNorToolIsUsed) {
    nodes.addUser("plain", "2", {";ShadowHash;", ";basic;", "Kerberosv5", "", ";kerberosv5;;plain@NIMBO.TEST;"});
    nodes.addUser("none", "3");
    EXPECT_EQ(check("plain"), 1);
    EXPECT_EQ(check("none"), 1);
    EXPECT_EQ(check("not in the directory"), 1);
    EXPECT_FALSE(hasRun());
    EXPECT_EQ(error, "");
}

TEST_F(GridCheck, DirectoryThatFailsIs1) {
    nodes->nameQuery = adminhost::Error{"ldap", -1, "Can't contact LDAP server"};
    EXPECT_EQ(check(), 1);
    nodes->opening = nodes->nameQuery;
    EXPECT_EQ(check(), 1);
    EXPECT_FALSE(hasRun());
}

TEST_F(GridCheck, FirstKerberosAuthorityCountsEvenIfItHasNoPrincipal) {
    nodes.addUser("short field", "2", {";Kerberosv5;", authorityOf("grid")});
    EXPECT_EQ(check("short field"), 1);
    EXPECT_FALSE(hasRun());
    nodes.addUser("later", "3", {";ShadowHash;", authorityOf("grid"), ";Kerberosv5;;unknown@NIMBO.TEST;"});
    EXPECT_EQ(check("later"), 0);
    nodes.addUser("four fields", "4", {"x;Kerberosv5;y;grid@NIMBO.TEST"});
    EXPECT_EQ(check("four fields"), 0) << "other fields are not read";
}

TEST_F(GridCheck, WrongPasswordIsTheStatusOfTheToolThatRunsWithoutATicket) {
    EXPECT_EQ(check("grid", "wrong"), noServiceTicket);
    EXPECT_TRUE(hasRun());
    EXPECT_NE(error, "");
    EXPECT_EQ(check("careful", "wrong"), noServiceTicket);
    EXPECT_EQ(check("grid", ""), noServiceTicket);
}

TEST_F(GridCheck, AccountsThatTheKdcRefusesAreTheStatusOfTheTool) {
    for (const char* user : {"expired", "oldpassword", "locked", "unknown"}) {
        EXPECT_EQ(check(user), noServiceTicket) << user;
    }
}

TEST_F(GridCheck, KdcThatIsDownIsTheStatusOfTheTool) {
    root.write("/krb5.conf", support::Kdc::clientConfiguration("NIMBO.TEST", 1));
    const ScopedEnvironment down({{"KRB5_CONFIG", root.path("/krb5.conf").string()}});
    EXPECT_EQ(check(), noServiceTicket);
}

TEST_F(GridCheck, CacheThatHoldsAGoodTicketIs3AndIsDestroyedWithoutRunningTheTool) {
    leaveTicketOf("grid");
    EXPECT_EQ(check(), 3);
    EXPECT_FALSE(hasRun());
    EXPECT_FALSE(fs::exists(root.path(cacheFile)));
    EXPECT_EQ(check(), 0) << "the next check finds no ticket";
}

TEST_F(GridCheck, TicketThatEndsSoonIsReplaced) {
    leaveTicketOf("short");
    EXPECT_EQ(check("short"), 0);
}

TEST_F(GridCheck, CacheOfAnotherAccountIsReplaced) {
    leaveTicketOf("careful");
    EXPECT_EQ(check(), 0);
}

TEST_F(GridCheck, PrincipalThatCannotBeParsedIs3AndALeftCacheIsRemoved) {
    nodes.addUser("unparsable", "2", {";Kerberosv5;;a@b@c;NIMBO.TEST;"});
    leaveTicketOf("grid");
    EXPECT_EQ(check("unparsable"), 3);
    EXPECT_FALSE(hasRun());
    nodes.addUser("empty", "3", {";Kerberosv5;;;"});
    EXPECT_EQ(check("empty"), noServiceTicket) << "an empty name is a principal that the KDC does not know";
}

TEST_F(GridCheck, MissingCacheDirectoryIs3) {
    fs::remove_all(root.path("/var/lumio"));
    EXPECT_EQ(check(), 3);
    EXPECT_FALSE(hasRun());
}

TEST_F(GridCheck, CacheThatIsALinkIsReplacedAndTheFileItNamesIsLeft) {
    leaveTicketOf("grid");
    fs::rename(root.path(cacheFile), root.path("/elsewhere"));
    const std::string before = root.read("/elsewhere");
    fs::create_symlink(root.path("/elsewhere"), root.path(cacheFile));
    EXPECT_EQ(check(), 0) << "the ticket that the link leads to is not used";
    EXPECT_EQ(root.read("/elsewhere"), before);
}

TEST_F(GridCheck, StatusOfTheToolIsTheResultAsItIs) {
    for (const std::int32_t status : {1, 2, 3, 4, 5, 255}) {
        behave("echo 'no grid here' >&2; exit " + std::to_string(status) + "\n");
        EXPECT_EQ(check(), status);
        EXPECT_EQ(error, "no grid here\n");
    }
    behave("kill -KILL $$\n");
    EXPECT_EQ(check(), killed);
}

TEST_F(GridCheck, ErrorOutputOfTheToolNeedsNoPlace) {
    behave("echo lost >&2\n");
    EXPECT_EQ(handler.checkNimboController(controller, "grid", password, nullptr), 0);
}

TEST_F(GridCheck, OutputWithoutAGridIs2) {
    for (const char* list :
         {"<plist><dict><key>gridList</key><array/></dict></plist>", "<plist><dict/></plist>",
          "<plist><array><string>gridList</string></array></plist>",
          "<plist><dict><key>gridList</key><string>0</string></dict></plist>",
          "<plist><dict><key>gridList</key><dict><key>0</key><string>0</string></dict></dict></plist>",
          "<plist><string>gridList</string></plist>", "gridList = (0)", "", "\xff\xfe garbage",
          "<plist><dict><key>gridList</key><array><string>0</string></array></dict>"}) {
        root.write("/list", list);
        EXPECT_EQ(check(), 2) << list;
    }
}

TEST_F(GridCheck, MissingToolIsNotZero) {
    fs::remove(root.path(tool));
    EXPECT_EQ(check(), -1);
    EXPECT_THAT(error, HasSubstr("/usr/bin/nimbo: No such file or directory"));
}

TEST_F(GridCheck, ToolThatHangsIsEndedAtTheDeadlineOfTheRequest) {
    behave("sleep 100\n");
    adminhost::setTaskDeadline(std::chrono::steady_clock::now() + std::chrono::seconds(1));
    EXPECT_EQ(check(), killed);
}

TEST_F(GridCheck, ToolThatPrintsMoreThanTheBoundFails) {
    constexpr std::size_t bound = std::size_t{1} << 20U;
    adminhost::setTaskOutputBound(bound);
    behave("head -c 2000000 /dev/zero\n");
    EXPECT_EQ(check(), -1);
}

TEST_F(GridCheck, ControllerNameIsOneArgumentWhateverItHolds) {
    EXPECT_EQ(handler.checkNimboController("a b;$(reboot)\n-x", "grid", password, nullptr), 0);
    EXPECT_THAT(root.read("/arguments"), testing::StartsWith("-h\na b;$(reboot)\n-x\n-auth\n"));
}

TEST_F(GridCheck, StateAndValidationShowTheOutcome) {
    EXPECT_EQ(handler.getStateOfNimboController(controller, "grid", password), "kNimboAvailable");
    EXPECT_EQ(handler.getStateOfNimboController(controller, "grid", "wrong"), "kNimboUnavailable");
    Dictionary request{
        {"nimbo_controller", controller}, {"nimbo_client_username", "grid"}, {"nimbo_client_password", password}};
    const Dictionary passed{{"command", "validateSettings"}};
    EXPECT_EQ(handler.validateSettingsWithRequest(request).dictionary(), passed);
    request.set("nimbo_client_password", "wrong");
    Dictionary failed = passed;
    failed.set("nimbo_controller_error", "kNimboControllerCheckFailedError");
    EXPECT_EQ(handler.validateSettingsWithRequest(request).dictionary(), failed);
}

TEST_F(GridCheck, AttributeOfAUserHasAllItsValues) {
    nodes.addUser("many", "2", {"a", "b"});
    using adminhost::directory::authenticationAuthority;
    EXPECT_EQ(LumioRequestHandler::getAttribute(authenticationAuthority, "many"), (std::vector<std::string>{"a", "b"}));
    EXPECT_EQ(LumioRequestHandler::getAttribute(authenticationAuthority, "missing"), std::nullopt);
    EXPECT_EQ(LumioRequestHandler::getAttribute(adminhost::directory::userShell, "many"), std::nullopt);
    nodes->nameQuery = adminhost::Error{"ldap", 50, "Insufficient access"};
    EXPECT_EQ(LumioRequestHandler::getAttribute(authenticationAuthority, "many"), std::nullopt);
}

}  // namespace
}  // namespace lumio
