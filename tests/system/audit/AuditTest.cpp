// The audit in a real journal: what is recorded, and what is shown of it.

#include "tests/system/audit/AuditFixture.h"

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::Not;
using testing::SizeIs;

TEST_F(AuditTest, JourneyHasTwoEventsForAChangeAndOneForAReading) {
    const std::string write = test::connectAs({test::bert}, daemon->socket())
                                  .post("/v1/fixture/reportWrite", R"({"changes": 1, "parts": 1, "text": "443"})")
                                  .headers.at("request-id");
    const std::string read =
        test::connectAs({test::bert}, daemon->socket()).post("/v1/fixture/echo").headers.at("request-id");
    const std::string refused =
        test::connectAs({test::anna}, daemon->socket()).post("/v1/fixture/reportWrite").headers.at("request-id");

    const auto written = awaitEntries(write, 2);
    EXPECT_EQ(written[0].text("event"), "begun");
    EXPECT_FALSE(written[0].contains("changes"));
    EXPECT_EQ(written[1].text("event"), "ended");
    for (const Dictionary& entry : written) {
        EXPECT_EQ(entry.text("plugin"), "fixture");
        EXPECT_EQ(entry.text("command"), "reportWrite");
        EXPECT_EQ(entry.text("access"), "write");
        EXPECT_EQ(entry.get("uid"), Value(test::bert));
        EXPECT_EQ(entry.text("user"), "bert");
        EXPECT_TRUE(entry.get("pid").isInteger());
        EXPECT_TRUE(entry.get("when").date());
    }
    EXPECT_EQ(written[1].get("status"), Value(204));
    EXPECT_TRUE(written[1].get("milliseconds").real());
    const Array& changes = *written[1].get("changes").array();
    ASSERT_EQ(changes.size(), 2U);
    EXPECT_EQ(changes[0].dictionary()->text("section"), "cameras");
    EXPECT_EQ(*changes[1].dictionary(), (Dictionary{{"section", "settings"},
                                                    {"identity", ""},
                                                    {"name", ""},
                                                    {"key", "port"},
                                                    {"from", 80},
                                                    {"to", "443"},
                                                    {"secret", false}}));
    ASSERT_EQ(written[1].get("notDone").array()->size(), 2U);
    EXPECT_EQ(written[1].get("notDone").array()->front().dictionary()->text("reason"), "not changed: camera not found");

    const auto reading = awaitEntries(read, 1);
    EXPECT_EQ(reading[0].text("event"), "ended");
    EXPECT_FALSE(reading[0].contains("changes"));
    const auto refusal = awaitEntries(refused, 1);
    EXPECT_EQ(refusal[0].text("user"), "anna");
    EXPECT_EQ(refusal[0].text("result"), "NOT_PERMITTED");

    std::cout << journalctl({"--output=verbose", "ADMINHOST_REQUEST=" + write})
              << ctl({"audit", "--since", "1h"}).output;
}

TEST_F(AuditTest, CancellationIsRecordedWithTheAccountsOfBothClients) {
    const std::string id = "01234567-89ab-cdef-0123-0123456789ab";
    test::UnixHttp reader = test::connectAs({test::bert}, daemon->socket());
    reader.begin("POST", "/v1/fixture/run", R"({"script": "sleep 20"})", {"Request-Id: " + id});
    ASSERT_TRUE(eventually([&] { return daemon->connect().get("/v1/requests/" + id).status == 200; }));
    EXPECT_EQ(daemon->connect().request("DELETE", "/v1/requests/" + id).status, 200);
    EXPECT_EQ(reader.reply().status, 503);
    const auto entries = awaitEntries(id, 2);
    EXPECT_EQ(entries[0].text("event"), "ended");
    EXPECT_EQ(entries[0].text("user"), "bert");
    EXPECT_EQ(entries[1].text("event"), "cancelled");
    EXPECT_EQ(entries[1].get("uid"), Value(::geteuid()));
    EXPECT_THAT(std::string(entries[1].text("result")), HasSubstr("(bert)"));
}

