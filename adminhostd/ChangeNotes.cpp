#include "adminhostd/ChangeNotes.h"

#include "adminhostd/LoadedPlugins.h"
#include "adminhostd/Login.h"
#include "platform/log/Log.h"

#include <utility>

#include <fmt/format.h>

namespace adminhost {
namespace {

using protocol::Outcome;

void send(int descriptor, protocol::ToFront message) {
    static_cast<void>(writeFrame(descriptor, protocol::frameOf(std::move(message))));
}

}  // namespace

void ChangeNotes::reportUnfinished() {
    BegunRequest::Left left = BegunRequest::left();
    if (left.ofLaterRelease != 0 && !std::exchange(_laterReleaseLogged, true)) {
        logEvent(fmt::format("adminhostd: {}: notes of a later release, which are kept until it is started again: {}",
                             BegunRequest::directory, left.ofLaterRelease));
    }
    for (protocol::Unfinished& request : left.notes) {
        if (_reported.insert(request.request).second) {
            send(_descriptor, std::move(request));
        }
    }
}

bool ChangeNotes::awaitProceed(const std::string& request) {
    while (auto frame = readFrame(_descriptor, _reader)) {
        const auto message = protocol::toWorker(std::move(*frame));
        const auto* earlier = message ? std::get_if<protocol::Recorded>(&*message) : nullptr;
        if (earlier == nullptr) {
            const auto* proceed = message ? std::get_if<protocol::Proceed>(&*message) : nullptr;
            return proceed != nullptr && proceed->request == request;
        }
        if (earlier->request != request) {
            recorded(*earlier);
        }  // else it is about an earlier request with this id, whose note this one has replaced
    }
    return false;
}

bool ChangeNotes::begin(const LoadedPlugin& loaded, const protocol::Perform& order) {
    const Command* command = commandNamed(loaded, order.command);
    protocol::Unfinished about;
    about.request = order.request;
    about.plugin = loaded.name;
    about.command = order.command;
    about.access = command == nullptr ? Access::account : command->access;
    about.caller = order.caller;
    about.user = accountNameOf(order.caller.uid);
    about.loginUser = order.caller.login == noLogin ? std::string() : accountNameOf(order.caller.login);
    // The front knows this request. Its note may stay for long after its end: until the end has been logged.
    _reported.insert(order.request);
    _note.emplace(about, command == nullptr ? Redaction() : Redaction(*command, order.arguments));
    if (!_note->problem().empty()) {
        logEvent("adminhostd: the beginning of a change cannot be noted: " + _note->problem());
    }
    send(_descriptor, protocol::Begun{order.request, about.user, about.loginUser, _note->problem()});
    if (awaitProceed(order.request)) {
        _sink.setNote(&*_note);
        return true;
    }
    _note->ended("nothing was run");
    _note.reset();
    return false;
}

void ChangeNotes::recorded(const protocol::Recorded& message) {
    BegunRequest::remove(message.request);
    _reported.erase(message.request);
}

void ChangeNotes::end(Outcome outcome) {
    _sink.setNote(nullptr);
    if (_note) {
        const bool completed = outcome == Outcome::answered || outcome == Outcome::nothing;
        _note->ended(completed                     ? "its operation was completed"
                     : outcome == Outcome::overrun ? "its operation was stopped at its deadline"
                                                   : "its operation failed");
        _note.reset();
    }
}

}  // namespace adminhost
