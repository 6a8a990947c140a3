#pragma once

// What can be written after "adminhostctl": one row for each verb. Every other word is a command of a plug-in.

#include "adminhostctl/Failure.h"
#include "adminhostctl/Request.h"
#include "adminhostctl/Service.h"

#include <cstddef>
#include <optional>
#include <ostream>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::ctl {

enum class Format { text, json, plist };

struct Options {
    Format format = Format::text;
    std::string file;                 ///< of the whole request; empty for none
    std::string passwordFile;         ///< of the grid password; empty for none
    bool names = false;               ///< only names, one a line, for completion
    bool group = false;               ///< short names are groups'
    std::optional<bool> isProtected;  ///< whether a property is to be protected
    std::size_t width = 80;           ///< columns of the terminal
};

/// What a verb works with.
struct Context {
    Service& service;
    const Options& options;
    const Sources& sources;
    std::ostream& out;
    std::ostream& err;
};

struct Verb {
    std::string_view words;      ///< "camera list"
    std::string_view arguments;  ///< for people: "NAME|UUID"
    std::string_view summary;
    std::size_t least;  ///< how many arguments
    std::size_t most;
    ExitStatus (*run)(const Context& context, std::span<const std::string> arguments);
};

[[nodiscard]] std::span<const Verb> verbs() noexcept;

/// Writes a value in the asked format; as text, it stands at the path of the command's answer. Throws Failure.
void writeValue(const Context& context, const Value& value, const Description& description,
                const std::string& path = {});

/// Runs the verb, or the command, that the words begin with. Throws Failure.
[[nodiscard]] ExitStatus run(const Context& context, const std::vector<std::string>& words);

}  // namespace adminhost::ctl
