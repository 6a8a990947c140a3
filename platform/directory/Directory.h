#pragma once

// The directory service: people and groups, in one or more nodes.
//
//     const auto records = searchDirectory(query);
//
// A node is opened for one request and closed by its destructor, which also drops the rights that authenticate() gave
// it. Failures are errors with a code and a description for people. A query returns everything it found or an error,
// never a part. All calls come from one thread. A property list can carry all texts that nodes return.

#include "platform/framework/Export.h"
#include "platform/value/Error.h"
#include "platform/value/Result.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace adminhost {

namespace directory {

inline constexpr std::string_view users = "dsRecTypeStandard:Users";
inline constexpr std::string_view groups = "dsRecTypeStandard:Groups";

inline constexpr std::string_view recordName = "dsAttrTypeStandard:RecordName";  ///< login or group name
inline constexpr std::string_view realName = "dsAttrTypeStandard:RealName";      ///< full name
inline constexpr std::string_view generatedUID = "dsAttrTypeStandard:GeneratedUID";
inline constexpr std::string_view uniqueID = "dsAttrTypeStandard:UniqueID";              ///< user id, decimal
inline constexpr std::string_view primaryGroupID = "dsAttrTypeStandard:PrimaryGroupID";  ///< group id, decimal
inline constexpr std::string_view homeDirectory = "dsAttrTypeStandard:NFSHomeDirectory";
inline constexpr std::string_view userShell = "dsAttrTypeStandard:UserShell";
inline constexpr std::string_view groupMembership = "dsAttrTypeStandard:GroupMembership";  ///< members' logins
inline constexpr std::string_view authenticationAuthority = "dsAttrTypeStandard:AuthenticationAuthority";

/// Domain of the directory's own errors. Codes: 1 no such node, 2 not supported by the node, 3 no such record; a back
/// end's failures keep the domain and code of the back end.
inline constexpr const char* errorDomain = "directory";
inline constexpr std::int64_t noSuchNode = 1;
inline constexpr std::int64_t notSupported = 2;
inline constexpr std::int64_t noSuchRecord = 3;

/// Domain of the errors of an LDAP node. The code is LDAP's result code; a negative one is the library's own: the
/// server did not answer (not reachable, timed out, the time for the directory is used up).
inline constexpr const char* ldapErrorDomain = "ldap";

}  // namespace directory

using DirectoryAttributes = std::map<std::string, std::vector<std::string>, std::less<>>;

struct ADMINHOST_EXPORT DirectoryQuery {
    enum class Match : std::uint32_t {
        equal = 0x2001,       ///< the whole value; UUIDs without regard to case
        beginsWith = 0x2002,  ///< the beginning of the value, without regard to case
    };

    std::vector<std::string> recordTypes;
    std::string attribute;
    Match match = Match::equal;
    std::vector<std::string> values;      ///< any of them
    std::vector<std::string> attributes;  ///< to return; those that a record lacks are absent
    std::size_t maximum = 0;              ///< the first so many records; 0 is no limit
};

struct ADMINHOST_EXPORT DirectoryRecord {
    std::string type;
    std::string node;  ///< name of the node that holds it
    DirectoryAttributes attributes;
    std::string place{};  ///< how the node itself names the record (a DN); empty for local accounts

    /// The values of an attribute, empty when there are none.
    [[nodiscard]] const std::vector<std::string>& values(std::string_view attribute) const noexcept;
    /// The first value of an attribute, or null.
    [[nodiscard]] const std::string* first(std::string_view attribute) const noexcept;
};

class ADMINHOST_EXPORT DirectoryNode {
  public:
    DirectoryNode() = default;
    DirectoryNode(const DirectoryNode&) = delete;
    DirectoryNode& operator=(const DirectoryNode&) = delete;
    virtual ~DirectoryNode() = default;

    [[nodiscard]] virtual const std::string& name() const noexcept = 0;
    /// The records that match, each once, in an order that is the same for the same content.
    [[nodiscard]] virtual Result<std::vector<DirectoryRecord>> records(const DirectoryQuery& query) = 0;
    /// The groups of the node that a user record of the node is a member of, directly or through other groups, each
    /// once, with the attributes. `person` must have come from this node, with at least its RecordName and
    /// PrimaryGroupID.
    [[nodiscard]] virtual Result<std::vector<DirectoryRecord>> groupsOf(const DirectoryRecord& person,
                                                                        const std::vector<std::string>& attributes);
    /// Checks that the node can be asked, without waiting longer than the limit.
    [[nodiscard]] virtual Result<void> reach(std::chrono::milliseconds limit);

    // Changes. A node that is read only fails with the code for "not supported by the node".

    /// Signs in as a user record of the node; changes are then made with that user's rights. The sign-in ends with the
    /// node or with the request (DirectoryRequest.h), whichever comes first. Returns false if it failed without an
    /// error.
    [[nodiscard]] virtual Result<bool> authenticate(std::string_view username, std::string_view password);
    /// Creates a record and reads it back. Returns nullopt if the record was created and then not found.
    [[nodiscard]] virtual Result<std::optional<DirectoryRecord>> createRecord(std::string_view type,
                                                                              std::string_view name,
                                                                              const DirectoryAttributes& attributes);
    [[nodiscard]] virtual Result<void> deleteRecord(std::string_view type, std::string_view name);
    /// Sets a record's password without giving the old one.
    [[nodiscard]] virtual Result<void> setPassword(std::string_view type, std::string_view name,
                                                   std::string_view password);

  protected:
    [[nodiscard]] Error unsupported(std::string_view operation) const;
};

using OpenedDirectoryNode = Result<std::unique_ptr<DirectoryNode>>;

/// A node that can be opened: its name, and how. A node that is on a network connects at its first query and not when
/// it is opened.
struct ADMINHOST_EXPORT DirectoryNodeSource {
    std::string name;
    std::function<OpenedDirectoryNode()> open;
};

class ADMINHOST_EXPORT DirectorySession {
  public:
    /// The node that searches all nodes of the session in order. It fails as soon as one of them does, and reports that
    /// node as not carried out (platform/framework/Report.h), once in a request.
    static constexpr std::uint32_t authenticationSearchNode = 0x2201;
    static constexpr std::string_view authenticationSearchNodeName = "/Search";

    explicit DirectorySession(std::vector<DirectoryNodeSource> nodes) : _nodes(std::move(nodes)) {}

    /// The process's session: the accounts of this machine, unless setDirectoryNodes() has set other nodes.
    [[nodiscard]] static DirectorySession& defaultSession();

    /// The node returned is never null. Fails if it does not exist or cannot be opened.
    [[nodiscard]] OpenedDirectoryNode openNode(std::uint32_t nodeType) const;
    [[nodiscard]] OpenedDirectoryNode openNode(std::string_view name) const;
    [[nodiscard]] const std::vector<DirectoryNodeSource>& nodes() const noexcept { return _nodes; }

  private:
    friend void setDirectoryNodes(std::vector<DirectoryNodeSource> nodes);
    std::vector<DirectoryNodeSource> _nodes;
};

/// The records of all nodes of the default session, in search order: opens the search node and asks it.
[[nodiscard]] ADMINHOST_EXPORT Result<std::vector<DirectoryRecord>> searchDirectory(const DirectoryQuery& query);

/// Sets the nodes of the default session, in search order. Called by the worker before requests are served.
ADMINHOST_EXPORT void setDirectoryNodes(std::vector<DirectoryNodeSource> nodes);

}  // namespace adminhost
