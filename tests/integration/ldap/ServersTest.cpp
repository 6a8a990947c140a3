// Which servers a node asks, how long, and when it gives up: order, time-outs, budgets, kept connections.

#include "platform/directory/Entries.h"
#include "platform/task/Task.h"
#include "tests/integration/ldap/ConnectionsFixture.h"
#include "tests/integration/ldap/TestAuthority.h"
#include "tests/support/SilentServer.h"

#include <chrono>
#include <csignal>

#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

using std::chrono::milliseconds;
using std::chrono::seconds;
using std::chrono::steady_clock;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

std::string uriOf(const test::SilentServer& server) {
    return "ldap://127.0.0.1:" + std::to_string(server.port());
}

TEST_F(LdapConnections, NodeConnectsAtItsFirstQueryAndNotWhenItIsOpened) {
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    const test::SilentServer hole;
    settings.uris = {uriOf(hole)};
    const DirectoryNodeSource source = ldapNode(settings);
    ASSERT_TRUE(source.open());
    EXPECT_EQ(hole.connections(), 0);
}

TEST_F(LdapConnections, ServersAreTriedInOrder) {
    ServerWithPeople server;
    LdapNodeSettings settings = settingsFor(server);
    settings.uris = {unusedUri(), server.uri(), unusedUri()};
    EXPECT_THAT(found(settings), ElementsAre("anna"));
}

TEST_F(LdapConnections, ServerThatRefusesTlsIsPassedOver) {
    const TestAuthority authority;
    support::Slapd::Options options;
    options.certificates = authority.issue("IP:127.0.0.1", std::chrono::hours(24));
    support::Slapd secure(options);
    secure.add(people());
    const support::Slapd withoutTls;
    LdapNodeSettings settings = settingsFor(secure);
    settings.caFile = HostPath(authority.file().string());
    settings.startTls = true;
    settings.uris = {withoutTls.uri(), secure.uri()};
    EXPECT_THAT(found(settings), ElementsAre("anna"));
}

TEST_F(LdapConnections, ServerThatIsDownIsAnErrorAtOnce) {
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    settings.uris = {unusedUri()};
    const auto begin = steady_clock::now();
    const Error error = errorOf(ask(ldapNode(settings), anna()));
    EXPECT_EQ(error.code, -1);
    EXPECT_THAT(error.description.value_or(""), HasSubstr("Can't contact LDAP server"));
    EXPECT_LT(steady_clock::now() - begin, seconds(4));
}

