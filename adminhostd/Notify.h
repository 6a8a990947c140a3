#pragma once

#include <string_view>

namespace adminhost {

/// Notifies the service manager, if it asked for it (NOTIFY_SOCKET), of a change of state: "READY=1", "STOPPING=1".
void notify(std::string_view state) noexcept;

}  // namespace adminhost
