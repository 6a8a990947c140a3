#include "platform/framework/PluginRequestHandler.h"

#include <set>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using namespace adminhost;

TEST(Response, IsNothingAtFirst) {
    EXPECT_EQ(Response().kind(), Response::Kind::nothing);
    EXPECT_EQ(Response(nullptr).kind(), Response::Kind::nothing);
    EXPECT_TRUE(Response().dictionary().empty());
}

TEST(Response, CarriesItsDictionary) {
    Response response(Dictionary{{"readStatus", 0}});
    EXPECT_EQ(response.kind(), Response::Kind::dictionary);
    response.dictionary().set("writeStatus", 400);
    EXPECT_EQ(response.dictionary(), (Dictionary{{"readStatus", 0}, {"writeStatus", 400}}));
}

TEST(Response, EmptyDictionaryIsNotNothing) {
    EXPECT_EQ(Response(Dictionary{}).kind(), Response::Kind::dictionary);
}

TEST(PluginRequestHandler, ErrorResponseHasCodeAndASentence) {
    const PluginRequestHandler handler;
    for (const char* code : {"INTERNAL_ERROR", "SOMETHING_ELSE"}) {
        const Response response = handler.responseForError(code);
        EXPECT_EQ(response.kind(), Response::Kind::error);
        EXPECT_EQ(response.dictionary().get("error"), Value(code));
        ASSERT_NE(response.dictionary().get("message").string(), nullptr);
        EXPECT_EQ(response.dictionary().get("message").string()->back(), '.');
        EXPECT_EQ(response.dictionary().size(), 2U);
    }
}

TEST(PluginRequestHandler, UnknownCodeIsKeptInItsErrorResponse) {
    const Response response = PluginRequestHandler().responseForError("SOMETHING_ELSE");
    EXPECT_EQ(response.kind(), Response::Kind::error);
    EXPECT_EQ(response.dictionary(),
              (Dictionary{{"error", "SOMETHING_ELSE"}, {"message", "The plug-in returned an error."}}));
}

TEST(PluginRequestHandler, HandlerHasSentencesForItsOwnCodes) {
    class Handler final : public PluginRequestHandler {
        [[nodiscard]] std::string messageForError(std::string_view code) const override {
            return code == "DOOR_LOCKED" ? "The door is locked." : PluginRequestHandler::messageForError(code);
        }
    };
    EXPECT_EQ(Handler().responseForError("DOOR_LOCKED").dictionary(),
              (Dictionary{{"error", "DOOR_LOCKED"}, {"message", "The door is locked."}}));
    EXPECT_EQ(Handler().responseForError("OTHER").dictionary().get("message"), Value("The plug-in returned an error."));
}

TEST(UserDefaults, UnknownNameIsNull) {
    EXPECT_TRUE(userDefault("adminhost.test.unknown").isNull());
}

TEST(UserDefaults, ValueIsKeptReplacedAndRemovedByNull) {
    setUserDefault("adminhost.test.a", Array{1, "two"});
    EXPECT_EQ(userDefault("adminhost.test.a"), Value(Array{1, "two"}));
    setUserDefault("adminhost.test.a", true);
    EXPECT_EQ(userDefault("adminhost.test.a"), Value(true));
    setUserDefault("adminhost.test.a", nullptr);
    EXPECT_TRUE(userDefault("adminhost.test.a").isNull());
}

TEST(UUIDString, IsCanonicalUpperCaseOfVersion4) {
    for (int i = 0; i < 1000; ++i) {
        const std::string text = makeUUIDString();
        ASSERT_THAT(text, testing::MatchesRegex("[0-9A-F]{8}-[0-9A-F]{4}-4[0-9A-F]{3}-[89AB][0-9A-F]{3}-[0-9A-F]{12}"));
    }
}

TEST(UUIDString, IsFreshEachTime) {
    std::set<std::string> all;
    for (int i = 0; i < 10'000; ++i) {
        all.insert(makeUUIDString());
    }
    EXPECT_EQ(all.size(), 10'000U);
}

}  // namespace
