// The operations of a resource that concern who may use it.

#include "platform/directory/Entries.h"
#include "platform/directory/Membership.h"
#include "platform/framework/Report.h"
#include "platform/log/Log.h"
#include "platform/task/Task.h"
#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"
#include "resources/Resource.h"
#include "resources/ToolWords.h"
#include "settings/StatementBatch.h"

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <unordered_set>

namespace lumio {

namespace directory = adminhost::directory;
using adminhost::Array;
using adminhost::Dictionary;
using adminhost::Error;
using adminhost::Result;
using adminhost::Value;

namespace {

std::string lowerCase(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(), [](unsigned char c) { return std::tolower(c); });
    return text;
}

/// "camera" -> "Camera", the form in which access rows name a type.
std::string capitalised(std::string_view word) {
    std::string text(word);
    if (!text.empty()) {
        text.front() = static_cast<char>(std::toupper(static_cast<unsigned char>(text.front())));
    }
    return text;
}

bool isType(const Value& type, std::string_view word) {
    return type.string() != nullptr && lowerCase(*type.string()) == word;
}

/// Keeps the first entry of each UUID; entries without one are dropped.
void dropDuplicates(std::vector<Dictionary>& entries) {
    std::unordered_set<std::string> seen;
    std::erase_if(entries, [&](const Dictionary& entry) {
        const std::string* guid = entry.get("guid").string();
        return guid == nullptr || !seen.insert(lowerCase(*guid)).second;
    });
}

/// A name of a change of an access list, and where its entry is in the list.
struct Named {
    std::string name;
    std::size_t index = 0;
};

struct Names {
    std::vector<Named> users;
    std::vector<Named> groups;
};

/// Appends the login or group name of a UUID text; returns false if it has none. Fails if the directory fails.
Result<bool> appendNameOf(const Value& uuidText, std::size_t index, Names& names) {
    const auto uuid = uuidText.string() == nullptr ? std::nullopt : adminhost::mbr_string_to_uuid(*uuidText.string());
    if (!uuid) {
        return false;
    }
    const auto id = adminhost::mbr_uuid_to_id(*uuid);
    if (!id) {
        return adminhost::failure(id.error());
    }
    if (!*id) {
        return false;
    }
    const auto name = adminhost::nameOf(**id);
    if (!name) {
        return adminhost::failure(name.error());
    }
    if (!*name || (*name)->empty()) {
        return false;
    }
    const bool isUser = (*id)->kind == adminhost::PosixId::Kind::user;
    (isUser ? names.users : names.groups).push_back({**name, index});
    return true;
}

std::string pathOf(std::size_t index) {
    return "allowedUsersAndGroups." + std::to_string(index);
}

/// The UUID of the only user or group of that name; null if the directory fails or does not have exactly one.
Value uuidOf(const std::string& name, std::string_view kind) {
    const auto entries = adminhost::directoryEntriesOf(name);
    Value uuid;
    for (const Value& element : entries.value_or(Array())) {
        const Dictionary& entry = *element.dictionary();
        if (entry.get("type") == Value(kind) && entry.get("shortName") == Value(name)) {
            if (!uuid.isNull()) {
                return nullptr;
            }
            uuid = entry.get("_id_");
        }
    }
    return uuid;
}

Value elementAt(const Array& array, std::size_t index) {
    return index < array.size() ? array[index] : Value();
}

}  // namespace

bool Resource::aclEnabled() {
    if (_data) {
        _aclEnabled = booleanOf(_data->get("access_control_enabled"));
    }
    return _aclEnabled;
}

void Resource::setACLEnabled(bool enabled) {
    constexpr const char* key = "access_control_enabled";
    const std::optional<std::string> uuid = statementGuid();
    if (!uuid) {
        reportNotDone(key, "not changed: the entry has no \"_id_\"");
        return;
    }
    std::optional<Error> error;
    (void)querySorvaneDatabase<Dictionary>(std::string("update ").append(resourceType()) +
                                               "s set access_control_enabled=\"" + (enabled ? "t" : "f") +
                                               "\" where uuid=\"" + *uuid + "\"",
                                           error);
    if (error) {
        reportNotDone(key, "not changed: the database refused it", toolWords(*error));
        return;
    }
    _aclEnabled = enabled;
    const Value before = _data && _data->contains(key) ? Value(booleanOf(_data->get(key))) : Value();
    if (before != Value(enabled)) {
        // Without the record, the statement succeeds also if no row has the uuid.
        reportChange(*uuid, key, before, enabled, {{key, !enabled}}, !_data);
    }
}

