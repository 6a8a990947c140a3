#pragma once

// What the benchmarks of the daemon share: its fixture plug-in, two requests, and the times that they take.

#include "tests/support/DaemonProcess.h"

#include <algorithm>
#include <chrono>
#include <string>
#include <string_view>
#include <vector>

#include <sys/socket.h>
#include <sys/un.h>

namespace bench {

inline constexpr std::string_view overviewRequest = "GET /v1/ HTTP/1.1\r\nHost: localhost\r\n\r\n";
inline constexpr std::string_view nothingRequest =
    "POST /v1/fixture/nothing HTTP/1.1\r\nHost: localhost\r\nContent-Length: 2\r\n\r\n{}";

inline sockaddr_un addressOf(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    return address;
}

inline adminhost::test::DaemonProcess::Options fixture() {
    adminhost::test::DaemonProcess::Options options;
    options.arguments = {"--plugin", std::string(FIXTURE_PLUGINS) + "/fixture_good.so"};
    return options;
}

inline double microsecondsOf(const auto& work) {
    const auto start = std::chrono::steady_clock::now();
    work();
    return std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - start).count();
}

inline double quantile(std::vector<double>& times, double share) {
    const auto at = times.begin() + static_cast<std::ptrdiff_t>(share * static_cast<double>(times.size() - 1));
    std::nth_element(times.begin(), at, times.end());
    return *at;
}

}  // namespace bench
