#include "tests/unit/resources/AccessListsFixture.h"
#include "tests/unit/resources/FixedDirectory.h"

#include <algorithm>
#include <cctype>

namespace lumio {
namespace {

TEST_F(AccessLists, DictionaryShowsNamesOfPeopleAndGroupsAndWhoUsesTheCamera) {
    allow(7, uuidOf("user:bo"));
    allow(7, uuidOf("group:editors"));
    const auto aula = camera();
    const Dictionary& shown = *aula->dictionary();
    EXPECT_EQ(shown.get("useUser"), Value("Anna Berg"));
    EXPECT_EQ(shown.get("access_control_enabled"), Value(true));
    EXPECT_EQ(*shown.get("allowedUsersAndGroups").array(), (Array{Value(Dictionary{{"shortName", "bo"},
                                                                                   {"longName", "bo"},
                                                                                   {"guid", uuidOf("user:bo")},
                                                                                   {"_id_", uuidOf("user:bo")},
                                                                                   {"type", "user"}}),
                                                                  Value(Dictionary{{"shortName", "editors"},
                                                                                   {"longName", "editors"},
                                                                                   {"guid", uuidOf("group:editors")},
                                                                                   {"_id_", uuidOf("group:editors")},
                                                                                   {"type", "group"}})}));
}

TEST_F(AccessLists, OfSeveralPeopleWithTheUuidOfWhoUsesItTheLastIsShown) {
    auto last = record("dsRecTypeStandard:Users", "last", "A");
    last.attributes[std::string(adminhost::directory::realName)] = {"Last One", "Other Name"};
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "first", "A"), last});
    EXPECT_EQ(camera()->dictionary()->get("useUser"), Value("Last One"));
    useDirectory(std::vector{last, record("dsRecTypeStandard:Users", "first", "A")});
    EXPECT_EQ(camera()->dictionary()->get("useUser"), Value("first")) << "no full name: the short one";
}

TEST_F(AccessLists, CameraThatNobodyUsesAsksForNoName) {
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "anybody", "A")});
    EXPECT_FALSE(camera(1)->dictionary()->contains("useUser"));
}

TEST_F(AccessLists, GroupDoesNotUseACamera) {
    root.sql(database, "update cameras set use_user_uuid='" + uuidOf("group:editors") + "'");
    EXPECT_FALSE(camera()->dictionary()->contains("useUser"));
}

TEST_F(AccessLists, ListedCamerasAccessSwitchIsTextUntilDictionaryMakesItABoolean) {
    const auto hall = camera(1);
    EXPECT_EQ(hall->data()->get("access_control_enabled"), Value("f"));
    EXPECT_EQ(hall->dictionary()->get("access_control_enabled"), Value(false));
    EXPECT_FALSE(hall->dictionary()->contains("useUser"));
    EXPECT_EQ(allowed(*hall), Array{});
}

TEST_F(AccessLists, DictionaryNeverExpandsTwice) {
    const auto aula = camera();
    EXPECT_EQ(aula->dictionary()->get("access_control_enabled"), Value(true));
    allow(7, uuidOf("user:bo"));
    EXPECT_EQ(aula->dictionary()->get("access_control_enabled"), Value(true));
    EXPECT_EQ(allowed(*aula), Array{});
}

class Expandable final : public Resource {
  public:
    using Resource::expandACLs;
    using Resource::getGroupDetailsForUUIDs;
    using Resource::readRow;
    [[nodiscard]] std::string_view resourceType() const noexcept override { return "camera"; }
};

TEST_F(AccessLists, ExpandingASecondTimeTurnsAStoredTrueIntoFalse) {
    Expandable resource;
    resource.readRow(Dictionary{{"id", "7"}, {"access_control_enabled", "t"}});
    resource.expandACLs();
    EXPECT_EQ(resource.data()->get("access_control_enabled"), Value(true));
    resource.expandACLs();
    EXPECT_EQ(resource.data()->get("access_control_enabled"), Value(false));
}

