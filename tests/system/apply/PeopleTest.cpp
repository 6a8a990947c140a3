// Access of people: several elements in one write, names that are looked up first, people who leave, and accounts that
// the directory no longer knows.

#include "tests/system/apply/OvertakenService.h"

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::Contains;
using testing::HasSubstr;
using testing::Not;

class People : public OvertakenService {
  protected:
    /// Names of the cameras and bundles of the workflows whose lists have the account, from the database.
    [[nodiscard]] std::vector<std::string> listsWith(const std::string& kind, const std::string& name) const {
        const std::string uuid = "'" + SampleRoot::uuidOf(kind, name) + "'";
        const std::string text = root.sql(
            "select name from cameras join access_control_entries on resource_type = 'Camera' and resource_id = "
            "cameras.id "
            "where record_uuid = " +
            uuid +
            " union all select bundle_path from workflows join access_control_entries on "
            "resource_type = 'Workflow' and resource_id = workflows.id where record_uuid = " +
            uuid);
        std::vector<std::string> names;
        std::istringstream lines(text);
        for (std::string line; std::getline(lines, line);) {
            names.push_back(line);
        }
        return names;
    }
    [[nodiscard]] std::size_t writes() const {
        std::istringstream lines(daemon.log());
        std::size_t count = 0;
        for (std::string line; std::getline(lines, line);) {
            const bool isBeginning = line.ends_with(": begins");
            count += isBeginning && line.find("lumio/writeSettings") != std::string::npos ? 1U : 0U;
        }
        return count;
    }
};

TEST_F(People, GroupIsAddedToSeveralCamerasInOneWrite) {
    const ProgramResult result = ctl({"camera", "allow", "--group", "editors", "Roof", "Studio A", "Main hall"});
    EXPECT_EQ(result.status, 0) << result.output;
    EXPECT_THAT(listsWith("group", "editors"), AllOf(Contains("Roof"), Contains("Studio A"), Contains("Main hall")));
    EXPECT_EQ(writes(), 1U);
    const ProgramResult removed = ctl({"camera", "deny", "--group", "editors", "Roof", "Studio A"});
    EXPECT_EQ(removed.status, 0) << removed.output;
    EXPECT_THAT(listsWith("group", "editors"), AllOf(Not(Contains("Roof")), Contains("Main hall")));
    EXPECT_EQ(ctl({"camera", "allow", "--group", "Roof", "editors"}).status, 0) << "CAMERA NAME, with the option first";
    EXPECT_THAT(listsWith("group", "editors"), Contains("Roof"));
}

TEST_F(People, NamesAreLookedUpBeforeAnythingIsSent) {
    for (const auto& [words, message] : std::vector<std::pair<std::vector<std::string>, std::string>>{
             {{"camera", "allow", "Roof", "anna", "studio"}, "studio is a group: add --group"},
             {{"camera", "allow", "Roof", "anna", "--group"}, "anna is a person: leave out --group"},
             {{"camera", "allow", "Roof", "anna", "ana"}, "person not found: ana; did you mean \"anna\"?"},
             {{"camera", "allow", "Roof", "anna", std::string(4096, 'x')}, "person not found: xxx"},
             {{"camera", "allow", "Roof", "anna", "o'hara \"x\""}, "person not found: o'hara \"x\""},
             {{"camera", "allow", "--", "Roof", "anna", "-rf"}, "person not found: -rf"},
             {{"camera", "allow", "Roof", "\xD7\x93\xD7\xA0\xD7\x94\xE2\x80\xAE"},
              "person not found: \xD7\x93\xD7\xA0\xD7\x94\\u202e"},
             {{"camera", "deny", "Roof", "ana"}, "person or group not found: ana"},
             {{"workflow", "allow", "Archive", "anna", "studio"}, "studio is a group: add --group"},
             {{"camera", "allow", "--group", "studio", "Roof", "Rof"}, "camera not found: Rof; did you mean \"Roof\"?"},
             {{"camera", "allow", "Roof"}, "a name is missing"}}) {
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 2) << testing::PrintToString(words);
        EXPECT_THAT(result.output, HasSubstr(message));
    }
    EXPECT_EQ(writes(), 0U);
    EXPECT_EQ(ctl({"camera", "allow", "Roof", "anna", "anna"}).status, 0) << "a name given twice is one change";
    EXPECT_EQ(writes(), 1U);
}

