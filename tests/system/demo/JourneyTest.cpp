// scripts/demo with the programs of this build: every step has the status that the script expects.

#include "tests/support/Program.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using adminhost::test::Errors;
using adminhost::test::ProgramResult;
using adminhost::test::runProgram;
using testing::AllOf;
using testing::ContainsRegex;
using testing::HasSubstr;

const std::string script = std::string(SOURCE_DIR) + "/scripts/demo";

TEST(Journey, ShowsTheMainTasksOnTheSampleService) {
    const ProgramResult demo = runProgram({script, "--built", BINARY_DIR}, Errors::merge);
    EXPECT_EQ(demo.status, 0) << demo.output;
    EXPECT_THAT(demo.output, AllOf(ContainsRegex("\n *Im Katalog "), ContainsRegex("\n *Hörfolge "),
                                   ContainsRegex("\n *カタログに公開 "), ContainsRegex("\n *Picture in Picture ")));
    EXPECT_THAT(demo.output,
                AllOf(HasSubstr("workflows.\"Publish to Catalog\".users.ben: (not allowed) -> (allowed): applied\n"),
                      HasSubstr(".groups.editors: (allowed) -> (not allowed): applied\n"),
                      ContainsRegex("workflows +Publish to Catalog +in its list, through the group lecturers\n")));
    EXPECT_THAT(demo.output, HasSubstr("The daemon has stopped."));
}

TEST(Journey, ShowsTheSameWithThePeopleInAnLdapServer) {
    const ProgramResult demo = runProgram({script, "--ldap", "--built", BINARY_DIR}, Errors::merge);
    EXPECT_EQ(demo.status, 0) << demo.output;
    EXPECT_THAT(demo.output, ContainsRegex("node +/LDAP\n"));
    EXPECT_THAT(demo.output,
                AllOf(HasSubstr("Anna Lindqvist (user)"),
                      HasSubstr("workflows.\"Publish to Catalog\".users.ben: (not allowed) -> (allowed): applied\n"),
                      HasSubstr(".groups.editors: (allowed) -> (not allowed): applied\n"),
                      ContainsRegex("workflows +Publish to Catalog +in its list, through the group lecturers\n")));
}

TEST(Journey, ReachesTheGridWithAnAccountThatItCreates) {
    const ProgramResult demo = runProgram({script, "--full", "--built", BINARY_DIR}, Errors::merge);
    EXPECT_EQ(demo.status, 0) << demo.output;
    EXPECT_THAT(demo.output, AllOf(HasSubstr("grid controller: passed\n"),
                                   ContainsRegex("grid controller +controller.test.example: available\n"),
                                   HasSubstr("\"nimboControllerState\": \"kNimboAvailable\"")));
    EXPECT_THAT(demo.output, HasSubstr("The daemon has stopped."));
}

TEST(Journey, UnknownOptionIsAUsageError) {
    const ProgramResult demo = runProgram({script, "--no-such-option"}, Errors::merge);
    EXPECT_EQ(demo.status, 2);
    EXPECT_THAT(demo.output, testing::StartsWith("usage: scripts/demo "));
}

}  // namespace
