#include "adminhostd/EventRing.h"
#include "platform/json/Json.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

constexpr uid_t owner = 7;
constexpr uid_t stranger = 8;

RequestRecord ended(const std::string& command = "c") {
    RequestRecord record;
    record.id = "id-of-the-request";
    record.plugin = "p";
    record.command = command;
    record.peer.uid = owner;
    record.status = 200;
    record.milliseconds = 1.5;
    return record;
}

Array eventsOf(const Dictionary& text) {
    return text.get("events").array() == nullptr ? Array() : *text.get("events").array();
}

TEST(EventRing, EndOfARequestIsAnEvent) {
    EventRing ring;
    EXPECT_TRUE(ring.isCurrent(0, ""));
    ring.add(ended());
    EXPECT_FALSE(ring.isCurrent(0, ""));
    const Dictionary text = ring.since(0, "", owner, false);
    EXPECT_EQ(text.get("last"), Value(1));
    EXPECT_EQ(text.get("missed"), Value(false));
    const Array events = eventsOf(text);
    ASSERT_EQ(events.size(), 1U);
    const Dictionary& event = *events.front().dictionary();
    EXPECT_EQ(event.get("kind"), Value("requestEnded"));
    EXPECT_EQ(event.get("command"), Value("c"));
    EXPECT_EQ(event.get("status"), Value(200));
    EXPECT_TRUE(ring.isCurrent(1, ring.epoch()));
    EXPECT_TRUE(eventsOf(ring.since(1, ring.epoch(), owner, false)).empty());
}

TEST(EventRing, ChangesAreOneEventForEachSectionWithNamesAndWithoutValues) {
    EventRing ring;
    RequestRecord record = ended("write");
    for (const char* key : {"b", "a", "b"}) {
        record.add(Change{"settings", "", "", key, "OLD", "NEW", false, Dictionary{{"undo", "OLD"}}});
    }
    record.add(Change{"cameras", "IDENTITY", "Studio", "users", Value(), "anna", false, {}});
    ring.add(record);
    const Array events = eventsOf(ring.since(0, "", owner, true));
    ASSERT_EQ(events.size(), 3U);
    EXPECT_EQ(events[0].dictionary()->get("kind"), Value("resourcesChanged"));
    EXPECT_EQ(events[0].dictionary()->get("section"), Value("cameras"));
    EXPECT_EQ(events[1].dictionary()->get("kind"), Value("settingsChanged"));
    EXPECT_EQ(events[1].dictionary()->get("keys"), Value(Array{"a", "b"}));
    EXPECT_EQ(events[2].dictionary()->get("kind"), Value("requestEnded"));
    const std::string all = jsonOf(Value(events));
    for (const char* value : {"OLD", "NEW", "anna", "Studio", "IDENTITY"}) {
        EXPECT_EQ(all.find(value), std::string::npos) << value;
    }
}

TEST(EventRing, DetailsAreForTheAccountOfTheRequestAndForThoseWhoMaySeeAll) {
    EventRing ring;
    ring.add(ended());
    for (const auto& [uid, all, shown] :
         {std::tuple(owner, false, true), std::tuple(stranger, true, true), std::tuple(stranger, false, false)}) {
        const Array events = eventsOf(ring.since(0, "", uid, all));
        const Dictionary& event = *events.front().dictionary();
        EXPECT_EQ(event.contains("request"), shown);
        EXPECT_EQ(event.contains("uid"), shown);
        EXPECT_EQ(event.contains("milliseconds"), shown);
        EXPECT_TRUE(event.contains("command"));
    }
}

TEST(EventRing, ClientThatAskedTooLateIsTold) {
    EventRing ring;
    for (std::size_t i = 0; i < EventRing::length + 5; ++i) {
        ring.add(ended());
    }
    EXPECT_EQ(ring.since(5, "", owner, false).get("missed"), Value(false)) << "the sixth is the oldest";
    EXPECT_EQ(eventsOf(ring.since(5, "", owner, false)).size(), EventRing::length);
    const Dictionary late = ring.since(4, "", owner, false);
    EXPECT_EQ(late.get("missed"), Value(true));
    EXPECT_EQ(eventsOf(late).size(), EventRing::length);
}

TEST(EventRing, NumbersOfAnEarlierDaemonAreMissedEvents) {
    EventRing ring;
    ring.add(ended());
    for (const auto& [after, epoch] : {std::pair(9UL, ""), std::pair(1UL, "another"), std::pair(0UL, "another")}) {
        EXPECT_FALSE(ring.isCurrent(after, epoch));
        const Dictionary text = ring.since(after, epoch, owner, false);
        EXPECT_EQ(text.get("missed"), Value(true)) << after << epoch;
        EXPECT_EQ(eventsOf(text).size(), 1U) << "everything that is known";
    }
    EXPECT_NE(EventRing().epoch(), ring.epoch());
}

TEST(EventRing, WithoutANumberOnlyTheLatestNumberIsShown) {
    EventRing ring;
    ring.add(ended());
    const Dictionary text = ring.since(std::nullopt, "", owner, false);
    EXPECT_EQ(text.get("last"), Value(1));
    EXPECT_EQ(text.get("missed"), Value(false));
    EXPECT_TRUE(eventsOf(text).empty());
}

TEST(EventRing, NamesOfOneEventAreBounded) {
    EventRing ring;
    RequestRecord record = ended();
    for (int i = 0; i < 500; ++i) {
        record.add(Change{"settings", "", "", "key" + std::to_string(i), {}, {}, false, {}});
    }
    ring.add(record);
    EXPECT_EQ(eventsOf(ring.since(0, "", owner, false)).front().dictionary()->get("keys").array()->size(),
              EventRing::keysMaximum);
}

}  // namespace
}  // namespace adminhost
