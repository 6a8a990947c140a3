#pragma once

// The plug-in's commands as the .toml files of this room describe them: the table that requests are checked against,
// and the form in which the daemon's clients get the descriptions. The tables are constants; everything here may be
// called at any time.

#include "platform/framework/Plugin.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace lumio {

/// The values that fit a key. A boolean may also be a number or text, because operations read both as booleans; a real
/// may be a whole number; a scalar is any single value but data.
enum class KeyType : std::uint8_t { any, scalar, text, integer, real, boolean, date, data, list, dictionary };

/// The rules for a value, because of the statement or argument that it becomes part of. Bits.
enum Rule : std::uint8_t {
    ruleStatement = 1U,      ///< is put between double quotes in a statement
    ruleNotAColumn = 2U,     ///< is not the name of a column: the database would read the column instead
    ruleRowNumber = 4U,      ///< a whole number in decimal
    ruleIdentifier = 8U,     ///< letters, digits and hyphens
    ruleArgument = 16U,      ///< is an argument of a tool
    ruleAbsolutePath = 64U,  ///< begins with a slash
    ruleShortNames = 32U,    ///< the "shortName" entries of the list are together in one tool's arguments
    ruleOneLine = 128U,      ///< contains no line feed
};

/// The effect of a change entry. Bits, so that a key can name those for which it is read.
enum EntryEffect : std::uint8_t { effectNothing = 1U, effectAdded = 2U, effectRemoved = 4U, effectChanged = 8U };

/// The flags by which a list's elements choose their effect.
struct EntryDescription {
    std::string_view addedBy;                      ///< the flag of an addition; empty when there are none
    std::string_view removedBy;                    ///< the flag of a removal; empty when there are none
    bool addedFirst;                               ///< which flag counts when both are set
    bool leadingZeros;                             ///< a flag "01" is true
    EntryEffect otherwise;                         ///< what an entry without flags does
    std::span<const std::string_view> addedKinds;  ///< additions of another "type" do nothing; empty: there is no type
    std::span<const std::string_view> columns;     ///< of the table that the entries change
    std::span<const std::string_view> together;    ///< keys whose texts are in one statement
};

struct KeyDescription {
    std::string_view name;  ///< "[]" for a list's elements
    KeyType type;
    std::uint8_t rules;                        ///< Rule bits
    std::uint8_t readFor;                      ///< EntryEffect bits; only told apart within change entries
    std::span<const std::string_view> with;    ///< read only if the same changed entry has one of these
    std::span<const KeyDescription> children;  ///< keys of a dictionary, or the one element description of a list
    const EntryDescription* entry;             ///< for a dictionary that is a change entry, else null
};

struct CommandDescription {
    std::string_view name;
    std::string_view summary;
    adminhost::Access access;
    bool showsRevision;                       ///< its answer includes the settings' revision
    bool takesRevision;                       ///< can be made to depend on a revision
    std::span<const std::string_view> needs;  ///< names for Plugin::probe(), called before it runs: "database"
    std::int64_t deadlineSeconds;             ///< its own bound; 0: the daemon's
    std::span<const KeyDescription> keys;
};

/// All commands, in the order in which people read them.
[[nodiscard]] std::span<const CommandDescription> commands() noexcept;

/// Null for an unknown name.
[[nodiscard]] const CommandDescription* findCommand(std::string_view name) noexcept;

/// The descriptions in the form that clients get: an array of dictionaries (README.md describes them).
[[nodiscard]] adminhost::Value describeCommands();

/// Returns everything that is wrong with the request, in the order of the descriptions; empty if the operations can
/// carry it out. Checks the types of described keys and, in change entries, the keys that the entry's change reads.
/// Keys that no description names pass, and so does a missing key: operations report those themselves.
[[nodiscard]] std::vector<adminhost::Finding> checkRequest(std::string_view command,
                                                           const adminhost::Dictionary& request);

/// The key paths within the request's "configuration" that no description names and that are not columns of the table
/// that an entry changes: operations ignore them. In the request's order. Entries that change nothing are not checked.
[[nodiscard]] std::vector<std::string> unknownKeys(std::string_view command, const adminhost::Dictionary& request);

/// One step of the descriptions' flat form, from which describeCommands() builds them.
struct DescriptionToken {
    enum class Kind : std::uint8_t { dictionary, list, text, integer, boolean, date };
    Kind kind;
    std::string_view key;   ///< within a dictionary
    std::string_view text;  ///< of a text
    std::int64_t number;    ///< count of a dictionary or list; value of the others (a date in seconds since 1970)
};
[[nodiscard]] std::span<const DescriptionToken> descriptionTokens() noexcept;

}  // namespace lumio
