#include "adminhostctl/DirectoryNames.h"

#include "adminhostctl/Connection.h"
#include "adminhostctl/Similar.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <set>

namespace adminhost::ctl {
namespace {

/// Short names that the name, which is not empty, may be a typo of. The daemon does not return all of a large
/// directory: those that begin with the same letter are asked for, and those that begin as all of the name but its last
/// letter.
std::vector<std::string> similarNames(const Context& context, const std::string& name) {
    std::size_t first = 1;
    while (first < name.size() && continuesCharacter(name[first])) {
        ++first;
    }
    std::size_t last = name.size() - 1;
    while (last > first && continuesCharacter(name[last])) {
        --last;
    }
    std::vector<std::string> names;
    for (const std::size_t length : std::set{first, std::max(first, last)}) {
        for (const Dictionary& entry : entriesBeginning(context, name.substr(0, length))) {
            names.emplace_back(entry.text("shortName"));
        }
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

std::vector<Dictionary> entriesBeginning(const Context& context, const std::string& text) {
    const Value answer = context.service.get("/v1/directory?match=" + Connection::escaped(text));
    return dictionariesOf(answer.dictionary() == nullptr ? Value() : answer.dictionary()->get("entries"));
}

std::vector<Dictionary> entriesNamed(const Context& context, const std::string& name) {
    if (name.empty()) {
        return {};  // the address without a text lists everybody
    }
    const Value answer = context.service.get("/v1/directory?is=" + Connection::escaped(name));
    return dictionariesOf(answer.dictionary() == nullptr ? Value() : answer.dictionary()->get("entries"));
}

std::string_view wordOfType(std::string_view type) noexcept {
    return type == "user" ? "person" : type;
}

Failure unknownName(const Context& context, std::string_view what, const std::string& name) {
    constexpr std::size_t longest = 256;  // accounts have shorter names
    const bool mayBeTypo = !name.empty() && name.size() <= longest;
    return usageError(std::string(what) + " not found: " + name +
                      (mayBeTypo ? didYouMean(name, similarNames(context, name)) : std::string()));
}

Failure ambiguousName(const std::string& name, std::span<const Dictionary> entries) {
    std::string identities;
    for (const Dictionary& entry : entries) {
        identities.append("\n  ").append(entry.text("_id_")).append("  ").append(entry.text("node"));
    }
    return usageError("several have the name " + name + "; use one of these instead:" + identities);
}

}  // namespace adminhost::ctl