std::string Resource::accessListStatement() const {
    return "select record_uuid from access_control_entries where resource_type = '" + capitalised(resourceType()) +
           "' and resource_id = '" + adminhost::textOf(rowId()) + "'";
}

std::vector<std::string> Resource::uuidsIn(const adminhost::Result<std::vector<Dictionary>>& rows) const {
    logUnusableId();
    if (!rows) {
        adminhost::logEvent("getUserAndGroupACLs SQL query returned error: " + textOf(rows.error()));
        // The response shows an empty list: without a report, a client would believe that it is one.
        adminhost::reportNotDone({"", "not read: the access list", toolWords(rows.error())});
        return {};
    }
    std::vector<std::string> uuids;
    for (const Dictionary& row : *rows) {
        if (const Value* uuid = row.find("record_uuid")) {
            uuids.push_back(textOf(*uuid));
        }
    }
    return uuids;
}

std::vector<std::string> Resource::getUserAndGroupACLs() {
    return uuidsIn(runStatement(accessListStatement()));
}

std::vector<Dictionary> Resource::getDirectoryDetailsForUUIDs(const std::vector<std::string>& uuids,
                                                              std::optional<std::string_view> recordType) {
    adminhost::DirectoryQuery query;
    if (recordType) {
        query.recordTypes = {std::string(*recordType)};
    } else {
        query.recordTypes = {std::string(directory::users), std::string(directory::groups)};
    }
    query.attribute = directory::generatedUID;
    query.values = uuids;
    query.attributes = {std::string(directory::recordName), std::string(directory::realName),
                        std::string(directory::generatedUID)};
    const auto records = adminhost::searchDirectory(query);
    if (!records) {
        std::printf("Tarn query error for users: %s\n", records.error().description.value_or("").c_str());
        std::fflush(stdout);
        return {};
    }
    std::vector<Dictionary> entries;
    entries.reserve(records->size());
    for (const adminhost::DirectoryRecord& record : *records) {
        entries.push_back(adminhost::directoryEntryOf(record));
    }
    return entries;
}

std::vector<Dictionary> Resource::getUserDetailsForUUIDs(const std::vector<std::string>& uuids) {
    return getDirectoryDetailsForUUIDs(uuids, directory::users);
}

std::vector<Dictionary> Resource::getGroupDetailsForUUIDs(const std::vector<std::string>& uuids) {
    return getDirectoryDetailsForUUIDs(uuids, directory::groups);
}

void Resource::expandACLs() {
    expandColumns();
    expandList(getUserAndGroupACLs());
}

void Resource::expandAll(const std::vector<Resource*>& resources) {
    std::vector<std::string> statements;
    statements.reserve(resources.size());
    for (const Resource* resource : resources) {
        statements.push_back(resource->accessListStatement());
    }
    // The tools run ahead while the directory is asked; everything else happens in the order of the resources.
    StatementBatch batch(std::move(statements));
    for (Resource* resource : resources) {
        resource->expandColumns();
        resource->expandList(resource->uuidsIn(batch.next()));
    }
}

void Resource::expandColumns() {
    if (!_data) {
        return;
    }
    const std::string* user = _data->get("use_user_uuid").string();
    if (user != nullptr && !user->empty()) {
        const std::vector<Dictionary> entries = getUserDetailsForUUIDs({*user});
        if (!entries.empty()) {
            const Dictionary& last = entries.back();
            _data->set("useUser", last.get(last.contains("longName") ? "longName" : "shortName"));
        }
    }
    _data->set("access_control_enabled", _data->get("access_control_enabled") == Value("t"));
}

void Resource::expandList(const std::vector<std::string>& uuids) {
    std::vector<Dictionary> entries;
    if (!uuids.empty()) {
        entries = getDirectoryDetailsForUUIDs(uuids);
        // More records than UUIDs means that some UUID was found in several places.
        if (entries.size() > uuids.size()) {
            dropDuplicates(entries);
        }
    }
    setAllowed(Array(std::make_move_iterator(entries.begin()), std::make_move_iterator(entries.end())));
}

void Resource::setAllowed(Array entries) {
    _aclsAreExpanded = true;
    if (_data) {
        _data->set("allowedUsersAndGroups", std::move(entries));
    }
}

