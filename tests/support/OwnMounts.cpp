#include "tests/support/OwnMounts.h"

#include "tests/support/Program.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <sys/mount.h>
#include <unistd.h>

namespace adminhost::test {

namespace fs = std::filesystem;

namespace {

void check(int status, const char* what) {
    if (status != 0) {
        throw std::runtime_error(std::string(what) + ": " + std::strerror(errno));
    }
}

}  // namespace

void enterOwnMounts(int argc, char** argv) {
    constexpr const char* inside = "ADMINHOST_TEST_NAMESPACE";
    if (std::getenv(inside) != nullptr) {
        return;
    }
    if (const std::string problem = namespaceProblem(); !problem.empty()) {
        throw std::runtime_error(problem);
    }
    ::setenv(inside, "1", 1);
    std::string program = fs::read_symlink("/proc/self/exe");
    std::string words[] = {"unshare", "--map-root-user", "--mount", "--"};
    std::vector<char*> command;
    for (std::string& word : words) {
        command.push_back(word.data());
    }
    command.push_back(program.data());
    command.insert(command.end(), argv + 1, argv + argc);
    command.push_back(nullptr);
    ::execvp("unshare", command.data());
    throw std::runtime_error(std::string("unshare: ") + std::strerror(errno));
}

Mount::Mount(fs::path place, const char* options) : _place(std::move(place)) {
    fs::create_directories(_place);
    check(::mount("tmpfs", _place.c_str(), "tmpfs", 0, options), "mount");
}

Mount::~Mount() {
    ::umount2(_place.c_str(), MNT_DETACH);
}

void Mount::makeReadOnly() const {
    check(::mount("tmpfs", _place.c_str(), "tmpfs", MS_REMOUNT | MS_RDONLY, nullptr), "remount");
    if (std::ofstream(_place / "probe").is_open()) {
        throw std::runtime_error(_place.string() + " is not read-only");
    }
}

void Mount::fill() const {
    std::ofstream file(_place / "filling");
    while (file << 'x' << std::flush) {
    }
    if (fs::space(_place).available != 0) {
        throw std::runtime_error(_place.string() + " is not full");
    }
}

void Mount::makeRoom() const {
    fs::remove(_place / "filling");
}

HangingMount::HangingMount(fs::path place)
    : _place(std::move(place)), _server(::open("/dev/fuse", O_RDWR | O_CLOEXEC)) {
    fs::create_directories(_place);
    if (_server < 0) {
        throw std::runtime_error(std::string("/dev/fuse: ") + std::strerror(errno));
    }
    const std::string options = "fd=" + std::to_string(_server) + ",rootmode=40000,user_id=0,group_id=0";
    check(::mount("hanging", _place.c_str(), "fuse", MS_NOSUID | MS_NODEV, options.c_str()), "mount of fuse");
}

HangingMount::~HangingMount() {
    ::umount2(_place.c_str(), MNT_DETACH);
    ::close(_server);  // ends every wait
}

}  // namespace adminhost::test
