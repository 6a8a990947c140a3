#include "platform/plist/PropertyList.h"

#include <chrono>
#include <cmath>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using namespace adminhost;
using namespace std::chrono;
using namespace std::string_literals;

std::string plist(const std::string& content) {
    return "<plist version=\"1.0\">" + content + "</plist>";
}

/// The error's description; "accepted" if there was none.
std::string errorOf(std::string_view bytes) {
    const auto value = parsePropertyList(bytes);
    if (value) {
        return "accepted";
    }
    EXPECT_EQ(value.error().domain, "propertyList");
    EXPECT_EQ(value.error().code, 1);
    return value.error().description.value_or("");
}

Value valueOf(std::string_view bytes) {
    auto value = parsePropertyList(bytes);
    EXPECT_TRUE(value) << value.error().description.value_or("");
    return value.value_or(nullptr);
}

TEST(XmlReader, NumberOfValuesIsBoundedByTheCaller) {
    const std::string text = "<plist><dict><key>a</key><array><true/><true/></array></dict></plist>";
    EXPECT_TRUE(parsePropertyList(text, 4));
    const auto tooMany = parsePropertyList(text, 3);
    ASSERT_FALSE(tooMany);
    EXPECT_EQ(tooMany.error(),
              (Error{"propertyList", plistTooManyValues, "line 1, column 55: there are more than 3 values"}));
    const auto broken = parsePropertyList("<plist>", 3);
    ASSERT_FALSE(broken);
    EXPECT_EQ(broken.error().code, 1);
}

TEST(XmlReader, ReadsEveryType) {
    const Value expected = Dictionary{{"b", true},
                                      {"f", false},
                                      {"i", -7},
                                      {"r", 1.5},
                                      {"s", "à < b"},
                                      {"d", sys_seconds(sys_days(2026y / January / 31) + 8h)},
                                      {"x", Data{0, 1, 255}},
                                      {"a", Array{1, "two"}},
                                      {"e", Dictionary{}}};
    EXPECT_EQ(valueOf("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n<dict>\n"
                      "<key>b</key><true/><key>f</key><false></false><key>i</key><integer>-7</integer>\n"
                      "<key>r</key><real>1.5</real><key>s</key><string>à &lt; b</string>\n"
                      "<key>d</key><date>2026-01-31T08:00:00Z</date><key>x</key><data>\n\tAA\n\tH/\n</data>\n"
                      "<key>a</key><array><integer>1</integer><string>two</string></array><key>e</key><dict/>\n"
                      "</dict>\n</plist>\n"),
              expected);
}

TEST(XmlReader, KeepsTheOrderOfKeys) {
    const Value value = valueOf(plist("<dict><key>z</key><true/><key>a</key><true/><key>m</key><true/></dict>"));
    std::string order;
    for (const DictionaryEntry& entry : *value.dictionary()) {
        order += entry.key;
    }
    EXPECT_EQ(order, "zam");
}

TEST(XmlReader, TopLevelMayBeAnyType) {
    EXPECT_EQ(valueOf(plist("<string>x</string>")), Value("x"));
    EXPECT_EQ(valueOf(plist("<array/>")), Value(Array{}));
    EXPECT_EQ(valueOf("<plist><true/></plist>"), Value(true));
}

TEST(XmlReader, KeepsWhiteSpaceOfTextsAndKeys) {
    EXPECT_EQ(valueOf(plist("<dict><key> k\n</key><string>\n a\tb </string></dict>")),
              Value(Dictionary{{" k\n", "\n a\tb "}}));
    EXPECT_EQ(valueOf(plist("<string></string>")), Value(""));
}

TEST(XmlReader, ReadsCommentsInstructionsSectionsAndReferences) {
    EXPECT_EQ(
        valueOf("<!-- a --><?b c?>" + plist("<!-- d --><string>a<!-- e -->b<![CDATA[<&]]>&#65;&#x42;&quot;</string>")),
        Value("ab<&AB\""));
}

