// The history of properties, cameras and access lists, and their recovery.

#include "platform/json/Json.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/ValueText.h"
#include "tests/system/apply/ControlledService.h"

#include <unistd.h>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::Not;

class LookingBack : public ControlledService {
  protected:
    /// The number of the newest entry.
    [[nodiscard]] std::string newest() const {
        const auto list = parseJson(ctl({"--format", "json", "history"}).output);
        return textOf(list->array()->back().dictionary()->get("number"));
    }
    [[nodiscard]] std::string row(const std::string& property) const {
        return root.sql("select value, protect from properties where name='" + property + "'");
    }
};

TEST_F(LookingBack, WrongChangeOfAccessIsUndone) {
    ASSERT_EQ(ctl({"camera", "deny", "Main hall", "anna", "lecturers"}).status, 0);
    const std::string denied = newest();
    ASSERT_EQ(ctl({"camera", "allow", "Main hall", "ben"}).status, 0);
    const std::string allowed = newest();
    ASSERT_EQ(ctl({"camera", "access", "Main hall", "off"}).status, 0);
    const std::string opened = newest();
    const ProgramResult dry = ctl({"rollback", denied, "--dry-run"});
    EXPECT_EQ(dry.status, 0);
    EXPECT_THAT(dry.output, HasSubstr("users.anna: (not allowed) -> (allowed)\n"));
    EXPECT_THAT(ctl({"camera", "show", "Main hall"}).output, Not(HasSubstr("Anna Lindqvist (user)")));
    for (const std::string& number : {denied, allowed, opened}) {
        const ProgramResult rollback = ctl({"rollback", number});
        EXPECT_EQ(rollback.status, 0) << rollback.output;
        EXPECT_THAT(rollback.output, Not(HasSubstr("ben: (not allowed)")));
    }
    EXPECT_THAT(ctl({"camera", "show", "Main hall"}).output, HasSubstr("Anna Lindqvist (user), lecturers (group)\n"));
    EXPECT_EQ(root.sql("select access_control_enabled from cameras where name='Main hall'"), "t\n");
    EXPECT_EQ(ctl({"rollback", denied}).output, "no change\n");
}

TEST_F(LookingBack, ValuesOfPropertiesAreRestoredAndRemovedOnesAddedAgain) {
    ASSERT_EQ(ctl({"property", "set", "default_language", "fr"}).status, 0);
    const std::string changed = newest();
    ASSERT_EQ(ctl({"property", "set", "colour", "blue"}).status, 0);
    const std::string added = newest();
    ASSERT_EQ(ctl({"property", "remove", "colour"}).status, 0);
    EXPECT_EQ(ctl({"rollback", changed}).status, 0);
    EXPECT_EQ(row("default_language"), "de|f\n");
    EXPECT_EQ(ctl({"rollback", added}).output, "no change\n") << "it has been removed since";
}

TEST_F(LookingBack, RemovedPropertyIsAddedAgainWithItsValueUnlessItWasASecret) {
    ASSERT_EQ(ctl({"property", "set", "colour", "blue"}).status, 0);
    ASSERT_EQ(ctl({"property", "remove", "colour"}).status, 0);
    const std::string removed = newest();
    const ProgramResult dry = ctl({"rollback", removed, "--dry-run"});
    EXPECT_EQ(dry.output, "properties.colour: (not present) -> \"blue\"\n");
    EXPECT_EQ(row("colour"), "");
    const ProgramResult rollback = ctl({"rollback", removed});
    EXPECT_EQ(rollback.status, 0) << rollback.output;
    EXPECT_EQ(rollback.output, "properties.colour: (not present) -> \"blue\": applied\n");
    EXPECT_EQ(row("colour"), "blue|f\n");
    EXPECT_EQ(ctl({"rollback", removed}).output, "no change\n");
    ASSERT_EQ(ctl({"property", "remove", "upload_token"}).status, 0);
    const ProgramResult secret = ctl({"rollback", newest()});
    EXPECT_EQ(secret.status, 1);
    EXPECT_THAT(secret.output, AllOf(HasSubstr("properties.upload_token: "),
                                     HasSubstr("not restored, a stored secret cannot be written back\nno change\n")));
}

