#include "resources/AccessOverview.h"

#include "platform/directory/Entries.h"
#include "platform/framework/Report.h"
#include "platform/text/Hex.h"
#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"
#include "resources/Camera.h"
#include "resources/Workflow.h"
#include "settings/SettingsStore.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <map>
#include <memory>
#include <set>

namespace lumio {

namespace directory = adminhost::directory;
using adminhost::Array;
using adminhost::Dictionary;
using adminhost::DictionaryEntry;
using adminhost::Error;
using adminhost::failure;
using adminhost::Result;
using adminhost::Value;

namespace {

/// Texts are selected as hexadecimal digits: a line feed in one would look like another row.
constexpr std::string_view cameraRows =
    "select id, hex(uuid) as uuid, hex(name) as name, access_control_enabled = 't' as restricted, disabled = 't' as "
    "disabled from cameras order by id";
constexpr std::string_view workflowRows =
    "select id, hex(uuid) as uuid, hex(bundle_path) as bundle, access_control_enabled = 't' as restricted, disabled = "
    "'t' as disabled from workflows order by id";
constexpr std::string_view accessRows =
    "select hex(record_uuid) as uuid, hex(resource_type) as type, resource_id as id from access_control_entries";

std::string upperCase(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(), [](unsigned char c) { return std::toupper(c); });
    return text;
}

std::string plainText(const Dictionary& row, std::string_view column) {
    return adminhost::utf8Of(adminhost::textOfHex(row.text(column)).value_or(""));
}

/// Only these are safe as a tool's argument.
bool isIdentifier(const std::string& uuid) {
    return !uuid.empty() && uuid.front() != '-' &&
           std::all_of(uuid.begin(), uuid.end(), [](unsigned char c) { return std::isalnum(c) != 0 || c == '-'; });
}

/// UUIDs of access lists by "TYPE ID", each once, in the order of the rows.
using Lists = std::map<std::string, std::vector<std::string>>;

struct Rows {
    std::vector<Dictionary> cameras;
    std::vector<Dictionary> workflows;
    Lists lists;
};

Result<Lists> accessLists() {
    auto rows = runStatement(std::string(accessRows));
    if (!rows) {
        return failure(std::move(rows.error()));
    }
    Lists lists;
    for (const Dictionary& row : *rows) {
        std::vector<std::string>& list = lists[plainText(row, "type") + ' ' + std::string(row.text("id"))];
        std::string uuid = plainText(row, "uuid");
        if (std::find(list.begin(), list.end(), uuid) == list.end()) {
            list.push_back(std::move(uuid));
        }
    }
    return lists;
}

Result<Rows> allRows() {
    auto cameras = runStatement(std::string(cameraRows));
    if (!cameras) {
        return failure(std::move(cameras.error()));
    }
    auto workflows = runStatement(std::string(workflowRows));
    if (!workflows) {
        return failure(std::move(workflows.error()));
    }
    auto lists = accessLists();
    if (!lists) {
        return failure(std::move(lists.error()));
    }
    return Rows{*std::move(cameras), *std::move(workflows), *std::move(lists)};
}

/// The directory's entries by their UUIDs in upper case, the first one of each.
Result<std::map<std::string, Dictionary>> accountsOf(const std::set<std::string>& uuids) {
    std::map<std::string, Dictionary> accounts;
    if (uuids.empty()) {
        return accounts;
    }
    adminhost::DirectoryQuery query;
    query.recordTypes = {std::string(directory::users), std::string(directory::groups)};
    query.attribute = directory::generatedUID;
    query.values.assign(uuids.begin(), uuids.end());
    query.attributes = {std::string(directory::recordName), std::string(directory::realName),
                        std::string(directory::generatedUID)};
    auto records = adminhost::searchDirectory(query);
    if (!records) {
        return failure(std::move(records.error()));
    }
    for (const adminhost::DirectoryRecord& record : *records) {
        Dictionary entry = adminhost::directoryEntryOf(record);
        std::string uuid = upperCase(std::string(entry.text("guid")));
        accounts.emplace(std::move(uuid), std::move(entry));
    }
    return accounts;
}

Array peopleOf(const std::vector<std::string>& uuids, const std::map<std::string, Dictionary>& accounts) {
    Array people;
    for (const std::string& uuid : uuids) {
        const auto known = accounts.find(upperCase(uuid));
        people.emplace_back(known != accounts.end() ? known->second : Dictionary{{"guid", uuid}, {"_id_", uuid}});
    }
    return people;
}

/// The workflow's name in the best of the languages.
Value nameOfWorkflow(const std::string& bundle, const std::vector<std::string>& languages) {
    const auto workflow = Workflow::initWithDictionary({{"bundle_path", bundle}});
    workflow->setAllowed({});
    workflow->localizeUsingLanguages(languages);
    const Dictionary* record = workflow->dictionary();
    return record == nullptr ? Value("") : record->get("name");
}

/// One list of a resource that holds the account.
struct Entry {
    std::string type;  ///< "camera", "workflow"
    std::string resource;
    std::string list;  ///< "Camera 7"
    std::string uuid;  ///< as in the row
};

std::unique_ptr<Resource> resourceOf(const Entry& entry) {
    if (entry.type == "camera") {
        return Camera::initWithGUID(entry.resource);
    }
    return Workflow::initWithGUID(entry.resource);
}

/// The lists that hold the account.
std::vector<Entry> entriesOf(const Rows& rows, const std::string& account, std::span<const std::string> resources) {
    std::vector<Entry> entries;
    const auto add = [&](const std::vector<Dictionary>& all, const char* type, const char* listType) {
        for (const Dictionary& row : all) {
            const std::string resource = plainText(row, "uuid");
            const bool isMeant =
                resources.empty() || std::any_of(resources.begin(), resources.end(), [&](const std::string& one) {
                    return upperCase(one) == upperCase(resource);
                });
            const auto list = rows.lists.find(std::string(listType) + ' ' + std::string(row.text("id")));
            if (!isMeant || list == rows.lists.end() || !isIdentifier(resource)) {
                continue;
            }
            for (const std::string& uuid : list->second) {
                if (upperCase(uuid) == account && isIdentifier(uuid)) {
                    entries.push_back({type, resource, list->first, uuid});
                }
            }
        }
    };
    add(rows.cameras, "camera", "Camera");
    add(rows.workflows, "workflow", "Workflow");
    return entries;
}

void reportRemoved(const Entry& entry, bool unverified) {
    adminhost::reportChange(
        {entry.type + 's', entry.resource, "", "access", entry.uuid, Value(), false, {}, unverified});
}

void reportLeft(const Entry& entry, const std::string& reason, const std::string& words) {
    adminhost::reportNotDone(
        {"resources", "not removed from the " + entry.type + ' ' + entry.resource + ": " + reason, words});
}

bool isListed(const Lists& lists, const Entry& entry) {
    const auto list = lists.find(entry.list);
    return list != lists.end() && std::find(list->second.begin(), list->second.end(), entry.uuid) != list->second.end();
}

}  // namespace

