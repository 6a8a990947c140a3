#include "resources/CountStatement.h"

#include "platform/log/Log.h"
#include "platform/value/ValueText.h"
#include "settings/StatementBatch.h"

#include <cstdlib>

namespace lumio {

std::vector<std::uint64_t> rowCounts(const std::vector<CountStatement>& counts) {
    std::vector<std::string> statements;
    statements.reserve(counts.size());
    for (const CountStatement& count : counts) {
        statements.push_back(count.statement);
    }
    StatementBatch batch(std::move(statements));
    std::vector<std::uint64_t> numbers;
    numbers.reserve(counts.size());
    for (const CountStatement& count : counts) {
        const auto rows = batch.next();
        if (!rows) {
            adminhost::logEvent(count.onFailure + textOf(rows.error()));
        }
        const std::string* text = rows && !rows->empty() ? rows->back().get("count(*)").string() : nullptr;
        numbers.push_back(text == nullptr ? 0 : static_cast<std::uint64_t>(std::strtoll(text->c_str(), nullptr, 10)));
    }
    return numbers;
}

}  // namespace lumio
