#include "handler/LumioRequestHandler.h"
#include "platform/framework/Report.h"
#include "tests/support/ServiceTables.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>
#include <functional>
#include <utility>

#include <gtest/gtest.h>

namespace lumio {
namespace {

using adminhost::Dictionary;
using adminhost::Response;
using adminhost::Value;

constexpr std::string_view script = "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_preferences";
constexpr std::string_view database = "/shared/Server/db.sqlite3";

class ReadSettings : public testing::Test {
  protected:
    void SetUp() override { root.writeTool(script, "#!/bin/sh\nexit 0\n"); }

    void writeSettings() const {
        root.writePropertyList("/Library/Preferences/com.brenn.lumioserverd.plist",
                               "<key>shared_filesystem</key><string>/shared</string>"
                               "<key>member_uuid</key><string>M</string><key>private</key><true/>");
        root.writePropertyList(
            "/shared/lumioserverd.plist",
            "<key>library_version</key><integer>7</integer><key>server_uuid</key><string>S</string>");
        writeMember("<key>server_host</key><string>mediahost</string><key>server_port</key><string>8170</string>");
        root.writePropertyList("/shared/Server/cluster_preferences.plist",
                               "<key>nimbo_controller</key><string>grid.example</string><key>unknown</key><true/>");
    }
    void writeMember(std::string_view content) const {
        root.writePropertyList("/shared/Server/member_preferences_M.plist", content);
    }
    void writeDatabase() const {
        root.sql(database, adminhost::test::serviceTables +
                               "insert into cameras(name,uuid,recording_status) values('Aula','C-1','offline');"
                               "insert into workflows(uuid,bundle_path,disabled) values('W-1','Lecture.bundle','f');"
                               "insert into properties(name,value,protect) values('n','left','f');");
    }
    [[nodiscard]] static std::vector<std::string> keysOf(const Dictionary& dictionary) {
        std::vector<std::string> keys;
        for (const auto& entry : dictionary) {
            keys.push_back(entry.key);
        }
        return keys;
    }
    Dictionary read(std::optional<std::string_view> variant = std::nullopt) {
        Dictionary request;
        if (variant) {
            request.set("optionalArguments", Dictionary{{"variant", *variant}});
        }
        response = handler.readSettingsWithRequest(request);
        EXPECT_EQ(response.kind(), Response::Kind::dictionary);
        const Dictionary* config = response.dictionary().get("configuration").dictionary();
        return config == nullptr ? Dictionary{} : *config;
    }
    [[nodiscard]] std::string catalogFor(std::string_view port) {
        writeMember("<key>server_host</key><string>h</string><key>server_port</key>" + std::string(port));
        return *read("getConfig").get("catalog_url").string();
    }

    adminhost::test::TemporaryRoot root;
    LumioRequestHandler handler;
    Response response;
};

/// Calls a function when an operation is about to read.
class AtReading final : public adminhost::ReportSink {
  public:
    explicit AtReading(std::function<void()> function) : _function(std::move(function)) {
        adminhost::setReportSink(this);
    }
    AtReading(const AtReading&) = delete;
    AtReading& operator=(const AtReading&) = delete;
    ~AtReading() { adminhost::setReportSink(nullptr); }

    void changed(adminhost::Change) override {}
    void becomesSecret(const adminhost::SecretPart&) override {}
    void notDone(adminhost::NotDone) override {}
    void readingBegins() override { _function(); }

