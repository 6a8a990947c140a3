#pragma once

// One row of the service's database that administrators work with: its record, its identity and its access list.
//
// A resource lives for one request. Its record comes from a query (initWithDictionary) or, for a resource known only by
// its UUID, from the database on the first use of data(). Changes go to the database or the configuration tool at once
// and are not reflected in the record. Operations named init... return a new object that the caller owns.

#include "platform/value/Result.h"
#include "platform/value/Value.h"
#include "settings/QueryRunner.h"

#include <concepts>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {
class Bundle;
}

namespace lumio {

class Resource {
  public:
    Resource() = default;
    Resource(const Resource&) = delete;
    Resource& operator=(const Resource&) = delete;
    virtual ~Resource() = default;

    // Objects of the base class itself, whose type word does not name a table. Each class below has its own.
    [[nodiscard]] static std::unique_ptr<Resource> init() { return std::make_unique<Resource>(); }
    [[nodiscard]] static std::unique_ptr<Resource> initWithGUID(std::optional<std::string> guid);
    [[nodiscard]] static std::unique_ptr<Resource> initWithDictionary(adminhost::Dictionary row);
    /// Always returns a plain Resource, also if called through a derived class. That is deliberate.
    [[nodiscard]] static std::unique_ptr<Resource> resourceWithDictionary(adminhost::Dictionary dictionary);
    /// Does nothing.
    static void initialize() {}
    /// The bundle's strings table of that name in the best of the preferred languages, else in "English"; nullopt if it
    /// has none, or if the first one found cannot be read.
    [[nodiscard]] static std::optional<adminhost::Dictionary> localizationsForResourceNamed(
        std::string_view name, const adminhost::Bundle& bundle, const std::vector<std::string>& preferredLanguages);

    /// Runs a statement; each row becomes an object of the result class: Dictionary, or a class with
    /// initWithDictionary. Returns null, and sets the error, only if the tool fails (QueryRunner.h).
    template <class ResultClass>
    [[nodiscard]] static auto querySorvaneDatabase(const std::string& statement,
                                                   std::optional<adminhost::Error>& error) {
        if constexpr (std::same_as<ResultClass, adminhost::Dictionary>) {
            return orError(runStatement(statement), error);
        } else {
            return orError(resourcesOf<ResultClass>(statement, {}), error);
        }
    }

    /// As above, the receiving class itself being the result class.
    [[nodiscard]] static auto querySorvaneDatabase(const std::string& statement,
                                                   std::optional<adminhost::Error>& error) {
        return querySorvaneDatabase<Resource>(statement, error);
    }

    /// The UUID that the resource was created with, else the record's "uuid".
    [[nodiscard]] const std::optional<std::string>& guid();
    void setGuid(std::optional<std::string> guid) {
        _guid = std::move(guid);
        _guidIsTheRecords = false;
    }
    /// The key path of the change entry in the request ("configuration.cameras.0"), for the reports of parts not done.
    void setKeyPath(std::string keyPath) { _keyPath = std::move(keyPath); }
    /// The record. If there is none yet, loads the row of the UUID, raw (dates as text, no "_id_"), if the database has
    /// exactly one. Null otherwise; the next call tries again.
    [[nodiscard]] const adminhost::Dictionary* data();
    /// Sets the access list of the record, which is then not read from the database.
    void setAllowed(adminhost::Array entries);
    /// Replaces the record; nullopt clears it.
    void setData(std::optional<adminhost::Dictionary> data) {
        _data = std::move(data);
        _rawIdentity.reset();
    }
    /// The record as administrators see it, with its access list expanded, which happens once. Null if there is no
    /// record: it is not loaded for this.
    [[nodiscard]] virtual const adminhost::Dictionary* dictionary();
    /// Expands the access lists of all these resources as dictionary() does, several queries at a time. Results and log
    /// lines are in the order of the resources. None of them may have been expanded before.
    static void expandAll(const std::vector<Resource*>& resources);
    template <class Class>
    static void expandAll(const std::vector<std::unique_ptr<Class>>& resources) {
        std::vector<Resource*> all;
        all.reserve(resources.size());
        for (const auto& resource : resources) {
            all.push_back(resource.get());
        }
        expandAll(all);
    }
    /// The same without a copy, for a resource that is not needed any more.
    [[nodiscard]] std::optional<adminhost::Dictionary> takeDictionary() &&;
    /// "CLASS - guid: UUID, " and the record from the next line on. Shows the present fields and loads nothing.
    [[nodiscard]] std::string description() const;

