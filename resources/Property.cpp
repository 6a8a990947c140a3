#include "resources/Property.h"

#include "codec/LumioCategories.h"
#include "platform/bundle/Bundle.h"
#include "platform/crypto/Crypt.h"
#include "platform/framework/Report.h"
#include "platform/log/Log.h"
#include "platform/text/LocalDate.h"
#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"
#include "resources/FormerProperties.h"
#include "resources/PropertyRows.h"
#include "resources/StatementText.h"
#include "resources/ToolWords.h"
#include "settings/SettingsStore.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <cstdlib>

namespace lumio {

using adminhost::Array;
using adminhost::booleanOf;
using adminhost::Change;
using adminhost::Dictionary;
using adminhost::DictionaryEntry;
using adminhost::Error;
using adminhost::logEvent;
using adminhost::textOf;
using adminhost::Value;

namespace {

constexpr const char* localizationBundle = "/System/Library/SorvaneProducer/SorvaneProducerServerLocalizations.bundle";

/// Wipes the text under "value".
void cleanseValue(Dictionary& values) noexcept {
    const Value* value = values.find("value");
    if (value != nullptr && value->string() != nullptr) {
        adminhost::cleanse(const_cast<char*>(value->string()->data()), value->string()->size());
    }
}

/// Wipes the text under "value" when the scope ends.
class ScopedValueCleanse {
  public:
    explicit ScopedValueCleanse(Dictionary& values) noexcept : _values(values) {}
    ScopedValueCleanse(const ScopedValueCleanse&) = delete;
    ScopedValueCleanse& operator=(const ScopedValueCleanse&) = delete;
    ~ScopedValueCleanse() { cleanseValue(_values); }

