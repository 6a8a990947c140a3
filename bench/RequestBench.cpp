// Reading through client, front, worker and tools against its floor: the tool runs alone.

#include "bench/Road.h"

namespace {

using namespace bench;

std::vector<Command> camerasFloor(const SampleRoot& root) {
    const std::string enabled = " from cameras where (disabled != 't' OR disabled is NULL)";
    std::vector<Command> floor{query(
        root,
        "select id,name,uuid,create_user_uuid,created_at,update_user_uuid,updated_at,last_recording_uuid,use_user_uuid,"
        "used_at,recording_status,access_control_enabled" +
            enabled)};
    std::istringstream ids(root.sql("select id" + enabled));
    for (std::string id; std::getline(ids, id);) {
        floor.push_back(query(
            root, "select record_uuid from access_control_entries where resource_type = 'Camera' and resource_id = '" +
                      id + "'"));
    }
    return floor;
}

/// The listing, and an access list for each workflow. The reading of bundles is not part of the floor.
std::vector<Command> workflowsFloor(const SampleRoot& root) {
    const std::string enabled = " from workflows where (disabled != 't' OR disabled is NULL)";
    std::vector<Command> floor{query(root, "select *" + enabled)};
    std::istringstream ids(root.sql("select id" + enabled));
    for (std::string id; std::getline(ids, id);) {
        floor.push_back(query(
            root,
            "select record_uuid from access_control_entries where resource_type = 'Workflow' and resource_id = '" + id +
                "'"));
    }
    return floor;
}

SampleSizes sizes(const benchmark::State& state) {
    SampleSizes sizes;
    sizes.cameras = static_cast<int>(state.range(0));
    sizes.accessEntries = 5;
    return sizes;
}

void getCameras(benchmark::State& state) {
    const SampleRoot root(sizes(state));
    const Daemon daemon(root);
    const std::vector<Command> floor = camerasFloor(root);
    compare(state, "getCameras", "{}", daemon, [&] { runAll(floor); });
}

void getWorkflows(benchmark::State& state) {
    SampleSizes sizes;
    sizes.workflows = static_cast<int>(state.range(0));
    sizes.accessEntries = 5;
    const SampleRoot root(sizes);
    const Daemon daemon(root);
    const std::vector<Command> floor = workflowsFloor(root);
    compare(state, "getWorkflows", R"({"optionalArguments": {"languages": ["de"]}})", daemon, [&] { runAll(floor); });
}

/// All of the settings with their revision: the setup script, cameras, properties, and the revision's one statement.
void readSettings(benchmark::State& state) {
    const SampleRoot root(sizes(state));
    const Daemon daemon(root);
    std::vector<Command> floor = camerasFloor(root);
    floor.insert(floor.begin(),
                 {root.disk("/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_preferences")});
    floor.push_back(query(root, "select * from properties;"));
    floor.push_back(
        query(root,
              "select 'camera', hex(uuid), hex(name), access_control_enabled, disabled from cameras union all "
              "select 'access', hex(record_uuid), hex(resource_type), resource_id, '' from "
              "access_control_entries order by 1,2,3,4,5"));
    compare(state, "readSettings", "{}", daemon, [&] { runAll(floor); });
}

BENCHMARK(getCameras)->Arg(1)->Arg(10)->Arg(100)->Arg(1000)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2);
BENCHMARK(getWorkflows)->Arg(10)->Arg(100)->Arg(1000)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2);
BENCHMARK(readSettings)->Arg(10)->Arg(100)->Arg(1000)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2);

}  // namespace

BENCHMARK_MAIN();
