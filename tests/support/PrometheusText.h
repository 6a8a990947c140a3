#pragma once

// A strict reader of the text exposition format 0.0.4 of Prometheus, for tests.
//
// It throws std::runtime_error for what a monitoring system may reject or misread: a sample before the TYPE line of its
// name, a name that occurs in two places, a sample that occurs twice, a histogram whose buckets do not increase or
// whose last one is not its count, names and labels with other characters, values that are not numbers, a missing line
// end.

#include <map>
#include <string>
#include <string_view>

namespace adminhost::test {

struct PrometheusText {
    using Labels = std::map<std::string, std::string>;

    std::map<std::string, std::string> types;  ///< by name
    std::map<std::string, std::map<Labels, double>>
        samples;  ///< by name (of a histogram also NAME_bucket and the like)

    /// The value of a sample; throws if there is none.
    [[nodiscard]] double at(const std::string& name, const Labels& labels = {}) const;
    /// The sum of the samples of this name that have these labels, perhaps among others.
    [[nodiscard]] double sum(const std::string& name, const Labels& labels = {}) const;
};

[[nodiscard]] PrometheusText parsePrometheusText(std::string_view text);

}  // namespace adminhost::test
