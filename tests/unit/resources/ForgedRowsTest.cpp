// The contents of a camera's name never change a statement.

#include "platform/value/ValueText.h"
#include "tests/support/RecordedStatements.h"
#include "tests/unit/resources/AccessListsFixture.h"

namespace lumio {
namespace {

using testing::UnorderedElementsAre;

constexpr const char* accessListOf =
    "select record_uuid from access_control_entries where resource_type = 'Camera' and "
    "resource_id = ";

constexpr const char* uuidLine = "camera: the record's uuid is not an identifier; it counts as a record without a uuid";

class ForgedRows : public AccessLists {
  protected:
    void SetUp() override {
        AccessLists::SetUp();
        allow(7, uuidOf("user:anna"));
        allow(8, uuidOf("user:bo"));
    }
    /// Gives camera 8 a name, char(10) for each "|".
    void nameHall(const std::string& name) const {
        std::string quoted;
        for (const char c : name) {
            quoted += c == '\'' ? std::string("''") : std::string(1, c);
        }
        root.sql(database, "update cameras set name=replace('" + quoted + "','|',char(10)) where id=8");
    }
    /// The access-list statements of a listing, several of which run at a time.
    [[nodiscard]] std::vector<std::string> queries() {
        const adminhost::test::RecordedStatements statements(root);
        answer = *handler.getCamerasWithRequest({}).dictionary().get("cameras").array();
        std::vector<std::string> taken = statements.take();
        taken.erase(taken.begin());
        return taken;
    }
    [[nodiscard]] std::string personOf(std::size_t index) const {
        const Array* people = answer.at(index).dictionary()->get("allowedUsersAndGroups").array();
        return people == nullptr || people->empty() ? ""
                                                    : adminhost::textOf(people->front().dictionary()->get("shortName"));
    }

