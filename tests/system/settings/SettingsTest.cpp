// Reading and writing settings through the daemon, the plug-in and the command line of this build on the sample
// service.

#include "platform/plist/PropertyList.h"
#include "platform/value/ValueText.h"
#include "tests/support/Environment.h"
#include "tests/system/settings/SettingsFixture.h"

#include <csignal>
#include <filesystem>
#include <fstream>
#include <future>
#include <iterator>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

using test::HttpReply;
using test::ProgramResult;
using test::Settings;
using testing::AnyOf;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

TEST_F(Settings, TwoWritersComeOneAfterTheOtherAndNothingIsMixed) {
    test::UnixHttp first = daemon.connect();
    test::UnixHttp second = daemon.connect();
    first.begin("POST", "/v1/lumio/writeSettings",
                R"({"configuration":{"server_host":"one","tunnel_server_host":"one"}})");
    second.begin("POST", "/v1/lumio/writeSettings",
                 R"({"configuration":{"server_host":"two","tunnel_server_host":"two"}})");
    for (test::UnixHttp* writer : {&first, &second}) {
        const HttpReply reply = writer->reply();
        EXPECT_EQ(reply.status, 200) << reply.body << daemon.log();
    }
    const Value read = valueOf(post("readSettings", R"({"optionalArguments":{"variant":"getConfig"}})"));
    const Dictionary& config = *read.dictionary()->get("configuration").dictionary();
    EXPECT_EQ(config.get("server_host"), config.get("tunnel_server_host"));
}

TEST_F(Settings, WriterOfAMemberKeyAndWriterOfAClusterKeyKeepEachOthersValues) {
    for (const std::string round : {"1", "2", "3", "4"}) {
        test::UnixHttp member = daemon.connect();
        test::UnixHttp cluster = daemon.connect();
        member.begin("POST", "/v1/lumio/writeSettings",
                     R"({"configuration":{"server_host":"host)" + round + R"(","nimbo_grid_id":"of the first"}})");
        cluster.begin("POST", "/v1/lumio/writeSettings",
                      R"({"configuration":{"submissions_groupname":"group)" + round +
                          R"(","nimbo_grid_id":"of the second","tunnel_server_host":"tunnel)" + round + R"("}})");
        EXPECT_EQ(member.reply().status, 200);
        EXPECT_EQ(cluster.reply().status, 200);
        const Value read = valueOf(post("readSettings", R"({"optionalArguments":{"variant":"getConfig"}})"));
        const Dictionary& config = *read.dictionary()->get("configuration").dictionary();
        EXPECT_EQ(config.get("server_host"), Value("host" + round));
        EXPECT_EQ(config.get("submissions_groupname"), Value("group" + round));
        EXPECT_EQ(config.get("tunnel_server_host"), Value("tunnel" + round));
        EXPECT_TRUE(config.get("nimbo_grid_id") == Value("of the first") ||
                    config.get("nimbo_grid_id") == Value("of the second"));
    }
}

TEST_F(Settings, NextWriteRemovesWhatKilledWorkersLeftAndNothingElse) {
    const std::string server = "/Library/SorvaneProducer/Shared/Server/";
    const std::vector<std::string> leftovers{
        "/Library/Preferences/.com.brenn.lumioserverd.plist.adminhost-0123456789abcdef",
        server + ".cluster_preferences.plist.adminhost-0123456789abcdef",
        server + ".member_preferences_" + test::SampleRoot::uuidOf("member", "media1") +
            ".plist.adminhost-0123456789abcdef",
        "/var/lib/adminhostd/history/lumio/unfinished-1/0.plist"};
    for (const std::string& leftover : leftovers) {
        root.write(leftover, "half");
    }
    root.write(server + ".other.plist.adminhost-0123456789abcdef", "another program's");
    const pid_t first = daemon.workerPid();
    ASSERT_EQ(::kill(first, SIGKILL), 0);
    ASSERT_TRUE(daemon.waitForLog("was killed by signal 9"));
    EXPECT_EQ(post("readSettings", R"({"optionalArguments":{"variant":"getConfig"}})").status, 200);
    EXPECT_NE(daemon.workerPid(), first);
    EXPECT_TRUE(std::filesystem::exists(root.disk(leftovers[1])))
        << "a read does not touch the shared file system for it";
    EXPECT_EQ(post("writeSettings", R"({"configuration":{"server_host":"host"}})").status, 200);
    for (const std::string& leftover : leftovers) {
        EXPECT_FALSE(std::filesystem::exists(root.disk(leftover))) << leftover;
    }
    EXPECT_TRUE(std::filesystem::exists(root.disk(server + ".other.plist.adminhost-0123456789abcdef")));
}

TEST_F(Settings, RequestThatAStatementCannotCarryIsRefusedWholeAndChangesNothing) {
    const std::string before = root.sql("select * from properties");
    const HttpReply reply =
        post("writeSettings",
             R"({"configuration":{"server_port":1,"properties":[{"_newid_":true,"name":"a\"b","value":"v"},)"
             R"({"_newid_":true,"name":"good","value":"v"}]}})");
    EXPECT_EQ(reply.status, 422);
    const Value body = valueOf(reply);
    EXPECT_EQ(body.dictionary()->get("findings").array()->front().dictionary()->get("keyPath"),
              Value("configuration.properties.0.name"));
    EXPECT_EQ(root.sql("select * from properties"), before);
    EXPECT_EQ(ctl({"history"}).output, "No change has been recorded yet.\n");
}

