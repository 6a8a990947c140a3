// The grid's account, created in a real LDAP server. The account's password is tried with the server's own client.

#include "handler/LumioRequestHandler.h"
#include "platform/directory/LdapNode.h"
#include "platform/directory/LocalAccounts.h"
#include "tests/support/CapturedReports.h"
#include "tests/support/Program.h"
#include "tests/support/Slapd.h"
#include "tests/support/TemporaryRoot.h"

#include <csignal>
#include <filesystem>
#include <memory>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {
namespace {

using adminhost::Dictionary;
using adminhost::Value;
using adminhost::test::runProgram;
using testing::AllOf;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

// As in the worker: writing to a server that went away is an error and not the end of the process.
const bool brokenPipesAreIgnored = std::signal(SIGPIPE, SIG_IGN) != SIG_ERR;

constexpr const char* administrator = "cn=admin,dc=nimbo,dc=test";
constexpr const char* administratorsPassword = "adminpw";
constexpr const char* account = "sorvanenimbo_8D2B4C1E-0F6A-4E0B-9C55-0A7B1C2D3E4F";
const std::string accountDn = std::string("uid=") + account + ",ou=people,dc=nimbo,dc=test";

const std::string tree =
    "dn: dc=nimbo,dc=test\nobjectClass: domain\ndc: nimbo\n\n"
    "dn: ou=people,dc=nimbo,dc=test\nobjectClass: organizationalUnit\nou: people\n\n";

std::string person(const std::string& uid, int number) {
    return "dn: uid=" + uid + ",ou=people,dc=nimbo,dc=test\nobjectClass: account\nobjectClass: posixAccount\n" +
           "objectClass: simpleSecurityObject\nuid: " + uid + "\ncn: " + uid +
           "\nuidNumber: " + std::to_string(number) + "\ngidNumber: 100\nhomeDirectory: /home/" + uid +
           "\nuserPassword: " + uid + "pw\n\n";
}

class SlapdAccount : public testing::Test {
  protected:
    void SetUp() override {
        root.writePropertyList("/Library/Preferences/com.brenn.lumioserverd.plist",
                               "<key>shared_filesystem</key><string>/shared</string>");
        root.writePropertyList("/shared/lumioserverd.plist",
                               "<key>server_uuid</key><string>8D2B4C1E-0F6A-4E0B-9C55-0A7B1C2D3E4F</string>");
        server.add(tree + person("anna", 1025) + person("ben", 1026));
        use(server.localUri());
    }
    void TearDown() override {
        adminhost::setDirectoryNodes({adminhost::localAccounts()});
        EXPECT_THAT(log.lines, IsEmpty());
    }

    void use(const std::string& uri) const {
        adminhost::LdapNodeSettings settings;
        settings.name = "/LDAP";
        settings.uris = {uri};
        settings.base = support::Slapd::suffix;
        settings.createBase = "ou=people,dc=nimbo,dc=test";
        adminhost::setDirectoryNodes({adminhost::ldapNode(std::move(settings))});
    }
    [[nodiscard]] Dictionary create(const std::string& name = administrator,
                                    const std::string& password = administratorsPassword) {
        const Dictionary answer =
            handler
                .createNimboAccountWithRequest(
                    {{"directoryNode", "/LDAP"}, {"directoryUsername", name}, {"directoryPassword", password}})
                .dictionary();
        EXPECT_EQ(answer.get("command"), Value("createNimboAccount"));
        return answer;
    }
    /// The status of the server's own client that signs in with the password from its standard input.
    [[nodiscard]] int signIn(const std::string& password) const {
        return runProgram({"ldapwhoami", "-x", "-H", server.uri(), "-D", accountDn, "-y", "/dev/stdin"},
                          adminhost::test::Errors::merge, password)
            .status;
    }
    /// The entry of the account as the server has it; empty if there is none.
    [[nodiscard]] std::string entry() const {
        return runProgram({"ldapsearch", "-Q", "-LLL", "-Y", "EXTERNAL", "-H", server.localUri(), "-b", accountDn, "-s",
                           "base", "-o", "ldif-wrap=no"},
                          adminhost::test::Errors::merge)
            .output;
    }
    [[nodiscard]] bool exists() const { return entry().find("dn: " + accountDn) != std::string::npos; }

