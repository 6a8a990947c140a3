#include "adminhostctl/Failure.h"
#include "adminhostctl/desired/PlanOutcome.h"
#include "adminhostctl/desired/Toml.h"
#include "tests/unit/adminhostctl/Describe.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using adminhost::Array;
using adminhost::Dictionary;
using adminhost::Value;
using namespace adminhost::ctl;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

const StateForm& form() {
    static const StateForm form(describe("writeSettings"));
    return form;
}

Dictionary person(const char* kind, const char* name, const char* uuid) {
    return {{"type", kind}, {"shortName", name}, {"_id_", uuid}};
}

Dictionary sampleRoot() {
    return {
        {"server_port", 8170},
        {"server_host", "media"},
        {"nimbo_controller", "grid.example.org"},
        {"shared_filesystem", "/old"},
        {"member_uuid", "M-1"},
        {"nimbo_client_password_is_set", true},
        {"properties", Array{Dictionary{{"_id_", "3"}, {"name", "plain"}, {"value", "left"}, {"protect", false}},
                             Dictionary{{"_id_", "4"}, {"name", "token"}, {"protect", true}}}},
        {"cameras",
         Array{Dictionary{{"_id_", "AAAA-1"},
                          {"name", "Hall"},
                          {"access_control_enabled", true},
                          {"allowedUsersAndGroups", Array{person("user", "anna", "U-1"), person("group", "anna", "G-1"),
                                                          person("user", "", "U-2")}}}}}};
}
State sample() {
    return stateOf(form(), sampleRoot());
}

WantedElement element(const char* name, Dictionary fields = {}) {
    return {name, std::move(fields), {}, {}, false, false};
}

Plan planOfProperty(WantedElement property) {
    Wanted wanted;
    wanted.elements["properties"].push_back(std::move(property));
    return planOf(form(), wanted, sample());
}

Value propertyRecords(WantedElement property) {
    return planOfProperty(std::move(property)).root.get("properties");
}

WantedElement secretly(WantedElement property) {
    property.writeSecret = true;
    return property;
}

RequestReport done(std::vector<ReportedGap> notDone = {}) {
    RequestReport report;
    report.state = RequestReport::State::done;
    report.notDone = std::move(notDone);
    return report;
}

std::vector<PlannedChange> failedOf(const PlanOutcome& outcome) {
    std::vector<PlannedChange> changes;
    for (const FailedChange& one : outcome.failed) {
        changes.push_back(one.change);
    }
    return changes;
}

TEST(StateForm, IsLearntFromTheDescriptionOfTheWritingCommand) {
    EXPECT_EQ(form().root(), "configuration");
    EXPECT_EQ(form().settingsSection(), "settings");
    EXPECT_EQ(form().lists().size(), 3U);
    EXPECT_THAT(form().switches(), ElementsAre("properties", "access"));
    EXPECT_NE(form().secret("nimbo_client_password"), nullptr);
    EXPECT_EQ(form().setting("nimbo_client_password"), nullptr);
    EXPECT_EQ(form().setting("nimbo_controller_resolve_name"), nullptr) << "an order, not a setting";
    EXPECT_THROW((void)form().list("doors"), Failure);
    EXPECT_THROW(StateForm(describe("getState")), Failure);
}

TEST(Plan, EqualSettingsAreNotSentAndTypesCount) {
    Wanted wanted;
    wanted.settings = {{"server_port", 8170}, {"server_host", "media"}};
    EXPECT_TRUE(planOf(form(), wanted, sample()).root.empty());
    wanted.settings.set("server_port", "8170");
    const Plan plan = planOf(form(), wanted, sample());
    EXPECT_EQ(plan.root, (Dictionary{{"server_port", "8170"}}));
    EXPECT_EQ(plan.changes,
              (std::vector<PlannedChange>{{"settings.server_port", "8170", "\"8170\"", "", false, "", ""}}));
    EXPECT_EQ(plan.changes.front().keyPath, "configuration.server_port");
    EXPECT_THAT(plan.restart, IsEmpty());
    EXPECT_FALSE(plan.moves);
}

