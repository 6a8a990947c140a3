#include "tests/support/TemporaryRoot.h"

#include "platform/files/Path.h"

#include <array>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {

namespace fs = std::filesystem;

TemporaryRoot::TemporaryRoot() {
    std::string pattern = (fs::temp_directory_path() / "adminhost-root.XXXXXX").string();
    if (::mkdtemp(pattern.data()) == nullptr) {
        throw std::runtime_error("cannot make " + pattern);
    }
    _directory = pattern;
    fs::create_directories(path("/usr/bin"));
    fs::create_symlink("/usr/bin/sqlite3", path("/usr/bin/sqlite3"));
    setSystemRoot(_directory);
}

TemporaryRoot::~TemporaryRoot() {
    setSystemRoot("/");
    std::error_code ignored;
    fs::remove_all(_directory, ignored);
}

fs::path TemporaryRoot::path(std::string_view hostPath) const {
    return _directory.string().append(hostPath);
}

void TemporaryRoot::write(std::string_view hostPath, std::string_view text) const {
    fs::create_directories(path(hostPath).parent_path());
    fs::remove(path(hostPath));  // a link may point out of the root, to this machine's tool
    std::ofstream file(path(hostPath), std::ios::binary);
    file << text;
    if (!file.flush()) {
        throw std::runtime_error("cannot write " + path(hostPath).string());
    }
}

void TemporaryRoot::writeTool(std::string_view hostPath, std::string_view text) const {
    write(hostPath, text);
    fs::permissions(path(hostPath), fs::perms(0755));
}

void TemporaryRoot::writePropertyList(std::string_view hostPath, std::string_view dictionaryContent) const {
    write(hostPath, std::string("<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\"><dict>")
                        .append(dictionaryContent)
                        .append("</dict></plist>\n"));
}

std::string TemporaryRoot::read(std::string_view hostPath) const {
    std::ifstream file(path(hostPath), std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

std::string TemporaryRoot::sql(std::string_view database, const std::string& statements) const {
    std::array<int, 2> ends{};
    if (::pipe(ends.data()) != 0) {
        throw std::runtime_error("no pipe");
    }
    const std::string file = path(database);
    fs::create_directories(fs::path(file).parent_path());
    std::array<const char*, 5> arguments{"sqlite3", "-batch", file.c_str(), statements.c_str(), nullptr};
    posix_spawn_file_actions_t actions;
    ::posix_spawn_file_actions_init(&actions);
    ::posix_spawn_file_actions_adddup2(&actions, ends[1], STDOUT_FILENO);
    ::posix_spawn_file_actions_addclose(&actions, ends[0]);
    ::posix_spawn_file_actions_addclose(&actions, ends[1]);
    pid_t child = 0;
    const int failure =
        ::posix_spawn(&child, "/usr/bin/sqlite3", &actions, nullptr, const_cast<char**>(arguments.data()), environ);
    ::posix_spawn_file_actions_destroy(&actions);
    ::close(ends[1]);
    std::string output;
    std::array<char, 4096> buffer{};
    for (ssize_t count = 0; (count = ::read(ends[0], buffer.data(), buffer.size())) > 0;) {
        output.append(buffer.data(), static_cast<std::size_t>(count));
    }
    ::close(ends[0]);
    int status = 0;
    if (failure != 0 || ::waitpid(child, &status, 0) != child || status != 0) {
        throw std::runtime_error("sqlite3 failed: " + statements);
    }
    return output;
}

}  // namespace adminhost::test
