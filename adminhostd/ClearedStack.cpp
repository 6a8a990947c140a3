#include "adminhostd/ClearedStack.h"

#include <cstddef>
#include <cstring>

namespace adminhost {

[[gnu::noinline]] void clearUnusedStack() noexcept {
    char room[std::size_t{64} << 10U];
    ::explicit_bzero(room, sizeof room);
}

}  // namespace adminhost
