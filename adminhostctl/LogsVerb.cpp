#include "adminhostctl/LogsVerb.h"

#include "adminhostctl/Follow.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/Similar.h"
#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "platform/value/Value.h"

#include <algorithm>
#include <charconv>
#include <system_error>
#include <utility>
#include <vector>

namespace adminhost::ctl {
namespace {

constexpr std::size_t usualLines = 10;
constexpr std::uint64_t firstWindow = std::uint64_t{64} << 10U;    ///< bytes at the end that are looked through first
constexpr std::uint64_t largestWindow = std::uint64_t{64} << 20U;  ///< more is not held in memory
constexpr std::size_t longestLine = std::size_t{1} << 20U;         ///< a longer one is printed in parts

struct ServiceLog {
    std::string name;
    std::string plugin;
    std::string path;
    std::string problem;  ///< why it cannot be read; empty if it can
    std::uint64_t inode = 0;
    std::uint64_t size = 0;
    bool exists = false;
};

struct ReadPiece {
    std::uint64_t inode = 0;
    std::uint64_t next = 0;
    bool more = false;
    bool gap = false;
    std::string bytes;
};

std::uint64_t numberAt(const Dictionary& dictionary, std::string_view key) {
    return dictionary.get(key).unsignedInteger().value_or(0);
}

std::vector<ServiceLog> logsOf(const Value& answer) {
    std::vector<ServiceLog> logs;
    const Array* list = answer.dictionary() == nullptr ? nullptr : answer.dictionary()->get("logs").array();
    for (const Value& element : list == nullptr ? Array{} : *list) {
        const Dictionary* log = element.dictionary();
        if (log != nullptr) {
            logs.push_back({std::string(log->text("name")), std::string(log->text("plugin")),
                            std::string(log->text("path")), std::string(log->text("problem")), numberAt(*log, "inode"),
                            numberAt(*log, "size"), log->contains("inode")});
        }
    }
    if (logs.empty()) {
        throw Failure(ExitStatus::failed, "no plug-in of the daemon names a log file");
    }
    return logs;
}

std::vector<ServiceLog> selected(std::vector<ServiceLog> logs, const std::string& name) {
    std::string names;
    std::vector<std::string> known;
    std::vector<ServiceLog> found;
    for (ServiceLog& log : logs) {
        known.push_back(log.name);
        names += (names.empty() ? "" : ", ") + log.name;
        if (log.name == name || log.plugin + '/' + log.name == name) {
            found.push_back(std::move(log));
        }
    }
    if (found.empty()) {
        throw usageError("log not found: " + name + didYouMean(name, known) + "; the logs are " + names);
    }
    if (found.size() > 1) {
        throw usageError("several plug-ins have a log " + name + "; use " + found.front().plugin + '/' + name);
    }
    return found;
}

ReadPiece pieceOf(const Context& context, const ServiceLog& log, std::uint64_t inode, std::uint64_t offset) {
    const Value answer =
        context.service.get("/v1/logs/" + Connection::escaped(log.name) + "?plugin=" + Connection::escaped(log.plugin) +
                            "&inode=" + std::to_string(inode) + "&offset=" + std::to_string(offset));
    const Dictionary* said = answer.dictionary();
    const Data* data = said == nullptr ? nullptr : said->get("data").data();
    if (data == nullptr) {
        throw Failure(ExitStatus::failed, "the daemon's answer is not a piece of a log");
    }
    return {numberAt(*said, "inode"), numberAt(*said, "next"), said->get("more") == Value(true),
            said->get("gap") == Value(true), std::string(data->begin(), data->end())};
}

void reportGap(const Context& context, const ServiceLog& log) {
    context.err << "adminhostctl: " << shown(log.name)
                << ": lines may be missing here: the file was emptied or removed before they were read\n";
}

/// The end of a log, and where it goes on.
struct LogEnd {
    std::string text;
    std::uint64_t inode = 0;
    std::uint64_t next = 0;
};

/// The bytes from the offset to the end that the log had when it was listed.
LogEnd fromOffset(const Context& context, const ServiceLog& log, std::uint64_t offset) {
    LogEnd tail{{}, log.inode, offset};
    for (bool more = true; more && tail.next < log.size;) {
        ReadPiece piece = pieceOf(context, log, tail.inode, tail.next);
        if (piece.inode != tail.inode || piece.gap) {
            break;  // rotated or emptied meanwhile: what follows is read from there on
        }
        more = piece.more && !piece.bytes.empty();
        tail.text += piece.bytes;
        tail.next = piece.next;
    }
    return tail;
}

/// Where the last lines of a text begin.
std::size_t beginOfLast(const std::string& text, std::size_t lines) {
    std::size_t begin = text.ends_with('\n') ? text.size() - 1 : text.size();
    for (std::size_t count = 0; count < lines; ++count) {
        const std::size_t end = begin == 0 ? std::string::npos : text.rfind('\n', begin - 1);
        if (end == std::string::npos) {
            return 0;
        }
        begin = end;
    }
    return lines == 0 ? text.size() : begin + 1;
}

LogEnd tailOf(const Context& context, const ServiceLog& log, std::size_t lines) {
    if (lines == 0) {
        return {{}, log.inode, log.size};
    }
    for (std::uint64_t window = firstWindow;; window *= 8) {
        const std::uint64_t offset = log.size > window ? log.size - window : 0;
        LogEnd tail = fromOffset(context, log, offset);
        const std::size_t begin = beginOfLast(tail.text, lines);
        if (begin > 0 || offset == 0 || window >= largestWindow) {
            tail.text.erase(0, begin);
            return tail;
        }
    }
}

/// Prints a log's whole lines as they come.
class LinePrinter {
  public:
    explicit LinePrinter(const Context& context, bool several) : _context(context), _several(several) {}

