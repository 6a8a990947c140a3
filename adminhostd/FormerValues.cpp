#include "adminhostd/FormerValues.h"

#include "adminhostd/HistoryFiles.h"
#include "platform/value/ValueText.h"

namespace adminhost {

FormerValues::FormerValues(std::string_view plugin) : _resources(resourcesOf(historyDirectoryOf(plugin))) {}

void FormerValues::hide(const SecretPart& part) {
    if (!_plain) {
        // One reading for all changes of the operation: with all entries kept it takes a while.
        _plain.emplace();
        for (const std::uint64_t number : numbersIn(_resources)) {
            const auto entry = readDictionary(resourceEntryOf(_resources, number));
            const Array* changes = entry ? entry->get("changes").array() : nullptr;
            for (std::size_t i = 0; changes != nullptr && i < changes->size(); ++i) {
                const Dictionary* kept = (*changes)[i].dictionary();
                if (kept != nullptr && kept->get("secret") != Value(true)) {
                    (*_plain)[{textOf(kept->get("section")), textOf(kept->get("identity")), textOf(kept->get("key"))}]
                        .insert(number);
                }
            }
        }
    }
    const auto found = _plain->find({part.section, part.identity, part.key});
    if (part.identity.empty() || found == _plain->end()) {
        return;
    }
    for (const std::uint64_t number : found->second) {
        const HostPath file = resourceEntryOf(_resources, number);
        auto entry = readDictionary(file);
        Value* list = entry ? entry->find("changes") : nullptr;
        if (list != nullptr && list->array() != nullptr && hideIn(*list->array(), {part})) {
            static_cast<void>(replacePlainly(*entry, file));
        }
    }
    _plain->erase(found);
}

}  // namespace adminhost
