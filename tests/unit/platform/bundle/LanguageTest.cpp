#include "platform/bundle/Language.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

using Names = std::vector<std::string>;

TEST(Language, NamesAndCodesAreLanguages) {
    for (const char* language : {"English", "French", "german", "SPANISH", "Simplified Chinese", "traditional-chinese",
                                 "Brazilian_Portuguese", "Farsi", "en", "fr", "pt_BR", "pt-br", "zh-Hant", "zh_Hant_HK",
                                 "de_DE", "gsw", "haw", "fr@euro", "de.UTF-8"}) {
        EXPECT_TRUE(isLanguage(language)) << language;
    }
    for (const char* other : {"", "Base", "Contents", "Resources", "Programs", "images", "e", "12", "x", "-", "_",
                              "@euro", ".UTF-8", "\xC3\xA9"}) {
        EXPECT_FALSE(isLanguage(other)) << other;
    }
    EXPECT_FALSE(isLanguage(std::string(100000, 'x')));
}

TEST(Matching, FirstPreferredLanguageThatIsThereComesFirst) {
    EXPECT_EQ(matchingLocalizations({"de", "en"}, {"fr", "de"}), (Names{"de"}));
    EXPECT_EQ(matchingLocalizations({"English", "French", "German"}, {"French", "German"}),
              (Names{"French", "German"}));
    EXPECT_EQ(matchingLocalizations({"de", "en", "fr"}, {"en", "fr", "en"}), (Names{"en", "fr"}));
}

TEST(Matching, NamesAndCodesOfALanguageAreOne) {
    EXPECT_EQ(matchingLocalizations({"English", "French"}, {"fr"}), (Names{"French"}));
    EXPECT_EQ(matchingLocalizations({"en", "fr"}, {"French"}), (Names{"fr"}));
    EXPECT_EQ(matchingLocalizations({"pt_BR"}, {"pt-BR"}), (Names{"pt_BR"}));
    EXPECT_EQ(matchingLocalizations({"Simplified Chinese"}, {"zh_CN"}), (Names{"Simplified Chinese"}));
    EXPECT_EQ(matchingLocalizations({"iw"}, {"he"}), (Names{"iw"}));
    EXPECT_EQ(matchingLocalizations({"Norwegian"}, {"nb_NO"}), (Names{"Norwegian"}));
}

TEST(Matching, ExactSpellingComesBeforeAnEquivalentOne) {
    EXPECT_EQ(matchingLocalizations({"English", "en"}, {"en"}), (Names{"en", "English"}));
    EXPECT_EQ(matchingLocalizations({"English", "en"}, {"English"}), (Names{"English", "en"}));
    EXPECT_EQ(matchingLocalizations({"pt-BR", "pt_BR"}, {"pt_BR"}), (Names{"pt_BR", "pt-BR"}));
}

TEST(Matching, LikelyScriptAndRegionAreFilledIn) {
    EXPECT_EQ(matchingLocalizations({"zh-Hans", "zh-Hant"}, {"zh-TW"}), (Names{"zh-Hant"}));
    EXPECT_EQ(matchingLocalizations({"zh-Hans", "zh-Hant"}, {"zh_CN"}), (Names{"zh-Hans"}));
    EXPECT_EQ(matchingLocalizations({"zh-Hans", "zh-Hant"}, {"zh_HK"}), (Names{"zh-Hant"}));
    EXPECT_EQ(matchingLocalizations({"zh_TW", "zh_CN"}, {"Traditional Chinese"}), (Names{"zh_TW"}));
    EXPECT_EQ(matchingLocalizations({"en-GB", "en-US"}, {"en"}), (Names{"en-US", "en-GB"}));
}

TEST(Matching, PlainLanguageComesAfterTheRegionalOneAndBeforeOtherRegions) {
    EXPECT_EQ(matchingLocalizations({"fr", "fr-BE", "fr-CA"}, {"fr-CA"}), (Names{"fr-CA", "fr", "fr-BE"}));
    EXPECT_EQ(matchingLocalizations({"en", "en-AU"}, {"en-GB"}), (Names{"en", "en-AU"}));
    EXPECT_EQ(matchingLocalizations({"de"}, {"de_AT.UTF-8"}), (Names{"de"}));
    EXPECT_EQ(matchingLocalizations({"fr-CA", "fr"}, {"fr@euro"}), (Names{"fr", "fr-CA"}));
}

TEST(Matching, NeverAnotherLanguageAndNeverAnotherScript) {
    EXPECT_EQ(matchingLocalizations({"es"}, {"ca"}), Names());
    EXPECT_EQ(matchingLocalizations({"ru"}, {"uk"}), Names());
    EXPECT_EQ(matchingLocalizations({"de"}, {"gsw"}), Names());
    EXPECT_EQ(matchingLocalizations({"zh-Hans"}, {"zh-Hant"}), Names());
    EXPECT_EQ(matchingLocalizations({"sr"}, {"sr-Latn"}), Names());
    EXPECT_EQ(matchingLocalizations({"en"}, {"fr"}), Names());
}

TEST(Matching, UnknownPreferredLanguagesAreSkipped) {
    EXPECT_EQ(matchingLocalizations({"de"}, {"", "no such language", "??", "de"}), (Names{"de"}));
    EXPECT_EQ(matchingLocalizations({"de"}, {}), Names());
    EXPECT_EQ(matchingLocalizations({}, {"de"}), Names());
}

TEST(Equivalent, EnglishAndItsCodeAreOneLocalization) {
    EXPECT_EQ(equivalentLocalizations({"English", "de", "en"}, "English"), (Names{"English", "en"}));
    EXPECT_EQ(equivalentLocalizations({"de", "en"}, "English"), (Names{"en"}));
    EXPECT_EQ(equivalentLocalizations({"de", "en-GB"}, "English"), Names());
}

}  // namespace
}  // namespace adminhost
