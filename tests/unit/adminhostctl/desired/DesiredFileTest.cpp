#include "adminhostctl/Failure.h"
#include "adminhostctl/desired/DesiredFile.h"
#include "adminhostctl/desired/ExportedFile.h"
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
const StateForm& form() {
    static const StateForm form(writeSettings());
    return form;
}

Value property(const char* id, const char* name, const char* value, bool isProtected = false) {
    Dictionary listed{{"_id_", id}, {"name", name}, {"protect", isProtected}};
    if (value != nullptr) {
        listed.set("value", value);
    }
    return listed;
}
Value camera(const char* uuid, const char* name, bool restricted = false, Array allowed = {}) {
    return Dictionary{{"_id_", uuid},
                      {"name", name},
                      {"access_control_enabled", restricted},
                      {"allowedUsersAndGroups", std::move(allowed)}};
}
Value workflow(const char* uuid, const char* name, const char* path, Array allowed = {}) {
    Dictionary listed{{"_id_", uuid},
                      {"bundle_path", path},
                      {"access_control_enabled", true},
                      {"allowedUsersAndGroups", std::move(allowed)}};
    listed.set("name", name == nullptr ? Value() : Value(name));
    return listed;
}
Value person(const char* kind, const char* name, const char* uuid) {
    return Dictionary{{"type", kind}, {"shortName", name}, {"_id_", uuid}};
}

Dictionary sample() {
    return {{"default_shared_filesystem", "/Library/SorvaneProducer/Shared"},
            {"shared_filesystem", "/shared"},
            {"nimbo_client_password_is_set", true},
            {"server_port", 8170},
            {"sorvane_capture_web_enabled", true},
            {"server_host", "a \"quoted\"\nhost"},
            {"max_file_size_in_mb", 2.0},
            {"web_app_url", "https://derived"},
            {"properties", Array{property("3", "plain", "left"), property("4", "token", nullptr, true),
                                 property("5", "empty", nullptr)}},
            {"cameras", Array{camera("AAAA-1", "Hall", true,
                                     {person("user", "ben", "U-2"), person("user", "anna", "U-1"),
                                      person("group", "staff", "G-1"), person("user", "", "U-3")}),
                              camera("AAAA-2", "Lab")}},
            {"workflows", Array{workflow("BBBB-2", "Publier", "W/Publish.workflow", {person("group", "staff", "G-1")}),
                                workflow("BBBB-1", "", "W/Gone.workflow")}}};
}
Dictionary sampleWith(const char* list, std::vector<Value> more) {
    Dictionary root = sample();
    for (Value& element : more) {
        root.find(list)->array()->push_back(std::move(element));
    }
    return root;
}

std::string exported(const Dictionary& root) {
    return exportOf(form(), stateOf(form(), root));
}
Wanted parse(std::string_view text, const Dictionary& root = sample()) {
    return parseDesired(text, "state.toml", form(), stateOf(form(), root));
}
Plan planOf(const Wanted& wanted, const Dictionary& root) {
    return planOf(form(), wanted, stateOf(form(), root));
}
std::string refused(std::string_view text, const Dictionary& state = sample()) {
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
                                             "# server_host = \"a \\\"quoted\\\"\\nhost\"\n"
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
                                             "[workflows.BBBB-1]\n"
                                             "# bundle_path: \"W/Gone.workflow\"\n"
                                             "access_control = true\n"
                                             "users = []\n"
                                             "groups = []\n"
                                             "\n"
                                             "[workflows.BBBB-2]\n"
                                             "# name: \"Publier\"\n"
                                             "access_control = true\n"
                                             "users = []\n"
                                             "groups = [\"staff\"]\n"
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
    Dictionary root{{"cameras", Array{}}, {"workflows", Array{}}, {"properties", Array{}}};
    std::vector<std::string> writable;
    for (const DescribedKey& key : writeSettings().keys()) {
        constexpr std::string_view prefix = "configuration.";
        const std::string name = key.path.starts_with(prefix) ? key.path.substr(prefix.size()) : "";
        if (!name.empty() && name.find_first_of(".[") == std::string::npos) {
            writable.push_back(name);
            if (key.type != "list") {
                root.set(name, "x");
            }
        }
    }
    const Wanted wanted = parse(exported(root), root);
    for (const char* const ofHost : {"member_uuid", "server_host", "tunnel_agent_host"}) {
        EXPECT_THAT(exported(root), HasSubstr(std::string("\n# ") + ofHost + " = \"x\"\n"));
        EXPECT_FALSE(wanted.settings.contains(ofHost)) << "another host has its own";
    }
    EXPECT_EQ(wanted.settings.size(), 24U) << "the other keys of the three files that are written";
    for (const char* other : {"nimbo_client_password", "nimbo_controller_resolve_name", "cameras", "properties"}) {
        EXPECT_THAT(writable, testing::Contains(other));
        EXPECT_FALSE(wanted.settings.contains(other)) << other;
        EXPECT_THAT(exported(root), Not(HasSubstr(std::string(other) + " = \"x\"")));
    }
}