TEST_F(People, NameThatTheServiceRefusesDoesNotLoseTheOthers) {
    // The directory has juergen and anna; the service's tool does not know one of them any more.
    const std::string tool = root.read("/usr/bin/lumioconfig");
    root.write("/usr/bin/lumioconfig",
               "#!/bin/sh\ncase \" $* \" in *' ben '*) echo 'no user ben' >&2; exit 2 ;; esac\n" +
                   tool.substr(tool.find('\n') + 1));
    std::filesystem::permissions(root.disk("/usr/bin/lumioconfig"), std::filesystem::perms(0755));
    const ProgramResult result = ctl({"camera", "allow", "Studio B", "anna", "ben", "carla"});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, HasSubstr("no user ben"));
    EXPECT_THAT(listsWith("user", "anna"), Contains("Studio B"));
    EXPECT_THAT(listsWith("user", "carla"), Contains("Studio B"));
    EXPECT_THAT(listsWith("user", "ben"), Not(Contains("Studio B")));
}

TEST_F(People, RevokeRemovesAllDirectEntriesAlsoOfDisabledResources) {
    root.sql("update cameras set disabled = 't' where name = 'Studio A'");
    const std::vector<std::string> before = listsWith("user", "juergen");
    EXPECT_THAT(before, AllOf(Contains("Studio A"), Contains("Workflows/TwoCameras.workflow")));
    EXPECT_THAT(ctl({"access", "juergen"}).output, testing::ContainsRegex("cameras +Studio A +in its list, through the "
                                                                          "group studio \\(disabled\\)"));
    const ProgramResult result = ctl({"access", "juergen", "--revoke", "--languages", "en"});
    EXPECT_EQ(result.status, 0) << result.output;
    EXPECT_THAT(
        result.output,
        AllOf(HasSubstr("cameras.\"Studio A\".users.juergen: (allowed) -> (not allowed): applied\n"),
              HasSubstr("workflows.\"Picture in Picture\".users.juergen: (allowed) -> (not allowed): applied\n")));
    EXPECT_THAT(listsWith("user", "juergen"), testing::IsEmpty());
    EXPECT_THAT(listsWith("group", "studio"), Contains("Studio A")) << "only the person's own entries";
    EXPECT_EQ(ctl({"access", "juergen", "--revoke"}).output, "no change\n");
}

TEST_F(People, RevokeTriesAgainAfterAnotherClientsChange) {
    makeDatabaseToolHoldable();
    const ProgramResult result = overtaken({"access", "juergen", "--revoke", "--languages", "en"},
                                           R"({"configuration":{"server_host":"other"}})", "sqlite3");
    EXPECT_EQ(result.status, 0) << result.output;
    EXPECT_THAT(result.output, HasSubstr("cameras.\"Studio A\".users.juergen: (allowed) -> (not allowed): applied\n"));
    EXPECT_THAT(listsWith("user", "juergen"), testing::IsEmpty());
    EXPECT_EQ(ctl({"settings", "get", "server_host"}).output, "other\n");
}

TEST_F(People, RevokeDoesNotRemoveAnEntryThatItHasNotShown) {
    makeDatabaseToolHoldable();
    const std::string roof = SampleRoot::uuidOf("camera", "Roof");
    const ProgramResult result =
        overtaken({"access", "juergen", "--revoke"},
                  R"({"configuration":{"cameras":[{"_id_":")" + roof +
                      R"(","allowedUsersAndGroups":[{"_newid_":true,"type":"user","shortName":"juergen"}]}]}})",
                  "sqlite3");
    EXPECT_EQ(result.status, 7) << result.output;
    EXPECT_THAT(result.output, HasSubstr("cameras.Roof.users.juergen: (allowed) -> (not allowed): another client has "
                                         "added this entry; nothing was written"));
    EXPECT_THAT(listsWith("user", "juergen"), AllOf(Contains("Roof"), Contains("Studio A")));
}

