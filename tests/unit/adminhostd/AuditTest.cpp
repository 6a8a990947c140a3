#include "adminhostd/Audit.h"
#include "adminhostd/Permissions.h"
#include "adminhostd/RequestLog.h"
#include "adminhostd/WorkerConfiguration.h"
#include "platform/log/Log.h"
#include "tests/support/CapturedLog.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr uid_t unnamed = 70'000;  ///< from here on, accounts have no names

void refuse(Audit& audit, uid_t account) {
    RequestRecord record;
    record.peer.uid = unnamed + account;
    record.close(403, "NOT_PERMITTED");
    audit.ended(record);
}

TEST(AuditOfRefusals, CountOfAnAccountThatIsForgottenIsLogged) {
    const test::CapturedLog log;
    Audit audit;
    for (std::size_t i = 0; i < Audit::refusalsLogged + 3; ++i) {
        refuse(audit, 1);
    }
    EXPECT_FALSE(log.contains("not logged"));
    for (uid_t other = 2; other <= Audit::refusedAccounts; ++other) {
        refuse(audit, other);
    }
    EXPECT_FALSE(log.contains("not logged"));
    refuse(audit, Audit::refusedAccounts + 1);
    EXPECT_TRUE(log.contains("adminhostd: 3 refusals of uid 70001 were not logged"));
}

TEST(AuditOfRefusals, AccountThatIsForgottenIsTheOneWithTheOldestRefusal) {
    const test::CapturedLog log;
    Audit audit;
    for (uid_t uid = Audit::refusedAccounts; uid > 0; --uid) {
        refuse(audit, uid);
    }
    for (std::size_t i = 0; i < Audit::refusalsLogged + 3; ++i) {
        refuse(audit, 1);
    }
    refuse(audit, Audit::refusedAccounts + 1);
    EXPECT_FALSE(log.contains("not logged")) << "uid 70001 is still counted";
}

TEST(AuditReading, AccountWhoseEntriesAreShownIsInTheConfigurationThatTheMonitorSends) {
    Options options;
    options.root = "/srv";
    EXPECT_EQ(workerConfiguration(options, {}, "").frontAccount, ::geteuid());
    options.account = "nobody";
    const auto expected = ::geteuid() == 0 ? accountNumberOf("nobody") : ::geteuid();
    EXPECT_EQ(workerConfiguration(options, {}, "").frontAccount, expected);
}

}  // namespace
}  // namespace adminhost
