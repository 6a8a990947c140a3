#include "resources/Resource.h"

#include "platform/bundle/Bundle.h"
#include "platform/framework/Report.h"
#include "platform/log/Log.h"
#include "platform/text/LocalDate.h"
#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"
#include "settings/LineRows.h"

#include <algorithm>
#include <array>

namespace lumio {

using adminhost::Dictionary;
using adminhost::Value;

namespace {

bool isDigit(char c) noexcept {
    return c >= '0' && c <= '9';
}

bool isNumber(std::string_view text) noexcept {
    return !text.empty() && std::all_of(text.begin(), text.end(), isDigit);
}

bool isIdentifier(std::string_view text) noexcept {
    return !text.empty() && text.front() != '-' && std::all_of(text.begin(), text.end(), [](char c) {
        return isDigit(c) || c == '-' || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
    });
}

}  // namespace

std::unique_ptr<Resource> Resource::initWithGUID(std::optional<std::string> guid) {
    auto resource = init();
    resource->setGuid(std::move(guid));
    return resource;
}

std::unique_ptr<Resource> Resource::initWithDictionary(Dictionary row) {
    auto resource = init();
    resource->readRow(std::move(row));
    return resource;
}

std::unique_ptr<Resource> Resource::resourceWithDictionary(Dictionary dictionary) {
    return initWithDictionary(std::move(dictionary));
}

std::optional<Dictionary> Resource::localizationsForResourceNamed(std::string_view name,
                                                                  const adminhost::Bundle& bundle,
                                                                  const std::vector<std::string>& preferredLanguages) {
    return adminhost::localizedTable(bundle, name, preferredLanguages);
}

std::span<const std::string_view> Resource::listOfResourceDateKeys() const {
    static constexpr std::array<std::string_view, 3> keys{"updated_at", "created_at", "used_at"};
    return keys;
}

void Resource::readRow(Dictionary row) {
    _data = std::move(row);
    for (const std::string_view key : listOfResourceDateKeys()) {
        Value* value = _data->find(key);
        if (value == nullptr || value->string() == nullptr) {
            continue;
        }
        if (const auto date = adminhost::localDateOf(*value->string())) {
            *value = *date;
        }
    }
    if (_data->contains("uuid")) {
        _data->set("_id_", _data->get("uuid"));
    }
}

const std::optional<std::string>& Resource::guid() {
    if (!_guid && _data && _data->contains("uuid")) {
        _guid = textOf(_data->get("uuid"));
        _guidIsTheRecords = true;
    }
    return _guid;
}

const Dictionary* Resource::data() {
    if (_data) {
        return &*_data;
    }
    if (const std::optional<std::string> uuid = statementGuid()) {
        auto rows = rowsWithIdentities(
            std::string("select * from ").append(resourceType()) + "s where uuid=\"" + *uuid + "\"", {});
        if (rows && rows->size() == 1) {
            _data = std::move(rows->front().record);
            _rawIdentity = std::move(rows->front().identity);
        }
    }
    return _data ? &*_data : nullptr;
}

const Dictionary* Resource::dictionary() {
    if (!_aclsAreExpanded) {
        expandACLs();
    }
    return _data ? &*_data : nullptr;
}

std::optional<Dictionary> Resource::takeDictionary() && {
    static_cast<void>(dictionary());
    return std::move(_data);
}

std::optional<std::string> Resource::rowId() const {
    const Value& shown = _data ? _data->get("id") : Value();
    if (shown.isNull()) {
        return std::nullopt;
    }
    std::optional<std::string> id = _rawIdentity ? _rawIdentity->id : textOf(shown);
    return id && isNumber(*id) ? id : std::nullopt;
}

void Resource::logUnusableId() const {
    if (_data && _data->contains("id") && !rowId()) {
        adminhost::logEvent(std::string(resourceType()) +
                            ": the record's id is not a number; it counts as a record without an id");
    }
}

std::optional<std::string> Resource::statementGuid() {
    if (!guid() || !_guidIsTheRecords) {
        return _guid;
    }
    std::optional<std::string> uuid = _rawIdentity ? _rawIdentity->uuid : _guid;
    if (uuid && isIdentifier(*uuid)) {
        return uuid;
    }
    adminhost::logEvent(std::string(resourceType()) +
                        ": the record's uuid is not an identifier; it counts as a record without a uuid");
    return std::nullopt;
}

adminhost::Result<std::vector<Resource::RowWithIdentity>> Resource::rowsWithIdentities(
    const std::string& statement, std::span<const std::string> columns) {
    auto output = statementOutput(statement);
    if (!output) {
        return adminhost::failure(std::move(output.error()));
    }
    std::vector<RowWithIdentity> rows;
    for (Dictionary& record : recordsOfLineOutput(*output)) {
        rows.push_back({std::move(record), {}});
    }
    const OutputLines lines(*output);
    std::vector<std::string> inferred;
    if (columns.empty()) {
        inferred = lineColumns(lines);
        columns = inferred;
    }
    const auto indexOf = [&](std::string_view name) {
        return static_cast<std::size_t>(std::find(columns.begin(), columns.end(), name) - columns.begin());
    };
    const std::size_t id = indexOf("id");
    const std::size_t uuid = indexOf("uuid");
    const auto raw = rowsOfRecords(lines, columns);
    for (std::size_t i = 0; i < std::min(raw.size(), rows.size()); ++i) {
        if (raw[i] && id < columns.size()) {
            rows[i].identity.id = raw[i]->values[id];
        }
        if (raw[i] && uuid < columns.size()) {
            rows[i].identity.uuid = raw[i]->values[uuid];
        }
    }
    return rows;
}

void Resource::reportNotDone(std::string_view key, std::string reason, std::string toolMessage) const {
    std::string path = _keyPath;
    path.append(path.empty() || key.empty() ? "" : ".").append(key);
    adminhost::reportNotDone({std::move(path), std::move(reason), std::move(toolMessage)});
}

void Resource::reportChange(std::string_view identity, std::string_view key, Value from, Value to, Dictionary undo,
                            bool unverified) const {
    adminhost::Change change;
    change.section = section();
    change.identity = identity;
    const Value& name = _data ? _data->get("name") : Value();
    change.name = name.isNull() ? "" : adminhost::utf8Of(textOf(name));
    change.key = key;
    change.from = std::move(from);
    change.to = std::move(to);
    change.unverified = unverified;
    if (!undo.empty()) {
        undo.set("_id_", identity);
        change.undo = Dictionary{{section(), adminhost::Array{std::move(undo)}}};
    }
    adminhost::reportChange(std::move(change));
}

std::string Resource::description() const {
    return std::string(className()) + " - guid: " + adminhost::textOf(_guid) + ", \n" +
           adminhost::textOf(_data ? Value(*_data) : Value());
}

}  // namespace lumio
