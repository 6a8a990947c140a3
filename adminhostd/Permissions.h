#pragma once

// Which accounts may do what.
//
// Each command has an access class, and so has the reading of the audit. The configuration grants classes to users and
// groups. Root and the account that the daemon runs as have all of them. Everybody else has only what is granted: that
// an account can open the socket grants nothing.

#include "adminhostd/Peer.h"
#include "platform/framework/Plugin.h"

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <sys/types.h>

namespace adminhost {

/// The access classes of commands, and one for the audit.
enum class Right : std::uint8_t { read, write, control, account, audit };

/// Every class with its word in configuration and messages.
inline constexpr std::pair<std::string_view, Right> rightWords[] = {{"read", Right::read},
                                                                    {"write", Right::write},
                                                                    {"control", Right::control},
                                                                    {"account", Right::account},
                                                                    {"audit", Right::audit}};
[[nodiscard]] std::string_view nameOf(Right right) noexcept;
[[nodiscard]] Right rightFor(Access access) noexcept;

class Rights {
  public:
    constexpr void add(Right right) noexcept { _bits |= bit(right); }
    constexpr void add(Rights others) noexcept { _bits |= others._bits; }
    [[nodiscard]] constexpr bool has(Right right) const noexcept { return (_bits & bit(right)) != 0; }
    [[nodiscard]] constexpr bool any() const noexcept { return _bits != 0; }
    [[nodiscard]] static constexpr Rights all() noexcept {
        Rights rights;
        for (const auto& [word, right] : rightWords) {
            rights.add(right);
        }
        return rights;
    }
    bool operator==(const Rights&) const = default;

  private:
    static constexpr unsigned bit(Right right) noexcept { return 1U << static_cast<unsigned>(right); }
    unsigned _bits = 0;
};

/// A user or a group of the configuration.
struct ConfiguredAccount {
    std::string name = {};        ///< empty if the number was given
    std::optional<id_t> id = {};  ///< the number, if it was given
    std::string place = {};       ///< in the file, for messages: "FILE, line 3, column 7"
    bool operator==(const ConfiguredAccount&) const = default;
};

/// One table [[permission]].
struct PermissionOptions {
    std::vector<ConfiguredAccount> users;
    std::vector<ConfiguredAccount> groups;
    Rights rights;
    bool operator==(const PermissionOptions&) const = default;
};

/// The number of the account with this name, by all the machine's account sources: this may ask a directory service.
[[nodiscard]] std::optional<uid_t> accountNumberOf(const std::string& name);

class Permissions {
  public:
    /// Looks up the names with the machine's account sources, which may ask a directory service: to be created at the
    /// start and when the configuration is read again, never for a request. `own` is the account that the daemon runs
    /// as, `file` the configuration that refusals name. A name that is not found any more keeps the number that it has
    /// in `former`: the front, which has given up its rights, cannot use every account source, and a reload must not
    /// take grants away because of that.
    Permissions(const std::vector<PermissionOptions>& options, uid_t own, std::string file,
                const Permissions* former = nullptr);

    [[nodiscard]] Rights of(const Peer& peer) const;
    /// The account that the daemon runs as.
    [[nodiscard]] uid_t own() const noexcept { return _own; }
    /// Returns true for root and the daemon's own account.
    [[nodiscard]] bool isOwn(const Peer& peer) const noexcept { return peer.uid == 0 || peer.uid == _own; }

    /// The message of a refusal: that the account lacks this class, and how to grant it. `name` is the account's; empty
    /// if it is not known.
    [[nodiscard]] std::string refusal(const Peer& peer, const std::string& name, Right right) const;

    /// The names that were not found, as sentences with a suggested fix. They grant nothing, and the others count: a
    /// directory service that is down at the start must not lock out everybody.
    [[nodiscard]] const std::vector<std::string>& problems() const noexcept { return _problems; }
    /// The names that keep their former numbers, as sentences.
    [[nodiscard]] const std::vector<std::string>& kept() const noexcept { return _kept; }
    /// Both as a check of the installation.
    [[nodiscard]] Diagnosis check() const;

  private:
    struct Grant {
        std::vector<uid_t> users;
        std::vector<gid_t> groups;
        Rights rights;
    };

    std::vector<Grant> _grants;
    std::vector<std::string> _problems;
    std::vector<std::string> _kept;
    std::map<std::pair<std::string_view, std::string>, id_t> _numbers;  ///< by kind ("user", "group") and name
    uid_t _own;
    std::string _file;
};

}  // namespace adminhost