  private:
    Dictionary& _values;
};

/// Makes the texts fit a response, which can only carry UTF-8.
void makeUtf8(Dictionary& row) {
    for (const DictionaryEntry& entry : row) {
        const std::string* text = entry.value.string();
        if (text != nullptr && !adminhost::isUtf8(*text)) {
            *row.find(entry.key) = adminhost::utf8Of(*text);
        }
    }
}

void reportRemoved(const std::string& id, const std::string& name, bool wasRead) {
    Change change;
    change.section = "properties";
    change.identity = id;
    change.name = name;
    change.from = name.empty() ? id : name;
    change.unverified = !wasRead;
    adminhost::reportChange(std::move(change));
}

std::string updateStatement(const Dictionary& working, const std::optional<std::string>& id) {
    const std::vector<std::string>& columns = Property::tableColumnNames();
    std::string statement = "update properties set ";
    for (const DictionaryEntry& entry : working) {
        if (entry.key != "id" && std::find(columns.begin(), columns.end(), entry.key) != columns.end()) {
            statement += entry.key + "=\"" + textOf(entry.value) + "\", ";
        }
    }
    statement.resize(statement.size() - 2);
    // Without an id its text is (null), which no row has.
    return statement + " where id=" + textOf(id);
}

std::string insertStatement(const Dictionary& working) {
    std::string keys;
    std::string values;
    for (const DictionaryEntry& entry : working) {
        keys += (keys.empty() ? "" : ",") + entry.key;
        values += (&entry == &*working.begin() ? "" : "\",\"") + textOf(entry.value);
    }
    return "insert into properties (" + keys + ") values (\"" + values + "\")";
}

}  // namespace

const std::vector<std::string>& Property::tableColumnNames() {
    static const std::vector<std::string> names{"id", "name", "value", "protect", "created_at", "updated_at"};
    return names;
}

std::span<const std::string_view> Property::listOfResourceDateKeys() const {
    static constexpr std::array<std::string_view, 2> keys{"updated_at", "created_at"};
    return keys;
}

void Property::readRow(Dictionary row) {
    Resource::readRow(std::move(row));
    _changeValues.reset();
    const bool isProtected = _data->text("protect") == "t";
    _data->set("protect", isProtected);
    if (isProtected) {
        _data->remove("value");
    }
    if (const Value* id = _data->find("id")) {
        _data->set("_id_", *id);
    }
}

Property::~Property() {
    for (std::optional<Dictionary>* values : {&_data, &_changeValues}) {
        if (*values) {
            cleanseValue(**values);
        }
    }
}

std::unique_ptr<Property> Property::initNewPropertyWithDictionary(const Dictionary& request) {
    auto property = init();
    property->_data = objectsWithAndForKeys(request, &tableColumnNames());
    if (!property->_data->contains("protect")) {
        property->_data->set("protect", false);
    }
    return property;
}

std::unique_ptr<Property> Property::initWithChangeRequest(const Dictionary& request) {
    auto property = init();
    property->_changeValues = request;
    const Value& id = request.get("_id_");
    if (!id.isNull()) {
        property->_changeValues->remove("_id");
        auto rows = propertyRows("*", " from properties where id = " + textOf(id) + ";", RowCount::atMostOne);
        if (!rows) {
            property->_loadError = std::move(rows.error());
        } else if (!rows->empty()) {
            property->_data = std::move(rows->front());
        }
    }
    return property;
}

bool Property::readAll(const Receiver& receiver, std::optional<Error>& error) {
    const PropertyRowReceiver rows{[&](Dictionary row) {
                                       makeUtf8(row);
                                       receiver.add(initWithDictionary(std::move(row)));
                                   },
                                   receiver.discard};
    // The tool would create a missing database as an empty file.
    const auto read = SettingsStore::dbPathExists() ? readPropertyRows("*", " from properties;", RowCount::any, rows)
                                                    : adminhost::failure(missingDatabase());
    if (!read) {
        error = read.error();
        logEvent("Error getting Sorvane workflow properties: " + textOf(error));
    }
    return read.has_value();
}

bool Property::readAllLocalized(const std::vector<std::string>& languages, const Receiver& receiver,
                                std::optional<Error>& error) {
    // Loaded for the first property, while the tool is still writing the others.
    std::optional<std::optional<Dictionary>> descriptions;
    const auto add = [&](std::unique_ptr<Property> property) {
        if (!descriptions) {
            descriptions.emplace(descriptionsForLocalizations(languages));
        }
        if (*descriptions) {
            const Value& description = (*descriptions)->get(textOf(property->_data->get("name")));
            if (!description.isNull()) {
                property->_data->set("description", description);
            }
        }
        receiver.add(std::move(property));
    };
    return readAll({add, receiver.discard}, error);
}

std::optional<std::vector<std::unique_ptr<Property>>> Property::allPropertiesWithError(std::optional<Error>& error) {
    std::vector<std::unique_ptr<Property>> all;
    const auto add = [&](std::unique_ptr<Property> property) { all.push_back(std::move(property)); };
    return readAll({add, [&] { all.clear(); }}, error) ? std::optional(std::move(all)) : std::nullopt;
}

std::optional<std::vector<std::unique_ptr<Property>>> Property::allPropertiesUsingLocalizations(
    const std::vector<std::string>& languages, std::optional<Error>& error) {
    std::vector<std::unique_ptr<Property>> all;
    const auto add = [&](std::unique_ptr<Property> property) { all.push_back(std::move(property)); };
    return readAllLocalized(languages, {add, [&] { all.clear(); }}, error) ? std::optional(std::move(all))
                                                                           : std::nullopt;
}

std::optional<Array> Property::recordsUsingLocalizations(const std::vector<std::string>& languages,
                                                         std::optional<Error>& error) {
    Array records;
    const auto add = [&](std::unique_ptr<Property> property) {
        std::move(*property).addDataDictionaryToMutableArray(records);
    };
    return readAllLocalized(languages, {add, [&] { records.clear(); }}, error) ? std::optional(std::move(records))
                                                                               : std::nullopt;
}

std::optional<Dictionary> Property::descriptionsForLocalizations(const std::vector<std::string>& languages) {
    const auto bundle = adminhost::Bundle::open(adminhost::HostPath(localizationBundle));
    return bundle ? localizationsForResourceNamed("PropertyDescriptions", *bundle, languages) : std::nullopt;
}

std::optional<Error> Property::deletePropertyWithID(const Value& id) {
    std::optional<Error> error;
    if (id.isNull()) {
        return error;
    }
    static_cast<void>(querySorvaneDatabase("delete from properties where id=\"" + textOf(id) + "\"", error));
    if (error) {
        logEvent("error deleting property with ID:\n" + textOf(id) + "\n  error:: " + textOf(error));
    } else if (const FormerProperties::Row* const row = FormerProperties::find(textOf(id))) {
        Change change;
        change.section = "properties";
        change.identity = textOf(id);
        change.name = row->name;
        change.from = row->isProtected ? Value(true) : Value(row->value);
        change.secret = row->isProtected;
        adminhost::reportChange(std::move(change));
    } else {
        reportRemoved(textOf(id), {}, false);
    }
    return error;
}

std::optional<Error> Property::delete_() {
    std::optional<Error> error;
    const std::optional<std::string> id = rowId();
    if (!id) {
        logUnusableId();
        return error;
    }
    static_cast<void>(querySorvaneDatabase("delete from properties where id=\"" + *id + "\"", error));
    if (error) {
        logEvent("error deleting property:\n" + recordText(booleanOf(stored("protect"))) +
                 "\n  error:: " + textOf(error));
        reportNotDone("", "not removed: the database refused it", toolWords(*error));
    } else {
        reportRemoved(*id, adminhost::utf8Of(textOf(stored("name"))), true);
    }
    return error;
}

std::optional<Error> Property::write() {
    if (_loadError) {
        // The update could match no row, and its arguments would show the value.
        logWriteError(*_loadError, false);
        reportNotDone("", "not changed: the property cannot be read", toolWords(*_loadError));
        return _loadError;
    }
    const bool isUpdate = _changeValues.has_value();
    const std::optional<std::string> id = rowId();
    logUnusableId();
    Dictionary working = isUpdate ? *_changeValues : _data.value_or(Dictionary());
    const ScopedValueCleanse wipeWorking(working);
    // One error for the name check and the write: a name check that failed is reported even when the write succeeds.
    std::optional<Error> error;
    if (const Value* name = working.find("name")) {
        if (std::optional<Error> taken = nameError(*name, error)) {
            reportNotDone("name", "not written: another property has this name");
            return taken;
        }
    }
    working.remove("_id_");

    const bool wasProtected = booleanOf(stored("protect"));
    bool isProtected = wasProtected;
    bool deciphered = false;
    if (const Value* protect = working.find("protect")) {
        isProtected = booleanOf(*protect);
        working.set("protect", isProtected ? "t" : "f");
        if (isUpdate && !working.contains("value")) {
            if (std::optional<Error> unfit = takeStoredValue(working, isProtected, deciphered)) {
                logWriteError(*unfit, true);
                reportNotDone("protect", "not changed: the deciphered value cannot be stored", toolWords(*unfit));
                return unfit;
            }
        }
    }
    if (isProtected && working.contains("value")) {
        std::optional<std::string> protectedValue = encryptValue(working.get("value"));
        if (!protectedValue) {
            reportNotDone(isUpdate && !_changeValues->contains("value") ? "protect" : "value",
                          "not written: the value cannot be protected without a usable key");
            return Error{"LumioPropertyCantEncryptValue", 1, std::nullopt};
        }
        cleanseValue(working);
        working.set("value", std::move(*protectedValue));
    }

    const std::string now =
        adminhost::localTextOf(std::chrono::floor<std::chrono::seconds>(std::chrono::system_clock::now()));
    working.set("updated_at", now);
    if (isUpdate) {
        working.remove("created_at");
    } else {
        working.set("created_at", now);
    }
    if (isUpdate && !id) {
        // No row matches, and every process on the machine can read a tool's arguments.
        cleanseValue(working);
        working.remove("value");
    }
    if (isUpdate && id && isProtected && !wasProtected) {
        adminhost::announceSecret({section(), *id, "value"});
    }
    std::string statement = isUpdate ? updateStatement(working, id) : insertStatement(working);
    const adminhost::ScopedCleanse wipeStatement(statement);
    std::optional<Error> failure;
    static_cast<void>(querySorvaneDatabase(statement, failure));
    if (failure) {
        if (deciphered) {
            // The tool quotes the statement, which contains a value that stays protected in this case.
            failure->description = withoutSecret(*failure->description, textOf(working.get("value")), statement);
        }
        reportNotDone("", "not written: the database refused it", toolWords(*failure));
        error = std::move(failure);
    } else {
        if (error) {
            reportNotDone("name", "written, but not checked: another property may have this name", toolWords(*error));
        }
        reportWritten(working, isProtected);
    }
    if (error) {
        logWriteError(*error, isProtected || wasProtected);
    }
    return error;
}

std::optional<Error> Property::takeStoredValue(Dictionary& working, bool isProtected, bool& deciphered) const {
    if (isProtected) {
        // Clients send "protect" only when it changes: a value that is protected already is protected twice.
        working.set("value", stored("value"));
        return std::nullopt;
    }
    std::optional<std::string> plain = decryptValue(stored("value"));
    if (!plain) {
        reportNotDone("protect", "not changed: the stored value cannot be deciphered");
        return std::nullopt;
    }
    const adminhost::ScopedCleanse wipePlain(*plain);
    if (const std::optional<std::string> why = whyUnfitForStatement(*plain)) {
        return Error{
            "sqliteQuery", 1,
            "Can't execute sqlite3 query: Error: the deciphered value " + *why + "; the property stays protected"};
    }
    working.set("value", *plain);
    deciphered = true;
    return std::nullopt;
}

void Property::reportWritten(const Dictionary& working, bool isProtected) const {
    if (!_changeValues) {
        const Value& id = working.get("id");
        Change change;
        change.section = section();
        change.identity = id.isNull() ? "" : textOf(id);
        change.name = working.contains("name") ? textOf(working.get("name")) : "";
        change.to = change.name;
        if (!id.isNull()) {
            change.undo = Dictionary{{section(), Array{Dictionary{{"_id_", change.identity}, {"_obsoleteid_", true}}}}};
        }
        adminhost::reportChange(std::move(change));
        return;
    }
    const std::optional<std::string> id = rowId();
    if (!id) {
        reportNotDone("", _changeValues->contains("_id_") ? "not changed: property not found"
                                                          : "not changed: the entry has no \"_id_\"");
        return;
    }
    const bool wasProtected = booleanOf(stored("protect"));
    if (isProtected != wasProtected) {
        reportChange(*id, "protect", wasProtected, isProtected, {{"protect", wasProtected}});
    }
    for (const std::string_view key : {"name", "value"}) {
        const bool isSent = _changeValues->contains(key);
        // A value that becomes protected is reported even if it is not sent: the history hides its former values then.
        if (key == "value" && (isSent ? isProtected || wasProtected : isProtected && !wasProtected)) {
            Change change;
            change.section = section();
            change.identity = *id;
            change.name = adminhost::utf8Of(textOf(stored("name")));
            change.key = key;
            change.secret = true;
            adminhost::reportChange(std::move(change));
            continue;
        }
        if (!isSent) {
            continue;
        }
        const std::string before = adminhost::utf8Of(textOf(stored(key)));
        const std::string now = textOf(_changeValues->get(key));
        if (before != now) {
            // A text that cannot be part of a statement cannot be sent back.
            reportChange(*id, key, before, now,
                         whyUnfitForStatement(before) ? Dictionary() : Dictionary{{key, before}});
        }
    }
}

void Property::logWriteError(const Error& error, bool hideValue) const {
    logEvent("error writing property:\n" + recordText(hideValue) + "\n   error: " + textOf(error));
}

std::optional<Error> Property::nameError(const Value& name, std::optional<Error>& toolError) const {
    const std::optional<std::string> id = rowId();
    const std::string condition = id ? " and not id=" + *id + ";" : ";";
    auto rows = propertyRows("id,name,value", " from properties where name=\"" + textOf(name) + "\"" + condition);
    if (!rows) {
        toolError = std::move(rows.error());
        return std::nullopt;
    }
    if (rows->empty()) {
        return std::nullopt;
    }
    Dictionary& other = rows->back();
    makeUtf8(other);
    return Error{"sqliteQuery", 2,
                 "Property name '" + textOf(other.get("name")) + "' already exists with value '" +
                     textOf(other.get("value")) + "'"};
}

const Value& Property::stored(std::string_view key) const noexcept {
    static const Value none;
    return _data ? _data->get(key) : none;
}

std::string Property::recordText(bool hideValue) const {
    if (!_data) {
        return textOf(Value());
    }
    Dictionary shown = *_data;
    if (hideValue && shown.contains("value")) {
        shown.set("value", "(secret)");
    }
    return textOf(Value(std::move(shown)));
}

void Property::addDataDictionaryToMutableArray(Array& array) const& {
    if (_data) {
        array.emplace_back(*_data);
    }
}

void Property::addDataDictionaryToMutableArray(Array& array) && {
    if (_data) {
        array.emplace_back(std::move(*_data));
    }
}

std::optional<std::int64_t> Property::getIDForName(const std::string& name, const std::string& table) const {
    const std::string statement = "select id from " + table + " where name='" + name + "';";
    std::optional<Error> error;
    const auto rows = querySorvaneDatabase<Dictionary>(statement, error);
    if (!rows || rows->empty()) {
        logEvent("getIDForName:fromTable: found nothing for this query: " + statement);
    }
    logEvent("idForNAme result: " + textOf(rows ? Value(Array(rows->begin(), rows->end())) : Value()));
    if (!rows || rows->size() != 1) {
        return std::nullopt;
    }
    return std::strtoll(textOf(rows->front().get("id")).c_str(), nullptr, 10);
}

}  // namespace lumio
