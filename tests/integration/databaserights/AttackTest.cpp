// What someone who can write the service's database gets when the daemon reads it.
//
// Each attack is tried in three ways: with the tool as root, without any protection, which shows that the attack is
// real; as the owner of the database; and as the owner, confined. The table of the results is printed.

#include "settings/DatabaseTool.h"
#include "settings/QueryRunner.h"
#include "settings/SettingsStore.h"
#include "tests/integration/databaserights/ServiceAccount.h"
#include "tests/support/Environment.h"
#include "tests/support/TemporaryRoot.h"
#include "tests/support/UserNamespace.h"

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>
#include <map>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace lumio {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;

enum class Protection { none, owner, ownerConfined };

/// The database of the service, in a place like the real one, and things that an intruder would like.
class Attack : public testing::Test {
  protected:
    static constexpr std::string_view database = "/database/db.sqlite3";

    void SetUp() override {
        root.write("/var/lumio/server/database.yml", "production:\n  database: " + std::string(database));
        root.sql(database, "create table t(a)");
        root.write("/secret", "the secret of root");
        fs::permissions(root.path("/secret"), fs::perms(0600));
        fs::create_directories(root.path("/outside"));  // which the account can write: it is its own, in other work
        fs::create_directories(root.path("/roots"));
        for (const char* path : {"/database", "/database/db.sqlite3", "/outside"}) {
            ASSERT_EQ(::chown(root.path(path).c_str(), accounts::user, accounts::group), 0);
        }
        fs::permissions(root.path("/"), fs::perms(0755));
        ASSERT_EQ(SettingsStore::dbPath().text(), database);
    }

    /// Runs the statement on the database and returns what the tool printed, its errors included.
    [[nodiscard]] std::string run(const std::string& statement, Protection protection) const {
        adminhost::TaskPlan plan = planOf(statement);
        EXPECT_TRUE(plan.rights);
        EXPECT_TRUE(plan.confinement) << "this test needs a kernel with Landlock (lsm=landlock,...)";
        if (protection != Protection::ownerConfined) {
            plan.confinement = nullptr;
            plan.environment.erase("HOME");
        }
        if (protection == Protection::none) {
            plan.rights.reset();
        }
        adminhost::TaskGroup tool;
        const auto result = tool.collect(tool.start(std::move(plan)));
        return result.output + result.error;
    }

    /// Creates the view that a listing reads, and reads it as a listing does.
    [[nodiscard]] std::string read(const std::string& expression, Protection protection) const {
        root.sql(database, "drop view if exists cameras; create view cameras as select " + expression + " as name");
        return run("select * from cameras", protection);
    }

    /// What the attack did, by the owner of the file that it creates: "written by root", or "not written".
    [[nodiscard]] std::string result(const std::string& verb, std::string_view path) const {
        struct stat status {};
        if (::lstat(root.path(path).c_str(), &status) != 0) {
            return "not " + verb;
        }
        return verb + " by " +
               (status.st_uid == 0                ? "root"
                : status.st_uid == accounts::user ? "the account"
                                                  : "another account");
    }

    /// Tries an attack in the three ways, adds a line to the table and expects these results.
    template <typename Try>
    void attempt(const std::string& name, Try attack, const std::vector<std::string>& expected) {
        std::vector<std::string> got;
        for (const Protection protection : {Protection::none, Protection::owner, Protection::ownerConfined}) {
            for (const char* directory : {"/roots", "/outside"}) {
                for (const auto& entry : fs::directory_iterator(root.path(directory))) {
                    fs::remove_all(entry.path());
                }
            }
            got.push_back(attack(protection));
        }
        std::cout << "| " << name << " | " << got[0] << " | " << got[1] << " | " << got[2] << " |\n";
        EXPECT_EQ(got, expected) << name;
    }
    [[nodiscard]] std::string at(std::string_view path) const { return root.path(path).string(); }

    adminhost::test::TemporaryRoot root;
};