TEST(Export, ValueThatALineCannotCarryIsAComment) {
    Dictionary root = sample();
    root.set("server_port", Array{1});
    EXPECT_THAT(exported(root), HasSubstr("\n# server_port: a list, not managed here\n"));
    EXPECT_FALSE(parse(exported(root), root).settings.contains("server_port"));
}

TEST(Export, WhatHasNoNameOfItsOwnIsAComment) {
    Dictionary root = sampleWith("properties", {property("6", "plain", "other"), property("7", "", "nameless"),
                                                property("8", "two\nlines", "x")});
    root.find("cameras")->array()->push_back(camera("AAAA-3", "Hall"));
    root.find("cameras")->array()->push_back(camera("AAAA-4", "AAAA-2"));
    const std::string text = exported(root);
    EXPECT_THAT(text, AllOf(HasSubstr("# properties.plain, 3: "), HasSubstr("# properties.plain, 6: "),
                            HasSubstr("# properties.\"\", 7: "), HasSubstr("[properties.\"two\\nlines\"]\n")));
    EXPECT_THAT(text, AllOf(HasSubstr("[cameras.AAAA-1]\n# name: \"Hall\"\n"),
                            HasSubstr("[cameras.AAAA-3]\n# name: \"Hall\"\n"),
                            HasSubstr("[cameras.AAAA-4]\n# name: \"AAAA-2\"\n"), HasSubstr("[cameras.Lab]\n")));
    EXPECT_THAT(planOf(parse(text, root), root).changes, IsEmpty());
}

TEST(Export, FailsWhenTheServiceDoesNotListASection) {
    for (const char* list : {"properties", "workflows", "cameras"}) {
        Dictionary root = sample();
        root.remove(list);
        try {
            (void)exported(root);
            ADD_FAILURE() << list;
        } catch (const Failure& failure) {
            EXPECT_EQ(failure.status(), ExitStatus::failed);
            EXPECT_THAT(failure.what(), HasSubstr(std::string("does not list its ") + list));
        }
    }
}

TEST(Export, LocalizedNamesAreCommentsAndTheIdentityNamesTheElement) {
    Dictionary french = sample();
    Dictionary english = sample();
    english.find("workflows")->array()->front() =
        workflow("BBBB-2", "Publish", "W/Publish.workflow", {person("group", "staff", "G-1")});
    EXPECT_NE(exported(french), exported(english)) << "the comment";
    EXPECT_THAT(planOf(parse(exported(french), english), english).changes, IsEmpty());
    EXPECT_THAT(planOf(parse(exported(english), french), french).changes, IsEmpty());
}

TEST(Export, SecondElementOfAnIdentityIsAComment) {
    const Dictionary root = sampleWith("workflows", {workflow("BBBB-1", "Other", "W/Other.workflow")});
    const std::string text = exported(root);
    EXPECT_THAT(text, HasSubstr("# workflows.Other, BBBB-1: not managed here"));
    EXPECT_THAT(planOf(parse(text, root), root).changes, IsEmpty());
}

TEST(Desired, FileNamesALocalizedElementByItsIdentityOnly) {
    EXPECT_THAT(parse("[workflows.bbbb-2]\nusers = [\"anna\"]\n").elements.at("workflows").front().lists.at("users"),
                ElementsAre("anna"));
    for (const char* name : {"Publier", "W/Publish.workflow", "BBBB-3"}) {
        EXPECT_THAT(refused(std::string("[workflows.\"") + name + "\"]\n"),
                    HasSubstr("not found in the service; a file names workflows by their identities"))
            << name;
    }
    EXPECT_THAT(refused("[workflows.bbbb-2]\n[workflows.BBBB-2]\n"), HasSubstr("is in the file twice"));
}