TEST(Plan, NewSharedFileSystemSendsEveryWantedSettingOfTheFilesThatMoveWithIt) {
    Wanted wanted;
    wanted.settings = {{"shared_filesystem", "/new"},
                       {"member_uuid", "M-1"},
                       {"server_port", 8170},
                       {"nimbo_controller", "grid.example.org"}};
    const Plan plan = planOf(form(), wanted, sample());
    EXPECT_EQ(plan.changes.size(), 1U);
    EXPECT_THAT(plan.restart, ElementsAre("stopService", "startService"));
    EXPECT_TRUE(plan.moves);
    EXPECT_EQ(
        plan.root,
        (Dictionary{{"shared_filesystem", "/new"}, {"server_port", 8170}, {"nimbo_controller", "grid.example.org"}}));
    EXPECT_THAT(plan.consequences, ElementsAre(HasSubstr("may not have them: server_host;")));
    EXPECT_THAT(plan.movedAlong, ElementsAre("server_host"));
    EXPECT_THAT(plan.notes, ElementsAre(HasSubstr("nimbo_client_password: a secret, read from another file then")));
}

TEST(Plan, NewMemberSendsTheSettingsOfTheMembersFileOnly) {
    Wanted wanted;
    wanted.settings = {{"shared_filesystem", "/old"},
                       {"member_uuid", "M-2"},
                       {"server_port", 8170},
                       {"nimbo_controller", "grid.example.org"}};
    EXPECT_EQ(planOf(form(), wanted, sample()).root, (Dictionary{{"member_uuid", "M-2"}, {"server_port", 8170}}));
}

TEST(Plan, NameThatTheWriteLooksUpReachesTheNewFileToo) {
    Dictionary root = sampleRoot();
    root.set("nimbo_controller", "grid");
    Wanted wanted;
    wanted.settings = {{"shared_filesystem", "/new"}, {"nimbo_controller", "grid"}};
    EXPECT_EQ(planOf(form(), wanted, stateOf(form(), root)).root, wanted.settings);
    wanted.settings.set("nimbo_controller", "studio.local");
    EXPECT_EQ(planOf(form(), wanted, stateOf(form(), root)).root, wanted.settings);
}

TEST(Plan, ControllerNameThatAWriteLooksUpIsOnlyWrittenWhenAskedFor) {
    Wanted wanted;
    wanted.settings = {{"nimbo_controller", "studio.a.local"}};
    EXPECT_TRUE(planOf(form(), wanted, sample()).changes.empty());
    EXPECT_EQ(planOf(form(), wanted, sample()).notes.size(), 1U);
    wanted.lookUp = true;
    EXPECT_EQ(planOf(form(), wanted, sample()).changes.size(), 1U);
    const DescribedKey& controller = *form().setting("nimbo_controller");
    EXPECT_TRUE(isLookedUp(controller, "grid"));
    EXPECT_FALSE(isLookedUp(controller, "grid.example.org"));
    EXPECT_FALSE(isLookedUp(controller, "grid.Local")) << "case counts";
    EXPECT_FALSE(isLookedUp(controller, ".local"));
    EXPECT_FALSE(isLookedUp(controller, ""));
    EXPECT_FALSE(isLookedUp(*form().setting("server_host"), "grid")) << "no other setting";
}

TEST(Plan, ProtectIsSentOnlyWhenItChanges) {
    EXPECT_EQ(propertyRecords(element("token", {{"protect", true}})), Value());
    EXPECT_EQ(propertyRecords(secretly(element("token", {{"value", "new"}, {"protect", true}}))),
              Value(Array{Dictionary{{"_id_", "4"}, {"value", "new"}}}));
    EXPECT_EQ(propertyRecords(element("token", {{"protect", false}})),
              Value(Array{Dictionary{{"_id_", "4"}, {"protect", false}}}));
    EXPECT_EQ(propertyRecords(element("plain", {{"value", "left"}, {"protect", true}})),
              Value(Array{Dictionary{{"_id_", "3"}, {"protect", true}}}));
}

