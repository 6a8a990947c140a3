#pragma once

// Tests beside a real systemd-journald and with several accounts, in namespaces of their own (see with-journal).
//
//     int main(int argc, char** argv) {
//         adminhost::test::enterJournal(argc, argv);
//         testing::InitGoogleTest(&argc, argv);
//         return RUN_ALL_TESTS();
//     }

#include "tests/support/UnixHttp.h"

#include <functional>
#include <string>
#include <vector>

#include <sys/types.h>

namespace adminhost::test {

/// Runs this program again inside and exits with its status. Returns if it runs inside already.
void enterJournal(int argc, char** argv);

/// An account of with-journal.
struct TestAccount {
    uid_t uid = 0;
    std::vector<gid_t> groups = {};  ///< supplementary ones
};
inline constexpr uid_t anna = 20001;
inline constexpr uid_t bert = 20002;
inline constexpr uid_t cora = 20003;
inline constexpr uid_t dora = 20004;
inline constexpr uid_t emil = 20005;
inline constexpr gid_t media = 20101;
inline constexpr gid_t ops = 20102;

/// Calls the function in a child process that runs as the account, in the directory, which may be one that the account
/// could not enter itself. Returns the child's exit status: the function's result, or 99 for an exception.
int runAs(const TestAccount& account, const std::string& directory, const std::function<int()>& function);

/// A connection that a process of the account has opened. The process has ended when this returns.
[[nodiscard]] UnixHttp connectAs(const TestAccount& account, const std::string& socket);

}  // namespace adminhost::test
