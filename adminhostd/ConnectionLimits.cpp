#include "adminhostd/ConnectionLimits.h"

#include <algorithm>

namespace adminhost {

ConnectionLimits::ConnectionLimits(std::size_t descriptors, std::size_t maximum) noexcept
    : _total(descriptors > ownDescriptors ? std::min(descriptors - ownDescriptors, maximum) : 1),
      _others(std::max<std::size_t>(_total - std::min(rootReserve, _total / 2), 1)),
      _perAccount(std::max<std::size_t>(_others / 2, 1)) {}

bool ConnectionLimits::add(uid_t uid) {
    if (full()) {
        return false;
    }
    if (uid != 0) {
        if (_openOfOthers >= _others) {
            return false;
        }
        std::size_t& count = _counts[uid];
        if (count >= _perAccount) {
            return false;
        }
        ++count;
        ++_openOfOthers;
    }
    ++_open;
    return true;
}

void ConnectionLimits::remove(uid_t uid) noexcept {
    --_open;
    if (uid == 0) {
        return;
    }
    --_openOfOthers;
    const auto found = _counts.find(uid);
    if (--found->second == 0) {
        _counts.erase(found);
    }
}

}  // namespace adminhost
