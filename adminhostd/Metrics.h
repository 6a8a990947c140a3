#pragma once

// The counters of the daemon, and their text in the exposition format 0.0.4 of Prometheus.

#include <array>
#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <tuple>
#include <utility>

namespace adminhost {

class Metrics {
  public:
    /// Combinations of command, status and code that are counted apart. Codes are the plug-ins' own: they must not
    /// fill the memory.
    static constexpr std::size_t seriesMaximum = 1000;
    /// Upper bounds of the durations, in seconds.
    static constexpr std::array durations{0.001, 0.005, 0.025, 0.1, 0.5, 2.5, 10.0, 60.0};

    /// What is not counted, but read when the text is asked for.
    struct Now {
        std::size_t waiting = 0;
        bool running = false;
        std::size_t queueLimit = 0;
        double deadlineSeconds = 0;
        std::size_t eventClients = 0;
        std::uint64_t workerStarts = 0;
        std::optional<std::uint64_t> frontBytes = {};  ///< resident
    };

    /// Names that are not known to a plug-in must be empty. The code is that of an error, or empty.
    void requestEnded(std::string_view plugin, std::string_view command, unsigned status, std::string_view code,
                      double seconds, bool checkOnly = false);
    /// Adds what a worker did for one request. `residentBytes` is its memory after that; 0: not known.
    void workDone(std::uint64_t toolRuns, std::uint64_t directoryLookups, std::uint64_t residentBytes) noexcept {
        _toolRuns += toolRuns;
        _directoryLookups += directoryLookups;
        _workerBytes = residentBytes;
    }

    [[nodiscard]] std::string text(const Now& now) const;

  private:
    using Name = std::tuple<std::string, std::string, bool>;  ///< plug-in, command, and whether only the check ran
    using Result = std::tuple<Name, unsigned, std::string>;   ///< also status and code
    struct Histogram {
        std::array<std::uint64_t, durations.size()> buckets{};  ///< not cumulated
        std::uint64_t count = 0;
        double sum = 0;
    };

    std::map<Result, std::uint64_t> _requests;
    std::map<Name, Histogram> _durations;
    std::uint64_t _toolRuns = 0;
    std::uint64_t _directoryLookups = 0;
    std::uint64_t _workerBytes = 0;
};

}  // namespace adminhost