    void add(const ServiceLog& log, std::string& unfinished, const std::string& bytes) {
        unfinished += bytes;
        const std::size_t end = unfinished.rfind('\n');
        const std::size_t whole = end != std::string::npos          ? end + 1
                                  : unfinished.size() > longestLine ? unfinished.size()
                                                                    : 0;
        if (whole > 0) {
            print(log, unfinished.substr(0, whole));
            unfinished.erase(0, whole);
        }
    }
    void print(const ServiceLog& log, const std::string& text) {
        if (_several && _last != log.name) {
            _context.out << (_last.empty() ? "" : "\n") << "==> " << shown(log.name) << " <==\n";
            _last = log.name;
        }
        _context.out << shown(text);
    }

  private:
    const Context& _context;
    bool _several;
    std::string _last;
};

/// A log that is followed.
struct Followed {
    ServiceLog log;
    std::uint64_t inode;
    std::uint64_t next;
    std::string unfinished;
};

/// Returns true if there is more to read at once.
bool readOn(const Context& context, LinePrinter& printer, Followed& followed) {
    const ReadPiece piece = pieceOf(context, followed.log, followed.inode, followed.next);
    if (piece.gap) {
        reportGap(context, followed.log);
    }
    if (piece.inode != followed.inode && !followed.unfinished.empty()) {
        printer.print(followed.log, followed.unfinished + '\n');
        followed.unfinished.clear();
    }
    followed.inode = piece.inode;
    followed.next = piece.next;
    printer.add(followed.log, followed.unfinished, piece.bytes);
    return piece.more;
}

void follow(const Context& context, LinePrinter& printer, std::vector<Followed>& all) {
    followUntilClosed(context, [&] {
        bool more = false;
        for (Followed& followed : all) {
            more = readOn(context, printer, followed) || more;
        }
        return more;
    });
}

void list(const Context& context, const std::vector<ServiceLog>& logs) {
    Table table({"log", "size", "file"});
    for (const ServiceLog& log : logs) {
        const std::string size = !log.problem.empty() ? "not readable"
                                 : log.exists         ? sizeText(log.size)
                                                      : "not written yet";
        table.addRow({shown(log.name), size, shown(log.problem.empty() ? log.path : log.problem)});
    }
    context.out << table.text(context.options.width, 0);
}

std::size_t linesOf(const Context& context) {
    if (!context.options.has(linesOption)) {
        return usualLines;
    }
    const std::string text = context.options.argumentOf(linesOption);
    std::size_t lines = 0;
    const auto [end, failure] = std::from_chars(text.data(), text.data() + text.size(), lines);
    if (failure != std::errc() || end != text.data() + text.size()) {
        throw usageError("--lines: \"" + text + "\" is not a number of lines");
    }
    return lines;
}

}  // namespace

ExitStatus logs(const Context& context, std::span<const std::string> arguments) {
    const bool follows = context.options.has(followOption);
    const bool onlyList = arguments.empty() && !follows && !context.options.has(linesOption);
    const std::size_t lines = linesOf(context);
    if (!onlyList && context.options.format != Format::text) {
        throw usageError("the lines of a log are printed as text only; without a name, the list has the other formats");
    }
    const Value answer = context.service.get("/v1/logs");
    std::vector<ServiceLog> all = logsOf(answer);
    if (onlyList) {
        if (context.options.names) {
            for (const ServiceLog& log : all) {
                context.out << shown(log.name) << '\n';
            }
        } else if (context.options.format == Format::text) {
            list(context, all);
        } else {
            writeValue(context, answer, Description());
        }
        return ExitStatus::done;
    }
    if (!arguments.empty()) {
        all = selected(std::move(all), arguments.front());
    }
    LinePrinter printer(context, all.size() > 1);
    std::vector<Followed> followed;
    ExitStatus status = ExitStatus::done;
    for (ServiceLog& log : all) {
        if (!log.problem.empty() || (!log.exists && !follows)) {
            context.err << "adminhostctl: " << shown(log.name) << ": "
                        << shown(log.problem.empty() ? log.path + " has not been written yet" : log.problem) << '\n';
            status = ExitStatus::failed;
            continue;
        }
        LogEnd tail = tailOf(context, log, lines);
        followed.push_back({std::move(log), tail.inode, tail.next, {}});
        printer.add(followed.back().log, followed.back().unfinished, tail.text);
    }
    if (follows && !followed.empty()) {
        context.out.flush();
        follow(context, printer, followed);
        return status;
    }
    for (const Followed& one : followed) {
        if (!one.unfinished.empty()) {
            printer.print(one.log, one.unfinished + '\n');
        }
    }
    return status;
}

}  // namespace adminhost::ctl
