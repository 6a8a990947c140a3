#include "tests/support/AvahiNamespace.h"

#include "tests/support/RunAgain.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <stdexcept>

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

constexpr const char* daemonVariable = "AVAHI_DAEMON_PID";

pid_t avahiDaemon() {
    const char* text = std::getenv(daemonVariable);
    const long pid = text == nullptr ? 0 : std::strtol(text, nullptr, 10);
    if (pid <= 1) {
        throw std::runtime_error("not inside with-avahi");
    }
    return static_cast<pid_t>(pid);
}

/// Reads until the text has arrived; the writer must send it within 20 seconds.
bool awaitText(int descriptor, const std::string& text) {
    std::string seen;
    pollfd wait{descriptor, POLLIN, 0};
    while (::poll(&wait, 1, 20'000) == 1) {
        char buffer[512];
        const ssize_t count = ::read(descriptor, buffer, sizeof buffer);
        if (count <= 0) {
            return false;
        }
        seen.append(buffer, static_cast<std::size_t>(count));
        if (seen.find(text) != std::string::npos) {
            return true;
        }
    }
    return false;
}

void endChild(pid_t child) {
    ::kill(child, SIGTERM);
    while (::waitpid(child, nullptr, 0) < 0 && errno == EINTR) {
    }
}

}  // namespace

void enterAvahiNamespace(int argc, char** argv) {
    if (std::getenv(daemonVariable) == nullptr) {
        runAgainBelow("with-avahi", argc, argv);
    }
}

PublishedService::PublishedService(const std::string& name, const std::string& type) {
    int ends[2];
    if (::pipe2(ends, O_CLOEXEC) != 0) {
        throw std::runtime_error("no pipe");
    }
    posix_spawn_file_actions_t actions;
    ::posix_spawn_file_actions_init(&actions);
    ::posix_spawn_file_actions_adddup2(&actions, ends[1], STDERR_FILENO);  // on which the tool reports success
    std::string words[] = {"avahi-publish-service", "-s", name, type, "7777"};
    char* const command[] = {words[0].data(), words[1].data(), words[2].data(),
                             words[3].data(), words[4].data(), nullptr};
    const int status = ::posix_spawnp(&_child, command[0], &actions, nullptr, command, ::environ);
    ::posix_spawn_file_actions_destroy(&actions);
    ::close(ends[1]);
    const bool published = status == 0 && awaitText(ends[0], "Established");
    ::close(ends[0]);
    if (!published) {
        if (status == 0) {
            endChild(_child);
        }
        throw std::runtime_error("avahi-publish-service did not publish " + name);
    }
}

PublishedService::~PublishedService() {
    endChild(_child);
}

SilentAvahi::SilentAvahi() : _daemon(avahiDaemon()) {
    ::kill(_daemon, SIGSTOP);
}

SilentAvahi::~SilentAvahi() {
    ::kill(_daemon, SIGCONT);
}

}  // namespace adminhost::test
