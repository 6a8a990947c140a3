#include "handler/AddressWait.h"

#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {
namespace {

using std::chrono::milliseconds;
using testing::Each;
using testing::ElementsAre;
using testing::SizeIs;

/// A stand-in for a service. After so many turns of the loop an address appears, or the resolution fails.
struct Resolver {
    void resolveWithTimeout(milliseconds timeout) { timeouts.push_back(timeout); }
    [[nodiscard]] const std::vector<int>& addresses() const { return found; }

    std::vector<milliseconds> timeouts;
    std::vector<int> found;
    bool failed = false;
};

struct Loop {
    explicit Loop(Resolver& of) : resolver(&of) {}
    void runOnce(milliseconds time) {
        turns.push_back(time);
        if (turns.size() == addressIn) {
            resolver->found.push_back(1);
        }
        if (turns.size() == failureIn) {
            resolver->failed = true;
        }
    }

    Resolver* resolver;
    std::size_t addressIn = 0;
    std::size_t failureIn = 0;
    std::vector<milliseconds> turns;
};

class AddressWait : public testing::Test {
  protected:
    void wait() {
        waitForAddress(resolver, loop, [this] { return resolver.failed; });
    }
    Resolver resolver;
    Loop loop{resolver};
};

TEST_F(AddressWait, SilentResolverIsGivenTenSecondsAndWaitedForInTenTurnsOfOneSecond) {
    wait();
    EXPECT_THAT(resolver.timeouts, ElementsAre(milliseconds(10000)));
    EXPECT_THAT(loop.turns, SizeIs(10));
    EXPECT_THAT(loop.turns, Each(milliseconds(1000)));
}

TEST_F(AddressWait, AddressEndsTheWait) {
    loop.addressIn = 3;
    wait();
    EXPECT_THAT(loop.turns, SizeIs(3));
}

TEST_F(AddressWait, AddressInTheTenthTurnIsStillFound) {
    loop.addressIn = 10;
    wait();
    EXPECT_THAT(resolver.found, SizeIs(1));
}

TEST_F(AddressWait, FailureEndsTheWaitAtOnce) {
    loop.failureIn = 2;
    wait();
    EXPECT_THAT(loop.turns, SizeIs(2));
}

TEST_F(AddressWait, FailureThatComesWithTheStartNeedsNoTurn) {
    resolver.failed = true;
    wait();
    EXPECT_THAT(loop.turns, SizeIs(0));
}

}  // namespace
}  // namespace lumio
