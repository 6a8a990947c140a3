// The grid's account from its creation to its use: created through the daemon in a real LDAP server, given a principal
// in a real KDC, written into the settings, and accepted by the grid. The administrator's password and the account's
// are nowhere but in the request and in the answer.

#include "platform/json/Json.h"
#include "platform/value/Value.h"
#include "tests/support/AdministratorTree.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Kdc.h"
#include "tests/support/SampleRoot.h"
#include "tests/support/Slapd.h"
#include "tests/system/secrets/Searches.h"

#include <chrono>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <optional>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

constexpr auto patience = std::chrono::seconds(60);
/// The account that the server lets change people.
constexpr const char* administrator = "writer";

class AccountCreation : public testing::Test {
  protected:
    void SetUp() override {
        server.add(administratorTree(planted));
        kdc.admin("addprinc -randkey nimbo/grid1.example.org");
        root.write("/etc/demo/nimbo.service", "nimbo/grid1.example.org");
        root.recordToolCalls();
        daemon.emplace(DaemonProcess::Options{
            {"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"},
            "[[directory.node]]\nname = \"/LDAP\"\nuri = [\"" + server.localUri() +
                "\"]\nbase = \"dc=nimbo,dc=test\"\ncreate_base = \"ou=people,dc=nimbo,dc=test\"\n"
                "kerberos_realm = \"NIMBO.TEST\"\n",
            {},
            true,
            {}});
    }
    void TearDown() override {
        for (const fs::path& directory : {fs::path(root.directory()), daemon->directory()}) {
            EXPECT_THAT(searchBelow(directory).holding, IsEmpty());
        }
        for (const pid_t pid : processesFrom(daemon->pid())) {
            EXPECT_FALSE(holdsPlanted(argumentsAndEnvironmentOf(pid))) << pid;
        }
    }

    [[nodiscard]] HttpReply post(const std::string& command, const Dictionary& body) const {
        HttpReply reply = UnixHttp(daemon->socket(), patience).post("/v1/lumio/" + command, jsonOf(body));
        EXPECT_FALSE(holdsPlanted(reply.body));
        EXPECT_EQ(reply.status, 200) << reply.body;
        return reply;
    }
    [[nodiscard]] static Dictionary answerIn(const HttpReply& reply) {
        const auto value = parseJson(reply.body);
        return value && value->dictionary() != nullptr ? *value->dictionary() : Dictionary();
    }
    [[nodiscard]] HttpReply create(const std::string& password = planted) const {
        return post(
            "createNimboAccount",
            {{"directoryNode", "/LDAP"}, {"directoryUsername", administrator}, {"directoryPassword", password}});
    }
    /// Neither files nor answers of the daemon hold the text.
    void expectNowhere(const std::string& secret, const std::string& request) const {
        for (const fs::path& directory : {fs::path(root.directory()), daemon->directory()}) {
            for (const auto& entry : fs::recursive_directory_iterator(directory)) {
                if (entry.is_regular_file() && !entry.is_symlink()) {
                    std::ifstream file(entry.path(), std::ios::binary);
                    EXPECT_THAT(std::string(std::istreambuf_iterator<char>(file), {}), Not(HasSubstr(secret)))
                        << entry.path();
                }
            }
        }
        for (const std::string& target :
             {"/v1/requests/" + request, std::string("/v1/lumio/history"), std::string("/v1/")}) {
            EXPECT_THAT(daemon->connect().get(target).body, Not(HasSubstr(secret))) << target;
        }
    }

    const support::Kdc kdc;
    const support::ScopedEnvironment environment{kdc.environment()};
    const support::Slapd server;
    const SampleRoot root;
    std::optional<DaemonProcess> daemon;
};

TEST_F(AccountCreation, AccountIsCreatedReplacedWrittenAndAcceptedByTheGrid) {
    const HttpReply first = create();
    const std::string name{answerIn(first).text("username")};
    EXPECT_EQ(name, "sorvanenimbo_" + SampleRoot::uuidOf("server", "library")) << first.body;
    const HttpReply second = create();
    EXPECT_EQ(answerIn(second).text("username"), name);
    const std::string password{answerIn(second).text("password")};
    ASSERT_EQ(password.size(), 20U) << second.body;
    EXPECT_NE(answerIn(first).text("password"), password);
    expectNowhere(password, second.headers.at("request-id"));
    EXPECT_THAT(daemon->connect().get("/v1/requests/" + second.headers.at("request-id")).body, HasSubstr(name))
        << "the account is reported";

    std::string quoted;
    for (const char c : password) {
        quoted.append(c == '"' ? 2 : 1, c);
    }
    kdc.admin("addprinc -pw \"" + quoted + "\" " + name);
    const HttpReply written =
        post("writeSettings",
             {{"configuration", Dictionary{{"nimbo_client_username", name}, {"nimbo_client_password", password}}}});
    EXPECT_THAT(written.body, HasSubstr("\"writeStatus\":0"));
    const HttpReply state = post("getState", {{"variant", "withDetails"}});
    EXPECT_THAT(state.body, HasSubstr(R"("nimboControllerState":"kNimboAvailable")"));
    expectNowhere(password, state.headers.at("request-id"));
}

TEST_F(AccountCreation, WrongPasswordOfTheAdministratorIsTheDirectorysErrorAndReportsNothing) {
    const HttpReply reply = create(std::string(planted) + "x");
    EXPECT_EQ(answerIn(reply).get("errorCode"), Value(49)) << reply.body;
    EXPECT_NE(answerIn(reply).text("error"), "");
    EXPECT_FALSE(reply.headers.contains("adminhost-changes"));
    EXPECT_THAT(daemon->connect().get("/v1/lumio/history").body, Not(HasSubstr("createNimboAccount")));
}

}  // namespace
}  // namespace adminhost::test
