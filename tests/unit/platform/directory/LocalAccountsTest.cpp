#include "platform/directory/AccountFiles.h"
#include "platform/directory/Entries.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/directory/NameBasedUuid.h"
#include "tests/unit/platform/directory/TemporaryAccounts.h"

#include <algorithm>

#include <gmock/gmock.h>
#include <sys/stat.h>

namespace adminhost {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

const std::string annaUuid = "81CEF789-6423-555F-BB64-F7BD915968D3";
const std::string editorsUuid = "978C0EBC-83A2-53B5-AB72-BBB478E881F8";

const std::vector<std::string> allAttributes = {std::string(directory::recordName),
                                                std::string(directory::realName),
                                                std::string(directory::generatedUID),
                                                std::string(directory::uniqueID),
                                                std::string(directory::primaryGroupID),
                                                std::string(directory::homeDirectory),
                                                std::string(directory::userShell),
                                                std::string(directory::groupMembership),
                                                std::string(directory::authenticationAuthority)};

DirectoryQuery queryFor(std::string_view attribute, std::vector<std::string> values) {
    DirectoryQuery query;
    query.recordTypes = {std::string(directory::users), std::string(directory::groups)};
    query.attribute = attribute;
    query.values = std::move(values);
    query.attributes = allAttributes;
    return query;
}

class LocalAccounts : public testing::Test {
  protected:
    LocalAccounts() {
        _root.users("root:x:0:0:root:/root:/bin/bash\nanna:x:1001:1000:Anna Berg,Room 4,,:/home/anna:/bin/zsh\n");
        _root.groups("root:x:0:\neditors:x:2000:anna,otto\n");
    }

    std::vector<DirectoryRecord> found(const DirectoryQuery& query) {
        auto records = searchDirectory(query);
        EXPECT_TRUE(records) << (records ? "" : records.error().description.value_or("no description"));
        return records.value_or(std::vector<DirectoryRecord>());
    }
    std::vector<std::string> names(const DirectoryQuery& query) {
        std::vector<std::string> all;
        for (const DirectoryRecord& record : found(query)) {
            all.push_back(*record.first(directory::recordName));
        }
        return all;
    }
    std::optional<Error> failure(const DirectoryQuery& query) {
        const auto records = searchDirectory(query);
        return records ? std::nullopt : std::optional(records.error());
    }

