// What the history shows of writes, of edits outside the daemon, and of secrets.

#include "platform/plist/PropertyList.h"
#include "platform/value/ValueText.h"
#include "tests/support/Environment.h"
#include "tests/system/settings/SettingsFixture.h"

#include <csignal>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <thread>

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

/// Changes the port from 9001 to 9002 in the settings file itself.
void editPortOutsideTheDaemon(const test::SampleRoot& root) {
    const std::string file = "/Library/SorvaneProducer/Shared/Server/member_preferences_" +
                             test::SampleRoot::uuidOf("member", "media1") + ".plist";
    std::string text = root.read(file);
    ASSERT_NE(text.find("9001"), std::string::npos);
    root.write(file, text.replace(text.find("9001"), 4, "9002"));
}

TEST_F(Settings, HistoryTellsWhatEachWriteChangedAndRollbackGoesBackThroughTheSameWrite) {
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"server_port":9001}})").status, 200);
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"nimbo_client_username":"other"}})").status, 200);
    const ProgramResult history = ctl({"history"});
    EXPECT_EQ(history.status, 0);
    EXPECT_THAT(history.output, HasSubstr("server_port: 8170 -> 9001"));
    EXPECT_THAT(history.output, HasSubstr(R"(nimbo_client_username: "lumiogrid" -> "other")"));

    const ProgramResult rollback = ctl({"rollback", "1"});
    EXPECT_EQ(rollback.status, 0) << rollback.output;
    EXPECT_THAT(rollback.output, HasSubstr("server_port: 9001 -> 8170"));
    EXPECT_THAT(rollback.output, HasSubstr("has to be restarted"));
    EXPECT_EQ(ctl({"rollback", "1"}).output, "no change\n");
    EXPECT_THAT(ctl({"history"}).output, HasSubstr(R"("other" -> "lumiogrid")"));
}

TEST_F(Settings, HistoryNamesTheLoginOfAClientThatHasEndedBeforeItsRequestRuns) {
    const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    int ends[2];
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    const pid_t child = ::fork();
    if (child == 0) {
        constexpr std::string_view login = "54321";
        const int file = ::open("/proc/self/loginuid", O_RDWR | O_CLOEXEC);
        // Where the kernel does not allow it, the session that this test belongs to counts.
        static_cast<void>(::write(file, login.data(), login.size()) == 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        daemon.socket().copy(address.sun_path, sizeof address.sun_path - 1);
        const int connected = ::connect(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address);
        char text[16] = {};
        const ssize_t size = ::pread(file, text, sizeof text, 0);
        static_cast<void>(::write(ends[1], text, size > 0 ? static_cast<std::size_t>(size) : 0) == size);
        char unused = 0;
        static_cast<void>(::read(ends[1], &unused, 1) == 1);
        ::_exit(connected);
    }
    char text[16] = {};
    ASSERT_GT(::read(ends[0], text, sizeof text), 0);
    EXPECT_EQ(daemon.connect().get("/v1/").status, 200) << "the earlier connection has been accepted too";
    ASSERT_EQ(::write(ends[0], "x", 1), 1);
    int status = -1;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    ASSERT_EQ(status, 0);
    ::close(ends[0]);
    ::close(ends[1]);
    test::UnixHttp client(socket);
    EXPECT_EQ(client.post("/v1/lumio/writeSettings", R"({"configuration":{"server_port":9001}})").status, 200);
    const Value history = valueOf(daemon.connect().get("/v1/lumio/history"));
    const std::string who = textOf(history.dictionary()->get("history").array()->front().dictionary()->get("who"));
    const std::string login(text);
    if (login != "4294967295" && login != std::to_string(::geteuid())) {
        EXPECT_THAT(who, testing::StartsWith("uid " + login + ", as ")) << "no account has this number";
    } else {
        EXPECT_THAT(who, testing::EndsWith("(uid " + std::to_string(::geteuid()) + ")"));
    }
}

TEST_F(Settings, WriteThatCanHaveNoEntryInTheHistoryIsCarriedOutAndReportsIt) {
    root.write("/var/lib/adminhostd/history", "a file where the directory belongs");
    const HttpReply reply = post("writeSettings", R"({"configuration":{"server_port":9001}})");
    EXPECT_EQ(reply.status, 200);
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "9001\n");
    const Value record = valueOf(daemon.connect().get("/v1/requests/" + reply.headers.at("request-id")));
    const Array* parts = record.dictionary()->get("notDone").array();
    ASSERT_TRUE(parts != nullptr && parts->size() == 1U) << textOf(record);
    EXPECT_EQ(parts->front().dictionary()->get("reason"), Value("the write has no entry in the history"));
    EXPECT_NE(parts->front().dictionary()->get("toolMessage"), Value(""));
}

