#include "adminhostctl/AuditVerb.h"

#include "adminhostctl/Follow.h"
#include "adminhostctl/LogsVerb.h"
#include "adminhostctl/Since.h"
#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "platform/json/Json.h"
#include "platform/text/IsoDate.h"
#include "platform/text/LocalDate.h"

#include <chrono>
#include <deque>
#include <functional>
#include <set>
#include <utility>
#include <vector>

#include <fmt/format.h>
#include <fmt/ranges.h>

namespace adminhost::ctl {
namespace {

constexpr std::size_t entriesMaximum = 10'000;  ///< more are not held in memory
constexpr auto usualPeriod = std::chrono::hours(24);

Date firstMoment(const Context& context) {
    const Date usual = std::chrono::floor<std::chrono::seconds>(std::chrono::system_clock::now()) - usualPeriod;
    return sinceOf(context).value_or(usual);
}

/// Reads the pages of the audit one after the other.
class AuditReader {
  public:
    explicit AuditReader(const Context& context)
        : _context(context),
          _selection("&user=" + Connection::escaped(context.options.argumentOf(userOption)) +
                     "&key=" + Connection::escaped(context.options.argumentOf(keyOption))),
          _since("since=" + Connection::escaped(isoTextOf(firstMoment(context)))) {}

    /// Calls the function for each entry that has come in since the last call. Returns true if there are more.
    bool readPage(const std::function<void(Dictionary)>& function) {
        const Value answer = _context.service.get(
            "/v1/audit?" + (_next.empty() ? _since : "after=" + Connection::escaped(_next)) + _selection);
        const Dictionary* page = answer.dictionary();
        const Array* entries = page == nullptr ? nullptr : page->get("entries").array();
        if (entries == nullptr) {
            throw Failure(ExitStatus::failed, "the daemon's answer is not a page of the audit");
        }
        if (page->get("gap") == Value(true)) {
            _context.err << "adminhostctl: events may be missing here: the journal has removed them meanwhile\n";
        }
        if (!page->text("next").empty()) {
            _next = page->text("next");
        }
        for (const Value& entry : *entries) {
            if (entry.dictionary() != nullptr) {
                function(*entry.dictionary());
            }
        }
        return page->get("more") == Value(true);
    }