TEST(Desired, FileIsReadWithAllItsTables) {
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
    EXPECT_THAT(wanted.removeUnlisted, ElementsAre("access", "properties"));
    EXPECT_FALSE(wanted.lookUp);
    EXPECT_TRUE(wanted.secrets.empty());
    const std::vector<WantedElement>& properties = wanted.elements.at("properties");
    ASSERT_EQ(properties.size(), 2U);
    EXPECT_EQ(properties[0].name, "fresh");
    EXPECT_EQ(properties[0].fields, (Dictionary{{"protect", true}, {"value", "x"}}));
    EXPECT_EQ(properties[1].fields, (Dictionary{{"protect", false}}));
    EXPECT_FALSE(properties[1].writeSecret) << "a file that is applied again and again does not ask for it";
    const std::vector<WantedElement>& cameras = wanted.elements.at("cameras");
    ASSERT_EQ(cameras.size(), 2U);
    EXPECT_EQ(cameras[0].fields, (Dictionary{{"access_control_enabled", false}}));
    EXPECT_THAT(cameras[0].lists.at("users"), ElementsAre("ben"));
    EXPECT_EQ(cameras[0].lists.count("groups"), 0U) << "what is not given stays as it is";
    EXPECT_THAT(cameras[1].lists.at("groups"), IsEmpty());
    EXPECT_TRUE(cameras[1].fields.empty());
}

TEST(Desired, LaterFileReplacesKeyByKeyHoweverItNamesTheElement) {
    const State state = stateOf(form(), sample());
    DesiredFiles files(form(), state, {});
    files.add(
        "[remove_unlisted]\naccess = true\n[settings]\nserver_port = 1\nserver_host = \"a\"\n"
        "[cameras.Hall]\naccess_control = false\nusers = [\"anna\", \"ben\"]\ngroups = []\n"
        "[properties.fresh]\nprotect = true\n",
        "base.toml");
    files.add(
        "[remove_unlisted]\naccess = false\nproperties = true\n[settings]\nserver_port = 2\n"
        "[cameras.aaaa-1]\nusers = [\"carla\"]\n[properties.fresh]\nvalue = \"x\"\n",
        "host.toml");
    const Wanted& wanted = files.wanted();
    EXPECT_EQ(wanted.settings, (Dictionary{{"server_port", 2}, {"server_host", "a"}}));
    EXPECT_THAT(wanted.removeUnlisted, ElementsAre("properties"));
    ASSERT_EQ(wanted.elements.at("cameras").size(), 1U) << "one element, named in two ways";
    const WantedElement& hall = wanted.elements.at("cameras").front();
    EXPECT_EQ(hall.fields, (Dictionary{{"access_control_enabled", false}}));
    EXPECT_THAT(hall.lists.at("users"), ElementsAre("carla"));
    EXPECT_THAT(hall.places.at("users"), ElementsAre("host.toml, line 7, column 10"));
    EXPECT_THAT(hall.lists.at("groups"), IsEmpty());
    EXPECT_EQ(wanted.elements.at("properties").front().fields, (Dictionary{{"protect", true}, {"value", "x"}}));
}

TEST(Desired, SectionsThatAreNotChosenAreNeitherCheckedNorChanged) {
    const State state = stateOf(form(), sample());
    DesiredFiles files(form(), state, {.force = false, .only = {"settings"}});
    files.add("[remove_unlisted]\nproperties = true\n[settings]\nserver_port = 1\n[cameras.Nowhere]\nuser = 1\n",
              "base.toml");
    EXPECT_TRUE(files.wanted().elements.empty());
    EXPECT_EQ(planOf(form(), files.wanted(), state).changes.size(), 1U) << "no property is removed";
}

TEST(Desired, EmptyFileWantsNothing) {
    for (const char* text : {"", "# nothing\n", "[settings]\n[properties]\n[cameras]\n[remove_unlisted]\n"}) {
        EXPECT_THAT(planOf(parse(text), sample()).changes, IsEmpty()) << text;
    }
}

