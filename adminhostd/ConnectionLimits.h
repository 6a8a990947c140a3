#pragma once

// How many connections the daemon holds at once, and how they are shared among accounts.

#include <cstddef>
#include <map>

#include <sys/types.h>

namespace adminhost {

/// Counts the open connections of each account. Root may use all of them. All other accounts together leave some to
/// root, and one of them alone may have half of the rest, so that no account can lock out the others.
class ConnectionLimits {
  public:
    static constexpr std::size_t rootReserve = 16;     ///< of them, for root only
    static constexpr std::size_t ownDescriptors = 16;  ///< that the daemon needs besides its connections

    /// `descriptors` is how many the process may have open, `maximum` how many connections in total. If there are few
    /// descriptors, all numbers shrink, to 1 in total at the least.
    ConnectionLimits(std::size_t descriptors, std::size_t maximum) noexcept;

    [[nodiscard]] std::size_t total() const noexcept { return _total; }
    /// For all accounts but root together.
    [[nodiscard]] std::size_t others() const noexcept { return _others; }
    /// For one account that is not root.
    [[nodiscard]] std::size_t perAccount() const noexcept { return _perAccount; }

    /// Returns true if no further connection can be held, root's included.
    [[nodiscard]] bool full() const noexcept { return _open >= _total; }
    /// Counts a connection of the account. Returns false if the account may not have another one now.
    [[nodiscard]] bool add(uid_t uid);
    /// Must be called when a connection that add() has counted is closed.
    void remove(uid_t uid) noexcept;

  private:
    std::size_t _total;
    std::size_t _others;
    std::size_t _perAccount;
    std::size_t _open = 0;
    std::size_t _openOfOthers = 0;
    std::map<uid_t, std::size_t> _counts;  ///< of accounts that are not root
};

}  // namespace adminhost
