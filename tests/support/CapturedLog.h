#pragma once

// The system log of a test: keeps the events while it lives.

#include "platform/log/Log.h"

#include <algorithm>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::test {

class CapturedLog : public LogSink {
  public:
    CapturedLog() { setLogSink(*this); }
    CapturedLog(const CapturedLog&) = delete;
    CapturedLog& operator=(const CapturedLog&) = delete;
    ~CapturedLog() override { setLogSink(standardErrorSink()); }

    void write(std::string_view event) noexcept override { _events.emplace_back(event); }

    [[nodiscard]] const std::vector<std::string>& events() const noexcept { return _events; }
    /// Whether any event has the text in it.
    [[nodiscard]] bool contains(std::string_view text) const {
        return std::any_of(_events.begin(), _events.end(),
                           [&](const std::string& event) { return event.find(text) != std::string::npos; });
    }
    void clear() noexcept { _events.clear(); }

  private:
    std::vector<std::string> _events;
};

}  // namespace adminhost::test
