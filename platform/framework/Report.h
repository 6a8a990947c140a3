#pragma once

// Reports: what a running operation has changed, and which parts of its request it did not carry out.
//
// An operation reports when it happens, beside its answer, which stays as it is. The worker hands each report to the
// front at once, so that reports survive a worker that is killed halfway. History, audit and command line read
// reports; nothing parses log lines. All calls come from the thread that runs the operation.

#include "platform/value/Value.h"

#include <string>
#include <utility>

namespace adminhost {

/// One thing that was changed, reported once it is on disk. No text may hold a secret.
struct Change {
    std::string section;   ///< "settings", or the list in the configuration: "cameras"
    std::string identity;  ///< what survives renaming: a UUID or an id; empty for settings
    std::string name;      ///< for people: "Studio 1"; empty for settings
    std::string key;       ///< what changed of it: "port", "users"; empty: all of it was added or removed
    Value from;            ///< null: absent before, or secret
    Value to;              ///< null: absent now, or secret
    bool secret = false;   ///< from and to are withheld
    Value undo;            ///< the part of a request's "configuration" that takes it back; null: cannot be taken back

    bool operator==(const Change&) const = default;
};

/// A part of an accepted request that was not carried out, or was ignored. No text may hold a secret.
struct NotDone {
    std::string keyPath;      ///< "configuration.cameras.0.users.1"
    std::string reason;       ///< one sentence for people
    std::string toolMessage;  ///< the tool's or the library's own words; empty if there are none

    bool operator==(const NotDone&) const = default;
};

class ReportSink {
  public:
    virtual void changed(Change change) = 0;
    virtual void notDone(NotDone part) = 0;

  protected:
    ~ReportSink() = default;
};

/// Where reports go from now on; null (the initial state): they are dropped. The sink must outlive its use.
void setReportSink(ReportSink* sink) noexcept;
void reportChange(Change change);
void reportNotDone(NotDone part);

}  // namespace adminhost
