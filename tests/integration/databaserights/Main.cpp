// These tests give files to other accounts and drop rights, so they run as root: of the machine, if they are started as
// root, otherwise of a user namespace with a range of ids. One account of the tests is added to the account database
// that this process sees.

#include "tests/integration/databaserights/ServiceAccount.h"
#include "tests/support/UserNamespace.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <stdexcept>
#include <string>
#include <string_view>

#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <unistd.h>

namespace {

void check(int status, const char* what) {
    if (status != 0) {
        throw std::runtime_error(std::string(what) + ": " + std::strerror(errno));
    }
}

/// Lays a copy of the file over the system's, with this line instead of those of an outer run.
void addLine(const std::string& directory, const std::string& file, const std::string& line) {
    const std::string name = line.substr(0, line.find(':') + 1);
    const std::string copy = directory + "/" + std::filesystem::path(file).filename().string();
    std::ofstream out(copy);
    std::ifstream in(file);
    for (std::string entry; std::getline(in, entry);) {
        if (!entry.starts_with(name)) {
            out << entry << '\n';
        }
    }
    out << line << std::endl;
    std::filesystem::permissions(copy, std::filesystem::perms(0644));
    check(::mount(copy.c_str(), file.c_str(), nullptr, MS_BIND, nullptr), "mount");
}

}  // namespace

int main(int argc, char** argv) {
    if (::geteuid() != 0) {
        std::vector<std::string> self = {std::filesystem::read_symlink("/proc/self/exe").string()};
        self.insert(self.end(), argv + 1, argv + argc);
        const auto result = adminhost::test::runInMappedNamespace(self);
        std::cout << result.output;
        return result.status;
    }
    check(::unshare(CLONE_NEWNS), "unshare");
    check(::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr), "mount");
    // The accounts of this program cannot enter a temporary directory that is closed to others.
    const char* const place = std::string_view(BINARY_DIR).starts_with("/mnt/") ? "/media" : "/mnt";
    check(::mount("tmpfs", place, "tmpfs", 0, "mode=1777"), "mount");
    ::setenv("TMPDIR", place, 1);
    using namespace accounts;
    std::string directory = (std::filesystem::temp_directory_path() / "accounts-XXXXXX").string();
    if (::mkdtemp(directory.data()) == nullptr) {
        throw std::runtime_error("cannot create " + directory);
    }
    std::filesystem::permissions(directory, std::filesystem::perms(0755));
    addLine(directory, "/etc/passwd",
            "service-of-test:x:" + std::to_string(user) + ":" + std::to_string(group) + "::" + directory + ":/bin/sh");
    addLine(directory, "/etc/group", "group-of-test:x:" + std::to_string(further) + ":service-of-test");
    home() = directory;
    testing::InitGoogleTest(&argc, argv);
    const int status = RUN_ALL_TESTS();
    std::filesystem::remove_all(directory);
    return status;
}