TEST_F(AccessLists, GroupLookUpFindsNoUsers) {
    EXPECT_EQ(Expandable::getGroupDetailsForUUIDs({uuidOf("user:bo"), uuidOf("group:editors")}).size(), 1U);
}

TEST_F(AccessLists, DictionaryOfACameraKnownOnlyByItsUuidLoadsNothingAndAsksForANullResource) {
    root.sql(database, "insert into access_control_entries values('" + uuidOf("user:bo") + "','Camera','(null)')");
    const auto aula = Camera::initWithGUID("C-7");
    EXPECT_EQ(aula->dictionary(), nullptr);
    EXPECT_THAT(aula->getUserAndGroupACLs(), ElementsAre(uuidOf("user:bo")));
}

TEST_F(AccessLists, AccessListIsTheRowsOfTypeAndIdInOrderWithDuplicates) {
    allow(7, "B");
    allow(7, "A");
    allow(8, "other camera");
    allow(7, "B");
    root.sql(database, "insert into access_control_entries values('other type','camera',7)");
    EXPECT_THAT(camera()->getUserAndGroupACLs(), ElementsAre("B", "A", "B"));
}

TEST_F(AccessLists, RowsOfTheAccessListWithoutAUuidAreSkipped) {
    // The empty line within the text ends its record, and the rest is a record without the column.
    root.sql(database, "insert into access_control_entries values('A' || char(10,10) || 'rest','Camera',7)");
    allow(7, "B");
    EXPECT_THAT(camera()->getUserAndGroupACLs(), ElementsAre("A", "B"));
}

TEST_F(AccessLists, FailedAccessListQueryIsLoggedAndEmpty) {
    const auto aula = camera();
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nprintf 'no table' >&2\nexit 3\n");
    EXPECT_THAT(aula->getUserAndGroupACLs(), IsEmpty());
    EXPECT_THAT(log.lines, ElementsAre("getUserAndGroupACLs SQL query returned error: sqliteQuery (3): Can't execute "
                                       "sqlite3 query: no table"));
}

TEST_F(AccessLists, UuidsThatNoLongerExistInTheDirectoryAreNotShown) {
    allow(7, uuidOf("user:gone"));
    allow(7, uuidOf("user:bo"));
    allow(7, "garbage");
    allow(7, "");
    const auto aula = camera();
    ASSERT_EQ(allowed(*aula).size(), 1U);
    EXPECT_EQ(allowed(*aula)[0].dictionary()->get("shortName"), Value("bo"));
}

TEST_F(AccessLists, UuidsAreFoundInAnyCaseAndShownAsTheDirectorySpellsThem) {
    std::string lower = uuidOf("user:bo");
    std::transform(lower.begin(), lower.end(), lower.begin(), [](unsigned char c) { return std::tolower(c); });
    allow(7, lower);
    const auto aula = camera();
    ASSERT_EQ(allowed(*aula).size(), 1U);
    EXPECT_EQ(allowed(*aula)[0].dictionary()->get("guid"), Value(uuidOf("user:bo")));
}

TEST_F(AccessLists, ThreeRecordsForTwoUuidsShowOneEntryForEachTheFirstOneKept) {
    allow(7, "A");
    allow(7, "B");
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "first", "A"),
                             record("dsRecTypeStandard:Groups", "twin", "A"),
                             record("dsRecTypeStandard:Users", "b", "B")});
    const auto aula = camera();
    ASSERT_EQ(allowed(*aula).size(), 2U);
    EXPECT_EQ(allowed(*aula)[0].dictionary()->get("shortName"), Value("first"));
    EXPECT_EQ(allowed(*aula)[1].dictionary()->get("shortName"), Value("b"));
}

TEST_F(AccessLists, DuplicatesAreFoundWhateverTheCaseOfTheirUuids) {
    allow(7, "AB");
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "first", "ab"),
                             record("dsRecTypeStandard:Groups", "twin", "AB")});
    const auto aula = camera();
    ASSERT_EQ(allowed(*aula).size(), 1U);
    EXPECT_EQ(allowed(*aula)[0].dictionary()->get("guid"), Value("ab"));
}

