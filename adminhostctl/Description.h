#pragma once

// A command as the daemon describes it. No command is known here; only this form is.

#include "platform/value/Value.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

namespace adminhost::ctl {

/// One key of a request or an answer.
struct DescribedKey {
    std::string path;  ///< "list[].name"
    std::string type;  ///< "text", "integer", "boolean", "list", "dictionary", "scalar", ...
    std::string enteredAs;
    std::string filledWith;  ///< of a list: "languages" if the caller's are sent where a request has none
    std::string unit;
    std::string column;  ///< heading in tables; empty: not shown in one
    std::string help;
    std::string defaultKey;  ///< of a setting in an answer: the key there that holds its default; empty: not known
    std::vector<std::string> allowed;
    std::optional<std::int64_t> minimum;  ///< of the sensible range of a number
    std::optional<std::int64_t> maximum;
    bool secret = false;
    bool required = false;
    // Of a list's element that is a person or a group.
    std::vector<std::string> title;  ///< keys of the element; the first with a text is shown for it
    std::string kind;                ///< key of the element that holds "user", "group", ...
    // Parts of a state that can be written; empty if they do not apply.
    std::string section;                  ///< table of a file: of plain values, of a list's elements
    std::string file;                     ///< of a setting: the settings file that holds it
    std::vector<std::string> locates;     ///< of a setting: files that move when it changes
    bool ofHost = false;                  ///< of a setting: part of the identity of one host
    std::vector<std::string> restart;     ///< of a setting: commands to run for it to take effect
    std::string lookedUp;                 ///< of a setting: which values a write replaces
    std::string shownBy;                  ///< of a secret setting: the key that shows whether it is set
    std::string identity;                 ///< of an element: the key that a write names it by
    std::string label;                    ///< of an element: the key that people name it by
    bool byIdentity = false;              ///< of an element: people may name it by identity too
    bool localized = false;               ///< of an element: the label depends on languages, so files use the identity
    std::vector<std::string> otherNames;  ///< of an element: more keys that people name it by
    std::string addedBy;                  ///< of an element: the flag that adds one
    std::string removedBy;                ///< of an element: the flag that removes one
    std::string unlisted;                 ///< of an element: the switch that removes unlisted elements
    std::vector<std::pair<std::string, std::string>> kinds;  ///< of an element: its name in a file for each kind
    std::string inFile;                                      ///< of an element's key: its name in a file
    std::string secretIf;                                    ///< of an element's key: secret while this key is true
};

/// One check of a command that tries settings (state "try").
struct Trial {
    std::string name;                ///< for people
    std::vector<std::string> needs;  ///< keys of the request without which it is not made
    std::vector<std::string> uses;   ///< further keys that it reads
    std::string error;               ///< key of the answer: present if the trial failed
    std::string detail;              ///< key of the answer that explains the error; empty: none
};

class Description {
  public:
    Description() = default;
    /// A part that is missing, or has another type than expected, counts as empty.
    explicit Description(const Dictionary& command);

    [[nodiscard]] const std::string& name() const noexcept { return _name; }
    [[nodiscard]] const std::string& summary() const noexcept { return _summary; }
    [[nodiscard]] const std::string& text() const noexcept { return _text; }
    /// Whether the command may change something: it has another right than reading.
    [[nodiscard]] bool changes() const noexcept { return _changes; }
    /// The command's own time limit; nullopt if the daemon's applies.
    [[nodiscard]] std::optional<std::chrono::seconds> deadline() const noexcept { return _deadline; }
    /// "read" if the command reads the state, "write" if it writes it, "try" if it tries values before they are
    /// written, "names" if it lists names of elements; empty for other commands.
    [[nodiscard]] const std::string& state() const noexcept { return _state; }
    [[nodiscard]] const std::vector<Trial>& trials() const noexcept { return _trials; }
    /// A request that reads only this section of the state; empty if the description has none.
    [[nodiscard]] Dictionary partOf(const std::string& section) const;
    [[nodiscard]] const std::vector<DescribedKey>& keys() const noexcept { return _keys.all; }
    [[nodiscard]] const std::vector<DescribedKey>& answerKeys() const noexcept { return _answer.all; }
    [[nodiscard]] const Array& errors() const noexcept { return _errors; }
    [[nodiscard]] const Dictionary& example() const noexcept { return _example; }

    /// Null if the path is not described.
    [[nodiscard]] const DescribedKey* key(std::string_view path) const noexcept { return _keys.find(path); }
    [[nodiscard]] const DescribedKey* answerKey(std::string_view path) const noexcept { return _answer.find(path); }

  private:
    struct Keys {
        std::vector<DescribedKey> all;
        std::unordered_map<std::string, std::size_t> index;

        void add(const Value& described);
        [[nodiscard]] const DescribedKey* find(std::string_view path) const noexcept;
    };

    std::string _name;
    std::string _summary;
    std::string _text;
    bool _changes = false;
    std::optional<std::chrono::seconds> _deadline;
    std::string _state;
    std::vector<Trial> _trials;
    Dictionary _parts;
    Keys _keys;
    Keys _answer;
    Array _errors;
    Dictionary _example;
};

}  // namespace adminhost::ctl
