#include "adminhostd/Options.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <sstream>
#include <stdexcept>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost {
namespace {

using testing::ElementsAre;
using testing::Pair;
using testing::StartsWith;

class DirectoryConfiguration : public testing::Test {
  protected:
    DirectoryConfiguration() {
        std::string directory = (std::filesystem::temp_directory_path() / "configuration.XXXXXX").string();
        _file = std::string(::mkdtemp(directory.data())) + "/adminhostd.toml";
    }
    ~DirectoryConfiguration() override { std::filesystem::remove_all(std::filesystem::path(_file).parent_path()); }
    DirectoryConfiguration(const DirectoryConfiguration&) = delete;
    DirectoryConfiguration& operator=(const DirectoryConfiguration&) = delete;

    [[nodiscard]] DirectoryOptions read(const std::string& text) const {
        std::ofstream(_file) << text;
        Options options;
        readConfiguration(_file, options);
        return options.directory;
    }
    /// The message of the mistake in the text, without the name of the file; empty if there is none.
    [[nodiscard]] std::string mistakeIn(const std::string& text) const {
        try {
            static_cast<void>(read(text));
        } catch (const std::runtime_error& error) {
            const std::string message = error.what();
            EXPECT_THAT(message, StartsWith(_file + ", "));
            return message.substr(std::min(message.size(), _file.size() + 2));
        }
        return {};
    }

