#include "platform/directory/Entries.h"

#include "platform/text/Uuid.h"

#include <set>
#include <tuple>

namespace adminhost {
namespace {

using Match = DirectoryQuery::Match;

std::optional<std::vector<DirectoryRecord>> find(DirectoryNode& node, std::string_view attribute, Match match,
                                                 std::string_view value, std::size_t limit, Error* error) {
    DirectoryQuery query;
    query.recordTypes = {std::string(directory::users), std::string(directory::groups)};
    query.attribute = attribute;
    query.match = match;
    query.values = {std::string(value)};
    query.attributes = {std::string(directory::recordName), std::string(directory::realName),
                        std::string(directory::generatedUID)};
    query.maximum = limit;
    return node.records(query, error);
}

}  // namespace

Dictionary directoryEntryOf(const DirectoryRecord& record) {
    const auto valueOf = [&](std::string_view attribute) {
        const std::string* text = record.first(attribute);
        return text == nullptr ? Value() : Value(*text);
    };
    Dictionary entry;
    entry.set("shortName", valueOf(directory::recordName));
    entry.set("longName",
              valueOf(record.values(directory::realName).empty() ? directory::recordName : directory::realName));
    entry.set("guid", valueOf(directory::generatedUID));
    entry.set("_id_", valueOf(directory::generatedUID));
    entry.set("type", record.type == directory::users ? "user" : "group");
    return entry;
}

std::optional<Array> directoryEntries(std::string_view matchText, std::size_t limit, Error* error) {
    const auto node = DirectorySession::defaultSession().openNode(DirectorySession::authenticationSearchNode, error);
    if (!node) {
        return std::nullopt;
    }
    Array entries;
    std::set<std::tuple<std::string, std::string, std::string>> seen;  // node, type, short name
    for (const std::string_view attribute : {directory::recordName, directory::realName}) {
        // The second query may find the same records again. It asks for as many as the limit, so the result still
        // reaches it.
        const auto records = find(*node, attribute, Match::beginsWith, matchText, limit, error);
        if (!records) {
            return std::nullopt;
        }
        for (const DirectoryRecord& record : *records) {
            const std::string* name = record.first(directory::recordName);
            if (limit != 0 && entries.size() == limit) {
                return entries;
            }
            if (name != nullptr && seen.emplace(record.node, record.type, *name).second) {
                entries.emplace_back(directoryEntryOf(record));
            }
        }
    }
    return entries;
}

std::optional<Array> directoryEntriesOf(std::string_view nameOrUuid, Error* error) {
    const auto node = DirectorySession::defaultSession().openNode(DirectorySession::authenticationSearchNode, error);
    if (!node) {
        return std::nullopt;
    }
    const auto attribute = uuidOf(nameOrUuid) ? directory::generatedUID : directory::recordName;
    const auto records = find(*node, attribute, Match::equal, nameOrUuid, 0, error);
    if (!records) {
        return std::nullopt;
    }
    Array entries;
    for (const DirectoryRecord& record : *records) {
        Dictionary entry = directoryEntryOf(record);
        entry.set("node", record.node);
        entries.emplace_back(std::move(entry));
    }
    return entries;
}

}  // namespace adminhost
