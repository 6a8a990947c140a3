#include "platform/directory/Entries.h"
#include "platform/directory/Membership.h"
#include "platform/directory/NameBasedUuid.h"
#include "tests/unit/platform/directory/TemporaryAccounts.h"

#include <gmock/gmock.h>

namespace adminhost {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class Entries : public testing::Test {
  protected:
    Entries() {
        _root.users(
            "anna:x:1001:1000:Anna Berg:/home/anna:/bin/sh\nberta:x:1002:1000:Annegret Zorn:/:\n"
            "Andi:x:1003:1000::/:\nroot:x:0:0:root:/root:\ntoor:x:0:0::/:\n");
        _root.groups("root:x:0:\nanimators:x:2000:anna\nbert:x:2001:\n");
    }
    static std::vector<std::string> shortNames(const Result<Array>& entries) {
        std::vector<std::string> names;
        for (const Value& entry : entries.value_or(Array())) {
            names.push_back(*entry.dictionary()->get("shortName").string());
        }
        return names;
    }

    static PosixId user(std::uint32_t id) { return {id, PosixId::Kind::user, "/Local"}; }
    static PosixId group(std::uint32_t id) { return {id, PosixId::Kind::group, "/Local"}; }

    TemporaryAccounts _root;
};

TEST_F(Entries, EntryHasNamesUuidTwiceAndKind) {
    const auto entries = directoryEntries("anna", 0);
    ASSERT_TRUE(entries);
    const std::string uuid = "81CEF789-6423-555F-BB64-F7BD915968D3";
    EXPECT_EQ(
        *entries,
        (Array{Dictionary{
            {"shortName", "anna"}, {"longName", "Anna Berg"}, {"guid", uuid}, {"_id_", uuid}, {"type", "user"}}}));
}

TEST_F(Entries, EntryWithoutFullNameShowsTheShortName) {
    const auto entries = directoryEntries("animators", 0);
    ASSERT_EQ(entries.value_or(Array()).size(), 1U);
    EXPECT_EQ(entries->at(0).dictionary()->get("longName"), Value("animators"));
    EXPECT_EQ(entries->at(0).dictionary()->get("type"), Value("group"));
}

TEST_F(Entries, WhatARecordLacksIsAbsent) {
    const DirectoryRecord record{"dsRecTypeStandard:Computers", "/Local", {}};
    EXPECT_EQ(directoryEntryOf(record), (Dictionary{{"type", "group"}}));
}

TEST_F(Entries, BeginningOfShortOrFullNameMatchesWithoutRegardToCaseShortNamesFirst) {
    EXPECT_THAT(shortNames(directoryEntries("AN", 0)), ElementsAre("anna", "Andi", "animators", "berta"));
    EXPECT_THAT(shortNames(directoryEntries("anne", 0)), ElementsAre("berta"));
    EXPECT_THAT(shortNames(directoryEntries("nn", 0)), IsEmpty());
}

TEST_F(Entries, LimitCountsEachRecordOnceAndIsFilled) {
    EXPECT_THAT(shortNames(directoryEntries("an", 2)), ElementsAre("anna", "Andi"));
    EXPECT_THAT(shortNames(directoryEntries("an", 3)), ElementsAre("anna", "Andi", "animators"));
    EXPECT_THAT(shortNames(directoryEntries("an", 4)), ElementsAre("anna", "Andi", "animators", "berta"));
    EXPECT_THAT(shortNames(directoryEntries("an", 5)), ElementsAre("anna", "Andi", "animators", "berta"));
}

TEST_F(Entries, EmptyTextFindsAll) {
    EXPECT_EQ(directoryEntries("", 0).value_or(Array()).size(), 8U);
}

TEST_F(Entries, DirectoryThatFailsIsAnError) {
    std::filesystem::remove(_root.path("etc/passwd"));
    const auto entries = directoryEntries("an", 0);
    ASSERT_FALSE(entries);
    EXPECT_EQ(entries.error().code, ENOENT);
    EXPECT_FALSE(directoryEntriesOf("anna"));
    EXPECT_FALSE(directoryGroupsOf("anna"));
}

TEST_F(Entries, NameOrUuidIsFoundWithItsNode) {
    for (const char* text : {"anna", "81CEF789-6423-555F-BB64-F7BD915968D3", "81cef789-6423-555f-bb64-f7bd915968d3"}) {
        const auto entries = directoryEntriesOf(text);
        ASSERT_EQ(entries.value_or(Array()).size(), 1U) << text;
        EXPECT_EQ(entries->at(0).dictionary()->get("node"), Value("/Local"));
        EXPECT_EQ(entries->at(0).dictionary()->get("shortName"), Value("anna"));
    }
    EXPECT_THAT(shortNames(directoryEntriesOf("root")), ElementsAre("root", "root"));
    EXPECT_THAT(shortNames(directoryEntriesOf("nobody")), IsEmpty());
}

TEST_F(Entries, PersonWithAKerberosAuthorityIsFoundWithThePrincipal) {
    EXPECT_FALSE(directoryEntriesOf("anna").value().at(0).dictionary()->contains("kerberosPrincipal"));
    setDirectoryNodes({localAccounts(std::nullopt, "EXAMPLE.ORG")});
    const auto entries = directoryEntriesOf("anna");
    setDirectoryNodes({localAccounts()});
    EXPECT_EQ(entries.value().at(0).dictionary()->get("kerberosPrincipal"), Value("anna@EXAMPLE.ORG"));
}

TEST_F(Entries, MembershipMapsUuidsToIdsWithTheirKind) {
    const auto uuid = mbr_string_to_uuid("81cef789-6423-555f-bb64-f7bd915968d3");
    ASSERT_TRUE(uuid);
    EXPECT_EQ(mbr_uuid_to_id(*uuid).value(), (PosixId{1001, PosixId::Kind::user, "/Local"}));
    EXPECT_EQ(mbr_uuid_to_id(nameBasedUuid(localAccountsNamespace, "group:animators")).value(),
              (PosixId{2000, PosixId::Kind::group, "/Local"}));
    EXPECT_EQ(static_cast<int>(PosixId::Kind::user), 0);
    EXPECT_EQ(static_cast<int>(PosixId::Kind::group), 1);
    EXPECT_FALSE(mbr_uuid_to_id(nameBasedUuid(localAccountsNamespace, "user:gone")).value());
    EXPECT_FALSE(mbr_string_to_uuid("garbage"));
}

TEST_F(Entries, MembershipOfAnUnreadableDirectoryIsItsError) {
    std::filesystem::remove(_root.path("etc/passwd"));
    const auto id = mbr_uuid_to_id(*mbr_string_to_uuid("81cef789-6423-555f-bb64-f7bd915968d3"));
    ASSERT_FALSE(id);
    EXPECT_EQ(id.error().code, ENOENT);
    EXPECT_FALSE(nameOf(user(1001)));
    EXPECT_EQ(nameOf(group(2000)).value(), "animators");
}

TEST_F(Entries, NamesOfIdsComeFromTheAccountsBelowTheSystemRootTheFirstOfSeveral) {
    EXPECT_EQ(nameOf(user(1001)).value(), "anna");
    EXPECT_EQ(nameOf(user(0)).value(), "root");
    EXPECT_EQ(nameOf(group(2000)).value(), "animators");
    EXPECT_FALSE(nameOf(user(4711)).value());
    EXPECT_FALSE(nameOf(group(1001)).value()) << "a user's id is no group's";
}

TEST_F(Entries, GroupsOfAPersonAreThoseThatListTheLoginAndThePrimaryGroup) {
    _root.groups("staff:x:1000:\nanimators:x:2000:bo,anna\nbert:x:2001:annabel\n");
    EXPECT_THAT(shortNames(directoryGroupsOf("anna")), ElementsAre("staff", "animators"));
    EXPECT_THAT(shortNames(directoryGroupsOf("81CEF789-6423-555F-BB64-F7BD915968D3")),
                ElementsAre("staff", "animators"));
    EXPECT_THAT(shortNames(directoryGroupsOf("animators")), IsEmpty()) << "a group is not a person";
}

}  // namespace
}  // namespace adminhost
