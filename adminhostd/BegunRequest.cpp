#include "adminhostd/BegunRequest.h"

#include "adminhostd/Permissions.h"
#include "adminhostd/ReportForm.h"
#include "platform/files/CreateMissing.h"
#include "platform/files/File.h"
#include "platform/json/Json.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <optional>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr std::int64_t noteFormat = 1;
constexpr std::size_t notesMaximum = 1000;  ///< that are read
constexpr const char* interrupted = "its operation was interrupted";

DiskPath notesDirectory() {
    return diskPath(HostPath(std::string(BegunRequest::directory)));
}

/// Ids are chosen by the front, or are UUIDs. Nothing else names a file.
bool namesNote(std::string_view request) {
    constexpr std::string_view allowed = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789-";
    constexpr std::size_t longest = 64;
    return !request.empty() && request.size() <= longest &&
           request.find_first_not_of(allowed) == std::string_view::npos;
}

std::string noteOf(std::string_view request) {
    return notesDirectory().text() + '/' + std::string(request);
}

/// A note has the same words as permissions. One of another release counts as the most confined class.
Access accessOf(std::string_view word) {
    for (const Access access : {Access::read, Access::write, Access::control}) {
        if (word == nameOf(rightFor(access))) {
            return access;
        }
    }
    return Access::account;
}

std::uint32_t numberAt(const Dictionary& line, std::string_view key) {
    return static_cast<std::uint32_t>(line.get(key).unsignedInteger().value_or(0));
}

void read(const Dictionary& line, protocol::Unfinished& note) {
    note.request = line.text("request");
    note.plugin = line.text("plugin");
    note.command = line.text("command");
    note.access = accessOf(line.text("access"));
    note.caller = {numberAt(line, "uid"), static_cast<pid_t>(numberAt(line, "pid")), numberAt(line, "login"),
                   std::string(line.text("unit"))};
    note.user = line.text("user");
    note.loginUser = line.text("loginUser");
}

/// Whether the first line is that of a note of a later release.
bool isOfLaterRelease(const std::string& text) {
    const auto value = parseJson(std::string_view(text).substr(0, text.find('\n')));
    const Dictionary* line = value ? value->dictionary() : nullptr;
    return line != nullptr && line->get("format").integer().value_or(0) > noteFormat;
}

/// The note in a file; nullopt if it is not one of this format. Its last line may be incomplete.
std::optional<protocol::Unfinished> noteIn(const std::string& text) {
    protocol::Unfinished note;
    note.end = interrupted;
    bool first = true;
    for (std::size_t begin = 0, end = 0; (end = text.find('\n', begin)) != std::string::npos; begin = end + 1) {
        const auto value = parseJson(std::string_view(text).substr(begin, end - begin));
        const Dictionary* line = value ? value->dictionary() : nullptr;
        if (line == nullptr) {
            continue;
        }
        if (std::exchange(first, false)) {
            if (line->get("format") != Value(noteFormat)) {
                return std::nullopt;
            }
            read(*line, note);
        } else if (const Dictionary* change = line->get("change").dictionary()) {
            note.changes.push_back(changeOf(*change));
        } else if (const Dictionary* part = line->get("notDone").dictionary()) {
            note.notDone.push_back(notDoneOf(*part));
        } else if (const std::string* how = line->get("end").string()) {
            note.end = *how;
        }
    }
    return first ? std::nullopt : std::optional(std::move(note));
}

}  // namespace

BegunRequest::BegunRequest(const protocol::Unfinished& about, Redaction redaction) : _redaction(std::move(redaction)) {
    if (!namesNote(about.request)) {
        _problem = "the id of the request is not one";
        return;
    }
    const OwnerAndMode forUs{::geteuid(), ::getegid(), S_IRWXU};
    if (const auto created = createDirectories(notesDirectory(), forUs); !created) {
        _problem = fmt::format("{}: {}", notesDirectory().text(), textOf(created.error().description));
        return;
    }
    const std::string path = noteOf(about.request);
    _file = FileDescriptor(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_APPEND | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
    if (!_file.isOpen()) {
        _problem = fmt::format("{}: {}", path, std::generic_category().message(errno));
        return;
    }
    append({{"format", noteFormat},
            {"request", about.request},
            {"plugin", about.plugin},
            {"command", about.command},
            {"access", nameOf(rightFor(about.access))},
            {"uid", about.caller.uid},
            {"pid", about.caller.pid},
            {"login", about.caller.login},
            {"unit", _redaction.text(about.caller.unit)},
            {"user", about.user},
            {"loginUser", about.loginUser}});
    if (!_problem.empty()) {
        _problem = path + ": " + _problem;
    }
}

void BegunRequest::append(Dictionary line) {
    const std::string text = jsonOf(std::move(line)) + '\n';
    if (!_file.isOpen() || _bytes + text.size() > noteMaximum) {
        return;
    }
    // A line that is written in part is completed, so that the next one begins where a line begins.
    std::string_view left = text;
    while (!left.empty()) {
        const ssize_t written = ::write(_file.get(), left.data(), left.size());
        if (written < 0 && errno != EINTR) {
            _problem = std::generic_category().message(errno);
            _file.close();
            return;
        }
        left.remove_prefix(written < 0 ? 0 : static_cast<std::size_t>(written));
    }
    _bytes += text.size();
}

void BegunRequest::add(const Change& change) {
    append({{"change", _redaction.report(reportOf(change))}});
}

void BegunRequest::add(const NotDone& part) {
    append({{"notDone", _redaction.report(reportOf(part))}});
}

void BegunRequest::ended(std::string_view end) {
    append({{"end", end}});
}

BegunRequest::Left BegunRequest::left() {
    std::vector<std::pair<std::filesystem::file_time_type, std::string>> files;
    std::error_code failure;
    for (std::filesystem::directory_iterator entry(notesDirectory().text(), failure), end; !failure && entry != end;
         entry.increment(failure)) {
        std::error_code ignored;
        if (files.size() < notesMaximum && namesNote(entry->path().filename().string())) {
            files.emplace_back(entry->last_write_time(ignored), entry->path().string());
        }
    }
    std::sort(files.begin(), files.end());
    Left left;
    for (const auto& [time, file] : files) {
        const auto text = readFile(DiskPath(file), noteMaximum);
        auto note = text ? noteIn(*text) : std::nullopt;
        if (note && file == noteOf(note->request)) {
            left.notes.push_back(*std::move(note));
        } else if (text && isOfLaterRelease(*text)) {
            ++left.ofLaterRelease;
        } else {
            ::unlink(file.c_str());  // nothing can be learnt from it
        }
    }
    return left;
}

void BegunRequest::remove(std::string_view request) {
    if (namesNote(request)) {
        ::unlink(noteOf(request).c_str());
    }
}

}  // namespace adminhost
