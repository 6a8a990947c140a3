#pragma once

// Confines a child process to some files, with the kernel's Landlock.
//
// A confined child, and every process that it starts, can use a file or directory only if the confinement allows it and
// its account may. It can neither mount, nor use the network over TCP, nor signal or trace processes outside, as far as
// the kernel knows these bounds. Listing attributes (stat) and changing them (chmod, chown) are not confined: Landlock
// does not know them.

#include "platform/files/FileDescriptor.h"
#include "platform/framework/Export.h"
#include "platform/value/Result.h"

#include <cstdint>
#include <string>
#include <utility>

namespace adminhost {

class ADMINHOST_EXPORT Confinement {
  public:
    enum class Access : std::uint8_t {
        read,     ///< a file, or everything below a directory
        execute,  ///< and read
        write,    ///< and read; in a directory also create and remove files, but no directories, links or devices
    };

    /// Returns true if the kernel has Landlock and uses it.
    [[nodiscard]] static bool isAvailable() noexcept;

    /// One that allows nothing yet. Fails (domain "posix") where it is not available.
    [[nodiscard]] static Result<Confinement> create();

    /// Allows the access to what an open descriptor refers to: a file or a directory. Returns the system's error
    /// number, 0 for success.
    [[nodiscard]] int allow(int descriptor, Access access) const noexcept;
    /// The same for a path, whose links are followed. A path that does not exist is a success.
    [[nodiscard]] int allowIfPresent(const std::string& path, Access access) const noexcept;

    /// For ChildPlan::confinement.
    [[nodiscard]] int descriptor() const noexcept { return _ruleset.get(); }

  private:
    Confinement(FileDescriptor ruleset, std::uint64_t known) noexcept : _ruleset(std::move(ruleset)), _known(known) {}

    FileDescriptor _ruleset;
    std::uint64_t _known;  ///< the kinds of access that this kernel can refuse
};

}  // namespace adminhost
