#include "platform/dnssd/HostName.h"

#include "platform/text/Utf8.h"

#include <cstring>

#include <netdb.h>
#include <netinet/in.h>
#include <resolv.h>

namespace adminhost {
namespace {

/// Bounds this thread's resolver for the life of the object. glibc reads its configuration anew when the file changes,
/// unless fields were set by the program, as here.
class BoundedResolver {
  public:
    BoundedResolver() : _ready(::res_init() == 0), _seconds(_res.retrans), _attempts(_res.retry) {
        if (_ready) {
            _res.retrans = 2;
            _res.retry = 1;
        }
    }
    BoundedResolver(const BoundedResolver&) = delete;
    BoundedResolver& operator=(const BoundedResolver&) = delete;
    ~BoundedResolver() {
        if (_ready) {
            _res.retrans = _seconds;
            _res.retry = _attempts;
        }
    }

  private:
    bool _ready;
    int _seconds;
    int _attempts;
};

}  // namespace

HostName hostNameOf(const SocketAddress& address) {
    sockaddr_storage storage{};
    if (address.size() < sizeof(sa_family_t) || address.size() > sizeof storage) {
        return {std::nullopt, EAI_FAMILY};
    }
    std::memcpy(&storage, address.data(), address.size());
    const std::size_t length = storage.ss_family == AF_INET    ? sizeof(sockaddr_in)
                               : storage.ss_family == AF_INET6 ? sizeof(sockaddr_in6)
                                                               : 0;
    if (length == 0 || address.size() < length) {
        return {std::nullopt, EAI_FAMILY};
    }
    const BoundedResolver bounded;
    char name[NI_MAXHOST] = "";
    const int error = ::getnameinfo(reinterpret_cast<const sockaddr*>(&storage), static_cast<socklen_t>(length), name,
                                    sizeof name, nullptr, 0, NI_NAMEREQD);
    if (error != 0) {
        return {std::nullopt, error};
    }
    return {name[0] == '\0' ? std::nullopt : std::optional(utf8Of(name)), 0};
}

}  // namespace adminhost
