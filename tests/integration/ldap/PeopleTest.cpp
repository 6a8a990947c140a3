// People across nodes: the search node, membership, and the groups of a person.

#include "platform/directory/Entries.h"
#include "platform/directory/Membership.h"
#include "tests/integration/ldap/TestDirectory.h"
#include "tests/support/TemporaryRoot.h"

namespace adminhost {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

std::vector<std::string> shortNames(const Result<Array>& entries) {
    if (!entries) {
        return {"error " + std::to_string(entries.error().code)};
    }
    std::vector<std::string> names;
    for (const Value& entry : *entries) {
        const std::string* name = entry.dictionary()->get("shortName").string();
        names.push_back(name == nullptr ? "(no name)" : *name);
    }
    return names;
}

Uuid uuidWith(int number) {
    return *mbr_string_to_uuid(uuidNumber(number));
}

class LdapPeople : public testing::Test {
  protected:
    test::TemporaryRoot _root;
};

TEST_F(LdapPeople, SearchNodeAsksNodesInOrderAndTheFirstRecordCountsEvenWithoutTheAttribute) {
    support::Slapd first;
    first.add(tree + personEntry("anna", 1001));
    support::Slapd second;
    second.add(tree + personEntry("anna", 1002, "krbPrincipalName: anna@TWO.TEST\n"));
    LdapNodeSettings one = settingsFor(first);
    one.name = "/One";
    LdapNodeSettings two = settingsFor(second);
    two.name = "/Two";
    const SessionWith session({ldapNode(one), ldapNode(two)});
    DirectoryQuery query = queryFor(directory::recordName, {"anna"});
    query.recordTypes = {std::string(directory::users)};
    query.attributes = {std::string(directory::authenticationAuthority)};
    auto records = searchDirectory(query).value();
    ASSERT_EQ(records.size(), 2U);
    EXPECT_EQ(records[0].node, "/One");
    EXPECT_EQ(records[1].node, "/Two");
    query.maximum = 1;
    records = searchDirectory(query).value();
    ASSERT_EQ(records.size(), 1U);
    EXPECT_EQ(records[0].node, "/One");
    EXPECT_THAT(records[0].values(directory::authenticationAuthority), IsEmpty());
}

TEST_F(LdapPeople, EntryWithoutANameIsLeftOutOfCompletion) {
    support::Slapd server;
    server.add(tree + personEntry("anna", 1, "testLogin: anna\n") + personEntry("nameless", 2));
    LdapNodeSettings settings = settingsFor(server);
    settings.userMap["RecordName"] = "testLogin";
    const SessionWith session({ldapNode(settings)});
    EXPECT_THAT(shortNames(directoryEntries("Full Name", 10)), ElementsAre("anna"));
}

TEST_F(LdapPeople, CompletionFindsBeginningsWithoutRegardToCase) {
    support::Slapd server;
    server.add(tree + personEntry("anna", 1) + personEntry("bo", 2) + groupEntry("animators", 3));
    const SessionWith session({ldapNode(settingsFor(server))});
    EXPECT_THAT(shortNames(directoryEntries("AN", 10)), ElementsAre("anna", "animators"));
    EXPECT_THAT(shortNames(directoryEntries("full name of b", 10)), ElementsAre("bo"));
}

TEST_F(LdapPeople, NameOfAUuidIsThatOfTheNodeThatKnowsTheUuid) {
    _root.write("/etc/passwd", "local:x:1001:1::/:\n");
    _root.write("/etc/group", "localgroup:x:2001:\n");
    support::Slapd server;
    server.add(tree + personEntry("anna", 1001) + groupEntry("editors", 2001));
    const SessionWith session({localAccounts(), ldapNode(settingsFor(server))});
    const auto person = mbr_uuid_to_id(uuidWith(1001)).value();
    EXPECT_EQ(person, (PosixId{1001, PosixId::Kind::user, "/LDAP"}));
    EXPECT_EQ(nameOf(*person).value(), "anna") << "and not the local account with that number";
    const auto group = mbr_uuid_to_id(uuidWith(2001)).value();
    EXPECT_EQ(group, (PosixId{2001, PosixId::Kind::group, "/LDAP"}));
    EXPECT_EQ(nameOf(*group).value(), "editors");
    EXPECT_FALSE(mbr_uuid_to_id(uuidWith(7)).value());
}

TEST_F(LdapPeople, RecordWithoutANumericIdHasNone) {
    support::Slapd::Options options;
    options.schema = support::Slapd::Schema::rfc2307bis;
    support::Slapd server(options);
    server.add(tree +
               "dn: cn=plain,ou=groups,dc=nimbo,dc=test\nobjectClass: groupOfNames\ncn: plain\nmember: "
               "cn=nobody\nentryUUID: " +
               uuidNumber(5) + "\n\n");
    LdapNodeSettings settings = settingsFor(server);
    settings.schema = LdapNodeSettings::Schema::rfc2307bis;
    const SessionWith session({ldapNode(settings)});
    EXPECT_THAT(shortNames(directoryEntriesOf(uuidNumber(5))), ElementsAre("plain"));
    EXPECT_FALSE(mbr_uuid_to_id(uuidWith(5)).value());
}

TEST_F(LdapPeople, NodeThatFailsIsAnErrorUnlessAnotherKnowsTheUuid) {
    _root.write("/etc/passwd", "local:x:1001:1::/:\n");
    _root.write("/etc/group", "");
    support::Slapd server;
    server.add(tree + personEntry("anna", 1001));
    LdapNodeSettings down = settingsFor(server);
    down.name = "/Down";
    down.uris = {"ldap://127.0.0.1:" + std::to_string(support::freePort())};
    const SessionWith session({ldapNode(down), ldapNode(settingsFor(server))});
    EXPECT_EQ(mbr_uuid_to_id(uuidWith(1001)).value(), (PosixId{1001, PosixId::Kind::user, "/LDAP"}));
    EXPECT_EQ(errorOf(mbr_uuid_to_id(uuidWith(7))).code, -1);
}

TEST_F(LdapPeople, GroupsOfAPersonAreThoseOfItsLoginAndItsPrimaryGroup) {
    support::Slapd server;
    std::string many = "memberUid: x0\n";
    for (int i = 1; i < 1000; ++i) {
        many += "memberUid: x" + std::to_string(i) + "\n";
    }
    server.add(tree + personEntry("anna", 1) + groupEntry("primary", 100) +
               groupEntry("zebra", 101, "memberUid: anna\n") + groupEntry("editors", 102, many + "memberUid: anna\n") +
               groupEntry("others", 103, "memberUid: annabel\n"));
    const SessionWith session({ldapNode(settingsFor(server))});
    EXPECT_THAT(shortNames(directoryGroupsOf("anna")), ElementsAre("editors", "primary", "zebra"));
    EXPECT_THAT(shortNames(directoryGroupsOf(uuidNumber(1))), ElementsAre("editors", "primary", "zebra"));
}

std::string nestedGroup(const std::string& name, int number, const std::string& member) {
    return "dn: cn=" + name +
           ",ou=groups,dc=nimbo,dc=test\nobjectClass: groupOfNames\nobjectClass: posixGroup\ncn: " + name +
           "\ngidNumber: " + std::to_string(number) + "\nmember: " + member + "\n\n";
}

TEST_F(LdapPeople, GroupsOfAPersonAreFoundThroughGroupsEightDeepAndCyclesEnd) {
    support::Slapd::Options options;
    options.schema = support::Slapd::Schema::rfc2307bis;
    support::Slapd server(options);
    const std::string anna = "uid=anna,ou=people,dc=nimbo,dc=test";
    std::string groups = nestedGroup("g1", 201, anna);
    for (int i = 2; i <= 10; ++i) {
        groups += nestedGroup("g" + std::to_string(i), 200 + i,
                              "cn=g" + std::to_string(i - 1) + ",ou=groups,dc=nimbo,dc=test");
    }
    groups += nestedGroup("circle1", 301, "cn=circle2,ou=groups,dc=nimbo,dc=test\nmember: " + anna);
    groups += nestedGroup("circle2", 302, "cn=circle1,ou=groups,dc=nimbo,dc=test");
    groups +=
        "dn: cn=unique,ou=groups,dc=nimbo,dc=test\nobjectClass: groupOfUniqueNames\ncn: unique\nuniqueMember: " + anna +
        "\n\n";
    server.add(tree + personEntry("anna", 1) + groups);
    LdapNodeSettings settings = settingsFor(server);
    settings.schema = LdapNodeSettings::Schema::rfc2307bis;
    const SessionWith session({ldapNode(settings)});
    EXPECT_THAT(shortNames(directoryGroupsOf("anna")),
                ElementsAre("circle1", "circle2", "g1", "g2", "g3", "g4", "g5", "g6", "g7", "g8", "unique"));
}

TEST_F(LdapPeople, MembersByDnAreNamedByTheirLogins) {
    support::Slapd::Options options;
    options.schema = support::Slapd::Schema::rfc2307bis;
    support::Slapd server(options);
    server.add(
        tree + personEntry("anna", 1) +
        "dn: cn=Carl Berg,ou=people,dc=nimbo,dc=test\nobjectClass: inetOrgPerson\nobjectClass: posixAccount\ncn: "
        "Carl Berg\nsn: Berg\nuid: carl\nuidNumber: 2\ngidNumber: 2\nhomeDirectory: /\n\n" +
        nestedGroup("mixed", 201,
                    "cn=Carl Berg,ou=people,dc=nimbo,dc=test\nmember: uid=anna,ou=people,dc=nimbo,dc=test\nmember: "
                    "cn=gone,ou=people,dc=nimbo,dc=test\nmemberUid: bylogin"));
    LdapNodeSettings settings = settingsFor(server);
    settings.schema = LdapNodeSettings::Schema::rfc2307bis;
    DirectoryQuery query = queryFor(directory::recordName, {"mixed"});
    query.attributes = {std::string(directory::groupMembership)};
    EXPECT_THAT(ask(ldapNode(settings), query).value().at(0).values(directory::groupMembership),
                ElementsAre("bylogin", "anna", "carl"));
}

}  // namespace
}  // namespace adminhost
