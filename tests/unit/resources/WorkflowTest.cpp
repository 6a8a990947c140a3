#include "resources/Workflow.h"
#include "tests/support/RecordedStatements.h"
#include "tests/unit/resources/AccessListsFixture.h"

#include <filesystem>
#include <fstream>

#include <sys/stat.h>

namespace lumio {
namespace {

namespace fs = std::filesystem;

constexpr std::string_view shared = "/Library/SorvaneProducer/Shared";

class Workflows : public AccessLists {
  protected:
    void SetUp() override {
        AccessLists::SetUp();
        root.sql(database,
                 "create table workflows(id integer primary key,uuid,bundle_path,disabled,access_control_enabled,"
                 "use_user_uuid,created_at,updated_at,used_at);");
    }

    void addRow(const std::string& uuid, const std::string& path, const std::string& disabled = "NULL") const {
        root.sql(database,
                 "insert into workflows(uuid,bundle_path,disabled,access_control_enabled,created_at) values('" + uuid +
                     "','" + path + "'," + disabled + ",'t','2026-03-01 08:00:00')");
    }
    void writeInformation(std::string_view bundle, std::string_view content) const {
        root.writePropertyList(std::string(shared) + "/" + std::string(bundle) + "/Contents/Info.plist", content);
    }
    void writeTable(std::string_view bundle, std::string_view localization, std::string_view text) const {
        root.write(std::string(shared) + "/" + std::string(bundle) + "/Contents/Resources/" +
                       std::string(localization) + ".lproj/InfoPlist.strings",
                   text);
    }
    /// The answer to the listing, in these languages.
    [[nodiscard]] Array listed(Array languages = {}) const {
        LumioRequestHandler own;
        const Dictionary answer =
            own.getWorkflowsWithRequest({{"optionalArguments", Dictionary{{"languages", Value(std::move(languages))}}}})
                .dictionary();
        EXPECT_EQ(answer.get("command"), Value("getWorkflows"));
        EXPECT_EQ(answer.get("readStatus"), Value(0));
        EXPECT_EQ(answer.size(), 3U);
        return answer.get("workflows").array() == nullptr ? Array() : *answer.get("workflows").array();
    }
    /// Name, description and notes of the only workflow.
    [[nodiscard]] std::vector<Value> texts(Array languages = {}) const {
        const Array all = listed(std::move(languages));
        EXPECT_EQ(all.size(), 1U);
        const Dictionary& only = *all.at(0).dictionary();
        EXPECT_TRUE(only.contains("name") && only.contains("description") && only.contains("notes"));
        return {only.get("name"), only.get("description"), only.get("notes")};
    }
    static std::vector<Value> texts(std::string_view name, std::string_view description, std::string_view notes) {
        return {Value(name), Value(description), Value(notes)};
    }
};

TEST_F(Workflows, DisabledOnesAreNotListed) {
    addRow("W-1", "A", "'t'");
    addRow("W-2", "B", "'f'");
    addRow("W-3", "C");
    const Array all = listed();
    ASSERT_EQ(all.size(), 2U);
    EXPECT_EQ(all[0].dictionary()->get("_id_"), Value("W-2"));
    EXPECT_EQ(all[1].dictionary()->get("_id_"), Value("W-3"));
}

TEST_F(Workflows, TheInformationFilesUuidStandsInForItsName) {
    addRow("W-1", "A");
    writeInformation("A", "<key>UUID</key><string>I-1</string>");
    EXPECT_EQ(texts(), texts("I-1", "", ""));
    writeInformation("A", "<key>UUID</key><string>I-1</string><key>Name</key><string>Publish</string>");
    EXPECT_EQ(texts(), texts("Publish", "", ""));
}

TEST_F(Workflows, TextsComeFromTheBestLanguage) {
    addRow("W-1", "A");
    writeInformation("A",
                     "<key>Name</key><string>n</string><key>Description</key><string>d</string>"
                     "<key>Notes</key><string>o</string>");
    writeTable("A", "German", "Name = \"Veröffentlichen\"; Notes = \"nicht übersetzt\";");
    writeTable("A", "English", "Name = \"Publish\"; Description = \"Publishes\";");
    EXPECT_EQ(texts({"French", "German"}), texts("Veröffentlichen", "d", "o"));
    EXPECT_EQ(texts({"fr"}), texts("Publish", "Publishes", "o"));
    EXPECT_EQ(texts(Array()), texts("Publish", "Publishes", "o")) << "an empty list means English";
    fs::remove_all(root.path(std::string(shared) + "/A/Contents/Resources/German.lproj"));
    EXPECT_EQ(texts({"French", "German"}), texts("Publish", "Publishes", "o"));
}

TEST_F(Workflows, AnEmptyLanguageListWithoutEnglishLeavesTheInformationFile) {
    addRow("W-1", "A");
    writeInformation("A", "<key>Name</key><string>n</string>");
    writeTable("A", "German", "Name = \"Veröffentlichen\";");
    EXPECT_EQ(texts(Array()), texts("n", "", ""));
}

TEST_F(Workflows, TheFirstTableDecidesEvenIfItCannotBeRead) {
    addRow("W-1", "A");
    writeInformation("A", "<key>Name</key><string>n</string>");
    writeTable("A", "German", "{{{");
    writeTable("A", "English", "Name = \"Publish\";");
    EXPECT_EQ(texts({"de", "en"}), texts("n", "", ""));
}

TEST_F(Workflows, OneWhoseBundleIsMissingIsListedWithEmptyTexts) {
    addRow("W-1", "gone");
    EXPECT_EQ(texts(), texts("", "", ""));
    const Dictionary workflow = *listed().at(0).dictionary();
    EXPECT_EQ(workflow.get("allowedUsersAndGroups"), Value(Array()));
    EXPECT_EQ(workflow.get("access_control_enabled"), Value(true));
    EXPECT_NE(workflow.get("created_at").date(), std::nullopt);
}

TEST_F(Workflows, ListingExpandsTheAccessListOnce) {
    addRow("W-1", "A");
    writeInformation("A", "<key>Name</key><string>n</string>");
    root.sql(database, "insert into access_control_entries values('" + uuidOf("user:anna") + "','Workflow',1)");
    const Dictionary workflow = *listed().at(0).dictionary();
    // A second expansion would read the boolean as a text other than "t".
    EXPECT_EQ(workflow.get("access_control_enabled"), Value(true));
    ASSERT_NE(workflow.get("allowedUsersAndGroups").array(), nullptr);
    ASSERT_EQ(workflow.get("allowedUsersAndGroups").array()->size(), 1U);
    EXPECT_EQ(workflow.get("allowedUsersAndGroups").array()->front().dictionary()->get("shortName"), Value("anna"));
}

TEST_F(Workflows, EveryListedOneHasAListAndABooleanSwitch) {
    addRow("W-1", "A");
    addRow("W-2", "B");
    addRow("W-3", "gone");
    root.sql(database,
             "update workflows set access_control_enabled='f' where id=2;"
             "update workflows set access_control_enabled=NULL where id=3;"
             "insert into access_control_entries values('" +
                 uuidOf("group:editors") + "','Workflow',1);" + "insert into access_control_entries values('" +
                 uuidOf("user:anna") + "','Camera',2)");
    const Array all = listed();
    ASSERT_EQ(all.size(), 3U);
    std::vector<Value> switches;
    std::vector<std::size_t> sizes;
    for (const Value& workflow : all) {
        switches.push_back(workflow.dictionary()->get("access_control_enabled"));
        ASSERT_NE(workflow.dictionary()->get("allowedUsersAndGroups").array(), nullptr);
        sizes.push_back(workflow.dictionary()->get("allowedUsersAndGroups").array()->size());
    }
    EXPECT_EQ(switches, (std::vector<Value>{true, false, false}));
    EXPECT_EQ(sizes, (std::vector<std::size_t>{1, 0, 0})) << "the camera with the same row number has its own list";
}

TEST_F(Workflows, RequestWithoutLanguagesGetsTheHosts) {
    addRow("W-1", "A");
    writeTable("A", "German", "Name = \"Veröffentlichen\";");
    writeTable("A", "English", "Name = \"Publish\";");
    adminhost::setUserDefault("BrennLanguages", Array{"de_DE"});
    const auto nameFor = [](const Dictionary& request) {
        LumioRequestHandler own;
        return own.getWorkflowsWithRequest(request)
            .dictionary()
            .get("workflows")
            .array()
            ->at(0)
            .dictionary()
            ->get("name");
    };
    EXPECT_EQ(nameFor({}), Value("Veröffentlichen"));
    EXPECT_EQ(nameFor({{"optionalArguments", Dictionary{{"variant", "x"}}}}), Value("Veröffentlichen"));
    EXPECT_EQ(nameFor({{"optionalArguments", Dictionary{{"languages", Array{}}}}}), Value("Publish"))
        << "an empty list is not a missing one";
    adminhost::setUserDefault("BrennLanguages", {});
    EXPECT_EQ(nameFor({}), Value("Publish"));
}

TEST_F(Workflows, StatementsOfTheListingAreOneAndOneForEachList) {
    addRow("W-1", "A");
    addRow("W-2", "B");
    const adminhost::test::RecordedStatements statements(root);
    (void)listed();
    EXPECT_THAT(
        statements.take(),
        testing::UnorderedElementsAre(
            "select * from workflows where (disabled != 't' OR disabled is NULL)",
            "select record_uuid from access_control_entries where resource_type = 'Workflow' and resource_id = '1'",
            "select record_uuid from access_control_entries where resource_type = 'Workflow' and resource_id = '2'"));
}

TEST_F(Workflows, ListedOnesAreExpandedAtOnceAndTheirBundlesAreFoundWithoutAnotherStatement) {
    addRow("W-1", "A");
    writeInformation("A", "<key>Name</key><string>n</string>");
    std::optional<Error> error;
    auto workflows = Workflow::allWorkflowsWithError(error);
    ASSERT_TRUE(workflows && workflows->size() == 1);
    EXPECT_EQ(workflows->front()->data()->get("access_control_enabled"), Value(true));
    const adminhost::test::RecordedStatements statements(root);
    EXPECT_TRUE(workflows->front()->bundle());
    workflows->front()->localizeUsingLanguages({});
    EXPECT_EQ(workflows->front()->dictionary()->get("access_control_enabled"), Value(true));
    EXPECT_THAT(statements.take(), IsEmpty());
}

TEST_F(Workflows, BundleOfOneThatWasNotListedExpandsItsAccessListFirst) {
    const auto workflow = Workflow::initWithDictionary(
        {{"uuid", "W-1"}, {"id", "1"}, {"bundle_path", "A"}, {"access_control_enabled", "t"}});
    writeInformation("A", "<key>Name</key><string>n</string>");
    EXPECT_TRUE(workflow->bundle());
    EXPECT_EQ(workflow->data()->get("access_control_enabled"), Value(true));
    EXPECT_TRUE(workflow->data()->contains("allowedUsersAndGroups"));
}

TEST_F(Workflows, OneWithoutARecordOrABundlePathHasNoBundleAndNoTexts) {
    auto unknown = Workflow::initWithGUID("W-9");
    EXPECT_FALSE(unknown->bundle());
    unknown->localizeUsingLanguages({});
    EXPECT_EQ(unknown->dictionary(), nullptr);
    auto pathless = Workflow::initWithDictionary({{"uuid", "W-1"}});
    EXPECT_FALSE(pathless->bundle());
    EXPECT_FALSE(pathless->uncachedInfoDictionary());
    EXPECT_FALSE(pathless->localizedStrings({"de"}));
    pathless->localizeUsingLanguages({"de"});
    EXPECT_EQ(pathless->dictionary()->get("name"), Value(""));
}

TEST_F(Workflows, LocalizedTextsReplaceEmptyOnesToo) {
    addRow("W-1", "A");
    writeTable("A", "English", "Name = \"Publish\"; Description = \"Publishes\";");
    EXPECT_EQ(texts(), texts("Publish", "Publishes", "")) << "a bundle without an information file";
}

TEST_F(Workflows, LocalizedTextThatIsNotATextIsCopiedAsItIs) {
    addRow("W-1", "A");
    writeTable("A", "English", "Name = (one, two);");
    EXPECT_EQ(texts().front(), Value(Array{"one", "two"}));
}

TEST_F(Workflows, StepsUpAreFollowedAsTheSystemFollowsThem) {
    addRow("W-1", "../Elsewhere/A");
    root.writePropertyList("/Library/SorvaneProducer/Elsewhere/A/Contents/Info.plist",
                           "<key>Name</key><string>up</string>");
    EXPECT_EQ(texts(), texts("up", "", ""));
    root.sql(database, "update workflows set bundle_path='Link/../B'");
    root.writePropertyList("/target/B/Contents/Info.plist", "<key>Name</key><string>beside the target</string>");
    fs::create_directories(root.path("/target/inner"));
    fs::create_directories(root.path(shared));
    fs::create_directory_symlink(root.path("/target/inner"), root.path(std::string(shared) + "/Link"));
    EXPECT_EQ(texts(), texts("beside the target", "", ""));
    root.sql(database, "update workflows set bundle_path='../../../../../../../../../../target/B'");
    EXPECT_EQ(texts(), texts("beside the target", "", "")) << "above the root is the root";
}

TEST_F(Workflows, TheBundlePathIsAlwaysBelowTheSharedFileSystem) {
    addRow("W-1", "/A");
    writeInformation("A", "<key>Name</key><string>below</string>");
    EXPECT_EQ(texts(), texts("below", "", ""));
}

TEST_F(Workflows, AnEmptyBundlePathNamesTheSharedFileSystem) {
    addRow("W-1", "");
    writeInformation(".", "<key>Name</key><string>itself</string>");
    EXPECT_EQ(texts(), texts("itself", "", ""));
}

TEST_F(Workflows, LinksAreFollowedButNotOutOfTheRoot) {
    addRow("W-1", "A");
    root.writePropertyList("/elsewhere/A/Contents/Info.plist", "<key>Name</key><string>linked</string>");
    fs::create_directory_symlink(root.path("/elsewhere/A"), root.path(std::string(shared) + "/A"));
    EXPECT_EQ(texts(), texts("linked", "", ""));
    const fs::path outside = adminhost::systemRoot() + "-outside";
    fs::create_directories(outside / "Contents");
    fs::copy_file(root.path("/elsewhere/A/Contents/Info.plist"), outside / "Contents/Info.plist",
                  fs::copy_options::overwrite_existing);
    fs::remove(root.path(std::string(shared) + "/A"));
    fs::create_directory_symlink(outside, root.path(std::string(shared) + "/A"));
    EXPECT_EQ(texts(), texts("", "", ""));
    fs::remove(root.path(std::string(shared) + "/A"));
    fs::create_directories(root.path(std::string(shared) + "/A/Contents"));
    fs::create_symlink(outside / "Contents/Info.plist", root.path(std::string(shared) + "/A/Contents/Info.plist"));
    EXPECT_EQ(texts(), texts("", "", ""));
    fs::remove_all(outside);
}

TEST_F(Workflows, TablesOutsideTheRootAreNotRead) {
    addRow("W-1", "A");
    writeInformation("A", "<key>Name</key><string>n</string>");
    const fs::path outside = adminhost::systemRoot() + "-outside";
    fs::create_directories(outside / "de.lproj");
    std::ofstream(outside / "de.lproj/InfoPlist.strings") << "Name = \"outside\";";
    fs::create_directory_symlink(outside / "de.lproj", root.path(std::string(shared) + "/A/de.lproj"));
    EXPECT_EQ(texts({"de"}), texts("n", "", ""));
    fs::remove(root.path(std::string(shared) + "/A/de.lproj"));
    fs::create_directory(root.path(std::string(shared) + "/A/de.lproj"));
    fs::create_symlink(outside / "de.lproj/InfoPlist.strings",
                       root.path(std::string(shared) + "/A/de.lproj/InfoPlist.strings"));
    EXPECT_EQ(texts({"de"}), texts("n", "", ""));
    fs::remove_all(outside);
}

TEST_F(Workflows, LinkedDirectoryOfWorkflowsIsNormal) {
    addRow("W-1", "Workflows/A");
    root.writePropertyList("/Volumes/Media/A/Contents/Info.plist", "<key>Name</key><string>n</string>");
    root.write("/Volumes/Media/A/Contents/Resources/de.lproj/InfoPlist.strings", "Name = \"deutsch\";");
    fs::create_directories(root.path(shared));
    fs::create_directory_symlink("../../../Volumes/Media", root.path(std::string(shared) + "/Workflows"));
    EXPECT_EQ(texts({"de"}), texts("deutsch", "", ""));
}

TEST_F(Workflows, InformationThatIsNoTextIsCopiedAsItIs) {
    addRow("W-1", "A");
    writeInformation("A", "<key>Name</key><integer>7</integer><key>Notes</key><true/>");
    EXPECT_EQ(texts(), (std::vector<Value>{Value(7), Value(""), Value(true)}));
}

TEST_F(Workflows, AnInformationFileThatIsNoFileOrTooLargeCountsAsMissing) {
    addRow("W-1", "A");
    const fs::path file = root.path(std::string(shared) + "/A/Contents/Info.plist");
    fs::create_directories(file);
    EXPECT_EQ(texts(), texts("", "", ""));
    fs::remove(file);
    ASSERT_EQ(::mkfifo(file.c_str(), 0600), 0);
    EXPECT_EQ(texts(), texts("", "", ""));
    fs::remove(file);
    writeInformation("A", "<key>Name</key><string>n</string>");
    fs::resize_file(file, Workflow::informationMaximumSize + 1);
    EXPECT_EQ(texts(), texts("", "", ""));
    fs::resize_file(file, std::uintmax_t{100} << 20U);
    EXPECT_EQ(texts(), texts("", "", ""));
    std::string whole = "<plist version=\"1.0\"><dict><key>Name</key><string>n</string></dict></plist>";
    whole.resize(Workflow::informationMaximumSize, ' ');
    root.write(std::string(shared) + "/A/Contents/Info.plist", whole);
    EXPECT_EQ(texts(), texts("n", "", ""));
    root.write(std::string(shared) + "/A/Contents/Info.plist", whole + ' ');
    EXPECT_EQ(texts(), texts("", "", "")) << "one byte more";
}

TEST_F(Workflows, AnInformationFileThatIsCutAnywhereCountsAsMissing) {
    addRow("W-1", "A");
    const std::string whole = "<plist version=\"1.0\"><dict><key>Name</key><string>n</string></dict></plist>";
    auto workflow = Workflow::initWithDictionary({{"uuid", "W-1"}, {"bundle_path", "A"}});
    for (std::size_t length = 0; length < whole.size(); ++length) {
        root.write(std::string(shared) + "/A/Contents/Info.plist", whole.substr(0, length));
        EXPECT_FALSE(workflow->uncachedInfoDictionary()) << length;
    }
    root.write(std::string(shared) + "/A/Contents/Info.plist", whole);
    EXPECT_TRUE(workflow->uncachedInfoDictionary()) << "it is read afresh";
}

TEST_F(Workflows, BinaryInformationFileIsReadAndCountsAsMissingIfItIsCutAnywhere) {
    using namespace std::string_literals;
    const std::string whole =
        "bplist00"
        "\xD1\x01\x02"
        "\x54Name"
        "\x51n"
        "\x08\x0B\x10"
        "\0\0\0\0\0\0\x01\x01"
        "\0\0\0\0\0\0\0\x03"
        "\0\0\0\0\0\0\0\0"
        "\0\0\0\0\0\0\0\x12"s;
    auto workflow = Workflow::initWithDictionary({{"uuid", "W-1"}, {"bundle_path", "A"}});
    for (std::size_t length = 0; length < whole.size(); ++length) {
        root.write(std::string(shared) + "/A/Contents/Info.plist", whole.substr(0, length));
        EXPECT_FALSE(workflow->uncachedInfoDictionary()) << length;
    }
    root.write(std::string(shared) + "/A/Contents/Info.plist", whole);
    EXPECT_EQ(workflow->uncachedInfoDictionary(), (Dictionary{{"Name", "n"}}));
}

TEST_F(Workflows, InformationThatIsNotADictionaryCountsAsMissing) {
    addRow("W-1", "A");
    root.write(std::string(shared) + "/A/Contents/Info.plist",
               "<plist version=\"1.0\"><array><string>Name</string></array></plist>");
    EXPECT_EQ(texts(), texts("", "", ""));
}

TEST_F(Workflows, TableThatIsAPipeOrADirectoryIsNotWaitedFor) {
    addRow("W-1", "A");
    writeInformation("A", "<key>Name</key><string>n</string>");
    fs::create_directories(root.path(std::string(shared) + "/A/de.lproj"));
    ASSERT_EQ(::mkfifo(root.path(std::string(shared) + "/A/de.lproj/InfoPlist.strings").c_str(), 0600), 0);
    fs::create_directories(root.path(std::string(shared) + "/A/fr.lproj/InfoPlist.strings"));
    EXPECT_EQ(texts({"de"}), texts("n", "", ""));
    EXPECT_EQ(texts({"fr"}), texts("n", "", ""));
}

TEST_F(Workflows, ListingWithoutADatabaseHasOnlyTheStatusAndCreatesNoFile) {
    fs::remove(root.path(database));
    const Dictionary answer = handler.getWorkflowsWithRequest({}).dictionary();
    EXPECT_EQ(answer.size(), 1U);
    EXPECT_NE(answer.get("readStatus"), Value(0));
    EXPECT_FALSE(fs::exists(root.path(database)));
}

TEST_F(Workflows, AFailedListingHasOnlyTheStatus) {
    root.sql(database, "drop table workflows");
    EXPECT_EQ(handler.getWorkflowsWithRequest({}).dictionary(), (Dictionary{{"readStatus", 1}}));
}

TEST_F(Workflows, ChangesSwitchAccessControlAndRunTheToolForTheList) {
    addRow("W-1", "A");
    const Array changes{Value(Dictionary{
        {"_id_", "W-1"},
        {"access_control_enabled", false},
        {"allowedUsersAndGroups", Array{Value(Dictionary{{"type", "user"}, {"shortName", "a"}, {"_newid_", true}})}}})};
    EXPECT_EQ(handler.setWorkflowACLWithRequest(&changes).kind(), adminhost::Response::Kind::nothing);
    EXPECT_EQ(root.sql(database, "select access_control_enabled from workflows"), "f\n");
    EXPECT_THAT(calls(), ElementsAre("--add_access --resource_type workflow --resource_uuid W-1 --record_type user "
                                     "--shortname a "));
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(Workflows, ChangesAreAppliedInOrderAndEntriesThatCannotBeUsedAreSkipped) {
    addRow("W-1", "A");
    addRow("W-2", "B");
    const adminhost::test::RecordedStatements statements(root);
    const Array changes{Value("no dictionary"), Value(Dictionary{{"access_control_enabled", true}}),
                        Value(Dictionary{{"_id_", "W-2"}, {"access_control_enabled", true}, {"_obsoleteid_", true}}),
                        Value(Dictionary{{"_id_", "W-1"}, {"access_control_enabled", 0}, {"name", "other"}})};
    handler.setWorkflowACLWithRequest(&changes);
    EXPECT_THAT(statements.take(), ElementsAre("update workflows set access_control_enabled=\"t\" where uuid=\"W-2\"",
                                               "update workflows set access_control_enabled=\"f\" where uuid=\"W-1\""))
        << "workflows are neither created nor removed here";
    EXPECT_THAT(calls(), IsEmpty());
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(Workflows, AnEmptyAccessListChangesOnlyTheSwitch) {
    addRow("W-1", "A");
    const Array changes{
        Value(Dictionary{{"_id_", "W-1"}, {"access_control_enabled", "0"}, {"allowedUsersAndGroups", Array{}}})};
    handler.setWorkflowACLWithRequest(&changes);
    EXPECT_EQ(root.sql(database, "select access_control_enabled from workflows"), "f\n");
    EXPECT_THAT(calls(), IsEmpty());
    EXPECT_EQ(handler.setWorkflowACLWithRequest(nullptr).kind(), adminhost::Response::Kind::nothing);
}

}  // namespace
}  // namespace lumio