    /// The type word: "" here, "workflow", "camera" or "property" below.
    [[nodiscard]] virtual std::string_view resourceType() const noexcept { return ""; }
    /// Removes the resource. The base class does nothing and reports no error.
    [[nodiscard]] virtual std::optional<adminhost::Error> delete_() { return std::nullopt; }

    // Access control (AccessLists.cpp)

    /// Returns true if access control is on: by the record if there is one (none is loaded), else as last set.
    [[nodiscard]] bool aclEnabled();
    /// Switches access control on or off in the database; needs a UUID. A failure is dropped without a message.
    void setACLEnabled(bool enabled);
    /// The UUIDs of the access list in row order, duplicates kept. A failure is logged and gives an empty list.
    [[nodiscard]] std::vector<std::string> getUserAndGroupACLs();
    /// Adds and removes people and groups with the service's configuration tool, one run for each kind of change.
    /// Entries that cannot be understood or resolved are skipped. An addition without "shortName" ends the operation
    /// before any run.
    void changeACLsWithRequest(const adminhost::Array* entries);
    /// Runs the configuration tool for the names, if there are any. If the tool fails, the error has its exit status
    /// and output. The error is for reports alone: responses do not depend on it.
    std::optional<adminhost::Error> _executeLumioConfigWithCommand(std::string_view command,
                                                                   std::string_view resourceType,
                                                                   std::string_view resourceID,
                                                                   std::string_view recordType,
                                                                   const std::vector<std::string>& shortNames);
    /// The user entries of the expanded access list.
    [[nodiscard]] adminhost::Array allowedUsers() const;
    /// The user entries too, never the groups. This sameness is deliberate: clients count on it.
    [[nodiscard]] adminhost::Array allowedGroups() const;
    [[nodiscard]] std::size_t countOfAllowedUsers() const { return allowedUsers().size(); }
    [[nodiscard]] std::size_t countOfAllowedGroups() const { return allowedGroups().size(); }
    // Null when the index is out of range.
    [[nodiscard]] adminhost::Value objectInAllowedUsersAtIndex(std::size_t index) const;
    [[nodiscard]] adminhost::Value objectInAllowedGroupsAtIndex(std::size_t index) const;

  protected:
    /// Adds "useUser" and "allowedUsersAndGroups" to the record and makes its access switch a boolean. Must run once
    /// only: a second run would read the boolean true as a text other than "t".
    void expandACLs();
    // Its steps, with the statement that is run between them.
    void expandColumns();
    [[nodiscard]] std::string accessListStatement() const;
    [[nodiscard]] std::vector<std::string> uuidsIn(
        const adminhost::Result<std::vector<adminhost::Dictionary>>& rows) const;
    void expandList(const std::vector<std::string>& uuids);
    /// The directory's entries for the UUIDs, of one record type or of people and groups. If the directory fails,
    /// prints that on standard output and returns an empty list.
    [[nodiscard]] static std::vector<adminhost::Dictionary> getDirectoryDetailsForUUIDs(
        const std::vector<std::string>& uuids, std::optional<std::string_view> recordType = std::nullopt);
    [[nodiscard]] static std::vector<adminhost::Dictionary> getUserDetailsForUUIDs(
        const std::vector<std::string>& uuids);
    [[nodiscard]] static std::vector<adminhost::Dictionary> getGroupDetailsForUUIDs(
        const std::vector<std::string>& uuids);

    [[nodiscard]] virtual std::string_view className() const noexcept { return "Resource"; }
    /// The columns whose local times become dates when a row is read.
    [[nodiscard]] virtual std::span<const std::string_view> listOfResourceDateKeys() const;
    /// The part of initWithDictionary that reads the row.
    virtual void readRow(adminhost::Dictionary row);

    // The columns of a database row are no more trustworthy than the names in it: only these go into statements and
    // tool arguments.

