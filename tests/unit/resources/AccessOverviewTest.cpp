// Who may use what as the database has it, and the removal of accounts that the directory does not know.

#include "resources/AccessOverview.h"
#include "tests/support/CapturedReports.h"
#include "tests/support/RecordedStatements.h"
#include "tests/unit/resources/AccessListsFixture.h"
#include "tests/unit/resources/FixedDirectory.h"

namespace lumio {
namespace {

using testing::HasSubstr;
using testing::SizeIs;

class AccessOverview : public AccessLists {
  protected:
    void SetUp() override {
        AccessLists::SetUp();
        root.sql(database,
                 "create table workflows(id integer primary key,uuid,bundle_path,access_control_enabled,disabled);"
                 "insert into workflows values(7,'W-7','Workflows/Gone.workflow','t','t')");
        allow(7, uuidOf("user:anna"));
        allow(7, gone);
        allow(8, uuidOf("group:editors"));
        root.sql(database, "insert into access_control_entries values('" + gone + "','Workflow',7)");
        // Removes the named UUIDs from the list of the resource, as the service's tool does with names.
        root.writeTool(tool, "#!/bin/sh\nfor a in \"$@\"; do printf '%s ' \"$a\"; done >> " +
                                 root.path("/calls").string() + "\necho >> " + root.path("/calls").string() +
                                 "\n[ -e '" + root.path("/refuse").string() +
                                 "' ] && { echo 'no such name' >&2; exit 2; }\n" + "[ \"$7\" = group ] || exit 0\n" +
                                 "exec /usr/bin/sqlite3 '" + root.path(database).string() +
                                 "' \"delete from access_control_entries where record_uuid='$9' and "
                                 "resource_type='$(echo $3 | sed 's/^c/C/;s/^w/W/')'\"\n");
    }
    [[nodiscard]] std::vector<std::string> entriesLeft() const {
        std::vector<std::string> lines;
        const auto rows =
            runStatement("select resource_type||' '||resource_id||' '||record_uuid as one from access_control_entries");
        for (const Dictionary& row : *rows) {
            lines.emplace_back(row.text("one"));
        }
        return lines;
    }
    static Dictionary resourceOf(const Array& all, const std::string& name) {
        for (const Value& one : all) {
            if (one.dictionary()->text("_id_") == name) {
                return *one.dictionary();
            }
        }
        ADD_FAILURE() << name;
        return {};
    }
    /// "anna, ?7C0F..." for the access list of a resource; accounts that are not known have a question mark.
    static std::vector<std::string> namesOf(const Dictionary& resource) {
        std::vector<std::string> names;
        for (const Value& person : *resource.get("allowedUsersAndGroups").array()) {
            const Dictionary& one = *person.dictionary();
            names.push_back(one.contains("type") ? std::string(one.text("shortName"))
                                                 : '?' + std::string(one.text("guid")));
        }
        return names;
    }

