#include "settings/Revision.h"

#include "platform/crypto/Digest.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/ValueText.h"
#include "settings/QueryRunner.h"
#include "settings/SettingsStore.h"

#include <array>

namespace lumio {

namespace {

/// The columns of each kind of resource. Texts that may hold line feeds or separators are selected as hexadecimal
/// digits.
constexpr std::array<std::string_view, 4> selections = {
    "select 'camera' as kind, hex(uuid) as a, hex(name) as b, access_control_enabled as c, disabled as d from cameras",
    "select 'workflow' as kind, hex(uuid) as a, hex(bundle_path) as b, access_control_enabled as c, disabled as d "
    "from workflows",
    "select 'access' as kind, hex(record_uuid) as a, hex(resource_type) as b, resource_id as c, '' as d "
    "from access_control_entries",
    "select 'property' as kind, hex(name) as a, hex(value) as b, protect as c, id as d from properties"};

void append(std::string& text, std::string_view part) {
    text += std::to_string(part.size());
    text += ':';
    text += part;
}

bool appendRows(std::string& text, std::string_view selection) {
    const auto rows = runStatement(std::string(selection) + " order by 1,2,3,4,5");
    if (!rows) {
        return false;
    }
    for (const adminhost::Dictionary& row : *rows) {
        append(text, textOf(row));
    }
    return true;
}

/// Reads all resources in one start of the tool. If one table is missing, the others still count, each by itself.
void appendResources(std::string& text) {
    std::string all;
    for (const std::string_view selection : selections) {
        all.append(all.empty() ? "" : " union all ").append(selection);
    }
    if (!appendRows(text, all)) {
        for (const std::string_view selection : selections) {
            append(text, appendRows(text, selection) ? "" : "unreadable");
        }
    }
}

}  // namespace

std::string settingsRevision() {
    std::string everything;
    for (const auto& prefs : {SettingsStore::identityPreferences(), SettingsStore::libraryInformation(),
                              SettingsStore::memberPreferences(), SettingsStore::clusterPreferences()}) {
        append(everything, prefs ? adminhost::xmlPropertyList(*prefs).value_or("") : "");
    }
    if (SettingsStore::dbPathExists()) {
        appendResources(everything);
    }
    return adminhost::sha256Of(everything).substr(0, 32);
}

}  // namespace lumio
