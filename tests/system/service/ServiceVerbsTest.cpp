// The verbs for the service as a whole, on the sample service. Below another root its pid file shows whether it runs.

#include "platform/json/Json.h"
#include "platform/release/Release.h"
#include "platform/value/Value.h"
#include "tests/system/apply/ControlledService.h"

#include <csignal>
#include <filesystem>

#include <unistd.h>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

class ServiceVerbs : public ControlledService {
  protected:
    ~ServiceVerbs() override { static_cast<void>(ctl({"stop"})); }

    void setStartupStatus(const std::string& status) const {
        root.write("/var/lumio/server/.lumioserverd_startup_status.plist",
                   "<?xml version=\"1.0\"?><plist version=\"1.0\"><dict><key>error</key><integer>" + status +
                       "</integer></dict></plist>");
    }
};

TEST_F(ServiceVerbs, StoppedServiceIsStatusThree) {
    const ProgramResult result = ctl({"status"});
    EXPECT_EQ(result.status, 3) << result.output;
    EXPECT_THAT(result.output,
                AllOf(HasSubstr("service             stopped\n"), HasSubstr("release " ADMINHOST_RELEASE),
                      HasSubstr("cameras "), HasSubstr("shared file system  "),
                      HasSubstr("grid controller     grid1.example.org: NOT AVAILABLE"), Not(HasSubstr("started "))));
}

TEST_F(ServiceVerbs, RunningServiceIsStatusZeroAndShowsItsStart) {
    root.remove("/var/lumio/server/.lumio_setup_done");
    const ProgramResult started = ctl({"start"});
    EXPECT_EQ(started.status, 0);
    EXPECT_EQ(started.output, "The service has been started.\n");
    EXPECT_TRUE(std::filesystem::exists(root.disk("/var/lumio/server/.lumio_setup_done")));
    const ProgramResult running = ctl({"status"});
    EXPECT_EQ(running.status, 0) << running.output;
    EXPECT_THAT(running.output, AllOf(HasSubstr("service             running\n"), HasSubstr("started             "),
                                      HasSubstr("set up              yes")));
    const ProgramResult stopped = ctl({"stop"});
    EXPECT_EQ(stopped.status, 0);
    EXPECT_EQ(stopped.output, "The service has been stopped.\n");
    EXPECT_EQ(ctl({"status"}).status, 3);
}

TEST_F(ServiceVerbs, ServiceWithAnIssueIsStatusOne) {
    ASSERT_EQ(ctl({"start"}).status, 0);
    setStartupStatus("69");
    const ProgramResult result = ctl({"status"});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output,
                AllOf(HasSubstr("running with an issue (startup status 69: the shared file system was not available"),
                      HasSubstr(": NOT AVAILABLE, ")));
    setStartupStatus("7");
    EXPECT_THAT(ctl({"status"}).output, HasSubstr("running with an issue (startup status 7)\n"));
}

TEST_F(ServiceVerbs, ProgramsGetTheServiceAndTheDaemonInOneDocument) {
    const ProgramResult result = ctl({"--format", "json", "status"});
    EXPECT_EQ(result.status, 3);
    const auto value = parseJson(result.output);
    ASSERT_TRUE(value && value->dictionary() != nullptr) << result.output;
    EXPECT_EQ(value->dictionary()->at("service.state"), Value("STOPPED"));
    EXPECT_EQ(value->dictionary()->at("daemon.release"), Value(ADMINHOST_RELEASE));
    EXPECT_EQ(value->dictionary()->get("problems"), Value(Array{}));
}

TEST_F(ServiceVerbs, ControlToolThatFailsIsStatusOneWithItsLogLines) {
    root.setSwitch("lumioctl.exit", "3");
    for (const char* verb : {"start", "stop"}) {
        const ProgramResult result = ctl({verb});
        EXPECT_EQ(result.status, 1) << verb;
        EXPECT_THAT(result.output, AllOf(HasSubstr("_SERVICE_ERR"), HasSubstr("result: 3"))) << verb;
    }
    root.clearSwitches();
}

TEST_F(ServiceVerbs, RecycleServiceSaysThatNothingWasDoneAndNamesStopAndStart) {
    const ProgramResult result = ctl({"recycleService"});
    EXPECT_EQ(result.status, 0);
    EXPECT_THAT(result.output, AllOf(HasSubstr("recycleService does nothing"), HasSubstr("adminhostctl stop"),
                                     HasSubstr("adminhostctl start")));
}

