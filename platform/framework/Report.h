#pragma once

// Reports: what a running operation has changed, and which parts of its request it did not carry out.
//
// An operation reports each change when it happens. Reports do not alter its response. The worker hands each report to
// the front at once, so that reports survive a worker that is killed halfway. History, audit and command line read
// reports and never parse log lines. All calls come from the thread that runs the operation.

#include "platform/framework/Export.h"
#include "platform/value/Value.h"

#include <string>
#include <utility>

namespace adminhost {

/// One thing that was changed, reported once it is on disk. No text may hold a secret.
struct ADMINHOST_EXPORT Change {
    std::string section;   ///< "settings", or the list in the configuration: "cameras"
    std::string identity;  ///< a UUID or an id, which renaming does not change; empty for settings
    std::string name;      ///< for people: "Studio 1"; empty for settings
    std::string key;       ///< the part that changed: "port", "users"; empty: all of it was added or removed
    Value from;            ///< null: absent before, or secret
    Value to;              ///< null: absent now, or secret
    bool secret = false;   ///< from and to are withheld
    Value undo;            ///< the part of a request's "configuration" that undoes it; null: cannot be undone
    /// The element was not read before, and what changes it succeeds in the same way if it does not exist: then nothing
    /// was changed.
    bool unverified = false;

    bool operator==(const Change&) const = default;
};

/// A part of an accepted request that was not carried out, or was ignored. No text may hold a secret.
struct ADMINHOST_EXPORT NotDone {
    std::string keyPath;      ///< "configuration.cameras.0.users.1"
    std::string reason;       ///< one sentence for people
    std::string toolMessage;  ///< the tool's or the library's own text; may be empty

    bool operator==(const NotDone&) const = default;
};

/// A part of an element whose value becomes a secret.
struct ADMINHOST_EXPORT SecretPart {
    std::string section;
    std::string identity;
    std::string key;

    bool operator==(const SecretPart&) const = default;
};

class ADMINHOST_EXPORT ReportSink {
  public:
    virtual void changed(Change change) = 0;
    virtual void becomesSecret(const SecretPart& part) = 0;
    virtual void notDone(NotDone part) = 0;
    virtual void readingBegins() {}

  protected:
    ~ReportSink() = default;
};

/// Sets where reports go from now on. With null, the initial state, they are dropped. The sink must outlive its use.
ADMINHOST_EXPORT void setReportSink(ReportSink* sink) noexcept;
ADMINHOST_EXPORT void reportChange(Change change);
ADMINHOST_EXPORT void reportNotDone(NotDone part);
/// Announces that the value is about to become a secret. Its former values in the history are hidden before this
/// returns, so that none stays readable if the process is killed between the change and its report. They stay hidden if
/// the change then fails.
ADMINHOST_EXPORT void announceSecret(const SecretPart& part);
/// Announces that the operation is about to read what its response shows, and has itself changed what it changes. The
/// revision that goes with the response is that of this moment: if somebody else writes while it is reading, a later
/// write with that revision is refused. Without this call, it is the revision after the operation.
ADMINHOST_EXPORT void announceReading();

}  // namespace adminhost
