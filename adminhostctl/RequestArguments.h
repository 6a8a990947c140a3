#pragma once

// Builds the request dictionary from the words of the command line.

#include "adminhostctl/Description.h"
#include "platform/value/Value.h"

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::ctl {

/// The sources of values that are not on the command line. Each function throws Failure when it cannot read.
struct Sources {
    /// The bytes of a file; "-" is standard input.
    std::function<std::string(const std::string& path)> read;
    /// Asks a person, twice, without showing what is typed; only called when standard input is a terminal.
    std::function<std::string(const std::string& key)> ask;
    bool terminal = false;  ///< standard input is a terminal
    bool clear = false;     ///< an empty secret is intended: it removes the stored one
    /// Asks once for a secret that exists already, without showing what is typed.
    std::function<std::string(const std::string& key)> askKnown = {};
    /// Asks a question; true for yes. Only called when standard input is a terminal.
    std::function<bool(const std::string& question)> confirm = {};
    bool force = false;  ///< values outside their range are accepted
};

/// Builds the request. Each argument is KEY=TEXT (converted to the key's type), KEY:=JSON, KEY@FILE or KEY@- (standard
/// input; a secret is asked for at a terminal). KEY is a path with dots; a number names a list's element, an existing
/// one or the next one. A file of text loses one line end at its end; for a list or a dictionary it holds JSON or an
/// XML property list. Arguments replace what the base request holds. Throws Failure(usage) for an argument of another
/// form, a key that is not described (except with KEY:=JSON), a text that does not fit its key or its range (without
/// Sources::force), a secret on the command
/// line, an empty secret, or a key that is given twice.
[[nodiscard]] Dictionary buildRequest(const Description& command, Dictionary base,
                                      const std::vector<std::string>& arguments, const Sources& sources);

/// The dictionary of a whole request: JSON, or an XML property list. Throws Failure(usage) with line and column.
[[nodiscard]] Dictionary parseRequest(std::string_view bytes, const std::string& from);

/// The value of a word for a key: a text, "@FILE" or "@-". A secret is never on the command line: without a word, or
/// with "@-" at a terminal, the person is asked for it; without a word and with Sources::clear it is empty. Throws
/// Failure(usage) as buildRequest does.
[[nodiscard]] Value valueOfWord(const DescribedKey& key, const std::optional<std::string>& word,
                                const Sources& sources);

/// The same for a key that holds text.
[[nodiscard]] std::string textOfWord(const DescribedKey& key, const std::optional<std::string>& word,
                                     const Sources& sources);

/// The value of a text for a key; throws Failure(usage) when it does not fit. A number may be followed by its unit.
[[nodiscard]] Value valueOfText(const DescribedKey& key, const std::string& text);

/// Why the value is not a sensible one for the key ("is above 65534"); empty if it is, or if the key has no range.
[[nodiscard]] std::string rangeProblem(const DescribedKey& key, const Value& value);

/// "yes", "no" and the other usual words; nullopt for another text.
[[nodiscard]] std::optional<bool> booleanOfText(const std::string& text);

/// "2026-01-31T08:00:00Z", or local time: "2026-01-31 08:00:00", "2026-01-31 08:00", "2026-01-31". Returns nullopt for
/// any other text.
[[nodiscard]] std::optional<Date> dateOfText(const std::string& text);

}  // namespace adminhost::ctl