TEST_F(Settings, HistoryTellsWhatEachWriteChangedFromWhatWasEditedOutside) {
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"server_port":9001}})").status, 200);
    ASSERT_NO_FATAL_FAILURE(editPortOutsideTheDaemon(root));
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"nimbo_client_password":"another one"}})").status, 200);
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"properties":[]}})").status, 200);
    const Value answer = valueOf(daemon.connect().get("/v1/lumio/history"));
    const Array& entries = *answer.dictionary()->get("history").array();
    ASSERT_EQ(entries.size(), 3U) << textOf(answer);
    const auto changesOf = [&](std::size_t i) { return entries[i].dictionary()->get("changes"); };
    EXPECT_EQ(changesOf(0).array()->front().dictionary()->get("to"), Value(9001));
    EXPECT_EQ(entries[1].dictionary()->get("who"), Value("outside the daemon"));
    EXPECT_EQ(changesOf(1), Value(Array{Dictionary{{"key", "server_port"}, {"from", 9001}, {"to", 9002}}}));
    EXPECT_EQ(
        changesOf(2),
        Value(Array{Dictionary{
            {"key", "nimbo_client_password"}, {"secret", true}, {"from", "(secret)"}, {"to", "(secret) changed"}}}));
    EXPECT_THAT(*entries[2].dictionary()->get("who").string(), HasSubstr("uid "));
}

