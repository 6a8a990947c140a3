#include "adminhostctl/CallerLanguages.h"

#include "platform/text/EnvironmentLanguages.h"

#include <algorithm>
#include <cstdlib>

namespace adminhost::ctl {
namespace {

std::string_view variable(const char* name) {
    const char* const text = std::getenv(name);
    return text == nullptr ? "" : text;
}

std::string_view locale() {
    for (const char* name : {"LC_ALL", "LC_MESSAGES", "LANG"}) {
        if (!variable(name).empty()) {
            return variable(name);
        }
    }
    return "";
}

}  // namespace

std::optional<std::vector<std::string>> callerLanguages() {
    if (locale().empty() && variable("LANGUAGE").empty()) {
        return std::nullopt;
    }
    if (locale() == "C" || locale() == "POSIX") {
        return std::vector<std::string>();
    }
    return languagesOfEnvironment();
}

std::vector<std::string> languagesOfText(std::string_view text) {
    std::vector<std::string> languages;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find(','), text.size());
        if (end > 0) {
            languages.emplace_back(text.substr(0, end));
        }
        text.remove_prefix(std::min(end + 1, text.size()));
    }
    return languages;
}

}  // namespace adminhost::ctl