TEST_F(People, RevokeOfEntriesThatAnotherClientHasRemovedIsSuccess) {
    makeDatabaseToolHoldable();
    const std::string removal = R"(","allowedUsersAndGroups":[{"_obsoleteid_":true,"_id_":")" +
                                SampleRoot::uuidOf("user", "juergen") + R"("}]}])";
    const ProgramResult result = overtaken(
        {"access", "juergen", "--revoke"},
        R"({"configuration":{"cameras":[{"_id_":")" + SampleRoot::uuidOf("camera", "Studio A") + removal +
            R"(,"workflows":[{"_id_":")" + SampleRoot::uuidOf("workflow", "TwoCameras.workflow") + removal + "}}",
        "sqlite3");
    EXPECT_EQ(result.status, 0) << result.output;
    EXPECT_EQ(result.output, "no change\nalready so: another client has changed it\n");
}

TEST_F(People, AccountThatIsGoneIsShownAndRemovedByItsUuid) {
    const std::string uuid = SampleRoot::uuidOf("user", "juergen");
    root.removeAccount("juergen");
    const ProgramResult shownByUuid = ctl({"access", uuid, "--languages", "en"});
    EXPECT_EQ(shownByUuid.status, 0) << shownByUuid.output;
    EXPECT_THAT(shownByUuid.output, AllOf(HasSubstr(uuid + " is not in the directory"), HasSubstr("Studio A"),
                                          HasSubstr("Picture in Picture"), Not(HasSubstr("open to everyone"))));
    const ProgramResult byName = ctl({"camera", "deny", "Studio A", "juergen"});
    EXPECT_EQ(byName.status, 2) << "no change would leave the access to an account that is created again";
    const ProgramResult one = ctl({"camera", "deny", "Studio A", uuid});
    EXPECT_EQ(one.status, 0) << one.output;
    EXPECT_THAT(one.output,
                HasSubstr("cameras.\"Studio A\".unknown." + uuid + ": (allowed) -> (not allowed): applied"));
    EXPECT_EQ(listsWith("user", "juergen"), std::vector<std::string>{"Workflows/TwoCameras.workflow"});
    EXPECT_EQ(ctl({"access", uuid, "--revoke"}).status, 0);
    EXPECT_THAT(listsWith("user", "juergen"), testing::IsEmpty());
    EXPECT_EQ(ctl({"access", uuid}).status, 2);
}

TEST_F(People, EntryThatTheServiceLeavesIsAFailure) {
    const std::string uuid = SampleRoot::uuidOf("user", "juergen");
    root.removeAccount("juergen");
    root.setSwitch("lumioconfig.error", "no such name");
    root.setSwitch("lumioconfig.exit", "2");
    const ProgramResult result = ctl({"access", uuid, "--revoke"});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, AllOf(HasSubstr("(not allowed): FAILED: "),
                                     HasSubstr("the configuration tool left the entry"), HasSubstr("no such name")));
    EXPECT_THAT(listsWith("user", "juergen"), Not(testing::IsEmpty()));
}

TEST_F(People, NotesExplainAListThatDoesNotCountAndOneThatIsEmpty) {
    EXPECT_THAT(ctl({"camera", "allow", "Roof", "anna"}).output,
                HasSubstr("Roof is open to everyone; its list counts after \"adminhostctl camera access Roof on\"\n"));
    EXPECT_THAT(ctl({"camera", "allow", "Lecture hall 2", "anna"}).output,
                HasSubstr("\"adminhostctl camera access 'Lecture hall 2' on\""));
    EXPECT_THAT(ctl({"camera", "allow", "Studio B", "anna"}).output, Not(HasSubstr("open to everyone")));
    EXPECT_THAT(ctl({"camera", "access", "Lecture hall 3", "on"}).output,
                HasSubstr("the list of Lecture hall 3 is empty, so nobody may use it now"));
    EXPECT_THAT(ctl({"camera", "access", "Roof", "on"}).output, Not(HasSubstr("nobody")));
}

TEST_F(People, WhoisShowsGroupsAndNodeAndEachValueOnce) {
    const std::string anna = ctl({"whois", "anna"}).output;
    EXPECT_EQ(anna, "shortName  anna\nlongName   Anna Lindqvist\nguid       " + SampleRoot::uuidOf("user", "anna") +
                        "\ntype       user\nnode       /Local\ngroups     staff, editors, lecturers\n");
    const std::string studio = ctl({"whois", "studio"}).output;
    EXPECT_EQ(studio, "shortName  studio\nguid       " + SampleRoot::uuidOf("group", "studio") +
                          "\ntype       group\nnode       /Local\n");
}

}  // namespace
}  // namespace adminhost::test
