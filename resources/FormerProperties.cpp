#include "resources/FormerProperties.h"

#include "platform/text/Hex.h"
#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"
#include "settings/QueryRunner.h"
#include "settings/SettingsStore.h"

#include <algorithm>
#include <cctype>
#include <string_view>

namespace lumio {
namespace {

using adminhost::Array;
using adminhost::booleanOf;
using adminhost::Dictionary;
using adminhost::textOf;
using adminhost::Value;

constexpr std::size_t mostRows = 1000;  ///< so that the numbers fit into the tool's argument

/// The numbers of the rows that the changes remove, for a statement.
std::string removedIds(const Array* changes) {
    std::string ids;
    std::size_t count = 0;
    for (const Value& change : changes != nullptr ? *changes : Array()) {
        const Dictionary* entry = change.dictionary();
        if (entry == nullptr || !adminhost::flagOf(entry->get("_obsoleteid_"))) {
            continue;
        }
        const std::string id = textOf(entry->get("_id_"));
        const bool isNumber =
            !id.empty() && std::all_of(id.begin(), id.end(), [](unsigned char c) { return std::isdigit(c) != 0; });
        if (isNumber && ++count <= mostRows) {
            ids += (ids.empty() ? "" : ", ") + id;
        }
    }
    return ids;
}

std::string plain(const Dictionary& row, std::string_view column) {
    return adminhost::utf8Of(adminhost::textOfHex(row.text(column)).value_or(""));
}

}  // namespace

FormerProperties* FormerProperties::_current = nullptr;

FormerProperties::FormerProperties(const Array* changes) {
    _current = this;
    const std::string ids = removedIds(changes);
    if (ids.empty() || !SettingsStore::dbPathExists()) {
        return;
    }
    // In hexadecimal digits no text of a row can look like another row.
    const auto rows = runStatement(
        "select id, hex(name) as name, hex(value) as value, protect from properties where id in (" + ids + ")");
    if (!rows) {
        return;
    }
    for (const Dictionary& row : *rows) {
        const bool isProtected = booleanOf(row.get("protect"));
        _rows[std::string(row.text("id"))] = {plain(row, "name"), isProtected ? "" : plain(row, "value"), isProtected};
    }
}

FormerProperties::~FormerProperties() {
    _current = nullptr;
}

const FormerProperties::Row* FormerProperties::find(const std::string& id) noexcept {
    if (_current == nullptr) {
        return nullptr;
    }
    const auto found = _current->_rows.find(id);
    return found == _current->_rows.end() ? nullptr : &found->second;
}

}  // namespace lumio