TEST_F(Settings, RollbackThatDoesNotTakeIsNamed) {
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"server_port":9001}})").status, 200);
    root.setSwitch("setup_library.exit", "3");
    const ProgramResult rollback = ctl({"rollback", "1"});
    EXPECT_EQ(rollback.status, 1);
    EXPECT_THAT(rollback.output, HasSubstr("writeStatus is 3"));
    EXPECT_EQ(ctl({"rollback", "77"}).status, 2);
}

TEST_F(Settings, RollbackNamesSettingsThatWereNotSetThenAndNotesThatAChangedPasswordStays) {
    root.write("/Library/SorvaneProducer/Shared/Server/member_preferences_" +
                   test::SampleRoot::uuidOf("member", "media1") + ".plist",
               "<plist><dict><key>server_port</key><integer>8170</integer></dict></plist>");
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"tunnel_agent_host":"agent","server_port":9001}})").status,
              200);
    EXPECT_THAT(ctl({"rollback", "1", "--dry-run"}).output, Not(HasSubstr("password"))) << "it is as it was";
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"nimbo_client_password":"another"}})").status, 200);
    const ProgramResult rollback = ctl({"rollback", "1"});
    EXPECT_EQ(rollback.status, 1) << "not all of it could be restored";
    EXPECT_THAT(rollback.output, HasSubstr("settings.server_port: 9001 -> 8170: applied\n"));
    EXPECT_THAT(
        rollback.output,
        HasSubstr("settings.tunnel_agent_host: not set at that time; it cannot be removed and stays \"agent\"\n"));
    EXPECT_THAT(rollback.output,
                HasSubstr("settings.nimbo_client_password: not restored, a stored secret cannot be written back\n"));
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8170\n");
    EXPECT_EQ(ctl({"settings", "get", "tunnel_agent_host"}).output, "agent\n");
}

TEST_F(Settings, RollbackOfSettingsThatAnotherClientChangesMeanwhileIsRefused) {
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"server_port":9001}})").status, 200);
    root.hold("setup_preferences");
    std::future<ProgramResult> restoring = std::async(std::launch::async, [&] { return ctl({"rollback", "1"}); });
    ASSERT_TRUE(root.waitForHeld("setup_preferences"));
    // The other client's write waits in the queue behind the rollback's first read, so it runs before the rollback's
    // write.
    test::UnixHttp client(daemon.socket(), std::chrono::seconds(60));
    client.begin("POST", "/v1/lumio/writeSettings", R"({"configuration":{"server_host":"other"}})");
    EXPECT_TRUE(daemon.waitForWaiting(1));
    root.release("setup_preferences");
    EXPECT_EQ(client.reply().status, 200);
    const ProgramResult rollback = restoring.get();
    EXPECT_EQ(rollback.status, 7);
    EXPECT_THAT(rollback.output, HasSubstr("REVISION_CHANGED"));
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "9001\n");
    EXPECT_EQ(ctl({"settings", "get", "server_host"}).output, "other\n");
}

TEST_F(Settings, LookingBackHasEveryFormat) {
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"server_port":9001}})").status, 200);
    for (const std::string& verb : {std::string("history"), std::string("whois")}) {
        std::vector<std::string> words{"--format", "plist", verb};
        if (verb == "whois") {
            words.emplace_back("anna");
        }
        const auto list = parsePropertyList(ctl(words).output);
        ASSERT_TRUE(list && list->array() != nullptr) << verb;
        EXPECT_EQ(list->array()->size(), 1U);
        words[1] = "json";
        EXPECT_EQ(parseJson(ctl(words).output), list);
    }
}

TEST_F(Settings, WhoisFindsPeopleAndGroupsByNameAndUuid) {
    const std::string uuid = test::SampleRoot::uuidOf("user", "anna");
    for (const std::string& text : {std::string("anna"), uuid}) {
        const ProgramResult whois = ctl({"whois", text});
        EXPECT_EQ(whois.status, 0);
        EXPECT_THAT(whois.output, HasSubstr("Anna Lindqvist"));
        EXPECT_THAT(whois.output, HasSubstr(uuid));
        EXPECT_THAT(whois.output, HasSubstr("/Local"));
    }
    const ProgramResult nobody = ctl({"whois", "nobody & nothing"});
    EXPECT_EQ(nobody.status, 2);
    EXPECT_THAT(nobody.output, HasSubstr("nobody & nothing"));
}

TEST_F(Settings, DirectoryCompletesNamesByTheirBeginningInAnyCase) {
    const Value found = valueOf(daemon.connect().get("/v1/directory?match=ANN"));
    ASSERT_EQ(found.dictionary()->get("entries").array()->size(), 1U);
    EXPECT_EQ(found.dictionary()->get("entries").array()->front().dictionary()->get("shortName"), Value("anna"));
    EXPECT_EQ(*valueOf(daemon.connect().get("/v1/directory?match=zzz")).dictionary()->get("entries").array(), Array{});
    EXPECT_EQ(daemon.connect().post("/v1/directory").status, 405);
}

TEST_F(Settings, DirectoryThatCannotAnswerIsAClearError) {
    root.remove("/etc/passwd");
    const HttpReply reply = daemon.connect().get("/v1/directory?match=a");
    EXPECT_EQ(reply.status, 500);
    EXPECT_EQ(valueOf(reply).dictionary()->get("error"), Value("DIRECTORY_UNAVAILABLE"));
}

TEST_F(Settings, SetupScriptThatLeavesADaemonHoldingItsPipesDoesNotHoldTheAnswer) {
    root.setSwitch("setup_preferences.daemon", "30");
    EXPECT_EQ(post("readSettings", R"({"optionalArguments":{"variant":"getConfig"}})").status, 200);
    EXPECT_TRUE(root.daemonLeftBy("setup_preferences")) << "the process that the script left lives on";
}

}  // namespace
}  // namespace adminhost
