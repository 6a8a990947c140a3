#include "adminhostd/AccountNames.h"
#include "adminhostd/Options.h"
#include "adminhostd/Permissions.h"
#include "tests/support/TemporaryRoot.h"

#include <fstream>
#include <stdexcept>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

namespace adminhost {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::StartsWith;

Rights only(Right right) {
    Rights rights;
    rights.add(right);
    return rights;
}

class PermissionConfiguration : public testing::Test {
  protected:
    [[nodiscard]] std::vector<PermissionOptions> read(const std::string& text) const {
        root.write("/adminhostd.toml", text);
        Options options;
        readConfiguration(root.path("/adminhostd.toml"), options);
        return options.permissions;
    }
    /// The message of the mistake in the text, without the name of the file; empty if there is none.
    [[nodiscard]] std::string mistakeIn(const std::string& text) const {
        try {
            static_cast<void>(read(text));
        } catch (const std::runtime_error& error) {
            const std::string message = error.what();
            const std::string file = root.path("/adminhostd.toml").string() + ", ";
            EXPECT_THAT(message, StartsWith(file));
            return message.substr(std::min(message.size(), file.size()));
        }
        return {};
    }

    const test::TemporaryRoot root;
};

TEST_F(PermissionConfiguration, TablesAreReadInTheirOrderWithNamesAndNumbers) {
    const auto tables = read(
        "[[permission]]\nusers = [\"anna\", 1000]\ngroups = [\"media\"]\n"
        "classes = [\"read\", \"write\"]\n[[permission]]\ngroups = [2000]\n"
        "classes = [\"control\", \"account\", \"audit\", \"audit\"]\n");
    ASSERT_EQ(tables.size(), 2U);
    ASSERT_EQ(tables[0].users.size(), 2U);
    EXPECT_EQ(tables[0].users[0].name, "anna");
    EXPECT_EQ(tables[0].users[1].id, 1000U);
    EXPECT_EQ(tables[0].groups[0].name, "media");
    for (const auto& [word, right] : rightWords) {
        EXPECT_EQ(tables[0].rights.has(right), right == Right::read || right == Right::write) << word;
        EXPECT_NE(tables[0].rights.has(right), tables[1].rights.has(right)) << word;
    }
    EXPECT_TRUE(read("").empty());
}

TEST_F(PermissionConfiguration, MistakesAreNamedWithTheirPlace) {
    const struct {
        const char* text;
        const char* expected;
    } cases[] = {
        {"permission = 1\n", "line 1, column 14: \"permission\" must be a list of tables: [[permission]]"},
        {"[permission]\nusers = [\"a\"]\n", "line 1, column 1: \"permission\" must be a list of tables"},
        {"permission = [1]\n", "line 1, column 14: \"permission\" must be a list of tables"},
        {"[[permission]]\nuser = [\"a\"]\n",
         "line 2, column 1: unknown key \"permission.user\"; known keys: users, groups, classes"},
        {"[[permission]]\nusers = \"a\"\n",
         "line 2, column 9: \"permission.users\" must be a list of names or numbers, and not empty"},
        {"[[permission]]\nusers = []\n", "line 2, column 9: \"permission.users\" must be a list of names or numbers"},
        {"[[permission]]\nusers = [\"a\", \"\"]\n", "line 2, column 15: \"permission.users\" must be a list of names"},
        {"[[permission]]\nusers = [-1]\n", "line 2, column 10: \"permission.users\" must be a list of names"},
        {"[[permission]]\nusers = [4294967295]\n", "line 2, column 10: \"permission.users\" must be a list of names"},
        {"[[permission]]\nusers = [1.5]\n", "line 2, column 10: \"permission.users\" must be a list of names"},
        {"[[permission]]\ngroups = [true]\n", "line 2, column 11: \"permission.groups\" must be a list of names"},
        {"[[permission]]\nclasses = \"read\"\n", "line 2, column 11: \"permission.classes\" must be a list of classes"},
        {"[[permission]]\nclasses = []\n", "line 2, column 11: \"permission.classes\" must be a list of classes"},
        {"[[permission]]\nclasses = [\"read\", \"all\"]\n",
         "line 2, column 20: \"permission.classes\" must be \"read\" or \"write\" or \"control\" or \"account\" or "
         "\"audit\""},
        {"[[permission]]\nclasses = [\"read\"]\n", "line 1, column 1: \"permission\" lacks \"users\" or \"groups\""},
        {"[[permission]]\nusers = [\"a\"]\n", "line 1, column 1: \"permission\" lacks \"classes\""},
    };
    for (const auto& entry : cases) {
        EXPECT_THAT(mistakeIn(entry.text), StartsWith(entry.expected)) << entry.text;
    }
}

Permissions granting(std::vector<ConfiguredAccount> users, std::vector<ConfiguredAccount> groups, Right right) {
    return {{{std::move(users), std::move(groups), only(right)}}, 77, "/etc/adminhostd.toml"};
}

TEST(Permissions, RootAndTheDaemonsAccountHaveAllRightsAndOthersNone) {
    const Permissions none({}, 77, "/etc/adminhostd.toml");
    EXPECT_EQ(none.of({.uid = 0}), Rights::all());
    EXPECT_EQ(none.of({.uid = 77}), Rights::all());
    EXPECT_FALSE(none.of({.uid = 78, .gid = 0, .groups = {0}}).any());
    EXPECT_TRUE(none.isOwn({.uid = 77}));
    EXPECT_FALSE(none.isOwn({.uid = 78}));
}

TEST(Permissions, UsersAndGroupsHaveWhatTheirTablesGrantTogether) {
    const Permissions permissions({{{{.id = 5}}, {}, only(Right::read)},
                                   {{{.id = 6}}, {{.id = 50}}, only(Right::write)},
                                   {{{.id = 5}}, {}, only(Right::audit)}},
                                  77, "/etc/adminhostd.toml");
    EXPECT_TRUE(permissions.of({.uid = 5}).has(Right::read));
    EXPECT_TRUE(permissions.of({.uid = 5}).has(Right::audit));
    EXPECT_FALSE(permissions.of({.uid = 5}).has(Right::write));
    EXPECT_TRUE(permissions.of({.uid = 5, .gid = 50}).has(Right::write)) << "the first group counts";
    EXPECT_TRUE(permissions.of({.uid = 8, .gid = 8, .groups = {1, 50}}).has(Right::write));
    EXPECT_FALSE(permissions.of({.uid = 50, .gid = 5}).any()) << "users and groups are different numbers";
}

TEST(Permissions, NamesAreLookedUpAndUnknownOnesAreProblemsThatGrantNothing) {
    const Permissions permissions = granting(
        {{.name = "root", .place = "FILE, line 1"}, {.name = "no such user", .place = "FILE, line 2"}},
        {{.name = "daemon", .place = "FILE, line 3"}, {.name = "no such group", .place = "FILE, line 4"}}, Right::read);
    EXPECT_THAT(permissions.problems(),
                ElementsAre("FILE, line 2: user not found: \"no such user\"; create the user, or correct the name, and "
                            "reload the daemon",
                            "FILE, line 4: group not found: \"no such group\"; create the group, or correct the name, "
                            "and reload the daemon"));
    EXPECT_TRUE(permissions.of({.uid = 9, .gid = 1}).has(Right::read)) << "the group \"daemon\" is 1";
    EXPECT_FALSE(permissions.of({.uid = 9, .gid = 9}).any());
}

TEST(Permissions, EachAccessClassOfCommandsHasARightOfItsName) {
    EXPECT_EQ(nameOf(rightFor(Access::read)), "read");
    EXPECT_EQ(nameOf(rightFor(Access::write)), "write");
    EXPECT_EQ(nameOf(rightFor(Access::control)), "control");
    EXPECT_EQ(nameOf(rightFor(Access::account)), "account");
    for (const auto& [word, right] : rightWords) {
        EXPECT_EQ(nameOf(right), word);
    }
}

TEST(AccountNames, FollowTheFileAndAreEmptyForOthers) {
    const test::TemporaryRoot root;
    root.write("/passwd", "anna:x:5:5::/:/bin/sh\nalias:x:5:5::/:/bin/sh\nnot a line\nbert:x:6:6::/:/bin/sh\n");
    AccountNames names(root.path("/passwd"), std::chrono::milliseconds(0));
    EXPECT_EQ(names.of(5), "anna");
    EXPECT_EQ(names.of(6), "bert");
    EXPECT_EQ(names.of(7), "");
    root.write("/passwd", "cora:x:7:7::/:/bin/sh\n");
    EXPECT_EQ(names.of(7), "cora");
    EXPECT_EQ(names.of(5), "");
    std::filesystem::remove(root.path("/passwd"));
    EXPECT_EQ(names.of(7), "");
    EXPECT_EQ(uidText(5, "anna"), "uid 5 (anna)");
    EXPECT_EQ(uidText(5, ""), "uid 5");
}

TEST(Peers, UnitIsTheFirstPartOfTheControlGroupThatIsNotASlice) {
    EXPECT_EQ(unitOf("/system.slice/cron.service"), "cron.service");
    EXPECT_EQ(unitOf("/system.slice/cron.service/inner.scope"), "cron.service");
    EXPECT_EQ(unitOf("/user.slice/user-1000.slice/session-3.scope"), "session-3.scope");
    EXPECT_EQ(unitOf("/user.slice/user-1000.slice/user@1000.service/app.slice/x.service"), "user@1000.service");
    EXPECT_EQ(unitOf("/"), "");
    EXPECT_EQ(unitOf(""), "");
    EXPECT_EQ(unitOf("/process_api/1c0a"), "");
    EXPECT_EQ(unitOf("/system.slice/a\nb.service"), "") << "not a name that the manager allows";
    EXPECT_EQ(unitOf("/system.slice/" + std::string(300, 'a') + ".service"), "");
}

TEST(Peers, CredentialsAreThoseOfTheOtherEnd) {
    int pair[2] = {-1, -1};
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM, 0, pair), 0);
    ucred credentials{};
    socklen_t size = sizeof credentials;
    ASSERT_EQ(::getsockopt(pair[0], SOL_SOCKET, SO_PEERCRED, &credentials, &size), 0);
    const Peer peer = peerOf(pair[0], credentials);
    EXPECT_EQ(peer.uid, ::getuid());
    EXPECT_EQ(peer.gid, ::getgid());
    EXPECT_EQ(peer.pid, ::getpid());
    std::vector<gid_t> groups(static_cast<std::size_t>(::getgroups(0, nullptr)));
    ASSERT_GE(::getgroups(static_cast<int>(groups.size()), groups.data()), 0);
    EXPECT_EQ(peer.groups, groups);
    EXPECT_TRUE(peer.isInGroup(::getgid()));
    ::close(pair[0]);
    ::close(pair[1]);
}

}  // namespace
}  // namespace adminhost
