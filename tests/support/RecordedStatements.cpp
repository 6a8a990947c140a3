#include "tests/support/RecordedStatements.h"

#include <regex>

namespace adminhost::test {

std::vector<std::string> RecordedStatements::takeWithoutTimes() const {
    static const std::regex time("[0-9]{4}-[0-9]{2}-[0-9]{2} [0-9]{2}:[0-9]{2}:[0-9]{2}");
    std::vector<std::string> statements = take();
    for (std::string& statement : statements) {
        statement = std::regex_replace(statement, time, "NOW");
    }
    return statements;
}

}  // namespace adminhost::test
