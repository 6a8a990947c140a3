// Listing 1000 properties, every fifth protected, against one bare run of the SQL tool with the same statement.

#include "handler/LumioRequestHandler.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"

#include <benchmark/benchmark.h>

namespace {

constexpr const char* statement = "select * from properties;";
constexpr int propertyCount = 1000;

/// The sample service, its properties replaced by the benchmark's: protected ones have two full lines and a part.
adminhost::test::SampleRoot& service() {
    static adminhost::test::SampleRoot root({0, 0, 0, 0, 0, 0});
    static const bool filled = [] {
        root.sql("with recursive n(i) as (select 1 union all select i+1 from n where i<" +
                 std::to_string(propertyCount) +
                 ") insert into properties(name,value,protect,created_at,updated_at) select 'property_'||i, "
                 "case i%5 when 0 then replace(hex(zeroblob(38)),'0','A')||char(10)||replace(hex(zeroblob(38)),'0','B')"
                 "||char(10)||'QUJD' else 'value number '||i end, case i%5 when 0 then 't' else 'f' end, "
                 "'2026-01-30 16:45:00','2026-01-30 16:45:00' from n");
        adminhost::setSystemRoot(root.path());
        return true;
    }();
    static_cast<void>(filled);
    return root;
}

void ListProperties(benchmark::State& state) {
    service();
    lumio::LumioRequestHandler handler;
    for (auto _ : state) {
        const adminhost::Response response = handler.getPropertiesWithRequest({});
        const adminhost::Array* list = response.dictionary().get("properties").array();
        if (list == nullptr || list->size() != propertyCount) {
            state.SkipWithError("the list is not whole");
            return;
        }
    }
}

void BareTool(benchmark::State& state) {
    const std::string database = service().databasePath();
    for (auto _ : state) {
        const auto result = adminhost::test::runProgram({"/usr/bin/sqlite3", "-line", database, statement});
        if (result.status != 0 || result.output.empty()) {
            state.SkipWithError("the tool failed");
            return;
        }
    }
}

BENCHMARK(ListProperties)->UseRealTime()->Unit(benchmark::kMicrosecond);
BENCHMARK(BareTool)->UseRealTime()->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