TEST_F(AccessLists, DuplicatesStayWhenTheDirectoryReturnsNoMoreEntriesThanUuids) {
    allow(7, "A");
    allow(7, "A");
    useDirectory(
        std::vector{record("dsRecTypeStandard:Users", "first", "A"), record("dsRecTypeStandard:Groups", "twin", "A")});
    EXPECT_EQ(allowed(*camera()).size(), 2U);
}

TEST_F(AccessLists, EntriesWithoutUuidAreDroppedOnlyTogetherWithDuplicates) {
    allow(7, "A");
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "nameless", std::nullopt)});
    EXPECT_EQ(allowed(*camera()).size(), 1U);
    useDirectory(std::vector{record("dsRecTypeStandard:Users", "nameless", std::nullopt),
                             record("dsRecTypeStandard:Users", "a", "A")});
    const auto aula = camera();
    ASSERT_EQ(allowed(*aula).size(), 1U);
    EXPECT_EQ(allowed(*aula)[0].dictionary()->get("shortName"), Value("a"));
}

TEST_F(AccessLists, FailingDirectoryIsToldOnStandardOutputAndTheListIsEmpty) {
    allow(7, "A");
    useDirectory(std::nullopt);
    testing::internal::CaptureStdout();
    const auto hall = camera(1);
    const auto aula = camera();
    EXPECT_EQ(allowed(*aula), Array{});
    // Two queries: for the user of the camera, and for the list.
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              "Tarn query error for users: the directory is away\nTarn query error for users: the directory is away\n");
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(AccessLists, MissingAccountFilesGiveAnEmptyList) {
    allow(7, uuidOf("user:bo"));
    std::filesystem::remove(root.path("/etc/passwd"));
    std::filesystem::remove(root.path("/etc/group"));
    testing::internal::CaptureStdout();
    EXPECT_EQ(allowed(*camera()), Array{});
    (void)testing::internal::GetCapturedStdout();
}

TEST_F(AccessLists, AllowedGroupsAnswersTheUserEntriesOnly) {
    allow(7, uuidOf("user:bo"));
    allow(7, uuidOf("group:editors"));
    const auto aula = camera();
    EXPECT_EQ(aula->allowedUsers(), Array{}) << "nothing is expanded yet";
    (void)aula->dictionary();
    ASSERT_EQ(aula->countOfAllowedGroups(), 1U);
    EXPECT_EQ(aula->allowedGroups(), aula->allowedUsers());
    EXPECT_EQ(aula->objectInAllowedGroupsAtIndex(0).dictionary()->get("shortName"), Value("bo"));
}

TEST_F(AccessLists, IndexOutOfRangeAnswersNull) {
    allow(7, uuidOf("user:bo"));
    const auto aula = camera();
    (void)aula->dictionary();
    EXPECT_EQ(aula->countOfAllowedUsers(), 1U);
    EXPECT_FALSE(aula->objectInAllowedUsersAtIndex(0).isNull());
    EXPECT_TRUE(aula->objectInAllowedUsersAtIndex(1).isNull());
    EXPECT_TRUE(aula->objectInAllowedGroupsAtIndex(99).isNull());
}

TEST_F(AccessLists, TypeWordsCompareExactlyInAllowedUsersAndWithoutCaseInChanges) {
    const auto aula = camera();
    aula->setData(Dictionary{{"allowedUsersAndGroups", Array{Value(Dictionary{{"type", "User"}}), Value("text")}}});
    EXPECT_EQ(aula->allowedUsers(), Array{});
    change({Value(Dictionary{{"type", "User"}, {"shortName", "bo"}, {"_newid_", true}}),
            Value(Dictionary{{"type", "GROUP"}, {"shortName", "editors"}, {"_newid_", "yes"}})});
    EXPECT_THAT(
        calls(),
        ElementsAre(
            "--add_access --resource_type camera --resource_uuid C-7 --record_type user --shortname bo ",
            "--add_access --resource_type camera --resource_uuid C-7 --record_type group --shortname editors "));
}

}  // namespace
}  // namespace lumio
