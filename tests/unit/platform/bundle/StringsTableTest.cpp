#include "platform/bundle/StringsTable.h"

#include <string>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

using namespace std::string_literals;

/// The table, or its error's text under the key "error".
Dictionary parsed(std::string_view bytes) {
    const auto table = parseStringsTable(bytes);
    return table ? *table : Dictionary{{"error", table.error().description.value_or("")}};
}

std::string problemOf(std::string_view bytes) {
    const auto table = parseStringsTable(bytes);
    EXPECT_FALSE(table) << bytes;
    return table ? "" : table.error().description.value_or("");
}

std::string utf16(std::string_view ascii, bool bigEndian) {
    std::string bytes;
    for (const char c : ascii) {
        bytes += bigEndian ? "\0"s + c : c + "\0"s;
    }
    return bytes;
}

TEST(StringsTable, QuotedKeysAndValues) {
    EXPECT_EQ(parsed("\"Name\" = \"Encode\";\n\"Description\"=\"Makes it small\";"),
              (Dictionary{{"Name", "Encode"}, {"Description", "Makes it small"}}));
    EXPECT_EQ(parsed("'single' = 'quo\"ted';"), (Dictionary{{"single", "quo\"ted"}}));
    EXPECT_EQ(parsed("\"two\nlines\" = \"a\nb\";"), (Dictionary{{"two\nlines", "a\nb"}}));
}

TEST(StringsTable, EmptyTextIsAnEmptyTable) {
    EXPECT_EQ(parsed(""), Dictionary());
    EXPECT_EQ(parsed(" \t\r\n // nothing\n /* at all */"), Dictionary());
    EXPECT_EQ(parsed("{}"), Dictionary());
}

TEST(StringsTable, KeysAndValuesWithoutQuotes) {
    EXPECT_EQ(parsed("NSName = value_1;a.b-c/d:e$ = 12;"), (Dictionary{{"NSName", "value_1"}, {"a.b-c/d:e$", "12"}}));
    EXPECT_EQ(problemOf("na(me = x;"), "line 1, column 3: \";\" is expected here");
    EXPECT_EQ(problemOf("a = b c;"), "line 1, column 7: \";\" is expected here");
    EXPECT_EQ(problemOf("\xC3\xA9 = x;"), "line 1, column 1: a key is expected here");
}

TEST(StringsTable, KeyAloneIsItsOwnValue) {
    EXPECT_EQ(parsed("\"Cancel\";"), (Dictionary{{"Cancel", "Cancel"}}));
    EXPECT_EQ(parsed("Cancel ;"), (Dictionary{{"Cancel", "Cancel"}}));
}

TEST(StringsTable, CommentsStandBetweenAnything) {
    EXPECT_EQ(parsed("/* one */ a // two\n = /* \" ; */ b /**/ ; // end"), (Dictionary{{"a", "b"}}));
    EXPECT_EQ(parsed("a = b/*x*/;"), (Dictionary{{"a", "b"}}));
    EXPECT_EQ(parsed("\"//\" = \"/* none */\";"), (Dictionary{{"//", "/* none */"}}));
    EXPECT_EQ(parsed("// one\r\"a\" = \"b\";"), (Dictionary{{"a", "b"}}));
    EXPECT_EQ(problemOf("a = b;\n /* open"), "line 2, column 2: this comment has no end");
}

TEST(StringsTable, EscapesOfLettersQuotesAndBackslash) {
    EXPECT_EQ(parsed(R"("k" = "\a\b\f\n\r\t\v\"\'\\\q";)"), (Dictionary{{"k", "\a\b\f\n\r\t\v\"'\\q"}}));
    EXPECT_EQ(parsed("\"k\" = \"a\\\nb\";"), (Dictionary{{"k", "a\nb"}}));
    EXPECT_EQ(parsed("\"k\" = \"\\\xC3\xA9\";"), (Dictionary{{"k", "\xC3\xA9"}}));
}

TEST(StringsTable, OctalEscapesHaveUpToThreeDigits) {
    EXPECT_EQ(parsed(R"("k" = "\101\60\9\1012\351\7x";)"), (Dictionary{{"k", "A09A2\xC3\xA9\ax"}}));
    EXPECT_EQ(problemOf(R"(k = "\400";)"), "line 1, column 6: an octal escape ends at \\377");
}

