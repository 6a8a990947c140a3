#include "adminhostd/WorkerChecks.h"
#include "platform/directory/Directory.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/service/ServiceState.h"
#include "tests/support/Environment.h"
#include "tests/support/TemporaryRoot.h"

#include <algorithm>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost {
namespace {

using ::testing::HasSubstr;
using Health = Diagnosis::Health;

class WorkerChecksTest : public ::testing::Test {
  protected:
    WorkerChecksTest() {
        root.write("/etc/passwd", "anna:x:1001:1000:Anna Berg:/home/anna:/bin/sh\n");
        root.write("/etc/group", "staff:x:1000:\n");
        setDirectoryNodes({localAccounts()});
        setServiceManager(ServiceManager::pidFile);
    }
    ~WorkerChecksTest() override {
        setDirectoryNodes({localAccounts()});
        setServiceManager(defaultServiceManager());
    }

    static Diagnosis check(const std::string& name) {
        const std::vector<Diagnosis> all = workerChecks();
        const auto found = std::find_if(all.begin(), all.end(), [&](const Diagnosis& one) { return one.name == name; });
        return found == all.end() ? Diagnosis() : *found;
    }
    static DirectoryNodeSource brokenNode() {
        return {"/LDAPv3/gone", []() -> OpenedDirectoryNode { return failure({"test", 1, "no route to it"}); }};
    }

    const test::TemporaryRoot root;
    const support::ScopedEnvironment bus{{{"DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/nowhere/bus"}}};
};

TEST_F(WorkerChecksTest, AvahiThatCannotBeAskedIsAWarning) {
    EXPECT_EQ(check("local names").health, Health::warning);
    EXPECT_THAT(check("local names").found, HasSubstr("the system bus cannot be reached"));
    EXPECT_THAT(check("local names").fix, HasSubstr("avahi-daemon"));
}

TEST_F(WorkerChecksTest, ServiceManagerThatCannotBeAskedIsAFailure) {
    EXPECT_EQ(check("service manager").health, Health::ok) << "a pid file needs no manager";
    setServiceManager(ServiceManager::systemd);
    EXPECT_EQ(check("service manager").health, Health::failure);
    EXPECT_THAT(check("service manager").fix, HasSubstr("service_manager"));
}

TEST_F(WorkerChecksTest, DirectoryNodeThatFailsIsAFailureAndTheOthersAreChecked) {
    setDirectoryNodes({localAccounts(), brokenNode()});
    EXPECT_EQ(check("directory /Local").health, Health::ok);
    EXPECT_EQ(check("directory /LDAPv3/gone").health, Health::failure);
    EXPECT_THAT(check("directory /LDAPv3/gone").found, HasSubstr("no route to it"));
}

TEST_F(WorkerChecksTest, PersonOfTheSameNameInTwoNodesIsAWarning) {
    setDirectoryNodes({localAccounts(), localAccounts(std::nullopt, "", "/Second")});
    const Diagnosis found = check("people in two directory nodes");
    EXPECT_EQ(found.health, Health::warning);
    EXPECT_THAT(found.found, HasSubstr("anna (/Local and /Second)"));
}

TEST_F(WorkerChecksTest, OneNodeIsNotComparedWithItself) {
    EXPECT_EQ(check("people in two directory nodes").name, "");
}

}  // namespace
}  // namespace adminhost
