#pragma once

// With which rights the database tool runs on a database file.
//
// A database can hold more than rows: a view can call functions of the tool that write files and run programs. So as
// root, the tool runs as the owner of the database file, and whatever the file holds gets the rights of that account.
// For a file that does not exist the owner of its directory counts. Root stays only if nobody else can change the file,
// or any directory on its path. Everything else is refused: a file whose owner cannot create files in its directory
// (where the tool's journals go), one of root's that others can reach, and a link on the path that others can change.
//
// Where the kernel has Landlock, the tool is confined as well, whatever its account: it can read and write the
// database's directory, read its own configuration, libraries and time zones, and execute nothing but itself.

#include "platform/files/FilePlace.h"
#include "platform/files/Path.h"
#include "platform/task/Confinement.h"
#include "platform/task/StartChild.h"
#include "platform/value/Result.h"

#include <memory>
#include <optional>
#include <string>

namespace lumio {

/// Why the tool does not run on a database, and what to do about it.
struct DatabaseRefusal {
    std::string reason;
    std::string fix;
};

class DatabaseAccess {
  public:
    /// Decides for the file of this moment. Never a refusal unless this process is root.
    [[nodiscard]] static tl::expected<DatabaseAccess, DatabaseRefusal> of(const adminhost::HostPath& database);

    /// The account that the tool runs as; none: that of this process.
    [[nodiscard]] const std::optional<adminhost::ChildRights>& account() const noexcept { return _account; }

    /// The directory with the database file, after all links; empty if it does not exist.
    [[nodiscard]] std::string directory() const;

    /// What confines the tool; null if the kernel has no Landlock, or the tool is a script: nobody knows which files
    /// its interpreter needs. Fails if the confinement cannot be made. For the same files, one is used for a second.
    [[nodiscard]] adminhost::Result<std::shared_ptr<const adminhost::Confinement>> confine(
        const adminhost::DiskPath& tool) const;

  private:
    [[nodiscard]] adminhost::Result<std::shared_ptr<const adminhost::Confinement>> confineNow(
        const adminhost::DiskPath& tool, const std::string& loader) const;

    adminhost::FileRoute _route;
    std::optional<adminhost::ChildRights> _account;
};

}  // namespace lumio
