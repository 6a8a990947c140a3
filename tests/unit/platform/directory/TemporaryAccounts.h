#pragma once

// A system root in a directory of its own, with account files, which is set while the object exists.

#include "platform/directory/Directory.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/files/Path.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

namespace adminhost {

class TemporaryAccounts {
  public:
    TemporaryAccounts() {
        const char* base = std::getenv("TMPDIR");
        std::string pattern = std::string(base == nullptr ? "/tmp" : base) + "/accounts.XXXXXX";
        if (::mkdtemp(pattern.data()) == nullptr) {
            std::abort();
        }
        _directory = pattern;
        std::filesystem::create_directory(_directory / "etc");
        setSystemRoot(_directory.string());
        setDirectoryNodes({localAccounts()});
    }
    TemporaryAccounts(const TemporaryAccounts&) = delete;
    TemporaryAccounts& operator=(const TemporaryAccounts&) = delete;
    ~TemporaryAccounts() {
        setSystemRoot("/");
        setDirectoryNodes({localAccounts()});
        std::filesystem::remove_all(_directory);
    }

    /// Writes a file below the root.
    void write(const std::string& path, const std::string& text) const {
        std::ofstream file(_directory / path, std::ios::binary);
        file << text;
    }
    void users(const std::string& text) const { write("etc/passwd", text); }
    void groups(const std::string& text) const { write("etc/group", text); }
    [[nodiscard]] std::filesystem::path path(const std::string& name) const { return _directory / name; }

  private:
    std::filesystem::path _directory;
};

}  // namespace adminhost
