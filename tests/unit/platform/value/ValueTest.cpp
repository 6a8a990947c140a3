#include "platform/value/Value.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

TEST(Value, IntegerAndRealAndTrueAreThreeDifferentValues) {
    EXPECT_NE(Value(1), Value(1.0));
    EXPECT_NE(Value(1), Value(true));
    EXPECT_NE(Value(1.0), Value(true));
}

TEST(Value, NonNegativeIntegersAreEqualWhicheverTypeTheyWereMadeFrom) {
    EXPECT_EQ(Value(std::int64_t{7}), Value(std::uint64_t{7}));
    EXPECT_EQ(Value(UINT64_MAX).unsignedInteger(), UINT64_MAX);
    EXPECT_EQ(Value(UINT64_MAX).integer(), std::nullopt);
    EXPECT_EQ(Value(-1).unsignedInteger(), std::nullopt);
}

TEST(Value, MovedFromValueIsNull) {
    Value a("text");
    const Value b = std::move(a);
    EXPECT_TRUE(a.isNull());  // NOLINT(bugprone-use-after-move): that it is null is the contract
    EXPECT_EQ(b, Value("text"));
}

TEST(Value, MayBeAssignedFromAValueInsideItself) {
    Value a(Array{Value("inner")});
    a = Value((*a.array())[0]);
    EXPECT_EQ(a, Value("inner"));
    Value b(Dictionary{{"k", Array{Value(1)}}});
    b = std::move(*b.dictionary()->find("k"));
    EXPECT_EQ(b, Value(Array{Value(1)}));
}

TEST(Dictionary, AppendedKeysAreFoundHoweverManyThereAre) {
    Dictionary dictionary;
    for (int i = 0; i < 40; ++i) {
        dictionary.append("key " + std::to_string(i), i);
        EXPECT_EQ(dictionary.get("key 0"), Value(0)) << i;
        EXPECT_EQ(dictionary.get("key " + std::to_string(i)), Value(i));
    }
    dictionary.set("key 39", "new");
    EXPECT_EQ(dictionary.size(), 40U);
    EXPECT_EQ(dictionary.get("key 39"), Value("new"));
}

TEST(Dictionary, NewKeyMayBeTheTextOfOneOfItsOwnValues) {
    Dictionary d;
    for (int i = 0; i < 80; ++i) {
        // Short, so that the text is inside the entry, which moves when the dictionary grows.
        const std::string key = "k" + std::to_string(i);
        d.set("next key", key);
        d.set(d.text("next key"), i);
        ASSERT_EQ(d.get(key), Value(i)) << key;
    }
}

TEST(Dictionary, KeepsInsertionOrderAndAnExistingKeysPlace) {
    Dictionary d;
    for (int i = 0; i < 100; ++i) {
        d.set("k" + std::to_string(i), i);
    }
    d.set("k3", "changed");
    ASSERT_TRUE(d.remove("k50"));
    int i = 0;
    for (const DictionaryEntry& entry : d) {
        if (i == 50) {
            ++i;
        }
        EXPECT_EQ(entry.key, "k" + std::to_string(i));
        EXPECT_EQ(d.get(entry.key), entry.value);
        ++i;
    }
    EXPECT_EQ(d.size(), 99U);
    EXPECT_EQ(d.get("k3"), Value("changed"));
    EXPECT_FALSE(d.contains("k50"));
}

TEST(Dictionary, StoringNullRemovesTheKey) {
    Dictionary d{{"a", 1}, {"b", 2}};
    d.set("a", nullptr);
    EXPECT_FALSE(d.contains("a"));
    d.set("c", Value());
    EXPECT_EQ(d.size(), 1U);
}

