#include "settings/StatementBatch.h"

#include "settings/SettingsStore.h"

#include <algorithm>
#include <chrono>
#include <thread>

#include <poll.h>

namespace lumio {

using adminhost::Dictionary;
using adminhost::TaskGroup;
using adminhost::TaskResult;

namespace {

constexpr std::size_t mostAtOnce = 8;
constexpr std::size_t mostUntaken = 64;  ///< results kept until their turn: each holds memory
/// SQLite's "database is locked". The last reader of a WAL database may get it when it closes the file; a statement
/// that runs by itself never gets it.
constexpr std::int32_t locked = 5;

}  // namespace

StatementBatch::StatementBatch(std::vector<std::string> statements, std::size_t atOnce)
    : _database(SettingsStore::dbPath()),
      _statements(std::move(statements)),
      _atOnce(atOnce != 0 ? atOnce : std::clamp<std::size_t>(std::thread::hardware_concurrency(), 1, mostAtOnce)) {
    _atOnce = std::min(_atOnce, std::max<std::size_t>(_statements.size(), 1));
    _tasks.reserve(_statements.size());
}

std::size_t StatementBatch::running() const {
    return static_cast<std::size_t>(
        std::count_if(_tasks.begin() + static_cast<std::ptrdiff_t>(std::min(_next, _tasks.size())), _tasks.end(),
                      [this](TaskGroup::Id task) { return !_group.ended(task); }));
}

void StatementBatch::startMore() {
    while (_tasks.size() < _statements.size() && _tasks.size() < _next + mostUntaken && running() < _atOnce) {
        _tasks.push_back(_group.start(planOf(_database, _statements[_tasks.size()])));
    }
}

void StatementBatch::serve() {
    std::vector<pollfd> entries;
    _group.addTo(entries);
    int milliseconds = -1;
    if (const auto due = _group.due()) {
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(*due - TaskGroup::Clock::now()).count();
        milliseconds = static_cast<int>(std::clamp<std::int64_t>(left, 0, 60'000));
    }
    static_cast<void>(::poll(entries.data(), entries.size(), milliseconds));
    _group.serve();
}

TaskResult StatementBatch::runAlone() {
    for (std::size_t i = _next + 1; i < _tasks.size(); ++i) {
        while (!_group.ended(_tasks[i])) {
            serve();
        }
    }
    return _group.collect(_group.start(planOf(_database, _statements[_next])));
}

adminhost::Result<std::vector<Dictionary>> StatementBatch::next() {
    startMore();
    while (!_group.ended(_tasks[_next])) {
        serve();
        startMore();
    }
    TaskResult result = _group.collect(_tasks[_next]);
    if (result.status == locked && _atOnce > 1) {
        result = runAlone();
    }
    ++_next;
    startMore();
    return rowsOf(std::move(result));
}

}  // namespace lumio
