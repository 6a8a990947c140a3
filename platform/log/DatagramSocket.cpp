#include "platform/log/DatagramSocket.h"

#include <sys/socket.h>
#include <sys/un.h>

namespace adminhost {

FileDescriptor datagramSocketTo(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    if (!socket.isOpen() || ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        socket.close();
    }
    return socket;
}

}  // namespace adminhost