TEST(XmlReader, BareDocumentTypeIsSkipped) {
    EXPECT_EQ(valueOf("<?xml version=\"1.0\"?>\n<!DOCTYPE plist PUBLIC \"-//X//DTD\" \"http://localhost/none.dtd\">\n" +
                      plist("<true/>")),
              Value(true));
    EXPECT_EQ(valueOf("<!DOCTYPE plist SYSTEM \"file:///etc/passwd\">" + plist("<true/>")), Value(true));
    EXPECT_EQ(valueOf("<!DOCTYPE plist>" + plist("<true/>")), Value(true));
}

TEST(XmlReader, DocumentTypeWithInternalSubsetIsRefused) {
    EXPECT_EQ(errorOf("<!DOCTYPE plist []>" + plist("<true/>")),
              "line 1, column 17: a document type with an internal subset is not accepted");
    EXPECT_THAT(errorOf("<?xml version=\"1.0\"?>\n<!DOCTYPE plist [<!ENTITY a \"x\"><!ENTITY b \"&a;&a;\">]>" +
                        plist("<string>&b;</string>")),
                testing::StartsWith("line 2, column 17: a document type with an internal subset"));
    EXPECT_THAT(errorOf("<!DOCTYPE plist [<!ENTITY a SYSTEM \"file:///etc/passwd\">]>" + plist("<string>&a;</string>")),
                testing::HasSubstr("internal subset"));
}

TEST(XmlReader, UnknownEntitiesAreRefusedAlsoAfterADocumentType) {
    EXPECT_EQ(errorOf(plist("<string>&a;</string>")), "line 1, column 30: undefined entity");
    EXPECT_EQ(errorOf("<!DOCTYPE plist SYSTEM \"x\">\n" + plist("<string>&a;</string>")),
              "line 2, column 30: unknown entity &a;");
}

TEST(XmlReader, ByteOrderMarkOfUtf8IsAccepted) {
    EXPECT_EQ(valueOf("\xEF\xBB\xBF<?xml version=\"1.0\" encoding=\"UTF-8\"?>" + plist("<string>à</string>")),
              Value("à"));
}

std::string utf16(const std::u16string& text, bool bigEndian) {
    std::string bytes;
    for (const char16_t unit : text) {
        const char high = static_cast<char>(unit >> 8U);
        const char low = static_cast<char>(unit & 0xFFU);
        bytes += bigEndian ? high : low;
        bytes += bigEndian ? low : high;
    }
    return bytes;
}

TEST(XmlReader, Utf16IsReadWithAndWithoutByteOrderMark) {
    const std::u16string text = u"<?xml version=\"1.0\" encoding=\"UTF-16\"?><plist><string>à😀</string></plist>";
    for (const bool bigEndian : {false, true}) {
        EXPECT_EQ(valueOf(utf16(u"\xFEFF" + text, bigEndian)), Value("à😀"));
        EXPECT_EQ(valueOf(utf16(text, bigEndian)), Value("à😀"));
    }
}

TEST(XmlReader, UnpairedSurrogatesAndHalfUnitsAreRefused) {
    std::u16string text = u"\xFEFF<plist>\n<string>à";
    EXPECT_EQ(errorOf(utf16(text + u'\xD800' + u"x</string></plist>", false)), "line 2, column 10: invalid UTF-16");
    EXPECT_EQ(errorOf(utf16(text + u'\xDC00' + u"x</string></plist>", true)), "line 2, column 10: invalid UTF-16");
    EXPECT_EQ(errorOf(utf16(text + u"</string></plist>", true) + '\0'), "line 2, column 27: invalid UTF-16");
}

TEST(XmlReader, DeclaredEncodingsAreObeyed) {
    EXPECT_EQ(valueOf("<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?><plist><string>\xE0</string></plist>"),
              Value("à"));
    EXPECT_EQ(valueOf("<?xml version=\"1.0\" encoding=\"US-ASCII\"?><plist><string>a</string></plist>"), Value("a"));
    EXPECT_THAT(errorOf("<?xml version=\"1.0\" encoding=\"US-ASCII\"?><plist><string>\xE0</string></plist>"),
                testing::EndsWith("not well-formed (invalid token)"));
    EXPECT_EQ(errorOf("<?xml version=\"1.0\" encoding=\"EBCDIC\"?><plist><true/></plist>"),
              "line 1, column 31: unknown encoding");
    EXPECT_THAT(errorOf("<?xml version=\"1.0\" encoding=\"UTF-16\"?><plist><true/></plist>"),
                testing::HasSubstr("encoding"));
}

