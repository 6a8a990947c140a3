#include "tests/unit/resources/PropertyFixture.h"

#include <algorithm>
#include <filesystem>

#include <sys/stat.h>

namespace lumio {
namespace {

class ProtectedValue : public PropertyFixture {
  protected:
    /// The one property is listed once, without any part of its value.
    static void expectListedWithoutValue() {
        const std::vector<Dictionary> records = listed();
        ASSERT_EQ(records.size(), 1U);
        std::vector<std::string> keys;
        for (const auto& entry : records[0]) {
            keys.push_back(entry.key);
        }
        std::sort(keys.begin(), keys.end());
        EXPECT_EQ(keys, (std::vector<std::string>{"_id_", "created_at", "id", "name", "protect", "updated_at"}));
        EXPECT_EQ(records[0].get("protect"), Value(true));
    }

    /// The stored value is the plain text's protected form, in full lines of 76 characters.
    void expectProtected(const std::string& plain) const {
        std::string stored = storedValue();
        for (std::size_t at = 0; at < stored.size(); at += 77) {
            const std::size_t length = std::min(stored.find('\n', at), stored.size()) - at;
            ASSERT_TRUE(length == 76 || at + length == stored.size());
        }
        const std::size_t lines = static_cast<std::size_t>(std::count(stored.begin(), stored.end(), '\n'));
        const std::size_t cipherLength = (plain.size() / 16 + 1) * 16;
        EXPECT_EQ(lines, cipherLength / 57);
        std::erase(stored, '\n');
        EXPECT_EQ(stored, protectedByOpenssl(plain));
        EXPECT_EQ(row("protect"), "t");
    }
};

class Cycle : public ProtectedValue, public testing::WithParamInterface<std::size_t> {};

TEST_P(Cycle, ProtectChangeUnprotectProtectKeepsTheValue) {
    const std::string first(GetParam(), 'a');
    const std::string second(GetParam(), 'b');
    ASSERT_EQ(insert({{"name", "n"}, {"value", first}}), std::nullopt);
    ASSERT_EQ(storedValue(), first);

    EXPECT_EQ(change({{"_id_", "1"}, {"protect", true}}), std::nullopt);
    expectProtected(first);
    expectListedWithoutValue();

    EXPECT_EQ(change({{"_id_", "1"}, {"value", second}}), std::nullopt);
    expectProtected(second);
    expectListedWithoutValue();

    EXPECT_EQ(change({{"_id_", "1"}, {"protect", false}}), std::nullopt);
    EXPECT_EQ(storedValue(), second);
    EXPECT_EQ(row("protect"), "f");
    ASSERT_EQ(listed().size(), 1U);
    EXPECT_EQ(listed()[0].get("value"), Value(second));

    EXPECT_EQ(change({{"_id_", "1"}, {"protect", true}}), std::nullopt);
    expectProtected(second);
    expectListedWithoutValue();
    EXPECT_TRUE(log.lines.empty());
}

INSTANTIATE_TEST_SUITE_P(PlainLengths, Cycle, testing::Values(5, 47, 48, 57, 111, 112, 896, 911, 912, 1808, 60000));

TEST_F(ProtectedValue, WrappedValueProtectedAgainIsEncryptedWhole) {
    for (const std::size_t length : {112U, 896U}) {
        sql("delete from properties; delete from sqlite_sequence;");
        ASSERT_EQ(insert({{"name", "n"}, {"value", std::string(length, 'x')}, {"protect", true}}), std::nullopt);
        const std::string once = storedValue();
        ASSERT_EQ(change({{"_id_", "1"}, {"protect", true}}), std::nullopt);
        EXPECT_EQ(Property::decryptValue(storedValue()), once);
    }
}

TEST_F(ProtectedValue, SeveralWrappedPropertiesAreListedOnceEach) {
    for (const char* name : {"a", "b", "c"}) {
        ASSERT_EQ(insert({{"name", name}, {"value", std::string(896, 'x')}, {"protect", true}}), std::nullopt);
        ASSERT_EQ(insert({{"name", std::string(name) + "2"}, {"value", "plain"}}), std::nullopt);
    }
    const std::vector<Dictionary> records = listed();
    ASSERT_EQ(records.size(), 6U);
    EXPECT_EQ(records[4].get("name"), Value("c"));
    EXPECT_EQ(records[4].size(), 6U);
    EXPECT_EQ(records[5].get("value"), Value("plain"));
}

TEST_F(ProtectedValue, ColumnsInAnotherOrderMakeNoDifference) {
    sql("drop table properties; create table properties(name,protect,id integer primary "
        "key,updated_at,created_at,value)");
    for (const std::size_t length : {5U, 112U, 896U}) {
        sql("delete from properties");
        const std::string plain(length, 'x');
        ASSERT_EQ(insert({{"name", "n"}, {"value", plain}, {"protect", true}}), std::nullopt);
        expectListedWithoutValue();
        ASSERT_EQ(change({{"_id_", "1"}, {"protect", false}}), std::nullopt);
        EXPECT_EQ(storedValue(), plain);
    }
}

TEST_F(ProtectedValue, PlainValueOfSeveralLinesIsOneValueAndIsProtectedWhole) {
    for (const std::string text : {"two\nlines", "with words\nin two lines\n", "a\n\n\nb\n", "\n"}) {
        sql("delete from properties; delete from sqlite_sequence;");
        ASSERT_EQ(insert({{"name", "n"}, {"value", text}}), std::nullopt);
        ASSERT_EQ(listed().size(), 1U);
        EXPECT_EQ(listed()[0].get("value"), Value(text));
        ASSERT_EQ(change({{"_id_", "1"}, {"protect", true}}), std::nullopt);
        EXPECT_EQ(Property::decryptValue(storedValue()), text);
        ASSERT_EQ(change({{"_id_", "1"}, {"protect", false}}), std::nullopt);
        EXPECT_EQ(storedValue(), text);
    }
}

TEST_F(ProtectedValue, WhatWasEncryptedIsDecryptedUnderTheSameKeyFile) {
    for (const std::string text : {"", "x", "sixteen bytes...", "\xC3\xA9t\xC3\xA9 \xF0\x9F\x8E\xA5", "\"'\\"}) {
        const auto cipher = Property::encryptValue(text);
        ASSERT_TRUE(cipher);
        EXPECT_EQ(Property::decryptValue(*cipher), text);
    }
    EXPECT_EQ(Property::encryptValue(12), Property::encryptValue("12"));
    EXPECT_TRUE(log.lines.empty());
}

TEST_F(ProtectedValue, NullGivesNothingWithoutALogLine) {
    EXPECT_EQ(Property::encryptValue({}), std::nullopt);
    EXPECT_EQ(Property::decryptValue({}), std::nullopt);
    EXPECT_TRUE(log.lines.empty());
}

TEST_F(ProtectedValue, EmptyTextDoesNotDecrypt) {
    EXPECT_EQ(Property::decryptValue(""), std::nullopt);
    EXPECT_EQ(log.lines, std::vector<std::string>{"no convertedValueData from aes128cbc..."});
}

TEST_F(ProtectedValue, KeyFileThatCannotBeLoadedIsLoggedByItsPath) {
    const std::vector<std::string> failed{"failed to load /shared/Server/Secrets/kek.plist"};
    const auto expectFailure = [&] {
        log.lines.clear();
        EXPECT_EQ(Property::encryptValue("x"), std::nullopt);
        EXPECT_EQ(log.lines, failed);
    };
    std::filesystem::remove(root.path(keyPath));
    expectFailure();
    root.write(keyPath, "no property list");
    expectFailure();
    root.write(keyPath, "<plist version=\"1.0\"><array/></plist>");
    expectFailure();
    std::filesystem::remove(root.path(keyPath));
    ASSERT_EQ(::mkfifo(root.path(keyPath).c_str(), 0600), 0);
    expectFailure();
    std::filesystem::remove(root.path(keyPath));
    std::filesystem::create_directory(root.path(keyPath));
    expectFailure();
}

TEST_F(ProtectedValue, WithoutASharedFilesystemThereIsNoKeyFileAndNoDefaultForIt) {
    root.writePropertyList("/Library/SorvaneProducer/Shared/Server/Secrets/kek.plist",
                           "<key>lumio_secret</key><string>bHVtaW8tc2FtcGxlLWtleQ==</string>");
    root.writePropertyList(identityPath, "<key>member_uuid</key><string>M</string>");
    EXPECT_EQ(Property::encryptValue("x"), std::nullopt);
    EXPECT_EQ(log.lines, std::vector<std::string>{"failed to load (null)/Server/Secrets/kek.plist"});
}

TEST_F(ProtectedValue, SecretThatIsMissingOrNoTextIsLogged) {
    for (const char* content : {"<key>other</key><string>x</string>", "<key>lumio_secret</key><integer>5</integer>",
                                "<key>lumio_secret</key><data>bHVtaW8tc2FtcGxlLWtleQ==</data>"}) {
        log.lines.clear();
        root.writePropertyList(keyPath, content);
        EXPECT_EQ(Property::encryptValue("x"), std::nullopt);
        EXPECT_EQ(log.lines, std::vector<std::string>{"kek shared_secret not found"});
    }
}

TEST_F(ProtectedValue, SecretOfAWrongLengthDoesNotEncrypt) {
    for (const char* secret : {"", "bHVtaW8=", "bm90IGJhc2U2NCBidXQgbG9uZ2Vy", "no base64 at all!"}) {
        log.lines.clear();
        useSecret(secret);
        EXPECT_EQ(Property::encryptValue("x"), std::nullopt);
        EXPECT_EQ(log.lines, std::vector<std::string>{"no convertedValueData from aes128cbc..."});
    }
}

TEST_F(ProtectedValue, KeyFileIsReadAnewEveryTime) {
    const auto first = Property::encryptValue("x");
    useSecret("QUJDREVGR0hJSktMTU5PUA==");
    EXPECT_NE(Property::encryptValue("x"), first);
}

TEST_F(ProtectedValue, ChangedCutOrLengthenedCipherTextGivesNothingOrAnotherText) {
    const std::string plain = "a secret of some length, over two blocks";
    const std::string stored = *Property::encryptValue(plain);
    for (std::size_t at = 0; at < stored.size(); ++at) {
        EXPECT_NE(Property::decryptValue(stored.substr(0, at)), plain);
        std::string changed = stored;
        changed[at] = static_cast<char>(changed[at] ^ 1);
        if (changed[at] != '<' && stored[at] != '=') {
            EXPECT_NE(Property::decryptValue(changed), plain) << at;
        }
    }
    EXPECT_NE(Property::decryptValue(stored + "AAAA"), plain);
    EXPECT_NE(Property::decryptValue("\xFF\xFE" + stored), plain);
    EXPECT_FALSE(log.contains("secret of"));
}

TEST_F(ProtectedValue, DecryptedBytesThatAreNotUtf8GiveNothing) {
    root.write("/plain", "\xFF\xFE latin \xE9");
    const std::string cipher =
        adminhost::test::runProgram({"openssl", "enc", "-aes-128-cbc", "-K", "6c756d696f2d73616d706c652d6b6579", "-iv",
                                     vectorHex, "-base64", "-A", "-in", root.path("/plain").string()})
            .output;
    EXPECT_EQ(Property::decryptValue(cipher), std::nullopt);
    EXPECT_TRUE(log.lines.empty());
}

TEST_F(ProtectedValue, NoLogLineOfAFailedWriteShowsAValueThatIsToBeProtected) {
    sql("insert into properties(name,value,protect) values('n','stored-secret','f')");
    sql("create trigger refuse before update on properties begin select raise(abort,'refused'); end;"
        "create trigger refuse2 before insert on properties begin select raise(abort,'refused'); end;");
    EXPECT_TRUE(insert({{"name", "m"}, {"value", "new-secret"}, {"protect", true}}));
    EXPECT_TRUE(change({{"_id_", "1"}, {"protect", true}}));
    ASSERT_EQ(log.lines.size(), 2U);
    EXPECT_TRUE(log.contains("value = (secret);"));
    EXPECT_FALSE(log.contains("-secret"));
}

TEST_F(ProtectedValue, PlainTextThatCannotBeStoredStaysProtectedAndUnseen) {
    ASSERT_EQ(insert({{"name", "n"}, {"value", "hidden \"words\" here"}, {"protect", true}}), std::nullopt);
    const std::string stored = storedValue();
    const auto error = change({{"_id_", "1"}, {"protect", false}});
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, "sqliteQuery");
    EXPECT_EQ(error->description->find("words"), std::string::npos);
    EXPECT_EQ(storedValue(), stored);
    EXPECT_EQ(row("protect"), "t");
    EXPECT_FALSE(log.contains("words"));
    EXPECT_FALSE(log.contains(stored));
}

TEST_F(ProtectedValue, ValueOverTheBoundOfOneArgumentIsAnErrorAndWritesNothing) {
    const auto error = insert({{"name", "n"}, {"value", std::string(100000, 'x')}, {"protect", true}});
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code, -1);
    EXPECT_TRUE(insert({{"name", "n"}, {"value", std::string(140000, 'x')}}));
    EXPECT_TRUE(insert({{"name", "n"}, {"value", std::string("a\0b", 3)}}));
    EXPECT_EQ(sql("select count(*) from properties"), "0\n");
}

}  // namespace
}  // namespace lumio
