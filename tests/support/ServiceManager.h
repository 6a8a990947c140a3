#pragma once

// Tests beside a service manager of their own: a real systemd for root, a mock for other accounts (see with-systemd).
//
//     int main(int argc, char** argv) {
//         adminhost::test::enterServiceManager(argc, argv);
//         testing::InitGoogleTest(&argc, argv);
//         return RUN_ALL_TESTS();
//     }

#include <string>

namespace adminhost::test {

/// Runs this program again beside the manager and exits with its status. Returns if it is running there already.
void enterServiceManager(int argc, char** argv);

/// Returns true beside a real systemd, false beside the mock.
[[nodiscard]] bool isRealServiceManager();

/// Adds a unit that is not running. `text` is its file; the mock ignores it.
void addUnit(const std::string& unit, const std::string& text);
/// Gives the unit a further name.
void addUnitAlias(const std::string& unit, const std::string& alias);

// Begin a change of a unit's state and do not wait for its end. Each fails with std::runtime_error.

void startUnit(const std::string& unit);
void stopUnit(const std::string& unit);
void reloadUnit(const std::string& unit);

/// Waits until the manager itself shows the unit in this state ("active"). Returns false after ten seconds. The mock is
/// put into the state.
[[nodiscard]] bool reachState(const std::string& unit, const std::string& state);

}  // namespace adminhost::test