    const std::string gone = "7C0F4E0E-2B5C-5D2B-9B7F-0A4E8B6E9D12";
};

TEST_F(AccessOverview, ListsDisabledResourcesAndAccountsThatTheDirectoryDoesNotKnow) {
    root.sql(database, "update cameras set disabled='t' where id=8");
    const auto all = accessOverview({"en"});
    ASSERT_TRUE(all);
    EXPECT_THAT(*all, SizeIs(3));
    const Dictionary aula = resourceOf(*all, "C-7");
    EXPECT_EQ(aula.get("section"), Value("cameras"));
    EXPECT_EQ(aula.get("name"), Value("Aula"));
    EXPECT_EQ(aula.get("access_control_enabled"), Value(true));
    EXPECT_EQ(aula.get("disabled"), Value(false));
    EXPECT_THAT(namesOf(aula), ElementsAre("anna", '?' + gone));
    EXPECT_EQ(resourceOf(*all, "C-8").get("disabled"), Value(true));
    EXPECT_THAT(namesOf(resourceOf(*all, "C-8")), ElementsAre("editors"));
    const Dictionary workflow = resourceOf(*all, "W-7");
    EXPECT_EQ(workflow.get("disabled"), Value(true));
    EXPECT_EQ(workflow.get("bundle_path"), Value("Workflows/Gone.workflow"));
    EXPECT_THAT(namesOf(workflow), ElementsAre('?' + gone));
}

TEST_F(AccessOverview, NeedsThreeStatementsWhateverTheNumberOfResources) {
    root.sql(database, "insert into cameras(id,name,uuid) values(9,'A','C-9'),(10,'B','C-10')");
    const adminhost::test::RecordedStatements statements(root);
    ASSERT_TRUE(accessOverview({}));
    EXPECT_THAT(statements.take(), SizeIs(3));
}

TEST_F(AccessOverview, NameWithLineFeedsIsOneName) {
    root.sql(database, "update cameras set name='a' || char(10) || '   id = 9' where id=7");
    const auto all = accessOverview({});
    ASSERT_TRUE(all);
    EXPECT_THAT(*all, SizeIs(3));
    EXPECT_EQ(resourceOf(*all, "C-7").get("name"), Value("a\n   id = 9"));
}

TEST_F(AccessOverview, FailsIfTheDirectoryFailsBecauseEveryoneWouldLookUnknown) {
    useDirectory(std::nullopt);
    EXPECT_FALSE(accessOverview({}));
    EXPECT_FALSE(removeUnknownAccount(gone, {}));
    EXPECT_THAT(entriesLeft(), SizeIs(4));
}

TEST_F(AccessOverview, UnknownAccountIsRemovedFromAllListsByItsUuid) {
    const adminhost::test::CapturedReports reports;
    const auto outcome = removeUnknownAccount("7c0f4e0e-2b5c-5d2b-9b7f-0a4e8b6e9d12", {});
    ASSERT_TRUE(outcome);
    EXPECT_EQ(outcome->removed, 2U);
    EXPECT_EQ(outcome->left, 0U);
    EXPECT_THAT(entriesLeft(), ElementsAre("Camera 7 " + uuidOf("user:anna"), "Camera 8 " + uuidOf("group:editors")));
    EXPECT_THAT(
        calls(),
        ElementsAre(
            "--remove_access --resource_type camera --resource_uuid C-7 --record_type user --shortname " + gone + ' ',
            "--remove_access --resource_type workflow --resource_uuid W-7 --record_type user --shortname " + gone + ' ',
            "--remove_access --resource_type camera --resource_uuid C-7 --record_type group --shortname " + gone + ' ',
            "--remove_access --resource_type workflow --resource_uuid W-7 --record_type group --shortname " + gone +
                ' '));
    EXPECT_THAT(reports.changes, SizeIs(2));
}

TEST_F(AccessOverview, OnlyTheNamedResourcesAreChanged) {
    const std::vector<std::string> named{"c-7"};
    const auto outcome = removeUnknownAccount(gone, named);
    ASSERT_TRUE(outcome);
    EXPECT_EQ(outcome->removed, 1U);
    EXPECT_THAT(entriesLeft(), testing::Contains("Workflow 7 " + gone));
}

TEST_F(AccessOverview, EntryThatTheToolLeavesIsReported) {
    root.write("/refuse", "");
    const adminhost::test::CapturedReports reports;
    const auto outcome = removeUnknownAccount(gone, {});
    ASSERT_TRUE(outcome);
    EXPECT_EQ(outcome->left, 2U);
    ASSERT_THAT(reports.parts, SizeIs(2));
    EXPECT_EQ(reports.parts[0].reason, "not removed from the camera C-7: the configuration tool left the entry");
    EXPECT_EQ(reports.parts[0].toolMessage, "no such name");
    EXPECT_THAT(reports.changes, IsEmpty());
}

TEST_F(AccessOverview, RemovalsAreReportedAsUnverifiedIfTheListsCannotBeReadAgain) {
    root.writeTool(tool, "#!/bin/sh\n[ \"$3\" = camera ] || { echo 'no such name' >&2; exit 2; }\necho broken > '" +
                             root.path(database).string() + "'\n");
    const adminhost::test::CapturedReports reports;
    EXPECT_FALSE(removeUnknownAccount(gone, {}));
    ASSERT_THAT(reports.changes, SizeIs(1)) << "what is gone must be in the audit and in the history";
    EXPECT_EQ(reports.changes[0].identity, "C-7");
    EXPECT_EQ(reports.changes[0].from, Value(gone));
    EXPECT_TRUE(reports.changes[0].unverified);
    ASSERT_THAT(reports.parts, SizeIs(1));
    EXPECT_EQ(reports.parts[0].reason, "not removed from the workflow W-7: the configuration tool failed");
    EXPECT_EQ(reports.parts[0].toolMessage, "no such name");
}

TEST_F(AccessOverview, AccountThatTheDirectoryKnowsIsNotRemoved) {
    const auto outcome = removeUnknownAccount(uuidOf("user:anna"), {});
    ASSERT_FALSE(outcome);
    EXPECT_EQ(outcome.error().description, "the directory knows the account: anna");
    EXPECT_THAT(calls(), IsEmpty());
}

}  // namespace
}  // namespace lumio