TEST(Dictionary, ListOfEntriesMovesItsValues) {
    Value text(std::string(100, 't'));
    Value data(Data(100));
    Value array(Array{1, 2, 3});
    Value inner(Dictionary{{"deep", std::string(100, 'd')}});
    const char* textBytes = text.string()->data();
    const std::uint8_t* dataBytes = data.data()->data();
    const Value* elements = array.array()->data();
    const DictionaryEntry* entries = &*inner.dictionary()->begin();

    const Dictionary d{{"text", std::move(text)},
                       {"data", std::move(data)},
                       {"array", std::move(array)},
                       {"outer", Dictionary{{"inner", std::move(inner)}}}};

    // A copy would be at another address.
    EXPECT_EQ(d.get("text").string()->data(), textBytes);
    EXPECT_EQ(d.get("data").data()->data(), dataBytes);
    EXPECT_EQ(d.get("array").array()->data(), elements);
    EXPECT_EQ(&*d.at("outer.inner").dictionary()->begin(), entries);
    EXPECT_EQ(d.at("outer.inner.deep"), Value(std::string(100, 'd')));
}

TEST(Dictionary, ListOfEntriesLeavesTheCallersValuesWhereTheyAreNotMoved) {
    const std::string key = "k" + std::string(100, 'e');
    const Value value("v");
    const Dictionary d{{key, value}, {"twice", 1}, {"twice", 2}, {"null", nullptr}, {key + "2", value}};
    EXPECT_EQ(value, Value("v"));
    EXPECT_EQ(d.get(key), value);
    EXPECT_EQ(d.get(key + "2"), value);
    EXPECT_EQ(d.get("twice"), Value(2));
    EXPECT_EQ(d.size(), 3U);
}

TEST(Dictionary, TextOfAKeyIsEmptyUnlessItsValueIsAString) {
    const Dictionary d{{"text", std::string("a\0b", 3)}, {"empty", ""}, {"number", 1}, {"data", Data{'x'}}};
    EXPECT_EQ(d.text("text"), std::string_view("a\0b", 3));
    EXPECT_EQ(d.text("text").data(), d.get("text").string()->data());
    EXPECT_EQ(d.text("empty"), "");
    EXPECT_EQ(d.text("number"), "");
    EXPECT_EQ(d.text("data"), "");
    EXPECT_EQ(d.text("missing"), "");
}

TEST(Dictionary, FollowsKeyPathsAndAnswersNullWhereTheyEndEarly) {
    const Dictionary d{{"optionalArguments", Dictionary{{"variant", "getConfig"}}}, {"text", "x"}};
    EXPECT_EQ(d.at("optionalArguments.variant"), Value("getConfig"));
    EXPECT_TRUE(d.at("optionalArguments.languages").isNull());
    EXPECT_TRUE(d.at("text.variant").isNull());
    EXPECT_TRUE(d.at("").isNull());
}

TEST(Dictionary, CopyOfALargeOneChangesAlone) {
    Dictionary original;
    for (int i = 0; i < 50; ++i) {
        original.set("key" + std::to_string(i), i);
    }
    Dictionary copy = original;
    copy.remove("key0");
    copy.set("key50", 50);
    EXPECT_FALSE(copy.contains("key0"));
    EXPECT_EQ(copy.get("key49"), Value(49));
    EXPECT_EQ(copy.get("key50"), Value(50));
    EXPECT_EQ(original.get("key0"), Value(0));
    EXPECT_FALSE(original.contains("key50"));
    Dictionary assigned{{"other", 1}};
    assigned = original;
    EXPECT_EQ(assigned, original);
    EXPECT_EQ(assigned.get("key49"), Value(49));
    Dictionary taken = std::move(original);
    EXPECT_EQ(taken, assigned);
    EXPECT_EQ(taken.get("key49"), Value(49));
}

TEST(Dictionary, EqualityIgnoresOrder) {
    EXPECT_EQ((Dictionary{{"a", 1}, {"b", 2}}), (Dictionary{{"b", 2}, {"a", 1}}));
    EXPECT_NE((Dictionary{{"a", 1}}), (Dictionary{{"a", 1}, {"b", 2}}));
}

}  // namespace
}  // namespace adminhost
