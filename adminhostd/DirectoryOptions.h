#pragma once

// The directory's nodes as the configuration describes them.

#include "platform/directory/LdapNode.h"

#include <chrono>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

struct DirectoryNodeOptions {
    bool local = false;         ///< the accounts of this machine: only the name and the Kerberos realm count
    LdapNodeSettings settings;  ///< credentialsDirectory is left to the worker
    /// Where the keys are in the file, "FILE, line 3, column 7", for messages of a check that the front cannot make.
    /// The node itself has the key "".
    std::map<std::string, std::string> places;

    bool operator==(const DirectoryNodeOptions&) const = default;
};

struct DirectoryOptions {
    std::vector<DirectoryNodeOptions> nodes;   ///< in search order; empty: the accounts of this machine
    std::chrono::milliseconds budget{10'000};  ///< for all directory work of a request
};

/// A word of the configuration and its meaning.
template <class E>
struct DirectoryWord {
    std::string_view text;
    E value;
};

inline constexpr DirectoryWord<LdapNodeSettings::Sasl> saslWords[] = {{"none", LdapNodeSettings::Sasl::none},
                                                                      {"external", LdapNodeSettings::Sasl::external},
                                                                      {"gssapi", LdapNodeSettings::Sasl::gssapi}};
inline constexpr DirectoryWord<LdapNodeSettings::Verify> verifyWords[] = {{"demand", LdapNodeSettings::Verify::demand},
                                                                          {"never", LdapNodeSettings::Verify::never}};
inline constexpr DirectoryWord<LdapNodeSettings::Schema> schemaWords[] = {
    {"rfc2307", LdapNodeSettings::Schema::rfc2307},
    {"rfc2307bis", LdapNodeSettings::Schema::rfc2307bis},
    {"ad", LdapNodeSettings::Schema::ad}};
inline constexpr DirectoryWord<LdapNodeSettings::UuidForm> uuidFormWords[] = {
    {"text", LdapNodeSettings::UuidForm::text},
    {"binary", LdapNodeSettings::UuidForm::binary},
    {"guid", LdapNodeSettings::UuidForm::guid}};

}  // namespace adminhost
