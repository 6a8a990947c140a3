// Workflows through the command line: listed in the caller's language, named in several ways, changed and applied.

#include "tests/support/Environment.h"
#include "tests/system/apply/ControlledService.h"

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

class WorkflowVerbs : public ControlledService {
  protected:
    /// Runs the command line in these languages.
    [[nodiscard]] ProgramResult in(const std::string& languages, std::vector<std::string> words) const {
        words.insert(words.begin(), {"/usr/bin/env", "-u", "LANGUAGE", "-u", "LC_MESSAGES", "LC_ALL=" + languages,
                                     std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon.socket()});
        return runProgram(words, Errors::merge);
    }
    [[nodiscard]] std::string access(const std::string& workflow) const {
        return root.sql(
            "select record_uuid from access_control_entries where resource_type = 'Workflow' and resource_id = (select "
            "id from workflows where uuid = '" +
            uuid(workflow) + "') order by id");
    }
    [[nodiscard]] static std::string uuid(const std::string& workflow) {
        return SampleRoot::uuidOf("workflow", workflow + ".workflow");
    }
};

TEST_F(WorkflowVerbs, ListShowsTheNamesInTheCallersLanguage) {
    const std::string french = in("fr_FR.UTF-8", {"workflow", "list", "--names"}).output;
    EXPECT_EQ(french, "Publier au catalogue\nÉpisode sonore\nPicture in Picture\nArchive\n" + uuid("Nameless") +
                          "\nWorkflows/Removed.workflow\n");
    EXPECT_THAT(in("de_DE.UTF-8", {"workflow", "list", "--names"}).output,
                StartsWith("Im Katalog veröffentlichen\nHörfolge\nBild im Bild\n"));
    EXPECT_THAT(in("ja_JP.UTF-8", {"workflow", "list"}).output,
                AllOf(HasSubstr("カタログに公開"), HasSubstr("音声エピソード"), HasSubstr("Picture in Picture")));
    EXPECT_THAT(in("C", {"workflow", "list", "--names"}).output, StartsWith("Publish to Catalog\nAudio Episode\n"));
    EXPECT_EQ(in("de_DE.UTF-8", {"workflow", "list", "--names", "--languages", "it,fr"}).output, french);
    EXPECT_THAT(french, Not(HasSubstr("Legacy"))) << "it is disabled";
}

TEST_F(WorkflowVerbs, ShowFindsByNameUuidAndBundlePath) {
    const ProgramResult byName = in("fr_FR.UTF-8", {"--format", "json", "workflow", "show", "Publier au catalogue"});
    EXPECT_EQ(byName.status, 0);
    EXPECT_THAT(byName.output,
                AllOf(HasSubstr("\"_id_\": \"" + uuid("Publish") + "\""), HasSubstr("\"notes\": \"Version 2.4\""),
                      HasSubstr("\"description\": \"Encode un enregistrement et le publie au catalogue.\"")));
    for (const std::string& name : {uuid("Publish"), std::string("Workflows/Publish.workflow")}) {
        EXPECT_EQ(in("fr_FR.UTF-8", {"--format", "json", "workflow", "show", name}).output, byName.output) << name;
    }
    const ProgramResult german = in("de_DE.UTF-8", {"workflow", "show", "Publier au catalogue"});
    EXPECT_EQ(german.status, 2) << "a name of another language";
    EXPECT_EQ(german.output,
              "adminhostctl: workflow not found: Publier au catalogue; \"adminhostctl workflow list\" shows the "
              "names\n");
}

TEST_F(WorkflowVerbs, NameOfSeveralIsRefusedWithTheirUuids) {
    root.sql("update workflows set bundle_path='Workflows/Publish.workflow' where uuid='" + uuid("Archive") + "'");
    for (const std::string name : {"Publish to Catalog", "Workflows/Publish.workflow"}) {
        for (const std::vector<std::string>& words :
             {std::vector<std::string>{"workflow", "show", name}, {"workflow", "allow", name, "ben"}}) {
            const ProgramResult result = in("C", words);
            EXPECT_EQ(result.status, 2);
            EXPECT_THAT(result.output, AllOf(HasSubstr("several have the name"), HasSubstr(uuid("Publish")),
                                             HasSubstr(uuid("Archive"))));
        }
    }
    EXPECT_EQ(in("C", {"workflow", "access", uuid("Archive"), "on"}).status, 0);
}