TEST_F(Attack, EveryAttemptGetsOnlyTheRightsOfTheAccountAndConfinedNothingOutsideTheDatabasesDirectory) {
    std::cout << "| attempt | as root, unprotected | as the owner of the database | and confined (as it is run) |\n"
                 "|---|---|---|---|\n";
    attempt("view \"cameras\" whose column calls edit(): runs a program",
            [&](Protection protection) {
                static_cast<void>(read("edit('x','touch " + at("/outside/edited") + "')", protection));
                return result("run", "/outside/edited");
            },
            {"run by root", "run by the account", "not run"});
    attempt("view whose column calls writefile()",
            [&](Protection protection) {
                const std::string text = read("writefile('" + at("/outside/written") + "','x')", protection);
                return result("written", "/outside/written") == "not written" &&
                               text.find("unsafe use") != std::string::npos
                           ? "refused by the tool"
                           : result("written", "/outside/written");
            },
            {"refused by the tool", "refused by the tool", "refused by the tool"});
    attempt("writefile() in a statement, in a directory of root's",
            [&](Protection protection) {
                static_cast<void>(run("select writefile('" + at("/roots/written") + "','x')", protection));
                return result("written", "/roots/written");
            },
            {"written by root", "not written", "not written"});
    attempt("writefile() in a statement, in another directory of the account's",
            [&](Protection protection) {
                static_cast<void>(run("select writefile('" + at("/outside/written") + "','x')", protection));
                return result("written", "/outside/written");
            },
            {"written by root", "written by the account", "not written"});
    attempt("edit() in a statement",
            [&](Protection protection) {
                static_cast<void>(run("select edit('x','touch " + at("/outside/edited") + "')", protection));
                return result("run", "/outside/edited");
            },
            {"run by root", "run by the account", "not run"});
    attempt("readfile() of a file like /etc/shadow",
            [&](Protection protection) {
                const std::string text = run("select readfile('" + at("/secret") + "') as text", protection);
                return text.find("the secret of root") != std::string::npos ? "read" : "not read";
            },
            {"read", "not read", "not read"});
    attempt("attach a database elsewhere",
            [&](Protection protection) {
                const std::string text =
                    run("attach '" + at("/outside/other.sqlite3") + "' as other; create table other.x(y)", protection);
                return result("created", "/outside/other.sqlite3");
            },
            {"created by root", "created by the account", "not created"});
    attempt("attach and read root's database",
            [&](Protection protection) {
                root.sql("/secret.sqlite3", "create table if not exists s(x); insert into s values('of root only')");
                fs::permissions(root.path("/secret.sqlite3"), fs::perms(0600));
                const std::string text =
                    run("attach '" + at("/secret.sqlite3") + "' as other; select x from other.s", protection);
                return text.find("of root only") != std::string::npos ? "read" : "not read";
            },
            {"read", "not read", "not read"});
    const support::ScopedEnvironment base({{"INTRUDER_BASE", root.path("").string()}});
    fs::copy_file(EXTENSION, root.path("/database/intruder.so"));
    fs::permissions(root.path("/database/intruder.so"), fs::perms(0755));
    attempt("load_extension() in a statement: a library in the database's directory",
            [&](Protection protection) {
                fs::remove(root.path("/database/extension"));
                static_cast<void>(run("select load_extension('" + at("/database/intruder.so") + "')", protection));
                std::string note =
                    fs::exists(root.path("/database/extension")) ? root.read("/database/extension") : "not run";
                if (note.starts_with("user 4711")) {
                    note.replace(0, 9, "the account");
                }
                return note;
            },
            {"user 0 secret read outside written", "the account secret refused outside written",
             "the account secret refused outside refused"});
    attempt("load_extension() in a statement: a library elsewhere",
            [&](Protection protection) {
                fs::copy_file(EXTENSION, root.path("/outside/intruder.so"));
                fs::permissions(root.path("/outside/intruder.so"), fs::perms(0755));
                fs::remove(root.path("/database/extension"));
                static_cast<void>(run("select load_extension('" + at("/outside/intruder.so") + "')", protection));
                return std::string(fs::exists(root.path("/database/extension")) ? "run" : "not run");
            },
            {"run", "run", "not run"});
    std::ofstream(accounts::home() + "/.sqliterc")
        << ".nullvalue CHANGED\n.shell touch " << at("/outside/started") << '\n';
    fs::permissions(accounts::home() + "/.sqliterc", fs::perms(0644));
    attempt(
        "start file .sqliterc in the account's home directory",
        [&](Protection protection) {
            const std::string text = run("select null as value", protection);
            return result("run", "/outside/started") +
                   (text.find("CHANGED") != std::string::npos ? ", output changed" : ", output as it should be");
        },
        {"not run, output as it should be", "run by the account, output changed", "not run, output as it should be"});
    fs::remove(accounts::home() + "/.sqliterc");
}

TEST_F(Attack, ProgramOfTheAttackGetsNothingThroughTheWholeRoadOfAListing) {
    root.sql(database, "create view cameras as select edit('x','touch " + at("/outside/edited") + "') as name");
    const auto rows = runStatement("select * from cameras");
    EXPECT_FALSE(rows && !rows->empty() && rows->front().text("name") == "edited");
    EXPECT_FALSE(fs::exists(root.path("/outside/edited")));
}

TEST_F(Attack, StartFileOfTheAccountIsAProblemOnlyWhereTheToolCanReadIt) {
    std::ofstream(accounts::home() + "/.sqliterc") << ".nullvalue CHANGED\n";
    EXPECT_FALSE(DatabaseTool().startFileProblem()) << "a confined tool does not read it";
    fs::remove(root.path("/usr/bin/sqlite3"));
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nexec /usr/bin/sqlite3 \"$@\"\n");
    const auto problem = DatabaseTool().startFileProblem();
    ASSERT_TRUE(problem) << "a script is not confined";
    EXPECT_EQ(problem->reason, accounts::home() + "/.sqliterc can change what /usr/bin/sqlite3 prints");
    fs::remove(accounts::home() + "/.sqliterc");
}

TEST(AttackInAUserNamespace, GetsTheSame) {
    std::string count;
    std::ifstream("/proc/self/uid_map") >> count >> count >> count;
    if (count != "4294967295") {
        return;  // this run is in one, because it was not started as root
    }
    const auto result = adminhost::test::runInMappedNamespace(
        {fs::read_symlink("/proc/self/exe").string(), "--gtest_filter=Attack.*:DatabaseAccessOfRoot.*:Confin*"});
    EXPECT_EQ(result.status, 0) << result.output;
    EXPECT_THAT(result.output, HasSubstr("PASSED"));
}

}  // namespace
}  // namespace lumio
