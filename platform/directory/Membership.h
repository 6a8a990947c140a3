#pragma once

// Membership: from UUIDs of the directory to the ids and names of the system.
//
// All look-ups go through the nodes of the default session and so see the accounts of the directory, not those of the
// name service of the machine the process runs on. Nodes are asked in search order. A node that fails is skipped; if no
// other node has the record, the result is its error.

#include "platform/framework/Export.h"
#include "platform/text/Uuid.h"
#include "platform/value/Result.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

struct ADMINHOST_EXPORT PosixId {
    enum class Kind : int { user = 0, group = 1 };
    std::uint32_t id = 0;
    Kind kind = Kind::user;
    std::string node{};  ///< the id's meaning is that node's: the same id in two nodes is two people

    friend bool operator==(const PosixId&, const PosixId&) = default;
};

/// The UUID of a text of 36 characters, in either case; nullopt for any other text.
[[nodiscard]] ADMINHOST_EXPORT std::optional<Uuid> mbr_string_to_uuid(std::string_view text) noexcept;

/// The user or group id of the first record with the UUID (users before groups). Returns nullopt if the
/// record is not found or has no numeric id.
[[nodiscard]] ADMINHOST_EXPORT Result<std::optional<PosixId>> mbr_uuid_to_id(const Uuid& uuid);

/// The login or group name of an id, from the node of the id, as getpwuid and getgrgid: if several records have the id,
/// the first one's. Returns nullopt if there is none.
[[nodiscard]] ADMINHOST_EXPORT Result<std::optional<std::string>> nameOf(const PosixId& id);

}  // namespace adminhost
