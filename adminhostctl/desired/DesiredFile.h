#pragma once

// The TOML files of a desired state, which "export" writes and "plan" and "apply" read. The tables are the sections
// that the descriptions name (StateForm.h):
//
//     [remove_unlisted]
//     SWITCH = false           # remove what is not listed here
//
//     [SETTINGS]
//     KEY = 8170
//
//     [SECTION."Main hall"]    # label, or identity if people may use it; identity only where labels are localized
//     FIELD = true
//     TEXT_file = "path"       # in place of TEXT, if that can be a secret: a file beside this one that holds it
//     PEOPLE = ["anna"]
//
// Anything not listed stays as it is. The switches have a table of their own because an element may have any name.

#include "adminhostctl/desired/Plan.h"
#include "adminhostctl/desired/State.h"

#include <set>
#include <string>
#include <string_view>

namespace adminhost::ctl {

/// The table of the switches.
inline constexpr std::string_view switchesTable = "remove_unlisted";

class FileNode;

/// Reads files of which the later ones win, key by key: a setting, a switch, or a key of an element replaces the one of
/// an earlier file, and a list of people is replaced as a whole. The same element may be named in different ways.
class DesiredFiles {
  public:
    struct Options {
        bool force = false;               ///< accept values outside their range
        std::set<std::string> only = {};  ///< sections to read; empty: all
    };

    /// The form and the state must outlive the object.
    DesiredFiles(const StateForm& form, const State& state, Options options);

    /// Reads one more file; `from` is its path, or "-". Throws Failure(usage) with the mistake, its file, line and
    /// column, and what to do: broken TOML, an unknown table, key or setting, a value whose type is neither that of its
    /// key nor that of the stored value, a file of a secret that cannot be used, or, unless forced, a value outside its
    /// range that is not stored yet. Only the names of the tables are checked in sections that are not read.
    void add(std::string_view text, const std::string& from);

    [[nodiscard]] const Wanted& wanted() const noexcept { return _wanted; }

  private:
    [[nodiscard]] bool isChosen(const std::string& section) const;
    void addSwitch(const std::string& key, const FileNode& node);
    void addElements(const ListForm& list, const FileNode& table);

    const StateForm& _form;
    const State& _state;
    Options _options;
    Wanted _wanted;
};

/// Reads one file, as DesiredFiles does.
[[nodiscard]] Wanted parseDesired(std::string_view text, const std::string& from, const StateForm& form,
                                  const State& state, bool force = false);

}  // namespace adminhost::ctl
