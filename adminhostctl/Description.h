#pragma once

// A command as the daemon describes it. Nothing about commands is known here beyond this form.

#include "platform/value/Value.h"

#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace adminhost::ctl {

/// One key of a request or an answer.
struct DescribedKey {
    std::string path;  ///< "configuration.properties[].name"
    std::string type;  ///< "text", "integer", "boolean", "list", "dictionary", "scalar", ...
    std::string enteredAs;
    std::string unit;
    std::string column;  ///< heading in tables; empty: not shown in one
    std::string help;
    std::vector<std::string> allowed;
    bool secret = false;
    bool required = false;
};

class Description {
  public:
    Description() = default;
    /// What is missing or of another type than described counts as empty.
    explicit Description(const Dictionary& command);

    [[nodiscard]] const std::string& name() const noexcept { return _name; }
    [[nodiscard]] const std::string& summary() const noexcept { return _summary; }
    [[nodiscard]] const std::string& text() const noexcept { return _text; }
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
    Keys _keys;
    Keys _answer;
    Array _errors;
    Dictionary _example;
};

}  // namespace adminhost::ctl
