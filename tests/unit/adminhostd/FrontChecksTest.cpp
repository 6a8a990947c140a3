#include "adminhostd/FrontChecks.h"
#include "adminhostd/ListeningSocket.h"
#include "tests/support/TemporaryRoot.h"

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;
using ::testing::HasSubstr;
using Health = Diagnosis::Health;

class FrontChecksTest : public ::testing::Test {
  protected:
    FrontChecksTest() {
        for (const char* directory : {"/run/adminhostd", "/usr/lib/adminhostd/plugins", "/var/lib/adminhostd"}) {
            fs::create_directories(root.path(directory));
        }
        root.write("/etc/adminhostd.toml", "queue_limit = 5\n");
        options.root = systemRoot();
        options.configuration = root.path("/etc/adminhostd.toml");
        options.configurationText = "queue_limit = 5\n";
    }

    /// The check of that name, of a daemon that has just been started; `breakIt` is called after the start.
    template <class Break>
    Diagnosis check(const std::string& name, Break breakIt) {
        const ListeningSocket socket(socketFile(), ListeningSocket::sameGroup);
        const FrontChecks checks(options);
        breakIt();
        return named(name, checks.run(workers));
    }
    static Diagnosis named(const std::string& name, const std::vector<Diagnosis>& all) {
        const auto found = std::find_if(all.begin(), all.end(), [&](const Diagnosis& one) { return one.name == name; });
        EXPECT_NE(found, all.end()) << name;
        return found == all.end() ? Diagnosis() : *found;
    }
    [[nodiscard]] std::string socketFile() const { return root.path("/run/adminhostd/adminhostd.sock"); }

    const test::TemporaryRoot root;
    Options options;
    FrontChecks::Workers workers{12, std::nullopt, {"sample 1.0"}, {}};
};

TEST_F(FrontChecksTest, NothingIsWrongWithAWholeInstallation) {
    const ListeningSocket socket(socketFile(), ListeningSocket::sameGroup);
    for (const Diagnosis& one : FrontChecks(options).run(workers)) {
        // Disk and clock are those of the machine that runs the test.
        if (!one.name.starts_with("free space") && one.name != "clock") {
            EXPECT_EQ(one.health, Health::ok) << one.name << ": " << one.found;
            EXPECT_EQ(one.fix, "") << one.name;
        }
        EXPECT_TRUE(one.found.ends_with('.')) << one.found;
    }
}

TEST_F(FrontChecksTest, SocketThatWasRemovedIsAFailure) {
    const Diagnosis found = check("socket", [&] { fs::remove(socketFile()); });
    EXPECT_EQ(found.health, Health::failure);
    EXPECT_THAT(found.found, HasSubstr("has been removed: new clients do not reach this daemon"));
    EXPECT_THAT(found.fix, HasSubstr("restart the daemon"));
}

TEST_F(FrontChecksTest, SocketOfAnotherProcessIsAFailure) {
    const Diagnosis found = check("socket", [&] {
        fs::rename(socketFile(), socketFile() + ".old");
        root.write("/run/adminhostd/adminhostd.sock", "");
    });
    EXPECT_EQ(found.health, Health::failure);
    EXPECT_THAT(found.found, HasSubstr("is not the daemon's any more"));
}

TEST_F(FrontChecksTest, SocketThatEverybodyMayOpenIsAWarning) {
    const Diagnosis found = check("socket", [&] { fs::permissions(socketFile(), fs::perms(0666)); });
    EXPECT_EQ(found.health, Health::warning);
    EXPECT_THAT(found.found, HasSubstr("mode 0666"));
    EXPECT_EQ(found.fix, "chmod 0660 " + socketFile());
}

TEST_F(FrontChecksTest, ConfigurationThatCannotBeReadAgainIsAFailure) {
    const Diagnosis found = check("configuration file", [&] { root.write("/etc/adminhostd.toml", "nonsense = 1\n"); });
    EXPECT_EQ(found.health, Health::failure);
    EXPECT_THAT(found.found, HasSubstr("line 1, column 1: unknown key \"nonsense\""));
}

TEST_F(FrontChecksTest, ConfigurationThatOthersMayWriteIsAFailure) {
    const Diagnosis found =
        check("configuration file", [&] { fs::permissions(root.path("/etc/adminhostd.toml"), fs::perms(0666)); });
    EXPECT_EQ(found.health, Health::failure);
    EXPECT_THAT(found.fix, HasSubstr("chmod go-w"));
}

TEST_F(FrontChecksTest, ConfigurationThatHasChangedSinceTheStartIsAWarning) {
    const auto edit = [&] { root.write("/etc/adminhostd.toml", "queue_limit = 6\n"); };
    const Diagnosis found = check("configuration file", edit);
    EXPECT_EQ(found.health, Health::warning);
    EXPECT_THAT(found.found, HasSubstr("has changed since the daemon read it"));
    EXPECT_THAT(found.fix, HasSubstr("reload the daemon"));
}

