#include "platform/log/Log.h"

#include <string>
#include <string_view>
#include <vector>

#include <gtest/gtest.h>

namespace {

using namespace adminhost;

class Recorder final : public LogSink {
  public:
    void write(std::string_view event) noexcept override { _events.emplace_back(event); }
    [[nodiscard]] const std::vector<std::string>& events() const noexcept { return _events; }

  private:
    std::vector<std::string> _events;
};

class Log : public testing::Test {
  protected:
    void TearDown() override { setLogSink(standardErrorSink()); }
};

TEST_F(Log, FirstSinkIsStandardErrorWithTheExactTextAndALineFeed) {
    testing::internal::CaptureStderr();
    logEvent("adminhost_lumio: capturing% %s %n \\ à");
    logEvent("");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "adminhost_lumio: capturing% %s %n \\ à\n\n");
}

TEST_F(Log, StandardErrorKeepsLineFeedsAndNulsInsideAnEvent) {
    const std::string event("two\nlines\0end", 13);
    testing::internal::CaptureStderr();
    standardErrorSink().write(event);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), event + "\n");
}

TEST_F(Log, LongEventArrivesWhole) {
    const std::string event(1'000'000, 'x');
    testing::internal::CaptureStderr();
    logEvent(event);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), event + "\n");
}

TEST_F(Log, EventsGoToTheSinkThatIsSetOneByOne) {
    Recorder recorder;
    setLogSink(recorder);
    logEvent("one");
    logEvent("two\n");
    setLogSink(standardErrorSink());
    testing::internal::CaptureStderr();
    logEvent("three");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "three\n");
    EXPECT_EQ(recorder.events(), (std::vector<std::string>{"one", "two\n"}));
}

TEST_F(Log, SystemLogSinkIsNotStandardError) {
    EXPECT_NE(&syslogSink(), &standardErrorSink());
    setLogSink(syslogSink());
    testing::internal::CaptureStderr();
    logEvent("adminhost test: 100% %s");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "");
}

}  // namespace
