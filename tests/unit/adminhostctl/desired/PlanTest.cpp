#include "adminhostctl/Failure.h"
#include "adminhostctl/desired/Plan.h"
#include "adminhostctl/desired/Toml.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using adminhost::Array;
using adminhost::Dictionary;
using adminhost::Value;
using namespace adminhost::ctl;

State sample() {
    State state;
    state.settings = {{"server_port", 8170}, {"server_host", "media"}, {"nimbo_controller", "grid.example.org"}};
    state.properties = std::vector<ListedProperty>{{"3", "plain", "left", false}, {"4", "token", std::nullopt, true}};
    state.cameras = std::vector<ListedCamera>{
        {"AAAA-1", "Hall", true, {{"user", "anna", "U-1"}, {"group", "anna", "G-1"}, {"user", "", "U-2"}}}};
    return state;
}

Plan planOfProperty(WantedProperty property) {
    Wanted wanted;
    wanted.properties.push_back(std::move(property));
    return planOf(wanted, sample());
}

Value propertyRecords(WantedProperty property) {
    return planOfProperty(std::move(property)).configuration.get("properties");
}

TEST(Plan, EqualSettingsAreNotSentAndTypesCount) {
    Wanted wanted;
    wanted.settings = {{"server_port", 8170}, {"server_host", "media"}};
    EXPECT_TRUE(planOf(wanted, sample()).configuration.empty());
    wanted.settings.set("server_port", "8170");
    const Plan plan = planOf(wanted, sample());
    EXPECT_EQ(plan.configuration, (Dictionary{{"server_port", "8170"}}));
    EXPECT_EQ(plan.changes, (std::vector<PlannedChange>{{"settings.server_port", "8170", "\"8170\""}}));
    EXPECT_FALSE(plan.restart);
}

TEST(Plan, NewSharedFileSystemSendsEverySettingBecauseOtherFilesAreUsedThen) {
    Wanted wanted;
    wanted.settings = {{"shared_filesystem", "/new"}, {"server_port", 8170}};
    const Plan plan = planOf(wanted, sample());
    EXPECT_EQ(plan.changes.size(), 1U);
    EXPECT_TRUE(plan.restart);
    EXPECT_EQ(plan.configuration.get("server_port"), Value(8170));
}

TEST(Plan, ControllerNameThatAWriteLooksUpIsOnlyWrittenWhenAskedFor) {
    Wanted wanted;
    wanted.settings = {{"nimbo_controller", "studio.a.local"}};
    EXPECT_TRUE(planOf(wanted, sample()).changes.empty());
    EXPECT_EQ(planOf(wanted, sample()).notes.size(), 1U);
    wanted.lookUpController = true;
    EXPECT_EQ(planOf(wanted, sample()).changes.size(), 1U);
    EXPECT_TRUE(isLookedUp("grid"));
    EXPECT_FALSE(isLookedUp("grid.example.org"));
    EXPECT_FALSE(isLookedUp("grid.Local")) << "case counts";
    EXPECT_FALSE(isLookedUp(".local"));
    EXPECT_FALSE(isLookedUp(""));
}

TEST(Plan, ProtectIsSentOnlyWhenItChanges) {
    EXPECT_EQ(propertyRecords({"token", std::nullopt, true, false, false}), Value());
    EXPECT_EQ(propertyRecords({"token", "new", true, false, true}),
              Value(Array{Dictionary{{"_id_", "4"}, {"value", "new"}}}));
    EXPECT_EQ(propertyRecords({"token", std::nullopt, false, false, false}),
              Value(Array{Dictionary{{"_id_", "4"}, {"protect", false}}}));
    EXPECT_EQ(propertyRecords({"plain", "left", true, false, false}),
              Value(Array{Dictionary{{"_id_", "3"}, {"protect", true}}}));
}

