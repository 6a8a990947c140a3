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

/// The problem of a body that has one.
BodyProblem problemOf(std::string_view body, BodyForm form, const BodyBounds& bounds = {}) {
    const auto request = requestOf(body, form, bounds);
    EXPECT_FALSE(request) << body.substr(0, 100);
    return request ? BodyProblem{} : request.error();
}

TEST(RequestOf, AcceptsDictionariesOnly) {
    EXPECT_EQ(requestOf("", BodyForm::json), Dictionary());
    EXPECT_EQ(requestOf("", BodyForm::propertyList), Dictionary());
    EXPECT_EQ(requestOf("{\"a\":1}", BodyForm::json), (Dictionary{{"a", 1}}));
    EXPECT_FALSE(requestOf("null", BodyForm::json));
    EXPECT_EQ(problemOf("\"text\"", BodyForm::json).text,
              "line 1, column 1: a request is a dictionary, not a value of type text");
    const BodyProblem problem = problemOf("{", BodyForm::propertyList);
    EXPECT_NE(problem.text.find("line"), std::string::npos) << problem.text;
    EXPECT_EQ(problem.kind, BodyProblem::Kind::malformed);
}

TEST(RequestOf, BoundsTheNumberOfValuesInBothForms) {
    // The list, its elements and the dictionary around it.
    const auto json = [](std::size_t values) {
        std::string text = "{\"a\":[0";
        for (std::size_t i = 3; i < values; ++i) {
            text += ",0";
        }
        return text + "]}";
    };
    const auto list = [](std::size_t values) {
        std::string text = "<plist><dict><key>a</key><array>";
        for (std::size_t i = 2; i < values; ++i) {
            text += "<true/>";
        }
        return text + "</array></dict></plist>";
    };
    EXPECT_TRUE(requestOf(json(BodyBounds().values), BodyForm::json));
    EXPECT_TRUE(requestOf(list(BodyBounds().values), BodyForm::propertyList));
    const BodyProblem ofJson = problemOf(json(BodyBounds().values + 1), BodyForm::json);
    EXPECT_EQ(ofJson.kind, BodyProblem::Kind::tooManyValues);
    EXPECT_EQ(ofJson.text, "line 1, column 200005: there are more than 100000 values");
    const BodyProblem ofList = problemOf(list(BodyBounds().values + 1), BodyForm::propertyList);
    EXPECT_EQ(ofList.kind, BodyProblem::Kind::tooManyValues);
    EXPECT_TRUE(ofList.text.starts_with("line 1, column ")) << ofList.text;
}

TEST(PrefersPropertyList, WeighsWhatIsAcceptedAndTakesTheFirstOfEquals) {
    for (const char* accept :
         {"application/x-plist", "Application/X-PList", "text/html, application/x-plist", "application/x-plist, */*",
          "application/x-plist, application/json", "application/json;q=0.5, application/x-plist;q=0.9",
          "application/json; q=0, application/x-plist; q=0.1"}) {
        EXPECT_TRUE(prefersPropertyList(accept)) << accept;
    }
    for (const char* accept : {"", "*/*", "application/json", "text/html", "application/x-plist;q=0",
                               "application/json, application/x-plist", "application/x-plist;q=0.1, application/json",
                               "application/x-plist;q=0.1, */*", "application/x-plistx", ",;",
                               "application/x-plist;q=x, application/x-plist;q=0"}) {
        EXPECT_FALSE(prefersPropertyList(accept)) << accept;
    }
}

TEST(RevisionsOf, ReadsAListOfQuotedTexts) {
    using Texts = std::vector<std::string>;
    EXPECT_EQ(revisionsOf(""), std::nullopt);
    EXPECT_EQ(revisionsOf(" "), std::nullopt);
    EXPECT_EQ(revisionsOf("*"), Texts{});
    EXPECT_EQ(revisionsOf("\"a\""), Texts{"a"});
    EXPECT_EQ(revisionsOf(" \"a\" ,\"b,c\" "), (Texts{"a", "b,c"}));
    for (const char* text : {"a", "\"a", "\"a\" \"b\"", "W/\"a\"", "\"", "*, \"a\""}) {
        EXPECT_EQ(revisionsOf(text), std::nullopt) << text;
    }
}

TEST(RequestBody, DepthIsBoundedInBothForms) {
    const BodyBounds bounds{.values = 100, .depth = 3};
    EXPECT_TRUE(requestOf(R"({"a":[{"b":1}]})", BodyForm::json, bounds));
    EXPECT_EQ(problemOf(R"({"a":[{"b":[]}]})", BodyForm::json, bounds).kind, BodyProblem::Kind::tooDeep);
    EXPECT_EQ(problemOf("<plist><dict><key>a</key><array><array><array/></array></array></dict></plist>",
                        BodyForm::propertyList, bounds)
                  .kind,
              BodyProblem::Kind::tooDeep);
}

TEST(RequestDeadline, IsAWholeNumberOfSecondsFromOne) {
    EXPECT_EQ(deadlineOf("1"), std::chrono::seconds(1));
    EXPECT_EQ(deadlineOf(" 300 "), std::chrono::seconds(300));
    EXPECT_EQ(deadlineOf("18446744073709551616"), std::chrono::seconds(1'000'000)) << "longer than any operation";
    for (const char* text : {"", " ", "0", "00", "-1", "+1", "1.5", "1s", "1 2", "soon"}) {
        EXPECT_FALSE(deadlineOf(text)) << text;
    }
}

}  // namespace
}  // namespace adminhost
