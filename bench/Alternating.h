#pragma once

// Times two pieces of work in turn in one benchmark, so that disturbances on the machine affect both equally.

#include <algorithm>
#include <ctime>
#include <vector>

#include <benchmark/benchmark.h>

namespace bench {

/// Wall time is for processes and waiting. Processor time, which other work on the machine disturbs less, is for
/// computing only.
enum class Clock { wall = CLOCK_MONOTONIC, processor = CLOCK_PROCESS_CPUTIME_ID };

inline double now(Clock clock) {
    timespec time{};
    ::clock_gettime(static_cast<clockid_t>(clock), &time);
    return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_nsec) * 1e-9;
}

template <typename Work>
double secondsOf(Clock clock, Work& work) {
    const double start = now(clock);
    work();
    return now(clock) - start;
}

inline double median(std::vector<double> values) {
    std::nth_element(values.begin(), values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2), values.end());
    return values[values.size() / 2];
}

/// Times ours and the floor in turn; the work between them is not timed. The counters are the medians in microseconds
/// and their ratio.
template <typename Ours, typename Floor, typename Between>
void alternate(benchmark::State& state, Clock clock, Ours ours, Floor floor, Between between) {
    std::vector<double> oursTimes;
    std::vector<double> floorTimes;
    while (state.KeepRunning()) {
        floorTimes.push_back(secondsOf(clock, floor));
        oursTimes.push_back(secondsOf(clock, ours));
        state.SetIterationTime(oursTimes.back());
        between();
    }
    state.counters["ours_us"] = median(oursTimes) * 1e6;
    state.counters["floor_us"] = median(floorTimes) * 1e6;
    state.counters["ratio"] = median(oursTimes) / median(floorTimes);
}

}  // namespace bench
