#pragma once

// The system log of a test.

#include "platform/log/Log.h"

#include <algorithm>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::test {

/// Keeps every event while it exists.
class CapturedLog final : public LogSink {
  public:
    CapturedLog() { setLogSink(*this); }
    CapturedLog(const CapturedLog&) = delete;
    CapturedLog& operator=(const CapturedLog&) = delete;
    ~CapturedLog() override { setLogSink(standardErrorSink()); }
    void write(std::string_view event) noexcept override { lines.emplace_back(event); }

    /// Returns true if an event contains the text.
    [[nodiscard]] bool contains(std::string_view text) const {
        return std::any_of(lines.begin(), lines.end(),
                           [&](const std::string& line) { return line.find(text) != std::string::npos; });
    }

    std::vector<std::string> lines;
};

}  // namespace adminhost::test
