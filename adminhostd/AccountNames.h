#pragma once

// The names of accounts, for messages and for the log.

#include <chrono>
#include <cstddef>
#include <map>
#include <string>

#include <sys/stat.h>
#include <sys/types.h>

namespace adminhost {

/// The names in the password file of this machine, which is read again when it has changed; this is looked for once a
/// second. No directory service is asked: the front must not wait for one. Accounts of other sources have no name here.
class AccountNames {
  public:
    static constexpr std::size_t maximum = 100'000;  ///< names that are kept

    explicit AccountNames(std::string file = "/etc/passwd", std::chrono::milliseconds pause = std::chrono::seconds(1))
        : _file(std::move(file)), _pause(pause) {}

    /// Empty if the account is not in the file, or if the file cannot be read.
    [[nodiscard]] const std::string& of(uid_t uid);

  private:
    void readIfChanged();

    std::string _file;
    std::chrono::milliseconds _pause;
    std::chrono::steady_clock::time_point _lookFrom;
    std::map<uid_t, std::string> _names;
    struct stat _seen {};
};

/// "uid 1000 (anna)", or "uid 1000" without a name.
[[nodiscard]] std::string uidText(uid_t uid, const std::string& name);

}  // namespace adminhost
