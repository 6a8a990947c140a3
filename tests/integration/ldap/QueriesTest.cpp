// Queries of a node in a real server.

#include "tests/integration/ldap/TestDirectory.h"

#include <algorithm>
#include <cctype>
#include <chrono>

namespace adminhost {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class LdapQueries : public testing::Test {
  protected:
    static void SetUpTestSuite() {
        server = new support::Slapd;
        std::string many;
        for (int i = 0; i < 600; ++i) {
            many += personEntry("many" + std::to_string(1000 + i), 20'000 + i);
        }
        server->add(
            tree + personEntry("anna", 1001, "krbPrincipalName: anna@NIMBO.TEST\nloginShell: /bin/zsh\n") +
            personEntry("Bo", 1002, "uid: aaa\n") + groupEntry("editors", 2001, "memberUid: anna\nmemberUid: Bo\n") +
            groupEntry("anna", 2002) +
            // cn=(x)*\, 0x01 and a quote
            "dn:: dWlkPShhKilcNUMsb3U9cGVvcGxlLGRjPW5pbWJvLGRjPXRlc3Q=\nobjectClass: account\nobjectClass: "
            "posixAccount\nuid: (a*)\\\ncn: odd\nuidNumber: 1010\ngidNumber: 100\nhomeDirectory: /\nentryUUID: " +
            uuidNumber(1010) + "\n\n" +
            // A name only in the form of bytes, and none at all: the login is taken from another attribute.
            personEntry("bytes", 1011, "testLogin:: Yv9k\n") +
            personEntry("two", 1012, "testLogin: good\ntestLogin:: Yv9k\n") + personEntry("none", 1013) + many);
    }
    static void TearDownTestSuite() {
        delete server;
        server = nullptr;
    }

    static std::vector<std::string> names(const DirectoryQuery& query) {
        return namesOf(ask(ldapNode(settingsFor(*server)), query));
    }

    static support::Slapd* server;
};

support::Slapd* LdapQueries::server = nullptr;

TEST_F(LdapQueries, AccountEntryBecomesARecord) {
    DirectoryQuery query = queryFor(directory::recordName, {"anna"});
    query.recordTypes = {std::string(directory::users)};
    query.attributes = {std::string(directory::recordName),     std::string(directory::realName),
                        std::string(directory::generatedUID),   std::string(directory::uniqueID),
                        std::string(directory::primaryGroupID), std::string(directory::homeDirectory),
                        std::string(directory::userShell),      std::string(directory::authenticationAuthority)};
    const auto records = ask(ldapNode(settingsFor(*server)), query).value();
    ASSERT_EQ(records.size(), 1U);
    EXPECT_EQ(records[0].type, directory::users);
    EXPECT_EQ(records[0].node, "/LDAP");
    EXPECT_EQ(records[0].place, "uid=anna,ou=people,dc=nimbo,dc=test");
    EXPECT_EQ(records[0].attributes, (DirectoryAttributes{{"dsAttrTypeStandard:RecordName", {"anna"}},
                                                          {"dsAttrTypeStandard:RealName", {"Full Name of anna"}},
                                                          {"dsAttrTypeStandard:GeneratedUID", {uuidNumber(1001)}},
                                                          {"dsAttrTypeStandard:UniqueID", {"1001"}},
                                                          {"dsAttrTypeStandard:PrimaryGroupID", {"100"}},
                                                          {"dsAttrTypeStandard:NFSHomeDirectory", {"/home/anna"}},
                                                          {"dsAttrTypeStandard:UserShell", {"/bin/zsh"}},
                                                          {"dsAttrTypeStandard:AuthenticationAuthority",
                                                           {";Kerberosv5;;anna@NIMBO.TEST;NIMBO.TEST;"}}}));
}

TEST_F(LdapQueries, GroupEntryBecomesARecordWithItsMembersLogins) {
    DirectoryQuery query = queryFor(directory::recordName, {"editors"});
    query.attributes = {std::string(directory::recordName), std::string(directory::primaryGroupID),
                        std::string(directory::groupMembership), std::string(directory::realName)};
    const auto records = ask(ldapNode(settingsFor(*server)), query).value();
    ASSERT_EQ(records.size(), 1U);
    EXPECT_EQ(records[0].type, directory::groups);
    EXPECT_EQ(records[0].attributes, (DirectoryAttributes{{"dsAttrTypeStandard:RecordName", {"editors"}},
                                                          {"dsAttrTypeStandard:PrimaryGroupID", {"2001"}},
                                                          {"dsAttrTypeStandard:GroupMembership", {"anna", "Bo"}}}));
}

TEST_F(LdapQueries, UsersComeBeforeGroupsEachInTheOrderOfTheirDns) {
    EXPECT_THAT(names(queryFor(directory::generatedUID,
                               {uuidNumber(2002), uuidNumber(2001), uuidNumber(1002), uuidNumber(1001)})),
                ElementsAre("Bo", "anna", "anna", "editors"));
    EXPECT_THAT(names(queryFor(directory::recordName, {"anna"})), ElementsAre("anna", "anna"));
}

TEST_F(LdapQueries, UuidsAreFoundInEitherCaseAndReturnedInUpperCase) {
    support::Slapd other;
    other.add(tree +
              "dn: uid=x,ou=people,dc=nimbo,dc=test\nobjectClass: account\nobjectClass: posixAccount\nuid: x\ncn: "
              "x\nuidNumber: 1\ngidNumber: 1\nhomeDirectory: /\nentryUUID: "
              "abcdefab-cdef-4abc-8def-abcdefabcdef\n\n");
    for (const char* uuid : {"abcdefab-cdef-4abc-8def-abcdefabcdef", "ABCDEFAB-CDEF-4ABC-8DEF-ABCDEFABCDEF"}) {
        const auto records = ask(ldapNode(settingsFor(other)), queryFor(directory::generatedUID, {uuid})).value();
        ASSERT_EQ(records.size(), 1U);
        EXPECT_THAT(records[0].values(directory::generatedUID), ElementsAre("ABCDEFAB-CDEF-4ABC-8DEF-ABCDEFABCDEF"));
    }
}

TEST_F(LdapQueries, GarbageUuidsMatchNothing) {
    EXPECT_THAT(
        names(queryFor(directory::generatedUID, {"", "*", "garbage", ")(uid=*", uuidNumber(9), uuidNumber(1001)})),
        ElementsAre("anna"));
    EXPECT_THAT(names(queryFor(directory::generatedUID, {})), IsEmpty());
}

TEST_F(LdapQueries, FiveThousandUuidsAreLookedUpEachRecordOnceWithoutTheServersLimit) {
    std::vector<std::string> uuids;
    for (int i = 0; i < 5000; ++i) {
        uuids.push_back(
            uuidNumber(20'000 + i % 2500));  // 600 of them exist; each twice, in different parts of the list
    }
    const auto found = names(queryFor(directory::generatedUID, uuids));
    EXPECT_EQ(found.size(), 600U);
    EXPECT_TRUE(std::is_sorted(found.begin(), found.end()));
    EXPECT_EQ(std::adjacent_find(found.begin(), found.end()), found.end());
}

TEST_F(LdapQueries, FilterCharactersInNamesAreOnlyThemselves) {
    EXPECT_THAT(names(queryFor(directory::recordName, {"(a*)\\"})), ElementsAre("(a*)\\"));
    for (const char* name : {"*", "a*", "anna)(uid=*", "*)(objectClass=*", "\\61nna", "anna\\"}) {
        EXPECT_THAT(names(queryFor(directory::recordName, {name})), IsEmpty()) << name;
    }
    DirectoryQuery query = queryFor(directory::recordName, {"(a*"});
    query.match = DirectoryQuery::Match::beginsWith;
    EXPECT_THAT(names(query), ElementsAre("(a*)\\"));
    query.values = {"*"};
    EXPECT_THAT(names(query), IsEmpty());
    query.values = {std::string("an\0na", 5)};
    EXPECT_THAT(names(query), IsEmpty());
}

TEST_F(LdapQueries, OfSeveralNamesTheOneInTheDnIsFirst) {
    support::Slapd other;
    other.add(tree +
              "dn: uid=second,ou=people,dc=nimbo,dc=test\nobjectClass: account\nobjectClass: posixAccount\nuid: "
              "first\nuid: second\nuid: third\ncn: x\nuidNumber: 1\ngidNumber: 1\nhomeDirectory: /\n\n");
    const auto records = ask(ldapNode(settingsFor(other)), queryFor(directory::recordName, {"third"})).value();
    ASSERT_EQ(records.size(), 1U);
    EXPECT_THAT(records[0].values(directory::recordName), ElementsAre("second", "first", "third"));
}

TEST_F(LdapQueries, OfSeveralNamesWithoutOneInTheDnTheServersFirstIsFirst) {
    support::Slapd other;
    other.add(tree +
              "dn: cn=Zed,ou=people,dc=nimbo,dc=test\nobjectClass: inetOrgPerson\nobjectClass: posixAccount\ncn: "
              "Zed\nsn: Z\nuid: second\nuid: another\nuidNumber: 5\ngidNumber: 5\nhomeDirectory: /\n\n");
    EXPECT_THAT(namesOf(ask(ldapNode(settingsFor(other)), queryFor(directory::recordName, {"another"}))),
                ElementsAre("second"));
}

TEST_F(LdapQueries, EntryWithoutANameIsListedWithoutOne) {
    LdapNodeSettings settings = settingsFor(*server);
    settings.userMap["RecordName"] = "testLogin";
    EXPECT_THAT(namesOf(ask(ldapNode(settings), queryFor(directory::generatedUID, {uuidNumber(1013)}))),
                ElementsAre("(no name)"));
}

TEST_F(LdapQueries, NameThatIsNotUtf8LeavesTheEntryOutUnlessThereIsAnother) {
    LdapNodeSettings settings = settingsFor(*server);
    settings.userMap["RecordName"] = "testLogin";
    EXPECT_THAT(
        namesOf(ask(ldapNode(settings), queryFor(directory::generatedUID, {uuidNumber(1011), uuidNumber(1012)}))),
        ElementsAre("good"));
}

TEST_F(LdapQueries, TextForPeopleThatIsNotUtf8IsRepaired) {
    LdapNodeSettings settings = settingsFor(*server);
    settings.userMap["RealName"] = "testLogin";
    const auto records = ask(ldapNode(settings), queryFor(directory::recordName, {"bytes"})).value();
    ASSERT_EQ(records.size(), 1U);
    EXPECT_THAT(records[0].values(directory::realName), ElementsAre("b\xEF\xBF\xBD"
                                                                    "d"));
}

TEST_F(LdapQueries, IdsAreFoundByTheirDecimalTextOnly) {
    EXPECT_THAT(names(queryFor(directory::uniqueID, {"1001"})), ElementsAre("anna"));
    EXPECT_THAT(names(queryFor(directory::primaryGroupID, {"2001"})), ElementsAre("editors"));
    EXPECT_THAT(names(queryFor(directory::uniqueID, {"01001", "+1001", "1001 ", "", "*", "99999999999999"})),
                IsEmpty());
}

TEST_F(LdapQueries, AttributeThatIsNotMappedMatchesNothing) {
    DirectoryQuery query = queryFor("dsAttrTypeStandard:EMailAddress", {"anna"});
    EXPECT_THAT(names(query), IsEmpty());
    query.attribute = directory::recordName;
    query.recordTypes = {"dsRecTypeStandard:Printers"};
    EXPECT_THAT(names(query), IsEmpty());
}

TEST_F(LdapQueries, MoreEntriesThanTheServersLimitIsAnErrorWithoutAMaximum) {
    DirectoryQuery query = queryFor(directory::recordName, {"many"});
    query.match = DirectoryQuery::Match::beginsWith;
    const Error error = errorOf(ask(ldapNode(settingsFor(*server)), query));
    EXPECT_EQ(error.domain, directory::ldapErrorDomain);
    EXPECT_EQ(error.code, 4);
    EXPECT_THAT(error.description.value_or(""), HasSubstr("Size limit exceeded"));
}

TEST_F(LdapQueries, MaximumEndsTheSearchThatTheServersLimitWouldEnd) {
    DirectoryQuery query = queryFor(directory::recordName, {"many"});
    query.match = DirectoryQuery::Match::beginsWith;
    for (const std::size_t maximum : {std::size_t{1}, std::size_t{20}, std::size_t{199}, std::size_t{500}}) {
        query.maximum = maximum;
        EXPECT_EQ(names(query).size(), maximum);
    }
    query.maximum = 501;
    EXPECT_EQ(errorOf(ask(ldapNode(settingsFor(*server)), query)).code, 4) << "fewer than requested came";
}

TEST_F(LdapQueries, MaximumOfManyMatchesPrefersUsers) {
    DirectoryQuery query = queryFor(directory::generatedUID, {uuidNumber(2001), uuidNumber(1001)});
    query.maximum = 1;
    EXPECT_THAT(names(query), ElementsAre("anna"));
}

TEST_F(LdapQueries, PagesAreReadToTheEndIfTheServerAllows) {
    support::Slapd::Options options;
    options.database = "limits * size.soft=unlimited size.hard=unlimited size.prtotal=unlimited\n";
    support::Slapd other(options);
    std::string many = tree;
    for (int i = 0; i < 450; ++i) {
        many += personEntry("many" + std::to_string(1000 + i), 20'000 + i);
    }
    other.add(many);
    DirectoryQuery query = queryFor(directory::recordName, {""});
    query.match = DirectoryQuery::Match::beginsWith;
    EXPECT_EQ(namesOf(ask(ldapNode(settingsFor(other)), query)).size(), 450U);
}

TEST_F(LdapQueries, BaseThatDoesNotExistIsTheServersError) {
    LdapNodeSettings settings = settingsFor(*server);
    settings.base = "ou=nowhere,dc=nimbo,dc=test";
    EXPECT_EQ(errorOf(ask(ldapNode(settings), queryFor(directory::recordName, {"anna"}))).code, 32);
}

TEST_F(LdapQueries, OwnBasesAndFiltersLimitTheNode) {
    LdapNodeSettings settings = settingsFor(*server);
    settings.userBase = "ou=people,dc=nimbo,dc=test";
    settings.groupBase = "ou=groups,dc=nimbo,dc=test";
    settings.userFilter = "(&(objectClass=posixAccount)(!(uid=anna)))";
    EXPECT_THAT(namesOf(ask(ldapNode(settings), queryFor(directory::recordName, {"anna", "Bo", "editors"}))),
                ElementsAre("Bo", "anna", "editors"));
}

TEST_F(LdapQueries, AuthorityIsTheMappedAttributeElseBuiltFromPrincipalsElseFromTheName) {
    support::Slapd other;
    other.add(tree +
              personEntry("mapped", 1,
                          "krbPrincipalName: x@Y\ntestAuthority: ;basic;\ntestAuthority: ;Kerberosv5;;m@N;N;\n") +
              personEntry("several", 2, "krbPrincipalName: s\\@t@ONE.TEST\nkrbPrincipalName: plain\n") +
              personEntry("without", 3));
    LdapNodeSettings settings = settingsFor(other);
    settings.userMap["AuthenticationAuthority"] = "testAuthority";
    settings.kerberosRealm = "DEFAULT.TEST";
    const auto authorities = [&](const char* name) {
        DirectoryQuery query = queryFor(directory::recordName, {name});
        query.attributes = {std::string(directory::authenticationAuthority)};
        return ask(ldapNode(settings), query).value().at(0).values(directory::authenticationAuthority);
    };
    EXPECT_THAT(authorities("mapped"), ElementsAre(";basic;", ";Kerberosv5;;m@N;N;"));
    EXPECT_THAT(authorities("several"),
                ElementsAre(";Kerberosv5;;s\\@t@ONE.TEST;ONE.TEST;", ";Kerberosv5;;plain;DEFAULT.TEST;"));
    EXPECT_THAT(authorities("without"), ElementsAre(";Kerberosv5;;without@DEFAULT.TEST;DEFAULT.TEST;"));
    settings.kerberosRealm.clear();
    EXPECT_THAT(authorities("without"), IsEmpty());
}

TEST_F(LdapQueries, UuidsOfOtherFormsAreFoundAndReturned) {
    support::Slapd other;
    // The bytes 00 01 ... 0f, once in the order of the text and once with the first three fields reversed.
    other.add(tree + personEntry("plain", 1, "testUuidBytes:: AAECAwQFBgcICQoLDA0ODw==\n") +
              personEntry("mixed", 2, "testUuidBytes:: AwIBAAUEBwYICQoLDA0ODw==\n") +
              personEntry("upper", 3, "testUuidText: 00010203-0405-0607-0809-0A0B0C0D0E0F\n") +
              personEntry("lower", 4, "testUuidText: aaaaaaaa-0405-0607-0809-0a0b0c0d0e0f\n"));
    const std::string uuid = "00010203-0405-0607-0809-0A0B0C0D0E0F";
    LdapNodeSettings settings = settingsFor(other);
    settings.userMap["GeneratedUID"] = "testUuidBytes";
    const auto found = [&](const std::string& text) {
        const auto records = ask(ldapNode(settings), queryFor(directory::generatedUID, {text})).value();
        std::vector<std::string> all = namesOf(records);
        for (const DirectoryRecord& record : records) {
            all.push_back(*record.first(directory::generatedUID));
        }
        return all;
    };
    settings.uuidForm = LdapNodeSettings::UuidForm::binary;
    EXPECT_THAT(found(uuid), ElementsAre("plain", uuid));
    settings.uuidForm = LdapNodeSettings::UuidForm::guid;
    EXPECT_THAT(found(uuid), ElementsAre("mixed", uuid));
    settings.userMap["GeneratedUID"] = "testUuidText";
    settings.uuidForm = LdapNodeSettings::UuidForm::text;
    EXPECT_THAT(found("00010203-0405-0607-0809-0a0b0c0d0e0f"), ElementsAre("upper", uuid));
    EXPECT_THAT(found("AAAAAAAA-0405-0607-0809-0A0B0C0D0E0F"),
                ElementsAre("lower", "AAAAAAAA-0405-0607-0809-0A0B0C0D0E0F"));
}

TEST_F(LdapQueries, ReferralIsErrorTenAndContinuationReferencesAreIgnoredThoughTheirServerIsThere) {
    support::Slapd::Options options;
    options.global = "referral " + server->uri() + "/\n";
    support::Slapd other(options);
    other.add(tree + personEntry("carl", 1) +
              "dn: ou=elsewhere,dc=nimbo,dc=test\nobjectClass: referral\nobjectClass: extensibleObject\nou: "
              "elsewhere\nref: " +
              server->uri() + "/ou=people,dc=nimbo,dc=test\n\n");
    LdapNodeSettings settings = settingsFor(other);
    EXPECT_THAT(namesOf(ask(ldapNode(settings), queryFor(directory::recordName, {"carl", "anna"}))),
                ElementsAre("carl"));
    settings.base = "dc=somewhere,dc=else";
    EXPECT_EQ(errorOf(ask(ldapNode(settings), queryFor(directory::recordName, {"anna"}))).code, 10);
    settings.base = "ou=elsewhere,dc=nimbo,dc=test";
    EXPECT_EQ(errorOf(ask(ldapNode(settings), queryFor(directory::recordName, {"anna"}))).code, 10);
}

TEST_F(LdapQueries, AliasesAreNotFollowed) {
    support::Slapd other;
    other.add(tree + personEntry("anna", 1) +
              "dn: ou=alias,dc=nimbo,dc=test\nobjectClass: alias\nobjectClass: extensibleObject\nou: "
              "alias\naliasedObjectName: ou=people,dc=nimbo,dc=test\n\n");
    LdapNodeSettings settings = settingsFor(other);
    settings.base = "ou=alias,dc=nimbo,dc=test";
    EXPECT_THAT(namesOf(ask(ldapNode(settings), queryFor(directory::recordName, {"anna"}))), IsEmpty());
}

TEST_F(LdapQueries, EntryOfADerivedClassIsOfItsRightKind) {
    support::Slapd::Options options;
    options.schema = support::Slapd::Schema::rfc2307bis;
    options.global =
        "objectclass ( 1.3.6.1.4.1.99999.2.2 NAME 'testAccount' SUP posixAccount AUXILIARY )\n"
        "objectclass ( 1.3.6.1.4.1.99999.2.3 NAME 'testGroup' SUP posixGroup AUXILIARY )\n";
    support::Slapd other(options);
    other.add(tree +
              "dn: uid=derived,ou=people,dc=nimbo,dc=test\nobjectClass: account\nobjectClass: testAccount\nuid: "
              "derived\ncn: d\nuidNumber: 1\ngidNumber: 1\nhomeDirectory: /\nentryUUID: " +
              uuidNumber(1) +
              "\n\ndn: cn=derivedgroup,ou=groups,dc=nimbo,dc=test\nobjectClass: organizationalRole\nobjectClass: "
              "testGroup\ncn: derivedgroup\ngidNumber: 2\nentryUUID: " +
              uuidNumber(2) + "\n\n");
    LdapNodeSettings settings = settingsFor(other);
    settings.schema = LdapNodeSettings::Schema::rfc2307bis;
    const auto records =
        ask(ldapNode(settings), queryFor(directory::generatedUID, {uuidNumber(1), uuidNumber(2)})).value();
    ASSERT_EQ(records.size(), 2U);
    EXPECT_EQ(records[0].type, directory::users);
    EXPECT_EQ(records[1].type, directory::groups);
}

}  // namespace
}  // namespace adminhost
