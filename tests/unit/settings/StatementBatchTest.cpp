#include "platform/task/Task.h"
#include "settings/QueryRunner.h"
#include "settings/StatementBatch.h"
#include "tests/support/TemporaryRoot.h"

#include <chrono>
#include <csignal>
#include <filesystem>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {
namespace {

using adminhost::Dictionary;
using namespace std::chrono_literals;

constexpr std::string_view database = "/Library/SorvaneProducer/Shared/Server/db.sqlite3";

using Outcome = adminhost::Result<std::vector<Dictionary>>;

// The tool records its statement, sleeps for the statement's number, and does what the statement's word names.
class StatementBatchTest : public testing::Test {
  protected:
    StatementBatchTest() {
        root.write(database, "");
        root.writeTool("/usr/bin/sqlite3", "#!/bin/bash\ndirectory=" + root.path("").string() + R"sh(
set -- $3
echo "$*" >>"$directory/calls"
trap 'echo end "$*" >>"$directory/calls"' EXIT
sleep "0.0$(( ($2 * 7919) % 6 ))"
case $1 in
killed) kill -KILL $$ ;;
failing) echo "Error: no such table" >&2; exit 1 ;;
locked) [ -e "$directory/unlocked" ] || { touch "$directory/unlocked"; echo "Error: database is locked (5)" >&2; exit 5; } ;;
always) echo "Error: database is locked (5)" >&2; exit 5 ;;
waiting) until [ "$(grep -c '^waiting' "$directory/calls")" -ge 3 ]; do sleep 0.01; done ;;
hanging) echo $$ >"$directory/process"; exec sleep 60 ;;
esac
printf '   id = %s\nvalue = %s\n' "$2" "$1"
)sh");
    }
    ~StatementBatchTest() override { adminhost::setTaskDeadline(std::nullopt); }

    static std::vector<std::string> statements(std::size_t count) {
        std::vector<std::string> list;
        for (std::size_t i = 0; i < count; ++i) {
            list.push_back("row " + std::to_string(i));
        }
        return list;
    }
    static std::vector<Outcome> inTurn(const std::vector<std::string>& list) {
        std::vector<Outcome> outcomes;
        for (const std::string& statement : list) {
            outcomes.push_back(runStatement(statement));
        }
        return outcomes;
    }
    static std::vector<Outcome> inBatch(const std::vector<std::string>& list, std::size_t atOnce) {
        StatementBatch batch(list, atOnce);
        std::vector<Outcome> outcomes(list.size());
        for (Outcome& outcome : outcomes) {
            outcome = batch.next();
        }
        return outcomes;
    }
    /// The records since the last call: the statements, and an "end" line for each run that ended by itself.
    [[nodiscard]] std::vector<std::string> calls() const {
        std::vector<std::string> lines;
        std::istringstream text(root.read("/calls"));
        for (std::string line; std::getline(text, line);) {
            lines.push_back(line);
        }
        root.write("/calls", "");
        return lines;
    }
    /// Only the statements.
    [[nodiscard]] std::vector<std::string> begun() const {
        std::vector<std::string> lines = calls();
        std::erase_if(lines, [](const std::string& line) { return line.starts_with("end "); });
        return lines;
    }

    adminhost::test::TemporaryRoot root;
};

TEST_F(StatementBatchTest, ResultsAndStatementsAreThoseOfRunningInTurn) {
    for (const std::size_t count : {1U, 2U, 8U, 100U}) {
        const std::vector<std::string> list = statements(count);
        const std::vector<Outcome> expected = inTurn(list);
        EXPECT_EQ(begun(), list);
        for (const std::size_t atOnce : {2U, 8U}) {
            EXPECT_EQ(inBatch(list, atOnce), expected) << count << " statements, " << atOnce << " at once";
            EXPECT_THAT(begun(), testing::UnorderedElementsAreArray(list));
        }
    }
}

TEST_F(StatementBatchTest, RunsAsManyAtATimeAsAllowed) {
    // The first three end only when all three are running.
    std::vector<std::string> list;
    for (int i = 0; i < 20; ++i) {
        list.push_back("waiting " + std::to_string(i));
    }
    adminhost::setTaskDeadline(std::chrono::steady_clock::now() + 120s);
    static_cast<void>(inBatch(list, 3));
    std::size_t running = 0;
    std::size_t most = 0;
    for (const std::string& line : calls()) {
        running += line.starts_with("end ") ? std::size_t(-1) : 1;
        most = std::max(most, running);
    }
    EXPECT_EQ(most, 3U);
}

