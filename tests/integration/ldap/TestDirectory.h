#pragma once

// People and groups for a temporary LDAP server, and a session with nodes in it.

#include "platform/directory/Directory.h"
#include "platform/directory/DirectoryRequest.h"
#include "platform/directory/LdapNode.h"
#include "platform/directory/LocalAccounts.h"
#include "tests/support/Slapd.h"

#include <csignal>
#include <string>
#include <string_view>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost {

/// As in the worker: writing to a server that went away is an error and not the end of the process.
inline const bool brokenPipesAreIgnored = std::signal(SIGPIPE, SIG_IGN) != SIG_ERR;

/// "00000000-0000-4000-8000-" and the number, 12 digits wide.
[[nodiscard]] inline std::string uuidNumber(int number) {
    std::string digits = std::to_string(number);
    return "00000000-0000-4000-8000-" + std::string(12 - digits.size(), '0') + digits;
}

inline const std::string tree = R"(dn: dc=nimbo,dc=test
objectClass: domain
dc: nimbo

dn: ou=people,dc=nimbo,dc=test
objectClass: organizationalUnit
ou: people

dn: ou=groups,dc=nimbo,dc=test
objectClass: organizationalUnit
ou: groups

)";

/// An account's entry; further lines may be appended before the empty line.
[[nodiscard]] inline std::string personEntry(const std::string& uid, int number, const std::string& more = {}) {
    return "dn: uid=" + uid + ",ou=people,dc=nimbo,dc=test\nobjectClass: account\nobjectClass: posixAccount\n" +
           "objectClass: simpleSecurityObject\nobjectClass: krbPrincipalAux\nobjectClass: testIdentified\nuid: " + uid +
           "\ncn: Full Name of " + uid + "\nuidNumber: " + std::to_string(number) +
           "\ngidNumber: 100\nhomeDirectory: /home/" + uid + "\nuserPassword: " + uid +
           "pw\nentryUUID: " + uuidNumber(number) + "\n" + more + "\n";
}

[[nodiscard]] inline std::string groupEntry(const std::string& cn, int number, const std::string& more = {}) {
    return "dn: cn=" + cn + ",ou=groups,dc=nimbo,dc=test\nobjectClass: posixGroup\ncn: " + cn +
           "\ngidNumber: " + std::to_string(number) + "\nentryUUID: " + uuidNumber(number) + "\n" + more + "\n";
}

[[nodiscard]] inline LdapNodeSettings settingsFor(const support::Slapd& server) {
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.uris = {server.localUri()};
    settings.base = support::Slapd::suffix;
    return settings;
}

[[nodiscard]] inline DirectoryQuery queryFor(std::string_view attribute, std::vector<std::string> values) {
    DirectoryQuery query;
    query.recordTypes = {std::string(directory::users), std::string(directory::groups)};
    query.attribute = attribute;
    query.values = std::move(values);
    query.attributes = {std::string(directory::recordName), std::string(directory::realName),
                        std::string(directory::generatedUID)};
    return query;
}

/// The node of the settings, opened once more for each call.
[[nodiscard]] inline Result<std::vector<DirectoryRecord>> ask(const DirectoryNodeSource& source,
                                                              const DirectoryQuery& query) {
    return source.open().value()->records(query);
}

/// First names of records; the error's text in their place if there is one.
[[nodiscard]] inline std::vector<std::string> namesOf(const Result<std::vector<DirectoryRecord>>& records) {
    if (!records) {
        return {"error " + std::to_string(records.error().code) + ": " + records.error().description.value_or("")};
    }
    std::vector<std::string> names;
    for (const DirectoryRecord& record : *records) {
        const std::string* name = record.first(directory::recordName);
        names.push_back(name == nullptr ? "(no name)" : *name);
    }
    return names;
}

template <class T>
[[nodiscard]] Error errorOf(const Result<T>& result) {
    return result ? Error{"no error", 0, std::nullopt} : result.error();
}

/// The default session has these nodes while the object exists.
class SessionWith {
  public:
    explicit SessionWith(std::vector<DirectoryNodeSource> nodes) { setDirectoryNodes(std::move(nodes)); }
    SessionWith(const SessionWith&) = delete;
    SessionWith& operator=(const SessionWith&) = delete;
    ~SessionWith() { setDirectoryNodes({localAccounts()}); }
};

}  // namespace adminhost