TEST_F(AuditTest, RequestThatChangesNothingLogsNoChange) {
    const std::string id = daemon->connect().post("/v1/fixture/reportWrite", "{}").headers.at("request-id");
    EXPECT_FALSE(awaitEntries(id, 2)[1].contains("changes"));
    const std::string bad = daemon->connect().post("/v1/fixture/reportWrite", R"({"bad": 1})").headers.at("request-id");
    EXPECT_EQ(awaitEntries(bad, 1)[0].text("result"), "REQUEST_REFUSED") << "nothing had begun";
    const std::string check = daemon->connect().post("/v1/fixture/reportWrite?check=1", "{}").headers.at("request-id");
    EXPECT_EQ(awaitEntries(check, 1)[0].get("checkOnly"), Value(true));
}

TEST_F(AuditTest, SelectionByUserKeyAndTimeAndPages) {
    test::connectAs({test::bert}, daemon->socket()).post("/v1/fixture/reportWrite", R"({"changes": 1})");
    const std::string last =
        daemon->connect().post("/v1/fixture/reportWrite", R"({"text": "443"})").headers.at("request-id");
    awaitEntries(last, 2);
    for (const char* user : {"bert", "20002"}) {
        const Array entries = *page(std::string("user=") + user).get("entries").array();
        ASSERT_GE(entries.size(), 2U);
        for (const Value& entry : entries) {
            EXPECT_EQ(entry.dictionary()->text("user"), "bert");
        }
    }
    EXPECT_THAT(*page("user=nobody-of-this-name").get("entries").array(), SizeIs(0));
    for (const char* key : {"port", "settings", "settings.port"}) {
        const Array entries = *page(std::string("key=") + key).get("entries").array();
        ASSERT_GE(entries.size(), 1U);
        EXPECT_EQ(entries.back().dictionary()->text("request"), last);
    }
    EXPECT_THAT(*page("key=cameras.port").get("entries").array(), SizeIs(0));
    EXPECT_THAT(*page("since=2100-01-01T00:00:00Z").get("entries").array(), SizeIs(0));
    EXPECT_GE(page("since=2020-01-01T00:00:00Z").get("entries").array()->size(), 4U);
    EXPECT_EQ(daemon->connect().get("/v1/audit?since=yesterday").status, 400);
    EXPECT_EQ(daemon->connect().get("/v1/audit?after=nowhere").status, 404);

    const Dictionary all = page("");
    EXPECT_EQ(all.get("more"), Value(false));
    const Array rest = *page("after=" + std::string(all.text("next"))).get("entries").array();
    for (const Value& entry : *all.get("entries").array()) {
        EXPECT_EQ(std::count(rest.begin(), rest.end(), entry), 0) << "each entry is on one page";
    }
    const std::string next = daemon->connect().post("/v1/fixture/echo").headers.at("request-id");
    ASSERT_TRUE(eventually([&] {
        const Array newer = *page("after=" + std::string(all.text("next"))).get("entries").array();
        return !newer.empty() && newer.back().dictionary()->text("request") == next;
    }));
}

TEST_F(AuditTest, PageIsBounded) {
    auto client = daemon->connect();
    for (int i = 0; i < 250; ++i) {
        client.post("/v1/fixture/nothing");
    }
    ASSERT_TRUE(eventually([&] { return page("").get("more") == Value(true); }));
    EXPECT_EQ(page("").get("entries").array()->size(), 200U);
}

TEST_F(AuditTest, FollowingReadsAreNotRecordedThemselves) {
    awaitEntries(daemon->connect().post("/v1/fixture/echo").headers.at("request-id"), 1);
    const test::HttpReply first = daemon->connect().get("/v1/audit");
    const std::string following = "/v1/audit?after=" + std::string(dictionaryOf(first).text("next"));
    const std::string next = daemon->connect().get(following).headers.at("request-id");
    EXPECT_EQ(settledCount(first.headers.at("request-id")), 1U) << "the first page is a reading like others";
    EXPECT_EQ(entriesOf(next).size(), 0U);
}