TEST(Plan, NewPropertyIsOneRecordAndNeedsAValue) {
    EXPECT_EQ(propertyRecords(element("fresh", {{"value", "x"}, {"protect", false}})),
              Value(Array{Dictionary{{"_newid_", true}, {"name", "fresh"}, {"value", "x"}}}));
    EXPECT_THROW(planOfProperty(element("fresh", {{"protect", true}})), Failure);
    EXPECT_THROW(planOfProperty(element("", {{"value", "x"}})), Failure);
}

TEST(Plan, CameraThatTheServiceDoesNotHaveIsRefused) {
    Wanted wanted;
    wanted.elements["cameras"].push_back(element("Roof"));
    EXPECT_THROW((void)planOf(form(), wanted, sample()), Failure);
}

TEST(Plan, SecretsShowAsSuchOnBothSides) {
    EXPECT_EQ(planOfProperty(secretly(element("token", {{"value", "new"}}))).changes,
              (std::vector<PlannedChange>{{"properties.token.value", "(secret)", "(secret)", "", true, "", ""}}));
    EXPECT_EQ(planOfProperty(element("plain", {{"value", "next"}, {"protect", true}})).changes.front(),
              (PlannedChange{"properties.plain.value", "\"left\"", "(secret)", "", true, "", ""}));
    EXPECT_EQ(planOfProperty(element("token", {{"value", "new"}})).notes.size(), 1U)
        << "a file does not write it again";
}

TEST(Plan, AccessListDistinguishesUsersFromGroupsOfTheSameName) {
    Wanted wanted;
    WantedElement camera = element("aaaa-1");
    camera.lists["users"] = {"ben", "ben"};
    wanted.elements["cameras"].push_back(camera);
    wanted.removeUnlisted = {"access"};
    const Plan plan = planOf(form(), wanted, sample());
    EXPECT_EQ(plan.root.get("cameras"),
              Value(Array{Dictionary{
                  {"_id_", "AAAA-1"},
                  {"allowedUsersAndGroups", Array{Dictionary{{"_newid_", true}, {"type", "user"}, {"shortName", "ben"}},
                                                  Dictionary{{"_obsoleteid_", true}, {"_id_", "U-1"}}}}}}));
    ASSERT_EQ(plan.changes.size(), 2U);
    EXPECT_EQ(plan.changes[1].keyPath, "configuration.cameras.0.allowedUsersAndGroups.1");
}

TEST(Outcome, WhatIsStillDifferentAfterwardsWasNotApplied) {
    Wanted wanted;
    wanted.settings = {{"server_port", 1}, {"server_host", "other"}};
    WantedElement removed = element("Hall");
    removed.remove = true;
    wanted.elements["cameras"].push_back(removed);
    const Plan plan = planOf(form(), wanted, sample());
    State after = sample();
    after.settings.set("server_port", 1);
    after.lists["cameras"].clear();
    const PlanOutcome outcome = outcomeOf(form(), wanted, plan, sample(), after, true,
                                          done({{"configuration.server_host", "is not writable", "tool 5"}}));
    EXPECT_EQ(failedOf(outcome),
              (std::vector<PlannedChange>{{"settings.server_host", "\"media\"", "\"other\"", "", false, "", ""}}));
    EXPECT_EQ(outcome.failed.front().reason, "is not writable (tool 5)");
    EXPECT_EQ(outcome.applied.size(), 2U);
    EXPECT_THAT(outcome.undetermined, IsEmpty());
}

/// Denies the user anna and allows the user ben, in this order in the request: ben is entry 0, anna entry 1.
Wanted otherPeople() {
    Wanted wanted;
    WantedElement camera = element("Hall");
    camera.lists["users"] = {"ben"};
    camera.denied = {{"user", "anna", ""}};
    wanted.elements["cameras"].push_back(camera);
    return wanted;
}

