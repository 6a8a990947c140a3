#include "resources/Workflow.h"

#include "platform/files/File.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/ValueText.h"
#include "settings/SettingsStore.h"

namespace lumio {

using adminhost::Bundle;
using adminhost::Dictionary;
using adminhost::DiskPath;
using adminhost::Error;
using adminhost::HostPath;
using adminhost::Value;

std::optional<std::vector<std::unique_ptr<Workflow>>> Workflow::allWorkflowsWithError(std::optional<Error>& error) {
    // The tool would create a missing database as an empty file.
    if (!SettingsStore::dbPathExists()) {
        error = missingDatabase();
        return std::nullopt;
    }
    auto workflows = querySorvaneDatabase("select * from workflows where (disabled != 't' OR disabled is NULL)", error);
    if (workflows) {
        expandAll(*workflows);
    }
    return workflows;
}

std::optional<Bundle> Workflow::bundle() {
    const Dictionary* record = dictionary();
    const Value* path = record == nullptr ? nullptr : record->find("bundle_path");
    if (path == nullptr) {
        return std::nullopt;
    }
    const HostPath place(SettingsStore::sharedFilesystemPath() + "/" + textOf(*path));
    return adminhost::isBelowSystemRoot(diskPath(place)) ? Bundle::open(place) : std::nullopt;
}

std::optional<Dictionary> Workflow::uncachedInfoDictionary() {
    const auto opened = bundle();
    if (!opened) {
        return std::nullopt;
    }
    const DiskPath file = diskPath(HostPath(opened->path().text() + "/Contents/Info.plist"));
    const auto bytes =
        adminhost::isBelowSystemRoot(file) ? adminhost::readFile(file, informationMaximumSize) : std::string();
    auto value = bytes ? adminhost::parsePropertyList(*bytes) : adminhost::failure(bytes.error());
    Dictionary* information = value ? value->dictionary() : nullptr;
    return information == nullptr ? std::nullopt : std::optional(std::move(*information));
}

std::optional<Dictionary> Workflow::localizedStrings(const std::vector<std::string>& languages) {
    const auto opened = bundle();
    return opened ? localizationsForResourceNamed("InfoPlist", *opened, languages) : std::nullopt;
}

Value Workflow::information(std::string_view key) {
    const auto dictionary = uncachedInfoDictionary();
    const Value* value = dictionary ? dictionary->find(key) : nullptr;
    return value == nullptr ? Value("") : *value;
}

void Workflow::localizeUsingLanguages(const std::vector<std::string>& languages) {
    if (dictionary() == nullptr) {
        return;
    }
    const auto first = uncachedInfoDictionary();
    _data->set("name", first && first->contains("Name") ? first->get("Name") : information("UUID"));
    _data->set("description", information("Description"));
    if (const auto strings = localizedStrings(languages)) {
        for (const auto& [text, key] : {std::pair("Name", "name"), std::pair("Description", "description")}) {
            if (const Value* localized = strings->find(text)) {
                _data->set(key, *localized);
            }
        }
    }
    _data->set("notes", information("Notes"));
}

}  // namespace lumio
