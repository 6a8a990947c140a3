#include "adminhostctl/DirectoryNames.h"

#include "adminhostctl/Connection.h"
#include "adminhostctl/Similar.h"

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

std::string_view wordOfType(std::string_view type) noexcept {
    return type == "user" ? "person" : type;
}

Failure unknownName(const Context& context, std::string_view what, const std::string& name) {
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

}  // namespace adminhost::ctl
