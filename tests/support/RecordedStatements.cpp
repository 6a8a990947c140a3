#include "tests/support/RecordedStatements.h"

#include <algorithm>
#include <string_view>

// Without std::regex, which takes longer to compile than all the rest of this program's support.

namespace adminhost::test {

std::vector<std::string> RecordedStatements::takeWithoutTimes() const {
    constexpr std::string_view time = "dddd-dd-dd dd:dd:dd";
    const auto fits = [](char c, char form) { return form == 'd' ? c >= '0' && c <= '9' : c == form; };
    std::vector<std::string> statements = take();
    for (std::string& statement : statements) {
        for (auto found = statement.begin();
             (found = std::search(found, statement.end(), time.begin(), time.end(), fits)) != statement.end();) {
            const auto at = found - statement.begin();
            statement.replace(found, found + static_cast<std::ptrdiff_t>(time.size()), "NOW");
            found = statement.begin() + at;
        }
    }
    return statements;
}

}  // namespace adminhost::test
