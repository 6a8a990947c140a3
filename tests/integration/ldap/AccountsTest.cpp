// Accounts created, deleted and given passwords by an administrator who has signed in.

#include "tests/integration/ldap/TestAuthority.h"
#include "tests/integration/ldap/TestDirectory.h"
#include "tests/support/Program.h"

namespace adminhost {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

const DirectoryAttributes newAccount{{std::string(directory::realName), {"grid account"}},
                                     {std::string(directory::homeDirectory), {"/var/empty"}},
                                     {std::string(directory::userShell), {"/bin/bash"}},
                                     {std::string(directory::uniqueID), {"1025"}},
                                     {std::string(directory::primaryGroupID), {"20"}}};

class LdapAccounts : public testing::Test {
  protected:
    LdapAccounts() {
        server.add(tree + personEntry("writer", 1) + personEntry("reader", 2) +
                   // Not an account: administrators need not be.
                   "dn: cn=Directory Manager,ou=people,dc=nimbo,dc=test\nobjectClass: inetOrgPerson\ncn: Directory "
                   "Manager\nsn: M\nuid: manager\nuserPassword: managerpw\n\n" +
                   personEntry("twin", 3) +
                   "dn: cn=twin,ou=people,dc=nimbo,dc=test\nobjectClass: inetOrgPerson\ncn: twin\nsn: T\nuid: "
                   "twin\nuserPassword: twinpw\n\n");
        settings = settingsFor(server);
        settings.createBase = "ou=people,dc=nimbo,dc=test";
    }

    [[nodiscard]] std::unique_ptr<DirectoryNode> node() const { return ldapNode(settings).open().value(); }
    [[nodiscard]] std::unique_ptr<DirectoryNode> writer() const {
        auto opened = node();
        EXPECT_TRUE(opened->authenticate("writer", "writerpw").value());
        return opened;
    }
    [[nodiscard]] static DirectoryQuery query(const std::string& name) {
        DirectoryQuery query = queryFor(directory::recordName, {name});
        query.recordTypes = {std::string(directory::users)};
        return query;
    }
    [[nodiscard]] int signIn(const std::string& dn, const std::string& password) const {
        return test::runProgram({"/usr/bin/ldapwhoami", "-x", "-H", server.localUri(), "-D", dn, "-w", password},
                                test::Errors::merge)
            .status;
    }

