// People and groups in a real directory server, through the daemon and the command line.

#include "tests/support/Slapd.h"
#include "tests/system/apply/ControlledService.h"

#include <filesystem>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::Not;

/// The server's people have the logins and UUIDs that the sample's configuration tool knows, and other full names.
std::string person(const std::string& login, const std::string& fullName, int number) {
    const std::string id = std::to_string(number);
    return "dn: uid=" + login +
           ",ou=people,dc=nimbo,dc=test\nobjectClass: inetOrgPerson\nobjectClass: posixAccount\nuid: " + login +
           "\ncn: " + fullName + "\nsn: " + fullName + "\nuidNumber: " + id +
           "\ngidNumber: 7001\nhomeDirectory: /home/" + login + "\nentryUUID: " + SampleRoot::uuidOf("user", login) +
           "\n\n";
}

std::string group(const std::string& name, int number, const std::string& members) {
    return "dn: cn=" + name + ",ou=groups,dc=nimbo,dc=test\nobjectClass: posixGroup\ncn: " + name +
           "\ngidNumber: " + std::to_string(number) + "\n" + members +
           "entryUUID: " + SampleRoot::uuidOf("group", name) + "\n\n";
}

class SeededServer {
  protected:
    SeededServer() {
        server.add(
            "dn: dc=nimbo,dc=test\nobjectClass: domain\ndc: nimbo\n\n"
            "dn: ou=people,dc=nimbo,dc=test\nobjectClass: organizationalUnit\nou: people\n\n"
            "dn: ou=groups,dc=nimbo,dc=test\nobjectClass: organizationalUnit\nou: groups\n\n" +
            person("anna", "Anna of the Server", 7101) + person("ben", "Ben of the Server", 7102) +
            group("lecturers", 7001, "memberUid: ben\n") + group("studio", 7002, "memberUid: anna\n"));
    }
    [[nodiscard]] std::string node(const std::string& more = "") const {
        return "[[directory.node]]\nname = \"/Example\"\nuri = [\"" + server.uri() +
               "\"]\nbase = \"dc=nimbo,dc=test\"\ntimeout_seconds = 2\n" + more;
    }

    support::Slapd server;
};

class LdapServer : protected SeededServer, public ControlledService {
  protected:
    LdapServer() : ControlledService("[directory]\nbudget_seconds = 3\n" + node()) {}
    explicit LdapServer(const std::string& more) : ControlledService(node(more)) {}

    [[nodiscard]] std::string accessRows() const {
        return root.sql(
            "select record_uuid from access_control_entries where resource_type='Camera' and "
            "resource_id=(select id from cameras where name='Main hall') order by record_uuid");
    }
};

TEST_F(LdapServer, AccessOfACameraIsShownAndChangedByTheNamesOfTheServer) {
    const std::string shown = ctl({"camera", "show", "Main hall"}).output;
    EXPECT_THAT(shown, HasSubstr("Anna of the Server"));
    EXPECT_THAT(shown, HasSubstr("lecturers"));
    EXPECT_EQ(ctl({"camera", "allow", "Main hall", "ben"}).output,
              "cameras.\"Main hall\".users.ben: (not allowed) -> (allowed): applied\n");
    EXPECT_EQ(ctl({"camera", "allow", "Main hall", "studio", "--group"}).output,
              "cameras.\"Main hall\".groups.studio: (not allowed) -> (allowed): applied\n");
    EXPECT_EQ(ctl({"camera", "deny", "Main hall", "anna"}).output,
              "cameras.\"Main hall\".users.anna: (allowed) -> (not allowed): applied\n");
    EXPECT_EQ(ctl({"camera", "access", "Main hall", "off"}).status, 0);
    EXPECT_THAT(accessRows(), HasSubstr(SampleRoot::uuidOf("user", "ben")));
    EXPECT_THAT(accessRows(), HasSubstr(SampleRoot::uuidOf("group", "studio")));
    EXPECT_THAT(accessRows(), HasSubstr(SampleRoot::uuidOf("group", "lecturers")));
    EXPECT_THAT(accessRows(), Not(HasSubstr(SampleRoot::uuidOf("user", "anna"))));
    EXPECT_EQ(root.sql("select access_control_enabled from cameras where name='Main hall'"), "f\n");
    EXPECT_THAT(ctl({"camera", "allow", "Main hall", "ben"}).output, testing::StartsWith("no change\n"));
}

