#include "commands/CommandTable.h"

#include <algorithm>
#include <chrono>

namespace lumio {
namespace {

using adminhost::Value;

/// Builds the value that begins at the token, and moves to the token after it.
Value build(const DescriptionToken*& token) {
    const DescriptionToken& first = *token++;
    switch (first.kind) {
        case DescriptionToken::Kind::dictionary: {
            adminhost::Dictionary dictionary;
            for (std::int64_t i = 0; i < first.number; ++i) {
                const std::string_view key = token->key;
                dictionary.set(key, build(token));
            }
            return dictionary;
        }
        case DescriptionToken::Kind::list: {
            adminhost::Array array;
            for (std::int64_t i = 0; i < first.number; ++i) {
                array.push_back(build(token));
            }
            return array;
        }
        case DescriptionToken::Kind::integer:
            return first.number;
        case DescriptionToken::Kind::boolean:
            return first.number != 0;
        case DescriptionToken::Kind::date:
            return adminhost::Date(std::chrono::seconds(first.number));
        case DescriptionToken::Kind::text:
            break;
    }
    return first.text;
}

}  // namespace

Value describeCommands() {
    const DescriptionToken* token = descriptionTokens().data();
    return build(token);
}

const CommandDescription* findCommand(std::string_view name) noexcept {
    const auto all = commands();
    const auto found =
        std::find_if(all.begin(), all.end(), [&](const CommandDescription& c) { return c.name == name; });
    return found == all.end() ? nullptr : &*found;
}

}  // namespace lumio