    std::string _file;
};

std::string contentOf(const std::string& file) {
    std::ifstream stream(std::string(SOURCE_DIR) + '/' + file);
    return {std::istreambuf_iterator<char>(stream), {}};
}

const char* const node = "[[directory.node]]\nname = \"/LDAP\"\nuri = [\"ldap://a\"]\nbase = \"dc=a\"\n";

TEST_F(DirectoryConfiguration, WithoutNodesThereAreNone) {
    EXPECT_TRUE(read("queue_limit = 3\n").nodes.empty());
    EXPECT_EQ(read("").budget, std::chrono::seconds(10));
    EXPECT_EQ(read("[directory]\nbudget_seconds = 2.5\n").budget, std::chrono::milliseconds(2500));
}

TEST_F(DirectoryConfiguration, NodeHasTheStatedDefaults) {
    const DirectoryOptions options = read(node);
    ASSERT_EQ(options.nodes.size(), 1U);
    EXPECT_FALSE(options.nodes[0].local);
    LdapNodeSettings expected;
    expected.name = "/LDAP";
    expected.uris = {"ldap://a"};
    expected.base = "dc=a";
    EXPECT_EQ(options.nodes[0].settings, expected);
}

TEST_F(DirectoryConfiguration, EveryKeyReachesItsSetting) {
    const DirectoryOptions options = read(R"toml(
[directory]
budget_seconds = 20

[[directory.node]]
name = "/First"
kind = "ldap"
uri = ["ldap://a", "ldap://b:3389"]
base = "dc=a"
user_base = "ou=u,dc=a"
group_base = "ou=g,dc=a"
user_filter = "uid=*"
group_filter = "(&(cn=*)(!(cn=x)))"
bind_dn = "cn=reader"
bind_password_file = "/etc/password"
cert_file = "/etc/cert"
key_file = "/etc/key"
starttls = true
ca_file = "/etc/ca"
verify = "never"
schema = "rfc2307bis"
uuid_form = "guid"
kerberos_realm = "A.TEST"
timeout_seconds = 2.5
create_base = "ou=new,dc=a"
object_classes = ["account", "x"]
[directory.node.map.users]
RecordName = "cn"
KerberosPrincipal = "mail"
[directory.node.map.groups]
GeneratedUID = "nsUniqueId"
[directory.node.create_attributes]
gecos = "Account %u"
host = ["a", "b"]

[[directory.node]]
name = "/Second"
uri = ["ldapi://%2Frun%2Fldapi"]
user_base = "ou=u"
group_base = "ou=g"
sasl = "gssapi"
keytab = "/etc/keytab"
principal = "host/a@A.TEST"

[[directory.node]]
name = "/Third"
uri = ["ldaps://c"]
base = "dc=c"
bind_dn = "cn=reader"
bind_password_credential = "ldap-password"
schema = "ad"

[[directory.node]]
name = "/Files"
kind = "local"
kerberos_realm = "B.TEST"
)toml");
    EXPECT_EQ(options.budget, std::chrono::seconds(20));
    ASSERT_EQ(options.nodes.size(), 4U);
    LdapNodeSettings first;
    first.name = "/First";
    first.uris = {"ldap://a", "ldap://b:3389"};
    first.base = "dc=a";
    first.userBase = "ou=u,dc=a";
    first.groupBase = "ou=g,dc=a";
    first.userFilter = "uid=*";
    first.groupFilter = "(&(cn=*)(!(cn=x)))";
    first.bindDn = "cn=reader";
    first.bindPasswordFile = HostPath("/etc/password");
    first.certFile = HostPath("/etc/cert");
    first.keyFile = HostPath("/etc/key");
    first.startTls = true;
    first.caFile = HostPath("/etc/ca");
    first.verify = LdapNodeSettings::Verify::never;
    first.schema = LdapNodeSettings::Schema::rfc2307bis;
    first.uuidForm = LdapNodeSettings::UuidForm::guid;
    first.kerberosRealm = "A.TEST";
    first.timeout = std::chrono::seconds(3);
    first.createBase = "ou=new,dc=a";
    first.objectClasses = {"account", "x"};
    first.userMap = {{"RecordName", "cn"}, {"KerberosPrincipal", "mail"}};
    first.groupMap = {{"GeneratedUID", "nsUniqueId"}};
    first.createAttributes = {{"gecos", {"Account %u"}}, {"host", {"a", "b"}}};
    EXPECT_EQ(options.nodes[0].settings, first);
    LdapNodeSettings second;
    second.name = "/Second";
    second.uris = {"ldapi://%2Frun%2Fldapi"};
    second.userBase = "ou=u";
    second.groupBase = "ou=g";
    second.sasl = LdapNodeSettings::Sasl::gssapi;
    second.keytab = HostPath("/etc/keytab");
    second.principal = "host/a@A.TEST";
    EXPECT_EQ(options.nodes[1].settings, second);
    LdapNodeSettings third;
    third.name = "/Third";
    third.uris = {"ldaps://c"};
    third.base = "dc=c";
    third.bindDn = "cn=reader";
    third.bindPasswordCredential = "ldap-password";
    third.schema = LdapNodeSettings::Schema::ad;
    EXPECT_EQ(options.nodes[2].settings, third);
    EXPECT_TRUE(options.nodes[3].local);
    EXPECT_EQ(options.nodes[3].settings.name, "/Files");
    EXPECT_EQ(options.nodes[3].settings.kerberosRealm, "B.TEST");
}

/// For each key of a node, a value that it cannot have.
const std::multimap<std::string, std::string> wrongValues = {
    {"name", "1"},
    {"name", "\"\""},
    {"kind", "\"nis\""},
    {"kind", "1"},
    {"uri", "\"ldap://a\""},
    {"uri", "[]"},
    {"uri", "[\"http://a\"]"},
    {"uri", "[1]"},
    {"base", "[]"},
    {"user_base", "1"},
    {"group_base", "true"},
    {"user_filter", "\"uid\""},
    {"user_filter", "1"},
    {"group_filter", "\"(cn=*\""},
    {"bind_dn", "1"},
    {"bind_password_file", "1"},
    {"bind_password_file", "\"relative\""},
    {"bind_password_credential", "\"../a\""},
    {"bind_password_credential", "\"\""},
    {"sasl", "\"plain\""},
    {"cert_file", "\"\""},
    {"key_file", "[]"},
    {"keytab", "1"},
    {"principal", "1"},
    {"starttls", "\"yes\""},
    {"ca_file", "false"},
    {"verify", "\"allow\""},
    {"verify", "true"},
    {"schema", "\"RFC2307\""},
    {"uuid_form", "\"base64\""},
    {"kerberos_realm", "1"},
    {"map", "\"users\""},
    {"timeout_seconds", "0"},
    {"timeout_seconds", "\"5\""},
    {"create_base", "1"},
    {"object_classes", "\"account\""},
    {"object_classes", "[]"},
    {"object_classes", "[\"a b\"]"},
    {"create_attributes", "[]"},
};

TEST_F(DirectoryConfiguration, WrongValueOfEveryKeyIsAnErrorAtItsPlace) {
    for (const auto& [key, value] : wrongValues) {
        std::string text = "queue_limit = 1\n[[directory.node]]\n";
        int line = 3;
        for (const auto& [other, fitting] : std::map<std::string, std::string>{
                 {"name", "\"/LDAP\""}, {"uri", "[\"ldap://a\"]"}, {"base", "\"dc=a\""}}) {
            if (other != key) {
                text += other + " = " + fitting + "\n";
                ++line;
            }
        }
        text += "  " + key + " = " + value + "\n";
        EXPECT_THAT(mistakeIn(text), StartsWith("line " + std::to_string(line) + ", column " +
                                                std::to_string(key.size() + 6) + ": \"directory.node." + key + "\" "))
            << value;
    }
}

TEST_F(DirectoryConfiguration, EveryKnownKeyIsDocumentedAndHasAWrongValueInThisTest) {
    const std::string message = mistakeIn(std::string(node) + "usr_base = \"ou=u\"\n");
    EXPECT_THAT(message, StartsWith("line 5, column 1: unknown key \"directory.node.usr_base\"; known keys: "));
    const std::string reference = contentOf("docs/directory.md");
    std::string known = message.substr(message.rfind(": ") + 2) + ", ";
    std::size_t count = 0;
    for (std::size_t end = 0; (end = known.find(", ")) != std::string::npos; known.erase(0, end + 2)) {
        const std::string key = known.substr(0, end);
        EXPECT_TRUE(wrongValues.contains(key)) << key;
        EXPECT_TRUE(reference.find('`' + key + '`') != std::string::npos ||
                    reference.find("[directory.node." + key) != std::string::npos)
            << key;
        ++count;
    }
    EXPECT_GT(count, 20U);
}

TEST_F(DirectoryConfiguration, ExamplesOfTheDocumentationAreAccepted) {
    std::istringstream lines(contentOf("docs/directory.md"));
    std::string example;
    std::size_t nodes = 0;
    for (std::string line; std::getline(lines, line);) {
        if (line.empty() || line.starts_with("    ")) {
            example += line.empty() ? "\n" : line.substr(4) + '\n';
            continue;
        }
        if (example.find("[[directory.node]]") != std::string::npos) {
            EXPECT_NO_THROW(nodes += read(example).nodes.size()) << example;
        }
        example.clear();
    }
    EXPECT_GE(nodes, 5U);
}

TEST_F(DirectoryConfiguration, MistakesInTablesAndBetweenKeysAreNamedWithTheirPlaces) {
    const std::string twice = std::string(node) + "[[directory.node]]\nname = \"/LDAP\"\n";
    const std::string local = "[[directory.node]]\nname = \"/A\"\nkind = \"local\"\n";
    struct {
        std::string text;
        const char* expected;
    } const cases[] = {
        {"directory = 1\n", "line 1, column 13: \"directory\" must be a table"},
        {"[directory]\nbudget = 1\n", "line 2, column 1: unknown key \"directory.budget\"; known keys: node, "},
        {"[directory]\nbudget_seconds = -1\n", "line 2, column 18: \"directory.budget_seconds\" must be a number"},
        {"[directory]\nnode = 1\n", "line 2, column 8: \"directory.node\" must be a list of tables"},
        {"[directory]\nnode = [1]\n", "line 2, column 9: \"directory.node\" must be a list of tables"},
        {"[directory.node]\nname = \"/A\"\n", "line 1, column 1: \"directory.node\" must be a list of tables"},
        {"[[directory.node]]\nuri = [\"ldap://a\"]\nbase = \"b\"\n",
         "line 1, column 1: \"directory.node.name\" is missing"},
        {"[[directory.node]]\nname = \"/A\"\nbase = \"b\"\n", "line 1, column 1: \"directory.node.uri\" is missing"},
        {"[[directory.node]]\nname = \"/A\"\nuri = [\"ldap://a\"]\nuser_base = \"b\"\n",
         "line 1, column 1: \"directory.node.base\" is missing"},
        {"[[directory.node]]\nname = \"/Search\"\nkind = \"local\"\n",
         "line 2, column 8: \"directory.node.name\" must not be \"/Search\""},
        {twice + "uri = [\"ldap://b\"]\nbase = \"b\"\n",
         "line 6, column 8: \"directory.node.name\" must be another: \"/LDAP\" is the name of the node at "},
        {local + "[[directory.node]]\nname = \"/B\"\nkind = \"local\"\n",
         "line 6, column 8: \"directory.node.kind\" must not be \"local\" twice"},
        {local + "base = \"b\"\n", "line 4, column 8: \"directory.node.base\" is not for a node of the kind \"local\""},
        {std::string(node) + "user_filter = \"(uid=a\\\\2)\"\n",
         "line 5, column 15: \"directory.node.user_filter\" is not a filter: at its byte 7 there must be two "
         "hexadecimal "
         "digits after the backslash"},
        {std::string(node) + "bind_dn = \"cn=a\"\n", "line 5, column 11: \"directory.node.bind_dn\" needs "},
        {std::string(node) + "bind_password_file = \"/a\"\n",
         "line 5, column 22: \"directory.node.bind_password_file\" needs \"bind_dn\""},
        {std::string(node) + "bind_dn = \"a\"\nbind_password_file = \"/a\"\nbind_password_credential = \"a\"\n",
         "line 6, column 22: \"directory.node.bind_password_file\" excludes \"bind_password_credential\""},
        {std::string(node) + "bind_dn = \"a\"\nbind_password_file = \"/a\"\nsasl = \"external\"\n",
         "line 5, column 11: \"directory.node.bind_dn\" excludes \"sasl\""},
        {std::string(node) + "keytab = \"/a\"\n", "line 5, column 10: \"directory.node.keytab\" needs sasl"},
        {std::string(node) + "sasl = \"gssapi\"\n", "line 5, column 8: \"directory.node.sasl\" needs \"keytab\""},
        {std::string(node) + "cert_file = \"/a\"\n",
         "line 5, column 13: \"directory.node.cert_file\" needs \"key_file\""},
        {std::string(node) + "key_file = \"/a\"\n",
         "line 5, column 12: \"directory.node.key_file\" needs \"cert_file\""},
        {"[[directory.node]]\nname = \"/A\"\nuri = [\"ldap://a\", \"ldaps://a\"]\nbase = \"b\"\nstarttls = true\n",
         "line 5, column 12: \"directory.node.starttls\" is only for URIs"},
        {std::string(node) + "[directory.node.map.people]\nRecordName = \"cn\"\n",
         "line 5, column 21: unknown key \"directory.node.map.people\"; known keys: users, groups"},
        {std::string(node) + "[directory.node.map.users]\nrecordName = \"cn\"\n",
         "line 6, column 1: unknown key \"directory.node.map.users.recordName\"; known keys: RecordName, "},
        {std::string(node) + "[directory.node.map.groups]\nRecordName = \"c n\"\n",
         "line 6, column 14: \"directory.node.map.groups.RecordName\" must be the name of an LDAP attribute"},
        {std::string(node) + "[directory.node.create_attributes]\ngecos = 1\n",
         "line 6, column 9: \"directory.node.create_attributes.gecos\" must be a text"},
        {std::string(node) + "name = \"/B\"\n", "line 5, column "},
    };
    for (const auto& entry : cases) {
        EXPECT_THAT(mistakeIn(entry.text), StartsWith(entry.expected)) << entry.text;
    }
}

TEST_F(DirectoryConfiguration, PlacesOfTheKeysAreKept) {
    EXPECT_THAT(read(node).nodes[0].places,
                ElementsAre(Pair("", _file + ", line 1, column 1"), Pair("base", _file + ", line 4, column 8"),
                            Pair("name", _file + ", line 2, column 8"), Pair("uri", _file + ", line 3, column 7")));
}

}  // namespace
}  // namespace adminhost