TEST(XmlReader, InvalidUtf8IsRefused) {
    for (const std::string bad : {"\xFF", "\xC0\x80", "\xED\xA0\x80", "\xF4\x90\x80\x80", "\xC3", "\xEF\xBF\xBE"}) {
        EXPECT_EQ(errorOf("<plist>\n<string>" + bad + "</string></plist>"),
                  "line 2, column 9: not well-formed (invalid token)");
        EXPECT_THAT(errorOf("<plist><dict><key>" + bad + "</key><true/></dict></plist>"),
                    testing::EndsWith("column 19: not well-formed (invalid token)"));
    }
}

TEST(XmlReader, CharactersThatXmlForbidsAreRefused) {
    EXPECT_THAT(errorOf(plist("<string>\x01</string>")), testing::EndsWith("not well-formed (invalid token)"));
    EXPECT_THAT(errorOf(plist("<string>"s + '\0' + "</string>")), testing::EndsWith("not well-formed (invalid token)"));
    EXPECT_THAT(errorOf(plist("<string>&#0;</string>")), testing::HasSubstr("invalid character"));
    EXPECT_THAT(errorOf(plist("<string>&#xD800;</string>")), testing::HasSubstr("invalid character"));
}

TEST(XmlReader, TextThatIsNoPropertyListIsRefused) {
    EXPECT_EQ(errorOf(""), "line 1, column 1: no element found");
    EXPECT_EQ(errorOf("plain text"), "line 1, column 1: syntax error");
    EXPECT_EQ(errorOf("{ a = b; }"), "line 1, column 1: not well-formed (invalid token)");
    EXPECT_EQ(errorOf("<html/>"), "line 1, column 1: unknown element <html>");
}

TEST(XmlReader, ListElementIsRequired) {
    EXPECT_EQ(errorOf("<dict/>"), "line 1, column 1: <dict> instead of <plist>");
    EXPECT_EQ(errorOf("<plist><plist><true/></plist></plist>"), "line 1, column 8: <plist> inside <plist>");
}

TEST(XmlReader, ListWithoutValueOrWithTwoIsRefused) {
    EXPECT_EQ(errorOf("<plist>\n</plist>"), "line 2, column 1: <plist> without a value");
    EXPECT_EQ(errorOf("<plist/>"), "line 1, column 9: <plist> without a value");
    EXPECT_EQ(errorOf("<plist><true/>\n <false/></plist>"), "line 2, column 2: a second value in <plist>");
    EXPECT_EQ(errorOf("<plist><dict/><dict/></plist>"), "line 1, column 15: a second value in <plist>");
}

TEST(XmlReader, WhatFollowsTheListIsRefused) {
    EXPECT_EQ(errorOf(plist("<true/>") + "\nx"), "line 2, column 1: junk after document element");
    EXPECT_EQ(errorOf(plist("<true/>") + "\n" + plist("<true/>")), "line 2, column 1: junk after document element");
    EXPECT_THAT(errorOf(plist("<true/>") + '\0'), testing::StartsWith("line 1, column 37: "));
    EXPECT_EQ(valueOf(plist("<true/>") + "\n \t\r\n<!-- end -->\n"), Value(true));
}

TEST(XmlReader, UnknownElementsAndAttributesAreRefused) {
    EXPECT_EQ(errorOf("<plist>\n  <set/>\n</plist>"), "line 2, column 3: unknown element <set>");
    EXPECT_EQ(errorOf("<plist><Dict/></plist>"), "line 1, column 8: unknown element <Dict>");
    EXPECT_EQ(errorOf("<plist><dict a=\"b\"/></plist>"), "line 1, column 8: <dict> with an unknown attribute a");
    EXPECT_EQ(errorOf("<plist class=\"b\"><dict/></plist>"),
              "line 1, column 1: <plist> with an unknown attribute class");
    EXPECT_EQ(errorOf("<plist version=\"2.0\"><dict/></plist>"), "line 1, column 1: unknown version \"2.0\"");
}