TEST_F(LdapServer, WhileItIsDownListsAreReportedAsEmptyAndAfterwardsTheyAreWhole) {
    const std::string whole = ctl({"export"}).output;
    ASSERT_THAT(whole, HasSubstr("anna"));
    server.stop();
    UnixHttp client = daemon.connect();
    const HttpReply between = client.post("/v1/lumio/getCameras", "{}");
    EXPECT_EQ(between.status, 200);
    EXPECT_THAT(between.body, Not(HasSubstr("\"shortName\"")));
    ASSERT_TRUE(between.headers.contains("adminhost-not-done"));
    EXPECT_EQ(between.headers.at("adminhost-not-done"), "1");
    const std::string exported = file("state.toml", "the last good one\n");
    const ProgramResult failing = ctl({"export", exported});
    EXPECT_EQ(failing.status, 1);
    EXPECT_THAT(failing.output, HasSubstr("the directory node \"/Example\" failed"));
    EXPECT_EQ(read(exported), "the last good one\n");
    server.start();
    EXPECT_EQ(ctl({"export"}).output, whole);
    EXPECT_FALSE(client.post("/v1/lumio/getCameras", "{}").headers.contains("adminhost-not-done"));
}

TEST_F(LdapServer, WhoisShowsTheNodeAndTheGroupsOfAPerson) {
    for (const std::string& who : {std::string("anna"), SampleRoot::uuidOf("user", "anna")}) {
        const ProgramResult result = ctl({"whois", who});
        EXPECT_EQ(result.status, 0) << result.output;
        EXPECT_THAT(result.output, HasSubstr("Anna of the Server"));
        EXPECT_THAT(result.output, HasSubstr("/Example"));
        EXPECT_THAT(result.output, ContainsRegex("groups +lecturers, studio\n")) << "the first is her primary group";
    }
    EXPECT_THAT(daemon.connect().get("/v1/directory?is=ben").body,
                ContainsRegex("\"groups\":\\[\\{\"shortName\":\"lecturers\",[^]]*\"node\":\"/Example\"\\}\\]"));
    EXPECT_THAT(daemon.connect().get("/v1/directory?is=studio").body, Not(HasSubstr("\"groups\"")));
}

TEST_F(LdapServer, LocalAccountsAreUnknownWithoutANodeForThem) {
    EXPECT_EQ(ctl({"whois", "carla"}).status, 2) << "who is in the account files only";
    EXPECT_THAT(daemon.connect().get("/v1/directory").body, Not(HasSubstr("/Local")));
}

/// The server first, then the accounts of the sample root.
class ServerAndAccounts : public LdapServer {
  protected:
    ServerAndAccounts() : LdapServer("[[directory.node]]\nname = \"/Files\"\nkind = \"local\"\n") {}
};

TEST_F(ServerAndAccounts, NodesAreAskedInTheOrderOfTheConfiguration) {
    const std::string both = ctl({"whois", "anna"}).output;
    EXPECT_LT(both.find("Anna of the Server"), both.find("Anna Lindqvist"));
    EXPECT_THAT(both, HasSubstr("/Example"));
    EXPECT_THAT(both, HasSubstr("/Files"));
    const std::string carla = ctl({"whois", "carla"}).output;
    EXPECT_THAT(carla, HasSubstr("/Files"));
    EXPECT_THAT(carla, ContainsRegex("groups +[^\n]*editors[^\n]*studio"));
}