  private:
    const Context& _context;
    std::string _selection;
    std::string _since;
    std::string _next;
};

std::string accountText(const Dictionary& entry, const char* name, const char* number) {
    const std::string_view user = entry.text(name);
    const auto uid = entry.get(number).unsignedInteger();
    return !user.empty() ? std::string(user) : uid ? "uid " + std::to_string(*uid) : std::string();
}

std::string whoText(const Dictionary& entry) {
    const std::string account = accountText(entry, "user", "uid");
    const std::string login = accountText(entry, "loginUser", "loginUid");
    return login.empty() || login == account ? account : login + " as " + account;
}

std::string resultText(const Dictionary& entry) {
    const std::string_view event = entry.text("event");
    const std::string checkOnly = entry.get("checkOnly") == Value(true) ? "check only, " : "";
    if (event == "begun") {
        return "begins";
    }
    if (event == "unfinished") {
        return "unfinished: " + std::string(entry.text("result"));
    }
    const auto status = entry.get("status").unsignedInteger().value_or(0);
    const auto refusals = entry.get("refusalsNotLogged").unsignedInteger();
    const std::string before = refusals ? fmt::format(" ({} more before it)", *refusals) : "";
    if (event == "cancelled") {
        return (status < 300 ? "cancelled; " + std::string(entry.text("result"))
                             : fmt::format("is not cancelled; {} {}", status, entry.text("result"))) +
               before;
    }
    return checkOnly + (status < 300 ? "done" : fmt::format("{} {}", status, entry.text("result"))) + before;
}

std::string valueText(const Value& value) {
    return value.isNull() ? "(not set)" : value.string() != nullptr ? *value.string() : jsonOf(value);
}

std::string changeText(const Dictionary& change) {
    std::string text(change.text("section"));
    for (const std::string_view part :
         {change.text("name").empty() ? change.text("identity") : change.text("name"), change.text("key")}) {
        text.append(part.empty() ? "" : " ").append(part);
    }
    text += ": ";
    const Value& from = change.get("from");
    const Value& to = change.get("to");
    if (change.get("secret") == Value(true)) {
        text += "(secret) changed";
    } else if (change.text("key").empty()) {
        text += to.isNull() ? "removed" : from.isNull() ? "added" : "replaced";
    } else {
        text += valueText(from) + " -> " + valueText(to);
    }
    return text + (change.get("unverified") == Value(true) ? " (if it exists)" : "");
}

/// What was changed and what was not done, one part in each text.
std::vector<std::string> reportTexts(const Dictionary& entry) {
    std::vector<std::string> texts;
    const auto add = [&](const char* key, const std::string& before, auto textOfReport) {
        const Array* reports = entry.get(key).array();
        for (const Value& report : reports == nullptr ? Array() : *reports) {
            if (report.dictionary() != nullptr) {
                texts.push_back(before + textOfReport(*report.dictionary()));
            }
        }
        if (const auto omitted = entry.get(std::string(key) + "Omitted").unsignedInteger()) {
            texts.push_back(fmt::format("{}{} more", before, *omitted));
        }
    };
    add("changes", "", &changeText);
    add("notDone", "not done: ", [](const Dictionary& part) {
        const std::string_view tool = part.text("toolMessage");
        return fmt::format("{}{}{}{}", part.text("keyPath"), part.text("keyPath").empty() ? "" : ": ",
                           part.text("reason"), tool.empty() ? "" : fmt::format(" ({})", tool));
    });
    return texts;
}

std::string commandText(const Dictionary& entry) {
    const std::string_view plugin = entry.text("plugin");
    return fmt::format("{}{}{}", plugin, plugin.empty() ? "" : "/", entry.text("command"));
}

std::vector<std::string> cellsOf(const Dictionary& entry) {
    const auto when = entry.get("when").date();
    const auto milliseconds = entry.get("milliseconds").real();
    std::vector<std::string> cells{when ? localTextOf(*when) : "",
                                   whoText(entry),
                                   commandText(entry),
                                   resultText(entry),
                                   milliseconds ? fmt::format("{:.0f} ms", *milliseconds) : "",
                                   fmt::format("{}", fmt::join(reportTexts(entry), "; "))};
    for (std::string& cell : cells) {
        // One event is one row, whatever its texts hold.
        cell = shownIndented(cell, 0);
        for (char& c : cell) {
            c = c == '\n' || c == '\t' ? ' ' : c;
        }
    }
    return cells;
}

void printTable(const Context& context, const std::deque<Dictionary>& entries) {
    // A beginning is of interest only while its end is missing.
    std::set<std::string, std::less<>> ended;
    for (const Dictionary& entry : entries) {
        // A change that could not be cancelled is still running.
        if (entry.text("event") != "begun" && entry.text("event") != "cancelled") {
            ended.emplace(entry.text("request"));
        }
    }
    Table table({"time", "who", "command", "result", "took", "changes"});
    for (const Dictionary& entry : entries) {
        if (entry.text("event") != "begun" || !ended.contains(entry.text("request"))) {
            table.addRow(cellsOf(entry));
        }
    }
    context.out << table.text(context.options.width, 0);
}

/// One line for each event, because the width of columns is not known before the last one.
void printLine(const Context& context, const Dictionary& entry) {
    if (context.options.format == Format::json) {
        context.out << shownJson(jsonOf(entry)) << '\n';
        return;
    }
    std::string line;
    for (const std::string& cell : cellsOf(entry)) {
        line += (cell.empty() || line.empty() ? "" : "  ") + cell;
    }
    context.out << line << '\n';
}

}  // namespace

ExitStatus audit(const Context& context, std::span<const std::string>) {
    AuditReader reader(context);
    if (context.options.has(followOption)) {
        if (context.options.format == Format::plist) {
            throw usageError("with --follow the format is text or json: a property list has an end");
        }
        followUntilClosed(context,
                          [&] { return reader.readPage([&](const Dictionary& entry) { printLine(context, entry); }); });
        return ExitStatus::done;
    }
    std::deque<Dictionary> entries;
    bool all = true;
    while (reader.readPage([&](Dictionary entry) {
        entries.push_back(std::move(entry));
        if (entries.size() > entriesMaximum) {
            entries.pop_front();
            all = false;
        }
    })) {
    }
    if (!all) {
        context.err << fmt::format("adminhostctl: only the latest {} events are shown\n", entriesMaximum);
    }
    if (context.options.format == Format::text) {
        printTable(context, entries);
    } else {
        writeValue(context, Dictionary{{"entries", Array(entries.begin(), entries.end())}}, Description());
    }
    return ExitStatus::done;
}

}  // namespace adminhost::ctl