TEST_F(StatementBatchTest, AnEmptyBatchStartsNothing) {
    StatementBatch batch({});
    EXPECT_THAT(begun(), testing::IsEmpty());
}

TEST_F(StatementBatchTest, AKilledAndAFailingToolCostOnlyTheirOwnStatements) {
    std::vector<std::string> list = statements(8);
    list[2] = "killed 2";
    list[5] = "failing 5";
    const std::vector<Outcome> outcomes = inBatch(list, 4);
    EXPECT_EQ(outcomes, inTurn(list));
    ASSERT_FALSE(outcomes[2]);
    EXPECT_EQ(outcomes[2].error().code, 128 + 9);
    ASSERT_FALSE(outcomes[5]);
    EXPECT_EQ(outcomes[5].error().description, "Can't execute sqlite3 query: Error: no such table\n");
}

TEST_F(StatementBatchTest, ADeadlineInTheMiddleEndsTheRunningToolsAndStartsNoFurther) {
    std::vector<std::string> list = statements(8);
    list[4] = "hanging 4";
    list[5] = "hanging 5";
    const auto begin = std::chrono::steady_clock::now();
    adminhost::setTaskDeadline(begin + 1500ms);
    const std::vector<Outcome> outcomes = inBatch(list, 2);
    EXPECT_LT(std::chrono::steady_clock::now() - begin, 20s);  // the tools would take a minute
    for (std::size_t i = 0; i < 4; ++i) {
        EXPECT_TRUE(outcomes[i]) << i;
    }
    for (const std::size_t i : {4U, 5U}) {
        ASSERT_FALSE(outcomes[i]);
        EXPECT_EQ(outcomes[i].error().code, 128 + 9);
    }
    for (const std::size_t i : {6U, 7U}) {
        ASSERT_FALSE(outcomes[i]);
        EXPECT_EQ(outcomes[i].error().code, -1);
    }
    EXPECT_THAT(begun(), testing::UnorderedElementsAre("row 0", "row 1", "row 2", "row 3", "hanging 4", "hanging 5"));
}

TEST_F(StatementBatchTest, ALockedDatabaseIsTriedAgainAlone) {
    std::vector<std::string> list = statements(6);
    list[1] = "locked 1";
    const std::vector<Outcome> outcomes = inBatch(list, 3);
    EXPECT_EQ(outcomes[1], (std::vector<Dictionary>{{{"id", "1"}, {"value", "locked"}}}));
    // No other tool was running during the second try.
    const std::vector<std::string> lines = calls();
    const auto first = std::find(lines.begin(), lines.end(), "locked 1");
    const auto second = std::find(first + 1, lines.end(), "locked 1");
    ASSERT_NE(second, lines.end());
    EXPECT_EQ(2 * std::count_if(lines.begin(), second, [](const auto& line) { return line.starts_with("end "); }),
              second - lines.begin());
    EXPECT_EQ(*(second + 1), "end locked 1");
}

TEST_F(StatementBatchTest, ADatabaseThatStaysLockedIsReported) {
    const std::vector<Outcome> outcomes = inBatch({"row 0", "always 1", "row 2"}, 2);
    EXPECT_TRUE(outcomes[0]);
    ASSERT_FALSE(outcomes[1]);
    EXPECT_EQ(outcomes[1].error().code, 5);
    EXPECT_TRUE(outcomes[2]);
    EXPECT_THAT(begun(), testing::UnorderedElementsAre("row 0", "always 1", "always 1", "row 2"));
}

TEST_F(StatementBatchTest, OneAtATimeNeverTriesAgain) {
    const std::vector<Outcome> outcomes = inBatch({"always 0", "always 1"}, 1);
    EXPECT_EQ(outcomes[0].error().code, 5);
    EXPECT_EQ(begun(), (std::vector<std::string>{"always 0", "always 1"}));
}

TEST_F(StatementBatchTest, AnAbandonedBatchLeavesNoToolRunning) {
    {
        StatementBatch batch({"row 0", "hanging 1"}, 2);
        static_cast<void>(batch.next());
        while (!std::filesystem::exists(root.path("/process"))) {
            std::this_thread::sleep_for(10ms);
        }
    }
    const int process = std::stoi(root.read("/process"));
    EXPECT_EQ(::kill(process, 0), -1) << process;
}

}  // namespace
}  // namespace lumio
