#include "adminhostd/AuditEvent.h"

#include "adminhostd/AccountNames.h"
#include "platform/json/Json.h"
#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <cmath>
#include <set>
#include <utility>
#include <vector>

#include <fmt/format.h>

namespace adminhost {
namespace {

constexpr std::size_t lineReportsMaximum = 1500;  ///< bytes of a line's changes, and as many of what was not done
// The journal drops an event of more than 1024 fields. 32 KiB hold some 550 reports at the most.
constexpr std::size_t keysMaximum = 400;
constexpr std::size_t keyBytesMaximum = std::size_t{16} << 10U;

/// The text up to a bound, without half a character, and the number of omitted bytes.
std::string cut(const std::string& text, std::size_t maximum) {
    if (text.size() <= maximum) {
        return text;
    }
    std::size_t size = maximum;
    while (size > 0 && continuesCharacter(text[size])) {
        --size;
    }
    return fmt::format("{}... ({} more bytes)", std::string_view(text).substr(0, size), text.size() - size);
}

std::string cut(const std::string& text) {
    return cut(text, auditTextMaximum);
}

/// The text in one line of printable characters.
std::string oneLine(const std::string& text) {
    std::string line = text;
    std::replace(line.begin(), line.end(), '\n', ' ');
    return logTextOf(line);
}

/// A text as it is, any other value as JSON.
std::string shownValue(const Value& value) {
    return value.isNull() ? "(not set)" : value.string() != nullptr ? *value.string() : jsonOf(value);
}

/// A report with bounded texts.
Dictionary bounded(const Dictionary& report) {
    Dictionary shortened;
    for (const DictionaryEntry& entry : report) {
        if (entry.value.string() != nullptr) {
            shortened.set(entry.key, cut(*entry.value.string()));
        } else {
            const std::string text = jsonOf(entry.value);
            shortened.set(entry.key, text.size() <= auditTextMaximum ? entry.value : Value(cut(text)));
        }
    }
    return shortened;
}

/// The words under which a change can be found: its section, its key, and both.
std::vector<std::string> keysOf(const Dictionary& change) {
    const std::string section(change.text("section"));
    const std::string key(change.text("key"));
    std::vector<std::string> keys{section};
    if (!key.empty()) {
        keys.push_back(key);
        keys.push_back(section + '.' + key);
    }
    return keys;
}

void addReports(LogFields& fields, const AuditedReports& reports, const char* countField, const char* field,
                std::size_t& left) {
    if (reports.reported > 0) {
        fields.emplace_back(countField, std::to_string(reports.reported));
    }
    std::set<std::string> keys;
    std::size_t keyBytes = 0;
    bool full = false;
    std::int64_t number = 1;
    for (const Value& element : reports.kept) {
        const Dictionary& report = *element.dictionary();
        if (report.contains("section")) {  // also of a change that is left out: it can be searched for
            for (const std::string& key : keysOf(report)) {
                std::string bounded = cut(key);
                const std::size_t size = bounded.size();
                if (keys.size() < keysMaximum && keyBytes + size <= keyBytesMaximum &&
                    keys.insert(std::move(bounded)).second) {
                    keyBytes += size;
                }
            }
        }
        if (full) {
            continue;
        }
        // The journal does not keep the order of fields.
        Dictionary numbered{{std::string(reportNumber), number++}};
        for (const DictionaryEntry& entry : bounded(report)) {
            numbered.set(entry.key, entry.value);
        }
        std::string text = jsonOf(numbered);
        full = text.size() > left;
        if (!full) {
            left -= text.size();
            fields.emplace_back(field, std::move(text));
        }
    }
    for (const std::string& key : keys) {
        fields.emplace_back("ADMINHOST_KEY", key);
    }
}

std::string reportsText(const char* what, const AuditedReports& reports,
                        std::string (*textOfReport)(const Dictionary&)) {
    if (reports.reported == 0) {
        return {};
    }
    std::string text;
    std::size_t shown = 0;
    for (const Value& report : reports.kept) {
        const std::string one = oneLine(textOfReport(bounded(*report.dictionary())));
        if (text.size() + one.size() > lineReportsMaximum) {
            break;
        }
        text += (text.empty() ? "" : "; ") + one;
        ++shown;
    }
    if (shown < reports.reported) {
        text += fmt::format("{}{} more", text.empty() ? "" : "; ", reports.reported - shown);
    }
    return fmt::format(", {}: {} ({})", what, reports.reported, text);
}

std::string outcomeText(const AuditEvent& event) {
    switch (event.kind) {
        case AuditEvent::Kind::begun:
            return "begins";
        case AuditEvent::Kind::unfinished:
            return "had begun when the daemon ended; " + event.result;
        case AuditEvent::Kind::cancelled:
            return event.status < 300 ? "cancelled; " + event.result
                                      : fmt::format("is not cancelled; {} {}", event.status, event.result);
        case AuditEvent::Kind::ended:
            break;
    }
    return fmt::format("{}{}{} in {:.1f} ms", event.status, event.result.empty() ? "" : " ", event.result,
                       event.milliseconds);
}

std::string nameOf(AuditEvent::Kind kind) {
    constexpr const char* names[] = {"begun", "ended", "unfinished", "cancelled"};
    return names[static_cast<int>(kind)];
}

}  // namespace

AuditEvent redacted(AuditEvent event, const Redaction& redaction) {
    // Plug-in and command are names that the plug-in has given: an unknown name from an address is not recorded at all.
    for (std::string* text : {&event.client.unit, &event.result}) {
        *text = redaction.text(*text);
    }
    for (AuditedReports* reports : {&event.changes, &event.notDone}) {
        for (Value& report : reports->kept) {
            report = redaction.report(*report.dictionary());
        }
    }
    return event;
}

LogFields fieldsOf(const AuditEvent& event) {
    LogFields fields{{"MESSAGE_ID", std::string(event.kind == AuditEvent::Kind::begun ? begunMessage : endedMessage)},
                     {"ADMINHOST_EVENT", nameOf(event.kind)},
                     {"ADMINHOST_REQUEST", event.request},
                     {"ADMINHOST_COMMAND", event.command},
                     {"ADMINHOST_UID", std::to_string(event.client.uid)},
                     {"ADMINHOST_PID", std::to_string(event.client.pid)}};
    const auto add = [&](const char* name, std::string text) {
        if (!text.empty()) {
            fields.emplace_back(name, std::move(text));
        }
    };
    add("ADMINHOST_PLUGIN", event.plugin);
    add("ADMINHOST_ACCESS", event.access);
    add("ADMINHOST_USER", event.client.user);
    add("ADMINHOST_UNIT", event.client.unit);
    if (event.client.login != noLogin) {
        fields.emplace_back("ADMINHOST_LOGIN_UID", std::to_string(event.client.login));
        add("ADMINHOST_LOGIN_USER", event.client.loginUser);
    }
    if (event.checkOnly) {
        fields.emplace_back("ADMINHOST_CHECK_ONLY", "1");
    }
    if (event.kind == AuditEvent::Kind::begun) {
        return fields;
    }
    add("ADMINHOST_STATUS", event.status == 0 ? "" : std::to_string(event.status));
    add("ADMINHOST_RESULT", cut(event.result));
    if (event.kind == AuditEvent::Kind::ended) {
        fields.emplace_back("ADMINHOST_DURATION_USEC", std::to_string(std::llround(event.milliseconds * 1000)));
    }
    add("ADMINHOST_REFUSALS_NOT_LOGGED", event.refusalsNotLogged == 0 ? "" : std::to_string(event.refusalsNotLogged));
    std::size_t left = auditReportsMaximum;
    addReports(fields, event.changes, "ADMINHOST_CHANGES", "ADMINHOST_CHANGE", left);
    addReports(fields, event.notDone, "ADMINHOST_NOT_DONE", "ADMINHOST_PART_NOT_DONE", left);
    return fields;
}

std::string lineOf(const AuditEvent& event) {
    std::string line = fmt::format("adminhostd: request {} {}/{} by {}", event.request, event.plugin, event.command,
                                   uidText(event.client.uid, event.client.user));
    if (event.client.login != noLogin && event.client.login != event.client.uid) {
        line += " of the login of " + uidText(event.client.login, event.client.loginUser);
    }
    line += fmt::format(" pid {}", event.client.pid);
    if (!event.client.unit.empty()) {
        line += " in " + event.client.unit;
    }
    line += fmt::format(": {}{}{}{}", event.checkOnly ? "check only, " : "", outcomeText(event),
                        reportsText("changes", event.changes, &changeText),
                        reportsText("not done", event.notDone, &notDoneText));
    if (event.refusalsNotLogged > 0) {
        line += fmt::format("; {} earlier refusals of this account were not logged", event.refusalsNotLogged);
    }
    return oneLine(line);
}

std::string changeText(const Dictionary& change) {
    std::string text(change.text("section"));
    const std::string_view name = change.text("name").empty() ? change.text("identity") : change.text("name");
    if (!name.empty()) {
        text.append(" ").append(name);
    }
    const std::string_view key = change.text("key");
    const Value& from = change.get("from");
    const Value& to = change.get("to");
    if (!key.empty()) {
        text.append(" ").append(key);
    }
    text += ": ";
    if (change.get("secret") == Value(true)) {
        text.append(Redaction::mark).append(" changed");
    } else if (key.empty()) {
        text += to.isNull() ? "removed" : from.isNull() ? "added" : "replaced";
    } else {
        text += shownValue(from) + " -> " + shownValue(to);
    }
    return text + (change.get("unverified") == Value(true) ? " (if it exists)" : "");
}

std::string notDoneText(const Dictionary& part) {
    std::string text(part.text("keyPath"));
    text.append(text.empty() ? "" : ": ").append(part.text("reason"));
    const std::string_view tool = part.text("toolMessage");
    return tool.empty() ? text : text.append(" (").append(tool).append(")");
}

}  // namespace adminhost
