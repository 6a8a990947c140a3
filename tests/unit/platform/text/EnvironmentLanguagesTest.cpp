#include "platform/text/EnvironmentLanguages.h"
#include "tests/support/Environment.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

using Languages = std::vector<std::string>;

Languages languagesOf(const char* language, const char* all, const char* messages, const char* lang) {
    const support::ScopedEnvironment scoped(
        {{"LANGUAGE", language}, {"LC_ALL", all}, {"LC_MESSAGES", messages}, {"LANG", lang}});
    return languagesOfEnvironment();
}

TEST(LanguagesOfEnvironment, FirstVariableThatIsSetEndsTheSearch) {
    EXPECT_EQ(languagesOf("", "C", "", "de_DE"), Languages());
    EXPECT_EQ(languagesOf("", "", "POSIX", "de_DE"), Languages());
    EXPECT_EQ(languagesOf("", "C.UTF-8", "fr_FR", "de_DE"), Languages());
    EXPECT_EQ(languagesOf("", "it_IT", "fr_FR", "de_DE"), Languages{"it_IT"});
    EXPECT_EQ(languagesOf("", "", "fr_FR", "de_DE"), Languages{"fr_FR"});
    EXPECT_EQ(languagesOf("", "", "", "de_DE"), Languages{"de_DE"});
}

TEST(LanguagesOfEnvironment, ListOfLanguagesComesFirstAndKeepsItsOrder) {
    EXPECT_EQ(languagesOf("uk:ru.KOI8-R", "C", "", "de_DE"), (Languages{"uk", "ru"}));
    EXPECT_EQ(languagesOf("fr@euro::C:de_DE.UTF-8@euro", "", "", ""), (Languages{"fr@euro", "de_DE@euro"}));
    EXPECT_EQ(languagesOf("", "", "", ""), Languages());
}

}  // namespace
}  // namespace adminhost
