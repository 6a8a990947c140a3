#include "adminhostctl/lumio/People.h"

#include "adminhostctl/Connection.h"
#include "adminhostctl/Similar.h"

#include <algorithm>
#include <cctype>

namespace adminhost::ctl {
namespace {

/// Short names that begin as the name does: those that it may be a typo of.
std::vector<std::string> similarNames(const Context& context, const std::string& name) {
    std::vector<std::string> names;
    const Value answer = context.service.get("/v1/directory?match=" + Connection::escaped(name.substr(0, 1)));
    for (const Dictionary& entry :
         dictionariesOf(answer.dictionary() == nullptr ? Value() : answer.dictionary()->get("entries"))) {
        names.emplace_back(entry.text("shortName"));
    }
    return names;
}

}  // namespace

std::vector<Dictionary> dictionariesOf(const Value& list) {
    std::vector<Dictionary> all;
    for (const Value& element : list.array() == nullptr ? Array() : *list.array()) {
        if (element.dictionary() != nullptr) {
            all.push_back(*element.dictionary());
        }
    }
    return all;
}

std::vector<Dictionary> entriesNamed(const Context& context, const std::string& name) {
    if (name.empty()) {
        return {};  // the address without a text lists everybody
    }
    const Value answer = context.service.get("/v1/directory?is=" + Connection::escaped(name));
    return dictionariesOf(answer.dictionary() == nullptr ? Value() : answer.dictionary()->get("entries"));
}

Failure unknownName(const Context& context, const char* what, const std::string& name) {
    const bool isAscii = !name.empty() && static_cast<unsigned char>(name.front()) < 0x80;
    return usageError(std::string(what) + " not found: " + name +
                      (isAscii ? didYouMean(name, similarNames(context, name)) : std::string()));
}

Failure ambiguousName(const std::string& name, std::span<const Dictionary> entries) {
    std::string identities;
    for (const Dictionary& entry : entries) {
        identities.append("\n  ").append(entry.text("_id_")).append("  ").append(entry.text("node"));
    }
    return usageError("several have the name " + name + "; use one of these instead:" + identities);
}

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