TEST_F(WorkflowVerbs, UsersAndGroupsComeOnAndOffTheList) {
    EXPECT_EQ(in("fr_FR.UTF-8", {"workflow", "allow", "Publier au catalogue", "ben"}).output,
              "workflows.\"Publier au catalogue\".users.ben: (not allowed) -> (allowed): applied\n");
    EXPECT_EQ(in("C", {"workflow", "allow", "Workflows/Publish.workflow", "studio", "--group"}).status, 0);
    EXPECT_EQ(in("C", {"workflow", "deny", uuid("Publish"), "editors"}).output,
              "workflows." + uuid("Publish") + ".groups.editors: (allowed) -> (not allowed): applied\n");
    EXPECT_EQ(access("Publish"), SampleRoot::uuidOf("group", "lecturers") + "\n" + SampleRoot::uuidOf("user", "ben") +
                                     "\n" + SampleRoot::uuidOf("group", "studio") + "\n");
    EXPECT_EQ(in("C", {"workflow", "allow", "Publish to Catalog", "ben"}).output, "no change\n");
    EXPECT_THAT(in("C", {"workflow", "show", "Publish to Catalog"}).output,
                HasSubstr("Ben Okafor (user), lecturers (group), studio (group)"));
}

TEST_F(WorkflowVerbs, AccessIsSwitchedAndAnUnknownWorkflowIsAUsageError) {
    const std::string stored = "select access_control_enabled from workflows where uuid='" + uuid("Publish") + "'";
    EXPECT_EQ(in("C", {"workflow", "access", "Publish to Catalog", "off"}).status, 0);
    EXPECT_EQ(root.sql(stored), "f\n");
    EXPECT_EQ(in("C", {"workflow", "access", "Publish to Catalog", "off"}).output, "no change\n");
    EXPECT_EQ(in("C", {"workflow", "access", "Publish to Catalog", "on"}).status, 0);
    EXPECT_EQ(root.sql(stored), "t\n");
    EXPECT_EQ(in("C", {"workflow", "access", "Publish to Catalog", "perhaps"}).status, 2);
    for (const std::string unknown : {"No such workflow", "Legacy", ""}) {
        EXPECT_EQ(in("C", {"workflow", "access", unknown, "on"}).status, 2) << unknown;
    }
    EXPECT_EQ(in("C", {"workflow", "remove", "Publish to Catalog"}).status, 2) << "only the service removes workflows";
}

TEST_F(WorkflowVerbs, WorkflowWithoutABundleIsChangedByItsPathOrUuid) {
    EXPECT_EQ(in("C", {"workflow", "allow", "Workflows/Removed.workflow", "ben"}).status, 0);
    EXPECT_EQ(access("Removed"), SampleRoot::uuidOf("user", "ben") + "\n");
    EXPECT_EQ(in("C", {"workflow", "deny", uuid("Removed"), "ben"}).status, 0);
    EXPECT_EQ(access("Removed"), "");
}

TEST_F(WorkflowVerbs, FileNamesThemByUuidWithTheNameAsAComment) {
    const std::string french = in("fr_FR.UTF-8", {"export"}).output;
    EXPECT_THAT(french, HasSubstr("[workflows." + uuid("Publish") +
                                  "]\n# name: \"Publier au catalogue\"\naccess_control = true\nusers = []\ngroups = "
                                  "[\"editors\", \"lecturers\"]\n"));
    EXPECT_THAT(french,
                HasSubstr("[workflows." + uuid("Removed") + "]\n# bundle_path: \"Workflows/Removed.workflow\"\n"));
    for (const char* language : {"fr_FR.UTF-8", "de_DE.UTF-8", "C"}) {
        EXPECT_THAT(in(language, {"plan", file("french.toml", french)}).output, StartsWith("no change\n")) << language;
    }
}