TEST_F(LdapConnections, ServerThatNeverRespondsEndsAtTheTimeOutAndIsNotTriedAgainInTheRequest) {
    const test::SilentServer hole;
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    settings.uris = {uriOf(hole)};
    settings.timeout = seconds(1);
    const DirectoryNodeSource source = ldapNode(settings);
    const DirectoryRequestScope request(milliseconds(10'000));
    const auto begin = steady_clock::now();
    const Error error = errorOf(ask(source, anna()));
    const auto first = steady_clock::now() - begin;
    EXPECT_EQ(error.code, -5);
    EXPECT_GE(first, milliseconds(900));
    EXPECT_LT(first, seconds(8));
    EXPECT_EQ(hole.connections(), 1);
    for (int i = 0; i < 1000; ++i) {
        ASSERT_EQ(errorOf(ask(source, anna())), error);
    }
    EXPECT_EQ(hole.connections(), 0);
    beginDirectoryRequest(milliseconds(10'000));
    EXPECT_EQ(errorOf(ask(source, anna())).code, -5);
    EXPECT_EQ(hole.connections(), 1) << "tried again in the next request";
}

TEST_F(LdapConnections, TlsHandshakeThatNeverEndsIsCutOffToo) {
    const test::SilentServer hole;
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    settings.uris = {"ldaps" + uriOf(hole).substr(4)};
    settings.timeout = seconds(1);
    const auto begin = steady_clock::now();
    EXPECT_LT(errorOf(ask(ldapNode(settings), anna())).code, 0);
    EXPECT_LT(steady_clock::now() - begin, seconds(8));
    settings.uris = {uriOf(hole)};
    settings.startTls = true;
    EXPECT_LT(errorOf(ask(ldapNode(settings), anna())).code, 0);
    EXPECT_LT(steady_clock::now() - begin, seconds(16));
}

TEST_F(LdapConnections, BudgetOfTheRequestEndsAllDirectoryWork) {
    const test::SilentServer one;
    const test::SilentServer two;
    LdapNodeSettings settings;
    settings.base = "dc=nimbo,dc=test";
    settings.name = "/One";
    settings.uris = {uriOf(one)};
    const DirectoryNodeSource first = ldapNode(settings);
    settings.name = "/Two";
    settings.uris = {uriOf(two)};
    const DirectoryNodeSource second = ldapNode(settings);
    const DirectoryRequestScope request(milliseconds(700));
    const auto begin = steady_clock::now();
    EXPECT_EQ(errorOf(ask(first, anna())).code, -5);
    const Error error = errorOf(ask(second, anna()));
    EXPECT_EQ(error.code, -5);
    EXPECT_THAT(error.description.value_or(""), HasSubstr("the time for the directory is used up"));
    EXPECT_EQ(two.connections(), 0);
    EXPECT_LT(steady_clock::now() - begin, seconds(4)) << "neither node's 5 s";
}

TEST_F(LdapConnections, DeadlineOfTheRequestEndsDirectoryWorkToo) {
    const test::SilentServer hole;
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    settings.uris = {uriOf(hole)};
    setTaskDeadline(steady_clock::now() + milliseconds(500));
    const auto begin = steady_clock::now();
    EXPECT_EQ(errorOf(ask(ldapNode(settings), anna())).code, -5);
    EXPECT_LT(steady_clock::now() - begin, seconds(4));
    setTaskDeadline(std::nullopt);
}

TEST_F(LdapConnections, WrongPasswordIsTriedOnceInARequestAndAtOneServer) {
    ServerWithPeople server;
    const test::SilentServer hole;
    LdapNodeSettings settings = settingsFor(server);
    settings.uris = {server.uri(), uriOf(hole)};
    settings.bindDn = "uid=writer,ou=people,dc=nimbo,dc=test";
    settings.bindPasswordFile = file("wrong");
    const DirectoryNodeSource source = ldapNode(settings);
    const DirectoryRequestScope request(std::nullopt);
    EXPECT_EQ(errorOf(ask(source, anna())).code, 49);
    EXPECT_EQ(hole.connections(), 0);
    support::writeFile(settings.bindPasswordFile->text(), "writerpw");
    EXPECT_EQ(errorOf(ask(source, anna())).code, 49) << "not tried again in this request";
    beginDirectoryRequest(std::nullopt);
    EXPECT_THAT(namesOf(ask(source, anna())), ElementsAre("anna"));
}

TEST_F(LdapConnections, ConnectionIsKeptBetweenRequestsAndOpenedAgainWhenTheServerWentAway) {
    ServerWithPeople server;
    LdapNodeSettings settings = settingsFor(server);
    settings.uris = {server.uri()};
    const DirectoryNodeSource source = ldapNode(settings);
    const auto ask1 = [&] {
        const DirectoryRequestScope request(milliseconds(10'000));
        return namesOf(ask(source, anna()));
    };
    EXPECT_THAT(ask1(), ElementsAre("anna"));
    server.stop();
    server.start();
    EXPECT_THAT(ask1(), ElementsAre("anna")) << "opened again, without an error";
    server.stop();
    EXPECT_THAT(ask1(), ElementsAre(HasSubstr("error -1"))) << "the server is down";
    server.start();
    EXPECT_THAT(ask1(), ElementsAre("anna"));
}

TEST_F(LdapConnections, KeptConnectionThatNoLongerRespondsFailsAtTheTimeOutAndIsReplaced) {
    ServerWithPeople server;
    LdapNodeSettings settings = settingsFor(server);
    settings.uris = {server.uri()};
    settings.timeout = seconds(1);
    const DirectoryNodeSource source = ldapNode(settings);
    EXPECT_THAT(namesOf(ask(source, anna())), ElementsAre("anna"));
    ASSERT_EQ(::kill(server.pid(), SIGSTOP), 0);
    int status = 0;
    ASSERT_EQ(::waitpid(server.pid(), &status, WUNTRACED), server.pid());
    ASSERT_TRUE(WIFSTOPPED(status)) << "all its threads have stopped";
    EXPECT_EQ(errorOf(ask(source, anna())).code, -5);
    ASSERT_EQ(::kill(server.pid(), SIGCONT), 0);
    EXPECT_THAT(namesOf(ask(source, anna())), ElementsAre("anna"));
}

TEST_F(LdapConnections, UnreachableNodesAreNamedWithinTheLimitForAllTogether) {
    ServerWithPeople server;
    const test::SilentServer hole;
    LdapNodeSettings silent = settingsFor(server);
    silent.name = "/Silent";
    silent.uris = {uriOf(hole)};
    LdapNodeSettings down = settingsFor(server);
    down.name = "/Down";
    down.uris = {unusedUri()};
    const SessionWith session({ldapNode(silent), ldapNode(down), ldapNode(settingsFor(server)), localAccounts()});
    const auto begin = steady_clock::now();
    const std::vector<UnreachableNode> unreachable = unreachableDirectoryNodes(milliseconds(2000));
    EXPECT_LT(steady_clock::now() - begin, seconds(5));
    ASSERT_THAT(unreachable, SizeIs(2));
    EXPECT_EQ(unreachable[0].name, "/Silent");
    EXPECT_THAT(unreachable[0].reason, HasSubstr("the server does not respond"));
    EXPECT_EQ(unreachable[1].name, "/Down");
    EXPECT_THAT(unreachable[1].reason, HasSubstr("Can't contact LDAP server"));
}

TEST_F(LdapConnections, NodeWithAKeptConnectionIsUnreachableWhenItsServerHasEnded) {
    ServerWithPeople server;
    const DirectoryNodeSource source = ldapNode(settingsFor(server));
    const SessionWith session({source});
    EXPECT_THAT(namesOf(ask(source, anna())), ElementsAre("anna"));
    EXPECT_THAT(unreachableDirectoryNodes(milliseconds(2000)), IsEmpty());
    server.stop();
    EXPECT_THAT(unreachableDirectoryNodes(milliseconds(2000)), SizeIs(1));
}

}  // namespace
}  // namespace adminhost