TEST_F(Settings, HistoryShowsEachWriteAndEachEditOutsideAsARowOfItsOwn) {
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"server_port":9001}})").status, 200);
    ASSERT_NO_FATAL_FAILURE(editPortOutsideTheDaemon(root));
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"nimbo_client_password":"planted","properties":[)"
                                    R"({"_newid_":true,"name":"two lines","value":"a"}]}})")
                  .status,
              200);
    const std::string camera = root.sql("select name from cameras where (disabled != 't' or disabled is null) limit 1");
    const std::string name = camera.substr(0, camera.find('\n'));
    for (const char* state : {"off", "on"}) {
        ASSERT_EQ(ctl({"camera", "access", name, state}).status, 0);
    }
    ASSERT_THAT(ctl({"camera", "deny", name, "anna"}).status, AnyOf(0, 2)) << "2: not in the list";
    ASSERT_EQ(ctl({"camera", "allow", name, "anna"}).status, 0);

    const support::ScopedEnvironment wide(
        support::ScopedEnvironment::Changes{{"COLUMNS", "200"}});  // no line is wrapped
    const ProgramResult history = ctl({"history"});
    EXPECT_EQ(history.status, 0);
    const auto lineWith = [&](const std::string& words) {
        const std::size_t at = history.output.find(words);
        const std::size_t begin = at == std::string::npos ? 0 : history.output.rfind('\n', at) + 1;
        return at == std::string::npos ? "" : history.output.substr(begin, history.output.find('\n', at) - begin);
    };
    EXPECT_THAT(lineWith("server_port: 8170 -> 9001"), HasSubstr("(uid "));
    EXPECT_THAT(lineWith("server_port: 9001 -> 9002"), HasSubstr("outside the daemon"));
    EXPECT_THAT(lineWith("server_port: 9001 -> 9002"), HasSubstr("before "));
    EXPECT_THAT(lineWith("nimbo_client_password: (secret) changed"), HasSubstr("(uid "));
    EXPECT_THAT(lineWith("nimbo_client_password: (secret) changed"), Not(HasSubstr("server_port")));
    EXPECT_THAT(history.output, HasSubstr("properties.\"two lines\": (not present) -> (present)\n"));
    EXPECT_THAT(lineWith(".users.anna: (not"), HasSubstr("(uid "));
    EXPECT_THAT(lineWith(".access_control: (not"), HasSubstr("cameras."));
    EXPECT_THAT(history.output, Not(HasSubstr("planted")));

    const auto list = parseJson(ctl({"--format", "json", "history"}).output);
    ASSERT_TRUE(list && list->array() != nullptr);
    const Array& entries = *list->array();
    ASSERT_GE(entries.size(), 4U);
    const auto changesOf = [&](std::size_t i) { return *entries[i].dictionary()->get("changes").array(); };
    EXPECT_EQ(changesOf(0), (Array{Dictionary{{"key", "server_port"}, {"from", 8170}, {"to", 9001}}}));
    EXPECT_EQ(entries[1].dictionary()->get("outside"), Value(true));
    EXPECT_EQ(changesOf(1), (Array{Dictionary{{"key", "server_port"}, {"from", 9001}, {"to", 9002}}}));
    ASSERT_EQ(changesOf(2).size(), 2U) << "one entry for a write of settings and properties";
    EXPECT_EQ(changesOf(2)[0].dictionary()->get("to"), Value("(secret) changed"));
    EXPECT_EQ(changesOf(2)[1].dictionary()->get("name"), Value("two lines"));
    EXPECT_EQ(entries[2].dictionary()->get("number"), Value(3));
    EXPECT_THAT(std::string(entries.back().dictionary()->text("number")), StartsWith("r"));
    EXPECT_FALSE(entries[2].dictionary()->contains("settings")) << "no copies of everything";
    EXPECT_EQ(changesOf(entries.size() - 1).back().dictionary()->get("to"), Value("anna"));

    const ProgramResult rollback = ctl({"rollback", "2"});
    EXPECT_EQ(rollback.status, 0) << rollback.output;
    EXPECT_THAT(rollback.output, HasSubstr("settings.server_port: 9002 -> 9001: applied\n"));
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "9001\n");
}

TEST_F(Settings, HistoryShowsAWriteThatWasKilledAndLongValuesByTheirBeginning) {
    const std::string value(100, 'x');
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"server_host":")" + value + R"("}})").status, 200);
    EXPECT_THAT(ctl({"history"}).output, HasSubstr("xxx..."));
    EXPECT_THAT(ctl({"history"}).output, Not(HasSubstr(value)));
    const std::string about = "/var/lib/adminhostd/history/lumio/00000001/about.plist";
    std::string text = root.read(about);
    const std::size_t at = text.find("<key>changes</key>");
    ASSERT_NE(at, std::string::npos);
    root.write(about, text.replace(at, std::string("<key>changes</key>").size(), "<key>other</key>"));
    EXPECT_THAT(ctl({"history"}).output, HasSubstr("not recorded"));
}