/// Signs in with a password from a file.
class ServerWithPassword : public LdapServer {
  protected:
    ServerWithPassword()
        : LdapServer("bind_dn = \"cn=admin,dc=nimbo,dc=test\"\nbind_password_file = \"/etc/ldap-password\"\n") {}
    void writePassword(const std::string& password, fs::perms mode) const {
        root.write("/etc/ldap-password", password + "\n");
        fs::permissions(root.disk("/etc/ldap-password"), mode);
    }
};

TEST_F(ServerWithPassword, PasswordFileThatOthersMayReadIsRefusedUntilItsModeIsFixed) {
    writePassword("adminpw", fs::perms(0644));
    const ProgramResult refused = ctl({"whois", "anna"});
    EXPECT_EQ(refused.status, 1);
    EXPECT_THAT(refused.output, HasSubstr("/etc/ldap-password"));
    EXPECT_THAT(refused.output, HasSubstr("0600"));
    EXPECT_EQ(ctl({"export"}).status, 1);
    writePassword("adminpw", fs::perms(0600));
    EXPECT_THAT(ctl({"whois", "anna"}).output, HasSubstr("Anna of the Server"));
    EXPECT_EQ(ctl({"export"}).status, 0);
}

TEST_F(ServerWithPassword, WrongPasswordIsAFindingThatDoesNotShowIt) {
    writePassword("planted-password", fs::perms(0600));
    const ProgramResult exported = ctl({"export"});
    EXPECT_EQ(exported.status, 1);
    EXPECT_THAT(exported.output, HasSubstr("the directory node \"/Example\" failed"));
    EXPECT_THAT(exported.output, Not(HasSubstr("planted-password")));
    EXPECT_THAT(daemon.log(), Not(HasSubstr("planted-password")));
}

/// A daemon that the service manager has given a credential.
class ServerWithCredential : private SeededServer, public testing::Test {
  protected:
    [[nodiscard]] HttpReply annaWith(const std::string& password) const {
        std::ofstream(server.directory() / "ldap-password") << password;
        DaemonProcess::Options options;
        options.configuration =
            node("bind_dn = \"cn=admin,dc=nimbo,dc=test\"\nbind_password_credential = \"ldap-password\"\n");
        options.arguments = {"--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"};
        options.environment = {"CREDENTIALS_DIRECTORY=" + server.directory().string()};
        return DaemonProcess(options).connect().get("/v1/directory?is=anna");
    }
};

TEST_F(ServerWithCredential, IsSignedInToWithTheCredentialOfTheServiceManager) {
    const HttpReply known = annaWith("adminpw");
    EXPECT_EQ(known.status, 200);
    EXPECT_THAT(known.body, HasSubstr("Anna of the Server"));
    const HttpReply refused = annaWith("planted-password");
    EXPECT_EQ(refused.status, 500);
    EXPECT_THAT(refused.body, Not(HasSubstr("planted-password")));
}

class CheckedServer : private SeededServer, public testing::Test {
  protected:
    [[nodiscard]] ProgramResult check(const std::string& more = "") const {
        const std::string configuration = (server.directory() / "adminhostd.toml").string();
        std::ofstream(configuration) << node(more);
        return runProgram(
            {std::string(BINARY_DIR) + "/bin/adminhostd", "--check", "--config", configuration, "--root", root.path(),
             "--socket", root.directory() + "/socket", "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"},
            Errors::merge);
    }
    void stop() { server.stop(); }

    const SampleRoot root;
};

TEST_F(CheckedServer, IsNotAskedByTheCheckOfTheInstallationWhichLooksAtItsSettings) {
    const ProgramResult malformed = check("bind_dn = \"no name\"\nbind_password_file = \"/etc/password\"\n");
    EXPECT_EQ(malformed.status, 1);
    EXPECT_THAT(malformed.output, ContainsRegex("adminhostd.toml, line 6, column 11: the directory node \"/Example\" "
                                                "cannot be used: bind_dn"));
    stop();
    const ProgramResult down = check();
    EXPECT_EQ(down.status, 0) << down.output;
}

}  // namespace
}  // namespace adminhost::test