TEST(Outcome, PersonWhoIsReportedAsNotRemovedWasNotRemovedAlthoughTheListIsEmpty) {
    Wanted wanted;
    WantedElement camera = element("Hall");
    camera.denied = {{"user", "anna", ""}};
    wanted.elements["cameras"].push_back(camera);
    const Plan plan = planOf(form(), wanted, sample());
    State after = sample();
    after.lists["cameras"].front().people.clear();
    const PlanOutcome outcome =
        outcomeOf(form(), wanted, plan, sample(), after, true,
                  done({{"configuration.cameras.0.allowedUsersAndGroups.0", "not removed: the directory failed", ""}}));
    EXPECT_EQ(failedOf(outcome), plan.changes);
    ASSERT_EQ(outcome.failed.size(), 1U);
    EXPECT_EQ(outcome.failed.front().reason, "not removed: the directory failed");
    EXPECT_THAT(outcome.applied, IsEmpty());
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), after, true, done()).applied, plan.changes);
}

TEST(Outcome, ListsOfPeopleThatWereNotReadCompletelyDecideNothing) {
    const Wanted wanted = otherPeople();
    const Plan plan = planOf(form(), wanted, sample());
    ASSERT_EQ(plan.changes.size(), 2U);
    State after = sample();
    after.lists["cameras"].front().people.clear();
    after.peopleUnread = true;
    RequestReport report = done({{"", "the directory node \"/Example\" failed", ""}});
    const PlanOutcome unknown = outcomeOf(form(), wanted, plan, sample(), after, true, report);
    EXPECT_EQ(unknown.undetermined, plan.changes);
    EXPECT_THAT(unknown.failed, IsEmpty());
    EXPECT_THAT(unknown.applied, IsEmpty());

    report.changes.push_back({"cameras", "AAAA-1", "Hall", "users", "anna", Value(), false});
    const PlanOutcome reported = outcomeOf(form(), wanted, plan, sample(), after, true, report);
    EXPECT_THAT(reported.applied, ElementsAre(plan.changes[1])) << "the daemon reports it";
    EXPECT_THAT(reported.undetermined, ElementsAre(plan.changes[0]));

    report.notDone.push_back({"configuration.cameras.0.allowedUsersAndGroups.0", "not added", "tool 5"});
    EXPECT_EQ(failedOf(outcomeOf(form(), wanted, plan, sample(), after, true, report)),
              (std::vector<PlannedChange>{plan.changes[0]}));
}

TEST(Outcome, ListsOfPeopleThatWereNotReadCompletelyDoNotConcernOtherChanges) {
    Wanted wanted;
    wanted.settings = {{"server_port", 1}};
    WantedElement camera = element("Hall");
    camera.lists["users"] = {"anna"};  // who is in the list already
    wanted.elements["cameras"].push_back(camera);
    const Plan plan = planOf(form(), wanted, sample());
    ASSERT_EQ(plan.changes.size(), 1U);
    State after = sample();
    after.settings.set("server_port", 1);
    after.lists["cameras"].front().people.clear();
    after.peopleUnread = true;
    const PlanOutcome outcome = outcomeOf(form(), wanted, plan, sample(), after, true, done());
    EXPECT_EQ(outcome.applied, plan.changes);
    EXPECT_THAT(outcome.failed, IsEmpty());
    EXPECT_THAT(outcome.undetermined, IsEmpty());
}

TEST(Outcome, NothingIsKnownOfAStateThatCannotBeRead) {
    Wanted wanted;
    wanted.settings = {{"server_port", 1}};
    const Plan plan = planOf(form(), wanted, sample());
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), std::nullopt, true, done()).undetermined, plan.changes);
    wanted.elements["properties"].push_back(element("plain", {{"value", "right"}}));
    const Plan both = planOf(form(), wanted, sample());
    State unread = sample();
    unread.settings.set("server_port", 1);
    unread.lists.clear();
    EXPECT_EQ(outcomeOf(form(), wanted, both, sample(), unread, true, done()).undetermined, both.changes);
}

