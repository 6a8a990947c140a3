#include "adminhostd/AuditEvent.h"
#include "adminhostd/Redaction.h"
#include "platform/json/Json.h"

#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost {
namespace {

using testing::HasSubstr;
using testing::Not;

constexpr const char* planted = "hunter2 o'Hara \"x\"";

Command command() {
    Command described;
    described.name = "writeSettings";
    described.description.set("keys",
                              Array{Dictionary{{"path", "configuration.port"}},
                                    Dictionary{{"path", "configuration.password"}, {"secret", true}},
                                    Dictionary{{"path", "configuration.keys"}, {"secret", true}},
                                    Dictionary{{"path", "configuration.properties[].value"}, {"secretIf", "protect"}}});
    return described;
}

Dictionary requestWith(const Value& password) {
    return {{"configuration", Dictionary{{"port", 80}, {"password", password}}}};
}

/// An event with the text in every place that a client, a tool or an operation can fill.
AuditEvent eventWith(const std::string& text) {
    AuditEvent event;
    event.kind = AuditEvent::Kind::ended;
    event.request = "1-1";
    event.plugin = "lumio";
    event.command = "writeSettings";
    event.client.unit = text + ".service";
    event.status = 500;
    event.result = text;
    Array changes;
    for (const char* key : {"section", "identity", "name", "key", "from", "to", "undo"}) {
        Dictionary change{{"section", "settings"}, {"key", "port"}, {"from", 1}, {"to", 2}};
        change.set(key, "before " + text + " after");
        changes.emplace_back(change);
    }
    changes.emplace_back(
        Dictionary{{"section", "settings"}, {"key", "port"}, {"to", Array{text, Dictionary{{text, text}}}}});
    changes.emplace_back(Dictionary{{"section", "settings"}, {"key", "port"}, {"to", Data(text.begin(), text.end())}});
    event.changes = {changes, changes.size()};
    Array parts;
    for (const char* key : {"keyPath", "reason", "toolMessage"}) {
        Dictionary part{{"keyPath", "configuration"}, {"reason", "why"}, {"toolMessage", "words"}};
        part.set(key, "before " + text + " after");
        parts.emplace_back(part);
    }
    event.notDone = {parts, parts.size()};
    return event;
}

/// Everything that is logged of an event.
std::string loggedTextOf(const AuditEvent& event) {
    std::string all = lineOf(event);
    for (const auto& [name, value] : fieldsOf(event)) {
        all += '\n' + name + '=' + value;
    }
    return all;
}

TEST(Redaction, NoPlantedSecretIsLoggedFromAnyPlaceThatAValueCanReach) {
    const Redaction redaction(command(), requestWith(planted));
    const std::string plain = loggedTextOf(eventWith("hunter2"));
    EXPECT_THAT(plain, HasSubstr("hunter2")) << "the places are logged";
    for (const std::string& form : {std::string(planted), std::string("hunter2 o''Hara \"x\""),
                                    std::string("hunter2 o'Hara \\\"x\\\""), std::string("aHVudGVyMiBvJ0hhcmEgIngi")}) {
        const std::string logged = loggedTextOf(redacted(eventWith(form), redaction));
        EXPECT_THAT(logged, Not(HasSubstr("hunter2"))) << logged;
        EXPECT_THAT(logged, Not(HasSubstr("aHVudGVyMi"))) << logged;
        EXPECT_THAT(logged, HasSubstr("before (secret) after"));
        EXPECT_THAT(logged, HasSubstr("ADMINHOST_UNIT=(secret).service"));
    }
}

TEST(Redaction, SecretsOfEveryTypeAndInListsAreFound) {
    const Redaction number(command(), requestWith(12345));
    EXPECT_EQ(number.text("port 12345 is used"), "port (secret) is used");
    EXPECT_EQ(number.report({{"to", 12345}}).get("to"), Value("(secret)"));
    EXPECT_EQ(number.report({{"to", 123}}).get("to"), Value(123));
    const Redaction data(command(), requestWith(Data{'a', 'b', 'c'}));
    EXPECT_EQ(data.text("is abc or YWJj"), "is (secret) or (secret)");
    const Redaction list(command(), {{"configuration", Dictionary{{"keys", Array{"one", Dictionary{{"k", "two"}}}}}}});
    EXPECT_EQ(list.text("one two three"), "(secret) (secret) three");
}

TEST(Redaction, LongestSecretIsReplacedFirstAndTheMarkIsNotSearched) {
    const Redaction redaction(command(),
                              {{"configuration", Dictionary{{"password", "sec"}, {"keys", Array{"secret e", "e"}}}}});
    EXPECT_EQ(redaction.text("a secret e"), "a (secret)");
    EXPECT_EQ(redaction.text("sec e"), "(secret) (secret)");
}

TEST(Redaction, ValuesOfASecretKeyAreRemovedWhateverTheOperationSays) {
    const Redaction redaction(command(), requestWith("new"));
    const Dictionary shown = redaction.report({{"section", "settings"},
                                               {"key", "password"},
                                               {"from", "old"},
                                               {"to", true},
                                               {"secret", false},
                                               {"undo", Dictionary{{"password", "old"}}}});
    EXPECT_EQ(shown, (Dictionary{{"section", "settings"}, {"key", "password"}, {"secret", true}}));
    const Dictionary marked = redaction.report({{"key", "port"}, {"from", false}, {"to", 2}, {"secret", true}});
    EXPECT_EQ(marked, (Dictionary{{"key", "port"}, {"secret", true}}));
}

TEST(Redaction, ValueThatIsASecretOnlyInSomeElementsIsOneUnlessItIsKnownNotToBe) {
    const auto with = [](Dictionary property) {
        return Redaction(command(), {{"configuration", Dictionary{{"properties", Array{std::move(property)}}}}});
    };
    EXPECT_EQ(with({{"value", "v1"}, {"protect", true}}).text("v1"), "(secret)");
    EXPECT_EQ(with({{"value", "v1"}, {"protect", "yes"}}).text("v1"), "(secret)");
    EXPECT_EQ(with({{"value", "v1"}, {"protect", false}}).text("v1"), "v1");
    EXPECT_EQ(with({{"value", "v1"}}).text("v1"), "(secret)") << "the stored property may be protected";
    const Dictionary open{{"key", "value"}, {"from", "v0"}, {"to", "v1"}, {"secret", false}};
    EXPECT_EQ(with({{"value", "v1"}}).report(open).get("to"), Value("v1")) << "the operation knows that it is not";
    EXPECT_EQ(with({{"value", "v1"}, {"protect", true}}).report(open).get("to"), Value("(secret)"));
}

TEST(Redaction, WithoutSecretsEverythingStays) {
    const AuditEvent event = eventWith("text");
    EXPECT_EQ(lineOf(redacted(event, Redaction())), lineOf(event));
    EXPECT_EQ(Redaction(command(), {}).text("(not set)"), "(not set)");
    EXPECT_EQ(Redaction(Command(), requestWith("x")).text("x"), "x");
}

AuditEvent sampleEvent() {
    AuditEvent event;
    event.kind = AuditEvent::Kind::ended;
    event.request = "1-1";
    event.plugin = "lumio";
    event.command = "writeSettings";
    event.access = "write";
    event.client = {20001, "anna", 1005, "eva", 42, "session-3.scope"};
    event.status = 200;
    event.milliseconds = 12.34;
    event.changes = {
        {Dictionary{{"section", "settings"}, {"key", "port"}, {"from", 80}, {"to", 443}, {"secret", false}},
         Dictionary{{"section", "settings"}, {"key", "password"}, {"secret", true}},
         Dictionary{{"section", "cameras"}, {"identity", "U"}, {"name", "Studio 1"}, {"from", "U"}}},
        3};
    event.notDone = {{Dictionary{{"keyPath", "configuration.x"}, {"reason", "not known"}, {"toolMessage", "no row"}}},
                     1};
    return event;
}

std::string fieldOf(const AuditEvent& event, std::string_view name) {
    std::string values;
    for (const auto& [field, value] : fieldsOf(event)) {
        if (field == name) {
            values += (values.empty() ? "" : "|") + value;
        }
    }
    return values;
}

TEST(AuditEvent, LineHasWhoWhatTheResultAndWhatChanged) {
    EXPECT_EQ(
        lineOf(sampleEvent()),
        "adminhostd: request 1-1 lumio/writeSettings by uid 20001 (anna) of the login of uid 1005 (eva) pid 42 in "
        "session-3.scope: 200 in 12.3 ms, changes: 3 (settings port: 80 -> 443; settings password: (secret) "
        "changed; cameras Studio 1: removed), not done: 1 (configuration.x: not known (no row))");
    AuditEvent begun = sampleEvent();
    begun.kind = AuditEvent::Kind::begun;
    begun.client = {20001, "", noLogin, "", 42, ""};
    begun.changes = {};
    begun.notDone = {};
    EXPECT_EQ(lineOf(begun), "adminhostd: request 1-1 lumio/writeSettings by uid 20001 pid 42: begins");
    begun.kind = AuditEvent::Kind::cancelled;
    begun.status = 200;
    begun.result = "it was sent by uid 7";
    EXPECT_EQ(lineOf(begun),
              "adminhostd: request 1-1 lumio/writeSettings by uid 20001 pid 42: cancelled; it was sent by uid 7");
    EXPECT_EQ(fieldOf(begun, "ADMINHOST_EVENT"), "cancelled");
    EXPECT_EQ(fieldOf(begun, "MESSAGE_ID"), endedMessage);
    begun.status = 403;
    begun.result = "NOT_PERMITTED";
    EXPECT_EQ(lineOf(begun),
              "adminhostd: request 1-1 lumio/writeSettings by uid 20001 pid 42: is not cancelled; 403 NOT_PERMITTED");
    begun.kind = AuditEvent::Kind::unfinished;
    begun.result = "its operation was interrupted";
    EXPECT_EQ(lineOf(begun),
              "adminhostd: request 1-1 lumio/writeSettings by uid 20001 pid 42: had begun when the daemon ended; its "
              "operation was interrupted");
}

TEST(AuditEvent, FieldsAreThoseThatTheJournalIsSearchedBy) {
    const AuditEvent event = sampleEvent();
    EXPECT_EQ(fieldOf(event, "MESSAGE_ID"), endedMessage);
    EXPECT_EQ(fieldOf(event, "ADMINHOST_EVENT"), "ended");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_REQUEST"), "1-1");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_PLUGIN"), "lumio");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_COMMAND"), "writeSettings");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_ACCESS"), "write");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_UID"), "20001");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_USER"), "anna");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_LOGIN_UID"), "1005");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_LOGIN_USER"), "eva");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_PID"), "42");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_UNIT"), "session-3.scope");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_STATUS"), "200");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_DURATION_USEC"), "12340");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_CHANGES"), "3");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_NOT_DONE"), "1");
    EXPECT_EQ(fieldOf(event, "ADMINHOST_KEY"), "cameras|password|port|settings|settings.password|settings.port");
    EXPECT_THAT(fieldOf(event, "ADMINHOST_CHANGE"),
                HasSubstr(R"({"n":1,"section":"settings","key":"port","from":80,"to":443,"secret":false})"));
    AuditEvent begun = event;
    begun.kind = AuditEvent::Kind::begun;
    EXPECT_EQ(fieldOf(begun, "MESSAGE_ID"), begunMessage);
    EXPECT_EQ(fieldOf(begun, "ADMINHOST_CHANGE"), "") << "nothing has been changed yet";
    EXPECT_EQ(fieldOf(begun, "ADMINHOST_STATUS"), "");
}