TEST_F(LookingBack, WhatCannotBeRestoredIsSaidBeforeAnythingIsWritten) {
    ASSERT_EQ(ctl({"camera", "remove", "Studio A"}).status, 0);
    const ProgramResult camera = ctl({"rollback", newest()});
    EXPECT_EQ(camera.status, 1);
    EXPECT_THAT(camera.output, AllOf(HasSubstr("not restored, what was removed cannot be added again\nno change\n")));
    ASSERT_EQ(ctl({"property", "set", "upload_token", "@" + file("token", "new")}).status, 0);
    const ProgramResult secret = ctl({"rollback", newest(), "--dry-run"});
    EXPECT_THAT(secret.output, HasSubstr("not restored, a stored secret cannot be written back\nno change\n"));
}

TEST_F(LookingBack, RenamedPropertyIsNotRestoredAndFailsTheRollback) {
    std::string id = root.sql("select id from properties where name='default_language'");
    id.pop_back();
    ASSERT_EQ(ctl({"writeSettings", "configuration.properties.0._id_=" + id,
                   "configuration.properties.0.name=first_language"})
                  .status,
              0);
    const ProgramResult renamed = ctl({"rollback", newest()});
    EXPECT_EQ(renamed.status, 1);
    EXPECT_THAT(
        renamed.output,
        AllOf(HasSubstr("properties.default_language.name: \"default_language\" -> \"first_language\": not restored, "),
              HasSubstr("no change\n")));
}

TEST_F(LookingBack, AccessOfAnAccountThatIsGoneIsNotRestoredAndFailsTheRollback) {
    const std::string uuid = SampleRoot::uuidOf("user", "juergen");
    root.removeAccount("juergen");
    ASSERT_EQ(ctl({"access", uuid, "--revoke"}).status, 0);
    const ProgramResult revoked = ctl({"rollback", newest()});
    EXPECT_EQ(revoked.status, 1);
    EXPECT_THAT(revoked.output,
                AllOf(HasSubstr("cameras.\"Studio A\".access: \"" + uuid + "\" -> (not set): not restored, "),
                      HasSubstr("no change\n")));
}

TEST_F(LookingBack, ChangesThatTheHistoryCouldNotKeepAreCountedAndFailTheRollback) {
    ASSERT_EQ(ctl({"property", "set", "colour", "blue"}).status, 0);
    const HostPath entry(root.path() + "/var/lib/adminhostd/history/lumio/resources/00000001.plist");
    auto stored = readPropertyList(diskPath(entry));
    ASSERT_TRUE(stored && stored->dictionary() != nullptr);
    stored->dictionary()->set("changesDropped", 200);
    ASSERT_TRUE(writePropertyList(*stored, entry));
    EXPECT_THAT(ctl({"history"}).output, ContainsRegex("colour.*\n +and 200 more, which are not recorded"));
    const ProgramResult rollback = ctl({"rollback", newest()});
    EXPECT_EQ(rollback.status, 1);
    EXPECT_THAT(rollback.output, AllOf(HasSubstr("200 more changes of that request: not restored, "),
                                       HasSubstr("properties.colour: \"blue\" -> (removed): applied\n")));
    EXPECT_EQ(row("colour"), "");
}

TEST_F(LookingBack, HistoryIsFilteredAndHasSecondsAndZone) {
    ASSERT_EQ(ctl({"settings", "set", "server_port", "8180"}).status, 0);
    ASSERT_EQ(ctl({"property", "set", "colour", "blue"}).status, 0);
    const std::string all = ctl({"history"}).output;
    EXPECT_THAT(all, ContainsRegex("r1 .*, [0-9][0-9]:[0-9][0-9]:[0-9][0-9] [A-Z+-].*colour"));
    EXPECT_THAT(ctl({"history", "--key", "server_port"}).output,
                AllOf(HasSubstr("server_port"), Not(HasSubstr("colour"))));
    EXPECT_THAT(ctl({"history", "--key", "properties"}).output,
                AllOf(HasSubstr("colour"), Not(HasSubstr("server_port"))));
    EXPECT_THAT(ctl({"history", "--key", "no_such"}).output, HasSubstr("No such change has been recorded."));
    EXPECT_THAT(ctl({"history", "--since", "today"}).output, AllOf(HasSubstr("colour"), HasSubstr("server_port")));
    EXPECT_THAT(ctl({"history", "--since", "2999-01-01"}).output, HasSubstr("No such change"));
    EXPECT_EQ(ctl({"history", "--since", "soon"}).status, 2);
    EXPECT_THAT(ctl({"history", "--user", std::to_string(::geteuid())}).output, HasSubstr("server_port"));
    EXPECT_THAT(ctl({"history", "--user", "nobody-of-that-name"}).output, HasSubstr("No such change"));
}

}  // namespace
}  // namespace adminhost::test
