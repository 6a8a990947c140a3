// How a node connects: servers, TLS, ways of signing in, time-outs and budgets.

#include "platform/directory/Entries.h"
#include "platform/task/Task.h"
#include "tests/integration/ldap/TestAuthority.h"
#include "tests/integration/ldap/TestDirectory.h"
#include "tests/support/Environment.h"
#include "tests/support/Kdc.h"
#include "tests/support/Program.h"

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <fstream>
#include <set>

#include <fcntl.h>
#include <ldap.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/stat.h>
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
using testing::Not;
using testing::SizeIs;
using testing::StartsWith;

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

class LdapConnections : public testing::Test {
  protected:
    static std::string people() { return tree + personEntry("anna", 1001) + personEntry("writer", 1002); }
    static DirectoryQuery anna() { return queryFor(directory::recordName, {"anna"}); }
    /// The name of the only record that is found, or the error.
    static std::vector<std::string> found(const LdapNodeSettings& settings) {
        return namesOf(ask(ldapNode(settings), anna()));
    }
    static std::string unusedUri() { return "ldap://127.0.0.1:" + std::to_string(support::freePort()); }

    /// Where the library puts caches in files.
    static std::set<std::string> cacheFiles() {
        std::set<std::string> names;
        for (const auto& entry : std::filesystem::directory_iterator("/tmp")) {
            const std::string name = entry.path().filename();
            if (name.starts_with("krb5cc") || name.starts_with("tkt")) {
                names.insert(name);
            }
        }
        return names;
    }

    [[nodiscard]] HostPath file(const std::string& text, mode_t mode = 0600) {
        const std::filesystem::path path = _directory / ("file" + std::to_string(++_files));
        support::writeFile(path, text);
        ::chmod(path.c_str(), mode);
        return HostPath(path.string());
    }

    struct Directory {
        std::filesystem::path path = support::createTemporaryDirectory("ldap");
        Directory() = default;
        Directory(const Directory&) = delete;
        Directory& operator=(const Directory&) = delete;
        ~Directory() { std::filesystem::remove_all(path); }
        operator const std::filesystem::path&() const { return path; }
        std::filesystem::path operator/(const std::string& name) const { return path / name; }
    };
    Directory _directory;
    int _files = 0;
};

// Signing in.

TEST_F(LdapConnections, PasswordOfAFileIsReadAtEachConnectWithoutItsLineEnd) {
    support::Slapd::Options options;
    options.global = "disallow bind_anon\nrequire authc\n";
    support::Slapd server(options);
    server.add(people());
    LdapNodeSettings settings = settingsFor(server);
    settings.uris = {server.uri()};
    settings.bindDn = "uid=writer,ou=people,dc=nimbo,dc=test";
    settings.bindPasswordFile = file("wrong");
    const DirectoryNodeSource source = ldapNode(settings);
    const Error error = errorOf(ask(source, anna()));
    EXPECT_EQ(error.code, 49);
    EXPECT_THAT(error.description.value_or(""), HasSubstr("bind as uid=writer,ou=people,dc=nimbo,dc=test"));
    EXPECT_THAT(error.description.value_or(""), Not(HasSubstr("wrong")));
    support::writeFile(settings.bindPasswordFile->text(), "writerpw\n");
    EXPECT_THAT(namesOf(ask(source, anna())), ElementsAre("anna"));
}

TEST_F(LdapConnections, PasswordOfACredentialOfTheServiceManagerIsUsed) {
    support::Slapd server;
    server.add(people());
    LdapNodeSettings settings = settingsFor(server);
    settings.bindDn = "uid=writer,ou=people,dc=nimbo,dc=test";
    settings.bindPasswordCredential = "ldap";
    EXPECT_THAT(errorOf(ask(ldapNode(settings), anna())).description.value_or(""), HasSubstr("LoadCredential="));
    support::writeFile(_directory / "ldap", "writerpw");
    ::chmod((_directory / "ldap").c_str(), 0440);
    settings.credentialsDirectory = DiskPath(_directory.path.string());
    EXPECT_THAT(found(settings), ElementsAre("anna"));
}

TEST_F(LdapConnections, PasswordFileThatOthersMayReadIsRefusedBeforeTheServerIsAsked) {
    support::Slapd server;
    server.add(people());
    LdapNodeSettings settings = settingsFor(server);
    settings.bindDn = "uid=writer,ou=people,dc=nimbo,dc=test";
    for (const mode_t mode : {0640U, 0604U, 0660U}) {
        settings.bindPasswordFile = file("writerpw", mode);
        const Error error = errorOf(ask(ldapNode(settings), anna()));
        EXPECT_EQ(error.code, -2);
        EXPECT_THAT(error.description.value_or(""), HasSubstr("0600"));
        EXPECT_THAT(error.description.value_or(""), Not(HasSubstr("writerpw")));
    }
    settings.bindPasswordFile = HostPath((_directory / "missing").string());
    EXPECT_THAT(errorOf(ask(ldapNode(settings), anna())).description.value_or(""), HasSubstr("No such file"));
    settings.bindPasswordFile = file("\n");
    EXPECT_THAT(errorOf(ask(ldapNode(settings), anna())).description.value_or(""), HasSubstr("empty"));
}

