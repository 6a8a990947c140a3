#include "adminhostctl/Failure.h"
#include "adminhostctl/desired/Plan.h"
#include "adminhostctl/desired/State.h"
#include "tests/unit/adminhostctl/Describe.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::ctl {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

const StateForm& form() {
    static const StateForm form(describe("writeSettings"));
    return form;
}
const ListForm& workflows() {
    return form().list("workflows");
}

Value workflow(const char* uuid, const char* name, const char* path) {
    return Dictionary{{"_id_", uuid}, {"name", name}, {"bundle_path", path}};
}
State sample() {
    return stateOf(
        form(), {{"workflows",
                  Array{workflow("AAAA-1", "Publier", "W/Publish.workflow"), workflow("AAAA-2", "", "W/Gone.workflow"),
                        workflow("AAAA-3", "Encoder", "W/Same.workflow"),
                        workflow("AAAA-4", "Encoder", "W/Same.workflow"), workflow("AAAA-5", "AAAA-1", "")}}});
}

std::string identityOf(const Element* element) {
    return element == nullptr ? "(none)" : element->identity;
}
std::string refusalOf(const std::string& name) {
    const State state = sample();
    try {
        (void)findByAnyName(state, workflows(), name);
    } catch (const Failure& failure) {
        EXPECT_EQ(failure.status(), ExitStatus::usage);
        return failure.what();
    }
    ADD_FAILURE() << name;
    return {};
}

TEST(FindByAnyName, FindsByIdentityInAnyCaseThenByNameOrAnotherName) {
    const State state = sample();
    EXPECT_EQ(identityOf(findByAnyName(state, workflows(), "aaaa-2")), "AAAA-2");
    EXPECT_EQ(identityOf(findByAnyName(state, workflows(), "Publier")), "AAAA-1");
    EXPECT_EQ(identityOf(findByAnyName(state, workflows(), "W/Gone.workflow")), "AAAA-2");
    EXPECT_EQ(identityOf(findByAnyName(state, workflows(), "AAAA-1")), "AAAA-1") << "an identity counts before a name";
    EXPECT_EQ(identityOf(findByAnyName(state, workflows(), "Publish")), "(none)");
    EXPECT_EQ(identityOf(findByAnyName(state, workflows(), "")), "(none)") << "a missing name is not a name";
}

TEST(FindByAnyName, NameOfSeveralIsRefusedWithTheirIdentitiesAndOtherNames) {
    for (const char* name : {"Encoder", "W/Same.workflow"}) {
        EXPECT_THAT(refusalOf(name), AllOf(HasSubstr("\n  AAAA-3  W/Same.workflow\n  AAAA-4  W/Same.workflow"),
                                           Not(HasSubstr("AAAA-1"))));
    }
}

TEST(FindElement, NamesALocalizedElementByItsIdentityOnly) {
    const State state = sample();
    EXPECT_EQ(identityOf(findElement(state, workflows(), "aaaa-1")), "AAAA-1");
    EXPECT_EQ(identityOf(findElement(state, workflows(), "Publier")), "(none)");
    EXPECT_EQ(identityOf(findElement(state, workflows(), "W/Publish.workflow")), "(none)");
}

TEST(Plan, ChangesOfAnElementAreShownUnderTheNameThatThePersonGave) {
    WantedElement wanted{"AAAA-1", {{"access_control_enabled", true}}, {}, {}, false, false};
    wanted.shownAs = "Publier";
    Wanted all;
    all.elements["workflows"].push_back(wanted);
    const Plan plan = planOf(form(), all, sample());
    ASSERT_EQ(plan.changes.size(), 1U);
    EXPECT_EQ(plan.changes.front().entry, "workflows.Publier.access_control");
    EXPECT_EQ(plan.root.get("workflows"),
              Value(Array{Dictionary{{"_id_", "AAAA-1"}, {"access_control_enabled", true}}}));
}

}  // namespace
}  // namespace adminhost::ctl
