#include "adminhostd/RequestBody.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

TEST(BodyFormOf, ReadsTypeAndCharacterSetInAnyCase) {
    for (const char* type :
         {"", "application/json", "Application/JSON", " application/json ; charset=UTF-8",
          "application/json;charset=\"utf-8\"; boundary=x", ";", "application/json;charset=utf-8;"}) {
        EXPECT_EQ(bodyFormOf(type), BodyForm::json) << type;
    }
    EXPECT_EQ(bodyFormOf("application/x-plist"), BodyForm::propertyList);
    for (const char* type :
         {"text/plain", "application/jsonx", "application/json;charset=latin1", "application/json;charset",
          "application/json;charset=", "application/json;charset=\"", "application/x-www-form-urlencoded"}) {
        EXPECT_EQ(bodyFormOf(type), std::nullopt) << type;
    }
}

TEST(RequestOf, TakesDictionariesOnly) {
    std::string problem;
    EXPECT_EQ(requestOf("", BodyForm::json, problem), Dictionary());
    EXPECT_EQ(requestOf("", BodyForm::propertyList, problem), Dictionary());
    EXPECT_EQ(requestOf("{\"a\":1}", BodyForm::json, problem), (Dictionary{{"a", 1}}));
    EXPECT_FALSE(requestOf("null", BodyForm::json, problem));
    EXPECT_FALSE(requestOf("\"text\"", BodyForm::json, problem));
    EXPECT_EQ(problem, "line 1, column 1: a request is a dictionary, not a value of type text");
    EXPECT_FALSE(requestOf("{", BodyForm::propertyList, problem));
    EXPECT_NE(problem.find("line"), std::string::npos) << problem;
}

TEST(RevisionsOf, ReadsAListOfQuotedTexts) {
    EXPECT_EQ(revisionsOf(""), Array{});
    EXPECT_EQ(revisionsOf("*"), Array{});
    EXPECT_EQ(revisionsOf("\"a\""), Array{Value("a")});
    EXPECT_EQ(revisionsOf(" \"a\" ,\"b,c\" "), (Array{Value("a"), Value("b,c")}));
    for (const char* text : {"a", "\"a", "\"a\" \"b\"", "W/\"a\"", "\"", "*, \"a\""}) {
        EXPECT_EQ(revisionsOf(text), std::nullopt) << text;
    }
}

}  // namespace
}  // namespace adminhost
