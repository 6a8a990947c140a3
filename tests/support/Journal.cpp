#include "tests/support/Journal.h"

#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <stdexcept>

#include <grp.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

constexpr int exceptionStatus = 99;

/// Sends a descriptor over a socket pair.
bool sendDescriptor(int conversation, int descriptor) {
    char byte = 0;
    iovec data{&byte, 1};
    alignas(cmsghdr) char room[CMSG_SPACE(sizeof descriptor)] = {};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = room;
    message.msg_controllen = sizeof room;
    cmsghdr* const header = CMSG_FIRSTHDR(&message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(sizeof descriptor);
    std::memcpy(CMSG_DATA(header), &descriptor, sizeof descriptor);
    return ::sendmsg(conversation, &message, 0) == 1;
}

int receiveDescriptor(int conversation) {
    char byte = 0;
    iovec data{&byte, 1};
    int descriptor = -1;
    alignas(cmsghdr) char room[CMSG_SPACE(sizeof descriptor)] = {};
    msghdr message{};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = room;
    message.msg_controllen = sizeof room;
    if (::recvmsg(conversation, &message, MSG_CMSG_CLOEXEC) == 1) {
        const cmsghdr* const header = CMSG_FIRSTHDR(&message);
        if (header != nullptr && header->cmsg_type == SCM_RIGHTS) {
            std::memcpy(&descriptor, CMSG_DATA(header), sizeof descriptor);
        }
    }
    return descriptor;
}

}  // namespace

void enterJournal(int argc, char** argv) {
    if (std::getenv("JOURNAL_GROUPS") != nullptr) {
        return;
    }
    std::string script = SOURCE_DIR "/tests/support/with-journal";
    std::string self = std::filesystem::read_symlink("/proc/self/exe");
    std::vector<char*> command = {script.data(), self.data()};
    command.insert(command.end(), argv + 1, argv + argc);
    command.push_back(nullptr);
    ::execv(script.c_str(), command.data());
    throw std::runtime_error("cannot run " + script + ": " + std::strerror(errno));
}

int runAs(const TestAccount& account, const std::string& directory, const std::function<int()>& function) {
    const pid_t child = ::fork();
    if (child == 0) {
        int status = exceptionStatus;
        try {
            if (::chdir(directory.c_str()) == 0 && ::setgroups(account.groups.size(), account.groups.data()) == 0 &&
                ::setresgid(account.uid, account.uid, account.uid) == 0 &&
                ::setresuid(account.uid, account.uid, account.uid) == 0) {
                status = function();
            }
        } catch (...) {
            status = exceptionStatus;
        }
        ::_exit(status);
    }
    int status = -1;
    if (child < 0 || ::waitpid(child, &status, 0) != child) {
        throw std::runtime_error(std::string("cannot run as another account: ") + std::strerror(errno));
    }
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

UnixHttp connectAs(const TestAccount& account, const std::string& socket) {
    int pair[2] = {-1, -1};
    if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, pair) != 0) {
        throw std::runtime_error(std::string("socketpair: ") + std::strerror(errno));
    }
    const std::filesystem::path path = socket;
    const int status = runAs(account, path.parent_path(), [&] {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path.filename().string().copy(address.sun_path, sizeof address.sun_path - 1);
        const int client = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        return ::connect(client, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 &&
                       sendDescriptor(pair[1], client)
                   ? 0
                   : 1;
    });
    ::close(pair[1]);
    const int client = status == 0 ? receiveDescriptor(pair[0]) : -1;
    ::close(pair[0]);
    if (client < 0) {
        throw std::runtime_error("the account cannot connect to " + socket);
    }
    return UnixHttp(client);
}

}  // namespace adminhost::test
