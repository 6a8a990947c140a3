#pragma once

// Changes environment variables of the test program temporarily.

#include <cstdlib>
#include <map>
#include <optional>
#include <string>

namespace support {

/// Sets variables (or removes those without a value). The destructor restores them.
class ScopedEnvironment {
  public:
    using Changes = std::map<std::string, std::optional<std::string>>;

    explicit ScopedEnvironment(const Changes& changes) {
        for (const auto& [name, value] : changes) {
            const char* former = std::getenv(name.c_str());
            _former[name] = former != nullptr ? std::optional<std::string>(former) : std::nullopt;
            apply(name, value);
        }
    }
    ScopedEnvironment(const ScopedEnvironment&) = delete;
    ScopedEnvironment& operator=(const ScopedEnvironment&) = delete;
    ~ScopedEnvironment() {
        for (const auto& [name, value] : _former) {
            apply(name, value);
        }
    }

  private:
    static void apply(const std::string& name, const std::optional<std::string>& value) {
        if (value) {
            setenv(name.c_str(), value->c_str(), 1);
        } else {
            unsetenv(name.c_str());
        }
    }

    Changes _former;
};

}  // namespace support