TEST(Outcome, SecretThatWasAppliedIsToldFromTheReportOfWhatWasNot) {
    Wanted wanted;
    wanted.elements["properties"].push_back(secretly(element("token", {{"value", "new"}})));
    const Plan plan = planOf(form(), wanted, sample());
    const auto outcome = [&](const RequestReport& report, bool answered = true) {
        return outcomeOf(form(), wanted, plan, sample(), sample(), answered, report);
    };
    EXPECT_EQ(outcome(done()).applied.size(), 1U);
    for (const char* path : {"configuration.properties.0.value", "configuration.properties.0"}) {
        EXPECT_EQ(outcome(done({{path, "cannot be enciphered", ""}})).failed.size(), 1U) << path;
    }
    for (const char* path : {"configuration.properties.1", "configuration.properties.01", "configuration.proper"}) {
        EXPECT_EQ(outcome(done({{path, "of another one", ""}})).applied.size(), 1U) << path;
    }
    EXPECT_EQ(outcome(done(), false).undetermined.size(), 1U) << "the answer is missing";
    EXPECT_EQ(outcome({}, true).undetermined.size(), 1U) << "the daemon does not know the request";
    RequestReport reported = done();
    reported.changes.push_back({"properties", "4", "token", "value", {}, {}, true});
    EXPECT_EQ(outcome(reported, false).applied.size(), 1U);
    reported.changes.front().identity = "5";
    EXPECT_EQ(outcome(reported, false).undetermined.size(), 1U);
}

TEST(Outcome, SecretIsUndeterminedIfItsReportMayBeAmongThoseThatTheDaemonDropped) {
    Wanted wanted;
    wanted.elements["properties"].push_back(secretly(element("token", {{"value", "new"}})));
    const Plan plan = planOf(form(), wanted, sample());
    RequestReport report = done();
    report.notDoneDropped = 1;
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), sample(), true, report).undetermined, plan.changes);
    report.changes.push_back({"properties", "4", "token", "value", {}, {}, true});
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), sample(), true, report).applied, plan.changes);
}

TEST(Outcome, ProtectionThatWasSwitchedOffWithoutItsTextWasNotApplied) {
    Wanted wanted;
    wanted.elements["properties"].push_back(element("token", {{"protect", false}}));
    const Plan plan = planOf(form(), wanted, sample());
    Dictionary root = sampleRoot();
    root.find("properties")->array()->back() =
        Dictionary{{"_id_", "4"}, {"name", "token"}, {"value", "x"}, {"protect", false}};
    const State after = stateOf(form(), root);
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), after, true, done()).applied.size(), 1U);
    EXPECT_EQ(
        outcomeOf(form(), wanted, plan, sample(), after, true, done({{"configuration.properties.0", "no key", ""}}))
            .failed.size(),
        1U);
}

TEST(Outcome, PasswordIsJudgedByWhetherOneIsStored) {
    Wanted wanted;
    wanted.secrets["nimbo_client_password"] = "new";
    const Plan plan = planOf(form(), wanted, sample());
    State without = sample();
    without.settings.set("nimbo_client_password_is_set", false);
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), sample(), true, done()).applied.size(), 1U);
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), without, true, done()).failed.size(), 1U);
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), sample(), true,
                        done({{"configuration.nimbo_client_password", "cannot be enciphered", ""}}))
                  .failed.size(),
              1U);
}

TEST(Outcome, LookedUpNameIsWhateverTheWriteStored) {
    Wanted wanted;
    wanted.settings = {{"nimbo_controller", "studio.local"}};
    wanted.lookUp = true;
    const Plan plan = planOf(form(), wanted, sample());
    State found = sample();
    found.settings.set("nimbo_controller", "host.example.org");
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), found, true, done()).applied.size(), 1U);
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), found, false, done()).applied.size(), 1U);
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), sample(), false, done()).failed.size(), 1U);
    State asWritten = sample();
    asWritten.settings.set("nimbo_controller", "studio.local");
    EXPECT_EQ(outcomeOf(form(), wanted, plan, sample(), asWritten, true,
                        done({{"configuration.nimbo_controller", "the name was not resolved", ""}}))
                  .applied.size(),
              1U)
        << "it is stored, which is what was asked for";
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