class Leftovers : public ControlledService {
  protected:
    const std::string cache = "/var/lumio/server/adminhostd_krb_cc";

    void replaceWorker() const {
        const pid_t before = daemon.workerPid();
        ASSERT_EQ(::kill(before, SIGKILL), 0);
        // The request that meets the dying worker fails; the next worker removes the files before it serves one.
        int status = 0;
        for (int tries = 0; status != 200 && tries < 100; ++tries) {
            status = daemon.connect().post("/v1/lumio/getLogPaths", "{}").status;
        }
        EXPECT_EQ(status, 200) << daemon.log();
        EXPECT_NE(daemon.workerPid(), before);
    }
};

TEST_F(Leftovers, TicketOfAWorkerThatWasKilledIsRemovedByTheNextOne) {
    root.write(cache, "a ticket");
    replaceWorker();
    EXPECT_FALSE(std::filesystem::exists(root.disk(cache)));
}

TEST_F(Leftovers, FileBehindALinkThatOthersMayHaveCreatedStays) {
    const std::filesystem::path elsewhere = root.disk("/var/elsewhere");
    std::filesystem::rename(root.disk("/var/lumio/server"), elsewhere);
    root.write("/var/elsewhere/adminhostd_krb_cc", "of somebody else");
    std::filesystem::create_directory_symlink(elsewhere, root.disk("/var/lumio/server"));
    replaceWorker();
    EXPECT_FALSE(std::filesystem::exists(elsewhere / "adminhostd_krb_cc")) << "here only root could create the link";
    root.write("/var/elsewhere/adminhostd_krb_cc", "of somebody else");
    std::filesystem::permissions(root.disk("/var/lumio"), std::filesystem::perms(0777));
    replaceWorker();
    EXPECT_TRUE(std::filesystem::exists(elsewhere / "adminhostd_krb_cc"));
}

class ServiceWithoutItsDirectory : public ControlledService {
  protected:
    ServiceWithoutItsDirectory()
        : ControlledService(
              "[[directory.node]]\nname = \"/Example\"\nuri = [\"ldap://127.0.0.1:1\"]\nbase = \"dc=example\"\n") {}
    static constexpr const char* reason = "the directory node \"/Example\" failed";
};

TEST_F(ServiceWithoutItsDirectory, StatusShowsWhyTheGridControllerIsNotAvailable) {
    const ProgramResult result = ctl({"status"});
    EXPECT_EQ(result.status, 3);
    EXPECT_THAT(result.output, AllOf(HasSubstr("NOT AVAILABLE"), HasSubstr(std::string("adminhostctl: ") + reason)));
}

TEST_F(ServiceWithoutItsDirectory, TrialOfTheGridShowsWhyItFails) {
    const std::string password = file("password", "planted-password\n");
    const ProgramResult result =
        ctl({"settings", "set", "nimbo_controller", "grid2.example.org", "--validate", "--password-file", password});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, AllOf(HasSubstr("grid controller: failed: "), HasSubstr(reason)));
}