TEST_F(Settings, PropertyThatBecomesProtectedLeavesNoPlainValueInTheHistory) {
    const auto change = [&](const std::string& entry) {
        EXPECT_EQ(post("writeSettings", R"({"configuration":{"properties":[)" + entry + "]}}").status, 200);
    };
    change(R"({"_newid_":true,"name":"key","value":"planted-one"})");
    const std::string id = root.sql("select id from properties where name='key'");
    const std::string entry = R"({"_id_":")" + id.substr(0, id.find('\n')) + R"(",)";
    change(entry + R"("value":"planted-two"})");
    const auto filesWithPlainValue = [&] {
        std::size_t count = 0;
        const std::filesystem::path directory = root.disk("/var/lib/adminhostd/history");
        for (const auto& file : std::filesystem::recursive_directory_iterator(directory)) {
            if (!file.is_regular_file()) {
                continue;
            }
            std::ifstream stream(file.path(), std::ios::binary);
            const std::string bytes((std::istreambuf_iterator<char>(stream)), {});
            count += bytes.find("planted-") == std::string::npos ? 0U : 1U;
        }
        return count;
    };
    ASSERT_EQ(filesWithPlainValue(), 1U) << "a plain value is kept";
    ASSERT_THAT(daemon.connect().get("/v1/lumio/history").body, HasSubstr("planted-two"));

    change(entry + R"("protect":true})");
    EXPECT_EQ(filesWithPlainValue(), 0U);
    EXPECT_THAT(daemon.connect().get("/v1/lumio/history").body, Not(HasSubstr("planted-")));
    EXPECT_THAT(ctl({"history"}).output, HasSubstr("properties.key.value: (secret) changed"));
}

TEST_F(Settings, PropertyThatWasProtectedByAKilledWorkerLeavesNoPlainValueInTheHistory) {
    const auto change = [&](const std::string& entry) {
        return post("writeSettings", R"({"configuration":{"properties":[)" + entry + "]}}").status;
    };
    ASSERT_EQ(change(R"({"_newid_":true,"name":"key","value":"planted-one"})"), 200);
    const std::string id = root.sql("select id from properties where name='key'");
    const std::string entry = R"({"_id_":")" + id.substr(0, id.find('\n')) + R"(",)";
    const std::string record = "/v1/requests/6ba7b810-9dad-11d1-80b4-00c04fd430c8";
    ASSERT_EQ(post("writeSettings", R"({"configuration":{"properties":[)" + entry + R"("value":"planted-two"}]}})",
                   {"Request-Id: 6ba7b810-9dad-11d1-80b4-00c04fd430c8"})
                  .status,
              200);
    ASSERT_THAT(daemon.connect().get(record).body, HasSubstr("planted-two"));
    ASSERT_THAT(daemon.connect().get("/v1/lumio/history").body, HasSubstr("planted-two"));
    // The statement is carried out, and the worker does not live to report it.
    root.write("/usr/bin/sqlite3",
               "#!/bin/sh\n/usr/bin/sqlite3 \"$@\" || exit\ncase \"$3\" in update*) kill -9 $PPID;; esac\n");
    std::filesystem::permissions(root.disk("/usr/bin/sqlite3"), std::filesystem::perms(0755));
    EXPECT_EQ(change(entry + R"("protect":true})"), 500);
    EXPECT_EQ(root.sql("select protect from properties where name='key'"), "t\n");
    EXPECT_THAT(daemon.connect().get("/v1/lumio/history").body, Not(HasSubstr("planted-")));
    EXPECT_THAT(daemon.connect().get(record).body, Not(HasSubstr("planted-")));
}

TEST_F(Settings, RemovalOfAPropertyThatDoesNotExistIsNotShownAsCertain) {
    const HttpReply reply =
        post("writeSettings", R"({"configuration":{"properties":[{"_id_":"9876","_obsoleteid_":true}]}})");
    ASSERT_EQ(reply.status, 200);
    const Value record = valueOf(daemon.connect().get("/v1/requests/" + reply.headers.at("request-id")));
    EXPECT_EQ(record.dictionary()->get("changes").array()->front().dictionary()->get("unverified"), Value(true));
    EXPECT_THAT(ctl({"history"}).output, HasSubstr("properties.9876: (present) -> (not present) (if it existed)\n"));
}

TEST_F(Settings, UnknownPluginHasNoHistory) {
    EXPECT_EQ(daemon.connect().get("/v1/other/history").status, 404);
    EXPECT_EQ(*valueOf(daemon.connect().get("/v1/lumio/history")).dictionary()->get("history").array(), Array{});
}

}  // namespace
}  // namespace adminhost
