#include "adminhostd/AuditJournal.h"

#include "adminhostd/AuditEvent.h"
#include "adminhostd/Permissions.h"
#include "adminhostd/WorkerAnswer.h"
#include "platform/json/Json.h"
#include "platform/log/Log.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <charconv>
#include <chrono>
#include <cstdint>
#include <cstdlib>
#include <map>
#include <memory>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

#include <fmt/format.h>
#include <systemd/sd-journal.h>

namespace adminhost {
namespace {

using protocol::Answer;
using protocol::Outcome;

struct CloseJournal {
    void operator()(sd_journal* journal) const noexcept { ::sd_journal_close(journal); }
};
using Journal = std::unique_ptr<sd_journal, CloseJournal>;

/// The fields of an entry that begin with ADMINHOST_, without that.
using Fields = std::multimap<std::string, std::string, std::less<>>;

Answer notReadable(std::string_view reason, BodyForm form) {
    return errorAnswer("AUDIT_NOT_READABLE", reason, form);
}

Answer failed(const char* step, int result, BodyForm form) {
    return notReadable(
        fmt::format("The journal cannot be read: {}: {}.", step, std::generic_category().message(-result)), form);
}

Fields fieldsOf(sd_journal* journal, std::size_t& bytes) {
    constexpr std::string_view prefix = "ADMINHOST_";
    Fields fields;
    const void* data = nullptr;
    std::size_t size = 0;
    SD_JOURNAL_FOREACH_DATA(journal, data, size) {
        const std::string_view field(static_cast<const char*>(data), size);
        const std::size_t sign = field.find('=');
        if (field.starts_with(prefix) && sign != std::string_view::npos) {
            bytes += size;
            fields.emplace(field.substr(prefix.size(), sign - prefix.size()), field.substr(sign + 1));
        }
    }
    return fields;
}

std::string textIn(const Fields& fields, std::string_view name) {
    const auto found = fields.find(name);
    return found == fields.end() ? std::string() : utf8Of(found->second);
}

std::optional<std::uint64_t> numberIn(const Fields& fields, std::string_view name) {
    const auto found = fields.find(name);
    if (found == fields.end()) {
        return std::nullopt;
    }
    std::uint64_t number = 0;
    const std::string& text = found->second;
    const auto [end, failure] = std::from_chars(text.data(), text.data() + text.size(), number);
    return failure == std::errc() && end == text.data() + text.size() ? std::optional(number) : std::nullopt;
}

Value numberOrNull(const Fields& fields, std::string_view name) {
    const auto number = numberIn(fields, name);
    return number ? Value(*number) : Value();
}

Value textOrNull(const Fields& fields, std::string_view name) {
    std::string text = textIn(fields, name);
    return text.empty() ? Value() : Value(std::move(text));
}

/// The reports in the fields of this name, and how many were left out of them.
void addReports(Dictionary& entry, const char* key, const Fields& fields, std::string_view field,
                std::string_view countField) {
    std::multimap<std::uint64_t, Dictionary> numbered;
    const auto [begin, end] = fields.equal_range(field);
    for (auto one = begin; one != end; ++one) {
        auto report = parseJson(utf8Of(one->second));
        if (report && report->dictionary() != nullptr) {
            Dictionary& read = *report->dictionary();
            const std::uint64_t number = read.get(reportNumber).unsignedInteger().value_or(0);
            read.remove(reportNumber);
            numbered.emplace(number, std::move(read));
        }
    }
    Array reports;
    for (auto& [number, report] : numbered) {
        reports.emplace_back(std::move(report));
    }
    const std::uint64_t reported = numberIn(fields, countField).value_or(0);
    if (reported > reports.size()) {
        entry.set(std::string(key) + "Omitted", reported - reports.size());
    }
    if (!reports.empty()) {
        entry.set(key, std::move(reports));
    }
}

Dictionary entryOf(const Fields& fields, std::uint64_t microseconds) {
    const auto duration = numberIn(fields, "DURATION_USEC");
    Dictionary entry{{"when", Date(std::chrono::seconds(microseconds / 1'000'000))},
                     {"event", textOrNull(fields, "EVENT")},
                     {"request", textOrNull(fields, "REQUEST")},
                     {"plugin", textOrNull(fields, "PLUGIN")},
                     {"command", textOrNull(fields, "COMMAND")},
                     {"access", textOrNull(fields, "ACCESS")},
                     {"uid", numberOrNull(fields, "UID")},
                     {"user", textOrNull(fields, "USER")},
                     {"loginUid", numberOrNull(fields, "LOGIN_UID")},
                     {"loginUser", textOrNull(fields, "LOGIN_USER")},
                     {"pid", numberOrNull(fields, "PID")},
                     {"unit", textOrNull(fields, "UNIT")},
                     {"checkOnly", fields.contains("CHECK_ONLY") ? Value(true) : Value()},
                     {"status", numberOrNull(fields, "STATUS")},
                     {"result", textOrNull(fields, "RESULT")},
                     {"milliseconds", duration ? Value(static_cast<double>(*duration) / 1000) : Value()},
                     {"refusalsNotLogged", numberOrNull(fields, "REFUSALS_NOT_LOGGED")}};
    addReports(entry, "changes", fields, "CHANGE", "CHANGES");
    addReports(entry, "notDone", fields, "PART_NOT_DONE", "NOT_DONE");
    return entry;
}

/// A name or number of an account. `number` is that of the name: an event has no name if the front did not know it.
struct WantedUser {
    std::string text;
    std::string number;