TEST(Desired, SettingIsOfItsOwnTypeOrOfTheStoredOnes) {
    EXPECT_EQ(parse("[settings]\nserver_port = 1\n").settings.get("server_port"), Value(1));
    EXPECT_THAT(refused("[settings]\nserver_port = \"1\"\n"), EndsWith("must be a whole number, without quotes"));
    EXPECT_THAT(refused("[settings]\nserver_port = 1.0\n"), HasSubstr("must be a whole number"));
    EXPECT_THAT(refused("[settings]\nserver_host = 1\n"), HasSubstr("must be a text in quotes"));
    EXPECT_THAT(refused("[settings]\nsorvane_capture_web_enabled = \"yes\"\n"), HasSubstr("must be true or false"));
    Dictionary state = sample();
    state.set("server_port", "8170");
    EXPECT_EQ(parse("[settings]\nserver_port = \"1\"\n", state).settings.get("server_port"), Value("1"));
    EXPECT_EQ(parse("[settings]\nmax_file_size_in_mb = 3.5\n").settings.get("max_file_size_in_mb"), Value(3.5));
}

TEST(Desired, DatesAreMomentsWithAnOffset) {
    Dictionary state = sample();
    const Date noon(std::chrono::sys_days(std::chrono::year(2026) / 1 / 31) + std::chrono::hours(12));
    state.set("server_port", noon);
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
                StartsWith("state.toml, line 2, column 15: settings.server_port must be a text, a number, true"));
    EXPECT_THAT(refused("[settings]\nnimbo_client_password = \"planted\"\n"),
                AllOf(StartsWith("state.toml, line 2, column 25: "), HasSubstr("--password-file FILE"),
                      Not(HasSubstr("planted"))));
    EXPECT_THAT(refused("[settings]\nweb_app_url = \"x\"\n"), HasSubstr("is not a setting that can be written"));
    EXPECT_THAT(refused("[settings]\nnimbo_controller_resolve_name = true\n"), HasSubstr("is not a setting"));
    EXPECT_THAT(refused("[setting]\n"),
                HasSubstr("setting is unknown; the tables are settings, properties, workflows, cameras"));
    EXPECT_THAT(refused("properties = []\n"), HasSubstr("properties must be a table: [properties]"));
    EXPECT_THAT(refused("[properties]\nx = 1\n"), HasSubstr("properties.x must be a table"));
    EXPECT_THAT(refused("[properties.x]\nname = \"y\"\n"), HasSubstr("properties.x.name is unknown"));
    EXPECT_THAT(refused("[properties.x]\nprotect = \"yes\"\n"),
                HasSubstr("properties.x.protect must be true or false"));
    EXPECT_THAT(refused("[cameras.Hall]\nuser = []\n"), HasSubstr("cameras.Hall.user is unknown"));
    EXPECT_THAT(refused("[cameras.Hall]\nusers = [1]\n"), HasSubstr("must be a text in quotes"));
    EXPECT_THAT(refused("[cameras.Hall]\nusers = [\"\"]\n"), HasSubstr("is an empty name"));
    EXPECT_THAT(refused("[cameras.Roof]\n"), HasSubstr("cameras.Roof not found in the service"));
    EXPECT_THAT(refused("[cameras.Hall]\n[cameras.aaaa-1]\n"), HasSubstr("is in the file twice"));
    EXPECT_THAT(refused("[remove_unlisted]\ncameras = true\n"), HasSubstr("remove_unlisted.cameras is unknown"));
    EXPECT_THAT(refused("[remove_unlisted]\naccess = 1\n"), HasSubstr("must be true or false"));
}

TEST(Desired, CameraOfASharedNameIsRefusedWithTheUuids) {
    EXPECT_THAT(refused("[cameras.Hall]\n", sampleWith("cameras", {camera("AAAA-3", "Hall")})),
                AllOf(HasSubstr("AAAA-1"), HasSubstr("AAAA-3")));
}

TEST(Desired, MessageShowsWhatATerminalWouldActOnByNumber) {
    EXPECT_THAT(refused("[settings]\n\"\\u001B[2J\" = 1\n"), Not(HasSubstr("\x1B")));
}

}  // namespace
}  // namespace adminhost::ctl
