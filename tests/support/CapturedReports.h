#pragma once

#include "platform/framework/Report.h"

#include <vector>

namespace adminhost::test {

/// Collects the reports of operations while it exists.
class CapturedReports final : public ReportSink {
  public:
    CapturedReports() { setReportSink(this); }
    CapturedReports(const CapturedReports&) = delete;
    CapturedReports& operator=(const CapturedReports&) = delete;
    ~CapturedReports() { setReportSink(nullptr); }

    void changed(Change change) override { changes.push_back(std::move(change)); }
    void becomesSecret(const SecretPart& part) override { announced.push_back(part); }
    void notDone(NotDone part) override { parts.push_back(std::move(part)); }

    std::vector<Change> changes;
    std::vector<SecretPart> announced;
    std::vector<NotDone> parts;  ///< not carried out
};

}  // namespace adminhost::test