TEST(StringsTable, UnicodeEscapesHaveFourDigits) {
    EXPECT_EQ(parsed(R"("k" = "\U00e9\u20AC\U00411";)"), (Dictionary{{"k", "\xC3\xA9\xE2\x82\xAC\x41\x31"}}));
    EXPECT_EQ(parsed(R"("k" = "\Ud83c\Udfa5";)"), (Dictionary{{"k", "\xF0\x9F\x8E\xA5"}}));
    for (const char* bad : {R"(k = "\U12";)", R"(k = "\U";)", R"(k = "\Ud83c";)", R"(k = "\Ud83c\n";)",
                            R"(k = "\Ud83c\U0041";)", R"(k = "\Udfa5";)", R"(k = "\Ug000";)"}) {
        EXPECT_EQ(problemOf(bad),
                  "line 1, column 6: an escape of four hexadecimal digits that name a character is expected here");
    }
}

TEST(StringsTable, NulIsRefusedHoweverItIsWritten) {
    for (const std::string& bad : {R"(k = "\0";)"s, R"(k = "\U0000";)"s, "k = \"a\0b\";"s, "k = \"a\\\0b\";"s}) {
        EXPECT_NE(problemOf(bad).find("NUL"), std::string::npos) << bad;
    }
}

TEST(StringsTable, LastOfEqualKeysStands) {
    EXPECT_EQ(parsed("a = 1; a = 2;"), (Dictionary{{"a", "2"}}));
}

TEST(StringsTable, MayStandInBraces) {
    EXPECT_EQ(parsed("{ a = b; c = d; }"), (Dictionary{{"a", "b"}, {"c", "d"}}));
    EXPECT_EQ(problemOf("{ a = b; "), "line 1, column 10: a key or \"}\" is expected here");
    EXPECT_EQ(problemOf("{ a = b; } c = d;"), "line 1, column 12: a key is expected here");
    EXPECT_EQ(problemOf("a = b; }"), "line 1, column 8: a key is expected here");
}

TEST(StringsTable, ValuesMayBeListsDictionariesAndData) {
    EXPECT_EQ(parsed("l = (a, \"b\", (), ); d = {x = y; n = {};}; b = <0Fb7 77>; e = <>;"),
              (Dictionary{{"l", Array{"a", "b", Array{}}},
                          {"d", Dictionary{{"x", "y"}, {"n", Dictionary()}}},
                          {"b", Data{0x0F, 0xB7, 0x77}},
                          {"e", Data{}}}));
    EXPECT_EQ(problemOf("l = (a b);"), "line 1, column 8: \",\" or \")\" is expected here");
    EXPECT_EQ(problemOf("l = (,);"), "line 1, column 6: a value is expected here");
    EXPECT_EQ(problemOf("b = <123>;"), "line 1, column 9: hexadecimal digits in pairs and \">\" are expected here");
}

TEST(StringsTable, NestingIsBounded) {
    const auto nested = [](std::size_t depth) {
        return "k = " + std::string(depth, '(') + std::string(depth, ')') + ";";
    };
    EXPECT_TRUE(parseStringsTable(nested(stringsTableMaximumDepth)));
    EXPECT_NE(problemOf(nested(stringsTableMaximumDepth + 1)).find("too deep"), std::string::npos);
    EXPECT_NE(problemOf("k = " + std::string(1000000, '(')).find("too deep"), std::string::npos);
}

TEST(StringsTable, SizeIsBounded) {
    const std::string fits(stringsTableMaximumSize, ' ');
    EXPECT_EQ(parsed(fits), Dictionary());
    EXPECT_NE(problemOf(fits + " ").find("more than"), std::string::npos);
}

TEST(StringsTable, MistakesNameLineAndColumnInCharacters) {
    EXPECT_EQ(problemOf("\"a\" = \"b\";\n\"c\" \"d\";"), "line 2, column 5: \";\" is expected here");
    EXPECT_EQ(problemOf("\"\xC3\xA9\" = ;"), "line 1, column 7: a value is expected here");
    EXPECT_EQ(problemOf("a = \"b"), "line 1, column 5: this text has no closing quote");
    EXPECT_EQ(problemOf("a = \"b\\"), "line 1, column 8: this text has no closing quote");
    EXPECT_EQ(problemOf("a = b"), "line 1, column 6: \";\" is expected here");
    EXPECT_EQ(problemOf("just words"), "line 1, column 6: \";\" is expected here");
}

TEST(StringsTable, Utf8WithAndWithoutByteOrderMark) {
    const Dictionary expected{{"k", "Aufl\xC3\xB6sung"}};
    EXPECT_EQ(parsed("k = \"Aufl\xC3\xB6sung\";"), expected);
    EXPECT_EQ(parsed("\xEF\xBB\xBFk = \"Aufl\xC3\xB6sung\";"), expected);
    EXPECT_NE(problemOf("k = \"Aufl\xF6sung\";").find("in neither"), std::string::npos);
}

