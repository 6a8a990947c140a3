// Which servers a node asks, how long, and when it gives up: order, time-outs, budgets, kept connections.

#include "platform/directory/Entries.h"
#include "platform/task/Task.h"
#include "tests/integration/ldap/ConnectionsFixture.h"
#include "tests/integration/ldap/TestAuthority.h"

#include <chrono>
#include <csignal>

#include <fcntl.h>
#include <netinet/in.h>
#include <sys/socket.h>
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

/// A port that accepts connections, and never sends anything.
class BlackHole {
  public:
    BlackHole() : _socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t length = sizeof address;
        EXPECT_EQ(::bind(_socket, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(::listen(_socket, 100), 0);
        EXPECT_EQ(::getsockname(_socket, reinterpret_cast<sockaddr*>(&address), &length), 0);
        _port = ntohs(address.sin_port);
    }
    BlackHole(const BlackHole&) = delete;
    BlackHole& operator=(const BlackHole&) = delete;
    ~BlackHole() { ::close(_socket); }

    [[nodiscard]] std::string uri() const { return "ldap://127.0.0.1:" + std::to_string(_port); }
    /// The number of connections that clients have made.
    [[nodiscard]] int connections() const {
        int count = 0;
        ::fcntl(_socket, F_SETFL, O_NONBLOCK);
        for (int accepted = ::accept(_socket, nullptr, nullptr); accepted >= 0;
             accepted = ::accept(_socket, nullptr, nullptr)) {
            ::close(accepted);
            ++count;
        }
        return count;
    }

  private:
    int _socket;
    int _port = 0;
};

TEST_F(LdapConnections, NodeConnectsAtItsFirstQueryAndNotWhenItIsOpened) {
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    const BlackHole hole;
    settings.uris = {hole.uri()};
    const DirectoryNodeSource source = ldapNode(settings);
    ASSERT_TRUE(source.open());
    EXPECT_EQ(hole.connections(), 0);
}

TEST_F(LdapConnections, ServersAreTriedInOrder) {
    support::Slapd server;
    server.add(people());
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
    const BlackHole hole;
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    settings.uris = {hole.uri()};
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
    const BlackHole hole;
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    settings.uris = {"ldaps" + hole.uri().substr(4)};
    settings.timeout = seconds(1);
    const auto begin = steady_clock::now();
    EXPECT_LT(errorOf(ask(ldapNode(settings), anna())).code, 0);
    EXPECT_LT(steady_clock::now() - begin, seconds(8));
    settings.uris = {hole.uri()};
    settings.startTls = true;
    EXPECT_LT(errorOf(ask(ldapNode(settings), anna())).code, 0);
    EXPECT_LT(steady_clock::now() - begin, seconds(16));
}

TEST_F(LdapConnections, BudgetOfTheRequestEndsAllDirectoryWork) {
    const BlackHole one;
    const BlackHole two;
    LdapNodeSettings settings;
    settings.base = "dc=nimbo,dc=test";
    settings.name = "/One";
    settings.uris = {one.uri()};
    const DirectoryNodeSource first = ldapNode(settings);
    settings.name = "/Two";
    settings.uris = {two.uri()};
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
    const BlackHole hole;
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    settings.uris = {hole.uri()};
    setTaskDeadline(steady_clock::now() + milliseconds(500));
    const auto begin = steady_clock::now();
    EXPECT_EQ(errorOf(ask(ldapNode(settings), anna())).code, -5);
    EXPECT_LT(steady_clock::now() - begin, seconds(4));
    setTaskDeadline(std::nullopt);
}

TEST_F(LdapConnections, WrongPasswordIsTriedOnceInARequestAndAtOneServer) {
    support::Slapd server;
    server.add(people());
    const BlackHole hole;
    LdapNodeSettings settings = settingsFor(server);
    settings.uris = {server.uri(), hole.uri()};
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
    support::Slapd server;
    server.add(people());
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
    support::Slapd server;
    server.add(people());
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
    support::Slapd server;
    server.add(people());
    const BlackHole hole;
    LdapNodeSettings silent = settingsFor(server);
    silent.name = "/Silent";
    silent.uris = {hole.uri()};
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
    support::Slapd server;
    server.add(people());
    const DirectoryNodeSource source = ldapNode(settingsFor(server));
    const SessionWith session({source});
    EXPECT_THAT(namesOf(ask(source, anna())), ElementsAre("anna"));
    EXPECT_THAT(unreachableDirectoryNodes(milliseconds(2000)), IsEmpty());
    server.stop();
    EXPECT_THAT(unreachableDirectoryNodes(milliseconds(2000)), SizeIs(1));
}

}  // namespace
}  // namespace adminhost
