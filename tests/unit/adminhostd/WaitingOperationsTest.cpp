#include "adminhostd/WaitingOperations.h"

#include <string>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

using namespace std::chrono_literals;

constexpr auto longest = std::chrono::milliseconds(300s);

class Waiting : public ::testing::Test {
  protected:
    static Operation operation(const std::string& id, const std::string& command) {
        Operation one{nullptr, std::make_shared<RequestRecord>()};
        one.record->id = id;
        one.record->peer.uid = 7;
        protocol::Perform order;
        order.request = id;
        order.plugin = "p";
        order.command = command;
        order.arguments = Dictionary{{"a", 1}};
        one.order = order;
        return one;
    }
    static Operation read(const std::string& id) { return operation(id, "read"); }
    static Operation change(const std::string& id) {
        Operation one = operation(id, "write");
        one.changes = true;
        return one;
    }
    static Operation control(const std::string& id) {
        Operation one = change(id);
        one.urgent = true;
        return one;
    }
    std::string order() {
        std::string ids;
        while (const auto next = waiting.takeNext(false)) {
            ids += next->record->id;
        }
        return ids;
    }
    /// The ids of those that share the run of the first, which begins now.
    std::string sharersOfFirst() {
        Operation first = *waiting.takeNext(false);
        first.until = first.endIfBegun(now, longest);
        std::string ids;
        for (const Operation& sharer : waiting.takeSharers(first, now, longest)) {
            ids += sharer.record->id;
        }
        return ids;
    }

    WaitingOperations waiting;
    const WaitingOperations::Clock::time_point now = WaitingOperations::Clock::now();
};

TEST_F(Waiting, RunInTheOrderOfTheirArrival) {
    for (Operation& one : std::vector{read("a"), change("b"), read("c")}) {
        waiting.add(std::move(one));
    }
    EXPECT_EQ(order(), "abc");
}

TEST_F(Waiting, UrgentOnesGoBeforeReadsButNotBeforeEarlierChanges) {
    for (Operation& one :
         std::vector{read("a"), change("b"), read("c"), read("d"), control("e"), control("f"), read("g")}) {
        waiting.add(std::move(one));
    }
    EXPECT_EQ(order(), "abefcdg");
}

TEST_F(Waiting, WhileTheLockIsHeldElsewhereReadsGoOnAndChangesKeepTheirOrder) {
    for (Operation& one : std::vector{change("a"), read("b"), control("c")}) {
        waiting.add(std::move(one));
    }
    EXPECT_EQ(waiting.takeNext(true)->record->id, "b");
    EXPECT_FALSE(waiting.takeNext(true));
    EXPECT_EQ(order(), "ac");
}

TEST_F(Waiting, IdenticalReadsShareTheRunOfTheFirst) {
    for (Operation& one : std::vector{read("a"), operation("b", "other"), read("c"), read("d")}) {
        waiting.add(std::move(one));
    }
    EXPECT_EQ(sharersOfFirst(), "cd");
    EXPECT_EQ(order(), "b");
}

TEST_F(Waiting, NoRunIsSharedAcrossAChange) {
    for (Operation& one : std::vector{read("a"), read("b"), change("c"), read("d")}) {
        waiting.add(std::move(one));
    }
    EXPECT_EQ(sharersOfFirst(), "b");
    EXPECT_EQ(order(), "cd");
}

TEST_F(Waiting, ChangesNeverShareARun) {
    waiting.add(change("a"));
    waiting.add(change("b"));
    EXPECT_EQ(sharersOfFirst(), "");
}

