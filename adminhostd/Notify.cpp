#include "adminhostd/Notify.h"

#include "platform/files/FileDescriptor.h"

#include <cstddef>
#include <cstdlib>
#include <cstring>

#include <sys/socket.h>
#include <sys/un.h>

namespace adminhost {

void notify(std::string_view state) noexcept {
    // The protocol is one datagram; its library would load half a dozen others into a small process.
    const char* path = std::getenv("NOTIFY_SOCKET");
    sockaddr_un address{};
    const std::size_t length = path == nullptr ? 0 : std::strlen(path);
    if (length < 2 || length >= sizeof address.sun_path || (path[0] != '/' && path[0] != '@')) {
        return;
    }
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path, length);
    if (path[0] == '@') {
        address.sun_path[0] = '\0';
    }
    const FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    const auto size = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + length);
    static_cast<void>(::sendto(socket.get(), state.data(), state.size(), MSG_NOSIGNAL,
                               reinterpret_cast<const sockaddr*>(&address), size));
}

}  // namespace adminhost
