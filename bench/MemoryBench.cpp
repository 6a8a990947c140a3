// Memory that a listing of many resources needs at its peak.
//
// "worker" and "front" are how much the peak of the process's resident memory during one listing is above its resident
// memory before, in bytes for each resource; "answer" is the size of the answer for each resource. The second argument
// is the number of entries of each access list.

#include "bench/Road.h"

#include <fstream>

namespace {

using namespace bench;

/// The value of a line of /proc/PID/status in bytes.
double statusOf(pid_t process, const std::string& key) {
    std::ifstream status("/proc/" + std::to_string(process) + "/status");
    for (std::string line; std::getline(status, line);) {
        if (line.starts_with(key + ':')) {
            return std::stod(line.substr(key.size() + 1)) * 1024;
        }
    }
    throw std::runtime_error("cannot read the memory of a process");
}

/// Makes the present resident memory the peak.
void resetPeak(pid_t process) {
    std::ofstream references("/proc/" + std::to_string(process) + "/clear_refs");
    references << "5" << std::flush;
    if (!references) {
        throw std::runtime_error("cannot reset the peak of a process");
    }
}

pid_t workerOf(const Daemon& daemon) {
    const std::string front = std::to_string(daemon.process());
    std::ifstream children("/proc/" + front + "/task/" + front + "/children");
    pid_t worker = 0;
    if (!(children >> worker)) {
        throw std::runtime_error("the daemon has no worker");
    }
    return worker;
}

void list(benchmark::State& state, const std::string& command, bool workflows) {
    const auto count = static_cast<int>(state.range(0));
    SampleSizes sizes;
    (workflows ? sizes.workflows : sizes.cameras) = count;
    sizes.accessEntries = static_cast<int>(state.range(1));
    const SampleRoot root(sizes);
    const Daemon daemon(root);
    benchmark::DoNotOptimize(daemon.request("getProperties", "{}"));  // loads what any listing needs
    const pid_t worker = workerOf(daemon);
    const std::array<pid_t, 2> processes{worker, daemon.process()};
    std::array<double, 2> peaks{};
    double answer = 0;
    while (state.KeepRunning()) {
        std::array<double, 2> before{};
        for (std::size_t i = 0; i < processes.size(); ++i) {
            resetPeak(processes[i]);
            before[i] = statusOf(processes[i], "VmRSS");
        }
        answer = static_cast<double>(daemon.request(command, "{}").size());
        for (std::size_t i = 0; i < processes.size(); ++i) {
            peaks[i] = statusOf(processes[i], "VmHWM") - before[i];
        }
    }
    state.counters["worker"] = peaks[0] / count;
    state.counters["front"] = peaks[1] / count;
    state.counters["answer"] = answer / count;
}

void getCameras(benchmark::State& state) {
    list(state, "getCameras", false);
}

void getWorkflows(benchmark::State& state) {
    list(state, "getWorkflows", true);
}

// One round each: later ones would begin with the memory that the first one has left.
BENCHMARK(getCameras)->Args({5000, 0})->Args({5000, 5})->Iterations(1)->Unit(benchmark::kMillisecond);
BENCHMARK(getWorkflows)->Args({5000, 0})->Args({5000, 5})->Iterations(1)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