TEST_F(Waiting, ReadsThatDifferInAnythingThatShapesTheAnswerDoNotShare) {
    std::vector<Operation> others;
    for (int i = 0; i < 10; ++i) {
        others.push_back(read("b"));
    }
    others[0].record->peer.uid = 8;
    std::get<protocol::Perform>(others[1].order).plugin = "q";
    std::get<protocol::Perform>(others[2].order).form = BodyForm::propertyList;
    std::get<protocol::Perform>(others[3].order).arguments = Dictionary{{"a", 2}};
    std::get<protocol::Perform>(others[4].order).checkOnly = true;
    others[5].order = protocol::ReadHistory{"p"};
    others[6].endBy = now + 1s;  // would be answered after its deadline
    std::get<protocol::Perform>(others[7].order).revisions = {"r1"};
    std::get<protocol::Perform>(others[8].order).showsRevision = true;
    std::get<protocol::Perform>(others[9].order).command = "other";
    for (Operation& other : others) {
        waiting.add(read("a"));
        waiting.add(std::move(other));
        EXPECT_EQ(sharersOfFirst(), "") << &other - others.data();
        static_cast<void>(waiting.takeAll());
    }
}

TEST_F(Waiting, ReadWithAShortDeadlineOfItsClientIsNotSharedByOthers) {
    Operation first = read("a");
    first.endBy = now + 1s;
    waiting.add(std::move(first));
    waiting.add(read("b"));
    EXPECT_EQ(sharersOfFirst(), "");
}

TEST_F(Waiting, DirectoryAndHistoryAreSharedAndLogsAreNot) {
    const auto with = [](const std::string& id, protocol::ToWorker order) {
        Operation one = read(id);
        one.order = std::move(order);
        return one;
    };
    waiting.add(with("a", protocol::FindAccounts{"m", ""}));
    waiting.add(with("b", protocol::FindAccounts{"m", ""}));
    waiting.add(with("c", protocol::FindAccounts{"n", ""}));
    EXPECT_EQ(sharersOfFirst(), "b");
    EXPECT_EQ(order(), "c");
    waiting.add(with("a", protocol::ReadHistory{"p"}));
    waiting.add(with("b", protocol::ReadHistory{"p"}));
    EXPECT_EQ(sharersOfFirst(), "b");
    waiting.add(with("a", protocol::ReadLog{}));
    waiting.add(with("b", protocol::ReadLog{}));
    EXPECT_EQ(sharersOfFirst(), "");
}

TEST_F(Waiting, ThoseWhoseTimeIsOverAreTakenWithoutTheOthers) {
    Operation early = read("a");
    early.beginBy = now + 1s;
    Operation late = read("b");
    late.endBy = now + 2s;
    waiting.add(std::move(early));
    waiting.add(std::move(late));
    waiting.add(read("c"));
    EXPECT_EQ(waiting.due(), now + 1s);
    EXPECT_TRUE(waiting.takeLate(now).empty());
    EXPECT_EQ(waiting.takeLate(now + 1s).size(), 1U);
    EXPECT_EQ(waiting.due(), now + 2s);
    EXPECT_EQ(waiting.takeLate(now + 3s).front().record->id, "b");
    EXPECT_EQ(order(), "c");
}

TEST_F(Waiting, ChangeWithoutItsLockIsLateAtItsDeadlineWhateverRunsThen) {
    Operation locked = change("a");
    locked.until = now + 1s;
    locked.locked.emplace();
    waiting.addAgain(std::move(locked));
    waiting.add(change("b"));
    EXPECT_EQ(waiting.due(), now + 1s);
    EXPECT_TRUE(waiting.takeLate(now).empty());
    const std::vector<Operation> late = waiting.takeLate(now + 1s);
    ASSERT_EQ(late.size(), 1U);
    EXPECT_EQ(late.front().record->id, "a");
    EXPECT_FALSE(waiting.due());
}

TEST_F(Waiting, OneIsTakenByItsRequest) {
    Operation one = read("a");
    const auto record = one.record;
    waiting.add(read("b"));
    waiting.add(std::move(one));
    EXPECT_TRUE(waiting.take(*record));
    EXPECT_FALSE(waiting.take(*record));
    EXPECT_EQ(waiting.size(), 1U);
}

}  // namespace
}  // namespace adminhost
