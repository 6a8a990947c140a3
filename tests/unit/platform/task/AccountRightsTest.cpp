#include "platform/task/AccountRights.h"
#include "platform/task/ProgramLoader.h"
#include "platform/task/TaskGroup.h"

#include <algorithm>
#include <filesystem>
#include <sstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;

TEST(ProgramLoader, IsThatOfTheProgramsFile) {
    const auto loader = loaderOf(DiskPath("/bin/sh"));
    ASSERT_TRUE(loader);
    EXPECT_TRUE(fs::exists(*loader)) << *loader;
    EXPECT_THAT(*loader, HasSubstr("ld-"));
    EXPECT_EQ(loaderOf(DiskPath(*loader)), "") << "a program that needs none";
    EXPECT_EQ(loaderOf(DiskPath("/usr/bin/ldd")), std::nullopt) << "a script";
    EXPECT_EQ(loaderOf(DiskPath("/missing")), std::nullopt);
    EXPECT_EQ(loaderOf(DiskPath("/dev/null")), std::nullopt);
    EXPECT_EQ(loaderOf(DiskPath("/")), std::nullopt);
}

TEST(AccountRights, AreTheAccountsGroupsAsTheSystemHasThem) {
    const auto rights = rightsOfAccount(0);
    ASSERT_TRUE(rights);
    TaskGroup group;
    const auto result = group.collect(group.start({.tool = DiskPath("/usr/bin/id"), .arguments = {"-G", "root"}}));
    std::istringstream words(result.output);
    std::vector<gid_t> groups;
    for (gid_t one = 0; words >> one;) {
        groups.push_back(one);
    }
    auto ours = rights->groups;
    std::sort(ours.begin(), ours.end());
    std::sort(groups.begin(), groups.end());
    EXPECT_EQ(ours, groups);
    EXPECT_EQ(rights->user, 0U);
    EXPECT_EQ(rights->group, 0U);
}

TEST(AccountRights, UserIdWithoutAnAccountIsInNoGroup) {
    const auto rights = rightsOfAccount(3'999'999'999);
    ASSERT_TRUE(rights);
    EXPECT_EQ(rights->user, 3'999'999'999U);
    EXPECT_EQ(rights->group, 65534U);
    EXPECT_TRUE(rights->groups.empty());
}

}  // namespace
}  // namespace adminhost