  private:
    std::function<void()> _function;
};

TEST_F(ReadSettings, IsAnnouncedAfterTheSetupScriptAndBeforeAnythingIsRead) {
    writeSettings();
    writeDatabase();
    root.writeTool(script, "#!/bin/sh\ntouch '" + root.path("/prepared").string() + "'\n");
    int announced = 0;
    const AtReading sink([&] {
        ++announced;
        EXPECT_TRUE(std::filesystem::exists(root.path("/prepared")));
        writeMember("<key>server_host</key><string>later</string>");
        root.sql(database, "update cameras set name='Later'");
    });
    const Dictionary config = read();
    EXPECT_EQ(announced, 1);
    EXPECT_EQ(config.get("server_host"), Value("later"));
    EXPECT_EQ(config.at("cameras").array()->at(0).dictionary()->get("name"), Value("Later"));
}

TEST_F(ReadSettings, WithoutSettingsFilesAndDatabaseAnswersOnlyTheDefaultSharedFilesystem) {
    EXPECT_EQ(read(), (Dictionary{{"default_shared_filesystem", "/Library/SorvaneProducer/Shared"}}));
    EXPECT_EQ(response.dictionary().get("readStatus"), Value(0));
    EXPECT_EQ(response.dictionary().size(), 2U);
}

TEST_F(ReadSettings, ReadStatusIsThePreferencesScriptsStatusAndTheConfigurationIsGatheredAllTheSame) {
    writeSettings();
    root.writeTool(script, "#!/bin/sh\nexit 9\n");
    EXPECT_EQ(read().get("member_uuid"), Value("M"));
    EXPECT_EQ(response.dictionary().get("readStatus"), Value(9));
}

TEST_F(ReadSettings, ScriptThatIsMissingIsAStatusOfMinusOne) {
    std::filesystem::remove(root.path(script));
    (void)read();
    EXPECT_EQ(response.dictionary().get("readStatus"), Value(-1));
}

TEST_F(ReadSettings, ScriptRunsBeforeAnythingIsGatheredAlsoForANarrowedRead) {
    root.writeTool(script, "#!/bin/sh\necho run >> " + root.path("/runs").string() + "\n");
    (void)read();
    (void)read("getCameras");
    (void)read("nonsense");
    EXPECT_EQ(root.read("/runs"), "run\nrun\nrun\n");
}

TEST_F(ReadSettings, SettingsThatTheScriptWritesAreSeenByTheSameRead) {
    writeSettings();
    std::filesystem::rename(root.path("/Library/Preferences/com.brenn.lumioserverd.plist"), root.path("/saved.plist"));
    root.writeTool(script, "#!/bin/sh\nmv " + root.path("/saved.plist").string() + " " +
                               root.path("/Library/Preferences/com.brenn.lumioserverd.plist").string() + "\n");
    EXPECT_EQ(read().get("member_uuid"), Value("M"));
}

TEST_F(ReadSettings, CopiesTheKeysOfTheTablesAndNoOthersInTheirOrder) {
    writeSettings();
    const Dictionary config = read("getConfig");
    std::vector<std::string> keys;
    for (const auto& entry : config) {
        if (entry.key != "nimbo_client_password_is_set") {
            keys.push_back(entry.key);
        }
    }
    EXPECT_EQ(keys, (std::vector<std::string>{"default_shared_filesystem", "member_uuid", "shared_filesystem",
                                              "nimbo_controller", "server_host", "server_port", "web_app_url",
                                              "catalog_url", "library_version", "server_uuid"}));
    EXPECT_EQ(config.get("library_version"), Value(7));
}

TEST_F(ReadSettings, DefaultSharedFilesystemIsTheDefaultWhateverTheSettingsSay) {
    writeSettings();
    for (const auto variant : {std::optional<std::string_view>(), std::optional<std::string_view>("getConfig")}) {
        EXPECT_EQ(read(variant).get("default_shared_filesystem"), Value("/Library/SorvaneProducer/Shared"));
        EXPECT_EQ(read(variant).get("shared_filesystem"), Value("/shared"));
    }
}

TEST_F(ReadSettings, IdentityValueThatIsNotATextNamesThePlaceByItsTextForm) {
    root.writePropertyList("/Library/Preferences/com.brenn.lumioserverd.plist",
                           "<key>shared_filesystem</key><string>/shared</string><key>member_uuid</key>"
                           "<integer>7</integer>");
    root.writePropertyList("/shared/Server/member_preferences_7.plist", "<key>server_host</key><string>h</string>");
    const Dictionary config = read("getConfig");
    EXPECT_EQ(config.get("member_uuid"), Value(7)) << "copied with its type";
    EXPECT_EQ(config.get("server_host"), Value("h"));
}

TEST_F(ReadSettings, EmptyIdentityValuesAreValuesAndNotMissingOnes) {
    root.writePropertyList("/Library/Preferences/com.brenn.lumioserverd.plist",
                           "<key>shared_filesystem</key><string></string><key>member_uuid</key><string></string>");
    root.writePropertyList("/Server/member_preferences_.plist", "<key>server_host</key><string>h</string>");
    const Dictionary config = read("getConfig");
    EXPECT_EQ(config.get("shared_filesystem"), Value(""));
    EXPECT_EQ(config.get("member_uuid"), Value(""));
    EXPECT_EQ(config.get("server_host"), Value("h"));
}

TEST_F(ReadSettings, KeyThatTheFileLacksIsAbsent) {
    writeSettings();
    EXPECT_FALSE(read().contains("tunnel_agent_host"));
}

TEST_F(ReadSettings, UrlsAreBuiltFromHostAndPortTexts) {
    writeSettings();
    const Dictionary config = read();
    EXPECT_EQ(config.get("web_app_url"), Value("https://mediahost:8170/sorvaneproducer/capture"));
    EXPECT_EQ(config.get("catalog_url"), Value("http://mediahost:8171/sorvaneproducer/catalogs"));
}

TEST_F(ReadSettings, UrlsNeedBothHostAndPort) {
    writeSettings();
    writeMember("<key>server_host</key><string>h</string>");
    EXPECT_FALSE(read().contains("web_app_url"));
    writeMember("<key>server_port</key><integer>1</integer>");
    EXPECT_FALSE(read().contains("catalog_url"));
}

TEST_F(ReadSettings, PortThatIsNotNumericGivesACatalogPortOfOne) {
    writeSettings();
    EXPECT_EQ(catalogFor("<string>http</string>"), "http://h:1/sorvaneproducer/catalogs");
}

TEST_F(ReadSettings, CatalogPortReadsEveryKindOfPort) {
    writeSettings();
    EXPECT_EQ(catalogFor("<integer>8170</integer>"), "http://h:8171/sorvaneproducer/catalogs");
    EXPECT_EQ(catalogFor("<string> \t+80x</string>"), "http://h:81/sorvaneproducer/catalogs");
    EXPECT_EQ(catalogFor("<string>-5</string>"), "http://h:-4/sorvaneproducer/catalogs");
    EXPECT_EQ(catalogFor("<real>80.9</real>"), "http://h:81/sorvaneproducer/catalogs");
    EXPECT_EQ(catalogFor("<true/>"), "http://h:2/sorvaneproducer/catalogs");
    EXPECT_EQ(catalogFor("<array/>"), "http://h:1/sorvaneproducer/catalogs");
}

TEST_F(ReadSettings, CatalogPortIsClampedTo32BitsAndWraps) {
    writeSettings();
    const std::string wrapped = "http://h:-2147483648/sorvaneproducer/catalogs";
    EXPECT_EQ(catalogFor("<string>2147483647</string>"), wrapped);
    EXPECT_EQ(catalogFor("<string>99999999999999999999</string>"), wrapped);
    EXPECT_EQ(catalogFor("<integer>18446744073709551615</integer>"), wrapped);
    EXPECT_EQ(catalogFor("<real>1e300</real>"), wrapped);
    EXPECT_EQ(catalogFor("<string>-99999999999999999999</string>"), "http://h:-2147483647/sorvaneproducer/catalogs");
    EXPECT_EQ(catalogFor("<real>nan</real>"), "http://h:1/sorvaneproducer/catalogs");
}

TEST_F(ReadSettings, PortWithLeadingZerosIsDecimalAndHexadecimalDigitsEndIt) {
    writeSettings();
    EXPECT_EQ(catalogFor("<string>010</string>"), "http://h:11/sorvaneproducer/catalogs");
    EXPECT_EQ(catalogFor("<string>0x10</string>"), "http://h:1/sorvaneproducer/catalogs");
}

TEST_F(ReadSettings, WebAddressShowsTheTextOfAPortUnchanged) {
    writeSettings();
    for (const char* port : {"010", "0x10", " 8170x", "http", ""}) {
        writeMember("<key>server_host</key><string>h</string><key>server_port</key><string>" + std::string(port) +
                    "</string>");
        EXPECT_EQ(read().get("web_app_url"), Value("https://h:" + std::string(port) + "/sorvaneproducer/capture"));
    }
}

TEST_F(ReadSettings, WebAddressShowsTheNumberOfAPort) {
    writeSettings();
    writeMember("<key>server_host</key><string>h</string><key>server_port</key><integer>443</integer>");
    EXPECT_EQ(read().get("web_app_url"), Value("https://h:443/sorvaneproducer/capture"));
}

TEST_F(ReadSettings, WithoutVariantAddsSettingsAndCameras) {
    writeSettings();
    writeDatabase();
    const Dictionary config = read();
    EXPECT_TRUE(config.contains("member_uuid"));
    ASSERT_NE(config.get("cameras").array(), nullptr);
    EXPECT_EQ(config.get("cameras").array()->size(), 1U);
}

TEST_F(ReadSettings, VariantGetCamerasAnswersOnlyTheCameras) {
    writeSettings();
    writeDatabase();
    const Dictionary config = read("getCameras");
    EXPECT_EQ(config.size(), 2U);
    EXPECT_TRUE(config.contains("cameras"));
    EXPECT_TRUE(config.contains("default_shared_filesystem"));
}

TEST_F(ReadSettings, EmptyListingIsAnEmptyListAndNotAMissingKey) {
    writeSettings();
    writeDatabase();
    root.sql(database, "delete from cameras; delete from properties;");
    const Dictionary config = read();
    EXPECT_EQ(config.get("cameras"), Value(adminhost::Array{}));
    EXPECT_EQ(config.get("properties"), Value(adminhost::Array{}));
    EXPECT_EQ(keysOf(read("getCameras")), (std::vector<std::string>{"default_shared_filesystem", "cameras"}));
}

TEST_F(ReadSettings, DescriptionThatIsNotATextIsShownAsItStands) {
    writeSettings();
    writeDatabase();
    root.write(
        "/System/Library/SorvaneProducer/SorvaneProducerServerLocalizations.bundle/Contents/Resources/en.lproj/"
        "PropertyDescriptions.strings",
        "n = (one, two);");
    const Dictionary config = read("getProperties");
    ASSERT_EQ(config.get("properties").array()->size(), 1U);
    EXPECT_EQ(config.get("properties").array()->front().dictionary()->get("description"),
              Value(adminhost::Array{"one", "two"}));
}

TEST_F(ReadSettings, VariantGetConfigHasNeitherCamerasNorWorkflows) {
    writeSettings();
    writeDatabase();
    const Dictionary config = read("getConfig");
    EXPECT_TRUE(config.contains("member_uuid"));
    EXPECT_TRUE(config.contains("properties"));
    EXPECT_FALSE(config.contains("cameras"));
    EXPECT_FALSE(config.contains("workflows"));
}

TEST_F(ReadSettings, EachVariantAnswersItsSections) {
    writeSettings();
    writeDatabase();
    struct Row {
        std::optional<std::string_view> variant;
        bool settings;
        bool cameras;
        bool workflows;
        bool properties;
    };
    for (const Row& row : {Row{std::nullopt, true, true, true, true}, Row{"getConfig", true, false, false, true},
                           Row{"getCameras", false, true, false, false}, Row{"getWorkflows", false, false, true, false},
                           Row{"getProperties", false, false, false, true}, Row{"other", false, false, false, false}}) {
        const Dictionary config = read(row.variant);
        const std::string_view name = row.variant.value_or("(none)");
        for (const char* setting : {"member_uuid", "server_host", "nimbo_controller", "library_version"}) {
            EXPECT_EQ(config.contains(setting), row.settings) << name << ' ' << setting;
        }
        EXPECT_EQ(config.contains("cameras"), row.cameras) << name;
        EXPECT_EQ(config.contains("workflows"), row.workflows) << name;
        EXPECT_EQ(config.contains("properties"), row.properties) << name;
        EXPECT_TRUE(config.contains("default_shared_filesystem")) << name;
    }
    EXPECT_EQ(read("getWorkflows").get("workflows").array()->front().dictionary()->get("_id_"), Value("W-1"));
}

TEST_F(ReadSettings, VariantsAreExactAndCaseSensitive) {
    writeSettings();
    writeDatabase();
    EXPECT_EQ(read("getcameras").size(), 1U);
    EXPECT_EQ(read("").size(), 1U);
    EXPECT_EQ(read("getConfig ").size(), 1U);
}

TEST_F(ReadSettings, VariantThatIsNoTextAnswersNothingBeyondTheDefault) {
    writeSettings();
    response = handler.readSettingsWithRequest(Dictionary{{"optionalArguments", Dictionary{{"variant", 1}}}});
    EXPECT_EQ(response.dictionary().get("configuration").dictionary()->size(), 1U);
}

TEST_F(ReadSettings, OptionalArgumentsThatAreNoDictionaryReadAsNoVariant) {
    writeSettings();
    response = handler.readSettingsWithRequest(Dictionary{{"optionalArguments", "getCameras"}});
    EXPECT_TRUE(response.dictionary().get("configuration").dictionary()->contains("member_uuid"));
}

TEST_F(ReadSettings, WithoutDatabaseTheListVariantsAnswerOnlyTheDefaultAndMakeNoDatabaseFile) {
    writeSettings();
    root.writeTool(script, "#!/bin/sh\nexit 4\n");
    for (const char* variant : {"getCameras", "getWorkflows", "getProperties"}) {
        EXPECT_EQ(read(variant).size(), 1U) << variant;
        EXPECT_EQ(response.dictionary().get("readStatus"), Value(4));
    }
    (void)read();
    EXPECT_FALSE(std::filesystem::exists(root.path(database)));
}

TEST_F(ReadSettings, FailedListingAddsNothingAndDoesNotReachReadStatus) {
    writeSettings();
    root.write(database, "this is no database, but long enough to be looked at as one");
    const Dictionary config = read();
    EXPECT_FALSE(config.contains("cameras"));
    EXPECT_TRUE(config.contains("member_uuid"));
    EXPECT_EQ(response.dictionary().get("readStatus"), Value(0));
}

TEST_F(ReadSettings, SettingsFileThatCannotBeLoadedAddsNothing) {
    writeSettings();
    writeMember("<key>broken");
    const Dictionary config = read();
    EXPECT_FALSE(config.contains("server_host"));
    EXPECT_TRUE(config.contains("library_version"));
}

TEST_F(ReadSettings, KeyTablesAreAsTheFilesKnowThem) {
    using Keys = std::vector<std::string_view>;
    EXPECT_EQ(LumioRequestHandler::identityPreferencesKeysToCopy(), (Keys{"member_uuid", "shared_filesystem"}));
    EXPECT_EQ(LumioRequestHandler::libraryInformationKeysToCopy(), (Keys{"library_version", "server_uuid"}));
    EXPECT_EQ(LumioRequestHandler::memberPreferencesKeysToCopy(),
              (Keys{"server_host", "server_port", "sorvane_capture_web_enabled", "max_file_size_in_mb",
                    "upload_chunk_size_in_mb", "ssl_certificate_file", "ssl_certificate_key_file", "tunnel_agent_host",
                    "tunnel_agent_port", "tunnel_server_host", "tunnel_server_port", "tunnel_timeout_seconds"}));
    EXPECT_EQ(
        LumioRequestHandler::clusterPreferencesKeysToCopy(),
        (Keys{"agent_max_recording_minutes", "agent_unattended_recording_minutes", "http_auth_type",
              "camera_status_min_interval_seconds", "camera_watcher_check_interval_seconds",
              "camera_preview_cache_seconds", "agent_timeout_seconds", "nimbo_controller", "nimbo_job_cleanup_minutes",
              "submissions_groupname", "external_command_timeout_seconds", "nimbo_client_username", "nimbo_grid_id"}));
}

TEST_F(ReadSettings, CopyKeysReplacesWhatTheSourceHasAndLeavesTheRest) {
    Dictionary destination{{"a", 1}, {"b", 2}};
    LumioRequestHandler::copyKeys({"a", "b", "c"}, Dictionary{{"a", "new"}, {"c", 3}, {"d", 4}}, destination);
    EXPECT_EQ(destination, (Dictionary{{"a", "new"}, {"b", 2}, {"c", 3}}));
}

TEST_F(ReadSettings, SetupScriptThatLeavesADaemonHoldingItsPipesDoesNotHoldTheAnswer) {
    root.writeTool(script, "#!/bin/sh\nsleep 60 &\necho $! > " + root.path("/pid").string() + "\nexit 0\n");
    (void)read();
    EXPECT_EQ(response.dictionary().get("readStatus"), Value(0));
    const pid_t daemon = std::stoi(root.read("/pid"));
    EXPECT_EQ(::kill(daemon, 0), 0) << "the daemon lives on";
    ::kill(daemon, SIGKILL);
}

TEST(RequestHandler, RecycleServiceAnswersNothingWhateverTheVariant) {
    LumioRequestHandler handler;
    EXPECT_EQ(handler.recycleServiceWithVariant(nullptr).kind(), Response::Kind::nothing);
    EXPECT_EQ(handler.recycleServiceWithVariant("withDetails").kind(), Response::Kind::nothing);
    EXPECT_EQ(handler.recycleServiceWithVariant(Dictionary{{"a", 1}}).kind(), Response::Kind::nothing);
}

TEST(RequestHandler, ResourceDateKeysAreThree) {
    EXPECT_EQ(LumioRequestHandler::listOfResourceDateKeys(),
              (std::vector<std::string_view>{"updated_at", "created_at", "used_at"}));
}

}  // namespace
}  // namespace lumio
