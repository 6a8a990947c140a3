#include "adminhostd/WorkerDirectory.h"
#include "platform/directory/LocalAccounts.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;

class WorkerDirectory : public testing::Test {
  protected:
    ~WorkerDirectory() override { setDirectoryNodes({localAccounts()}); }

    [[nodiscard]] static std::vector<std::string> nodeNames() {
        std::vector<std::string> names;
        for (const DirectoryNodeSource& source : DirectorySession::defaultSession().nodes()) {
            names.push_back(source.name);
        }
        return names;
    }
    [[nodiscard]] static DirectoryNodeOptions ldap(const std::string& name) {
        DirectoryNodeOptions node;
        node.settings.name = name;
        node.settings.uris = {"ldap://127.0.0.1:1"};
        node.settings.base = "dc=example";
        return node;
    }
    [[nodiscard]] static DirectoryNodeOptions local(const std::string& name) {
        DirectoryNodeOptions node;
        node.local = true;
        node.settings.name = name;
        return node;
    }
};

TEST_F(WorkerDirectory, WithoutConfiguredNodesIsTheAccountsOfThisMachine) {
    EXPECT_THAT(configureDirectory({}), IsEmpty());
    EXPECT_THAT(nodeNames(), ElementsAre("/Local"));
}

TEST_F(WorkerDirectory, IsTheConfiguredNodesInTheirOrder) {
    protocol::Configure configuration;
    configuration.directory = {ldap("/B"), local("/Files"), ldap("/A")};
    EXPECT_THAT(configureDirectory(configuration), IsEmpty());
    EXPECT_THAT(nodeNames(), ElementsAre("/B", "/Files", "/A"));
    configuration.directory = {ldap("/B")};
    EXPECT_THAT(configureDirectory(configuration), IsEmpty());
    EXPECT_THAT(nodeNames(), ElementsAre("/B")) << "local accounts are not known unless a node names them";
}

TEST_F(WorkerDirectory, NodeThatCannotBeUsedIsNamedWithThePlaceOfItsKeyAndFails) {
    protocol::Configure configuration;
    configuration.directory = {ldap("/A")};
    configuration.directory[0].settings.userBase = "no name";
    configuration.directory[0].places = {{"", "file, line 1, column 1"}, {"user_base", "file, line 5, column 13"}};
    const auto problems = configureDirectory(configuration);
    ASSERT_EQ(problems.size(), 1U);
    EXPECT_THAT(problems[0],
                testing::StartsWith("file, line 5, column 13: the directory node \"/A\" cannot be used: user_base"));
    EXPECT_FALSE(DirectorySession::defaultSession().openNode("/A"));
    EXPECT_FALSE(searchDirectory({})) << "and so does the search in all nodes";
}

TEST_F(WorkerDirectory, CommandsOnAccountsHaveNoBudget) {
    Command command;
    command.access = Access::write;
    EXPECT_EQ(directoryBudget(&command, 7s), 7s);
    command.access = Access::read;
    EXPECT_EQ(directoryBudget(&command, 7s), 7s);
    command.access = Access::account;
    EXPECT_EQ(directoryBudget(&command, 7s), std::nullopt);
    EXPECT_EQ(directoryBudget(nullptr, 7s), 7s);
}

}  // namespace
}  // namespace adminhost