    support::Slapd server;
    LdapNodeSettings settings;
};

TEST_F(LdapAccounts, SignInByNameOrDnWhateverTheClassesOfTheEntry) {
    EXPECT_TRUE(node()->authenticate("writer", "writerpw").value());
    EXPECT_TRUE(node()->authenticate("manager", "managerpw").value());
    EXPECT_TRUE(node()->authenticate("uid=reader,ou=people,dc=nimbo,dc=test", "readerpw").value());
    EXPECT_TRUE(node()->authenticate("cn=admin,dc=nimbo,dc=test", "adminpw").value()) << "has no entry at all";
}

TEST_F(LdapAccounts, WrongPasswordAndUnknownOrAmbiguousNameAreCode49) {
    for (const auto& [name, password] :
         {std::pair("writer", "wrong"), std::pair("nobody", "x"), std::pair("twin", "twinpw"),
          std::pair("*", "writerpw"), std::pair("uid=nobody,dc=nimbo,dc=test", "x")}) {
        const Error error = errorOf(node()->authenticate(name, password));
        EXPECT_EQ(error.domain, directory::ldapErrorDomain);
        EXPECT_EQ(error.code, 49) << name;
        EXPECT_THAT(error.description.value_or(""), Not(HasSubstr("pw"))) << "no password in the words";
    }
}

TEST_F(LdapAccounts, EmptyPasswordIsCode53WithoutAskingTheServer) {
    server.stop();
    EXPECT_EQ(errorOf(node()->authenticate("writer", "")).code, 53);
    EXPECT_EQ(errorOf(node()->authenticate("cn=admin,dc=nimbo,dc=test", "")).code, 53);
}

TEST_F(LdapAccounts, PasswordIsNotSentInClearText) {
    settings.uris = {server.uri()};
    const Error error = errorOf(node()->authenticate("cn=admin,dc=nimbo,dc=test", "adminpw"));
    EXPECT_EQ(error.code, 13);
    EXPECT_THAT(error.description.value_or(""), HasSubstr("clear text"));
    server.stop();
    EXPECT_EQ(errorOf(node()->authenticate("cn=admin,dc=nimbo,dc=test", "adminpw")).code, 13)
        << "refused before anything is sent";
}

TEST_F(LdapAccounts, PasswordIsSentOverTls) {
    const TestAuthority authority;
    support::Slapd::Options options;
    options.certificates = authority.issue("IP:127.0.0.1", std::chrono::hours(24));
    support::Slapd secure(options);
    secure.add(tree + personEntry("writer", 1));
    settings.caFile = HostPath(authority.file().string());
    settings.uris = {secure.secureUri()};
    EXPECT_TRUE(node()->authenticate("writer", "writerpw").value());
    settings.uris = {secure.uri()};
    settings.startTls = true;
    EXPECT_TRUE(node()->authenticate("writer", "writerpw").value());
}

TEST_F(LdapAccounts, CreatedAccountIsReadBackAndCanSignInWithItsPassword) {
    settings.createAttributes["description"] = {"made for %u", "%u%u"};
    const auto signedIn = writer();
    const auto created = signedIn->createRecord(directory::users, "grid_1", newAccount).value();
    ASSERT_TRUE(created);
    EXPECT_EQ(created->place, "uid=grid_1,ou=people,dc=nimbo,dc=test");
    DirectoryAttributes expected = newAccount;
    expected[std::string(directory::recordName)] = {"grid_1"};
    EXPECT_EQ(created->attributes, expected);
    ASSERT_TRUE(signedIn->setPassword(directory::users, "grid_1", "!secret}"));
    EXPECT_EQ(signIn(created->place, "!secret}"), 0);
    EXPECT_EQ(signIn(created->place, "other"), 49);
    const auto shown = test::runProgram({"/usr/bin/ldapsearch", "-LLL", "-x", "-H", server.localUri(), "-b",
                                         created->place, "description", "objectClass"});
    for (const char* line : {"description: made for grid_1\n", "description: grid_1grid_1\n", "objectClass: account\n",
                             "objectClass: posixAccount\n"}) {
        EXPECT_THAT(shown.output, HasSubstr(line));
    }
}

TEST_F(LdapAccounts, NameIsEscapedInTheDn) {
    const auto created = writer()->createRecord(directory::users, "a,b=c+\"d", newAccount).value();
    ASSERT_TRUE(created);
    EXPECT_THAT(created->values(directory::recordName), ElementsAre("a,b=c+\"d"));
    EXPECT_THAT(created->place, HasSubstr(",ou=people,dc=nimbo,dc=test"));
}

TEST_F(LdapAccounts, AccountThatTheNodesFilterDoesNotShowIsCreatedAndDoesNotComeBack) {
    settings.userFilter = "(&(objectClass=posixAccount)(uidNumber<=100))";
    const auto signedIn = writer();
    const auto created = signedIn->createRecord(directory::users, "grid_1", newAccount);
    ASSERT_TRUE(created);
    EXPECT_FALSE(*created);
}

TEST_F(LdapAccounts, ExistingAccountIsCode68AndMissingRightsAreCode50) {
    EXPECT_EQ(errorOf(writer()->createRecord(directory::users, "reader", newAccount)).code, 68);
    const auto signedIn = node();
    ASSERT_TRUE(signedIn->authenticate("reader", "readerpw").value());
    EXPECT_EQ(errorOf(signedIn->createRecord(directory::users, "new", newAccount)).code, 50);
    EXPECT_EQ(errorOf(signedIn->deleteRecord(directory::users, "writer")).code, 50);
    EXPECT_EQ(errorOf(signedIn->setPassword(directory::users, "writer", "x")).code, 50);
}

TEST_F(LdapAccounts, AccountIsDeletedByNameAndAMissingOneIsCode32) {
    const auto signedIn = writer();
    EXPECT_THAT(namesOf(signedIn->records(query("reader"))), ElementsAre("reader"));
    ASSERT_TRUE(signedIn->deleteRecord(directory::users, "reader"));
    EXPECT_THAT(namesOf(signedIn->records(query("reader"))), IsEmpty());
    EXPECT_EQ(errorOf(signedIn->deleteRecord(directory::users, "reader")).code, 32);
    EXPECT_EQ(errorOf(signedIn->setPassword(directory::users, "reader", "x")).code, 32);
}

TEST_F(LdapAccounts, SeveralRecordsOfOneNameAreNotDeleted) {
    server.add(
        "dn: uid=writer,ou=groups,dc=nimbo,dc=test\nobjectClass: account\nobjectClass: posixAccount\nuid: "
        "writer\nuid: x\ncn: x\nuidNumber: 9\ngidNumber: 9\nhomeDirectory: /\n\n");
    const auto signedIn = node();
    ASSERT_TRUE(signedIn->authenticate("cn=admin,dc=nimbo,dc=test", "adminpw").value());
    EXPECT_EQ(errorOf(signedIn->deleteRecord(directory::users, "writer")).code, 53);
    EXPECT_EQ(namesOf(signedIn->records(query("writer"))).size(), 2U);
}

TEST_F(LdapAccounts, ChangesWithoutASignInAreRefused) {
    const auto opened = node();
    EXPECT_EQ(errorOf(opened->createRecord(directory::users, "new", newAccount)).code, 50);
    EXPECT_EQ(errorOf(opened->deleteRecord(directory::users, "reader")).code, 50);
    EXPECT_EQ(errorOf(opened->setPassword(directory::users, "reader", "x")).code, 50);
    EXPECT_EQ(errorOf(opened->createRecord(directory::groups, "new", {})).code, directory::notSupported);
}

TEST_F(LdapAccounts, SignInEndsWithItsRequestAndIsNeverUsedForLookUps) {
    const DirectoryNodeSource source = ldapNode(settings);
    std::unique_ptr<DirectoryNode> survivor;
    {
        const DirectoryRequestScope request(std::nullopt);
        survivor = source.open().value();
        ASSERT_TRUE(survivor->authenticate("writer", "writerpw").value());
        EXPECT_TRUE(survivor->setPassword(directory::users, "reader", "readerpw"));
    }
    EXPECT_EQ(errorOf(survivor->setPassword(directory::users, "reader", "x")).code, 50);
    EXPECT_THAT(namesOf(survivor->records(query("reader"))), ElementsAre("reader")) << "look-ups go on";
    const DirectoryRequestScope request(std::nullopt);
    EXPECT_EQ(errorOf(source.open().value()->deleteRecord(directory::users, "reader")).code, 50);
}

TEST_F(LdapAccounts, ServerThatGoesAwayAfterTheSignInIsAnErrorOfTheNetworkAndNotAnAnswer) {
    const auto signedIn = writer();
    server.stop();
    const Error error = errorOf(signedIn->records(query("reader")));
    EXPECT_LT(error.code, 0);
    EXPECT_LT(errorOf(signedIn->deleteRecord(directory::users, "reader")).code, 0);
}

}  // namespace
}  // namespace adminhost