    TemporaryAccounts _root;
};

TEST_F(LocalAccounts, UserLineBecomesARecord) {
    const auto records = found(queryFor(directory::recordName, {"anna"}));
    ASSERT_EQ(records.size(), 1U);
    EXPECT_EQ(records[0].type, directory::users);
    EXPECT_EQ(records[0].node, "/Local");
    EXPECT_EQ(records[0].attributes, (DirectoryAttributes{{"dsAttrTypeStandard:RecordName", {"anna"}},
                                                          {"dsAttrTypeStandard:RealName", {"Anna Berg"}},
                                                          {"dsAttrTypeStandard:GeneratedUID", {annaUuid}},
                                                          {"dsAttrTypeStandard:UniqueID", {"1001"}},
                                                          {"dsAttrTypeStandard:PrimaryGroupID", {"1000"}},
                                                          {"dsAttrTypeStandard:NFSHomeDirectory", {"/home/anna"}},
                                                          {"dsAttrTypeStandard:UserShell", {"/bin/zsh"}}}));
}

TEST_F(LocalAccounts, GroupLineBecomesARecordWithoutFullName) {
    const auto records = found(queryFor(directory::recordName, {"editors"}));
    ASSERT_EQ(records.size(), 1U);
    EXPECT_EQ(records[0].type, directory::groups);
    EXPECT_EQ(records[0].attributes, (DirectoryAttributes{{"dsAttrTypeStandard:RecordName", {"editors"}},
                                                          {"dsAttrTypeStandard:GeneratedUID", {editorsUuid}},
                                                          {"dsAttrTypeStandard:PrimaryGroupID", {"2000"}},
                                                          {"dsAttrTypeStandard:GroupMembership", {"anna", "otto"}}}));
}

TEST_F(LocalAccounts, OnlyRequestedAttributesAreAnswered) {
    DirectoryQuery query = queryFor(directory::recordName, {"anna"});
    query.attributes = {std::string(directory::realName), "dsAttrTypeStandard:EMailAddress"};
    EXPECT_EQ(found(query).at(0).attributes, (DirectoryAttributes{{"dsAttrTypeStandard:RealName", {"Anna Berg"}}}));
}

TEST_F(LocalAccounts, UserAndGroupOfOneNameAreBothFoundUsersFirst) {
    const auto records = found(queryFor(directory::recordName, {"root"}));
    ASSERT_EQ(records.size(), 2U);
    EXPECT_EQ(records[0].type, directory::users);
    EXPECT_EQ(records[1].type, directory::groups);
    EXPECT_NE(records[0].values(directory::generatedUID), records[1].values(directory::generatedUID));
}

TEST_F(LocalAccounts, RecordTypesLimitTheQuery) {
    DirectoryQuery query = queryFor(directory::recordName, {"root"});
    query.recordTypes = {std::string(directory::groups)};
    EXPECT_EQ(found(query).at(0).type, directory::groups);
    query.recordTypes = {"dsRecTypeStandard:Printers"};
    EXPECT_THAT(found(query), IsEmpty());
    query.recordTypes = {};
    EXPECT_THAT(found(query), IsEmpty());
}

TEST_F(LocalAccounts, UuidsCompareWithoutRegardToCaseAndTheDirectorySpellingIsAnswered) {
    std::string lower = annaUuid;
    std::transform(lower.begin(), lower.end(), lower.begin(), [](unsigned char c) { return std::tolower(c); });
    const auto records = found(queryFor(directory::generatedUID, {lower}));
    ASSERT_EQ(records.size(), 1U);
    EXPECT_THAT(records[0].values(directory::generatedUID), ElementsAre(annaUuid));
}

TEST_F(LocalAccounts, SeveralUuidsAreLookedUpAtOnceInTheDirectorysOrderEachRecordOnce) {
    EXPECT_THAT(names(queryFor(directory::generatedUID, {editorsUuid, annaUuid, editorsUuid})),
                ElementsAre("anna", "editors"));
}

TEST_F(LocalAccounts, GarbageUuidsMatchNothing) {
    EXPECT_THAT(names(queryFor(directory::generatedUID,
                               {"", "garbage", "' or 1=1", "00000000-0000-0000-0000-000000000000", annaUuid})),
                ElementsAre("anna"));
    EXPECT_THAT(names(queryFor(directory::generatedUID, {})), IsEmpty());
}

TEST_F(LocalAccounts, IdsAreFoundByTheirDecimalTextOnly) {
    EXPECT_THAT(names(queryFor(directory::uniqueID, {"1001"})), ElementsAre("anna"));
    EXPECT_THAT(names(queryFor(directory::primaryGroupID, {"2000"})), ElementsAre("editors"));
    EXPECT_THAT(names(queryFor(directory::primaryGroupID, {"1000"})), ElementsAre("anna"));
    EXPECT_THAT(names(queryFor(directory::uniqueID, {"01001", "+1001", "1001 ", "", "99999999999999"})), IsEmpty());
}

TEST_F(LocalAccounts, SeveralAccountsWithOneIdAreAllFound) {
    _root.users("root:x:0:0::/:\ntoor:x:0:0::/:\n");
    EXPECT_THAT(names(queryFor(directory::uniqueID, {"0"})), ElementsAre("root", "toor"));
}

TEST_F(LocalAccounts, NamesAreExactInCase) {
    EXPECT_THAT(names(queryFor(directory::recordName, {"Anna", "ann"})), IsEmpty());
}

TEST_F(LocalAccounts, BeginningsMatchWithoutRegardToCaseBeyondAsciiToo) {
    _root.users("asa:x:1:1:\xC3\x85sa \xC3\x96str\xC3\xB6m:/:\nbo:x:2:1:Bo:/:\n");
    DirectoryQuery query = queryFor(directory::realName, {"\xC3\xA5SA \xC3\xB6"});
    query.match = DirectoryQuery::Match::beginsWith;
    EXPECT_THAT(names(query), ElementsAre("asa"));
    query.values = {"sa"};
    EXPECT_THAT(names(query), IsEmpty());
}

TEST_F(LocalAccounts, MaximumKeepsTheFirstRecords) {
    DirectoryQuery query = queryFor(directory::recordName, {""});
    query.match = DirectoryQuery::Match::beginsWith;
    EXPECT_THAT(names(query), ElementsAre("root", "anna", "root", "editors"));
    query.maximum = 3;
    EXPECT_THAT(names(query), ElementsAre("root", "anna", "root"));
}

TEST_F(LocalAccounts, AmpersandInTheFullNameIsTheLoginCapitalised) {
    _root.users("daemon:x:1:1:Mr & and &,x:/:\n9x:x:2:1:&:/:\nnobody:x:3:1::/:\ncomma:x:4:1:,Room:/:\n");
    const auto records = found(queryFor(directory::recordName, {"daemon", "9x", "nobody", "comma"}));
    ASSERT_EQ(records.size(), 4U);
    EXPECT_THAT(records[0].values(directory::realName), ElementsAre("Mr Daemon and Daemon"));
    EXPECT_THAT(records[1].values(directory::realName), ElementsAre("9x"));
    EXPECT_THAT(records[2].values(directory::realName), IsEmpty());
    EXPECT_THAT(records[3].values(directory::realName), IsEmpty());
}

TEST_F(LocalAccounts, MissingFileIsAnErrorAndNeverAPart) {
    std::filesystem::remove(_root.path("etc/group"));
    const auto error = failure(queryFor(directory::generatedUID, {annaUuid}));
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code, ENOENT);
    EXPECT_THAT(error->description.value_or(""), HasSubstr("/etc/group"));

