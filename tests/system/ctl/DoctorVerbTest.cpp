#include "platform/json/Json.h"
#include "tests/system/ctl/FixtureClient.h"

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

using DoctorVerb = FixtureClient;

Array checksIn(const ProgramResult& result) {
    const auto value = parseJson(result.output);
    const Array* checks =
        value && value->dictionary() != nullptr ? value->dictionary()->get("checks").array() : nullptr;
    EXPECT_NE(checks, nullptr) << result.output;
    return checks == nullptr ? Array() : *checks;
}

TEST_F(DoctorVerb, PageHasALineForEachCheckWithItsFix) {
    const ProgramResult result = ctl({"doctor"});
    EXPECT_EQ(result.status, 1) << "the fixture's check is a warning: " << result.output;
    EXPECT_THAT(result.output,
                AllOf(HasSubstr("WARNING  fixture/sample"), HasSubstr("The sample is old."), HasSubstr("fix: renew it"),
                      HasSubstr("ok       socket"), HasSubstr("ok       command line"), HasSubstr(" checks: ")));
}

TEST_F(DoctorVerb, ProgramsGetTheChecksAsOneDocument) {
    const ProgramResult result = ctl({"--format", "json", "doctor"});
    EXPECT_EQ(result.status, 1);
    bool own = false;
    for (const Value& check : checksIn(result)) {
        EXPECT_EQ(check.dictionary()->size(), 4U);
        own = own || check.dictionary()->get("name") == Value("command line");
    }
    EXPECT_TRUE(own) << "the releases are compared";
}

TEST_F(DoctorVerb, FailureIsStatusTwo) {
    append(disk("/fixture-diagnose-throw"), "1");
    const ProgramResult result = ctl({"doctor"});
    EXPECT_EQ(result.status, 2);
    EXPECT_THAT(result.output, HasSubstr("FAILURE  fixture "));
}

TEST_F(DoctorVerb, DaemonThatCannotBeAskedIsStatusThreeAndTheSocketIsLookedAt) {
    const std::string program = std::string(BINARY_DIR) + "/bin/adminhostctl";
    const ProgramResult missing = runProgram({program, "--socket", "/nowhere/socket", "doctor"}, Errors::merge);
    EXPECT_EQ(missing.status, 3);
    EXPECT_THAT(missing.output, AllOf(HasSubstr("FAILURE  daemon"), HasSubstr("cannot be reached at /nowhere/socket"),
                                      HasSubstr("FAILURE  socket"), HasSubstr("systemctl start adminhostd")));
    const std::string file = (daemon.directory() / "no-socket").string();
    append(file, "");
    const ProgramResult none = runProgram({program, "--socket", file, "--format", "json", "doctor"}, Errors::merge);
    EXPECT_EQ(none.status, 3);
    EXPECT_THAT(none.output, HasSubstr("is not a socket."));
    EXPECT_EQ(checksIn(none).size(), 3U);
}

TEST_F(DoctorVerb, TextOfAPlugInDoesNotReachTheTerminalRaw) {
    append(disk("/fixture-diagnose-colour"), "1");
    EXPECT_THAT(ctl({"doctor"}).output, AllOf(HasSubstr("\\x1b[31m"), Not(HasSubstr("\x1b"))));
}

}  // namespace
}  // namespace adminhost::test
