#pragma once

// Bundles: directories that carry texts in several languages.
//
// A bundle's localizations are the subdirectories of its "Contents/Resources", of its "Resources" and of itself that
// are named after a language (Language.h), with or without an extension. A strings table is a file TABLE.strings in one
// of them. A bundle may be on a file system that others write to: reads are bounded, a pipe is never waited for, and
// localizations and tables that links lead to outside the system root count as missing.

#include "platform/bundle/StringsTable.h"
#include "platform/files/Path.h"
#include "platform/framework/Export.h"
#include "platform/value/Value.h"

#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace adminhost {

class ADMINHOST_EXPORT Bundle {
  public:
    /// Returns nullopt if the path is not a directory.
    [[nodiscard]] static std::optional<Bundle> open(const HostPath& path);

    [[nodiscard]] const HostPath& path() const noexcept { return _path; }
    /// The localizations' names as they are spelled, without extension; each once, in alphabetical order.
    [[nodiscard]] std::vector<std::string> localizations() const;
    /// The file with the table of that localization (spelled as localizations() does); nullopt if it has none.
    [[nodiscard]] std::optional<DiskPath> stringsTable(std::string_view table, std::string_view localization) const;

  private:
    struct Localization {
        std::string name;
        DiskPath directory;
    };

    explicit Bundle(HostPath path) : _path(std::move(path)) {}
    /// By name, then in search order. Lists the directories on the first call: opening a bundle is cheap.
    [[nodiscard]] const std::vector<Localization>& listed() const;

    HostPath _path;
    mutable std::optional<std::vector<Localization>> _localizations;
};

/// Reads a strings table of any form: XML, binary or quoted text. Fails if it cannot be read, is not a dictionary or is
/// larger than stringsTableMaximumSize.
[[nodiscard]] ADMINHOST_EXPORT Result<Dictionary> readStringsTable(const DiskPath& path);

/// The table in the best of the preferred languages (names or codes, most preferred first) that has it, else in
/// "English". Returns nullopt if there is none, and also if the first one found cannot be read.
[[nodiscard]] ADMINHOST_EXPORT std::optional<Dictionary> localizedTable(
    const Bundle& bundle, std::string_view table, const std::vector<std::string>& preferredLanguages);

}  // namespace adminhost
