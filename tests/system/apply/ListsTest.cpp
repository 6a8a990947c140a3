// Lists of cameras, workflows and properties: filters, order, columns, and what stands for long lists.

#include "tests/system/apply/ControlledService.h"

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::ContainsRegex;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::Not;

class Lists : public ControlledService {
  protected:
    /// The first column's values.
    [[nodiscard]] std::vector<std::string> namesOf(std::vector<std::string> words) const {
        words.emplace_back("--names");
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 0) << result.output;
        std::vector<std::string> names;
        std::istringstream lines(result.output);
        for (std::string line; std::getline(lines, line);) {
            names.push_back(line);
        }
        return names;
    }
};

TEST_F(Lists, FiltersLeaveTheElementsThatFitAllOfThem) {
    EXPECT_THAT(namesOf({"camera", "list", "--match", "lecture*"}),
                ElementsAre("Lecture hall 1", "Lecture hall 2", "Lecture hall 3"));
    EXPECT_THAT(namesOf({"camera", "list", "--status", "capturing*"}), ElementsAre("Main hall", "Studio A"));
    EXPECT_THAT(namesOf({"camera", "list", "--match", "*hall*", "--restricted"}),
                ElementsAre("Main hall", "Lecture hall 1"));
    EXPECT_THAT(namesOf({"camera", "list", "--allowed", "juergen", "--restricted"}),
                ElementsAre("Studio A", "Studio B"));
    EXPECT_THAT(namesOf({"camera", "list", "--allowed", "studio", "--match", "Lecture hall ?"}),
                ElementsAre("Lecture hall 2", "Lecture hall 3"))
        << "open to everyone";
    EXPECT_THAT(namesOf({"property", "list", "--match", "mail_*"}), ElementsAre("mail_sender", "mail_password"));
    EXPECT_THAT(namesOf({"workflow", "list", "--restricted", "--languages", "en"}),
                ElementsAre("Publish to Catalog", "Picture in Picture"));
    EXPECT_EQ(ctl({"camera", "list", "--match", "nothing"}).output, "none\n");
}

TEST_F(Lists, OrderIsThatOfTheColumn) {
    EXPECT_THAT(namesOf({"camera", "list", "--match", "*hall*", "--sort", "last used"}),
                ElementsAre("Lecture hall 2", "Lecture hall 1", "Main hall", "Lecture hall 3"))
        << "dates by time, missing ones last";
    EXPECT_THAT(namesOf({"property", "list", "--match", "c*", "--sort", "NAME"}),
                ElementsAre("catalog_password", "catalog_title", "copyright"));
}

TEST_F(Lists, ColumnsAreChosenByHeadingOrKey) {
    EXPECT_EQ(ctl({"camera", "list", "--match", "Studio *", "--columns", "status,uuid,NAME"}).output,
              "STATUS                UUID                                  NAME\n"
              "capturing_audio_only  " +
                  SampleRoot::uuidOf("camera", "Studio A") +
                  "  Studio A\n"
                  "starting              " +
                  SampleRoot::uuidOf("camera", "Studio B") + "  Studio B\n");
    EXPECT_EQ(ctl({"--format", "json", "camera", "list", "--match", "Roof", "--columns", "name"}).output,
              "[\n  {\n    \"name\": \"Roof\"\n  }\n]\n");
}

TEST_F(Lists, LongListIsShownAsNumbersUnlessWide) {
    EXPECT_EQ(ctl({"camera", "allow", "Studio A", "anna", "ben", "carla"}).status, 0);
    EXPECT_THAT(ctl({"camera", "list", "--match", "Studio A"}).output, ContainsRegex("yes +5 people, 1 group\n"));
    const std::string wide = ctl({"camera", "list", "--match", "Studio A", "--wide"}).output;
    EXPECT_THAT(wide, AllOf(HasSubstr("Anna Lindqvist (user)"), HasSubstr("studio (group)"), Not(HasSubstr("people"))));
    EXPECT_EQ(std::count(wide.begin(), wide.end(), '\n'), 2) << "nothing is wrapped";
}

TEST_F(Lists, ListThatDoesNotCountIsShownAsEveryone) {
    EXPECT_THAT(ctl({"camera", "list", "--match", "Library*"}).output,
                AllOf(ContainsRegex("no +everyone\n"), Not(HasSubstr("Carla Moreau (user)"))));
    EXPECT_THAT(ctl({"workflow", "list", "--columns", "name,allowed", "--languages", "en"}).output,
                ContainsRegex("Archive +everyone\n"));
}

TEST_F(Lists, UnknownColumnOrPersonIsUsage) {
    for (const auto& [words, message] : std::vector<std::pair<std::vector<std::string>, std::string>>{
             {{"camera", "list", "--sort", "nmae"}, "column not found: nmae; did you mean \"name\"?"},
             {{"camera", "list", "--columns", "name,size"},
              "column not found: size; the columns are id, name, status, "},
             {{"camera", "list", "--columns", ""}, "--columns: the list of columns is empty"},
             {{"camera", "list", "--allowed", "ana"}, "person or group not found: ana; did you mean \"anna\"?"},
             {{"property", "list", "--restricted"}, "\"property list\" does not have the option --restricted"},
             {{"workflow", "list", "--status", "idle"}, "it belongs to camera list"}}) {
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 2) << testing::PrintToString(words);
        EXPECT_THAT(result.output, HasSubstr(message));
    }
}

TEST_F(Lists, ShowHasNamesOfPeopleAndDatesWithTheirAge) {
    root.sql(
        "update cameras set used_at = datetime('now', 'localtime', '-2 minutes'), update_user_uuid = "
        "'7C0F4E0E-2B5C-5D2B-9B7F-0A4E8B6E9D12' where name = 'Main hall'");
    const std::string text = ctl({"camera", "show", "Main hall"}).output;
    EXPECT_THAT(
        text, AllOf(ContainsRegex("use_user_uuid +Anna Lindqvist\n"),
                    ContainsRegex("update_user_uuid +7C0F4E0E-2B5C-5D2B-9B7F-0A4E8B6E9D12 \\(not in the directory\\)"),
                    ContainsRegex("used_at +2 minutes ago, "), ContainsRegex("created_at +[0-9]+ (days|years?) ago, "),
                    Not(HasSubstr("_id_"))));
    EXPECT_THAT(ctl({"--format", "json", "camera", "show", "Main hall"}).output,
                AllOf(HasSubstr("\"use_user_uuid\": \"" + SampleRoot::uuidOf("user", "anna")), HasSubstr("\"_id_\"")));
}

TEST_F(Lists, NameThatATerminalWouldActOnIsEscapedAndFortyColumnsAreKept) {
    root.sql("update cameras set name = 'a' || char(27) || char(8238) where name = 'Roof'");
    const std::vector<std::string> words{
        "/usr/bin/env",  "-i",     "COLUMNS=40", std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket",
        daemon.socket(), "camera", "list"};
    const ProgramResult result = runProgram(words, Errors::merge);
    EXPECT_EQ(result.status, 0);
    EXPECT_THAT(result.output, AllOf(HasSubstr("a\\x1b\\u202e"), HasSubstr("omitted columns"), Not(HasSubstr("\x1b"))));
    std::istringstream lines(result.output);
    for (std::string line; std::getline(lines, line);) {
        const auto isContinuation = [](unsigned char c) { return (c & 0xC0U) == 0x80U; };
        EXPECT_LE(line.size() - static_cast<std::size_t>(std::count_if(line.begin(), line.end(), isContinuation)),
                  line.starts_with("(omitted") ? 80U : 40U)
            << line;
    }
}

}  // namespace
}  // namespace adminhost::test