TEST(AuditEvent, LongTextsAndManyReportsAreCutAndCounted) {
    AuditEvent event = sampleEvent();
    event.changes = {};
    for (int i = 0; i < 1000; ++i) {
        event.changes.kept.emplace_back(
            Dictionary{{"section", "settings"}, {"key", "k" + std::to_string(i)}, {"to", std::string(100'000, 'x')}});
    }
    event.changes.reported = 5000;
    const LogFields fields = fieldsOf(event);
    std::size_t bytes = 0;
    for (const auto& [name, value] : fields) {
        bytes += name.size() + value.size();
        EXPECT_LT(value.size(), 400U) << name;
    }
    EXPECT_LT(bytes, 64U << 10U) << "the journal's socket accepts it";
    EXPECT_EQ(fieldOf(event, "ADMINHOST_CHANGES"), "5000");
    EXPECT_LT(lineOf(event).size(), 4000U);
    EXPECT_THAT(lineOf(event), HasSubstr("changes: 5000 (settings k0: (not set) -> xxx"));
    EXPECT_THAT(lineOf(event), HasSubstr("(99800 more bytes)"));
    EXPECT_THAT(lineOf(event), HasSubstr(" more)"));
}

TEST(AuditEvent, KeysOfChangesThatAreLeftOutCanBeSearchedFor) {
    AuditEvent event = sampleEvent();
    event.changes = {};
    for (int i = 0; i < 300; ++i) {
        event.changes.kept.emplace_back(
            Dictionary{{"section", "settings"}, {"key", i == 299 ? "port" : "note"}, {"to", std::string(200, 'x')}});
    }
    event.changes.reported = 300;
    EXPECT_THAT(fieldOf(event, "ADMINHOST_CHANGE"), Not(HasSubstr("port")));
    EXPECT_EQ(fieldOf(event, "ADMINHOST_KEY"), "note|port|settings|settings.note|settings.port");
}

TEST(AuditEvent, SearchedKeysAreBoundedSoThatTheJournalAcceptsTheEvent) {
    AuditEvent event = sampleEvent();
    event.changes = {};
    for (int i = 0; i < 3000; ++i) {
        event.changes.kept.emplace_back(
            Dictionary{{"section", "s"}, {"key", (i % 2 == 0 ? "k" : std::string(1000, 'x')) + std::to_string(i)}});
    }
    event.changes.reported = 3000;
    const LogFields fields = fieldsOf(event);
    std::size_t bytes = 0;
    for (const auto& [name, value] : fields) {
        bytes += name.size() + value.size();
    }
    EXPECT_LT(fields.size(), 1024U) << "the journal drops an event with more fields";
    EXPECT_LT(bytes, 64U << 10U);
}

TEST(AuditEvent, TextsCannotBreakTheLine) {
    AuditEvent event = sampleEvent();
    event.changes = {{Dictionary{{"section", "s"}, {"key", "k"}, {"to", "a\nadminhostd: forged\x1b[2J"}}}, 1};
    EXPECT_THAT(lineOf(event), HasSubstr("(not set) -> a adminhostd: forged\\x1b[2J)"));
    EXPECT_THAT(lineOf(event), Not(HasSubstr("\n")));
}

}  // namespace
}  // namespace adminhost
