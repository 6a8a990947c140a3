// Writing all settings through client, front, worker and tools against its floor: the three script runs, the one
// statement of reading back, and three files written with the same flushes.

#include "bench/Road.h"

namespace {

using namespace bench;

constexpr const char* scripts = "/usr/share/sorvaneproducer/lumioserverd/script/";

/// Replaces a file durably: temporary file, flush, rename, flush of the directory.
void replace(const std::string& path, const std::string& bytes) {
    const std::string temporary = path + ".bench";
    const int file = ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    const bool written = ::write(file, bytes.data(), bytes.size()) == static_cast<ssize_t>(bytes.size());
    if (!written || ::fsync(file) != 0 || ::close(file) != 0 || ::rename(temporary.c_str(), path.c_str()) != 0) {
        throw std::runtime_error("cannot replace " + path);
    }
    const int directory = ::open(std::filesystem::path(path).parent_path().c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    ::fsync(directory);
    ::close(directory);
}

void writeSettings(benchmark::State& state) {
    const SampleRoot root;
    const Daemon daemon(root);
    // Every writable setting with its current value, so that all writes are the same.
    const std::string read = daemon.request("readSettings", R"({"optionalArguments":{"variant":"getConfig"}})");
    const std::string config = read.substr(read.find("\"configuration\":") + 16);
    const std::string body = R"({"optionalArguments":{"variant":"getConfig"},"configuration":)" +
                             config.substr(0, config.find(",\"properties\"")) + "}}";
    const std::string preferences = root.disk(std::string(scripts) + "setup_lumioserverd_preferences");
    const std::string library = root.disk(std::string(scripts) + "setup_lumioserverd_library");
    const std::vector<std::string> files = {root.identityPreferencesPath(), root.clusterPreferencesPath(),
                                            root.memberPreferencesPath()};
    compare(state, "writeSettings", body, daemon, [&] {
        runAll({{preferences}, {library}});
        for (const std::string& file : files) {
            replace(file + ".floor", std::string(2000, 'x'));
        }
        runAll({{preferences}, query(root, "select * from properties;")});
    });
}

BENCHMARK(writeSettings)->UseManualTime()->Unit(benchmark::kMillisecond)->MinTime(5);

}  // namespace

BENCHMARK_MAIN();