TEST(ServiceStatus, DaemonThatCannotBeReachedIsStatusFour) {
    const ProgramResult result = runProgram(
        {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", "/nowhere/socket", "status"}, Errors::merge);
    EXPECT_EQ(result.status, 4);
    EXPECT_THAT(result.output,
                AllOf(HasSubstr("service  unknown\n"), HasSubstr("cannot be reached at /nowhere/socket")));
}

TEST(ServiceStatus, DaemonWithoutTheServicesPlugInIsStatusFourAndItsHealthIsShown) {
    const DaemonProcess daemon(
        {{"--plugin", std::string(BINARY_DIR) + "/tests/plugins/fixture_described.so"}, "", {}, true, {}, 0, -1});
    const ProgramResult result = runProgram(
        {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon.socket(), "status"}, Errors::merge);
    EXPECT_EQ(result.status, 4);
    EXPECT_THAT(result.output, AllOf(HasSubstr("service  unknown\n"), HasSubstr("daemon   release "),
                                     HasSubstr("command not found: getState")));
}

TEST_F(ServiceVerbs, SettingThatFailsItsTrialIsNotWritten) {
    const std::string before = read(root.identityPreferencesPath());
    const ProgramResult result = ctl({"settings", "set", "shared_filesystem", "/no/such/place", "--validate"});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, AllOf(HasSubstr("shared file system: failed: kFilesystemNotExistsError\n"),
                                     HasSubstr("grid controller: not tried: it does not depend on this setting\n"),
                                     HasSubstr("nothing was written")));
    EXPECT_EQ(read(root.identityPreferencesPath()), before);
}

TEST_F(ServiceVerbs, SettingThatPassesItsTrialIsWritten) {
    // The test file on the shared file system is given to the account, which must be one that this process may choose.
    root.write("/etc/passwd", "grid:x:" + std::to_string(::geteuid()) + ":0::/:/bin/sh\n");
    ASSERT_EQ(ctl({"settings", "set", "nimbo_controller", "grid2.example.org"}).status, 0);
    const ProgramResult result = ctl({"settings", "set", "nimbo_client_username", "grid", "--validate"});
    EXPECT_EQ(result.status, 0) << result.output;
    EXPECT_THAT(result.output,
                AllOf(HasSubstr("shared file system: passed\n"),
                      HasSubstr("grid controller: not tried: nimbo_client_password is stored but cannot be read; "
                                "--password-file gives it\n"),
                      HasSubstr("\"lumiogrid\" -> \"grid\"")));
}

TEST_F(ServiceVerbs, GridIsTriedWithThePasswordOfTheFileWhichIsShownNowhere) {
    const std::string password = file("password", "planted-password\n");
    const ProgramResult result =
        ctl({"settings", "set", "nimbo_controller", "grid2.example.org", "--validate", "--password-file", password});
    EXPECT_EQ(result.status, 1) << "no Kerberos server here knows the account";
    EXPECT_THAT(result.output, AllOf(HasSubstr("grid controller: failed: kNimboControllerCheckFailedError\n"),
                                     Not(HasSubstr("planted-password"))));
    EXPECT_THAT(daemon.log(), Not(HasSubstr("planted-password")));
    EXPECT_THAT(ctl({"settings", "get", "nimbo_controller"}).output, HasSubstr("grid1.example.org"));
}

TEST_F(ServiceVerbs, SettingWithoutATrialIsWrittenAndSaidToBeUntried) {
    const ProgramResult result = ctl({"settings", "set", "server_port", "8180", "--validate"});
    EXPECT_EQ(result.status, 0);
    EXPECT_THAT(result.output, AllOf(HasSubstr("shared file system: not tried: it does not depend on this setting\n"),
                                     HasSubstr("settings.server_port: 8170 -> 8180: applied\n")));
}

TEST_F(ServiceVerbs, AccountInAnUnknownNodeIsAnErrorAndItsPasswordIsShownNowhere) {
    const std::string password = file("password", "planted-password\n");
    const ProgramResult result = ctl({"account", "create", "/LDAPv3/nowhere", "diradmin", "--password-file", password});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, AllOf(HasSubstr("the service returned an error: errorCode is "),
                                     HasSubstr("/LDAPv3/nowhere"), Not(HasSubstr("planted-password"))));
    EXPECT_THAT(daemon.log(), Not(HasSubstr("planted-password")));
}

TEST_F(ServiceVerbs, AccountNeedsAPasswordAndAnAgreementBeforeAnythingIsSent) {
    EXPECT_EQ(ctl({"account", "create", "/Local/Default"}).status, 2);
    const std::string program = std::string(BINARY_DIR) + "/bin/adminhostctl";
    const auto create = [&](std::vector<std::string> more) {
        more.insert(more.begin(),
                    {program, "--socket", daemon.socket(), "account", "create", "/Local/Default", "admin"});
        return runProgram(more, Errors::merge, "");
    };
    EXPECT_EQ(create({}).status, 2);
    EXPECT_THAT(create({}).output, HasSubstr("--password-file gives it"));
    EXPECT_EQ(create({"--password-file", file("empty", "\n")}).status, 2);
    const ProgramResult unsaved = create({"--password-file", file("password", "planted-password"), "--save"});
    EXPECT_EQ(unsaved.status, 2);
    EXPECT_THAT(unsaved.output, HasSubstr("--yes is needed"));
    EXPECT_THAT(daemon.log(), Not(HasSubstr("createNimboAccount")));
}

}  // namespace
}  // namespace adminhost::test
