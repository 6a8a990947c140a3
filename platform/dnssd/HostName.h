#pragma once

// Reverse look-up of an address.

#include "platform/dnssd/NetService.h"
#include "platform/framework/Export.h"

#include <optional>
#include <string>

namespace adminhost {

struct ADMINHOST_EXPORT HostName {
    std::optional<std::string> name;
    int error = 0;  ///< the resolver's EAI number when the look-up failed, else 0

    friend bool operator==(const HostName&, const HostName&) = default;
};

/// The host name of an address, by the system's resolver with the address's own family and length; never a numeric
/// text. No name and no error means that the host's entry has no name. Blocks: each name server is asked once, for 2
/// seconds at most, whatever /etc/resolv.conf says (it lists three servers at most). Other sources of the name service
/// switch keep their own bounds.
[[nodiscard]] ADMINHOST_EXPORT HostName hostNameOf(const SocketAddress& address);

}  // namespace adminhost
