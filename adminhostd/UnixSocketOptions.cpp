// The HTTP library sets options of TCP on the client's socket around each answer, unless it knows that the socket is
// not one of TCP, which it cannot know of sockets that it is given. All sockets of the front are Unix ones: these calls
// would fail in the kernel, two for each answer. Linked into the front as a source of its own: in an archive it would
// be left out.

#include <cerrno>

#include <netinet/in.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

extern "C" [[gnu::visibility("default")]] int setsockopt(int socket, int level, int option, const void* value,
                                                         socklen_t size) noexcept {
    if (level == IPPROTO_TCP) {
        errno = EOPNOTSUPP;
        return -1;
    }
    return static_cast<int>(::syscall(SYS_setsockopt, socket, level, option, value, size));
}
