#include "resources/ToolWords.h"

#include "platform/text/Utf8.h"

namespace lumio {

std::string toolWords(std::string_view error, std::string_view output) {
    constexpr std::size_t maximum = 1000;
    std::string_view words = error.find_first_not_of(" \n") == std::string_view::npos ? output : error;
    words = words.substr(0, words.find_last_not_of(" \n") + 1);
    // A character that the bound would cut is left out.
    std::size_t length = std::min(words.size(), maximum);
    while (length < words.size() && length > 0 && adminhost::continuesCharacter(words[length])) {
        --length;
    }
    return adminhost::utf8Of(words.substr(0, length));
}

std::string toolWords(const adminhost::Error& error) {
    constexpr std::string_view prefix = "Can't execute sqlite3 query: ";
    std::string_view words = error.description ? std::string_view(*error.description) : std::string_view();
    words.remove_prefix(words.starts_with(prefix) ? prefix.size() : 0);
    return toolWords(words, {});
}

}  // namespace lumio