TEST_F(LdapConnections, ExternalBindOverTheLocalSocketIsTheProcessesOwnAccount) {
    support::Slapd::Options options;
    options.global = "require authc\n";
    support::Slapd server(options);
    server.add(people());
    LdapNodeSettings settings = settingsFor(server);
    EXPECT_EQ(errorOf(ask(ldapNode(settings), anna())).code, 53) << "the server wants to know who asks";
    settings.sasl = LdapNodeSettings::Sasl::external;
    EXPECT_THAT(found(settings), ElementsAre("anna"));
}

TEST_F(LdapConnections, KerberosBindUsesTheKeytabAndLeavesNoTraceInTheEnvironmentOrInFiles) {
    const support::Kdc kdc;
    kdc.admin("addprinc -randkey ldap/localhost\naddprinc -randkey anna\naddprinc -pw other writer\nktadd -k " +
              (kdc.directory() / "krb5.keytab").string() + " ldap/localhost\nktadd -k " +
              (kdc.directory() / "node.keytab").string() + " anna\n");
    const support::ScopedEnvironment environment(kdc.environment());
    support::Slapd::Options options;
    options.global = "require authc\n";
    support::Slapd server(options);
    server.add(people());
    LdapNodeSettings settings = settingsFor(server);
    settings.uris = {server.namedUri()};
    settings.sasl = LdapNodeSettings::Sasl::gssapi;
    settings.keytab = HostPath((kdc.directory() / "node.keytab").string());
    const auto cacheName = kdc.environment().at("KRB5CCNAME").value();
    const auto cachesBefore = cacheFiles();
    const DirectoryNodeSource source = ldapNode(settings);
    EXPECT_THAT(namesOf(ask(source, anna())), ElementsAre("anna"));
    settings.principal = "anna@NIMBO.TEST";
    EXPECT_THAT(found(settings), ElementsAre("anna"));
    EXPECT_EQ(std::getenv("KRB5CCNAME"), cacheName);
    EXPECT_FALSE(std::filesystem::exists(kdc.directory() / "cc")) << "the default cache is not written";
    EXPECT_EQ(cacheFiles(), cachesBefore) << "the ticket is in memory only";
    settings.principal = "writer@NIMBO.TEST";
    const Error error = errorOf(ask(ldapNode(settings), anna()));
    EXPECT_EQ(error.code, -2);
    EXPECT_THAT(error.description.value_or(""), HasSubstr("Kerberos"));
}

TEST_F(LdapConnections, KerberosBindWithoutAKeytabOrAKdcIsAnErrorInWords) {
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    support::Slapd server;
    settings.uris = {server.uri()};
    settings.sasl = LdapNodeSettings::Sasl::gssapi;
    settings.keytab = HostPath((_directory / "missing.keytab").string());
    const Error error = errorOf(ask(ldapNode(settings), anna()));
    EXPECT_EQ(error.domain, directory::ldapErrorDomain);
    EXPECT_EQ(error.code, -2);
    EXPECT_THAT(error.description.value_or(""), HasSubstr("missing.keytab"));
}

// TLS.

TEST_F(LdapConnections, StartTlsAndLdapsAreUsedWithTheConfiguredAuthority) {
    const TestAuthority authority;
    support::Slapd::Options options;
    options.certificates = authority.issue("IP:127.0.0.1", std::chrono::hours(24));
    options.global = "security ssf=64\n";  // the local socket counts as 128
    support::Slapd server(options);
    server.add(people());
    LdapNodeSettings settings = settingsFor(server);
    settings.caFile = HostPath(authority.file().string());
    settings.uris = {server.uri()};
    EXPECT_EQ(errorOf(ask(ldapNode(settings), anna())).code, 13) << "the server insists on TLS";
    settings.startTls = true;
    EXPECT_THAT(found(settings), ElementsAre("anna"));
    settings.startTls = false;
    settings.uris = {server.secureUri()};
    EXPECT_THAT(found(settings), ElementsAre("anna"));
}