TEST(XmlReader, LongNamesAreShortenedInMessages) {
    EXPECT_EQ(errorOf("<plist><" + std::string(100'000, 'x') + "/></plist>"),
              "line 1, column 8: unknown element <" + std::string(60, 'x') + "...>");
    std::string accents;
    for (int i = 0; i < 1000; ++i) {
        accents += "€";
    }
    EXPECT_THAT(errorOf(plist("<dict><key>" + accents + "</key></dict>")),
                testing::HasSubstr("\"€€€€€€€€€€€€€€€€€€€€...\""));
}

TEST(XmlReader, TextOfAValueStandsInNoMessage) {
    for (const std::string name : {"integer", "real", "date", "data", "true", "false", "dict", "array", "string"}) {
        const std::string message =
            errorOf("<plist><" + name + ">planted" + (name == "string" ? "" : "</" + name + ">") + "</plist>");
        EXPECT_THAT(message, testing::StartsWith("line 1, column")) << name;
        EXPECT_THAT(message, testing::Not(testing::HasSubstr("planted")));
    }
}

TEST(XmlReader, DictionaryIsKeysWithValuesInTurn) {
    EXPECT_EQ(errorOf("<plist><dict><key>a</key>\n</dict></plist>"), "line 2, column 1: the key \"a\" has no value");
    EXPECT_EQ(errorOf("<plist><dict><key>a</key><key>b</key><true/></dict></plist>"),
              "line 1, column 26: the key \"a\" has no value");
    EXPECT_EQ(errorOf("<plist><dict><true/></dict></plist>"), "line 1, column 14: <true> without a key");
    EXPECT_EQ(errorOf("<plist><dict><key>a</key><true/><dict/></dict></plist>"),
              "line 1, column 33: <dict> without a key");
    EXPECT_EQ(errorOf("<plist><array><key>a</key></array></plist>"), "line 1, column 15: <key> inside <array>");
    EXPECT_EQ(errorOf("<plist><key>a</key></plist>"), "line 1, column 8: <key> outside <dict>");
}

TEST(XmlReader, KeyThatStandsTwiceIsRefused) {
    EXPECT_EQ(errorOf("<plist><dict><key>a</key><true/>\n<key>a</key><true/></dict></plist>"),
              "line 2, column 20: the key \"a\" occurs twice");
    std::string many;
    for (int i = 0; i < 100; ++i) {
        many += "<key>k" + std::to_string(i) + "</key><true/>";
    }
    EXPECT_EQ(valueOf(plist("<dict>" + many + "</dict>")).dictionary()->size(), 100U);
    EXPECT_THAT(errorOf(plist("<dict>" + many + "<key>k50</key><true/></dict>")),
                testing::EndsWith("the key \"k50\" occurs twice"));
}

TEST(XmlReader, ElementsInsideTextsAreRefused) {
    EXPECT_EQ(errorOf("<plist><string>a<true/></string></plist>"), "line 1, column 17: <true> inside <string>");
    EXPECT_EQ(errorOf("<plist><dict><key><string>a</string></key></dict></plist>"),
              "line 1, column 19: <string> inside <key>");
    EXPECT_EQ(errorOf("<plist><true><true/></true></plist>"), "line 1, column 14: <true> inside <true>");
}

TEST(XmlReader, TextBetweenElementsIsRefused) {
    const std::string what = "text outside the elements that hold text";
    EXPECT_EQ(errorOf("<plist>x<true/></plist>"), "line 1, column 8: " + what);
    EXPECT_EQ(errorOf("<plist><dict>\nx</dict></plist>"), "line 2, column 1: " + what);
    EXPECT_EQ(errorOf("<plist><array>&#65;</array></plist>"), "line 1, column 15: " + what);
    EXPECT_EQ(errorOf("<plist><true/>\u00A0</plist>"), "line 1, column 15: " + what);
}

TEST(XmlReader, BooleansAreEmpty) {
    EXPECT_EQ(errorOf("<plist><true>1</true></plist>"), "line 1, column 15: this text is not a valid <true>");
    EXPECT_EQ(errorOf("<plist><false> </false></plist>"), "line 1, column 16: this text is not a valid <false>");
}

TEST(XmlReader, IntegersSpanTheSignedAndTheUnsignedRange) {
    EXPECT_EQ(valueOf(plist("<integer>-9223372036854775808</integer>")), Value(INT64_MIN));
    EXPECT_EQ(valueOf(plist("<integer>18446744073709551615</integer>")), Value(UINT64_MAX));
    EXPECT_EQ(valueOf(plist("<integer>9223372036854775807</integer>")), Value(INT64_MAX));
    EXPECT_EQ(valueOf(plist("<integer>9223372036854775808</integer>")), Value(9223372036854775808U));
    EXPECT_EQ(errorOf(plist("<integer>-9223372036854775809</integer>")),
              "line 1, column 51: this text is not a valid <integer>");
    EXPECT_EQ(errorOf(plist("<integer>18446744073709551616</integer>")),
              "line 1, column 51: this text is not a valid <integer>");
}

TEST(XmlReader, IntegersAreDecimalWithASignAndWhiteSpaceAround) {
    EXPECT_EQ(valueOf(plist("<integer>\n +007 </integer>")), Value(7));
    EXPECT_EQ(valueOf(plist("<integer>-0</integer>")), Value(0));
    for (const char* text : {"", " ", "12x", "0x10", "1.0", "1 2", "+-1", "--1", "+", "-", "1e3", "\u0661"}) {
        EXPECT_THAT(errorOf(plist("<integer>"s + text + "</integer>")), testing::EndsWith("is not a valid <integer>"))
            << text;
    }
}

TEST(XmlReader, Reals) {
    EXPECT_EQ(valueOf(plist("<real>-1.5e3</real>")), Value(-1500.0));
    EXPECT_EQ(valueOf(plist("<real> +2 </real>")), Value(2.0));
    EXPECT_EQ(valueOf(plist("<real>inf</real>")), Value(HUGE_VAL));
    EXPECT_EQ(valueOf(plist("<real>-infinity</real>")), Value(-HUGE_VAL));
    EXPECT_TRUE(std::isnan(valueOf(plist("<real>nan</real>")).real().value_or(0)));
    EXPECT_EQ(valueOf(plist("<real>4.9406564584124654e-324</real>")), Value(4.9406564584124654e-324));
    for (const char* text : {"", "abc", "1,5", "1.5x", "0x1p3", "nan(1)", "1e999", "+-1", "1 2"}) {
        EXPECT_THAT(errorOf(plist("<real>"s + text + "</real>")), testing::EndsWith("is not a valid <real>")) << text;
    }
}

TEST(XmlReader, DatesAreOfTheCalendar) {
    EXPECT_EQ(valueOf(plist("<date>2024-02-29T23:59:59Z</date>")),
              Value(sys_seconds(sys_days(2024y / February / 29) + 23h + 59min + 59s)));
    EXPECT_EQ(valueOf(plist("<date>\n0000-01-01T00:00:00Z\n</date>")), Value(sys_seconds(sys_days(year(0) / 1 / 1))));
    for (const char* text :
         {"", "yesterday", "2026-02-29T00:00:00Z", "2026-13-01T00:00:00Z", "2026-00-01T00:00:00Z",
          "2026-01-00T00:00:00Z", "2026-01-01T24:00:00Z", "2026-01-01T00:60:00Z", "2026-01-01T00:00:60Z",
          "2026-01-01T00:00:00", "2026-01-01T00:00:00+01:00", "2026-01-01 00:00:00Z", "2026-1-1T00:00:00Z",
          "12026-01-01T00:00:00Z", "2026-01-01T00:00:00.5Z", "2026-01-01T00:00:00z"}) {
        EXPECT_THAT(errorOf(plist("<date>"s + text + "</date>")), testing::EndsWith("is not a valid <date>")) << text;
    }
}

TEST(XmlReader, DataIsPaddedBase64WithWhiteSpace) {
    EXPECT_EQ(valueOf(plist("<data></data>")), Value(Data{}));
    EXPECT_EQ(valueOf(plist("<data>\n\t Zm9v\r\n\tYmE= \n</data>")), Value(Data{'f', 'o', 'o', 'b', 'a'}));
    EXPECT_EQ(valueOf(plist("<data>+/8=</data>")), Value(Data{0xFB, 0xFF}));
    for (const char* text : {"Z", "Zm", "Zm9", "Zm9v=", "Zg=", "Zg===", "=", "====", "Zg==Zg==", "Zm9-",
                             "Zh==", "Zm9vYmF=", "Z===", "Zg=a"}) {
        EXPECT_THAT(errorOf(plist("<data>"s + text + "</data>")), testing::EndsWith("is not a valid <data>")) << text;
    }
}

std::string nested(int depth, const std::string& open, const std::string& close, const std::string& inner) {
    std::string text;
    for (int i = 0; i < depth; ++i) {
        text += open;
    }
    text += inner;
    for (int i = 0; i < depth; ++i) {
        text += close;
    }
    return text;
}

TEST(XmlReader, NestingOf512IsReadAnd513IsRefused) {
    for (const auto& [open, close] :
         {std::pair("<array>"s, "</array>"s), std::pair("<dict><key>k</key>"s, "</dict>"s)}) {
        EXPECT_FALSE(valueOf(plist(nested(512, open, close, "<true/>"))).isNull());
        EXPECT_THAT(errorOf(plist(nested(513, open, close, "<true/>"))),
                    testing::EndsWith(": nested more than 512 deep"));
    }
    EXPECT_EQ(errorOf("<plist>" + nested(513, "<array>", "</array>", "") + "</plist>"),
              "line 1, column 3592: nested more than 512 deep");
}

TEST(XmlReader, NestingOf100000IsRefusedWithoutHarm) {
    EXPECT_THAT(errorOf(plist(nested(100'000, "<array>", "</array>", ""))),
                testing::EndsWith("nested more than 512 deep"));
    EXPECT_THAT(errorOf(nested(100'000, "<a>", "</a>", "")), testing::EndsWith("unknown element <a>"));
}

TEST(XmlReader, ListCutAtAnyByteIsRefused) {
    std::string text;
    text = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<!DOCTYPE plist PUBLIC \"a\" \"b\">\n<!-- c -->\n" +
           plist(
               "\n<dict>\n\t<key>à</key>\n\t<array><integer>12</integer><real>1.5</real><string>x&amp;ÿ😀</string>"
               "<data>Zm9v</data><date>2026-01-31T08:00:00Z</date><true/></array>\n</dict>\n");
    ASSERT_NE(errorOf(text), "");
    ASSERT_EQ(errorOf(text), "accepted");
    for (std::size_t length = 0; length < text.size(); ++length) {
        EXPECT_THAT(errorOf(text.substr(0, length)), testing::StartsWith("line ")) << length;
    }
}

TEST(XmlReader, EveryByteChangedIsEitherReadOrRefusedWithAPlace) {
    const std::string text =
        plist("<dict><key>a</key><array><integer>1</integer><string>x&amp;y</string><data>Zm9v</data></array></dict>");
    int refused = 0;
    for (std::size_t at = 0; at < text.size(); ++at) {
        for (int byte = 0; byte < 256; ++byte) {
            std::string changed = text;
            changed[at] = static_cast<char>(byte);
            const std::string error = errorOf(changed);
            if (error != "accepted") {
                ++refused;
                // "bplist" is the beginning of the binary form, whose places are bytes.
                ASSERT_THAT(error, testing::StartsWith(changed[0] == 'b' ? "byte " : "line ")) << at << ' ' << byte;
            }
        }
    }
    EXPECT_GT(refused, 1000);
}

TEST(XmlReader, MoreThanTheMaximumSizeIsRefused) {
    std::string text = plist("<true/>");
    text.resize(plistMaximumSize, ' ');
    EXPECT_EQ(errorOf(text), "accepted");
    text += ' ';
    EXPECT_EQ(errorOf(text), "larger than 67108864 bytes");
}

}  // namespace