Result<Array> accessOverview(const std::vector<std::string>& languages) {
    if (!SettingsStore::dbPathExists()) {
        return failure(missingDatabase());
    }
    auto rows = allRows();
    if (!rows) {
        return failure(std::move(rows.error()));
    }
    std::set<std::string> uuids;
    for (const auto& [list, people] : rows->lists) {
        uuids.insert(people.begin(), people.end());
    }
    const auto accounts = accountsOf(uuids);
    if (!accounts) {
        return failure(accounts.error());
    }
    Array all;
    const auto add = [&](const Dictionary& row, const char* section, const char* listType, const Dictionary& names) {
        Dictionary one{{"section", section}, {"_id_", plainText(row, "uuid")}};
        for (const DictionaryEntry& name : names) {
            one.set(name.key, name.value);
        }
        one.set("disabled", row.text("disabled") == "1");
        one.set("access_control_enabled", row.text("restricted") == "1");
        const auto list = rows->lists.find(std::string(listType) + ' ' + std::string(row.text("id")));
        one.set("allowedUsersAndGroups", list == rows->lists.end() ? Array() : peopleOf(list->second, *accounts));
        all.emplace_back(std::move(one));
    };
    for (const Dictionary& row : rows->cameras) {
        add(row, "cameras", "Camera", {{"name", plainText(row, "name")}});
    }
    for (const Dictionary& row : rows->workflows) {
        const std::string bundle = plainText(row, "bundle");
        add(row, "workflows", "Workflow", {{"name", nameOfWorkflow(bundle, languages)}, {"bundle_path", bundle}});
    }
    return all;
}

Result<AccessRemoval> removeUnknownAccount(const std::string& uuid, std::span<const std::string> resources) {
    if (!SettingsStore::dbPathExists()) {
        return failure(missingDatabase());
    }
    const std::string account = upperCase(uuid);
    const auto known = accountsOf({uuid});
    if (!known) {
        return failure(known.error());
    }
    if (!known->empty()) {
        return failure(
            Error{"adminhost_lumio", 1,
                  "the directory knows the account: " + std::string(known->begin()->second.text("shortName"))});
    }
    const auto rows = allRows();
    if (!rows) {
        return failure(rows.error());
    }
    std::vector<Entry> left = entriesOf(*rows, account, resources);
    std::uint64_t removed = 0;
    std::map<std::string, std::string> words;  // what the tool said, by list
    // Whether the account was a person or a group is no longer known.
    for (const char* kind : {"user", "group"}) {
        if (left.empty()) {
            break;
        }
        std::set<std::string> failed;  // lists, in this round
        for (const Entry& entry : left) {
            if (const auto error = resourceOf(entry)->_executeLumioConfigWithCommand(
                    "--remove_access", entry.type, entry.resource, kind, {entry.uuid})) {
                words[entry.list] = error->description.value_or("");
                failed.insert(entry.list);
            }
        }
        const auto now = accessLists();
        if (!now) {
            // Past the deadline, for example. What may be gone must still be in the audit and in the history.
            for (const Entry& entry : left) {
                if (failed.contains(entry.list)) {
                    reportLeft(entry, "the configuration tool failed", words[entry.list]);
                } else {
                    reportRemoved(entry, true);
                }
            }
            return failure(now.error());
        }
        std::erase_if(left, [&](const Entry& entry) {
            if (isListed(*now, entry)) {
                return false;
            }
            reportRemoved(entry, false);
            ++removed;
            return true;
        });
    }
    for (const Entry& entry : left) {
        reportLeft(entry, "the configuration tool left the entry", words[entry.list]);
    }
    return AccessRemoval{removed, left.size()};
}

}  // namespace lumio