TEST_F(FrontChecksTest, OptionsThatAreReadAgainChangeNeitherTheStartNorTheSocket) {
    const ListeningSocket socket(socketFile(), ListeningSocket::sameGroup);
    FrontChecks checks(options);
    const std::string before = named("daemon", checks.run(workers)).found;
    root.write("/etc/adminhostd.toml", "queue_limit = 6\n");
    fs::rename(socketFile(), socketFile() + ".old");
    root.write("/run/adminhostd/adminhostd.sock", "");
    options.configurationText = "queue_limit = 6\n";
    options.pluginDirectory = HostPath("/elsewhere");
    checks.reconfigure(options);
    EXPECT_EQ(named("daemon", checks.run(workers)).found, before);
    EXPECT_EQ(named("socket", checks.run(workers)).health, Health::failure);
    EXPECT_EQ(named("configuration file", checks.run(workers)).health, Health::ok);
    EXPECT_THAT(named("plug-in directory", checks.run(workers)).found, HasSubstr("/elsewhere does not exist yet"));
}

TEST_F(FrontChecksTest, DirectoryThatOthersMayWriteIsAFailure) {
    for (const auto& [name, path] :
         {std::pair("run directory", "/run/adminhostd"), std::pair("history directory", "/var/lib/adminhostd"),
          std::pair("plug-in directory", "/usr/lib/adminhostd/plugins")}) {
        const Diagnosis found = check(name, [&, where = path] { fs::permissions(root.path(where), fs::perms(0777)); });
        EXPECT_EQ(found.health, Health::failure) << name;
        EXPECT_THAT(found.found, HasSubstr("may be written by group or others")) << name;
        EXPECT_THAT(found.fix, HasSubstr("chmod go-w")) << name;
        fs::permissions(root.path(path), fs::perms(0755));
    }
}

TEST_F(FrontChecksTest, DirectoryThatDoesNotExistYetIsNoFailure) {
    fs::remove(root.path("/var/lib/adminhostd"));
    EXPECT_EQ(check("history directory", [] {}).health, Health::ok);
}

TEST_F(FrontChecksTest, WorkerThatCannotBeStartedIsAFailureWithItsReason) {
    workers.pid.reset();
    workers.problem = "The worker cannot be started: no room.";
    const Diagnosis found = check("worker", [] {});
    EXPECT_EQ(found.health, Health::failure);
    EXPECT_THAT(found.found, HasSubstr("no room."));
    workers.problem.reset();
    EXPECT_EQ(check("worker", [] {}).health, Health::warning);
}

TEST_F(FrontChecksTest, PlugInThatWasRefusedIsAFailureWithItsReason) {
    workers.refused = {{"/a.so", "/a.so is broken"}};
    EXPECT_EQ(check("plug-ins", [] {}).health, Health::failure);
    EXPECT_THAT(check("plug-ins", [] {}).found, HasSubstr("/a.so is broken."));
    workers.refused.clear();
    workers.plugins.clear();
    EXPECT_EQ(check("plug-ins", [] {}).health, Health::failure);
}

TEST(ClockCheck, ClockThatTheKernelDoesNotCallSynchronisedIsAWarning) {
    timex clock{};
    EXPECT_EQ(clockCheck(TIME_OK, clock, false).health, Health::ok);
    EXPECT_EQ(clockCheck(TIME_ERROR, clock, true).health, Health::warning);
    clock.status = STA_UNSYNC;
    EXPECT_EQ(clockCheck(TIME_OK, clock, true).health, Health::warning);
    EXPECT_THAT(clockCheck(TIME_OK, clock, true).found, HasSubstr("not synchronised"));
}

TEST(ClockCheck, ClockThatTheDaemonMayNotReadIsWhatTheTimeServiceReports) {
    const timex clock{};
    EXPECT_EQ(clockCheck(-1, clock, true).health, Health::ok);
    const Diagnosis unknown = clockCheck(-1, clock, false);
    EXPECT_EQ(unknown.health, Health::warning);
    EXPECT_THAT(unknown.found, HasSubstr("It is not known whether the clock is synchronised"));
    EXPECT_THAT(unknown.fix, HasSubstr("timedatectl"));
}

TEST(SpaceCheck, LittleSpaceIsAWarningAndNoneAFailure) {
    struct statvfs space {};
    space.f_frsize = 4096;
    space.f_files = 1'000'000;
    space.f_favail = 500'000;
    space.f_bavail = 1'000'000;
    EXPECT_EQ(spaceCheck("space", "/var/x", space).health, Health::ok);
    EXPECT_EQ(spaceCheck("space", "/var/x", space).found, "4096 MB are free for /var/x, and 500000 files.");
    space.f_bavail = 20'000;
    EXPECT_EQ(spaceCheck("space", "/var/x", space).health, Health::warning);
    space.f_bavail = 100;
    EXPECT_EQ(spaceCheck("space", "/var/x", space).health, Health::failure);
    space.f_bavail = 1'000'000;
    space.f_favail = 10;
    EXPECT_EQ(spaceCheck("space", "/var/x", space).health, Health::warning);
    space.f_favail = 0;
    EXPECT_EQ(spaceCheck("space", "/var/x", space).health, Health::failure);
    space.f_files = 0;
    EXPECT_EQ(spaceCheck("space", "/var/x", space).health, Health::ok) << "a file system that does not count files";
}

}  // namespace
}  // namespace adminhost
