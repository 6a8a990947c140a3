// With which rights the database tool runs on a database, by owners and modes of the file and its path.

#include "platform/task/Task.h"
#include "settings/DatabaseAccess.h"
#include "settings/DatabaseTool.h"
#include "settings/QueryRunner.h"
#include "settings/SettingsStore.h"
#include "tests/integration/databaserights/ServiceAccount.h"
#include "tests/support/TemporaryRoot.h"

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace lumio {
namespace {

namespace fs = std::filesystem;
using adminhost::HostPath;
using testing::AllOf;
using testing::HasSubstr;

constexpr std::string_view file = "/Library/SorvaneProducer/Shared/Server/db.sqlite3";
constexpr std::string_view directory = "/Library/SorvaneProducer/Shared/Server";

class DatabaseAccessOfRoot : public testing::Test {
  protected:
    DatabaseAccessOfRoot() {
        root.sql(file, "create table t(a); insert into t values('one');");
        fs::permissions(root.path("/"), fs::perms(0755));
    }

    void own(std::string_view path, uid_t user, gid_t group, unsigned mode) const {
        ASSERT_EQ(::lchown(root.path(path).c_str(), user, group), 0);
        if (!fs::is_symlink(root.path(path))) {
            fs::permissions(root.path(path), fs::perms(mode));
        }
    }
    [[nodiscard]] static auto access() { return DatabaseAccess::of(SettingsStore::dbPath()); }
    /// The account's id, or -1 for root's own, or -2 for a refusal.
    [[nodiscard]] static long decided() {
        const auto found = access();
        return !found ? -2 : found->account() ? static_cast<long>(found->account()->user) : -1;
    }
    [[nodiscard]] static std::string reason() {
        const auto found = access();
        return found ? "no refusal" : found.error().reason;
    }
    [[nodiscard]] struct stat status(const std::string& path) const {
        struct stat found {};
        EXPECT_EQ(::stat(root.path(path).c_str(), &found), 0) << path;
        return found;
    }

    adminhost::test::TemporaryRoot root;
};

TEST_F(DatabaseAccessOfRoot, RootStaysIfOnlyRootCanWriteTheFileAndItsPath) {
    EXPECT_EQ(decided(), -1);
}

TEST_F(DatabaseAccessOfRoot, OwnerWithAllItsGroupsRunsTheToolIfItCanWriteTheDirectory) {
    own(file, accounts::user, accounts::group, 0644);
    own(directory, accounts::user, accounts::group, 0755);
    const auto found = access();
    ASSERT_TRUE(found) << found.error().reason;
    ASSERT_TRUE(found->account());
    EXPECT_EQ(found->account()->user, accounts::user);
    EXPECT_EQ(found->account()->group, accounts::group);
    auto groups = found->account()->groups;
    std::sort(groups.begin(), groups.end());
    EXPECT_EQ(groups, (std::vector<gid_t>{accounts::group, accounts::further}));
}

TEST_F(DatabaseAccessOfRoot, DirectoryCountsByOwnerGroupOrMode) {
    own(file, accounts::user, accounts::group, 0644);
    const struct {
        uid_t user;
        gid_t group;
        unsigned mode;
        long expected;
    } cases[] = {
        {accounts::user, 0, 0700, accounts::user},
        {accounts::user, accounts::group, 0577, -2},  // the owner's bits alone count for the owner
        {0, accounts::group, 0770, accounts::user},
        {0, accounts::further, 0770, accounts::user},
        {0, accounts::further, 0757, -2},  // likewise the group's
        {0, accounts::group, 0720, -2},    // writing without searching is not enough
        {0, 0, 0777, accounts::user},
        {0, 0, 0775, -2},
        {accounts::stranger, accounts::stranger, 0755, -2},
    };
    for (const auto& one : cases) {
        own(directory, one.user, one.group, one.mode);
        EXPECT_EQ(decided(), one.expected) << one.user << ' ' << one.group << ' ' << std::oct << one.mode;
    }
}

TEST_F(DatabaseAccessOfRoot, OwnerThatCannotWriteTheDirectoryIsRefusedAndNothingRuns) {
    own(file, accounts::user, accounts::group, 0644);
    EXPECT_THAT(reason(), AllOf(HasSubstr(std::string(file)), HasSubstr("belongs to the account service-of-test"),
                                HasSubstr("cannot create files in its directory")));
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\ntouch '" + root.path("/ran").string() + "'\n");
    const auto rows = runStatement("select a from t");
    ASSERT_FALSE(rows);
    EXPECT_EQ(rows.error().code, -1);
    EXPECT_THAT(rows.error().description.value_or(""),
                AllOf(HasSubstr("Can't execute sqlite3 query: /usr/bin/sqlite3: not started: "),
                      HasSubstr("give the directory to the account that the service runs as")));
    EXPECT_FALSE(fs::exists(root.path("/ran")));
    const adminhost::Probe probe = DatabaseTool().probe();
    EXPECT_EQ(probe.state, adminhost::Probe::State::unusable);
    EXPECT_EQ(probe.reason, reason());
}

TEST_F(DatabaseAccessOfRoot, RootsFileThatOthersCanWriteOrReachIsRefused) {
    own(file, 0, 0, 0664);
    EXPECT_THAT(reason(), HasSubstr("belongs to root, but others can write it"));
    own(file, 0, 0, 0646);
    EXPECT_EQ(decided(), -2);
    own(file, 0, 0, 0644);
    EXPECT_EQ(decided(), -1);
    for (const std::string_view part :
         {std::string_view("/Library"), std::string_view("/Library/SorvaneProducer"), directory}) {
        for (const unsigned mode : {0775U, 0757U}) {
            own(part, 0, 0, mode);
            EXPECT_EQ(decided(), -2) << part << std::oct << mode;
        }
        own(part, accounts::user, 0, 0755);
        EXPECT_EQ(decided(), -2) << part;
        own(part, 0, 0, 0755);
        EXPECT_EQ(decided(), -1) << part;
    }
}

TEST_F(DatabaseAccessOfRoot, StickyDirectoryOnThePathProtectsOnlyRootsOwnEntry) {
    own("/Library", 0, 0, 01777);
    EXPECT_EQ(decided(), -1);
    own("/Library/SorvaneProducer", accounts::stranger, 0, 0755);
    EXPECT_EQ(decided(), -2);
    own("/Library/SorvaneProducer", 0, 0, 0755);
    own(directory, 0, 0, 01777);
    EXPECT_EQ(decided(), -2) << "others could create the journal of the database there";
}

TEST_F(DatabaseAccessOfRoot, LinkOfOthersOnThePathIsRefusedAndOneOfTheOwnersIsFollowed) {
    const fs::path elsewhere = root.path("/data");
    fs::create_directories(elsewhere);
    fs::rename(root.path(file), elsewhere / "real.sqlite3");
    fs::create_symlink(elsewhere / "real.sqlite3", root.path(file));
    EXPECT_EQ(decided(), -1) << "a link of root's";
    own("/data", accounts::user, accounts::group, 0755);
    own("/data/real.sqlite3", accounts::user, accounts::group, 0644);
    EXPECT_EQ(decided(), accounts::user) << "a link in a directory of root's";
    EXPECT_EQ(access()->directory(), fs::canonical(elsewhere)) << "journals are created beside the file itself";
    own(directory, accounts::user, accounts::group, 0755);
    EXPECT_EQ(decided(), accounts::user) << "a link in a directory of the owner's";
    own(directory, accounts::stranger, accounts::group, 0755);
    EXPECT_THAT(reason(), HasSubstr("can change a link on its path"));
    own(directory, accounts::user, accounts::group, 0775);
    EXPECT_EQ(decided(), -2);
    own(directory, 0, 0, 01777);
    EXPECT_EQ(decided(), -2);
}

TEST_F(DatabaseAccessOfRoot, ForAMissingFileTheOwnerOfWhatExistsCounts) {
    fs::remove(root.path(file));
    EXPECT_EQ(decided(), -1);
    own(directory, accounts::user, accounts::group, 0755);
    EXPECT_EQ(decided(), accounts::user);
    ASSERT_TRUE(runStatement("create table t(a)"));
    EXPECT_EQ(status(std::string(file)).st_uid, accounts::user);
    fs::remove_all(root.path(directory));
    own("/Library/SorvaneProducer/Shared", accounts::stranger, 0, 0755);
    EXPECT_EQ(decided(), accounts::stranger);
    EXPECT_EQ(access()->directory(), "");
    const auto rows = runStatement("select a from t");
    ASSERT_FALSE(rows);
    EXPECT_EQ(rows.error().code, 1) << "the tool's own failure";
    EXPECT_THAT(rows.error().description.value_or(""), HasSubstr("unable to open database"));
}

TEST_F(DatabaseAccessOfRoot, DirectoryToolAndConfigurationThatAreReplacedAreUsedAtOnce) {
    own(file, accounts::user, accounts::group, 0644);
    own(directory, accounts::user, accounts::group, 0755);
    ASSERT_TRUE(runStatement("insert into t values('two')"));
    fs::rename(root.path(directory), root.path("/Library/former"));
    root.sql(file, "create table t(a); insert into t values('of the new directory')");
    own(file, accounts::user, accounts::group, 0644);
    own(directory, accounts::user, accounts::group, 0755);
    ASSERT_TRUE(runStatement("insert into t values('four')"));
    EXPECT_EQ(root.sql(file, "select count(*) from t"), "2\n");
    fs::remove(root.path("/usr/bin/sqlite3"));
    fs::copy_file("/usr/bin/sqlite3", root.path("/usr/bin/sqlite3"));
    fs::permissions(root.path("/usr/bin/sqlite3"), fs::perms(0755));
    ASSERT_TRUE(runStatement("insert into t values('by a new tool')"));
    const auto plan = [] { return databaseToolPlan(SettingsStore::dbPath(), {}); };
    const auto before = plan().confinement;
    EXPECT_EQ(plan().confinement, before) << "statements of one listing share it";
    adminhost::setToolFileVariables({{"XDG_CONFIG_HOME", root.path("/").string()}});
    EXPECT_NE(plan().confinement, before);
    adminhost::setToolFileVariables({});
}

TEST_F(DatabaseAccessOfRoot, PathThatCannotBeFollowedIsRefused) {
    fs::remove_all(root.path(directory));
    root.write(directory, "not a directory");
    EXPECT_THAT(reason(), HasSubstr("Not a directory"));
    fs::remove(root.path(directory));
    fs::create_symlink("Server", root.path(directory));
    EXPECT_THAT(reason(), HasSubstr("Too many levels of symbolic links"));
}

TEST_F(DatabaseAccessOfRoot, ToolRunsAsTheOwnerWithoutAnyPrivilege) {
    own(file, accounts::user, accounts::group, 0644);
    own(directory, accounts::user, accounts::group, 0755);
    root.writeTool("/usr/bin/sqlite3",
                   "#!/bin/sh\nexec grep -E '^(Uid|Gid|CapEff|CapPrm|NoNewPrivs)' "
                   "/proc/self/status\n");
    const auto text = statementOutput("");
    ASSERT_TRUE(text);
    EXPECT_EQ(*text,
              "Uid:\t4711\t4711\t4711\t4711\nGid:\t4712\t4712\t4712\t4712\nCapPrm:\t0000000000000000\n"
              "CapEff:\t0000000000000000\nNoNewPrivs:\t1\n");
}

TEST_F(DatabaseAccessOfRoot, JournalsBelongToTheOwnerOfTheDatabase) {
    own(file, accounts::user, accounts::group, 0644);
    own(directory, accounts::user, accounts::group, 0755);
    for (const auto& [mode, ends] :
         {std::pair("delete", std::vector{"-journal"}), std::pair("wal", std::vector{"-wal", "-shm"})}) {
        adminhost::TaskGroup group;  // ends the tool
        const auto tool = group.start(planOf(std::string("pragma journal_mode=") + mode +
                                             "; begin immediate; update t set a='two'; with recursive n(i) as (select "
                                             "1 union all select i+1 from n) select max(i) from n; commit"));
        for (const char* const end : ends) {
            const std::string path = std::string(file) + end;
            while (!fs::exists(root.path(path))) {
                group.serve();
                ASSERT_FALSE(group.ended(tool)) << group.collect(tool).error;
                std::this_thread::sleep_for(std::chrono::milliseconds(1));
            }
            EXPECT_EQ(status(path).st_uid, accounts::user) << path;
            EXPECT_EQ(status(path).st_gid, accounts::group) << path;
        }
    }
}

TEST_F(DatabaseAccessOfRoot, SortsThatNeedFilesWorkInTheDatabasesDirectory) {
    own(file, accounts::user, accounts::group, 0644);
    own(directory, accounts::user, accounts::group, 0755);
    const auto rows = runStatement(
        "with recursive n(i) as (select 1 union all select i+1 from n where i<60000), "
        "r as (select i, hex(randomblob(200)) as h from n order by h) select count(*) as c from (select h from r "
        "order by h desc limit 50000 offset 1)");
    ASSERT_TRUE(rows) << rows.error().description.value_or("");
    EXPECT_EQ(rows->front().text("c"), "50000");
}

}  // namespace
}  // namespace lumio
