#include "platform/text/LineAndColumn.h"

#include "platform/text/Utf8.h"

#include <algorithm>

#include <fmt/format.h>

namespace adminhost {

std::string lineAndColumnAfter(std::string_view text) {
    const auto lines = std::count(text.begin(), text.end(), '\n');
    const std::string_view lastLine = text.substr(text.rfind('\n') + 1);  // npos + 1 is 0
    const auto continuing = std::count_if(lastLine.begin(), lastLine.end(), continuesCharacter);
    return fmt::format("line {}, column {}", lines + 1, lastLine.size() - static_cast<std::size_t>(continuing) + 1);
}

}  // namespace adminhost
