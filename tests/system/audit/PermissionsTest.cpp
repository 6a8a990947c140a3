// Which account may do what, tried with the commands that the daemon describes itself.

#include "adminhostd/Permissions.h"
#include "platform/json/Json.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Eventually.h"
#include "tests/support/Journal.h"
#include "tests/support/SampleRoot.h"

#include <csignal>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <map>
#include <string>
#include <tuple>
#include <vector>

#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

int main(int argc, char** argv) {
    adminhost::test::enterJournal(argc, argv);
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}

namespace adminhost {
namespace {

using testing::HasSubstr;
using testing::Not;

/// One account for each class, named in the configuration in each of the ways there are.
struct Granted {
    Right right;
    test::TestAccount account;
    const char* table;  ///< its [[permission]] without the classes
};

const std::vector<Granted>& granted() {
    static const std::vector<Granted> all{{Right::read, {test::anna}, "users = [\"anna\"]"},
                                          {Right::write, {test::bert}, "users = [20002]"},
                                          {Right::control, {test::cora, {test::media}}, "groups = [\"media\"]"},
                                          {Right::account, {test::dora, {7, test::ops}}, "groups = [20102]"},
                                          {Right::audit, {test::emil}, "groups = [\"emil\"]"}};
    return all;
}

class Permission : public testing::Test {
  protected:
    Permission() {
        // Everybody may open the socket, so that it is the daemon that refuses.
        ::chmod(daemon.directory().c_str(), 0755);
        ::chmod(daemon.socket().c_str(), 0666);
    }

    [[nodiscard]] test::DaemonProcess::Options options() const {
        test::DaemonProcess::Options options;
        options.arguments = {"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"};
        for (const Granted& one : granted()) {
            options.configuration +=
                fmt::format("[[permission]]\n{}\nclasses = [\"{}\"]\n", one.table, nameOf(one.right));
        }
        options.configuration += "[[permission]]\nusers = [\"nobody-of-this-name\"]\nclasses = [\"write\"]\n";
        return options;
    }
    [[nodiscard]] test::UnixHttp as(const test::TestAccount& account) const {
        return test::connectAs(account, daemon.socket());
    }
    [[nodiscard]] Value valueOf(const std::string& address) const {
        const auto value = parseJson(daemon.connect().get(address).body);
        return value ? *value : Value();
    }
    /// The commands with their classes, as the daemon describes them.
    [[nodiscard]] std::map<std::string, std::string> commands() const {
        std::map<std::string, std::string> all;
        const Value described = valueOf("/v1/lumio");
        for (const Value& command : *described.array()) {
            all.emplace(command.dictionary()->text("name"), command.dictionary()->text("access"));
        }
        return all;
    }