    DirectoryQuery usersOnly = queryFor(directory::generatedUID, {annaUuid});
    usersOnly.recordTypes = {std::string(directory::users)};
    EXPECT_THAT(names(usersOnly), ElementsAre("anna")) << "a file that is not asked for is not read";
}

TEST_F(LocalAccounts, PipeInPlaceOfAFileIsAnErrorAtOnce) {
    std::filesystem::remove(_root.path("etc/passwd"));
    ASSERT_EQ(::mkfifo(_root.path("etc/passwd").c_str(), 0600), 0);
    EXPECT_TRUE(failure(queryFor(directory::recordName, {"anna"})));
}

TEST_F(LocalAccounts, EmptyFilesHoldNobody) {
    _root.users("");
    _root.groups("");
    DirectoryQuery query = queryFor(directory::recordName, {""});
    query.match = DirectoryQuery::Match::beginsWith;
    EXPECT_THAT(names(query), IsEmpty());
}

TEST_F(LocalAccounts, BrokenLinesAreSkippedAndTheRestIsRead) {
    using namespace std::string_literals;
    _root.users(
        "no colons\n:x:1:1::/:\nanna:x:notanumber:1::/:\nshort:x\n\n\n   \n# comment:x:1:1::/:\n"
        "cut\0off:x:2:2::/:\nbo:x:3:1:Bo:/home/bo:/bin/sh\n::::::\nlast:x:4:1::/:/bin/sh"s);
    _root.groups("broken\nx:y:z\n");
    DirectoryQuery query = queryFor(directory::recordName, {""});
    query.match = DirectoryQuery::Match::beginsWith;
    EXPECT_THAT(names(query), ElementsAre("bo", "last"));
}

TEST_F(LocalAccounts, DirectionsToTheNameServiceAreNoAccounts) {
    _root.users("+\n+::::::\n+@netgroup::::::\n-evil:x:7:7::/:\nbo:x:3:1::/:\n");
    _root.groups("+\n+:::\n-x:x:9:\nstaff:x:50:+,bo\n");
    DirectoryQuery query = queryFor(directory::recordName, {""});
    query.match = DirectoryQuery::Match::beginsWith;
    EXPECT_THAT(names(query), ElementsAre("bo", "staff"));
    EXPECT_THAT(found(queryFor(directory::recordName, {"staff"})).at(0).values(directory::groupMembership),
                ElementsAre("bo"));
}

TEST_F(LocalAccounts, OfSeveralLinesWithOneNameTheFirstHolds) {
    _root.users("bo:x:3:1:First:/:\nbo:x:4:1:Second:/:\n");
    const auto records = found(queryFor(directory::recordName, {"bo"}));
    ASSERT_EQ(records.size(), 1U);
    EXPECT_THAT(records[0].values(directory::realName), ElementsAre("First"));
    EXPECT_THAT(names(queryFor(directory::uniqueID, {"4"})), IsEmpty());
}

