#include "platform/text/EnvironmentLanguages.h"

#include <cstdlib>
#include <string_view>

namespace adminhost {

std::vector<std::string> languagesOfEnvironment() {
    std::vector<std::string> languages;
    for (const char* name : {"LANGUAGE", "LC_ALL", "LC_MESSAGES", "LANG"}) {
        const char* text = std::getenv(name);
        std::string_view left = text == nullptr ? "" : text;
        while (!left.empty()) {
            const std::size_t colon = left.find(':');
            std::string language(left.substr(0, colon));
            left.remove_prefix(colon == std::string_view::npos ? left.size() : colon + 1);
            if (const std::size_t dot = language.find('.'); dot != std::string::npos) {
                language.erase(dot, language.find('@', dot) - dot);
            }
            if (!language.empty() && language != "C" && language != "POSIX") {
                languages.push_back(std::move(language));
            }
        }
        if (text != nullptr && *text != '\0') {
            break;  // each variable overrides those after it, also with "C": then no language is preferred
        }
    }
    return languages;
}

}  // namespace adminhost
