// Workflows and cameras of a site whose people are in an LDAP server, through the command line.

#include "tests/support/Slapd.h"
#include "tests/system/apply/ControlledService.h"

#include <algorithm>
#include <cctype>
#include <chrono>
#include <future>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::Not;
using Clock = std::chrono::steady_clock;

std::string lower(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(), [](unsigned char c) { return std::tolower(c); });
    return text;
}

/// A person with the user id of a local one, and a group, with the UUIDs that the sample's configuration tool writes.
struct LdapPeople {
    LdapPeople() {
        slapd.add(
            "dn: dc=nimbo,dc=test\nobjectClass: domain\ndc: nimbo\n\n"
            "dn: uid=greta,dc=nimbo,dc=test\nobjectClass: inetOrgPerson\nobjectClass: posixAccount\nuid: greta\n"
            "cn: Greta Lang\nsn: Lang\nuidNumber: 1001\ngidNumber: 9001\nhomeDirectory: /home/greta\nentryUUID: " +
            lower(SampleRoot::uuidOf("user", "greta")) +
            "\n\ndn: cn=filmers,dc=nimbo,dc=test\nobjectClass: posixGroup\ncn: filmers\ngidNumber: 9002\n"
            "memberUid: greta\nentryUUID: " +
            lower(SampleRoot::uuidOf("group", "filmers")) + "\n");
    }

    support::Slapd slapd;
};

class LdapSite : protected LdapPeople, public ControlledService {
  protected:
    LdapSite()
        : ControlledService("[[directory.node]]\nname = \"/LDAP\"\nuri = [\"" + slapd.uri() +
                            "\"]\nbase = \"dc=nimbo,dc=test\"\n"
                            "[[directory.node]]\nname = \"/Local\"\nkind = \"local\"\n") {
        root.write("/etc/demo/directory", "user:greta\ngroup:filmers\n");
    }
    [[nodiscard]] std::string listOf(const std::string& type, const std::string& uuid) const {
        return root.sql("select record_uuid from access_control_entries where resource_type = '" + type +
                        "' and resource_id = (select id from " + lower(type) + "s where uuid = '" + uuid +
                        "') order by id");
    }

    const std::string greta = SampleRoot::uuidOf("user", "greta");
    const std::string anna = SampleRoot::uuidOf("user", "anna");
    const std::string filmers = SampleRoot::uuidOf("group", "filmers");
};

TEST_F(LdapSite, WorkflowIsListedInFrenchAndItsAccessChangedForPeopleOfTheServer) {
    const std::string uuid = SampleRoot::uuidOf("workflow", "TwoCameras.workflow");
    EXPECT_THAT(ctl({"--languages", "fr", "workflow", "list", "--names"}).output,
                AllOf(HasSubstr("Publier au catalogue\n"), HasSubstr("Picture in Picture\n")));
    EXPECT_EQ(ctl({"--languages", "de", "workflow", "allow", "Bild im Bild", "greta"}).output,
              "workflows.\"Bild im Bild\".users.greta: (not allowed) -> (allowed): applied\n");
    EXPECT_EQ(ctl({"workflow", "allow", uuid, "filmers", "--group"}).status, 0);
    const std::string juergen = SampleRoot::uuidOf("user", "juergen");
    EXPECT_EQ(listOf("Workflow", uuid), juergen + "\n" + greta + "\n" + filmers + "\n");
    EXPECT_THAT(ctl({"workflow", "show", uuid}).output,
                AllOf(HasSubstr("Greta Lang (user)"), HasSubstr("filmers (group)"), HasSubstr("Jürgen Weiß (user)")));
    EXPECT_THAT(ctl({"--languages", "de", "access", "greta"}).output,
                ContainsRegex("workflows +Bild im Bild +in its list, through the group filmers\n"));
    EXPECT_EQ(ctl({"workflow", "deny", uuid, "greta"}).status, 0);
    EXPECT_EQ(listOf("Workflow", uuid), juergen + "\n" + filmers + "\n");
    EXPECT_EQ(ctl({"workflow", "access", uuid, "off"}).status, 0);
    EXPECT_EQ(root.sql("select access_control_enabled from workflows where uuid = '" + uuid + "'"), "f\n");
}

