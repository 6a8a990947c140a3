// The verbs that change one thing, each checked in the service's own files and database.

#include "tests/system/apply/ControlledService.h"

namespace adminhost::test {
namespace {

using testing::ContainsRegex;
using testing::HasSubstr;
using testing::Not;

using ChangeVerbs = ControlledService;

TEST_F(ChangeVerbs, SettingIsConvertedWrittenAndReadBack) {
    const ProgramResult set = ctl({"settings", "set", "server_port", "8180"});
    EXPECT_EQ(set.status, 0);
    EXPECT_EQ(set.output, "settings.server_port: 8170 -> 8180: applied\n");
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8180\n");
    EXPECT_THAT(read(root.memberPreferencesPath()), HasSubstr("<integer>8180</integer>"));
}

TEST_F(ChangeVerbs, SettingThatHasItsValueAlreadyIsNotWrittenAgain) {
    EXPECT_EQ(ctl({"settings", "set", "server_port", "8170"}).output, "no change\n");
    EXPECT_EQ(ctl({"history"}).output, "No change has been recorded yet.\n");
}

TEST_F(ChangeVerbs, SettingThatNeedsARestartIsFollowedByANote) {
    EXPECT_THAT(ctl({"settings", "set", "nimbo_client_username", "other"}).output, HasSubstr("has to be restarted"));
    EXPECT_THAT(ctl({"settings", "set", "server_host", "other"}).output, Not(HasSubstr("restarted")));
}

TEST_F(ChangeVerbs, ControllerNameThatNobodyAnswersToIsStoredAndSaidSo) {
    const ProgramResult set = ctl({"settings", "set", "nimbo_controller", "nobodyhere"});
    EXPECT_EQ(set.status, 0);
    EXPECT_THAT(set.output, HasSubstr("\"grid1.example.org\" -> \"nobodyhere\""));
    EXPECT_THAT(set.output, HasSubstr("not found on the local network"));
}

TEST_F(ChangeVerbs, UnknownSettingsWrongTypesAndReadOnlyOnesAreUsageErrors) {
    for (const auto& [key, value, text] : {std::tuple{"no_such", "1", "not a setting that can be written: no_such"},
                                           {"server_port", "x", "not a whole number"},
                                           {"web_app_url", "x", "not a setting that can be written: web_app_url"},
                                           {"cameras", "x", "not a setting that can be written: cameras"},
                                           {"nimbo_controller_resolve_name", "yes", "not a setting"}}) {
        const ProgramResult set = ctl({"settings", "set", key, value});
        EXPECT_EQ(set.status, 2) << key;
        EXPECT_THAT(set.output, HasSubstr(text));
    }
    EXPECT_EQ(ctl({"settings", "get", "no_such"}).status, 2);
    EXPECT_EQ(ctl({"history"}).output, "No change has been recorded yet.\n");
}

TEST_F(ChangeVerbs, GridPasswordComesFromAFileOnlyAndIsShownNowhere) {
    EXPECT_EQ(ctl({"settings", "set", "nimbo_client_password", "planted-password"}).status, 2);
    EXPECT_EQ(ctl({"settings", "get", "nimbo_client_password"}).status, 2);
    const std::string before = read(root.clusterPreferencesPath());
    const ProgramResult set =
        ctl({"settings", "set", "nimbo_client_password", "@" + file("password", "planted-password\n")});
    EXPECT_EQ(set.status, 0);
    EXPECT_EQ(set.output, "settings.nimbo_client_password: (secret) -> (secret): applied\n");
    const std::string after = read(root.clusterPreferencesPath());
    EXPECT_NE(after, before);
    EXPECT_THAT(after, Not(HasSubstr("planted-password")));
    for (const std::string& empty : {"@" + file("empty", ""), std::string("@/dev/null"), "@" + file("line", "\n")}) {
        const ProgramResult refused = ctl({"settings", "set", "nimbo_client_password", empty});
        EXPECT_EQ(refused.status, 2) << empty;
        EXPECT_THAT(refused.output, HasSubstr("the value is empty; use --clear"));
    }
    EXPECT_EQ(ctl({"writeSettings", "configuration.nimbo_client_password@/dev/null"}).status, 2);
    EXPECT_EQ(ctl({"apply", file("nothing.toml", ""), "--password-file", "/dev/null"}).status, 2);
    EXPECT_EQ(read(root.clusterPreferencesPath()), after) << "the stored password is untouched";
    EXPECT_EQ(ctl({"settings", "set", "nimbo_client_password", "--clear"}).output,
              "settings.nimbo_client_password: (secret) -> (not set): applied\n");
    EXPECT_EQ(ctl({"settings", "get", "nimbo_client_password_is_set"}).output, "no\n");
}

TEST_F(ChangeVerbs, PasswordThatCannotBeProtectedIsNamedWithTheServicesLogLines) {
    root.write("/Library/SorvaneProducer/Shared/Server/Secrets/kek.plist", "no property list");
    const ProgramResult set = ctl({"settings", "set", "nimbo_client_password", "@" + file("password", "new")});
    EXPECT_EQ(set.status, 1);
    EXPECT_THAT(
        set.output,
        HasSubstr("settings.nimbo_client_password: (not set) -> (secret): FAILED: not written: the password cannot"));
    EXPECT_THAT(set.output, HasSubstr("nimbo_client_password encryption failed"));
}

TEST_F(ChangeVerbs, PropertyIsAddedChangedAndRemoved) {
    EXPECT_EQ(ctl({"property", "set", "colour", "blue"}).output,
              "properties.colour: (not present) -> \"blue\": applied\n");
    EXPECT_EQ(ctl({"property", "set", "colour", "red"}).output,
              "properties.colour.value: \"blue\" -> \"red\": applied\n");
    EXPECT_EQ(root.sql("select value, protect from properties where name='colour'"), "red|f\n");
    EXPECT_EQ(ctl({"property", "set", "colour", "red"}).output, "no change\n");
    EXPECT_EQ(ctl({"property", "remove", "colour"}).output, "properties.colour: \"red\" -> (removed): applied\n");
    EXPECT_EQ(root.sql("select count(*) from properties where name='colour'"), "0\n");
    EXPECT_EQ(ctl({"property", "remove", "colour"}).status, 2);
}

TEST_F(ChangeVerbs, ProtectedPropertyIsEncryptedOnceAndItsValueNeverShown) {
    const std::string row = "select value, protect from properties where name='token'";
    const ProgramResult added = ctl({"property", "set", "token", "@" + file("token", "planted-token\n"), "--protect"});
    EXPECT_EQ(added.output, "properties.token: (not present) -> (secret): applied\n");
    EXPECT_THAT(root.sql(row), testing::EndsWith("|t\n"));
    EXPECT_THAT(root.sql(row), Not(HasSubstr("planted-token")));
    EXPECT_EQ(ctl({"property", "set", "token", "other"}).status, 2) << "a secret on the command line";
    EXPECT_EQ(ctl({"property", "set", "token", "--protect", "@" + file("token", "second")}).output,
              "properties.token.value: (secret) -> (secret): applied\n");
    // Remove the protection: the plain text shows that it was encrypted only once.
    EXPECT_EQ(ctl({"property", "set", "token", "--no-protect"}).output,
              "properties.token.protect: yes -> no: applied\n");
    EXPECT_EQ(root.sql(row), "second|f\n");
    EXPECT_EQ(ctl({"property", "set", "token", "--protect"}).output, "properties.token.protect: no -> yes: applied\n");
    EXPECT_THAT(root.sql(row), Not(HasSubstr("second")));
}

TEST_F(ChangeVerbs, ProtectedValueThatCannotBeWrittenIsNamed) {
    root.write("/Library/SorvaneProducer/Shared/Server/Secrets/kek.plist", "no property list");
    const ProgramResult set = ctl({"property", "set", "upload_token", "@" + file("token", "planted-token")});
    EXPECT_EQ(set.status, 1);
    EXPECT_THAT(set.output, HasSubstr("properties.upload_token.value: (secret) -> (secret): FAILED: "));
    EXPECT_THAT(set.output, HasSubstr("could not update property with id"));
    EXPECT_THAT(set.output, Not(HasSubstr("planted-token")));
    const ProgramResult plain = ctl({"property", "set", "upload_token", "--no-protect"});
    EXPECT_EQ(plain.status, 1) << "the flag is stored, but the value could not be deciphered";
    EXPECT_THAT(plain.output, HasSubstr("properties.upload_token.protect: yes -> no: FAILED: "));
}

TEST_F(ChangeVerbs, PropertyNameThatAStatementCannotCarryIsRefusedWithAdvice) {
    const std::string before = root.sql("select * from properties");
    const ProgramResult set = ctl({"property", "set", "a\"b", "x"});
    EXPECT_EQ(set.status, 1);
    EXPECT_THAT(set.output, HasSubstr("configuration.properties.0.name"));
    EXPECT_EQ(root.sql("select * from properties"), before);
}

TEST_F(ChangeVerbs, UsersAndGroupsComeOnAndOffACamerasList) {
    EXPECT_EQ(ctl({"camera", "allow", "Main hall", "ben"}).output,
              "cameras.\"Main hall\".users.ben: (not allowed) -> (allowed): applied\n");
    EXPECT_EQ(ctl({"camera", "allow", "Main hall", "studio", "--group"}).status, 0);
    EXPECT_EQ(ctl({"camera", "deny", "Main hall", "anna", "lecturers"}).output,
              "cameras.\"Main hall\".users.anna: (allowed) -> (not allowed): applied\n"
              "cameras.\"Main hall\".groups.lecturers: (allowed) -> (not allowed): applied\n");
    const std::string shown = ctl({"camera", "show", "Main hall"}).output;
    EXPECT_THAT(shown, HasSubstr("Ben Okafor (user), studio (group)"));
    EXPECT_EQ(ctl({"camera", "allow", "Main hall", "ben"}).output, "no change\n");
}

TEST_F(ChangeVerbs, AccessIsSwitchedByNameAndByUuid) {
    EXPECT_EQ(ctl({"camera", "access", "Main hall", "off"}).status, 0);
    EXPECT_EQ(root.sql("select access_control_enabled from cameras where name='Main hall'"), "f\n");
    EXPECT_EQ(ctl({"camera", "access", SampleRoot::uuidOf("camera", "Main hall"), "on"}).status, 0);
    EXPECT_EQ(root.sql("select access_control_enabled from cameras where name='Main hall'"), "t\n");
    EXPECT_EQ(ctl({"camera", "access", "No such camera", "on"}).status, 2);
    EXPECT_EQ(ctl({"camera", "access", "Main hall", "perhaps"}).status, 2);
}

TEST_F(ChangeVerbs, NameOfSeveralCamerasIsRefusedWithTheirUuids) {
    root.sql("update cameras set name='Main hall' where name='Studio A'");
    const ProgramResult access = ctl({"camera", "access", "Main hall", "off"});
    EXPECT_EQ(access.status, 2);
    EXPECT_THAT(access.output, HasSubstr(SampleRoot::uuidOf("camera", "Main hall")));
    EXPECT_THAT(access.output, HasSubstr(SampleRoot::uuidOf("camera", "Studio A")));
}

TEST_F(ChangeVerbs, CameraIsRemoved) {
    EXPECT_EQ(ctl({"camera", "remove", "Studio A"}).status, 0);
    EXPECT_EQ(root.sql("select count(*) from cameras where name='Studio A'"), "0\n");
    EXPECT_EQ(ctl({"camera", "remove", "Studio A"}).status, 2);
}

TEST_F(ChangeVerbs, ConfigurationToolThatFailsIsToldByTheReadBack) {
    root.setSwitch("lumioconfig.exit", "3");
    const ProgramResult allow = ctl({"camera", "allow", "Main hall", "ben"});
    EXPECT_EQ(allow.status, 1);
    EXPECT_THAT(allow.output, HasSubstr("cameras.\"Main hall\".users.ben: (not allowed) -> (allowed): FAILED: "));
    const ProgramResult removal = ctl({"camera", "remove", "Studio A"});
    EXPECT_EQ(removal.status, 1);
    EXPECT_THAT(removal.output, HasSubstr("cameras.\"Studio A\": (present) -> (removed): FAILED: "));
    EXPECT_THAT(removal.output, HasSubstr("could not delete camera with uuid"));
}

TEST_F(ChangeVerbs, SettingsFileThatCannotBeWrittenIsNamedWithItsReason) {
    root.setSwitch("setup_library.exit", "7");
    const ProgramResult set = ctl({"settings", "set", "server_port", "8180"});
    EXPECT_EQ(set.status, 1);
    EXPECT_THAT(set.output, HasSubstr("writeStatus is 7"));
    EXPECT_THAT(set.output, HasSubstr("settings.server_port: 8170 -> 8180: FAILED: "));
}

TEST_F(ChangeVerbs, HistoryShowsAChangedPasswordAndEditsMadeOutsideTheDaemon) {
    ASSERT_EQ(ctl({"settings", "set", "nimbo_client_password", "@" + file("password", "another\n")}).status, 0);
    ASSERT_EQ(ctl({"settings", "set", "sorvane_capture_web_enabled", "off"}).status, 0);
    std::string outside = read(root.memberPreferencesPath());
    const std::size_t at = outside.find("<integer>8170</integer>");
    ASSERT_NE(at, std::string::npos);
    outside.replace(at, 23, "<integer>4242</integer>");
    std::ofstream(root.memberPreferencesPath()) << outside;
    ASSERT_EQ(ctl({"settings", "set", "tunnel_timeout_seconds", "31"}).status, 0);
    const std::string history = ctl({"history"}).output;
    EXPECT_THAT(history, ContainsRegex("1 .* nimbo_client_password: \\(secret\\) changed\n"));
    EXPECT_THAT(history, ContainsRegex("2 .* sorvane_capture_web_enabled: yes -> no\n"));
    EXPECT_THAT(history, ContainsRegex("3 .* outside the daemon  server_port: 8170 -> 4242\n"));
    EXPECT_THAT(history, ContainsRegex("4 .* tunnel_timeout_seconds: 30 s -> 31 s\n"));
}

TEST_F(ChangeVerbs, RejectedRequestNamesEachFindingOnce) {
    const ProgramResult set = ctl({"settings", "set", "shared_filesystem", "relative/path"});
    EXPECT_EQ(set.status, 1);
    EXPECT_EQ(set.output,
              "adminhostctl: the request was rejected, and nothing was changed (REQUEST_REFUSED):\n"
              "  configuration.shared_filesystem: must be an absolute path: the service and its tools do not share a "
              "current directory (begin it with a slash)\n");
}

TEST_F(ChangeVerbs, FurtherLinesOfAToolsWordsAreIndented) {
    root.setSwitch("lumioconfig.error", "locked\nadminhostctl: done\n");
    root.setSwitch("lumioconfig.exit", "3");
    const ProgramResult allow = ctl({"camera", "allow", "Roof", "ben"});
    EXPECT_EQ(allow.status, 1);
    EXPECT_THAT(allow.output, HasSubstr("locked\n    adminhostctl: done)\n"));
}

}  // namespace
}  // namespace adminhost::test
