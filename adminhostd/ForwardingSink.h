#pragma once

// The worker's end of its log and of its operations' reports.
//
// Events and reports are passed on to the front when they happen. The front writes the system log and keeps both with
// the request's record. They are lost only together with the front itself.

#include "adminhostd/BegunRequest.h"
#include "adminhostd/FormerValues.h"
#include "platform/framework/Report.h"
#include "platform/log/Log.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string_view>
#include <vector>

namespace adminhost {

/// What an operation has changed.
struct ReportedChanges {
    std::vector<Change> kept;
    std::uint64_t droppedOfResources = 0;  ///< changes beyond the bound; those of settings are not counted
};

/// The process's log and report sink while it lives.
class ForwardingSink final : public LogSink, public ReportSink {
  public:
    /// As many as a request's record keeps.
    static constexpr std::size_t changesMaximum = 1000;

    explicit ForwardingSink(int descriptor);
    ForwardingSink(const ForwardingSink&) = delete;
    ForwardingSink& operator=(const ForwardingSink&) = delete;
    ~ForwardingSink() override;

    /// Reports are added to this note too from now on; null: to none. It must outlive its use.
    void setNote(BegunRequest* note) noexcept { _note = note; }
    /// The reports from now on are of an operation of this plug-in. The function, if there is one, is called when the
    /// operation first announces that it is about to read.
    void beginOperation(std::string_view plugin, std::function<void()> onReading = {});
    /// Called after the operation. Returns its changes: at most changesMaximum, and all secret ones above it. They are
    /// then forgotten.
    [[nodiscard]] ReportedChanges takeChanges();

    void write(std::string_view event) noexcept override;
    /// A secret change first hides the former values in the plug-in's history: neither a worker that is killed in the
    /// middle of the operation nor the number of its changes may leave one readable.
    void changed(Change change) override;
    void becomesSecret(const SecretPart& part) override;
    void notDone(NotDone part) override;
    void readingBegins() override;

  private:
    int _descriptor;
    BegunRequest* _note = nullptr;
    ReportedChanges _changes;
    std::optional<FormerValues> _former;
    std::function<void()> _onReading;
};

}  // namespace adminhost
