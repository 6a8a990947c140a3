#pragma once

// One person in a directory, and the files of a node's settings.

#include "tests/integration/ldap/TestDirectory.h"

#include <filesystem>
#include <set>
#include <string>
#include <vector>

#include <sys/stat.h>

namespace adminhost {

class LdapConnections : public testing::Test {
  protected:
    static std::string people() { return tree + personEntry("anna", 1001) + personEntry("writer", 1002); }
    /// A server with them. `global` is further lines of its configuration.
    class ServerWithPeople : public support::Slapd {
      public:
        explicit ServerWithPeople(const std::string& global = {}) : Slapd(withLines(global)) { add(people()); }

      private:
        static Options withLines(const std::string& global) {
            Options options;
            options.global = global;
            return options;
        }
    };
    static DirectoryQuery anna() { return queryFor(directory::recordName, {"anna"}); }
    /// The name of the only record that is found, or the error.
    static std::vector<std::string> found(const LdapNodeSettings& settings) {
        return namesOf(ask(ldapNode(settings), anna()));
    }
    static std::string unusedUri() { return "ldap://127.0.0.1:" + std::to_string(support::freePort()); }

    /// Where the library puts caches in files.
    static std::set<std::string> cacheFiles() {
        std::set<std::string> names;
        for (const auto& entry : std::filesystem::directory_iterator("/tmp")) {
            const std::string name = entry.path().filename();
            if (name.starts_with("krb5cc") || name.starts_with("tkt")) {
                names.insert(name);
            }
        }
        return names;
    }

    [[nodiscard]] HostPath file(const std::string& text, mode_t mode = 0600) {
        const std::filesystem::path path = _directory / ("file" + std::to_string(++_files));
        support::writeFile(path, text);
        ::chmod(path.c_str(), mode);
        return HostPath(path.string());
    }

    struct Directory {
        std::filesystem::path path = support::createTemporaryDirectory("ldap");
        Directory() = default;
        Directory(const Directory&) = delete;
        Directory& operator=(const Directory&) = delete;
        ~Directory() { std::filesystem::remove_all(path); }
        operator const std::filesystem::path&() const { return path; }
        std::filesystem::path operator/(const std::string& name) const { return path / name; }
    };
    Directory _directory;
    int _files = 0;
};

}  // namespace adminhost
