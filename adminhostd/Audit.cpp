#include "adminhostd/Audit.h"

#include "adminhostd/Permissions.h"
#include "adminhostd/ReportForm.h"
#include "platform/log/Log.h"

#include <algorithm>
#include <utility>

#include <fmt/format.h>

namespace adminhost {
namespace {

constexpr auto refusalPeriod = std::chrono::minutes(1);
constexpr auto readingPeriod = std::chrono::hours(1);
constexpr std::size_t readingsMaximum = 1000;  ///< that are remembered
constexpr unsigned forbidden = 403;

}  // namespace

AuditedClient Audit::clientOf(const Peer& peer) {
    return {peer.uid, _names.of(peer.uid), peer.login, peer.login == noLogin ? "" : _names.of(peer.login), peer.pid,
            peer.unit};
}

AuditEvent Audit::eventFor(const RequestRecord& record, AuditEvent::Kind kind) {
    AuditEvent event;
    event.kind = kind;
    event.request = record.id;
    event.plugin = record.plugin;
    event.command = record.command;
    event.access = record.access;
    event.checkOnly = record.checkOnly;
    event.client = clientOf(record.peer);
    if (!record.user.empty()) {
        event.client.user = record.user;
    }
    if (!record.loginUser.empty()) {
        event.client.loginUser = record.loginUser;
    }
    return event;
}

void Audit::write(const AuditEvent& event, const Redaction& redaction) {
    const AuditEvent shown = redacted(event, redaction);
    logEntry(lineOf(shown), fieldsOf(shown));
}

void Audit::begun(RequestRecord& record, const protocol::Begun& about) {
    record.user = about.user;
    record.loginUser = about.loginUser;
    if (!about.problem.empty()) {
        ++_unrecorded;
        _unrecordedReason = about.problem;
    }
    write(eventFor(record, AuditEvent::Kind::begun), record.redaction);
}

void Audit::forgetOldestRefusals() {
    const auto oldest = std::min_element(_refusals.begin(), _refusals.end(),
                                         [](const auto& a, const auto& b) { return a.second.since < b.second.since; });
    if (oldest->second.notLogged > 0) {
        logEvent(fmt::format("adminhostd: {} refusals of {} were not logged", oldest->second.notLogged,
                             uidText(oldest->first, _names.of(oldest->first))));
    }
    _refusals.erase(oldest);
}

AuditEvent Audit::cancellation(const Peer& peer, const RequestRecord& record) {
    AuditEvent event = eventFor(record, AuditEvent::Kind::cancelled);
    event.result = "it was sent by " + uidText(event.client.uid, event.client.user);
    event.client = clientOf(peer);
    return event;
}

void Audit::cancelled(AuditEvent event, unsigned status, const std::string& code) {
    event.status = status;
    if (!code.empty()) {
        event.result = code;
    }
    if (status == forbidden && !countRefusal(event.client.uid, event.refusalsNotLogged)) {
        return;
    }
    write(event, Redaction());
}

bool Audit::countRefusal(uid_t uid, std::size_t& notLogged) {
    const auto now = Clock::now();
    if (_refusals.size() >= refusedAccounts && !_refusals.contains(uid)) {
        forgetOldestRefusals();
    }
    Refusals& refusals = _refusals.try_emplace(uid, Refusals{now}).first->second;
    if (now - refusals.since >= refusalPeriod) {
        refusals.since = now;
        refusals.logged = 0;
    }
    if (refusals.logged == refusalsLogged) {
        ++refusals.notLogged;
        return false;
    }
    ++refusals.logged;
    notLogged = std::exchange(refusals.notLogged, 0);
    return true;
}

bool Audit::countReading(uid_t uid, const std::string& place) {
    const auto now = Clock::now();
    const auto [reading, isNew] = _readings.try_emplace({uid, place}, now);
    const bool first = isNew || now - reading->second >= readingPeriod;
    if (first) {
        reading->second = now;
    }
    if (_readings.size() > readingsMaximum) {
        _readings.erase(std::min_element(_readings.begin(), _readings.end(),
                                         [](const auto& a, const auto& b) { return a.second < b.second; }));
    }
    return first;
}

bool Audit::isWorthLogging(const RequestRecord& record, std::size_t& notLogged) {
    if (record.status == forbidden) {
        // Any account that can connect can cause refusals: it must not be able to fill the log.
        return countRefusal(record.peer.uid, notLogged);
    }
    const bool read = record.status < 300 && !record.place.empty();
    const bool first = read && countReading(record.peer.uid, record.place);
    return first || !record.repeated || record.status >= 300;
}

void Audit::ended(RequestRecord& record) {
    const Redaction redaction = std::exchange(record.redaction, {});
    AuditEvent event = eventFor(record, AuditEvent::Kind::ended);
    if (!isWorthLogging(record, event.refusalsNotLogged)) {
        return;
    }
    event.status = record.status;
    event.result = record.error;
    event.milliseconds = record.milliseconds;
    event.changes = {record.keptChanges(), record.changes()};
    event.notDone = {record.keptNotDone(), record.notDone()};
    write(event, redaction);
}

namespace {

template <class Report>
Array reportsOf(const std::vector<Report>& reports) {
    Array all;
    all.reserve(reports.size());
    for (const Report& report : reports) {
        all.emplace_back(reportOf(report));
    }
    return all;
}

}  // namespace

void Audit::unfinished(const protocol::Unfinished& request) {
    AuditEvent event;
    event.kind = AuditEvent::Kind::unfinished;
    event.request = request.request;
    event.plugin = request.plugin;
    event.command = request.command;
    event.access = nameOf(rightFor(request.access));
    const protocol::Caller& caller = request.caller;
    event.client = {caller.uid, request.user, caller.login, request.loginUser, caller.pid, caller.unit};
    event.result = request.end;
    event.changes = {reportsOf(request.changes), request.changes.size()};
    event.notDone = {reportsOf(request.notDone), request.notDone.size()};
    write(event, Redaction());
}

Diagnosis Audit::check() const {
    using Health = Diagnosis::Health;
    const std::size_t lost = lostEvents();
    const bool journal = journalIsThere();
    const std::string where =
        journal ? "Who does what is recorded in the journal."
                : "Who does what is recorded as lines of the system log, because systemd-journald does not run; "
                  "\"adminhostctl audit\" cannot show them.";
    if (lost == 0 && _unrecorded == 0) {
        return {Health::ok, "audit", where, ""};
    }
    std::string found = where;
    if (lost > 0) {
        found += fmt::format(" {} events could not be written since the daemon was started.", lost);
    }
    if (_unrecorded > 0) {
        found += fmt::format(
            " {} commands began without a note, so that their end would be missing if the daemon was killed: {}.",
            _unrecorded, _unrecordedReason);
    }
    return {Health::warning, "audit", found,
            lost > 0 ? "check the log service and its disk space (systemctl status systemd-journald)"
                     : "make the directory writable, and its file system large enough"};
}

}  // namespace adminhost