TEST_F(LocalAccounts, WhatAPropertyListCannotCarryNeverLeavesTheNode) {
    _root.users(
        "b\xFF\x64:x:3:1:Bad login:/:\nctl\x01:x:4:1:Control:/:\nok:x:5:1:Bj\xF6rn \x02 \xEF\xBF\xBE!:/h\xFE:/s\n");
    _root.groups("g\xC0:x:1:\nfine:x:2:ok,b\xFF\x64\n");
    DirectoryQuery query = queryFor(directory::recordName, {""});
    query.match = DirectoryQuery::Match::beginsWith;
    const auto records = found(query);
    ASSERT_EQ(records.size(), 2U) << "an account whose name cannot be carried is left out";
    EXPECT_THAT(records[0].values(directory::realName), ElementsAre("Bj\xEF\xBF\xBDrn \xEF\xBF\xBD \xEF\xBF\xBD!"));
    EXPECT_THAT(records[0].values(directory::homeDirectory), ElementsAre("/h\xEF\xBF\xBD"));
    EXPECT_THAT(records[1].values(directory::groupMembership), ElementsAre("ok"));
}

TEST_F(LocalAccounts, LongLinesAreReadAndTooLongOnesSkipped) {
    std::string members = "m0";
    for (int i = 1; i < 100'000; ++i) {
        members += ",m" + std::to_string(i);
    }
    _root.users("long:x:1:1:" + std::string(1 << 20, 'n') + ":/:\ntoolong:x:2:1:" + std::string(17 << 20, 'n') +
                ":/:\nbo:x:3:1::/:\n");
    _root.groups("all:x:5:" + members + "\n");
    const auto records = found(queryFor(directory::recordName, {"long", "toolong", "bo", "all"}));
    ASSERT_EQ(records.size(), 3U);
    EXPECT_EQ(records[0].first(directory::realName)->size(), std::size_t{1} << 20U);
    EXPECT_EQ(*records[1].first(directory::recordName), "bo");
    EXPECT_EQ(records[2].values(directory::groupMembership).size(), 100'000U);
}

TEST_F(LocalAccounts, HundredThousandAccountsAreFoundByUuidIdAndName) {
    std::string users;
    for (int i = 0; i < 100'000; ++i) {
        const std::string n = std::to_string(i);
        users.append("user").append(n).append(":x:").append(n).append(":100:User ").append(n).append(":/:/bin/sh\n");
    }
    _root.users(users);
    const std::string uuid = textOf(nameBasedUuid(localAccountsNamespace, "user:user99999"));
    EXPECT_THAT(names(queryFor(directory::generatedUID, {uuid})), ElementsAre("user99999"));
    EXPECT_THAT(names(queryFor(directory::uniqueID, {"54321"})), ElementsAre("user54321"));
    EXPECT_THAT(names(queryFor(directory::recordName, {"user7"})), ElementsAre("user7"));
}

TEST_F(LocalAccounts, UnknownNodeTypeAndUnknownNodeAreErrors) {
    const DirectorySession& session = DirectorySession::defaultSession();
    const auto unknownType = session.openNode(0x2202U);
    ASSERT_FALSE(unknownType);
    EXPECT_EQ(unknownType.error().code, directory::noSuchNode);
    EXPECT_THAT(unknownType.error().description.value_or(""), HasSubstr("0x2202"));
    const auto unknownName = session.openNode("/Nowhere");
    ASSERT_FALSE(unknownName);
    EXPECT_THAT(unknownName.error().description.value_or(""), HasSubstr("/Nowhere"));
    EXPECT_EQ(session.openNode("/Local").value()->name(), "/Local");
    EXPECT_EQ(session.openNode("/Search").value()->name(), "/Search");
}

TEST_F(LocalAccounts, ChangesAreNotSupported) {
    const auto opened = DirectorySession::defaultSession().openNode("/Local");
    ASSERT_TRUE(opened);
    DirectoryNode& node = **opened;
    const auto errorOf = [](const auto& result) { return result ? Error() : result.error(); };
    for (const Error& error :
         {errorOf(node.authenticate("root", "secret")), errorOf(node.createRecord(directory::users, "new", {})),
          errorOf(node.deleteRecord(directory::users, "anna")),
          errorOf(node.setPassword(directory::users, "anna", "secret"))}) {
        EXPECT_EQ(error.code, directory::notSupported);
        EXPECT_THAT(error.description.value_or(""), HasSubstr("not supported by the directory node /Local"));
        EXPECT_THAT(error.description.value_or(""), Not(HasSubstr("secret")));
    }
}

// The search node over several nodes.

class FixedNode : public DirectoryNode {
  public:
    FixedNode(std::string name, std::optional<std::vector<std::string>> logins)
        : _name(std::move(name)), _logins(std::move(logins)) {}
    const std::string& name() const noexcept override { return _name; }
    Result<std::vector<DirectoryRecord>> records(const DirectoryQuery& query) override {
        if (!_logins) {
            return adminhost::failure(Error{"ldap", -1, "server down"});
        }
        std::vector<DirectoryRecord> records;
        for (const std::string& login : *_logins) {
            if (query.maximum == 0 || records.size() < query.maximum) {
                records.push_back(
                    {std::string(directory::users),
                     _name,
                     {{std::string(directory::recordName), {login}}, {std::string(directory::uniqueID), {"1001"}}}});
            }
        }
        return records;
    }

  private:
    std::string _name;
    std::optional<std::vector<std::string>> _logins;
};

DirectoryNodeSource fixedNode(const std::string& name, const std::optional<std::vector<std::string>>& logins) {
    return {name, [=] { return std::make_unique<FixedNode>(name, logins); }};
}

TEST_F(LocalAccounts, SearchNodeAsksAllNodesInOrderUpToTheMaximum) {
    setDirectoryNodes({localAccounts(), fixedNode("/LDAP", {{"carl", "dora", "emil"}})});
    DirectoryQuery query = queryFor(directory::recordName, {"anna"});
    EXPECT_THAT(names(query), ElementsAre("anna", "carl", "dora", "emil"));
    query.maximum = 2;
    EXPECT_THAT(names(query), ElementsAre("anna", "carl"));
}

TEST_F(LocalAccounts, SearchNodeFailsWithTheNodeThatFails) {
    setDirectoryNodes({localAccounts(), fixedNode("/LDAP", std::nullopt)});
    const auto error = failure(queryFor(directory::recordName, {"anna"}));
    ASSERT_TRUE(error);
    EXPECT_EQ(*error, (Error{"ldap", -1, "server down"}));
}

TEST_F(LocalAccounts, NodeThatCannotBeOpenedFailsTheSearchNode) {
    setDirectoryNodes({{"/LDAP", []() -> OpenedDirectoryNode {
                            return adminhost::failure(Error{"ldap", -2, "no ticket"});
                        }}});
    EXPECT_EQ(failure(queryFor(directory::recordName, {"anna"})), (Error{"ldap", -2, "no ticket"}));
}

TEST_F(LocalAccounts, UsersHaveAPrincipalInTheRealmIfThereIsOne) {
    EXPECT_EQ(found(queryFor(directory::recordName, {"anna"})).at(0).first(directory::authenticationAuthority),
              nullptr);
    setDirectoryNodes({localAccounts(std::nullopt, "NIMBO.TEST")});
    EXPECT_THAT(found(queryFor(directory::recordName, {"anna"})).at(0).values(directory::authenticationAuthority),
                ElementsAre(";Kerberosv5;;anna@NIMBO.TEST;NIMBO.TEST;"));
    EXPECT_EQ(found(queryFor(directory::recordName, {"editors"})).at(0).first(directory::authenticationAuthority),
              nullptr);
}

// UUIDs given by a file.

constexpr const char* given = "5f2c7d1e-0000-4000-8000-00000000000a";

TEST_F(LocalAccounts, FileOfUuidsReplacesTheComputedOnes) {
    _root.write("etc/uuids", std::string("# the service's rule\n\n  user:anna \t ") + given +
                                 "\r\ngroup:anna 11111111-0000-4000-8000-000000000000\n");
    setDirectoryNodes({localAccounts(HostPath("/etc/uuids"))});
    const auto records = found(queryFor(directory::generatedUID, {"5F2C7D1E-0000-4000-8000-00000000000A"}));
    ASSERT_EQ(records.size(), 1U);
    EXPECT_THAT(records[0].values(directory::generatedUID), ElementsAre(given)) << "spelt as in the file";
    EXPECT_THAT(names(queryFor(directory::generatedUID, {annaUuid})), IsEmpty());
}

TEST_F(LocalAccounts, AccountMissingInTheFileOfUuidsHasNone) {
    _root.write("etc/uuids", "user:anna 5F2C7D1E-0000-4000-8000-00000000000A\n");
    setDirectoryNodes({localAccounts(HostPath("/etc/uuids"))});
    const auto records = found(queryFor(directory::recordName, {"editors"}));
    ASSERT_EQ(records.size(), 1U);
    EXPECT_EQ(records[0].first(directory::generatedUID), nullptr);
    EXPECT_THAT(names(queryFor(directory::generatedUID, {editorsUuid})), IsEmpty());
}

TEST_F(LocalAccounts, OneUuidForTwoAccountsFindsBoth) {
    _root.write("etc/uuids", std::string("user:anna ") + given + "\ngroup:editors " + given + "\n");
    setDirectoryNodes({localAccounts(HostPath("/etc/uuids"))});
    EXPECT_THAT(names(queryFor(directory::generatedUID, {given})), ElementsAre("anna", "editors"));
}

TEST_F(LocalAccounts, BrokenLinesOfTheFileOfUuidsAreSkippedAndTheFirstOfANameHolds) {
    _root.write("etc/uuids", std::string("anna ") + given + "\nuser:anna\nuser:anna garbage\n" + given +
                                 "\nuser:anna " + given + "\nuser:anna 22222222-0000-4000-8000-000000000000");
    setDirectoryNodes({localAccounts(HostPath("/etc/uuids"))});
    EXPECT_THAT(found(queryFor(directory::recordName, {"anna"})).at(0).values(directory::generatedUID),
                ElementsAre(given));
}

TEST_F(LocalAccounts, MissingFileOfUuidsIsAnError) {
    setDirectoryNodes({localAccounts(HostPath("/etc/uuids"))});
    const auto error = failure(queryFor(directory::recordName, {"anna"}));
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code, ENOENT);
    EXPECT_THAT(error->description.value_or(""), HasSubstr("/etc/uuids"));
}

