#include "handler/Revision.h"

#include "handler/SettingsStore.h"
#include "platform/crypto/Digest.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/Text.h"
#include "resources/QueryRunner.h"

namespace lumio {

namespace {

/// One statement for all resources, so that a revision costs one start of the tool. Texts that may hold line feeds or
/// separators travel as hexadecimal digits.
constexpr const char* resourcesStatement =
    "select 'camera' as kind, hex(uuid) as a, hex(name) as b, access_control_enabled as c, disabled as d from cameras "
    "union all select 'workflow', hex(uuid), hex(bundle_path), access_control_enabled, disabled from workflows "
    "union all select 'access', hex(record_uuid), hex(resource_type), resource_id, '' from access_control_entries "
    "union all select 'property', hex(name), hex(value), protect, id from properties order by 1,2,3,4,5";

void append(std::string& text, std::string_view part) {
    text += std::to_string(part.size());
    text += ':';
    text += part;
}

}  // namespace

std::string settingsRevision() {
    std::string everything;
    for (const auto& prefs : {SettingsStore::identityPreferences(), SettingsStore::libraryInformation(),
                              SettingsStore::memberPreferences(), SettingsStore::clusterPreferences()}) {
        append(everything, prefs ? adminhost::xmlPropertyList(*prefs).value_or("") : "");
    }
    if (SettingsStore::dbPathExists()) {
        std::optional<adminhost::Error> error;
        if (const auto rows = runStatement(resourcesStatement, error)) {
            for (const adminhost::Dictionary& row : *rows) {
                append(everything, textOf(row));
            }
        } else {
            append(everything, textOf(error));
        }
    }
    return adminhost::sha256Of(everything).substr(0, 32);
}

}  // namespace lumio