    support::Slapd server;
    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    adminhost::test::CapturedReports reports;
    LumioRequestHandler handler;
};

TEST_F(SlapdAccount, CanSignInWithThePasswordOfTheAnswer) {
    const Dictionary answer = create();
    ASSERT_EQ(answer.get("username"), Value(account)) << answer.text("error");
    const std::string password{answer.text("password")};
    EXPECT_EQ(signIn(password), 0);
    EXPECT_NE(signIn(password + "x"), 0);
    EXPECT_THAT(entry(),
                AllOf(HasSubstr("objectClass: posixAccount\n"), HasSubstr("\ncn: " + std::string(account) + "\n"),
                      HasSubstr("\nuidNumber: 1027\n"), HasSubstr("\ngidNumber: 20\n"),
                      HasSubstr("\nhomeDirectory: /var/empty\n"), HasSubstr("\nloginShell: /bin/bash\n")));
    EXPECT_THAT(entry(), Not(HasSubstr(password))) << "the server stores no plain text";
}

TEST_F(SlapdAccount, IsReplacedByASecondRunAndKeepsItsId) {
    const std::string first{create().text("password")};
    ASSERT_EQ(signIn(first), 0);
    const std::string second{create().text("password")};
    EXPECT_NE(second, first);
    EXPECT_NE(signIn(first), 0) << "the former password is not kept";
    EXPECT_EQ(signIn(second), 0);
    EXPECT_THAT(entry(), HasSubstr("\nuidNumber: 1027\n")) << "the former id is free again";
}

TEST_F(SlapdAccount, WrongPasswordOrUnknownAdministratorIs49AndChangesNothing) {
    ASSERT_EQ(create().get("errorCode"), Value());
    const std::string before = entry();
    EXPECT_EQ(create(administrator, "wrong").get("errorCode"), Value(49));
    EXPECT_EQ(create("nobody here").get("errorCode"), Value(49));
    EXPECT_EQ(create("uid=nobody,dc=nimbo,dc=test").get("errorCode"), Value(49));
    EXPECT_EQ(entry(), before);
}

TEST_F(SlapdAccount, EmptyPasswordIs53AndTheServerIsNotAsked) {
    server.stop();
    EXPECT_EQ(create(administrator, "").get("errorCode"), Value(53));
}

TEST_F(SlapdAccount, AdministratorWithoutRightsCannotDeleteOrCreate) {
    EXPECT_EQ(create("anna", "annapw").get("errorCode"), Value(50));
    EXPECT_FALSE(exists());
    ASSERT_EQ(create().get("errorCode"), Value());
    const std::string before = entry();
    const Dictionary refused = create("anna", "annapw");
    EXPECT_EQ(refused.get("errorCode"), Value(50));
    EXPECT_NE(refused.text("error"), "");
    EXPECT_EQ(entry(), before);
}

TEST_F(SlapdAccount, ConnectionThatIsNotProtectedIsRefusedBeforeAnythingIsDeleted) {
    ASSERT_EQ(create().get("errorCode"), Value());
    const std::string before = entry();
    use(server.uri());
    const Dictionary answer = create();
    EXPECT_FALSE(answer.contains("password"));
    EXPECT_TRUE(answer.contains("errorCode"));
    EXPECT_NE(answer.text("error"), "");
    EXPECT_EQ(entry(), before);
}

TEST_F(SlapdAccount, ServerThatIsDownIsTheLibrarysError) {
    server.stop();
    const Dictionary answer = create();
    EXPECT_EQ(answer.get("errorCode"), Value(-1));
    EXPECT_NE(answer.text("error"), "");
}

TEST_F(SlapdAccount, NodeOfLocalAccountsRefusesInClearWords) {
    adminhost::setDirectoryNodes({adminhost::localAccounts()});
    const Dictionary answer = handler
                                  .createNimboAccountWithRequest({{"directoryNode", "/Local"},
                                                                  {"directoryUsername", "root"},
                                                                  {"directoryPassword", administratorsPassword}})
                                  .dictionary();
    EXPECT_EQ(answer.get("errorCode"), Value(adminhost::directory::notSupported));
    EXPECT_THAT(std::string(answer.text("error")), HasSubstr("/Local"));
}

}  // namespace
}  // namespace lumio