    /// The record's "id" if it is decimal digits, as in the raw text of the tool's output.
    [[nodiscard]] std::optional<std::string> rowId() const;
    /// Logs a record whose id is not a number.
    void logUnusableId() const;
    /// The UUID: one that was given is returned unchanged, the record's only if it is an identifier (letters, digits,
    /// hyphens); else null after a log line.
    [[nodiscard]] std::optional<std::string> statementGuid();

    /// The objects of a statement's rows. The columns, in the statement's order, separate the rows' identities from
    /// values that look like them; without columns they are inferred from the output.
    template <class ResultClass>
    [[nodiscard]] static adminhost::Result<std::vector<std::unique_ptr<ResultClass>>> resourcesOf(
        const std::string& statement, std::span<const std::string> columns) {
        auto rows = rowsWithIdentities(statement, columns);
        if (!rows) {
            return adminhost::failure(std::move(rows.error()));
        }
        std::vector<std::unique_ptr<ResultClass>> results;
        results.reserve(rows->size());
        for (RowWithIdentity& row : *rows) {
            results.push_back(ResultClass::initWithDictionary(std::move(row.record)));
            static_cast<Resource&>(*results.back())._rawIdentity = std::move(row.identity);
        }
        return results;
    }

    /// The form of the operations whose callers pass a place for the error; it is written on failure only.
    template <class Rows>
    [[nodiscard]] static std::optional<Rows> orError(adminhost::Result<Rows> rows,
                                                     std::optional<adminhost::Error>& error) {
        if (!rows) {
            error = std::move(rows.error());
            return std::nullopt;
        }
        return *std::move(rows);
    }

    /// "id" and "uuid" as in the raw text of the tool's output; null if they are not known.
    struct RawIdentity {
        std::optional<std::string> id;
        std::optional<std::string> uuid;
    };
    struct RowWithIdentity {
        adminhost::Dictionary record;
        RawIdentity identity;
    };
    [[nodiscard]] static adminhost::Result<std::vector<RowWithIdentity>> rowsWithIdentities(
        const std::string& statement, std::span<const std::string> columns);

    // Reports (platform/framework/Report.h). The record is not loaded for them: fields that it does not have stay null.

    /// Reports a part of the change entry, "" for the whole, as not carried out.
    void reportNotDone(std::string_view key, std::string reason, std::string toolMessage = {}) const;
    /// Reports a change. The undo is what the entry must hold beside "_id_" to undo it; empty if it cannot be undone.
    void reportChange(std::string_view identity, std::string_view key, adminhost::Value from, adminhost::Value to,
                      adminhost::Dictionary undo, bool unverified = false) const;
    /// The list in the configuration that resources of this type are in: "cameras".
    [[nodiscard]] virtual std::string section() const { return std::string(resourceType()) + "s"; }

    std::optional<adminhost::Dictionary> _data;
    std::string _keyPath;
    std::optional<std::string> _guid;
    bool _guidIsTheRecords = false;
    std::optional<RawIdentity> _rawIdentity;  ///< null for a record that did not come from the tool's output
    bool _aclsAreExpanded = false;
    bool _aclEnabled = false;
};

/// The construction and query operations that every resource class has for its own objects.
template <class Self>
class ResourceClass : public Resource {
  public:
    [[nodiscard]] static std::unique_ptr<Self> init() { return std::make_unique<Self>(); }

    [[nodiscard]] static std::unique_ptr<Self> initWithGUID(std::optional<std::string> guid) {
        std::unique_ptr<Self> resource = init();
        resource->setGuid(std::move(guid));
        return resource;
    }

    [[nodiscard]] static std::unique_ptr<Self> initWithDictionary(adminhost::Dictionary row) {
        std::unique_ptr<Self> resource = init();
        static_cast<ResourceClass&>(*resource).readRow(std::move(row));
        return resource;
    }

    using Resource::querySorvaneDatabase;
    [[nodiscard]] static auto querySorvaneDatabase(const std::string& statement,
                                                   std::optional<adminhost::Error>& error) {
        return Resource::querySorvaneDatabase<Self>(statement, error);
    }
};

}  // namespace lumio
