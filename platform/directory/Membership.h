#pragma once

// Membership: from UUIDs of the directory to the ids and names of the system.
//
// All look-ups go through the nodes of the default session and so see the accounts below the system root, not the name
// service of the machine the process runs on. If the directory fails, the result is "not found".

#include "platform/framework/Export.h"
#include "platform/text/Uuid.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

struct ADMINHOST_EXPORT PosixId {
    enum class Kind : int { user = 0, group = 1 };
    std::uint32_t id = 0;
    Kind kind = Kind::user;

    friend bool operator==(const PosixId&, const PosixId&) = default;
};

/// The UUID of a text of 36 characters, in either case; nullopt for any other text.
[[nodiscard]] ADMINHOST_EXPORT std::optional<Uuid> mbr_string_to_uuid(std::string_view text) noexcept;

/// The user or group id of the first record with the UUID (nodes in order, users before groups).
[[nodiscard]] ADMINHOST_EXPORT std::optional<PosixId> mbr_uuid_to_id(const Uuid& uuid);

/// The login name of a user id, as getpwuid: if several accounts have the id, the first one's. Nodes are asked in order
/// until one knows the id; a node that fails is skipped.
[[nodiscard]] ADMINHOST_EXPORT std::optional<std::string> userNameOf(std::uint32_t userId);
/// The name of a group id, as getgrgid.
[[nodiscard]] ADMINHOST_EXPORT std::optional<std::string> groupNameOf(std::uint32_t groupId);

}  // namespace adminhost