    const test::SampleRoot root;
    const test::DaemonProcess daemon{options()};
};

TEST_F(Permission, EachClassAllowsItsOwnCommandsAndAddressesOnly) {
    // A command is tried with a body that cannot be read: that is refused after the permission was checked, and nothing
    // is run. 400 therefore means that the account may run it.
    struct Row {
        std::string method;
        std::string address;
        std::string needs;  ///< a class; empty if any class will do
        int allowed = 0;    ///< the status for an account that may; 0: 400 for POST, else 200
        int others = 403;   ///< the status for an account with another class
    };
    std::vector<Row> rows;
    const auto described = commands();
    ASSERT_GT(described.size(), 10U);
    for (const auto& [name, access] : described) {
        rows.push_back({"POST", "/v1/lumio/" + name, access});
    }
    rows.push_back({"POST", "/v1/lumio/writeSettings?check=1", "write"});
    rows.push_back({"POST", "/v1/lumio/startService?check=1", "control"});
    const std::string request = "/v1/requests/" + daemon.connect().post("/v1/lumio/getState").headers.at("request-id");
    for (const char* method : {"GET", "HEAD"}) {
        for (const char* address :
             {"/v1/lumio/history", "/v1/directory?is=anna", "/v1/doctor", "/v1/logs", "/v1/metrics"}) {
            rows.push_back({method, address, "read"});
        }
        rows.push_back({method, "/v1/logs/no-such-log", "read", 404});
        rows.push_back({method, "/v1/audit", "audit"});
        for (const char* address : {"/v1/", "/v1/lumio", "/v1/events"}) {
            rows.push_back({method, address, ""});
        }
        // The request is root's: without "read" it does not exist.
        rows.push_back({method, request, "read", 0, 404});
    }
    rows.push_back({"DELETE", request, "its own", 409, 404});
    std::string table = fmt::format("{:<52}{:<9}", "", "needs");
    for (const auto& [word, right] : rightWords) {
        table += fmt::format("{:<9}", word);
    }
    table += "none     root\n";
    for (const Row& row : rows) {
        table += fmt::format("{:<52}{:<9}", row.method + ' ' + row.address, row.needs.empty() ? "any" : row.needs);
        const int allowed = row.allowed != 0 ? row.allowed : row.method == "POST" ? 400 : 200;
        const auto tryAs = [&](test::UnixHttp client, int expected) {
            const test::HttpReply reply = client.request(row.method, row.address, row.method == "POST" ? "{" : "",
                                                         {"Content-Type: application/json"});
            EXPECT_EQ(reply.status, expected) << row.method << ' ' << row.address << ": " << reply.body;
            table += fmt::format("{:<9}", expected == allowed ? "allowed" : std::to_string(reply.status));
        };
        for (const Granted& one : granted()) {
            const bool may = row.needs.empty() || row.needs == nameOf(one.right);
            // "read" shows the requests of others, and does not allow to cancel them.
            const bool seesOnly = row.method == "DELETE" && one.right == Right::read;
            tryAs(as(one.account), may ? allowed : seesOnly ? 403 : row.others);
        }
        tryAs(as({12345, {}}), 403);
        tryAs(daemon.connect(), allowed);
        table += '\n';
    }
    std::cout << table;
}

TEST_F(Permission, RefusalNamesTheAccountTheClassTheFileAndTheLinesToAdd) {
    const test::HttpReply reply = as({test::anna}).post("/v1/lumio/writeSettings", "{}");
    EXPECT_EQ(reply.status, 403);
    const auto body = parseJson(reply.body);
    ASSERT_TRUE(body && body->dictionary() != nullptr);
    EXPECT_EQ(body->dictionary()->text("error"), "NOT_PERMITTED");
    EXPECT_EQ(body->dictionary()->text("message"),
              "The user \"anna\" (uid 20001) lacks the class \"write\", which this needs. To grant it, root adds to " +
                  (daemon.directory() / "config").string() +
                  " the lines \"[[permission]]\", 'users = [\"anna\"]' and 'classes = [\"write\"]', and runs "
                  "\"systemctl reload adminhostd\".");
    EXPECT_THAT(as({12345}).get("/v1/").body, HasSubstr("The account with uid 12345 lacks the class"));
    EXPECT_THAT(as({12345}).get("/v1/").body, HasSubstr("'users = [12345]'"));
}

TEST_F(Permission, AccountWithoutAnyClassGetsOneAnswerWhateverItAsksFor) {
    const test::HttpReply known = daemon.connect().post("/v1/lumio/getState", "{}");
    std::string first;
    for (const auto& [method, address] :
         std::vector<std::pair<std::string, std::string>>{{"GET", "/v1/"},
                                                          {"GET", "/v1/lumio"},
                                                          {"POST", "/v1/lumio/writeSettings"},
                                                          {"POST", "/v1/lumio/noSuchCommand"},
                                                          {"GET", "/v1/noSuchPlugin"},
                                                          {"GET", "/v1/requests/" + known.headers.at("request-id")},
                                                          {"GET", "/v1/requests/unknown"},
                                                          {"GET", "/nowhere"},
                                                          {"DELETE", "/v1/"},
                                                          {"GET", "/v1/doctor"}}) {
        const test::HttpReply reply = as({12345}).request(method, address);
        EXPECT_EQ(reply.status, 403) << address;
        EXPECT_EQ(reply.body, first.empty() ? reply.body : first) << address;
        first = reply.body;
        EXPECT_THAT(reply.body, Not(HasSubstr("getState"))) << address;
    }
}

TEST_F(Permission, GroupOfTheSocketGrantsNothing) {
    ASSERT_EQ(::chown(daemon.socket().c_str(), 0, test::media), 0);
    ASSERT_EQ(::chmod(daemon.socket().c_str(), 0660), 0);
    // "media" is granted "control" above; "ops" may not even open the socket.
    EXPECT_EQ(as({test::anna, {test::media}}).post("/v1/lumio/writeSettings", "{").status, 403);
    EXPECT_EQ(as({12345, {test::media}}).post("/v1/lumio/startService", "{").status, 400);
    EXPECT_THROW(static_cast<void>(as({test::anna, {test::ops}})), std::runtime_error);
}

TEST_F(Permission, GroupsThatCountAreThoseOfTheConnectingProcess) {
    // The group file lists no members: what the process has is what counts, also beyond the usual number of groups.
    std::vector<gid_t> many;
    for (gid_t group = 30'000; group < 30'500; ++group) {
        many.push_back(group);
    }
    EXPECT_EQ(as({12345, many}).get("/v1/").status, 403);
    many.push_back(test::media);
    EXPECT_EQ(as({12345, many}).get("/v1/").status, 200);
}

TEST_F(Permission, RequestsOfOthersAreShownWithTheClassReadAndWithoutTheirReports) {
    const test::HttpReply theirs = daemon.connect().post("/v1/lumio/getState", "{}");
    const std::string address = "/v1/requests/" + theirs.headers.at("request-id");
    const auto seen = parseJson(as({test::anna}).get(address).body);
    ASSERT_TRUE(seen && seen->dictionary() != nullptr);
    EXPECT_EQ(seen->dictionary()->text("command"), "getState");
    EXPECT_FALSE(seen->dictionary()->contains("changes"));
    const std::string absent = "/v1/requests/00000000-0000-4000-8000-000000000000";
    for (const auto& [method, suffix, headers] :
         std::vector<std::tuple<const char*, const char*, test::UnixHttp::Headers>>{
             {"GET", "", {}},
             {"DELETE", "", {}},
             {"POST", "", {}},
             {"GET", "?check=1", {}},
             {"GET", "", {"Request-Deadline: soon"}}}) {
        for (const std::string& one : {address, absent}) {
            EXPECT_EQ(as({test::bert}).request(method, one + suffix, "", headers).status, 404)
                << method << suffix << ": as for a request that does not exist";
        }
    }

    const test::HttpReply own = as({test::bert}).post("/v1/lumio/writeSettings", "{");
    const auto shown = parseJson(as({test::bert}).get("/v1/requests/" + own.headers.at("request-id")).body);
    ASSERT_TRUE(shown && shown->dictionary() != nullptr);
    EXPECT_TRUE(shown->dictionary()->contains("changes"));
    EXPECT_EQ(as({test::bert}).request("DELETE", "/v1/requests/" + own.headers.at("request-id")).status, 409)
        << "it may be cancelled, but has ended";
}

TEST_F(Permission, RefusedRequestLeavesTheIdUnused) {
    const std::string id = "Request-Id: 01234567-89ab-cdef-0123-456789abcdef";
    EXPECT_EQ(as({test::bert}).post("/v1/lumio/getState", "{}", {id}).status, 403);
    EXPECT_EQ(daemon.connect().post("/v1/lumio/getState", "{}", {id}).status, 200);
}

TEST_F(Permission, NameThatIsNotFoundIsReportedAndTheOthersCount) {
    EXPECT_TRUE(daemon.waitForLog("user not found: \"nobody-of-this-name\"; create the user")) << daemon.log();
    EXPECT_THAT(daemon.log(), HasSubstr("line 17, column 10: user not found"));
}

TEST_F(Permission, NameThatAReloadNoLongerFindsKeepsItsNumberUntilTheTablesDoNotNameIt) {
    const std::filesystem::path file = "/etc/passwd";
    const std::filesystem::path saved = "/etc/passwd.saved";
    std::filesystem::copy_file(file, saved);
    {
        std::ifstream lines(saved);
        std::ofstream others(file);
        for (std::string line; std::getline(lines, line);) {
            others << (line.starts_with("anna:") ? "" : line + '\n');
        }
    }
    daemon.signal(SIGHUP);
    const bool reloaded = daemon.waitForLog("the configuration has been read again");
    const int status = as({test::anna}).get("/v1/doctor").status;
    const test::HttpReply doctor = daemon.connect().get("/v1/doctor");
    std::ofstream(daemon.directory() / "config") << "[[permission]]\nusers = [\"bert\"]\nclasses = [\"read\"]\n";
    daemon.signal(SIGHUP);
    EXPECT_TRUE(
        test::eventually([&] { return as({test::anna}).get("/v1/doctor").status == 403; }, std::chrono::seconds(30)))
        << "the new tables do not name it";
    std::filesystem::rename(saved, file);
    ASSERT_TRUE(reloaded) << daemon.log();
    EXPECT_EQ(status, 200) << daemon.log();
    EXPECT_THAT(daemon.log(), HasSubstr("user not found any more: \"anna\"; its number 20001 stays in effect"));
    EXPECT_THAT(daemon.log(), Not(HasSubstr("user not found any more: \"nobody-of-this-name\"")));
    EXPECT_THAT(doctor.body, HasSubstr("keep the numbers that they had"));
}

}  // namespace
}  // namespace adminhost
