#include "settings/StatementBatch.h"

#include "settings/SettingsStore.h"

#include <algorithm>
#include <thread>

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

TaskResult StatementBatch::runAlone() {
    for (std::size_t i = _next + 1; i < _tasks.size(); ++i) {
        while (!_group.ended(_tasks[i])) {
            _group.wait();
        }
    }
    return _group.collect(_group.start(planOf(_database, _statements[_next])));
}

adminhost::Result<std::vector<Dictionary>> StatementBatch::next() {
    startMore();
    while (!_group.ended(_tasks[_next])) {
        _group.wait();
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