TEST_F(LdapSite, CamerasAccessIsChangedForPeopleOfTheServerAndTheLocalOneWithTheSameIdKeepsHers) {
    const std::string uuid = SampleRoot::uuidOf("camera", "Main hall");
    const std::string before = listOf("Camera", uuid);
    EXPECT_THAT(before, HasSubstr(anna));
    EXPECT_EQ(ctl({"camera", "allow", "Main hall", "greta"}).status, 0);
    EXPECT_EQ(ctl({"camera", "allow", "Main hall", "filmers", "--group"}).status, 0);
    EXPECT_EQ(listOf("Camera", uuid), before + greta + "\n" + filmers + "\n");
    EXPECT_EQ(ctl({"camera", "deny", "Main hall", "greta"}).status, 0);
    EXPECT_EQ(listOf("Camera", uuid), before + filmers + "\n");
    EXPECT_EQ(ctl({"camera", "deny", "Main hall", "filmers", "--group"}).status, 0);
    EXPECT_EQ(ctl({"camera", "deny", "Main hall", "anna"}).status, 0);
    EXPECT_THAT(listOf("Camera", uuid), AllOf(Not(HasSubstr(filmers)), Not(HasSubstr(anna))));
    EXPECT_EQ(ctl({"camera", "access", "Main hall", "off"}).status, 0);
    EXPECT_EQ(root.sql("select access_control_enabled from cameras where uuid = '" + uuid + "'"), "f\n");
}

TEST_F(LdapSite, DesiredStateIsExportedAndSettlesAtOnce) {
    const std::string uuid = SampleRoot::uuidOf("workflow", "Archive.workflow");
    const std::string desired =
        file("desired.toml", "[workflows." + uuid + "]\nusers = [\"anna\", \"greta\"]\ngroups = [\"filmers\"]\n");
    EXPECT_EQ(ctl({"apply", desired}).status, 0);
    EXPECT_EQ(ctl({"apply", desired}).output, "no change\n");
    EXPECT_THAT(ctl({"export"}).output, HasSubstr("users = [\"anna\", \"greta\"]\ngroups = [\"filmers\"]\n"));
}

TEST_F(LdapSite, PeopleAreNotShownAsRemovedWhenTheServerFailsWithinTheWrite) {
    const std::string uuid = SampleRoot::uuidOf("workflow", "Archive.workflow");
    ASSERT_EQ(ctl({"workflow", "allow", uuid, "greta"}).status, 0);
    const std::string before = listOf("Workflow", uuid);
    ASSERT_THAT(before, HasSubstr(greta));
    const std::string desired =
        file("desired.toml", "[settings]\nserver_port = 8180\n[remove_unlisted]\naccess = true\n[workflows." + uuid +
                                 "]\nusers = []\n");
    holdWrite();
    std::future<ProgramResult> apply = std::async(std::launch::async, [&] { return ctl({"apply", desired}); });
    waitForWrite();
    slapd.stop();
    releaseWrite();
    const ProgramResult result = apply.get();
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, ContainsRegex("workflows[^\n]*users.greta: [^\n]*FAILED: [^\n]*not removed"));
    EXPECT_THAT(listOf("Workflow", uuid), HasSubstr(greta));
}

TEST_F(LdapSite, RequestWhileTheServerIsDownIsReportedAndTheNextOneIsWhole) {
    ASSERT_EQ(ctl({"workflow", "allow", "Workflows/Archive.workflow", "greta"}).status, 0);
    UnixHttp client(daemon.socket(), std::chrono::seconds(30));
    slapd.stop();
    const auto start = Clock::now();
    const HttpReply down = client.post("/v1/lumio/getWorkflows", "{}");
    EXPECT_LT(Clock::now() - start, std::chrono::seconds(15)) << "the budget is ten seconds";
    EXPECT_EQ(down.status, 200);
    EXPECT_TRUE(down.headers.contains("adminhost-not-done"));
    EXPECT_THAT(down.body, AllOf(Not(HasSubstr("\"shortName\"")), HasSubstr("\"allowedUsersAndGroups\":[]")));
    for (const std::vector<std::string>& words : {std::vector<std::string>{"export"},
                                                  {"access", "anna"},
                                                  {"workflow", "list"},
                                                  {"workflow", "deny", "Workflows/Archive.workflow", "greta"}}) {
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 1) << words.front();
        EXPECT_THAT(result.output,
                    testing::AnyOf(HasSubstr("\"/LDAP\" failed"), HasSubstr("Can't contact LDAP server")));
    }
    slapd.start();
    const HttpReply up = client.post("/v1/lumio/getWorkflows", "{}");
    EXPECT_FALSE(up.headers.contains("adminhost-not-done"));
    EXPECT_THAT(up.body, HasSubstr("\"shortName\":\"greta\""));
    EXPECT_EQ(ctl({"export"}).status, 0);
}

}  // namespace
}  // namespace adminhost::test
