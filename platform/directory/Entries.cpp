#include "platform/directory/Entries.h"

#include "platform/text/Uuid.h"

#include <set>
#include <sstream>
#include <tuple>
#include <utility>

namespace adminhost {
namespace {

using Match = DirectoryQuery::Match;

std::vector<std::string> entryAttributes() {
    return {std::string(directory::recordName), std::string(directory::realName), std::string(directory::generatedUID)};
}

/// The principal in the first authority of the kind Kerberos; null if there is none.
Value kerberosPrincipalIn(const DirectoryRecord& record) {
    constexpr std::size_t kindField = 1;
    constexpr std::size_t principalField = 3;
    for (const std::string& authority : record.values(directory::authenticationAuthority)) {
        std::vector<std::string> fields;
        std::istringstream text(authority);
        for (std::string field; std::getline(text, field, ';');) {
            fields.push_back(std::move(field));
        }
        if (fields.size() > kindField && fields[kindField] == "Kerberosv5") {
            return fields.size() > principalField && !fields[principalField].empty() ? Value(fields[principalField])
                                                                                     : Value();
        }
    }
    return {};
}

Dictionary entryWithNode(const DirectoryRecord& record) {
    Dictionary entry = directoryEntryOf(record);
    entry.set("node", record.node);
    entry.set("kerberosPrincipal", kerberosPrincipalIn(record));
    return entry;
}

Result<std::vector<DirectoryRecord>> find(std::string_view attribute, Match match, std::string_view value,
                                          std::size_t limit, std::vector<std::string> attributes = entryAttributes()) {
    DirectoryQuery query;
    query.recordTypes = {std::string(directory::users), std::string(directory::groups)};
    query.attribute = attribute;
    query.match = match;
    query.values = {std::string(value)};
    query.attributes = std::move(attributes);
    query.maximum = limit;
    return searchDirectory(query);
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

Result<Array> directoryEntries(std::string_view matchText, std::size_t limit) {
    Array entries;
    std::set<std::tuple<std::string, std::string, std::string>> seen;  // node, type, short name
    for (const std::string_view attribute : {directory::recordName, directory::realName}) {
        // The second query may find the same records again. It asks for as many as the limit, so the result still
        // reaches it.
        const auto records = find(attribute, Match::beginsWith, matchText, limit);
        if (!records) {
            return failure(records.error());
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

Result<Array> directoryEntriesOf(std::string_view nameOrUuid) {
    const auto attribute = uuidOf(nameOrUuid) ? directory::generatedUID : directory::recordName;
    std::vector<std::string> attributes = entryAttributes();
    attributes.emplace_back(directory::authenticationAuthority);
    const auto records = find(attribute, Match::equal, nameOrUuid, 0, std::move(attributes));
    if (!records) {
        return failure(records.error());
    }
    Array entries;
    for (const DirectoryRecord& record : *records) {
        entries.emplace_back(entryWithNode(record));
    }
    return entries;
}

Result<Array> directoryGroupsOf(std::string_view nameOrUuid) {
    DirectoryQuery query;
    query.recordTypes = {std::string(directory::users)};
    query.attribute = uuidOf(nameOrUuid) ? directory::generatedUID : directory::recordName;
    query.values = {std::string(nameOrUuid)};
    query.attributes = {std::string(directory::recordName), std::string(directory::primaryGroupID)};
    const auto people = searchDirectory(query);
    if (!people) {
        return failure(people.error());
    }
    Array entries;
    for (const DirectoryRecord& person : *people) {
        const auto node = DirectorySession::defaultSession().openNode(person.node);
        const auto groups = node ? (*node)->groupsOf(person, entryAttributes()) : failure(node.error());
        if (!groups) {
            return failure(groups.error());
        }
        for (const DirectoryRecord& group : *groups) {
            entries.emplace_back(entryWithNode(group));
        }
    }
    return entries;
}

}  // namespace adminhost