TEST_F(LocalAccounts, ChangedFileOfUuidsIsSeen) {
    _root.write("etc/uuids", std::string("user:anna ") + given + "\n");
    setDirectoryNodes({localAccounts(HostPath("/etc/uuids"))});
    EXPECT_THAT(names(queryFor(directory::generatedUID, {given})), ElementsAre("anna"));
    _root.write("etc/uuids", std::string("user:root ") + given + "\n");
    EXPECT_THAT(names(queryFor(directory::generatedUID, {given})), ElementsAre("root"));
}

// One pass for many look-ups.

/// Looks up until the files are old enough that their time stamps can be trusted.
void settle(AccountFiles& files) {
    std::size_t before = 0;
    do {
        before = files.passes();
        EXPECT_TRUE(files.table(AccountKind::user));
        EXPECT_TRUE(files.table(AccountKind::group));
    } while (files.passes() != before);
}

TEST_F(LocalAccounts, ThousandLookUpsShareOnePass) {
    AccountFiles files;
    settle(files);
    const std::size_t before = files.passes();
    for (int i = 0; i < 1000; ++i) {
        ASSERT_EQ(files.table(AccountKind::user).value()->withUuid(*uuidOf(annaUuid)).size(), 1U);
        ASSERT_EQ(files.table(AccountKind::group).value()->withUuid(*uuidOf(editorsUuid)).size(), 1U);
    }
    EXPECT_EQ(files.passes(), before);
}

TEST_F(LocalAccounts, ChangedAccountsAreSeenAtTheNextLookUp) {
    AccountFiles files;
    settle(files);
    _root.users("bert:x:1001:1000:Bert Berg,Room 4,,:/home/bert:/bin/zsh\n");
    EXPECT_EQ(files.table(AccountKind::user).value()->named("anna").size(), 0U);
    EXPECT_EQ(files.table(AccountKind::user).value()->named("bert").size(), 1U);
    // The same length at once again: the time stamps may be the same.
    for (const char* name : {"carl", "dora", "emil", "fred"}) {
        _root.users(std::string(name) + ":x:1001:1000:Bert Berg,Room 4,,:/home/bert:/bin/zsh\n");
        EXPECT_EQ(files.table(AccountKind::user).value()->named(name).size(), 1U) << name;
    }
}

TEST_F(LocalAccounts, OtherSystemRootIsSeenAtTheNextLookUp) {
    AccountFiles files;
    settle(files);
    TemporaryAccounts other;
    other.users("bo:x:3:1::/:\n");
    EXPECT_EQ(files.table(AccountKind::user).value()->named("bo").size(), 1U);
}

}  // namespace
}  // namespace adminhost
