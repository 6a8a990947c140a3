// "access NAME": what a person or group may use.

#include "platform/json/Json.h"
#include "tests/system/apply/ControlledService.h"

#include <filesystem>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::Contains;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::Not;

class AccessVerb : public ControlledService {
  protected:
    /// "Main hall: directly, through lecturers" for each element that the name may use.
    [[nodiscard]] std::vector<std::string> accessOf(std::vector<std::string> words) const {
        words.insert(words.begin(), {"--format", "json", "--languages", "en", "access"});
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 0) << result.output;
        const auto value = parseJson(result.output);
        std::vector<std::string> all;
        for (const Value& one : value && value->array() != nullptr ? *value->array() : Array()) {
            const Dictionary& access = *one.dictionary();
            std::string text(access.text("section"));
            text.append(" ").append(access.text("name")).append(":");
            text += access.get("everyone") == Value(true) ? " everyone" : "";
            text += access.get("directly") == Value(true) ? " directly" : "";
            for (const Value& group : *access.get("through").array()) {
                text += ' ' + *group.string();
            }
            all.push_back(text);
        }
        return all;
    }
};

TEST_F(AccessVerb, PersonMayUseWhatIsOpenWhatListsThemAndWhatListsTheirGroups) {
    const std::vector<std::string> anna = accessOf({"anna"});
    EXPECT_THAT(anna,
                AllOf(Contains("cameras Main hall: directly lecturers"), Contains("cameras Lecture hall 1: lecturers"),
                      Contains("cameras Lecture hall 2: everyone"), Contains("cameras Éditing suite: editors"),
                      Contains("workflows Publish to Catalog: editors lecturers"),
                      Contains("workflows Audio Episode: everyone"), Contains("workflows Archive: everyone")));
    EXPECT_THAT(anna, AllOf(Not(Contains(HasSubstr("Studio A"))), Not(Contains(HasSubstr("Picture in Picture")))));
    EXPECT_EQ(accessOf({SampleRoot::uuidOf("user", "anna")}), anna);
    EXPECT_THAT(accessOf({"juergen"}), AllOf(Contains("workflows Picture in Picture: directly"),
                                             Contains("cameras Studio A: directly studio")));
    EXPECT_THAT(accessOf({"carla"}), Contains("cameras Library, reading room: everyone directly"));
}

TEST_F(AccessVerb, TextNamesTheGroupsAndShowsTheNameInTheCallersLanguage) {
    const std::string text = ctl({"access", "ben", "--languages", "de"}).output;
    EXPECT_THAT(text, AllOf(ContainsRegex("workflows +Im Katalog veröffentlichen +through the group lecturers\n"),
                            ContainsRegex("workflows +Hörfolge +open to everyone\n"),
                            ContainsRegex("cameras +Main hall +through the group lecturers\n")));
}

TEST_F(AccessVerb, GroupMayUseWhatListsIt) {
    EXPECT_THAT(accessOf({"lecturers"}),
                AllOf(Contains("cameras Main hall: directly"), Contains("workflows Publish to Catalog: directly")));
    root.write("/etc/group", root.read("/etc/group") + "anna:x:1999:\n");
    EXPECT_THAT(accessOf({"anna"}), Contains("cameras Main hall: directly lecturers")) << "the person comes first";
    EXPECT_THAT(accessOf({"anna", "--group"}), Not(Contains(HasSubstr("Main hall"))));
}

TEST_F(AccessVerb, NameThatNobodyHasIsAUsageError) {
    for (const std::vector<std::string>& words : {std::vector<std::string>{"access", "nobodyhere"},
                                                  {"access", "ben", "--group"},
                                                  {"access", SampleRoot::uuidOf("user", "gone")},
                                                  {"access", ""}}) {
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 2);
        EXPECT_THAT(result.output, HasSubstr(" not found"));
    }
}

TEST_F(AccessVerb, FailsWhenTheDirectoryOrAnAccessListCannotBeRead) {
    root.sql("alter table access_control_entries rename to gone");
    const ProgramResult lists = ctl({"access", "anna"});
    EXPECT_EQ(lists.status, 1);
    EXPECT_THAT(lists.output, HasSubstr("parts of the state could not be read"));
    root.sql("alter table gone rename to access_control_entries");
    std::filesystem::remove(root.disk("/etc/group"));
    const ProgramResult directory = ctl({"access", "anna"});
    EXPECT_EQ(directory.status, 1);
    EXPECT_THAT(directory.output, HasSubstr("parts of the state could not be read: the access lists ("));
}

}  // namespace
}  // namespace adminhost::test
