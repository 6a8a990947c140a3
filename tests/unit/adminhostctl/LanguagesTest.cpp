#include "adminhostctl/CallerLanguages.h"
#include "adminhostctl/DaemonClient.h"
#include "tests/support/Environment.h"
#include "tests/unit/adminhostctl/Describe.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::ctl {
namespace {

using Languages = std::vector<std::string>;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Optional;

std::optional<Languages> languagesOf(const char* language, const char* all, const char* messages, const char* lang) {
    const support::ScopedEnvironment scoped(
        {{"LANGUAGE", language}, {"LC_ALL", all}, {"LC_MESSAGES", messages}, {"LANG", lang}});
    return callerLanguages();
}

Dictionary filled(const Description& command, Dictionary request, const Languages& languages = {"fr", "de"}) {
    addLanguages(request, command, languages);
    return request;
}

TEST(CallerLanguages, LanguageComesBeforeTheLocale) {
    EXPECT_THAT(languagesOf("fr:de_DE.UTF-8", "", "", "en_GB.UTF-8"), Optional(ElementsAre("fr", "de_DE")));
    EXPECT_THAT(languagesOf("", "it_IT.UTF-8", "fr_FR", "de_DE"), Optional(ElementsAre("it_IT")));
    EXPECT_THAT(languagesOf("", "", "fr_FR", "de_DE"), Optional(ElementsAre("fr_FR")));
    EXPECT_THAT(languagesOf("", "", "", "ja_JP.UTF-8"), Optional(ElementsAre("ja_JP")));
    EXPECT_THAT(languagesOf("fr", "C.UTF-8", "", ""), Optional(ElementsAre("fr")));
}

TEST(CallerLanguages, LocaleCMeansEnglishWhateverLanguageIs) {
    EXPECT_THAT(languagesOf("fr:de", "C", "de_DE", "de_DE"), Optional(IsEmpty()));
    EXPECT_THAT(languagesOf("fr:de", "", "POSIX", "de_DE"), Optional(IsEmpty()));
    EXPECT_THAT(languagesOf("fr:de", "", "", "C"), Optional(IsEmpty()));
    EXPECT_THAT(languagesOf("", "", "", "C.UTF-8"), Optional(IsEmpty()));
}

TEST(CallerLanguages, WithoutAnyVariableTheDaemonsAreUsed) {
    EXPECT_EQ(languagesOf("", "", "", ""), std::nullopt);
    const support::ScopedEnvironment scoped(
        {{"LANGUAGE", std::nullopt}, {"LC_ALL", std::nullopt}, {"LC_MESSAGES", std::nullopt}, {"LANG", std::nullopt}});
    EXPECT_EQ(callerLanguages(), std::nullopt);
}

TEST(CallerLanguages, TextOfAnOptionIsAListWithCommas) {
    EXPECT_THAT(languagesOfText("de,pt_BR"), ElementsAre("de", "pt_BR"));
    EXPECT_THAT(languagesOfText(",de,,fr,"), ElementsAre("de", "fr"));
    EXPECT_THAT(languagesOfText(""), IsEmpty());
}

TEST(AddLanguages, CommandThatDescribesThemGetsThem) {
    const Dictionary languages{{"optionalArguments", Dictionary{{"languages", Array{"fr", "de"}}}}};
    for (const char* command : {"getWorkflows", "getProperties", "readSettings", "writeSettings"}) {
        EXPECT_EQ(filled(describe(command), {}), languages) << command;
    }
    for (const char* command : {"getCameras", "getState"}) {
        EXPECT_EQ(filled(describe(command), {}), Dictionary()) << command;
    }
    EXPECT_EQ(
        filled(describe("readSettings"), {{"optionalArguments", Dictionary{{"variant", "getConfig"}}}}),
        (Dictionary{{"optionalArguments", Dictionary{{"variant", "getConfig"}, {"languages", Array{"fr", "de"}}}}}));
    EXPECT_EQ(filled(describe("getWorkflows"), {}, {}),
              (Dictionary{{"optionalArguments", Dictionary{{"languages", Array{}}}}}))
        << "none is not the same as the daemon's";
}

TEST(AddLanguages, RequestWithItsOwnKeepsThem) {
    for (const Value& own : {Value(Array{"it"}), Value(Array{}), Value("it")}) {
        const Dictionary request{{"optionalArguments", Dictionary{{"languages", own}}}};
        EXPECT_EQ(filled(describe("getWorkflows"), request), request);
    }
    const Dictionary other{{"optionalArguments", "text"}};
    EXPECT_EQ(filled(describe("getWorkflows"), other), other);
}

}  // namespace
}  // namespace adminhost::ctl