TEST_F(WorkflowVerbs, FileIsAppliedOnceAndThenNothingChanges) {
    const std::string desired =
        file("desired.toml", "[remove_unlisted]\naccess = true\n[workflows." + uuid("Publish") +
                                 "]\naccess_control = false\nusers = [\"anna\", \"ben\"]\ngroups = [\"editors\"]\n" +
                                 "[workflows." + uuid("Removed") + "]\nusers = [\"carla\"]\n");
    const ProgramResult plan = in("fr_FR.UTF-8", {"plan", desired});
    EXPECT_EQ(plan.status, 0);
    const std::string entry = "workflows." + uuid("Publish");
    for (const std::string& line :
         {entry + ".access_control: yes -> no\n", entry + ".users.anna: (not allowed) -> (allowed)\n",
          entry + ".users.ben: (not allowed) -> (allowed)\n", entry + ".groups.lecturers: (allowed) -> (not allowed)\n",
          "workflows." + uuid("Removed") + ".users.carla: (not allowed) -> (allowed)\n"}) {
        EXPECT_THAT(plan.output, HasSubstr(line));
    }
    EXPECT_THAT(plan.output, Not(HasSubstr("editors")));
    EXPECT_EQ(access("Removed"), "") << "a plan writes nothing";
    const ProgramResult apply = in("fr_FR.UTF-8", {"apply", desired});
    EXPECT_EQ(apply.status, 0) << apply.output;
    EXPECT_EQ(access("Removed"), SampleRoot::uuidOf("user", "carla") + "\n");
    EXPECT_EQ(root.sql("select access_control_enabled from workflows where uuid='" + uuid("Publish") + "'"), "f\n");
    EXPECT_EQ(in("de_DE.UTF-8", {"apply", desired}).output, "no change\n");
    const support::ScopedEnvironment wide(support::ScopedEnvironment::Changes{{"COLUMNS", "1000"}});
    EXPECT_THAT(in("C", {"history"}).output,
                HasSubstr("workflows." + uuid("Removed") + ".users.carla: (not allowed) -> (allowed)\n"));
}

TEST_F(WorkflowVerbs, FileWithAnUnknownUuidOrANameIsRefusedAndNothingIsSent) {
    for (const std::string& name : {uuid("Unknown"), uuid("Legacy"), std::string("\"Publish to Catalog\"")}) {
        const ProgramResult apply =
            in("C", {"apply", file("bad.toml", "[workflows." + name + "]\nusers = [\"ben\"]\n")});
        EXPECT_EQ(apply.status, 2) << name;
        EXPECT_THAT(apply.output, AllOf(HasSubstr("bad.toml, line 1, column "), HasSubstr("not found in the service"),
                                        HasSubstr("by their identities")));
    }
    EXPECT_EQ(in("C", {"history"}).output, "No change has been recorded yet.\n");
}

TEST_F(WorkflowVerbs, ConfigurationToolThatFailsIsNamed) {
    root.setSwitch("lumioconfig.exit", "3");
    const ProgramResult allow = in("C", {"workflow", "allow", "Publish to Catalog", "ben"});
    EXPECT_EQ(allow.status, 1);
    EXPECT_THAT(allow.output,
                HasSubstr("workflows.\"Publish to Catalog\".users.ben: (not allowed) -> (allowed): FAILED: "));
}

TEST_F(WorkflowVerbs, ListThatCannotBeReadIsNotExported) {
    root.sql("alter table workflows rename to gone");
    const ProgramResult exported = in("C", {"export"});
    EXPECT_EQ(exported.status, 1);
    EXPECT_THAT(exported.output, HasSubstr("not read: the workflows (Error: in prepare, no such table: workflows)"));
    EXPECT_EQ(in("C", {"workflow", "list"}).status, 1);
    EXPECT_EQ(in("C", {"camera", "access", "Main hall", "off"}).status, 0) << "cameras have nothing to do with them";
}

}  // namespace
}  // namespace adminhost::test
