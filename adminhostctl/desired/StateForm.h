#pragma once

// The parts of a state that can be written. All of them come from the description of the writing command, so that no
// key, table or command of a service is named here (commands/README.md explains the words of the descriptions).

#include "adminhostctl/Description.h"

#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace adminhost::ctl {

/// A key of an element that holds one text or boolean.
struct FieldForm {
    std::string key;
    std::string inFile;    ///< its name in a file
    bool boolean = false;  ///< else a text
    std::string secretIf;  ///< key of the boolean that makes it a secret; empty: it is not a secret
};

/// A key of an element that holds a list of people.
struct PeopleForm {
    std::string key;
    std::string identity;
    std::string label;
    std::string kind;  ///< key that holds the kind
    std::string addedBy;
    std::string removedBy;
    std::string unlisted;                                    ///< switch that removes those that a file does not list
    std::vector<std::pair<std::string, std::string>> kinds;  ///< kind, and the name of its list in a file
};

/// A list of elements. In a file, each element is a table.
struct ListForm {
    std::string section;  ///< name of the table
    std::string key;      ///< of the list in the state
    std::string identity;
    std::string label;
    bool byIdentity = false;
    bool localized = false;               ///< the label depends on languages: files name elements by identity only
    std::vector<std::string> otherNames;  ///< further keys that people name an element by
    std::string addedBy;                  ///< empty: only the service adds elements
    std::string removedBy;
    std::string unlisted;
    std::vector<FieldForm> fields;
    std::vector<PeopleForm> people;

    /// Null if there is none.
    [[nodiscard]] const FieldForm* fieldOf(std::string_view key) const noexcept;
    [[nodiscard]] const FieldForm* fieldInFile(std::string_view name) const noexcept;
    /// Whether it is the name that a file gives to a list of people.
    [[nodiscard]] bool isPeople(std::string_view name) const noexcept;
};

class StateForm {
  public:
    /// Throws Failure(failed) when the description names no section of plain values.
    explicit StateForm(const Description& write);

    /// The key of request and answer that holds the state.
    [[nodiscard]] const std::string& root() const noexcept { return _root; }
    /// Name of the table of the plain values.
    [[nodiscard]] const std::string& settingsSection() const noexcept { return _settingsSection; }
    /// Name of the command that writes the state, for messages.
    [[nodiscard]] const std::string& command() const noexcept { return _command; }
    /// The settings that can be written and read, and those that can only be written. A path is below root().
    [[nodiscard]] const std::vector<DescribedKey>& settings() const noexcept { return _settings; }
    [[nodiscard]] const std::vector<DescribedKey>& secrets() const noexcept { return _secrets; }
    /// Sections whose elements people create come first.
    [[nodiscard]] const std::vector<ListForm>& lists() const noexcept { return _lists; }

    /// The setting, or the secret setting, with this name; null if there is none.
    [[nodiscard]] const DescribedKey* setting(std::string_view name) const noexcept;
    [[nodiscard]] const DescribedKey* secret(std::string_view name) const noexcept;
    /// The list with the section's name; throws Failure(failed) if there is none.
    [[nodiscard]] const ListForm& list(std::string_view section) const;
    /// Names of the switches that remove what a file does not list.
    [[nodiscard]] std::vector<std::string> switches() const;
    /// Name of a setting: its path without the root.
    [[nodiscard]] std::string nameOf(const DescribedKey& setting) const;

  private:
    void addList(const Description& write, const DescribedKey& element);

    std::string _command;
    std::string _root;
    std::string _settingsSection;
    std::vector<DescribedKey> _settings;
    std::vector<DescribedKey> _secrets;
    std::vector<ListForm> _lists;
};

}  // namespace adminhost::ctl
