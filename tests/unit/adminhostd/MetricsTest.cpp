#include "adminhostd/Metrics.h"
#include "adminhostd/OwnMemory.h"
#include "tests/support/PrometheusText.h"

#include <stdexcept>
#include <string>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

using test::parsePrometheusText;
using test::PrometheusText;

TEST(Metrics, RequestsAreCountedByCommandAndResult) {
    Metrics metrics;
    metrics.requestEnded("p", "read", 200, "", 0.002);
    metrics.requestEnded("p", "read", 200, "", 3.0);
    metrics.requestEnded("p", "read", 504, "DEADLINE_EXCEEDED", 300.0);
    metrics.requestEnded("p", "write", 200, "", 0.02);
    const PrometheusText text = parsePrometheusText(metrics.text({}));
    EXPECT_EQ(
        text.at("adminhost_requests_total", {{"plugin", "p"}, {"command", "read"}, {"status", "200"}, {"error", ""}}),
        2);
    EXPECT_EQ(text.at("adminhost_requests_total",
                      {{"plugin", "p"}, {"command", "read"}, {"status", "504"}, {"error", "DEADLINE_EXCEEDED"}}),
              1);
    const std::string bucket = "adminhost_request_duration_seconds_bucket";
    const auto read = [&](const std::string& bound) {
        return text.at(bucket, {{"plugin", "p"}, {"command", "read"}, {"le", bound}});
    };
    EXPECT_EQ(read("0.001"), 0);
    EXPECT_EQ(read("0.005"), 1);
    EXPECT_EQ(read("10"), 2);
    EXPECT_EQ(read("60"), 2);
    EXPECT_EQ(read("+Inf"), 3);
    EXPECT_DOUBLE_EQ(text.at("adminhost_request_duration_seconds_sum", {{"plugin", "p"}, {"command", "read"}}),
                     303.002);
}

TEST(Metrics, DurationOnABoundBelongsToItsBucket) {
    Metrics metrics;
    metrics.requestEnded("p", "c", 200, "", 0.1);
    const PrometheusText text = parsePrometheusText(metrics.text({}));
    EXPECT_EQ(text.at("adminhost_request_duration_seconds_bucket", {{"plugin", "p"}, {"command", "c"}, {"le", "0.1"}}),
              1);
    EXPECT_EQ(
        text.at("adminhost_request_duration_seconds_bucket", {{"plugin", "p"}, {"command", "c"}, {"le", "0.025"}}), 0);
}

TEST(Metrics, CodesWithSpecialCharactersAreEscaped) {
    Metrics metrics;
    const std::string code = "a\"b\\c\nd{}";
    metrics.requestEnded("p", "c", 500, code, 1);
    EXPECT_EQ(
        parsePrometheusText(metrics.text({}))
            .at("adminhost_requests_total", {{"plugin", "p"}, {"command", "c"}, {"status", "500"}, {"error", code}}),
        1);
}

TEST(Metrics, CodesWithoutEndAreCountedTogether) {
    Metrics metrics;
    for (std::size_t i = 0; i < 2 * Metrics::seriesMaximum; ++i) {
        metrics.requestEnded("p", "c", 500, std::to_string(i), 1);
    }
    const PrometheusText text = parsePrometheusText(metrics.text({}));
    EXPECT_LE(text.samples.at("adminhost_requests_total").size(), Metrics::seriesMaximum + 1);
    EXPECT_EQ(text.sum("adminhost_requests_total"), 2.0 * Metrics::seriesMaximum);
    EXPECT_EQ(text.sum("adminhost_requests_total", {{"command", "other"}}), 1.0 * Metrics::seriesMaximum);
}

TEST(Metrics, StateOfTheDaemonAndWorkOfTheWorkerAreThere) {
    Metrics metrics;
    metrics.workDone(3, 2, 8);
    metrics.workDone(1, 0, 7);
    const OwnMemory memory;
    const auto bytes = memory.bytes();
    ASSERT_TRUE(bytes);
    EXPECT_GT(*bytes, std::uint64_t{100'000});
    const PrometheusText text = parsePrometheusText(metrics.text({.waiting = 5,
                                                                  .running = true,
                                                                  .queueLimit = 64,
                                                                  .deadlineSeconds = 300,
                                                                  .eventClients = 2,
                                                                  .workerStarts = 3,
                                                                  .frontBytes = bytes}));
    EXPECT_EQ(text.at("adminhost_requests_waiting"), 5);
    EXPECT_EQ(text.at("adminhost_requests_running"), 1);
    EXPECT_EQ(text.at("adminhost_tool_runs_total"), 4);
    EXPECT_EQ(text.at("adminhost_directory_lookups_total"), 2);
    EXPECT_EQ(text.at("adminhost_worker_starts_total"), 3);
    EXPECT_EQ(text.at("adminhost_resident_memory_bytes", {{"process", "worker"}}), 7);
    EXPECT_EQ(text.at("adminhost_resident_memory_bytes", {{"process", "front"}}), static_cast<double>(*bytes));
    EXPECT_EQ(parsePrometheusText(Metrics().text({})).samples.count("adminhost_resident_memory_bytes"), 0U)
        << "what is not known is left out";
}

TEST(Metrics, StrictReaderRejectsWhatAMonitoringSystemMayMisread) {
    const std::string head = "# HELP a b\n# TYPE a gauge\n";
    EXPECT_EQ(parsePrometheusText(head + "a{x=\"\\\"\\n\"} 1\n").at("a", {{"x", "\"\n"}}), 1);
    for (const std::string& text :
         {std::string("a 1\n"), head + "a 1", head + "a 1\na 2\n", head + "a{x=\"1} 2\n",
          head + "a{x=\"1\",x=\"2\"} 2\n", head + "a one\n", head + "a nan\n", head + "b 1\n", head + "1a 1\n",
          head + head, head + "a{x=\"\\t\"} 1\n", std::string("# TYPE a gauge\na 1\n"), head + "\n",
          std::string(
              "# HELP h x\n# TYPE h histogram\nh_bucket{le=\"1\"} 2\nh_bucket{le=\"+Inf\"} 1\nh_sum 1\nh_count 1\n"),
          std::string("# HELP h x\n# TYPE h histogram\nh_bucket{le=\"+Inf\"} 1\nh_sum 1\nh_count 2\n")}) {
        EXPECT_THROW(static_cast<void>(parsePrometheusText(text)), std::runtime_error) << text;
    }
}

}  // namespace
}  // namespace adminhost
