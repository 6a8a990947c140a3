// How a node connects: TLS, and ways of signing in.

#include "tests/integration/ldap/ConnectionsFixture.h"
#include "tests/integration/ldap/TestAuthority.h"
#include "tests/support/Environment.h"
#include "tests/support/Kdc.h"
#include "tests/support/Program.h"

#include <chrono>
#include <cstdlib>
#include <fstream>

#include <ldap.h>
#include <sys/stat.h>

namespace adminhost {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

// Signing in.

TEST_F(LdapConnections, PasswordOfAFileIsReadAtEachConnectWithoutItsLineEnd) {
    const ServerWithPeople server("disallow bind_anon\nrequire authc\n");
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
    ServerWithPeople server;
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
    ServerWithPeople server;
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
    const ServerWithPeople server("require authc\n");
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
    const ServerWithPeople server("require authc\n");
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

}  // namespace
}  // namespace adminhost
