// What the rights of the database tool cost: a run as the owner of the database, and confined, against the same run
// with the daemon's own rights. Only root can drop rights; for another account the first pair compares equal runs.

#include "bench/Alternating.h"
#include "settings/DatabaseAccess.h"
#include "settings/QueryRunner.h"
#include "settings/SettingsStore.h"
#include "tests/support/TemporaryRoot.h"

#include <array>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <utility>

#include <sys/resource.h>
#include <unistd.h>

namespace {

using adminhost::TaskGroup;
using adminhost::TaskPlan;

constexpr const char* statement = "select a from t";
// An account of every machine: for a user id without an account, the tool asks every account source for its home.
constexpr uid_t owner = 1;

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

/// Processor time of this process and of the children that it has waited for.
double processorMicroseconds() {
    double sum = 0;
    for (const auto who : {RUSAGE_SELF, RUSAGE_CHILDREN}) {
        rusage usage{};
        ::getrusage(who, &usage);
        for (const timeval& time : {usage.ru_utime, usage.ru_stime}) {
            sum += static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_usec);
        }
    }
    return sum;
}

/// The means of the three runs in processor time of tool and daemon, which other work on the machine disturbs less.
void processorTime(benchmark::State& state) {
    const Database database;
    const TaskPlan bare = unprotected();
    std::array<double, 3> sums{};
    std::size_t runs = 0;
    const auto timed = [](double& sum, auto plan) {
        const double before = processorMicroseconds();
        run(plan());
        sum += processorMicroseconds() - before;
    };
    for (auto _ : state) {
        timed(sums[0], [&] { return bare; });
        timed(sums[1], [&] { return asOwner(bare); });
        timed(sums[2], [] { return lumio::planOf(statement); });
        ++runs;
    }
    state.counters["bare_us"] = sums[0] / static_cast<double>(runs);
    state.counters["owner_ratio"] = sums[1] / sums[0];
    state.counters["confinement_us"] = (sums[2] - sums[1]) / static_cast<double>(runs);
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
BENCHMARK(processorTime)->Unit(benchmark::kMicrosecond)->Iterations(2000);
BENCHMARK(decision)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
