#include "adminhostctl/lumio/People.h"

#include <algorithm>
#include <cctype>

namespace adminhost::ctl {

std::vector<std::string> shortNamesOf(const Context& context, std::span<const std::string> names, bool groups) {
    std::vector<std::string> shortNames;
    for (const std::string& name : names) {
        std::vector<Dictionary> wanted;
        bool isOther = false;
        for (const Dictionary& entry : entriesNamed(context, name)) {
            const bool fits = (entry.text("type") == "group") == groups;
            isOther = isOther || !fits;
            if (fits) {
                wanted.push_back(entry);
            }
        }
        if (wanted.empty() && isOther) {
            throw usageError(groups ? name + " is a person: leave out " + std::string(groupOption)
                                    : name + " is a group: add " + std::string(groupOption));
        }
        if (wanted.empty()) {
            throw unknownName(context, groups ? "group" : "person", name);
        }
        if (wanted.size() > 1) {
            throw ambiguousName(name, wanted);
        }
        shortNames.emplace_back(wanted.front().text("shortName"));
    }
    return shortNames;
}

bool isSameUuid(std::string_view a, std::string_view b) {
    return !a.empty() && std::equal(a.begin(), a.end(), b.begin(), b.end(), [](unsigned char x, unsigned char y) {
        return std::tolower(x) == std::tolower(y);
    });
}

}  // namespace adminhost::ctl
