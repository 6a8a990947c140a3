// Verbs of the command line that concern one setting, against one read of the settings by the same command line, on a
// service with many cameras. Both are timed in turn in one run; "ratio" shows what a verb adds to that read.

#include "bench/Road.h"

namespace {

using namespace bench;

class Ctl {
  public:
    explicit Ctl(int cameras) : _root(sizes(cameras)), _daemon(_root) {
        const auto build = std::filesystem::read_symlink("/proc/self/exe").parent_path().parent_path();
        _words = {build / "bin/adminhostctl", "--socket", _daemon.socket()};
    }
    void perform(const Command& words) const {
        Command command = _words;
        command.insert(command.end(), words.begin(), words.end());
        benchmark::DoNotOptimize(run(command));
    }
    void readSettings() const { perform({"--format", "json", "readSettings", "optionalArguments.variant=getConfig"}); }

  private:
    static SampleSizes sizes(int cameras) {
        SampleSizes sizes;
        sizes.cameras = cameras;
        sizes.accessEntries = 5;
        return sizes;
    }

    SampleRoot _root;
    Daemon _daemon;
    Command _words;
};

void settingsGet(benchmark::State& state) {
    const Ctl ctl(static_cast<int>(state.range(0)));
    alternate(
        state, Clock::wall,
        [&] {
            ctl.perform({"settings", "get", "server_port"});
        },
        [&] { ctl.readSettings(); }, [] {});
}

void settingsSet(benchmark::State& state) {
    const Ctl ctl(static_cast<int>(state.range(0)));
    int port = 8200;
    alternate(
        state, Clock::wall,
        [&] {
            ctl.perform({"settings", "set", "server_port", std::to_string(port++)});
        },
        [&] { ctl.readSettings(); }, [] {});
}

BENCHMARK(settingsGet)->Arg(1)->Arg(1000)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2);
BENCHMARK(settingsSet)->Arg(1)->Arg(1000)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(2);

}  // namespace

BENCHMARK_MAIN();