    Array answer;
};

TEST_F(ForgedRows, IdInANameIsNotTheCamerasId) {
    nameHall("x|id = 7");
    EXPECT_THAT(queries(), UnorderedElementsAre(accessListOf + std::string("'7'"), accessListOf + std::string("'8'")));
    EXPECT_EQ(personOf(1), "bo");
    EXPECT_EQ(answer[1].dictionary()->get("id"), Value("7")) << "the answer is what the line reading gives";
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(ForgedRows, StatementInANameIsNotRun) {
    nameHall("x|  id = 0' union select writefile('" +
             root.path("/Library/SorvaneProducer/Shared/Server/written").string() + "','x');--");
    EXPECT_THAT(queries(), UnorderedElementsAre(accessListOf + std::string("'7'"), accessListOf + std::string("'8'")));
    EXPECT_FALSE(std::filesystem::exists(root.path("/Library/SorvaneProducer/Shared/Server/written")));
}

TEST_F(ForgedRows, PaddedIdInANameIsNotTheCamerasId) {
    nameHall("x|                    id = 7");
    EXPECT_THAT(queries(), UnorderedElementsAre(accessListOf + std::string("'7'"), accessListOf + std::string("'8'")));
    EXPECT_EQ(personOf(1), "bo") << "only one line can begin the row";
}

TEST_F(ForgedRows, RowWithTwoReadingsHasNoIdAndSaysSoOnce) {
    nameHall("x|                  uuid = y");
    EXPECT_THAT(queries(),
                UnorderedElementsAre(accessListOf + std::string("'7'"), accessListOf + std::string("'(null)'")));
    EXPECT_EQ(personOf(1), "");
    EXPECT_THAT(log.lines, ElementsAre("camera: the record's id is not a number; it counts as a record without an id"));
}

TEST_F(ForgedRows, PiecesOfARowHaveNoId) {
    // An empty line ends a record, so the rest of the row is a separate record.
    nameHall("x||                    id = 7");
    const std::vector<std::string> statements = queries();
    ASSERT_EQ(answer.size(), 3U);
    EXPECT_THAT(statements,
                UnorderedElementsAre(accessListOf + std::string("'7'"), accessListOf + std::string("'(null)'"),
                                     accessListOf + std::string("'(null)'")));
    EXPECT_EQ(personOf(2), "");
}

TEST_F(ForgedRows, IdOfAnotherRowBelongsToNeither) {
    std::string whole = "x";
    for (const char* column :
         {"uuid", "create_user_uuid", "created_at", "update_user_uuid", "updated_at", "last_recording_uuid",
          "use_user_uuid", "used_at", "recording_status", "access_control_enabled"}) {
        whole += "|" + std::string(22 - std::string_view(column).size(), ' ') + column + " = t";
    }
    nameHall(whole + "||                    id = 7|                  name = forged");
    const std::vector<std::string> statements = queries();
    EXPECT_THAT(statements,
                UnorderedElementsAre(accessListOf + std::string("'(null)'"), accessListOf + std::string("'8'"),
                                     accessListOf + std::string("'(null)'")));
    EXPECT_EQ(personOf(2), "");
    EXPECT_EQ(log.lines.size(), 2U);
}

TEST_F(ForgedRows, IdThatIsNotANumberIsNoId) {
    root.sql(database,
             "alter table cameras rename to old; create table cameras as select * from old;"
             "update cameras set id='0'' or ''1''=''1' where id=8; update cameras set id=null where id=7");
    EXPECT_THAT(queries(),
                UnorderedElementsAre(accessListOf + std::string("'(null)'"), accessListOf + std::string("'(null)'")));
    EXPECT_EQ(personOf(1), "");
    EXPECT_EQ(log.lines.size(), 2U);
}

TEST_F(ForgedRows, UuidInAnotherColumnIsNotTheCamerasUuid) {
    root.sql(database, "update cameras set recording_status='x' || char(10) || 'uuid = C-7' where id=8");
    const auto hall = camera(1);
    EXPECT_EQ(hall->guid(), "C-7") << "as the line reading has it";
    const adminhost::test::RecordedStatements statements(root);
    hall->setACLEnabled(true);
    EXPECT_EQ(hall->delete_(), std::nullopt);
    EXPECT_THAT(statements.take(), ElementsAre("update cameras set access_control_enabled=\"t\" where uuid=\"C-8\""));
    EXPECT_THAT(calls(), ElementsAre("--remove_camera C-8 "));
}

TEST_F(ForgedRows, UuidThatIsNoIdentifierReachesNeitherStatementNorTool) {
    for (const char* uuid : {"C-7\" or \"1\"=\"1", "--remove_all", "", "a b"}) {
        root.sql(database, "update cameras set uuid='" + std::string(uuid) + "' where id=8");
        log.lines.clear();
        const auto hall = camera(1);
        const adminhost::test::RecordedStatements statements(root);
        hall->setACLEnabled(true);
        const Array entries{Dictionary{{"type", "user"}, {"shortName", "bo"}, {"_newid_", true}}};
        hall->changeACLsWithRequest(&entries);
        EXPECT_NE(hall->delete_(), std::nullopt);
        EXPECT_THAT(statements.take(), IsEmpty());
        EXPECT_THAT(calls(), IsEmpty());
        EXPECT_THAT(log.lines, ElementsAre(uuidLine, uuidLine, uuidLine));
    }
}

TEST_F(ForgedRows, LazilyLoadedRecordsHaveTheirOwnIdToo) {
    nameHall("x|id = 7");
    const auto hall = Camera::initWithGUID("C-8");
    ASSERT_NE(hall->data(), nullptr);
    EXPECT_EQ(hall->data()->get("id"), Value("7"));
    EXPECT_THAT(hall->getUserAndGroupACLs(), ElementsAre(uuidOf("user:bo")));
    nameHall("x|                    id = 7");
    const auto again = Camera::initWithGUID("C-8");
    ASSERT_NE(again->data(), nullptr);
    EXPECT_THAT(again->getUserAndGroupACLs(), ElementsAre(uuidOf("user:bo")));
}

}  // namespace
}  // namespace lumio
