#pragma once

// The configuration as the service answers it, in the form that changes are derived from.

#include "platform/value/Value.h"

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::ctl {

// Settings that are no plain values: one is written and never answered, one may be looked up.
inline constexpr std::string_view passwordKey = "nimbo_client_password";
inline constexpr std::string_view controllerKey = "nimbo_controller";

/// An entry of an access list that the directory knows.
struct ListedPerson {
    std::string kind;  ///< "user" or "group"
    std::string shortName;
    std::string id;  ///< UUID
};

struct ListedCamera {
    std::string uuid;
    std::string name;
    bool restricted = false;  ///< only the people of the list may use it
    std::vector<ListedPerson> allowed;
};

struct ListedProperty {
    std::string id;  ///< row number
    std::string name;
    std::optional<std::string> value;  ///< nothing for a protected one
    bool isProtected = false;
};

struct State {
    Dictionary settings;  ///< all but the lists, also what is derived and cannot be written
    /// In the service's order. Nothing when the service answered no list: its database cannot be read.
    std::optional<std::vector<ListedProperty>> properties;
    std::optional<std::vector<ListedCamera>> cameras;
};

/// Elements without identity are left out; what has an unexpected type counts as missing.
[[nodiscard]] State stateOf(const Dictionary& configuration);

/// Whether two texts are the same UUID, in whatever case.
[[nodiscard]] bool sameUuid(const std::string& a, const std::string& b);

/// The camera with the UUID (in any case) or, if there is none, with the name; null if there is none of the name.
/// Throws Failure: several have the name (usage), cameras are not listed (answeredError).
[[nodiscard]] const ListedCamera* findCamera(const State& state, const std::string& nameOrUuid);

/// Null if there is none. Throws Failure: several have the name (usage), properties are not listed (answeredError).
[[nodiscard]] const ListedProperty* findProperty(const State& state, const std::string& name);

}  // namespace adminhost::ctl