TEST(StringsTable, Utf16OfBothByteOrdersWithAndWithoutByteOrderMark) {
    const Dictionary expected{{"k", "v"}};
    for (const char* table : {"\"k\" = \"v\";", "// c\nk = v;", "k=v;"}) {
        EXPECT_EQ(parsed("\xFE\xFF" + utf16(table, true)), expected);
        EXPECT_EQ(parsed("\xFF\xFE" + utf16(table, false)), expected);
        EXPECT_EQ(parsed(utf16(table, true)), expected);
        EXPECT_EQ(parsed(utf16(table, false)), expected);
    }
}

TEST(StringsTable, Utf16CharactersOfEveryLength) {
    const std::string before = "\xFE\xFF" + utf16("k=\"", true);
    const std::string after = utf16("\";", true);
    EXPECT_EQ(parsed(before + "\x00\xE9\x20\xAC\xD8\x3C\xDF\xA5"s + after),
              (Dictionary{{"k", "\xC3\xA9\xE2\x82\xAC\xF0\x9F\x8E\xA5"}}));
    EXPECT_NE(problemOf(before + "\xD8\x3C" + after).find("in neither"), std::string::npos);
    EXPECT_NE(problemOf(before + "\xDF\xA5" + after).find("in neither"), std::string::npos);
    EXPECT_NE(problemOf(before + "\xD8\x3C").find("in neither"), std::string::npos);
    EXPECT_NE(problemOf(before + after + "\n").find("in neither"), std::string::npos);
}

TEST(StringsTable, XmlPropertyListIsRead) {
    const std::string list = "<plist version=\"1.0\"><dict><key>k</key><string>v</string></dict></plist>";
    EXPECT_EQ(parsed(list), (Dictionary{{"k", "v"}}));
    EXPECT_EQ(parsed("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n" + list), (Dictionary{{"k", "v"}}));
    EXPECT_NE(problemOf("<plist version=\"1.0\"><array/></plist>").find("is a list"), std::string::npos);
    EXPECT_FALSE(parseStringsTable("<plist version=\"1.0\"><dict>"));
}

const std::string binaryTable =
    "bplist00"
    "\xD1\x01\x02\x51k\x51v"
    "\x08\x0B\x0D"
    "\0\0\0\0\0\0\x01\x01"
    "\0\0\0\0\0\0\0\x03"
    "\0\0\0\0\0\0\0\0"
    "\0\0\0\0\0\0\0\x0F"s;

TEST(StringsTable, BinaryPropertyListIsRead) {
    EXPECT_EQ(parsed(binaryTable), (Dictionary{{"k", "v"}}));
}

TEST(StringsTable, CutAtEveryByteIsEitherAShorterTableOrAMistakeWithItsPlace) {
    const std::string whole =
        "/* c */ \"a\\n\" = \"b\\U00e9\\351\"; // x\n'k' = (l, <00ff>, {m = n;}); \"caf\xC3\xA9\"; last = word;\n";
    ASSERT_TRUE(parseStringsTable(whole));
    for (const std::string& encoded : {whole, "\xEF\xBB\xBF" + whole}) {
        for (std::size_t length = 0; length < encoded.size(); ++length) {
            const auto table = parseStringsTable(std::string_view(encoded).substr(0, length));
            if (!table) {
                EXPECT_FALSE(table.error().description.value_or("").empty()) << length;
            } else {
                EXPECT_LE(table->size(), 4U);
                EXPECT_FALSE(table->contains("last") && length < encoded.size() - 1);
            }
        }
    }
}

TEST(StringsTable, OtherFormsCutAtEveryByteAreRefusedOrShorter) {
    const std::string xml = "<plist version=\"1.0\"><dict><key>k</key><string>v</string></dict></plist>";
    for (std::size_t length = 1; length < xml.size(); ++length) {
        EXPECT_FALSE(parseStringsTable(xml.substr(0, length))) << length;
    }
    for (std::size_t length = 1; length < binaryTable.size(); ++length) {
        EXPECT_FALSE(parseStringsTable(binaryTable.substr(0, length))) << length;
    }
    for (const bool bigEndian : {true, false}) {
        const std::string table = (bigEndian ? "\xFE\xFF" : "\xFF\xFE") + utf16("\"k\" = \"v\";", bigEndian);
        for (std::size_t length = 3; length < table.size(); ++length) {
            EXPECT_FALSE(parseStringsTable(table.substr(0, length))) << length;
        }
    }
}

}  // namespace
}  // namespace adminhost
