#include "adminhostd/Metrics.h"

#include "platform/release/Release.h"

#include <algorithm>

#include <fmt/format.h>

namespace adminhost {
namespace {

/// A label's value, quoted.
std::string quoted(std::string_view text) {
    std::string quoted = "\"";
    for (const char c : text) {
        if (c == '\n') {
            quoted += "\\n";
            continue;
        }
        if (c == '\\' || c == '"') {
            quoted += '\\';
        }
        quoted += c;
    }
    return quoted + '"';
}

void begin(std::string& text, std::string_view name, std::string_view type, std::string_view help) {
    text += fmt::format("# HELP {0} {1}\n# TYPE {0} {2}\n", name, help, type);
}

void add(std::string& text, std::string_view name, std::string_view type, std::string_view help, double value) {
    begin(text, name, type, help);
    text += fmt::format("{} {}\n", name, value);
}

/// The labels of a plug-in's command.
std::string labelsOf(const std::tuple<std::string, std::string, bool>& name) {
    const auto& [plugin, command, checkOnly] = name;
    // No label is the same as an empty one.
    return fmt::format("plugin={},command={}{}", quoted(plugin), quoted(command), checkOnly ? ",check=\"1\"" : "");
}

}  // namespace

void Metrics::requestEnded(std::string_view plugin, std::string_view command, unsigned status, std::string_view code,
                           double seconds, bool checkOnly) {
    const Name name(plugin, command, checkOnly);
    Result result{name, status, code};
    if (!_requests.contains(result) && _requests.size() >= seriesMaximum) {
        result = {Name("", "other", false), status, ""};
    }
    ++_requests[std::move(result)];
    Histogram& histogram = _durations[name];
    const auto bucket = std::lower_bound(durations.begin(), durations.end(), seconds);
    if (bucket != durations.end()) {
        ++histogram.buckets[static_cast<std::size_t>(bucket - durations.begin())];
    }
    ++histogram.count;
    histogram.sum += seconds;
}

std::string Metrics::text(const Now& now) const {
    std::string text;
    begin(text, "adminhost_build_info", "gauge", "The release of the daemon.");
    text += fmt::format("adminhost_build_info{{release={}}} 1\n", quoted(ADMINHOST_RELEASE));
    begin(text, "adminhost_requests_total", "counter",
          "Requests that ended, by command, HTTP status and the code of an error.");
    for (const auto& [result, count] : _requests) {
        const auto& [name, status, code] = result;
        text += fmt::format("adminhost_requests_total{{{},status=\"{}\",error={}}} {}\n", labelsOf(name), status,
                            quoted(code), count);
    }
    begin(text, "adminhost_request_duration_seconds", "histogram", "Time from the arrival of a request to its answer.");
    for (const auto& [name, histogram] : _durations) {
        const std::string labels = labelsOf(name);
        std::uint64_t cumulated = 0;
        for (std::size_t i = 0; i < durations.size(); ++i) {
            cumulated += histogram.buckets[i];
            text += fmt::format("adminhost_request_duration_seconds_bucket{{{},le=\"{}\"}} {}\n", labels, durations[i],
                                cumulated);
        }
        text += fmt::format(
            "adminhost_request_duration_seconds_bucket{{{0},le=\"+Inf\"}} {1}\n"
            "adminhost_request_duration_seconds_sum{{{0}}} {2}\nadminhost_request_duration_seconds_count{{{0}}} {1}\n",
            labels, histogram.count, histogram.sum);
    }
    add(text, "adminhost_requests_waiting", "gauge", "Requests that wait for the worker.",
        static_cast<double>(now.waiting));
    add(text, "adminhost_requests_running", "gauge", "Requests that the worker is running.", now.running ? 1 : 0);
    add(text, "adminhost_requests_waiting_maximum", "gauge", "How many requests may wait (queue_limit).",
        static_cast<double>(now.queueLimit));
    add(text, "adminhost_request_deadline_seconds", "gauge", "The longest time that a request may run.",
        now.deadlineSeconds);
    add(text, "adminhost_event_clients", "gauge", "Clients that wait for the next event.",
        static_cast<double>(now.eventClients));
    add(text, "adminhost_tool_runs_total", "counter", "Tools that were started for requests that ended.",
        static_cast<double>(_toolRuns));
    add(text, "adminhost_directory_lookups_total", "counter",
        "Look-ups of people and groups in the directory's nodes for requests that ended.",
        static_cast<double>(_directoryLookups));
    add(text, "adminhost_worker_starts_total", "counter", "Starts of a worker, the first one included.",
        static_cast<double>(now.workerStarts));
    begin(text, "adminhost_resident_memory_bytes", "gauge",
          "Resident memory; that of the worker after its latest answer.");
    for (const auto& [process, bytes] :
         {std::pair("front", now.frontBytes.value_or(0)), std::pair("worker", _workerBytes)}) {
        if (bytes > 0) {
            text += fmt::format("adminhost_resident_memory_bytes{{process=\"{}\"}} {}\n", process, bytes);
        }
    }
    return text;
}

}  // namespace adminhost
