// Listing 1000 properties, every fifth protected, against one bare run of the SQL tool with the same statement: by the
// handler alone, and through client, front and worker.

#include "bench/Road.h"
#include "handler/LumioRequestHandler.h"

namespace {

using namespace bench;

constexpr int propertyCount = 1000;

/// The sample service with the benchmark's properties in place of its own. Protected values have two full lines and a
/// shorter one.
const SampleRoot& service() {
    static const SampleRoot root({0, 0, 0, 0, 0, 0});
    static const bool filled = [] {
        root.sql("delete from properties; with recursive n(i) as (select 1 union all select i+1 from n where i<" +
                 std::to_string(propertyCount) +
                 ") insert into properties(name,value,protect,created_at,updated_at) select 'property_'||i, "
                 "case i%5 when 0 then replace(hex(zeroblob(38)),'0','A')||char(10)||replace(hex(zeroblob(38)),'0','B')"
                 "||char(10)||'QUJD' else 'value number '||i end, case i%5 when 0 then 't' else 'f' end, "
                 "'2026-01-30 16:45:00','2026-01-30 16:45:00' from n");
        return true;
    }();
    static_cast<void>(filled);
    return root;
}

Command bareTool() {
    return query(service(), "select * from properties;");
}

void ListProperties(benchmark::State& state) {
    adminhost::setSystemRoot(service().path());
    const Command tool = bareTool();
    lumio::LumioRequestHandler handler;
    adminhost::Response response = nullptr;
    alternate(
        state, bench::Clock::wall, [&] { response = handler.getPropertiesWithRequest({}); },
        [&] { benchmark::DoNotOptimize(run(tool)); },
        [&] {
            const adminhost::Array* list = response.dictionary().get("properties").array();
            if (list == nullptr || list->size() != propertyCount) {
                state.SkipWithError("the list is not whole");
            }
            response = nullptr;
        });
}

void RequestProperties(benchmark::State& state) {
    const Daemon daemon(service());
    const Command tool = bareTool();
    compare(state, "getProperties", "{}", daemon, [&] { benchmark::DoNotOptimize(run(tool)); });
}

BENCHMARK(ListProperties)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2);
BENCHMARK(RequestProperties)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2);

}  // namespace

BENCHMARK_MAIN();