void Resource::changeACLsWithRequest(const Array* entries) {
    if (entries == nullptr || entries->empty()) {
        return;
    }
    Names toAdd;
    Names toRemove;
    for (std::size_t index = 0; index < entries->size(); ++index) {
        const Dictionary* entry = (*entries)[index].dictionary();
        if (entry == nullptr) {
            reportNotDone(pathOf(index), "ignored: the entry is not a dictionary");
            continue;
        }
        if (booleanOf(entry->get("_newid_"))) {
            const bool isUser = isType(entry->get("type"), "user");
            if (!isUser && !isType(entry->get("type"), "group")) {
                reportNotDone(pathOf(index), "ignored: \"type\" is neither \"user\" nor \"group\"");
                continue;  // and not tried as a removal
            }
            const Value* name = entry->find("shortName");
            if (name == nullptr) {
                reportNotDone(pathOf(index), "not added: the entry has no \"shortName\"");
                reportNotDone("allowedUsersAndGroups", "not changed: one of the entries has no \"shortName\"");
                return;
            }
            (isUser ? toAdd.users : toAdd.groups).push_back({textOf(*name), index});
        } else if (booleanOf(entry->get("_obsoleteid_"))) {
            const auto appended = appendNameOf(entry->get("_id_"), index, toRemove);
            if (!appended) {
                reportNotDone(pathOf(index), "not removed: the directory failed",
                              appended.error().description.value_or(""));
            } else if (!*appended) {
                reportNotDone(pathOf(index),
                              "not removed: the directory has no user or group with this UUID and a numeric id");
            }
        }
    }
    const std::optional<std::string> uuid = statementGuid();
    if (!uuid) {
        reportNotDone("allowedUsersAndGroups", "not changed: the entry has no \"_id_\"");
        return;
    }
    const auto run = [&](const char* command, const char* kind, const std::vector<Named>& names) {
        std::vector<std::string> shortNames;
        for (const Named& named : names) {
            shortNames.push_back(named.name);
        }
        const auto error = _executeLumioConfigWithCommand(command, resourceType(), *uuid, kind, shortNames);
        const bool adds = std::string_view(command) == "--add_access";
        for (const Named& named : names) {
            if (error) {
                reportNotDone(pathOf(named.index),
                              std::string(adds ? "not added" : "not removed") +
                                  ": the configuration tool failed with status " + std::to_string(error->code),
                              error->description.value_or(""));
                continue;
            }
            Dictionary undo;
            if (!adds) {
                undo = {{"type", kind}, {"shortName", named.name}, {"_newid_", true}};
            } else if (Value person = uuidOf(named.name, kind); !person.isNull()) {
                undo = {{"_id_", std::move(person)}, {"_obsoleteid_", true}};
            }
            const Value name = adminhost::utf8Of(named.name);
            reportChange(*uuid, std::string(kind) + "s", adds ? Value() : name, adds ? name : Value(),
                         undo.empty() ? Dictionary() : Dictionary{{"allowedUsersAndGroups", Array{std::move(undo)}}});
        }
    };
    run("--add_access", "user", toAdd.users);
    run("--add_access", "group", toAdd.groups);
    run("--remove_access", "user", toRemove.users);
    run("--remove_access", "group", toRemove.groups);
}

std::optional<Error> Resource::_executeLumioConfigWithCommand(std::string_view command, std::string_view resourceType,
                                                              std::string_view resourceID, std::string_view recordType,
                                                              const std::vector<std::string>& shortNames) {
    if (shortNames.empty()) {
        return std::nullopt;
    }
    std::vector<std::string> arguments;
    for (const std::string_view word :
         {command, std::string_view("--resource_type"), resourceType, std::string_view("--resource_uuid"), resourceID,
          std::string_view("--record_type"), recordType}) {
        arguments.emplace_back(word);
    }
    for (const std::string& name : shortNames) {
        arguments.emplace_back("--shortname");
        arguments.push_back(name);
    }
    static const adminhost::HostPath tool("/usr/bin/lumioconfig");
    std::string output;
    std::string words;
    const std::int32_t status = adminhost::launch_task(adminhost::diskPath(tool), arguments, &output, &words);
    return status == 0 ? std::nullopt : std::optional(Error{"adminhost_lumio", status, toolWords(words, output)});
}

Array Resource::allowedUsers() const {
    Array users;
    const Array* entries = _data ? _data->get("allowedUsersAndGroups").array() : nullptr;
    if (entries != nullptr) {
        std::copy_if(entries->begin(), entries->end(), std::back_inserter(users), [](const Value& entry) {
            return entry.dictionary() != nullptr && entry.dictionary()->get("type") == Value("user");
        });
    }
    return users;
}

Array Resource::allowedGroups() const {
    return allowedUsers();
}

Value Resource::objectInAllowedUsersAtIndex(std::size_t index) const {
    return elementAt(allowedUsers(), index);
}
Value Resource::objectInAllowedGroupsAtIndex(std::size_t index) const {
    return elementAt(allowedGroups(), index);
}

}  // namespace lumio