    [[nodiscard]] bool is(const Fields& fields, std::string_view name, std::string_view uid) const {
        const std::string found = textIn(fields, uid);
        return found == text || textIn(fields, name) == text || (!number.empty() && found == number);
    }
};

WantedUser wantedUser(const std::string& text) {
    const auto number = text.empty() ? std::nullopt : accountNumberOf(text);
    return {text, number ? std::to_string(*number) : std::string()};
}

bool isOfUser(const Fields& fields, const WantedUser& user) {
    return user.text.empty() || user.is(fields, "USER", "UID") || user.is(fields, "LOGIN_USER", "LOGIN_UID");
}

bool hasKey(const Fields& fields, const std::string& key) {
    const auto [begin, end] = fields.equal_range("KEY");
    return key.empty() || std::any_of(begin, end, [&](const auto& field) { return field.second == key; });
}

int addMatch(sd_journal* journal, std::string_view field, std::string_view value) {
    const std::string match = fmt::format("{}={}", field, value);
    return ::sd_journal_add_match(journal, match.data(), match.size());
}

/// Two matches of one field are alternatives; different fields must all match.
int addMatches(sd_journal* journal, uid_t account, const std::string& unit) {
    int result = addMatch(journal, "MESSAGE_ID", begunMessage);
    for (const auto& [field, value] :
         std::vector<std::pair<const char*, std::string>>{{"MESSAGE_ID", std::string(endedMessage)},
                                                          {"_TRANSPORT", "journal"},
                                                          {"_UID", std::to_string(account)},
                                                          {"_SYSTEMD_UNIT", unit}}) {
        if (result >= 0 && !value.empty()) {
            result = addMatch(journal, field, value);
        }
    }
    return result;
}

std::string cursorOf(sd_journal* journal) {
    char* text = nullptr;
    const int result = ::sd_journal_get_cursor(journal, &text);
    const std::unique_ptr<char, decltype(&std::free)> owned(text, &std::free);
    return result < 0 ? std::string() : std::string(text);
}

/// Moves before the first entry that may be returned.
int seek(sd_journal* journal, const protocol::ReadAudit& order, bool& gap) {
    if (order.after.empty()) {
        return order.since == 0 ? ::sd_journal_seek_head(journal)
                                : ::sd_journal_seek_realtime_usec(journal, order.since * 1'000'000);
    }
    int result = ::sd_journal_seek_cursor(journal, order.after.c_str());
    if (result >= 0) {
        result = ::sd_journal_next(journal);  // to the entry itself, which was returned before
    }
    if (result <= 0) {
        return result;
    }
    gap = ::sd_journal_test_cursor(journal, order.after.c_str()) <= 0;
    // After a gap, this entry is the first one that is left: it has not been returned yet.
    return gap ? ::sd_journal_seek_cursor(journal, order.after.c_str()) : result;
}

}  // namespace

Answer auditAnswer(const protocol::ReadAudit& order, uid_t account, const std::string& unit) {
    if (!journalIsThere()) {
        return notReadable(
            "systemd-journald does not run on this machine, so the audit cannot be searched. Its events are the lines "
            "of the system log that contain \"adminhostd: request\".",
            order.form);
    }
    const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(order.milliseconds) / 2;
    sd_journal* opened = nullptr;
    int result = ::sd_journal_open(&opened, SD_JOURNAL_LOCAL_ONLY);
    if (result < 0) {
        return failed("open", result, order.form);
    }
    const Journal journal(opened);
    result = addMatches(journal.get(), account, unit);
    if (result < 0) {
        return failed("match", result, order.form);
    }
    bool gap = false;
    result = seek(journal.get(), order, gap);
    if (result == -EINVAL && !order.after.empty()) {
        Answer unknown;
        unknown.outcome = Outcome::absent;
        unknown.error = "UNKNOWN_PLACE";
        unknown.message = "The argument \"after\" is not a place in the audit: it must be the \"next\" of an answer.";
        return unknown;
    }
    if (result < 0) {
        return failed("seek", result, order.form);
    }
    const WantedUser user = wantedUser(order.user);
    Array entries;
    std::size_t bytes = 0;
    std::string next = order.after;
    bool more = false;
    while ((result = ::sd_journal_next(journal.get())) > 0) {
        if (entries.size() == auditPageMaximum || bytes > auditPageBytesMaximum ||
            std::chrono::steady_clock::now() > end) {
            more = true;
            break;
        }
        std::uint64_t microseconds = 0;
        ::sd_journal_get_realtime_usec(journal.get(), &microseconds);
        std::size_t size = 0;
        const Fields fields = fieldsOf(journal.get(), size);
        next = cursorOf(journal.get());
        if (isOfUser(fields, user) && hasKey(fields, order.key)) {
            bytes += size;
            entries.emplace_back(entryOf(fields, microseconds));
        }
    }
    if (result < 0) {
        return failed("read", result, order.form);
    }
    Dictionary page{{"entries", std::move(entries)}, {"next", next}, {"more", more}};
    page.set("gap", gap ? Value(true) : Value());
    return written(Outcome::answered, std::move(page), order.form);
}

}  // namespace adminhost
