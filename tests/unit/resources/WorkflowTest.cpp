#include "resources/Workflow.h"
#include "tests/unit/resources/AccessListsFixture.h"

#include <filesystem>
#include <thread>

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
    std::string whole = "<plist version=\"1.0\"><dict><key>Name</key><string>n</string></dict></plist>";
    whole.resize(Workflow::informationMaximumSize, ' ');
    root.write(std::string(shared) + "/A/Contents/Info.plist", whole);
    EXPECT_EQ(texts(), texts("n", "", ""));
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
