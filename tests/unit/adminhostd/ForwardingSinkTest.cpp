#include "adminhostd/ForwardingSink.h"
#include "adminhostd/Frame.h"
#include "adminhostd/Protocol.h"
#include "adminhostd/SettingsHistory.h"
#include "tests/support/TemporaryRoot.h"

#include <string>
#include <thread>
#include <variant>
#include <vector>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

namespace adminhost {
namespace {

Change changeOf(const std::string& identity, Value from, bool secret) {
    Change change;
    change.section = "properties";
    change.identity = identity;
    change.key = "value";
    change.from = std::move(from);
    change.secret = secret;
    return change;
}

class Forwarding : public testing::Test {
  protected:
    void SetUp() override { ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0); }
    void TearDown() override {
        ::close(ends[0]);
        ::close(ends[1]);
    }
    /// The value from before its only change that the first kept entry shows.
    [[nodiscard]] Value formerValue() const {
        const Array entries = history.resourceEntries();
        return entries.empty() ? Value()
                               : entries[0].dictionary()->get("changes").array()->front().dictionary()->get("from");
    }
    [[nodiscard]] std::optional<protocol::ToFront> received() {
        auto frame = readFrame(ends[1], reader);
        auto message = frame ? protocol::toFront(std::move(*frame)) : failure(Error{});
        return message ? std::optional(*std::move(message)) : std::nullopt;
    }

    test::TemporaryRoot root;
    const SettingsHistory history{"lumio", {}};
    int ends[2] = {-1, -1};
    FrameReader reader;
};

TEST_F(Forwarding, FormerValueIsHiddenBeforeTheFrontIsSentTheSecretChange) {
    ASSERT_FALSE(history.keepResources({changeOf("3", "plain", false)}, {}));
    ForwardingSink sink(ends[0]);
    sink.beginOperation("lumio");
    reportChange(changeOf("4", nullptr, true));
    EXPECT_EQ(formerValue(), Value("plain")) << "another property's";
    reportChange(changeOf("3", nullptr, true));
    EXPECT_EQ(formerValue(), Value("(secret)")) << "although the worker may die before its operation ends";
    for (const char* const identity : {"4", "3"}) {
        const auto part = received();
        ASSERT_TRUE(part && std::holds_alternative<SecretPart>(*part)) << "the front hides it too";
        EXPECT_EQ(std::get<SecretPart>(*part), (SecretPart{"properties", identity, "value"}));
        const auto message = received();
        ASSERT_TRUE(message && std::holds_alternative<Change>(*message));
        EXPECT_EQ(std::get<Change>(*message).identity, identity);
    }
}

TEST_F(Forwarding, FormerValueIsHiddenWhenItsSecretIsAnnounced) {
    ASSERT_FALSE(history.keepResources({changeOf("3", "plain", false)}, {}));
    ForwardingSink sink(ends[0]);
    announceSecret({"properties", "3", "value"});
    EXPECT_EQ(formerValue(), Value("plain")) << "no operation has begun";
    sink.beginOperation("lumio");
    announceSecret({"properties", "4", "value"});
    EXPECT_EQ(formerValue(), Value("plain")) << "another property's";
    announceSecret({"properties", "3", "value"});
    EXPECT_EQ(formerValue(), Value("(secret)"));
    EXPECT_TRUE(sink.takeChanges().kept.empty()) << "an announcement is no change";
}

TEST_F(Forwarding, SecretChangeAfterTheMaximumOfChangesHidesTheFormerValuesAndIsKept) {
    ASSERT_FALSE(history.keepResources({changeOf("3", "plain", false)}, {}));
    std::thread front([&] {
        while (readFrame(ends[1], reader)) {
        }
    });
    {
        ForwardingSink sink(ends[0]);
        sink.beginOperation("lumio");
        for (std::size_t i = 0; i < ForwardingSink::changesMaximum + 5; ++i) {
            reportChange(changeOf("9", static_cast<std::int64_t>(i), false));
        }
        reportChange(changeOf("3", nullptr, true));
        EXPECT_EQ(formerValue(), Value("(secret)"));
        const ReportedChanges changes = sink.takeChanges();
        EXPECT_EQ(changes.kept.size(), ForwardingSink::changesMaximum + 1);
        EXPECT_EQ(changes.kept.back().identity, "3");
        EXPECT_EQ(changes.droppedOfResources, 5U);
        EXPECT_EQ(sink.takeChanges().droppedOfResources, 0U);
    }
    ::shutdown(ends[0], SHUT_RDWR);
    front.join();
}

}  // namespace
}  // namespace adminhost
