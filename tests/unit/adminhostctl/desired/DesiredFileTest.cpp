#include "adminhostctl/Failure.h"
#include "adminhostctl/desired/DesiredFile.h"
#include "tests/unit/adminhostctl/Describe.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::ctl {
namespace {

using testing::AllOf;
using testing::ElementsAre;
using testing::EndsWith;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

const Description& writeSettings() {
    static const Description description = describe("writeSettings");
    return description;
}

State sample() {
    State state;
    state.settings = {{"default_shared_filesystem", "/Library/SorvaneProducer/Shared"},
                      {"shared_filesystem", "/shared"},
                      {"nimbo_client_password_is_set", true},
                      {"server_port", 8170},
                      {"sorvane_capture_web_enabled", true},
                      {"server_host", "a \"quoted\"\nhost"},
                      {"max_file_size_in_mb", 2.0},
                      {"web_app_url", "https://derived"}};
    state.properties = std::vector<ListedProperty>{
        {"3", "plain", "left", false}, {"4", "token", std::nullopt, true}, {"5", "empty", std::nullopt, false}};
    state.cameras = std::vector<ListedCamera>{
        {"AAAA-1",
         "Hall",
         true,
         {{"user", "ben", "U-2"}, {"user", "anna", "U-1"}, {"group", "staff", "G-1"}, {"user", "", "U-3"}}},
        {"AAAA-2", "Lab", false, {}}};
    return state;
}

std::string exported(const State& state) {
    return exportOf(state, writeSettings());
}
Wanted parse(std::string_view text, const State& state = sample()) {
    return parseDesired(text, "state.toml", writeSettings(), state);
}
std::string refused(std::string_view text, const State& state = sample()) {
    try {
        (void)parse(text, state);
    } catch (const Failure& failure) {
        EXPECT_EQ(failure.status(), ExitStatus::usage);
        return failure.what();
    }
    ADD_FAILURE() << "taken: " << text;
    return {};
}

TEST(Export, HoldsWritableSettingsPropertiesAndAccessListsInAFixedForm) {
    EXPECT_THAT(exported(sample()), EndsWith("[remove_unlisted]\n"
                                             "properties = false\n"
                                             "access = false\n"
                                             "\n"
                                             "[settings]\n"
                                             "shared_filesystem = \"/shared\"\n"
                                             "server_host = \"a \\\"quoted\\\"\\nhost\"\n"
                                             "server_port = 8170\n"
                                             "sorvane_capture_web_enabled = true\n"
                                             "max_file_size_in_mb = 2.0\n"
                                             "\n"
                                             "[properties.empty]\n"
                                             "protect = false\n"
                                             "\n"
                                             "[properties.plain]\n"
                                             "value = \"left\"\n"
                                             "protect = false\n"
                                             "\n"
                                             "[properties.token]\n"
                                             "# value = (secret)\n"
                                             "protect = true\n"
                                             "\n"
                                             "[cameras.Hall]\n"
                                             "access_control = true\n"
                                             "users = [\"anna\", \"ben\"]\n"
                                             "groups = [\"staff\"]\n"
                                             "\n"
                                             "[cameras.Lab]\n"
                                             "access_control = false\n"
                                             "users = []\n"
                                             "groups = []\n"));
}

TEST(Export, ReadAgainIsNoChange) {
    EXPECT_THAT(planOf(parse(exported(sample())), sample()).changes, IsEmpty());
    EXPECT_THAT(planOf(parse(exported(sample())), sample()).notes, IsEmpty());
}

TEST(Export, EveryWritableSettingIsManagedHereAndNothingElse) {
    State state;
    std::vector<std::string> writable;
    for (const DescribedKey& key : writeSettings().keys()) {
        constexpr std::string_view prefix = "configuration.";
        const std::string name = key.path.starts_with(prefix) ? key.path.substr(prefix.size()) : "";
        if (!name.empty() && name.find_first_of(".[") == std::string::npos) {
            state.settings.set(name, "x");
            writable.push_back(name);
        }
    }
    const Wanted wanted = parse(exported(state), state);
    EXPECT_EQ(wanted.settings.size(), 27U) << "the keys of the three files that are written";
    for (const char* other : {"nimbo_client_password", "nimbo_controller_resolve_name", "cameras", "properties"}) {
        EXPECT_THAT(writable, testing::Contains(other));
        EXPECT_FALSE(wanted.settings.contains(other)) << other;
        EXPECT_THAT(exported(state), Not(HasSubstr(std::string(other) + " = \"x\"")));
    }
}

TEST(Export, ValueThatALineCannotCarryIsAComment) {
    State state = sample();
    state.settings.set("server_port", Array{1});
    EXPECT_THAT(exported(state), HasSubstr("\n# server_port: a list, not managed here\n"));
    EXPECT_FALSE(parse(exported(state), state).settings.contains("server_port"));
}

TEST(Export, WhatHasNoNameOfItsOwnIsAComment) {
    State state = sample();
    state.properties->push_back({"6", "plain", "other", false});
    state.properties->push_back({"7", "", "nameless", false});
    state.properties->push_back({"8", "two\nlines", "x", false});
    state.cameras->push_back({"AAAA-3", "Hall", false, {}});
    state.cameras->push_back({"AAAA-4", "AAAA-2", false, {}});
    const std::string text = exported(state);
    EXPECT_THAT(text, AllOf(HasSubstr("# properties.plain, row 3: "), HasSubstr("# properties.plain, row 6: "),
                            HasSubstr("# properties.\"\", row 7: "), HasSubstr("[properties.\"two\\nlines\"]\n")));
    EXPECT_THAT(text, AllOf(HasSubstr("[cameras.AAAA-1]\n# name: \"Hall\"\n"),
                            HasSubstr("[cameras.AAAA-3]\n# name: \"Hall\"\n"),
                            HasSubstr("[cameras.AAAA-4]\n# name: \"AAAA-2\"\n"), HasSubstr("[cameras.Lab]\n")));
    EXPECT_THAT(planOf(parse(text, state), state).changes, IsEmpty());
}

TEST(Export, ListsThatTheServiceDoesNotAnswerAreLeftOut) {
    State state = sample();
    state.properties.reset();
    state.cameras.reset();
    EXPECT_THAT(exported(state), Not(testing::ContainsRegex("\\[(properties|cameras)\\.")));
}

TEST(Desired, FileIsReadAsItStands) {
    const Wanted wanted = parse(
        "[remove_unlisted]\nproperties = true\naccess = true\n"
        "[settings]\nserver_port = 9000\nserver_host = \"media\"\nsorvane_capture_web_enabled = false\n"
        "[properties.fresh]\nvalue = \"x\"\nprotect = true\n"
        "[properties.token]\nprotect = false\n"
        "[cameras.Hall]\naccess_control = false\nusers = [\"ben\"]\n"
        "[cameras.aaaa-2]\ngroups = []\n");
    EXPECT_EQ(wanted.settings.size(), 3U);
    EXPECT_EQ(wanted.settings.get("server_port"), Value(9000));
    EXPECT_EQ(wanted.settings.get("server_host"), Value("media"));
    EXPECT_EQ(wanted.settings.get("sorvane_capture_web_enabled"), Value(false));
    EXPECT_TRUE(wanted.removeProperties);
    EXPECT_TRUE(wanted.removePeople);
    EXPECT_FALSE(wanted.lookUpController);
    EXPECT_FALSE(wanted.password);
    ASSERT_EQ(wanted.properties.size(), 2U);
    EXPECT_EQ(wanted.properties[0].name, "fresh");
    EXPECT_EQ(wanted.properties[0].value, "x");
    EXPECT_EQ(wanted.properties[0].isProtected, true);
    EXPECT_EQ(wanted.properties[1].value, std::nullopt);
    EXPECT_EQ(wanted.properties[1].isProtected, false);
    EXPECT_FALSE(wanted.properties[1].writeSecret) << "a file that is applied again and again does not ask for it";
    ASSERT_EQ(wanted.cameras.size(), 2U);
    EXPECT_EQ(wanted.cameras[0].restricted, false);
    EXPECT_THAT(*wanted.cameras[0].users, ElementsAre("ben"));
    EXPECT_EQ(wanted.cameras[0].groups, std::nullopt) << "what is not given stays as it is";
    EXPECT_THAT(*wanted.cameras[1].groups, IsEmpty());
    EXPECT_EQ(wanted.cameras[1].restricted, std::nullopt);
}

TEST(Desired, EmptyFileWantsNothing) {
    for (const char* text : {"", "# nothing\n", "[settings]\n[properties]\n[cameras]\n[remove_unlisted]\n"}) {
        EXPECT_THAT(planOf(parse(text), sample()).changes, IsEmpty()) << text;
    }
}

TEST(Desired, SettingIsOfItsOwnTypeOrOfTheStoredOnes) {
    EXPECT_EQ(parse("[settings]\nserver_port = 1\n").settings.get("server_port"), Value(1));
    EXPECT_THAT(refused("[settings]\nserver_port = \"1\"\n"), EndsWith("takes a whole number, without quotes"));
    EXPECT_THAT(refused("[settings]\nserver_port = 1.0\n"), HasSubstr("takes a whole number"));
    EXPECT_THAT(refused("[settings]\nserver_host = 1\n"), HasSubstr("takes a text in quotes"));
    EXPECT_THAT(refused("[settings]\nsorvane_capture_web_enabled = \"yes\"\n"), HasSubstr("takes true or false"));
    State state = sample();
    state.settings.set("server_port", "8170");
    EXPECT_EQ(parse("[settings]\nserver_port = \"1\"\n", state).settings.get("server_port"), Value("1"));
    EXPECT_EQ(parse("[settings]\nmax_file_size_in_mb = 3.5\n").settings.get("max_file_size_in_mb"), Value(3.5));
}

TEST(Desired, DatesAreMomentsWithAnOffset) {
    State state = sample();
    const Date noon(std::chrono::sys_days(std::chrono::year(2026) / 1 / 31) + std::chrono::hours(12));
    state.settings.set("server_port", noon);
    EXPECT_THAT(exported(state), HasSubstr("server_port = 2026-01-31T12:00:00Z\n"));
    EXPECT_EQ(parse("[settings]\nserver_port = 2026-01-31T13:30:00+01:30\n", state).settings.get("server_port"),
              Value(noon));
    for (const char* text : {"2026-01-31T12:00:00", "2026-01-31", "12:00:00", "2026-01-31T12:00:00.5Z"}) {
        EXPECT_THAT(refused(std::string("[settings]\nserver_port = ") + text + "\n", state),
                    HasSubstr("a date such as 2026-01-31T08:00:00Z"))
            << text;
    }
}

TEST(Desired, EveryRefusalNamesThePlace) {
    EXPECT_THAT(refused("[settings]\nserver_port = \n"), StartsWith("state.toml, line 2, column "));
    EXPECT_THAT(refused("[settings]\nserver_port = [1]\n"),
                StartsWith("state.toml, line 2, column 15: settings.server_port takes a text, a number, true"));
    EXPECT_THAT(refused("[settings]\nnimbo_client_password = \"planted\"\n"),
                AllOf(StartsWith("state.toml, line 2, column 25: "), HasSubstr("--password-file FILE"),
                      Not(HasSubstr("planted"))));
    EXPECT_THAT(refused("[settings]\nweb_app_url = \"x\"\n"), HasSubstr("is no setting that can be written"));
    EXPECT_THAT(refused("[settings]\nnimbo_controller_resolve_name = true\n"), HasSubstr("is no setting"));
    EXPECT_THAT(refused("[setting]\n"), HasSubstr("setting is unknown; there are settings, properties, cameras"));
    EXPECT_THAT(refused("properties = []\n"), HasSubstr("properties is a table: [properties]"));
    EXPECT_THAT(refused("[properties]\nx = 1\n"), HasSubstr("properties.x is a table"));
    EXPECT_THAT(refused("[properties.x]\nname = \"y\"\n"), HasSubstr("properties.x.name is unknown"));
    EXPECT_THAT(refused("[properties.x]\nprotect = \"yes\"\n"), HasSubstr("properties.x.protect takes true or false"));
    EXPECT_THAT(refused("[cameras.Hall]\nuser = []\n"), HasSubstr("cameras.Hall.user is unknown"));
    EXPECT_THAT(refused("[cameras.Hall]\nusers = [1]\n"), HasSubstr("takes a text in quotes"));
    EXPECT_THAT(refused("[cameras.Hall]\nusers = [\"\"]\n"), HasSubstr("has an empty short name"));
    EXPECT_THAT(refused("[cameras.Roof]\n"), HasSubstr("cameras.Roof is no camera of the service"));
    EXPECT_THAT(refused("[cameras.Hall]\n[cameras.aaaa-1]\n"), HasSubstr("stands in the file twice"));
    EXPECT_THAT(refused("[remove_unlisted]\ncameras = true\n"), HasSubstr("remove_unlisted.cameras is unknown"));
    EXPECT_THAT(refused("[remove_unlisted]\naccess = 1\n"), HasSubstr("takes true or false"));
}

TEST(Desired, CameraOfASharedNameIsRefusedWithTheUuids) {
    State state = sample();
    state.cameras->push_back({"AAAA-3", "Hall", false, {}});
    EXPECT_THAT(refused("[cameras.Hall]\n", state), AllOf(HasSubstr("AAAA-1"), HasSubstr("AAAA-3")));
}

TEST(Desired, MessageShowsWhatATerminalWouldActOnByNumber) {
    EXPECT_THAT(refused("[settings]\n\"\\u001B[2J\" = 1\n"), Not(HasSubstr("\x1B")));
}

}  // namespace
}  // namespace adminhost::ctl
