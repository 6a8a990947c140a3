// What the rights of the database tool cost: a run as the owner of the database, and confined, against the same run
// with the daemon's own rights. Only root can drop rights; for another account the first pair compares equal runs.

#include "bench/Alternating.h"
#include "settings/DatabaseAccess.h"
#include "settings/QueryRunner.h"
#include "settings/SettingsStore.h"
#include "tests/support/TemporaryRoot.h"

#include <cstdlib>
#include <filesystem>
#include <string>
#include <utility>

#include <unistd.h>

namespace {

using adminhost::TaskGroup;
using adminhost::TaskPlan;

constexpr const char* statement = "select a from t";
constexpr uid_t owner = 4711;

/// A root with a database whose owner is another account, if this process may give it away.
struct Database {
    adminhost::test::TemporaryRoot root;

    Database() {
        const std::string file = "/Library/SorvaneProducer/Shared/Server/db.sqlite3";
        root.sql(file, "create table t(a); insert into t values('x');");
        std::filesystem::permissions(root.path("/"), std::filesystem::perms(0755));
        for (const auto& path : {root.path(file), root.path(file).parent_path()}) {
            if (::geteuid() == 0 && ::chown(path.c_str(), owner, owner) != 0) {
                std::abort();
            }
        }
    }
};

void run(TaskPlan plan) {
    TaskGroup tool;
    auto result = tool.collect(tool.start(std::move(plan)));
    if (result.status != 0) {
        std::abort();
    }
    benchmark::DoNotOptimize(result.output);
}

/// A run with the daemon's own rights.
TaskPlan unprotected() {
    TaskPlan plan = lumio::planOf(statement);
    plan.rights.reset();
    plan.noNewPrivileges = false;
    plan.confinement = nullptr;
    plan.environment.erase("HOME");
    plan.environment.erase("SQLITE_TMPDIR");
    return plan;
}

/// The same run as the database's owner; the decision is part of it.
TaskPlan asOwner(TaskPlan plan) {
    const auto access = lumio::DatabaseAccess::of(lumio::SettingsStore::dbPath());
    plan.rights = access->account();
    plan.noNewPrivileges = true;
    return plan;
}

void droppedRights(benchmark::State& state) {
    const Database database;
    const TaskPlan bare = unprotected();
    bench::alternate(
        state, bench::Clock::wall, [&] { run(asOwner(bare)); }, [&] { run(bare); }, [] {});
}

void confinement(benchmark::State& state) {
    const Database database;
    const TaskPlan bare = unprotected();
    bench::alternate(
        state, bench::Clock::wall, [] { run(lumio::planOf(statement)); }, [&] { run(asOwner(bare)); }, [] {});
}

/// Deciding and building the confinement alone.
void decision(benchmark::State& state) {
    const Database database;
    for (auto _ : state) {
        auto plan = lumio::planOf(statement);
        benchmark::DoNotOptimize(plan);
    }
}

BENCHMARK(droppedRights)->UseManualTime()->Unit(benchmark::kMicrosecond)->Iterations(2000);
BENCHMARK(confinement)->UseManualTime()->Unit(benchmark::kMicrosecond)->Iterations(2000);
BENCHMARK(decision)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
