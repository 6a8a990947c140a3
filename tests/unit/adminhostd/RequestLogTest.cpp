#include "adminhostd/RequestLog.h"

#include <gtest/gtest.h>

namespace adminhost {
namespace {

Change change(std::size_t bytes) {
    return {"settings", "", "", "key", Value(), std::string(bytes, 'x'), false, Value()};
}

std::size_t sizeOf(const Dictionary& text, std::string_view key) {
    return text.get(key).array() == nullptr ? 0 : text.get(key).array()->size();
}

TEST(RequestRecord, ReportsAreShownToThoseWhoMayReadThemOnly) {
    RequestRecord record;
    record.add(change(1));
    record.add(NotDone{"configuration.a", "It is not known.", ""});
    record.add(std::string_view("an event"));
    EXPECT_EQ(sizeOf(record.describe(true), "changes"), 1U);
    EXPECT_EQ(sizeOf(record.describe(true), "notDone"), 1U);
    const Dictionary others = record.describe(false);
    EXPECT_FALSE(others.contains("changes"));
    EXPECT_FALSE(others.contains("notDone"));
    EXPECT_EQ(sizeOf(others, "log"), 1U);
}

TEST(RequestRecord, LargeReportsAreCountedOnlyBeyondTheirBound) {
    RequestRecord record;
    for (int i = 0; i < 6; ++i) {
        record.add(change(1'000'000));
    }
    record.add(change(1));
    EXPECT_EQ(record.changes(), 7U);
    EXPECT_EQ(sizeOf(record.describe(true), "changes"), 5U) << "four large ones and the small one";
    EXPECT_EQ(record.describe(true).get("changesDropped"), Value(2));
    EXPECT_LE(record.reportBytes(), RequestRecord::reportBytesMaximum);
}

TEST(RequestLog, ValuesOfAPartThatBecomesSecretAreWithheldInEveryRecord) {
    RequestLog log;
    for (const char* id : {"a", "b"}) {
        auto record = std::make_shared<RequestRecord>();
        record->id = id;
        record->add(Change{"properties", "3", "n", "value", "one", "two", false, Dictionary{{"value", "one"}}});
        record->add(Change{"properties", "3", "n", "name", "one", "two", false, Dictionary{{"name", "one"}}});
        record->add(Change{"settings", "", "", "value", "one", "two", false, {}});
        log.add(std::move(record));
    }
    log.hide({"properties", "3", "value"});
    log.hide({"settings", "", "value"});
    for (const char* id : {"a", "b"}) {
        const Array changes = *log.find(id)->describe(true).get("changes").array();
        for (const char* key : {"from", "to", "undo"}) {
            EXPECT_TRUE(changes[0].dictionary()->get(key).isNull()) << key;
            EXPECT_EQ(changes[1].dictionary()->get(key).isNull(), false) << "another part's " << key;
        }
        EXPECT_EQ(changes[0].dictionary()->get("secret"), Value(true));
        EXPECT_EQ(changes[1].dictionary()->get("secret"), Value(false));
        EXPECT_EQ(changes[2].dictionary()->get("from"), Value("one")) << "only elements are hidden, by their identity";
    }
}

std::shared_ptr<RequestRecord> recordNamed(const std::string& id) {
    auto record = std::make_shared<RequestRecord>();
    record->id = id;
    record->state = RequestRecord::State::done;
    return record;
}

TEST(RequestLog, ForgetsTheOldestBeyondItsLength) {
    RequestLog log;
    for (std::size_t i = 0; i <= RequestLog::length; ++i) {
        log.add(recordNamed(std::to_string(i)));
    }
    EXPECT_EQ(log.find("0"), nullptr);
    EXPECT_NE(log.find("1"), nullptr);
    EXPECT_NE(log.find(std::to_string(RequestLog::length)), nullptr);
}

TEST(RequestLog, ForgetsTheOldestWhenTheReportsOfAllTakeTooMuchMemory) {
    RequestLog log;
    for (int i = 0; i < 30; ++i) {
        auto record = recordNamed(std::to_string(i));
        log.add(record);
        for (int k = 0; k < 4; ++k) {
            record->add(change(1'000'000));
        }
    }
    log.add(recordNamed("last"));
    EXPECT_EQ(log.find("0"), nullptr);
    EXPECT_NE(log.find("29"), nullptr);
    EXPECT_NE(log.find("last"), nullptr);
}

TEST(RequestLog, RequestsThatWaitOrRunAreNeverForgotten) {
    RequestLog log;
    auto running = recordNamed("running");
    running->state = RequestRecord::State::running;
    auto waiting = recordNamed("waiting");
    waiting->state = RequestRecord::State::waiting;
    log.add(running);
    log.add(waiting);
    for (std::size_t i = 0; i <= RequestLog::length; ++i) {
        log.add(recordNamed(std::to_string(i)));
    }
    EXPECT_NE(log.find("running"), nullptr);
    EXPECT_NE(log.find("waiting"), nullptr);
    EXPECT_EQ(log.find("0"), nullptr);
    running->state = RequestRecord::State::done;
    log.add(recordNamed("next"));
    EXPECT_EQ(log.find("running"), nullptr);
}

TEST(RequestLog, IdIsUsedOnceInAnyCase) {
    RequestLog log;
    EXPECT_TRUE(log.use("6ba7b810-9dad-11d1-80b4-00c04fd430c8"));
    EXPECT_FALSE(log.use("6BA7B810-9DAD-11D1-80B4-00C04FD430C8"));
    EXPECT_TRUE(log.use("6ba7b811-9dad-11d1-80b4-00c04fd430c8"));
}

TEST(RequestLog, OldestUsedIdIsForgottenBeyondTheBound) {
    RequestLog log;
    for (std::size_t i = 0; i <= RequestLog::usedMaximum; ++i) {
        EXPECT_TRUE(log.use(std::to_string(i)));
    }
    EXPECT_FALSE(log.use("1"));
    EXPECT_TRUE(log.use("0"));
}

}  // namespace
}  // namespace adminhost