TEST(Plan, NewPropertyIsOneRecordAndNeedsAValue) {
    EXPECT_EQ(propertyRecords({"fresh", "x", false, false, false}),
              Value(Array{Dictionary{{"_newid_", true}, {"name", "fresh"}, {"value", "x"}}}));
    EXPECT_THROW(planOfProperty({"fresh", std::nullopt, true, false, false}), Failure);
    EXPECT_THROW(planOfProperty({"", "x", true, false, false}), Failure);
}

TEST(Plan, SecretsShowAsSuchOnBothSides) {
    EXPECT_EQ(planOfProperty({"token", "new", {}, false, true}).changes,
              (std::vector<PlannedChange>{{"properties.token.value", "(secret)", "(secret)"}}));
    EXPECT_EQ(planOfProperty({"plain", "next", true, false, false}).changes.front(),
              (PlannedChange{"properties.plain.value", "\"left\"", "(secret)"}));
    EXPECT_EQ(planOfProperty({"token", "new", {}, false, false}).notes.size(), 1U) << "a file does not write it again";
}

TEST(Plan, AccessListTellsUsersFromGroupsOfTheSameName) {
    Wanted wanted;
    wanted.cameras.push_back({"aaaa-1", {}, std::vector<std::string>{"ben", "ben"}, {}, {}, false});
    wanted.removePeople = true;
    const Plan plan = planOf(wanted, sample());
    EXPECT_EQ(plan.configuration.get("cameras"),
              Value(Array{Dictionary{
                  {"_id_", "AAAA-1"},
                  {"allowedUsersAndGroups", Array{Dictionary{{"_newid_", true}, {"type", "user"}, {"shortName", "ben"}},
                                                  Dictionary{{"_obsoleteid_", true}, {"_id_", "U-1"}}}}}}));
}

TEST(Plan, WhatIsStillDifferentAfterwardsDidNotTake) {
    Wanted wanted;
    wanted.settings = {{"server_port", 1}, {"server_host", "other"}};
    wanted.cameras.push_back({"Hall", {}, {}, {}, {}, true});
    const Plan plan = planOf(wanted, sample());
    State after = sample();
    after.settings.set("server_port", 1);
    after.cameras->clear();
    EXPECT_EQ(changesNotTaken(wanted, plan, sample(), after, true, {}),
              (std::vector<PlannedChange>{{"settings.server_host", "\"media\"", "\"other\""}}));
    EXPECT_EQ(changesNotTaken(wanted, plan, sample(), State(), true, {}).size(), plan.changes.size());
}

TEST(Plan, SecretThatTookIsToldFromTheLog) {
    Wanted wanted;
    wanted.properties.push_back({"token", "new", {}, false, true});
    const Plan plan = planOf(wanted, sample());
    EXPECT_TRUE(changesNotTaken(wanted, plan, sample(), sample(), true, {}).empty());
    const std::vector<std::string> log = {"adminhost_lumio: could not update property with id: 4, error: X (1)"};
    EXPECT_EQ(changesNotTaken(wanted, plan, sample(), sample(), true, log).size(), 1U);
    const std::vector<std::string> other = {"adminhost_lumio: could not update property with id: 44, error: X (1)"};
    EXPECT_TRUE(changesNotTaken(wanted, plan, sample(), sample(), true, other).empty());
}

TEST(Toml, TextsAndKeysAreQuotedAsTheFormatNeeds) {
    EXPECT_EQ(tomlText("a\"\\\n\t\x01\x7Fé"), "\"a\\\"\\\\\\n\\t\\u0001\\u007Fé\"");
    EXPECT_EQ(tomlText("\xE2\x80\xAE"), "\"\\U0000202E\"") << "a change of direction";
    EXPECT_EQ(tomlKey("plain_Key-1"), "plain_Key-1");
    EXPECT_EQ(tomlKey("a.b"), "\"a.b\"");
    EXPECT_EQ(tomlKey(""), "\"\"");
    EXPECT_EQ(tomlValue(2.0), "2.0");
    EXPECT_EQ(tomlValue(Value(adminhost::Date(std::chrono::seconds(1769846400)))), "2026-01-31T08:00:00Z");
    EXPECT_EQ(tomlValue(Array{}), std::nullopt);
}

}  // namespace
