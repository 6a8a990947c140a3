// Servers that behave as OpenLDAP's does not: long lists in parts, limits that are ignored, refusals.

#include "platform/directory/LdapSearchBounds.h"
#include "tests/integration/ldap/ScriptedServer.h"
#include "tests/integration/ldap/TestDirectory.h"

namespace adminhost {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

using Entry = ScriptedServer::Entry;
using Reply = ScriptedServer::Reply;

LdapNodeSettings settingsFor(const std::string& uri) {
    LdapNodeSettings settings;
    settings.name = "/AD";
    settings.uris = {uri};
    settings.base = "dc=nimbo,dc=test";
    settings.schema = LdapNodeSettings::Schema::ad;
    return settings;
}

std::string guidBytes() {
    return {"\x03\x02\x01\x10\x05\x04\x07\x06\x08\x09\x0A\x0B\x0C\x0D\x0E\x0F"};
}

DirectoryQuery oneType(std::string_view type, std::string_view name) {
    DirectoryQuery query = queryFor(directory::recordName, {std::string(name)});
    query.recordTypes = {std::string(type)};
    return query;
}

TEST(OddLdapServers, AccountOfActiveDirectoryHasItsNamesGuidAndPrincipal) {
    std::vector<std::string> asked;
    const ScriptedServer server([&](const ScriptedServer::Search& search) {
        asked = search.attributes;
        return Reply{{Entry{"CN=Anna Berg,CN=Users,DC=nimbo,DC=test",
                            {{"sAMAccountName", {"anna"}},
                             {"displayName", {"Anna Berg"}},
                             {"objectGUID", {guidBytes()}},
                             {"userPrincipalName", {"anna@NIMBO.TEST"}}}}}};
    });
    DirectoryQuery query = oneType(directory::users, "anna");
    query.attributes.emplace_back(directory::authenticationAuthority);
    const auto records = ask(ldapNode(settingsFor(server.uri())), query);
    EXPECT_THAT(asked, ElementsAre("sAMAccountName", "displayName", "objectGUID", "userPrincipalName"));
    ASSERT_EQ(namesOf(records), std::vector<std::string>{"anna"});
    EXPECT_THAT(records->at(0).values(directory::realName), ElementsAre("Anna Berg"));
    EXPECT_THAT(records->at(0).values(directory::generatedUID), ElementsAre("10010203-0405-0607-0809-0A0B0C0D0E0F"));
    EXPECT_THAT(records->at(0).values(directory::authenticationAuthority),
                ElementsAre(";Kerberosv5;;anna@NIMBO.TEST;NIMBO.TEST;"));
}

TEST(OddLdapServers, MembersInRangesAreReadToTheEnd) {
    const std::string group = "CN=editors,DC=nimbo,DC=test";
    const std::string end = ",CN=Users,DC=nimbo,DC=test";
    std::vector<std::string> ranges;
    const ScriptedServer server([&](const ScriptedServer::Search& search) {
        if (search.base == group) {
            ranges.push_back(search.attributes.at(0));
            return Reply{{search.attributes.at(0) == "member;range=2-*"
                              ? Entry{group, {{"member;range=2-3", {"CN=C" + end, "CN=D" + end}}}}
                              : Entry{group, {{"member;range=4-*", {"CN=E" + end}}}}}};
        }
        if (search.attributes.size() == 1) {  // the logins of the members
            return Reply{{Entry{"CN=C" + end, {{"sAMAccountName", {"c"}}}},
                          Entry{"CN=E" + end, {{"sAMAccountName", {"e"}}}},
                          Entry{"CN=A" + end, {{"sAMAccountName", {"a"}}}}}};
        }
        return Reply{
            {Entry{group, {{"sAMAccountName", {"editors"}}, {"member;range=0-1", {"CN=A" + end, "CN=B" + end}}}}}};
    });
    DirectoryQuery query = oneType(directory::groups, "editors");
    query.attributes = {std::string(directory::groupMembership)};
    const auto records = ask(ldapNode(settingsFor(server.uri())), query);
    ASSERT_EQ(namesOf(records).size(), 1U);
    EXPECT_THAT(records->at(0).values(directory::groupMembership), ElementsAre("c", "e", "a"));
    EXPECT_THAT(ranges, ElementsAre("member;range=2-*", "member;range=4-*"));
}

TEST(OddLdapServers, RangesThatDoNotAdvanceEnd) {
    const std::string group = "CN=editors,DC=nimbo,DC=test";
    int searches = 0;
    const ScriptedServer server([&](const ScriptedServer::Search&) {
        ++searches;
        return Reply{{Entry{group, {{"sAMAccountName", {"editors"}}, {"member;range=0-1", {"CN=A", "CN=B"}}}}}};
    });
    DirectoryQuery query = oneType(directory::groups, "editors");
    query.attributes = {std::string(directory::groupMembership)};
    EXPECT_EQ(namesOf(ask(ldapNode(settingsFor(server.uri())), query)).size(), 1U);
    EXPECT_LT(searches, 5);
}

TEST(OddLdapServers, MoreEntriesThanRequestedAreCutOff) {
    // This server knows no paging and sends everything.
    const ScriptedServer server([](const ScriptedServer::Search&) {
        Reply reply;
        for (int i = 0; i < 300; ++i) {
            reply.entries.push_back(
                {"CN=" + std::to_string(1000 + i), {{"sAMAccountName", {"user" + std::to_string(1000 + i)}}}});
        }
        return reply;
    });
    DirectoryQuery query = oneType(directory::users, "user");
    query.match = DirectoryQuery::Match::beginsWith;
    const DirectoryNodeSource source = ldapNode(settingsFor(server.uri()));
    EXPECT_EQ(namesOf(ask(source, query)).size(), 300U);
    query.maximum = 3;
    EXPECT_THAT(namesOf(ask(source, query)), ElementsAre("user1000", "user1001", "user1002"));
    query.maximum = 1;
    EXPECT_THAT(namesOf(ask(source, query)), ElementsAre("user1000")) << "the rest of the last one does not come back";
}

DirectoryQuery usersBeginningWith(std::string_view text) {
    DirectoryQuery query = oneType(directory::users, text);
    query.match = DirectoryQuery::Match::beginsWith;
    return query;
}

TEST(OddLdapServers, PagesThatAllHaveOneCookieAreReadToTheLast) {
    int pages = 0;
    const ScriptedServer server([&](const ScriptedServer::Search&) {
        const std::string name = "user" + std::to_string(++pages);
        return Reply{{{"CN=" + name, {{"sAMAccountName", {name}}}}}, LDAP_SUCCESS, pages < 3 ? "the cookie" : ""};
    });
    EXPECT_THAT(namesOf(ask(ldapNode(settingsFor(server.uri())), usersBeginningWith("user"))),
                ElementsAre("user1", "user2", "user3"));
}

TEST(OddLdapServers, EmptyPageThatComesAgainIsAnError) {
    int pages = 0;
    const ScriptedServer server([&](const ScriptedServer::Search&) {
        // Ends after all, so that the test does.
        return Reply{{}, LDAP_SUCCESS, ++pages < 100 ? "the cookie" : ""};
    });
    const Error error = errorOf(ask(ldapNode(settingsFor(server.uri())), usersBeginningWith("user")));
    EXPECT_THAT(error.description.value_or(""), HasSubstr("the server sends the same empty page again"));
    EXPECT_EQ(pages, 2);
}

/// The bounds of this program's searches while a test runs.
struct ScopedSearchBounds {
    explicit ScopedSearchBounds(const LdapSearchBounds& bounds) { setLdapSearchBounds(bounds); }
    ScopedSearchBounds(const ScopedSearchBounds&) = delete;
    ScopedSearchBounds& operator=(const ScopedSearchBounds&) = delete;
    ~ScopedSearchBounds() { setLdapSearchBounds({}); }
};

TEST(OddLdapServers, MoreEntriesThanTheBoundInAllPagesTogetherAreAnError) {
    int pages = 0;
    const ScriptedServer server([&](const ScriptedServer::Search&) {
        const std::string name = "user" + std::to_string(++pages);
        return Reply{{{"CN=" + name, {{"sAMAccountName", {name}}}}}, LDAP_SUCCESS, pages < 5 ? name : ""};
    });
    const DirectoryNodeSource source = ldapNode(settingsFor(server.uri()));
    {
        const ScopedSearchBounds bounds({.entries = 4});
        EXPECT_THAT(errorOf(ask(source, usersBeginningWith("user"))).description.value_or(""),
                    HasSubstr("the server sends more than 4 entries or"));
    }
    pages = 0;
    const ScopedSearchBounds bounds({.entries = 5});
    EXPECT_EQ(namesOf(ask(source, usersBeginningWith("user"))).size(), 5U);
}

TEST(OddLdapServers, MoreBytesThanTheBoundAreAnError) {
    const ScriptedServer server([&](const ScriptedServer::Search&) {
        return Reply{{{"CN=anna", {{"sAMAccountName", {"anna"}}, {"displayName", {std::string(1000, 'a')}}}}}};
    });
    const ScopedSearchBounds bounds({.entries = 10, .bytes = 1000});
    EXPECT_THAT(errorOf(ask(ldapNode(settingsFor(server.uri())), usersBeginningWith("anna"))).description.value_or(""),
                HasSubstr("or 1000 bytes"));
}

TEST(OddLdapServers, UuidsAreLookedUpTwoHundredAtATimeEachOnce) {
    int searches = 0;
    const ScriptedServer server([&](const ScriptedServer::Search&) {
        ++searches;
        return Reply{};
    });
    DirectoryQuery query = oneType(directory::users, "");
    query.attribute = directory::generatedUID;
    query.values.clear();
    const DirectoryNodeSource source = ldapNode(settingsFor(server.uri()));
    for (const auto& [uuids, expected] : {std::pair(0, 0), std::pair(200, 1), std::pair(201, 2), std::pair(450, 3)}) {
        query.values.clear();
        for (int i = 0; i < uuids; ++i) {
            query.values.push_back(uuidNumber(i));
            query.values.push_back(uuidNumber(i));
        }
        searches = 0;
        EXPECT_TRUE(ask(source, query));
        EXPECT_EQ(searches, expected) << uuids;
    }
}

TEST(OddLdapServers, BusyServerIsLeftForTheNextQuery) {
    int searches = 0;
    const ScriptedServer server([&](const ScriptedServer::Search&) {
        return ++searches == 1 ? Reply{{}, LDAP_BUSY} : Reply{{Entry{"CN=anna", {{"sAMAccountName", {"anna"}}}}}};
    });
    const DirectoryNodeSource source = ldapNode(settingsFor(server.uri()));
    const DirectoryQuery query = oneType(directory::users, "anna");
    {
        const DirectoryRequestScope request(std::nullopt);
        EXPECT_EQ(errorOf(ask(source, query)).code, LDAP_BUSY);
        EXPECT_EQ(errorOf(ask(source, query)).code, LDAP_BUSY) << "not asked again in the request";
    }
    EXPECT_EQ(searches, 1);
    EXPECT_THAT(namesOf(ask(source, query)), ElementsAre("anna"));
}

TEST(OddLdapServers, RefusalIsTheServersCode) {
    const ScriptedServer server([](const ScriptedServer::Search&) { return Reply{{}, LDAP_INSUFFICIENT_ACCESS}; });
    const Error error = errorOf(ask(ldapNode(settingsFor(server.uri())), oneType(directory::users, "anna")));
    EXPECT_EQ(error.code, LDAP_INSUFFICIENT_ACCESS);
    EXPECT_THAT(error.description.value_or(""), HasSubstr("Insufficient access"));
}

}  // namespace
}  // namespace adminhost
