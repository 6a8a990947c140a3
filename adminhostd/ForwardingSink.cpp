#include "adminhostd/ForwardingSink.h"

#include "adminhostd/Frame.h"
#include "adminhostd/Protocol.h"

#include <string>
#include <utility>

namespace adminhost {
namespace {

void send(int descriptor, protocol::ToFront message) {
    static_cast<void>(writeFrame(descriptor, protocol::frameOf(std::move(message))));
}

}  // namespace

ForwardingSink::ForwardingSink(int descriptor) : _descriptor(descriptor) {
    setLogSink(*this);
    setReportSink(this);
}

ForwardingSink::~ForwardingSink() {
    setReportSink(nullptr);
    setLogSink(standardErrorSink());
}

void ForwardingSink::beginOperation(std::string_view plugin, std::function<void()> onReading) {
    _changes = {};
    _onReading = std::move(onReading);
    _former.emplace(plugin);
}

ReportedChanges ForwardingSink::takeChanges() {
    _onReading = {};
    return std::exchange(_changes, {});
}

void ForwardingSink::write(std::string_view event) noexcept {
    try {
        send(_descriptor, protocol::Log{std::string(event)});
    } catch (...) {
        return;
    }
}

void ForwardingSink::changed(Change change) {
    if (change.secret) {
        becomesSecret({change.section, change.identity, change.key});
    }
    // Beyond the bound, secret ones are kept: their former values are hidden once more when the entry is added.
    if (change.secret || _changes.kept.size() < changesMaximum) {
        _changes.kept.push_back(change);
    } else if (change.section != "settings") {
        ++_changes.droppedOfResources;
    }
    if (_note != nullptr) {
        _note->add(change);
    }
    send(_descriptor, std::move(change));
}

void ForwardingSink::becomesSecret(const SecretPart& part) {
    if (_former) {
        _former->hide(part);
    }
    send(_descriptor, part);
}

void ForwardingSink::notDone(NotDone part) {
    if (_note != nullptr) {
        _note->add(part);
    }
    send(_descriptor, std::move(part));
}

void ForwardingSink::readingBegins() {
    if (const auto onReading = std::exchange(_onReading, {})) {
        onReading();
    }
}

}  // namespace adminhost
