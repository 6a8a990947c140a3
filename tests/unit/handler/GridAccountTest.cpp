#include "handler/LumioRequestHandler.h"
#include "tests/support/CapturedReports.h"
#include "tests/support/MemoryDirectory.h"
#include "tests/support/TemporaryRoot.h"

#include <algorithm>
#include <set>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {
namespace {

using adminhost::Dictionary;
using adminhost::Error;
using adminhost::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::MatchesRegex;
using testing::Not;

namespace directory = adminhost::directory;

constexpr std::string_view identityFile = "/Library/Preferences/com.brenn.lumioserverd.plist";
constexpr std::string_view libraryFile = "/shared/lumioserverd.plist";
const std::string account = "sorvanenimbo_SERVER-1";

class GridAccount : public testing::Test {
  protected:
    void SetUp() override {
        root.writePropertyList(identityFile, "<key>shared_filesystem</key><string>/shared</string>");
        root.writePropertyList(libraryFile, "<key>server_uuid</key><string>SERVER-1</string>");
    }
    /// The planted password is in no line of the log and in no report.
    void TearDown() override {
        EXPECT_FALSE(log.contains(nodes->administratorsPassword));
        if (!nodes->setPassword.empty()) {
            EXPECT_FALSE(log.contains(nodes->setPassword));
        }
        for (const adminhost::Change& change : reports.changes) {
            for (const Value* value : {&change.from, &change.to, &change.undo}) {
                EXPECT_TRUE(value->isNull() || *value == Value(change.name));
            }
        }
        EXPECT_THAT(reports.parts, IsEmpty());
    }

