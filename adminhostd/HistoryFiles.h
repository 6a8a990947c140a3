#pragma once

// The files of the histories: where their entries are stored, how they are numbered, written and read, and how a value
// that has become secret is removed from a kept change. Only root can enter the directories.

#include "platform/files/CreateMissing.h"
#include "platform/files/Path.h"
#include "platform/framework/Report.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <optional>
#include <string_view>
#include <system_error>
#include <vector>

namespace adminhost {

/// The path of a file in the directory.
[[nodiscard]] HostPath below(const HostPath& directory, std::string_view name);
/// The directory of the settings' history of a plug-in.
[[nodiscard]] HostPath historyDirectoryOf(std::string_view plugin);
/// The directory of its resources' history.
[[nodiscard]] HostPath resourcesOf(const HostPath& historyDirectory);
/// The directory of an entry of the settings.
[[nodiscard]] HostPath entryOf(const HostPath& directory, std::uint64_t number);
/// The file of an entry of the resources.
[[nodiscard]] HostPath resourceEntryOf(const HostPath& directory, std::uint64_t number);
/// Owner and mode of the directories.
[[nodiscard]] OwnerAndMode historyOwner();

/// The numbers of the entries, in order. Other files in the directory are skipped.
[[nodiscard]] std::vector<std::uint64_t> numbersIn(const HostPath& directory);
[[nodiscard]] std::uint64_t nextAfter(const std::vector<std::uint64_t>& numbers);
/// Removes an entry; a failure is ignored, because the next entry tries again.
void removeAll(const HostPath& path);
[[nodiscard]] Error stepFailed(const char* step, const std::error_code& code);

/// Writes a file of a new entry without a flush, so that no administrator waits for the disk. An entry that a power cut
/// damages is left out when it is read.
[[nodiscard]] std::optional<Error> writePlainly(std::string_view bytes, const HostPath& path);
[[nodiscard]] std::optional<Error> writePlainly(const Dictionary& dictionary, const HostPath& path);
/// Replaces a file of an entry. A reader sees either the old file or the new one.
[[nodiscard]] std::optional<Error> replacePlainly(const Dictionary& dictionary, const HostPath& path);
/// The dictionary in a property list file; nullopt if it cannot be read.
[[nodiscard]] std::optional<Dictionary> readDictionary(const HostPath& path);

/// Replaces what the changes hold of these secrets by "(secret)"; returns true if there was anything to replace.
[[nodiscard]] bool hideIn(Array& changes, const std::vector<SecretPart>& secret);

}  // namespace adminhost
