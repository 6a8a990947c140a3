// A property list of 10 MB: parsing against expat alone (empty handlers), and against Python's plistlib.

#include "bench/Alternating.h"
#include "platform/plist/PropertyList.h"
#include "platform/task/Task.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

#include <expat.h>

namespace {

using namespace adminhost;

Value library() {
    Array cameras;
    for (int i = 0; i < 15000; ++i) {
        cameras.emplace_back(Dictionary{{"uuid", "6F9619FF-8B86-D011-B42D-00C04FC9" + std::to_string(10000 + i)},
                                        {"name", "Camera " + std::to_string(i) + " à l'étage & <roof>"},
                                        {"disabled", i % 7 == 0},
                                        {"created_at", Date(std::chrono::seconds(1'700'000'000 + i))},
                                        {"bit_rate", i * 1000},
                                        {"gain", i / 3.0},
                                        {"thumbnail", Data(60, static_cast<std::uint8_t>(i))},
                                        {"formats", Array{"mp4", "mov", i}}});
    }
    return Dictionary{{"cameras", std::move(cameras)}};
}

const std::string& text() {
    static const std::string list = xmlPropertyList(library()).value_or("");
    return list;
}

void parseWithExpatAlone(const std::string& list) {
    XML_Parser parser = ::XML_ParserCreate(nullptr);
    ::XML_SetElementHandler(
        parser, [](void*, const XML_Char*, const XML_Char**) {}, [](void*, const XML_Char*) {});
    ::XML_SetCharacterDataHandler(parser, [](void*, const XML_Char*, int) {});
    if (::XML_Parse(parser, list.data(), static_cast<int>(list.size()), XML_TRUE) != XML_STATUS_OK) {
        std::abort();
    }
    ::XML_ParserFree(parser);
}

/// The parsed value outlives the timing, because freeing it is not part of parsing.
Value parseOurs(const std::string& list) {
    auto value = parsePropertyList(list);
    if (!value) {
        std::abort();
    }
    return *std::move(value);
}

void ParseAgainstExpatAlone(benchmark::State& state) {
    Value value;
    bench::alternate(
        state, bench::Clock::processor, [&] { value = parseOurs(text()); }, [&] { parseWithExpatAlone(text()); },
        [&] { value = nullptr; });
    state.counters["bytes"] = static_cast<double>(text().size());
}

/// Runs Python once and returns the processor time of its parsing, without its start.
void ParseAgainstPlistlib(benchmark::State& state) {
    std::string place = std::filesystem::temp_directory_path() / "plistbench-XXXXXX";
    if (::mkdtemp(place.data()) == nullptr) {
        std::abort();
    }
    std::ofstream(place + "/list", std::ios::binary) << text();
    std::vector<double> ours;
    std::vector<double> theirs;
    while (state.KeepRunning()) {
        std::string seconds;
        const auto status = launch_task(DiskPath("/usr/bin/python3"),
                                        {"-c",
                                         "import plistlib, sys, time\nb = open(sys.argv[1], 'rb').read()\n"
                                         "t = time.process_time()\nplistlib.loads(b)\nprint(time.process_time() - t)",
                                         place + "/list"},
                                        &seconds, nullptr);
        if (status != 0) {
            std::abort();
        }
        theirs.push_back(std::stod(seconds));
        Value value;
        const auto work = [&] { value = parseOurs(text()); };
        ours.push_back(bench::secondsOf(bench::Clock::processor, work));
        state.SetIterationTime(ours.back());
    }
    std::filesystem::remove_all(place);
    state.counters["ours_us"] = bench::median(ours) * 1e6;
    state.counters["plistlib_us"] = bench::median(theirs) * 1e6;
    state.counters["times_faster"] = bench::median(theirs) / bench::median(ours);
}

void Write(benchmark::State& state) {
    const Value value = library();
    while (state.KeepRunning()) {
        auto written = xmlPropertyList(value);
        benchmark::DoNotOptimize(written);
    }
}

BENCHMARK(ParseAgainstExpatAlone)->UseManualTime()->Unit(benchmark::kMillisecond)->Iterations(15);
BENCHMARK(ParseAgainstPlistlib)->UseManualTime()->Unit(benchmark::kMillisecond)->Iterations(5);
BENCHMARK(Write)->Unit(benchmark::kMillisecond)->Iterations(10);

}  // namespace

BENCHMARK_MAIN();
