#pragma once

// Keeping secrets out of the audit.

#include "platform/framework/Plugin.h"
#include "platform/value/Value.h"

#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

/// Knows the secrets of one request and takes them out of everything that is recorded about it.
///
/// The command's description names the keys whose values are secret. These values are looked for in every text,
/// whatever wrote it: a tool may repeat a password in its message. Besides, no value of a key of such a name is shown.
class Redaction {
  public:
    static constexpr std::string_view mark = "(secret)";  ///< in the place of a secret

    /// No secrets are known.
    Redaction() = default;
    Redaction(const Command& command, const Dictionary& request);

    /// The text with every secret replaced, also in the forms in which tools and files write it: with quotes doubled,
    /// as in JSON, and as base64.
    [[nodiscard]] std::string text(std::string_view text) const { return replacedIn(text, _secrets); }
    /// A change or a part that was not done, as requests report them (docs/http.md): without secrets in any of its
    /// texts and values, and without what would undo it. The values of a secret key are removed, and the change is
    /// marked as secret.
    [[nodiscard]] Dictionary report(const Dictionary& report) const;

  private:
    using Secrets = std::vector<std::string>;  ///< the longest first

    [[nodiscard]] static std::string replacedIn(std::string_view text, const Secrets& secrets);
    [[nodiscard]] static Value replaced(const Value& value, const Secrets& secrets);

    Secrets _secrets;
    Secrets _certain;  ///< of them, those that are secret whatever the stored state is
    std::set<std::string, std::less<>> _secretKeys;
    std::set<std::string, std::less<>> _conditionalKeys;  ///< whose values are secret only in some elements
};

}  // namespace adminhost
