// Writing the grid controller's name to the cluster preferences, with a real bus and a real Avahi daemon.

#include "handler/LumioRequestHandler.h"
#include "platform/plist/PropertyList.h"
#include "tests/support/AvahiNamespace.h"
#include "tests/support/Environment.h"
#include "tests/support/TemporaryRoot.h"

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {
namespace {

using namespace std::chrono_literals;
using adminhost::Dictionary;
using adminhost::Response;
using adminhost::Value;
using adminhost::test::PublishedService;
using adminhost::test::SilentAvahi;
using support::ScopedEnvironment;
using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::MatchesRegex;
using testing::SizeIs;
using testing::StartsWith;
using Clock = std::chrono::steady_clock;

constexpr const char* type = "_nimbo._tcp";
constexpr std::string_view clusterFile = "/shared/Server/cluster_preferences.plist";
constexpr const char* foundHost = "controller.test.example";
/// In the namespace of with-avahi, which has a copy of /etc of its own.
constexpr const char* hostsFile = "/etc/hosts";

const ScopedEnvironment::Changes noBus{{"DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/run/with-avahi/missing"}};

/// While it exists, the host file of the namespace is empty, so that the addresses have no names.
class NamelessAddresses {
  public:
    NamelessAddresses() {
        std::ifstream file(hostsFile);
        _former.assign(std::istreambuf_iterator<char>(file), {});
        if (_former.find(foundHost) == std::string::npos) {
            throw std::runtime_error("not the namespace's own /etc/hosts: not changed");
        }
        std::ofstream(hostsFile) << "127.0.0.1 localhost\n";
    }
    NamelessAddresses(const NamelessAddresses&) = delete;
    NamelessAddresses& operator=(const NamelessAddresses&) = delete;
    ~NamelessAddresses() { std::ofstream(hostsFile) << _former; }

  private:
    std::string _former;
};

class ControllerName : public testing::Test {
  protected:
    void SetUp() override {
        for (const char* script : {"setup_lumioserverd_preferences", "setup_lumioserverd_library"}) {
            root.writeTool(std::string("/usr/share/sorvaneproducer/lumioserverd/script/") + script,
                           "#!/bin/sh\nexit 0\n");
        }
        root.writePropertyList("/Library/Preferences/com.brenn.lumioserverd.plist",
                               "<key>shared_filesystem</key><string>/shared</string>"
                               "<key>member_uuid</key><string>M</string>");
        root.writePropertyList(clusterFile, "<key>nimbo_controller</key><string>former.example</string>");
        std::filesystem::create_directories(root.path("/var/lumio/server"));
    }

    /// Writes the name; the flag is left out of the configuration when there is none.
    void write(const std::string& name, std::optional<bool> resolveName = std::nullopt) {
        Dictionary configuration{{"nimbo_controller", name}};
        if (resolveName) {
            configuration.set("nimbo_controller_resolve_name", *resolveName);
        }
        log.lines.clear();
        const auto begin = Clock::now();
        const Response answer =
            handler.writeSettingsWithRequest(Dictionary{{"configuration", std::move(configuration)}});
        time = Clock::now() - begin;
        EXPECT_EQ(answer.dictionary().get("writeStatus"), Value(0)) << "whatever became of the name";
        EXPECT_FALSE(answer.dictionary().contains("errorDescription"));
        EXPECT_FALSE(answer.dictionary().contains("needsRecycleOrRestart"));
        EXPECT_FALSE(cluster().contains("nimbo_controller_resolve_name"));
        readBack = answer.dictionary().get("configuration");
    }
    [[nodiscard]] Dictionary cluster() const {
        const auto value = adminhost::readPropertyList(adminhost::DiskPath(root.path(clusterFile)));
        EXPECT_TRUE(value && value->dictionary() != nullptr);
        return value && value->dictionary() != nullptr ? *value->dictionary() : Dictionary();
    }
    [[nodiscard]] Value stored() const { return cluster().get("nimbo_controller"); }
    /// The only line of a resolution that failed.
    static auto unableToResolve(const std::string& name) {
        return ElementsAre(StartsWith("adminhost_lumio: unable to resolve " + name + ", error: "));
    }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    LumioRequestHandler handler;
    Clock::duration time{};
    Value readBack;
};

TEST_F(ControllerName, PlainNameThatIsFoundIsStoredAsTheHostsName) {
    const PublishedService published("Studio", type);
    write("Studio");
    EXPECT_EQ(stored(), Value(foundHost));
    EXPECT_EQ(readBack.dictionary()->get("nimbo_controller"), Value(foundHost)) << "the answer says what is stored";
    EXPECT_THAT(log.lines, IsEmpty());
    EXPECT_LT(time, 5s) << "an address ends the wait";
}

TEST_F(ControllerName, NameEndingInLocalIsResolvedWithoutTheSuffix) {
    const PublishedService published("Aula", type);
    write("Aula.local", false);
    EXPECT_EQ(stored(), Value(foundHost));
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(ControllerName, WithTheFlagTheSuffixIsKeptInTheNameThatIsResolved) {
    const PublishedService published("Hall.local", type);
    write("Hall.local", true);
    EXPECT_EQ(stored(), Value(foundHost));
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(ControllerName, OtherDotsBeforeTheSuffixDoNotKeepANameFromBeingResolved) {
    const PublishedService published("House 2. Floor 3", type);
    write("House 2. Floor 3.local");
    EXPECT_EQ(stored(), Value(foundHost));
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(ControllerName, WithTheFlagANameWithADotIsResolvedUnchanged) {
    const PublishedService published("grid.example", type);
    write("grid.example", true);
    EXPECT_EQ(stored(), Value(foundHost));
}

TEST_F(ControllerName, WithoutTheFlagANameWithADotIsStoredEvenWhenAServiceHasThatName) {
    const PublishedService published("grid.other", type);
    write("grid.other", false);
    EXPECT_EQ(stored(), Value("grid.other"));
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(ControllerName, NameWithADotAsksNobody) {
    const ScopedEnvironment missing(noBus);
    write("grid.local.example", false);
    EXPECT_EQ(stored(), Value("grid.local.example"));
    EXPECT_THAT(log.lines, IsEmpty()) << "asking would have failed and been logged";
}

TEST_F(ControllerName, SuffixIsComparedWithItsCase) {
    const ScopedEnvironment missing(noBus);
    write("Studio.Local");
    EXPECT_EQ(stored(), Value("Studio.Local"));
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(ControllerName, OnlyOneSuffixIsRemoved) {
    const ScopedEnvironment missing(noBus);
    write("Studio.local.local");
    EXPECT_THAT(log.lines, unableToResolve("Studio.local"));
}

TEST_F(ControllerName, NameThatNobodyAnswersToIsLoggedAndStoredUnchanged) {
    write("Nobody.local");
    EXPECT_EQ(stored(), Value("Nobody.local")) << "with its suffix, though it is resolved without";
    EXPECT_THAT(log.lines, ElementsAre(AllOf(StartsWith("adminhost_lumio: unable to resolve Nobody, error: "),
                                             HasSubstr("errorCode"), HasSubstr("-15"))));
    EXPECT_LT(time, 9s) << "the failure ends the wait";
}

TEST_F(ControllerName, ServiceOfAnotherTypeIsNotAController) {
    const PublishedService published("Printer", "_other._tcp");
    write("Printer");
    EXPECT_EQ(stored(), Value("Printer"));
    EXPECT_THAT(log.lines, unableToResolve("Printer"));
}

TEST_F(ControllerName, WithoutABusTheWriteEndsAtOnceAndTheNameIsStoredUnchanged) {
    const ScopedEnvironment missing(noBus);
    write("Studio");
    EXPECT_EQ(stored(), Value("Studio"));
    EXPECT_THAT(log.lines, unableToResolve("Studio"));
    EXPECT_LT(time, 3s);
}

TEST_F(ControllerName, WithoutADaemonTheWriteEndsAtOnceAndTheNameIsStoredUnchanged) {
    const char* address = std::getenv("EMPTY_BUS_ADDRESS");
    ASSERT_NE(address, nullptr);
    const ScopedEnvironment empty(ScopedEnvironment::Changes{{"DBUS_SYSTEM_BUS_ADDRESS", address}});
    write("Studio");
    EXPECT_EQ(stored(), Value("Studio"));
    EXPECT_THAT(log.lines, unableToResolve("Studio"));
    EXPECT_LT(time, 3s);
}

TEST_F(ControllerName, SilentDaemonIsWaitedForTenTurnsAndTheNameIsStoredUnchanged) {
    const SilentAvahi silent;
    write("Studio");
    EXPECT_EQ(stored(), Value("Studio"));
    EXPECT_GE(time, 9s);
    EXPECT_LT(time, 20s);
    EXPECT_THAT(log.lines, SizeIs(testing::Le(1U))) << "the tenth turn and the resolver's time-out end together";
}

TEST_F(ControllerName, AddressWithoutANameIsLoggedAndTheNameIsStoredUnchanged) {
    const PublishedService published("Nameless", type);
    const NamelessAddresses nameless;
    write("Nameless");
    EXPECT_EQ(stored(), Value("Nameless"));
    EXPECT_THAT(log.lines, ElementsAre(MatchesRegex("adminhost_lumio: unable to resolve host: error = -[0-9]+")));
}

TEST_F(ControllerName, FailureOfOneWriteDoesNotReachTheNext) {
    {
        const ScopedEnvironment missing(noBus);
        write("Second");
        EXPECT_THAT(log.lines, unableToResolve("Second"));
    }
    const PublishedService published("Second", type);
    write("Second");
    EXPECT_EQ(stored(), Value(foundHost));
    EXPECT_THAT(log.lines, IsEmpty());
    write("Second.local");
    EXPECT_EQ(stored(), Value(foundHost)) << "nor does what was found";
}

TEST_F(ControllerName, FailedResolutionChangesNoOtherSetting) {
    root.writePropertyList(clusterFile,
                           "<key>nimbo_client_username</key><string>grid</string>"
                           "<key>kept</key><string>cluster</string>");
    const ScopedEnvironment missing(noBus);
    write("Studio", true);
    EXPECT_EQ(cluster(),
              (Dictionary{{"nimbo_client_username", "grid"}, {"kept", "cluster"}, {"nimbo_controller", "Studio"}}));
}

}  // namespace
}  // namespace lumio

int main(int argc, char** argv) {
    adminhost::test::enterAvahiNamespace(argc, argv);
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