TEST_F(AuditTest, ReadingThatOnlyLooksLikeFollowingIsRecorded) {
    fs::create_directories(root.disk("/var/log/fixture"));
    std::ofstream(root.disk("/var/log/fixture/fixture.log")) << "text\n";
    awaitEntries(daemon->connect().post("/v1/fixture/echo").headers.at("request-id"), 1);
    const std::string place(page("").text("next"));
    const test::TestAccount emil{test::emil};
    const test::TestAccount bert{test::bert};
    for (const auto& [account, address] :
         {std::pair(bert, std::string("/v1/logs?inode=0&offset=0")),
          std::pair(bert, std::string("/v1/logs/log?inode=0&offset=0")), std::pair(emil, "/v1/audit?after=" + place)}) {
        const test::HttpReply first = test::connectAs(account, daemon->socket()).get(address);
        ASSERT_EQ(first.status, 200) << first.body;
        const test::HttpReply second = test::connectAs(account, daemon->socket()).get(address);
        EXPECT_EQ(settledCount(first.headers.at("request-id")), 1U) << address;
        EXPECT_EQ(entriesOf(second.headers.at("request-id")).size(), 0U) << address;
    }
}

TEST_F(AuditTest, AccountIsFoundByANameThatOnlyALookUpKnows) {
    // The daemon does not know the name when it records the request, as with accounts of a directory service.
    constexpr uid_t zoe = 20006;
    const std::string id = test::connectAs({zoe}, daemon->socket()).get("/v1/").headers.at("request-id");
    EXPECT_FALSE(awaitEntries(id, 1)[0].contains("user"));
    std::ofstream("/etc/passwd", std::ios::app) << "zoe:x:20006:20006::/nonexistent:/usr/sbin/nologin\n";
    const Array entries = *page("user=zoe").get("entries").array();
    ASSERT_THAT(entries, testing::Not(testing::IsEmpty()));
    EXPECT_EQ(entries.back().dictionary()->text("request"), id);
}

TEST_F(AuditTest, CommandLinePrintsATableJsonAndFollows) {
    daemon->connect().post("/v1/fixture/reportWrite", R"({"text": "a\u001b[2Jb\nc"})");
    const std::string id = daemon->connect().post("/v1/fixture/echo").headers.at("request-id");
    awaitEntries(id, 1);
    const std::string table = ctl({"audit", "--since", "1h"}).output;
    EXPECT_THAT(table, HasSubstr("TIME"));
    EXPECT_THAT(table, HasSubstr("fixture/reportWrite"));
    EXPECT_THAT(table, HasSubstr("\\x1b[2J"));
    EXPECT_THAT(table, Not(HasSubstr("\x1b")));
    EXPECT_THAT(table, Not(HasSubstr("begins"))) << "its end is there";
    const auto json = parseJson(ctl({"--format", "json", "audit", "--user", "root"}).output);
    ASSERT_TRUE(json && json->dictionary() != nullptr);
    EXPECT_GE(json->dictionary()->get("entries").array()->size(), 3U);
    EXPECT_EQ(ctl({"audit", "--since", "soon"}).status, 2);
    EXPECT_THAT(ctl({"audit", "--since", "soon"}).output, HasSubstr("neither a date"));
    EXPECT_EQ(ctl({"audit", "--since", "yesterday", "--key", "port"}).status, 0);

    const std::string output = daemon->directory() / "followed";
    const std::string program =
        fmt::format("echo $$ >{1}.pid; exec {0}/bin/adminhostctl --socket {2} audit -f >{1} 2>&1", BINARY_DIR, output,
                    daemon->socket());
    std::thread follower([&] { static_cast<void>(test::runProgram({"/bin/sh", "-c", program})); });
    const auto followed = [&] {
        std::ifstream file(output);
        return std::string(std::istreambuf_iterator<char>(file), {});
    };
    EXPECT_TRUE(eventually([&] { return followed().find("fixture/echo") != std::string::npos; })) << followed();
    daemon->connect().post("/v1/fixture/languages");
    EXPECT_TRUE(eventually([&] { return followed().find("fixture/languages") != std::string::npos; })) << followed();
    pid_t pid = 0;
    std::ifstream(output + ".pid") >> pid;
    ::kill(pid, SIGTERM);
    follower.join();
}

}  // namespace
}  // namespace adminhost
