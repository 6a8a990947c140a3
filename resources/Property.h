#pragma once

// Workflow properties: named values for the service's workflows, some of them protected.
//
// A protected value is stored as docs/protected-values.md describes and is never listed. Values are inserted into
// statements unchanged, between double quotes and unescaped: one with a double quote makes its statement fail.
//
// A property lives for one request. It is created for listing (initWithDictionary), for insertion
// (initNewPropertyWithDictionary) or for change (initWithChangeRequest). write() inserts one that has no change values
// and updates one that has.

#include "resources/Resource.h"

#include <functional>

namespace lumio {

class Property final : public ResourceClass<Property> {
  public:
    /// "id", "name", "value", "protect", "created_at", "updated_at".
    [[nodiscard]] static const std::vector<std::string>& tableColumnNames();

    /// A property to insert: the request's entries for the table's columns, "id" included; "protect" is false if the
    /// request does not have it.
    [[nodiscard]] static std::unique_ptr<Property> initNewPropertyWithDictionary(const adminhost::Dictionary& request);
    /// A property to change: the record is the row whose id is the request's "_id_", raw. A row that does not exist
    /// leaves the record null, and write() then changes nothing and returns no error; a row that cannot be read is
    /// write()'s error.
    [[nodiscard]] static std::unique_ptr<Property> initWithChangeRequest(const adminhost::Dictionary& request);

    /// Every property, as administrators see it. "protect" is a boolean, a protected "value" is absent, "_id_" repeats
    /// "id". Returns null, with the error and a log line, on failure; a missing database is a failure too.
    [[nodiscard]] static std::optional<std::vector<std::unique_ptr<Property>>> allPropertiesWithError(
        std::optional<adminhost::Error>& error);
    /// The same, each with its "description" where the service has one in the languages (most preferred first).
    [[nodiscard]] static std::optional<std::vector<std::unique_ptr<Property>>> allPropertiesUsingLocalizations(
        const std::vector<std::string>& languages, std::optional<adminhost::Error>& error);
    /// The records of these properties. Each is complete as soon as its row has been read, the first ones while the
    /// tool is still writing the others.
    [[nodiscard]] static std::optional<adminhost::Array> recordsUsingLocalizations(
        const std::vector<std::string>& languages, std::optional<adminhost::Error>& error);
    /// Descriptions by property name; empty if the service's bundle or a table in it is missing.
    [[nodiscard]] static std::optional<adminhost::Dictionary> descriptionsForLocalizations(
        const std::vector<std::string>& languages);

    /// Deletes the row; does nothing for null. Returns the error, which is logged too, if the tool fails.
    static std::optional<adminhost::Error> deletePropertyWithID(const adminhost::Value& id);

    // Between a plain text and its protected form, with the key, which every call reads from the shared file system.
    // They return nullopt for null and, after a log line, if the key file or its secret is missing or the cipher fails.
    [[nodiscard]] static std::optional<std::string> encryptValue(const adminhost::Value& value);
    [[nodiscard]] static std::optional<std::string> decryptValue(const adminhost::Value& value);
    [[nodiscard]] static std::optional<std::string> cryptedValue(const adminhost::Value& value, bool encrypt);

    /// Inserts or updates the row. Fails, without a write, for a row that could not be read, a name that another
    /// property has, a value that is to be protected but cannot be, and a plain text that cannot be part of a
    /// statement. If protection is switched on without a new value, the stored one is protected, even if it is
    /// protected already. If it is switched off without a new value, the plain text is stored, if the stored one can be
    /// deciphered. If the tool fails in the check of the name, the write is still made, but that error is returned.
    [[nodiscard]] std::optional<adminhost::Error> write();
    /// Deletes the record's row; does nothing without an id.
    [[nodiscard]] std::optional<adminhost::Error> delete_() override;
    /// Appends the record, if there is one.
    void addDataDictionaryToMutableArray(adminhost::Array& array) const&;
    /// The same without a copy, for a property that is not needed any more.
    void addDataDictionaryToMutableArray(adminhost::Array& array) &&;

    /// The id of the only row of the table with that name.
    [[nodiscard]] std::optional<std::int64_t> getIDForName(const std::string& name, const std::string& table) const;

    /// The requested changes of an existing property; null for one that is new or listed.
    [[nodiscard]] const std::optional<adminhost::Dictionary>& changeValues() const noexcept { return _changeValues; }
    void setChangeValues(std::optional<adminhost::Dictionary> values) { _changeValues = std::move(values); }

    Property() = default;
    Property(const Property&) = delete;
    Property& operator=(const Property&) = delete;
    /// Wipes the values: one may be the plain text of a protected one.
    ~Property() override;

    [[nodiscard]] std::string_view resourceType() const noexcept override { return "property"; }
    /// The record as it is: properties have no access lists.
    [[nodiscard]] const adminhost::Dictionary* dictionary() override { return _data ? &*_data : nullptr; }

  protected:
    [[nodiscard]] std::string_view className() const noexcept override { return "Property"; }
    [[nodiscard]] std::span<const std::string_view> listOfResourceDateKeys() const override;
    void readRow(adminhost::Dictionary row) override;
    [[nodiscard]] std::string section() const override { return "properties"; }

  private:
    /// Receives the properties one by one, the first ones while the tool is still writing the others.
    struct Receiver {
        std::function<void(std::unique_ptr<Property>)> add;
        std::function<void()> discard;  ///< those so far do not count
    };
    /// Return false, with the error and a log line, on failure.
    [[nodiscard]] static bool readAll(const Receiver& receiver, std::optional<adminhost::Error>& error);
    [[nodiscard]] static bool readAllLocalized(const std::vector<std::string>& languages, const Receiver& receiver,
                                               std::optional<adminhost::Error>& error);
    [[nodiscard]] std::optional<adminhost::Error> nameError(const adminhost::Value& name,
                                                            std::optional<adminhost::Error>& toolError) const;
    /// Puts the stored value into the changes, as switching protection on or off needs it. Returns the error if the
    /// deciphered one cannot be stored.
    [[nodiscard]] std::optional<adminhost::Error> takeStoredValue(adminhost::Dictionary& working, bool isProtected,
                                                                  bool& deciphered) const;
    /// Reports what an insert or update has changed on disk.
    void reportWritten(const adminhost::Dictionary& working, bool isProtected) const;
    void logWriteError(const adminhost::Error& error, bool hideValue) const;
    /// The record's value under the key; null without a record.
    [[nodiscard]] const adminhost::Value& stored(std::string_view key) const noexcept;
    /// The record's text for the log, its value hidden on demand.
    [[nodiscard]] std::string recordText(bool hideValue) const;

    std::optional<adminhost::Dictionary> _changeValues;
    std::optional<adminhost::Error> _loadError;  ///< why the row to change could not be read
};

}  // namespace lumio