TEST_F(LdapConnections, CertificateThatIsNotTrustedExpiredOrForAnotherNameIsRefusedUnlessNoneIsChecked) {
    const TestAuthority authority;
    const TestAuthority otherAuthority;
    struct Case {
        const char* subject;
        std::chrono::hours valid;
        const TestAuthority& trusted;
        std::string words;
    };
    for (const Case& wrong :
         {Case{"IP:127.0.0.1", std::chrono::hours(24), otherAuthority,
               "is not trusted by " + otherAuthority.file().string()},
          Case{"IP:127.0.0.1", std::chrono::hours(-24), authority, "the server's certificate expired on "},
          Case{"DNS:elsewhere.test", std::chrono::hours(24), authority,
               "is not for 127.0.0.1, but for DNS:elsewhere.test"}}) {
        support::Slapd::Options options;
        options.certificates = authority.issue(wrong.subject, wrong.valid);
        support::Slapd server(options);
        server.add(people());
        for (const bool startTls : {true, false}) {
            LdapNodeSettings settings = settingsFor(server);
            settings.uris = {startTls ? server.uri() : server.secureUri()};
            settings.startTls = startTls;
            settings.caFile = HostPath(wrong.trusted.file().string());
            const Error error = errorOf(ask(ldapNode(settings), anna()));
            EXPECT_TRUE(error.code == -1 || error.code == -11) << error.code;
            EXPECT_THAT(error.description.value_or(""), StartsWith(settings.uris[0] + ": "));
            EXPECT_THAT(error.description.value_or(""), HasSubstr(wrong.words));
            settings.verify = LdapNodeSettings::Verify::never;
            EXPECT_THAT(found(settings), ElementsAre("anna"));
        }
    }
}

TEST_F(LdapConnections, AuthorityOfTheTestIsNotTrustedWithoutBeingConfigured) {
    const TestAuthority authority;
    support::Slapd::Options options;
    options.certificates = authority.issue("IP:127.0.0.1", std::chrono::hours(24));
    support::Slapd server(options);
    LdapNodeSettings settings = settingsFor(server);
    settings.uris = {server.secureUri()};
    EXPECT_LT(errorOf(ask(ldapNode(settings), anna())).code, 0);
}

// Files and variables of the library.

/// Asks at an address with a certificate that must not be trusted.
void expectTheLibrarysDefaults(const char* address) {
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    settings.uris = {address};
    EXPECT_LT(errorOf(ask(ldapNode(settings), queryFor(directory::recordName, {"anna"}))).code, 0)
        << "the certificate must have been checked";
    int verify = -1;
    ASSERT_EQ(::ldap_get_option(nullptr, LDAP_OPT_X_TLS_REQUIRE_CERT, &verify), LDAP_OPT_SUCCESS);
    EXPECT_NE(verify, LDAP_OPT_X_TLS_NEVER);
    int sizeLimit = -1;
    ASSERT_EQ(::ldap_get_option(nullptr, LDAP_OPT_SIZELIMIT, &sizeLimit), LDAP_OPT_SUCCESS);
    EXPECT_EQ(sizeLimit, 0);
    int dereference = -1;
    ASSERT_EQ(::ldap_get_option(nullptr, LDAP_OPT_DEREF, &dereference), LDAP_OPT_SUCCESS);
    EXPECT_EQ(dereference, LDAP_DEREF_NEVER);
    EXPECT_EQ(std::getenv("LDAPNOINIT"), nullptr) << "tools must not inherit it";
}

TEST_F(LdapConnections, LibrarysOwnFilesAndVariablesAreNotUsed) {
    // The library reads its environment once, so the test runs itself in a new process with this variable.
    if (const char* address = std::getenv("LDAP_TEST_ADDRESS")) {
        expectTheLibrarysDefaults(address);
        return;
    }
    const TestAuthority authority;
    support::Slapd::Options options;
    options.certificates = authority.issue("IP:127.0.0.1", std::chrono::hours(24));
    support::Slapd server(options);
    std::ofstream(_directory / "ldaprc") << "SIZELIMIT 7\n";
    std::ofstream(_directory / "ldap.conf") << "TLS_CACERT " << authority.file().string() << "\n";
    const support::ScopedEnvironment environment({{"LDAPCONF", (_directory / "ldap.conf").string()},
                                                  {"LDAPRC", (_directory / "ldaprc").string()},
                                                  {"LDAPTLS_REQCERT", "never"},
                                                  {"LDAPDEREF", "always"},
                                                  {"LDAP_TEST_ADDRESS", server.secureUri()}});
    const auto run =
        test::runProgram({"/proc/self/exe", "--gtest_filter=LdapConnections.LibrarysOwnFilesAndVariablesAreNotUsed"},
                         test::Errors::merge);
    EXPECT_EQ(run.status, 0) << run.output;
    EXPECT_THAT(run.output, HasSubstr("[  PASSED  ] 1 test"));
}

// Servers that do not respond.

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

TEST_F(LdapConnections, ServerThatRefusesToBindIsTheLastOneTried) {
    support::Slapd first;
    first.add(people());
    support::Slapd second;
    second.add(people());
    LdapNodeSettings settings = settingsFor(first);
    settings.uris = {first.uri(), second.uri()};
    settings.bindDn = "uid=writer,ou=people,dc=nimbo,dc=test";
    settings.bindPasswordFile = file("wrong");
    EXPECT_THAT(errorOf(ask(ldapNode(settings), anna())).description.value_or(""), StartsWith(first.uri()));
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