    [[nodiscard]] Dictionary request() {
        return {{"directoryNode", "/Memory"},
                {"directoryUsername", nodes->administrator},
                {"directoryPassword", nodes->administratorsPassword}};
    }
    [[nodiscard]] Dictionary create(const Dictionary& given) {
        const auto response = handler.createNimboAccountWithRequest(given);
        EXPECT_EQ(response.kind(), adminhost::Response::Kind::dictionary);
        return response.dictionary();
    }
    [[nodiscard]] Dictionary create() { return create(request()); }
    [[nodiscard]] static Dictionary failed(std::int64_t code, std::string_view text) {
        return {{"command", "createNimboAccount"}, {"errorCode", code}, {"error", text}};
    }
    [[nodiscard]] const std::string& valueOf(const adminhost::DirectoryRecord& record, std::string_view attribute) {
        EXPECT_EQ(record.values(attribute).size(), 1U) << attribute;
        return *record.first(attribute);
    }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    adminhost::test::CapturedReports reports;
    adminhost::test::MemoryDirectory nodes;
    LumioRequestHandler handler;
};

TEST_F(GridAccount, IsCreatedWithItsFiveAttributesAndThePasswordOfTheAnswer) {
    const Dictionary answer = create();
    std::vector<std::string> keys;
    for (const auto& entry : answer) {
        keys.push_back(entry.key);
    }
    EXPECT_THAT(keys, ElementsAre("command", "username", "password"));
    EXPECT_EQ(answer.get("command"), Value("createNimboAccount"));
    EXPECT_EQ(answer.get("username"), Value(account));
    EXPECT_EQ(answer.get("password"), Value(nodes->setPassword));

    ASSERT_EQ(nodes->records.size(), 1U);
    const adminhost::DirectoryRecord& record = nodes->records.front();
    EXPECT_EQ(record.type, directory::users);
    EXPECT_EQ(record.attributes.size(), 6U) << "the five and the name";
    EXPECT_EQ(valueOf(record, directory::recordName), account);
    EXPECT_EQ(valueOf(record, directory::realName), account);
    EXPECT_EQ(valueOf(record, directory::homeDirectory), "/var/empty");
    EXPECT_EQ(valueOf(record, directory::userShell), "/bin/bash");
    EXPECT_EQ(valueOf(record, directory::uniqueID), "1025");
    EXPECT_EQ(valueOf(record, directory::primaryGroupID), "20");
    EXPECT_THAT(nodes->asked, ElementsAre("open", "authenticate diradmin", "query RecordName=" + account + " max 1",
                                          "query UniqueID=1025 max 250", "create " + account, "password " + account));
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(GridAccount, FirstMissingKeyIsTheOnlyOneThatIsNamedAndTheDirectoryIsNotAsked) {
    for (const std::string& key :
         {std::string("directoryNode"), std::string("directoryUsername"), std::string("directoryPassword")}) {
        Dictionary given = request();
        given.remove(key);
        EXPECT_EQ(create(given), failed(1, key + " is missing"));
        given.set(key, 5);
        EXPECT_EQ(create(given), failed(1, key + " is missing")) << "a value that is not a text is missing";
    }
    EXPECT_EQ(create({{"directoryPassword", "x"}}), failed(1, "directoryNode is missing"));
    EXPECT_EQ(create({}), failed(1, "directoryNode is missing"));
    EXPECT_THAT(nodes->asked, IsEmpty());
}

TEST_F(GridAccount, UnknownNodeIsTheDirectorysError) {
    Dictionary given = request();
    given.set("directoryNode", "/Elsewhere");
    const Dictionary answer = create(given);
    EXPECT_EQ(answer.get("errorCode"), Value(directory::noSuchNode));
    EXPECT_THAT(std::string(answer.text("error")), testing::HasSubstr("/Elsewhere"));
}

TEST_F(GridAccount, NodeThatCannotBeOpenedIsTheDirectorysError) {
    nodes->opening = Error{"ldap", -1, "Can't contact LDAP server"};
    EXPECT_EQ(create(), failed(-1, "Can't contact LDAP server"));
    EXPECT_THAT(nodes->asked, ElementsAre("open"));
}

TEST_F(GridAccount, WrongPasswordChangesNothing) {
    nodes.addUser(account, "1025");
    Dictionary given = request();
    given.set("directoryPassword", "wrong");
    EXPECT_EQ(create(given), failed(49, "Invalid credentials"));
    EXPECT_THAT(nodes->asked, ElementsAre("open", "authenticate diradmin"));
    EXPECT_EQ(nodes->records.size(), 1U);
    EXPECT_THAT(reports.changes, IsEmpty());
}

TEST_F(GridAccount, SignInThatFailsWithoutAnErrorHasItsOwnMessage) {
    nodes->refusesWithoutError = true;
    EXPECT_EQ(create(), failed(1, "unknown authentication error"));
    EXPECT_THAT(nodes->asked, ElementsAre("open", "authenticate diradmin"));
}

TEST_F(GridAccount, ServerWithoutUuidGetsANewNameEachTimeAndThatIsLoggedAfterTheSignIn) {
    root.writePropertyList(libraryFile, "<key>library_version</key><string>2</string>");
    const std::string first{create().text("username")};
    ASSERT_THAT(first, MatchesRegex("sorvanenimbo_[0-9A-F]{8}(-[0-9A-F]{4}){3}-[0-9A-F]{12}"));
    EXPECT_THAT(log.lines, ElementsAre("adminhost_lumio: Sorvane Producer using uuid '" + first.substr(13) +
                                       "' because the server_uuid could not be determined."));
    EXPECT_NE(create().text("username"), first);

    log.lines.clear();
    Dictionary given = request();
    given.set("directoryPassword", "wrong");
    static_cast<void>(create(given));
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(GridAccount, EmptyOrUnusableServerUuidCountsAsMissing) {
    for (const char* uuid : {"<string></string>", "<integer>5</integer>"}) {
        log.lines.clear();
        root.writePropertyList(libraryFile, std::string("<key>server_uuid</key>") + uuid);
        EXPECT_EQ(create().text("username").size(), account.substr(0, 13).size() + 36);
        EXPECT_EQ(log.lines.size(), 1U);
    }
    log.lines.clear();
    std::filesystem::remove(root.path(libraryFile));
    static_cast<void>(create());
    EXPECT_EQ(log.lines.size(), 1U);
}

TEST_F(GridAccount, TakesTheFirstFreeUserIdFrom1025) {
    nodes.addUser("a", "1025");
    nodes.addUser("b", "1026");
    nodes.addUser("c", "1024");
    static_cast<void>(create());
    EXPECT_EQ(valueOf(nodes->records.back(), directory::uniqueID), "1027");
}

TEST_F(GridAccount, EarlierAccountIsReplacedBeforeTheSearchForAnIdSoThatItsIdComesBack) {
    nodes.addUser(account, "1025");
    const std::string first{create().text("password")};
    EXPECT_THAT(nodes->asked, ElementsAre("open", "authenticate diradmin", "query RecordName=" + account + " max 1",
                                          "delete " + account, "query UniqueID=1025 max 250", "create " + account,
                                          "password " + account));
    ASSERT_EQ(nodes->records.size(), 1U);
    EXPECT_EQ(valueOf(nodes->records.front(), directory::uniqueID), "1025");
    EXPECT_NE(create().text("password"), first);
    EXPECT_EQ(nodes->records.size(), 1U);
}

TEST_F(GridAccount, FailureToLookUpOrDeleteTheEarlierAccountEndsTheCreation) {
    nodes.addUser(account, "1025");
    nodes->nameQuery = Error{"ldap", 50, "Insufficient access"};
    EXPECT_EQ(create(), failed(50, "Insufficient access"));
    nodes->nameQuery.reset();
    nodes->deletion = Error{"ldap", 53, "Server is unwilling to perform"};
    EXPECT_EQ(create(), failed(53, "Server is unwilling to perform"));
    EXPECT_EQ(nodes->records.size(), 1U);
    EXPECT_THAT(nodes->asked, Not(testing::Contains("create " + account)));
}

TEST_F(GridAccount, SearchForAnIdThatTheServerRefusesCountsAsFree) {
    nodes.addUser("a", "1025");
    nodes->idQuery = Error{"ldap", 50, "Insufficient access"};
    EXPECT_EQ(create().get("username"), Value(account));
    EXPECT_EQ(valueOf(nodes->records.back(), directory::uniqueID), "1025");
}

TEST_F(GridAccount, SearchForAnIdThatTheServerDidNotAnswerEndsTheCreation) {
    nodes->idQuery = Error{"ldap", -5, "Timed out"};
    EXPECT_EQ(create(), failed(-5, "Timed out"));
    EXPECT_THAT(nodes->records, IsEmpty());
}

TEST_F(GridAccount, RecordThatIsNotCreatedIsTheDirectorysErrorAndTheEarlierAccountStaysDeleted) {
    nodes.addUser(account, "1025");
    nodes->creation = Error{"ldap", 65, "Object class violation"};
    EXPECT_EQ(create(), failed(65, "Object class violation"));
    EXPECT_THAT(nodes->records, IsEmpty());
}

TEST_F(GridAccount, RecordThatDoesNotComeBackHasItsOwnMessageAndStays) {
    nodes->losesNewRecord = true;
    EXPECT_EQ(create(), failed(1, "unknown record creation error"));
    EXPECT_EQ(nodes->records.size(), 1U);
    EXPECT_TRUE(nodes->setPassword.empty());
}

TEST_F(GridAccount, PasswordThatIsNotSetIsTheDirectorysErrorAndTheRecordStays) {
    nodes->passwordSetting = Error{"ldap", 19, std::nullopt};
    EXPECT_EQ(create(), failed(19, "")) << "an error without a description has an empty message";
    EXPECT_EQ(nodes->records.size(), 1U);
}

TEST_F(GridAccount, EveryPasswordHas20CharactersFromExclamationMarkToClosingBrace) {
    std::set<std::string> passwords;
    std::set<char> characters;
    constexpr int runs = 300;
    for (int i = 0; i < runs; ++i) {
        static_cast<void>(create());
        const std::string password = nodes->setPassword;
        EXPECT_EQ(password.size(), 20U);
        EXPECT_TRUE(std::all_of(password.begin(), password.end(), [](char c) { return c >= '!' && c <= '}'; }))
            << password;
        passwords.insert(password);
        characters.insert(password.begin(), password.end());
    }
    EXPECT_EQ(passwords.size(), static_cast<std::size_t>(runs));
    // 6000 draws miss one of 93 characters with a probability of 93 * (92/93)^6000, below 10^-26.
    EXPECT_EQ(characters.size(), 93U) << "every one occurs, also the first and the last";
}

TEST_F(GridAccount, ReplacedAndNewAccountAreReported) {
    nodes.addUser(account, "1025");
    static_cast<void>(create());
    adminhost::Change removed;
    removed.section = "accounts";
    removed.identity = account;
    removed.name = account;
    removed.from = account;
    adminhost::Change added = removed;
    added.from = nullptr;
    added.to = account;
    EXPECT_THAT(reports.changes, ElementsAre(removed, added));
}

}  // namespace
}  // namespace lumio
