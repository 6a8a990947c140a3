// A listing, whose access-list queries run several at a time, against expanding one camera after the other: the same
// answers, statements and log lines, although every run of the tool takes a random time.

#include "platform/task/Task.h"
#include "tests/support/CapturedReports.h"
#include "tests/unit/resources/AccessListsFixture.h"

#include <algorithm>
#include <chrono>
#include <filesystem>

namespace lumio {
namespace {

using namespace std::chrono_literals;
using adminhost::NotDone;

constexpr int firstId = 100;

struct Outcome {
    Value cameras;
    std::vector<std::string> lines;
    std::vector<std::string> parts;
    std::vector<std::string> statements;
    bool operator==(const Outcome&) const = default;
};

class ParallelListing : public AccessLists {
  protected:
    void TearDown() override {
        adminhost::setTaskDeadline(std::nullopt);
        AccessLists::TearDown();
    }

    /// So many cameras, each with a person or a group on its list.
    void makeCameras(int count) const {
        std::string rows = "delete from cameras; delete from access_control_entries;";
        for (int id = firstId; id < firstId + count; ++id) {
            const std::string number = std::to_string(id);
            rows += "insert into cameras(id,name,uuid,access_control_enabled) values(" + number + ",'Camera " + number +
                    "','C-" + number + "','t');insert into access_control_entries values('" +
                    uuidOf(id % 2 == 0 ? "user:anna" : "group:editors") + "','Camera'," + number + ");";
        }
        root.sql(database, rows);
    }
    /// The tool records its statement, waits up to 40 ms before a query of an access list, and then carries out the
    /// lines of shell, in which $id is the camera.
    void makeTool(const std::string& lines) const {
        std::filesystem::remove(root.path("/usr/bin/sqlite3"));
        root.writeTool("/usr/bin/sqlite3",
                       "#!/bin/bash\nprintf '%s\\n' \"$3\" >>'" + root.path("/statements").string() +
                           "'\ncase $3 in *access_control_entries*)\nid=${3##*= \\'}\nid=${id%\\'}\n" +
                           "sleep 0.0$((RANDOM % 5))\n" + lines + "\nesac\n" + "exec /usr/bin/sqlite3 \"$@\"\n");
    }
    [[nodiscard]] Outcome outcomeOf(Value cameras) {
        Outcome outcome{std::move(cameras), std::exchange(log.lines, {}), {}, {}};
        for (const NotDone& part : std::exchange(reports.parts, {})) {
            outcome.parts.push_back(part.reason + ": " + part.toolMessage);
        }
        std::istringstream text(root.read("/statements"));
        for (std::string statement; std::getline(text, statement);) {
            outcome.statements.push_back(statement);
        }
        std::filesystem::remove(root.path("/statements"));
        return outcome;
    }
    [[nodiscard]] Outcome inTurn() {
        Array list;
        std::optional<Error> error;
        auto cameras = Camera::allCamerasWithError(error);
        EXPECT_TRUE(cameras);
        for (const auto& each : *cameras) {
            list.emplace_back(*each->dictionary());
        }
        return outcomeOf(std::move(list));
    }
    [[nodiscard]] Outcome inParallel() {
        return outcomeOf(handler.getCamerasWithRequest({}).dictionary().get("cameras"));
    }
    /// Tools that run at the same time record their statements in any order.
    static Outcome withSortedStatements(Outcome outcome) {
        std::sort(outcome.statements.begin(), outcome.statements.end());
        return outcome;
    }
    void expectTheSame() {
        const Outcome sequential = inTurn();
        const Outcome parallel = inParallel();
        EXPECT_EQ(parallel.cameras, sequential.cameras);
        EXPECT_EQ(parallel.lines, sequential.lines);
        EXPECT_EQ(parallel.parts, sequential.parts);
        ASSERT_FALSE(parallel.statements.empty());
        EXPECT_EQ(parallel.statements.front(), sequential.statements.front()) << "the listing runs first and alone";
        EXPECT_EQ(withSortedStatements(parallel), withSortedStatements(sequential));
    }

    adminhost::test::CapturedReports reports;
};

TEST_F(ParallelListing, OfAnyNumberOfCamerasHasAnswersStatementsAndLinesOfOneAfterTheOther) {
    makeTool("");
    for (const int count : {1, 2, 8, 100}) {
        SCOPED_TRACE(count);
        makeCameras(count);
        expectTheSame();
    }
}

TEST_F(ParallelListing, WithTheThirdToolKilledIsThatOfOneAfterTheOther) {
    makeTool("case $id in 102) kill -KILL $$ ;; esac");
    for (const int count : {8, 100}) {
        SCOPED_TRACE(count);
        makeCameras(count);
        expectTheSame();
    }
}

TEST_F(ParallelListing, WithToolsThatFailIsThatOfOneAfterTheOther) {
    makeTool("case $id in 101) echo away >&2; exit 7 ;; 106) kill -KILL $$ ;; esac");
    makeCameras(8);
    const Outcome sequential = inTurn();
    EXPECT_EQ(sequential.lines.size(), 2U);
    EXPECT_EQ(sequential.parts.size(), 2U);
    expectTheSame();
}

TEST_F(ParallelListing, AtADeadlineInTheMiddleShowsTheSameListsAndNamesTheSameFailures) {
    makeTool("[ $id -lt 104 ] || exec sleep 60");
    makeCameras(8);
    const auto begin = std::chrono::steady_clock::now();
    adminhost::setTaskDeadline(std::chrono::steady_clock::now() + 3s);
    Outcome sequential = inTurn();
    adminhost::setTaskDeadline(std::chrono::steady_clock::now() + 3s);
    Outcome parallel = inParallel();
    EXPECT_LT(std::chrono::steady_clock::now() - begin, 40s) << "the tools would take a minute";
    EXPECT_EQ(parallel.cameras, sequential.cameras);
    // As many tools as run at once are killed at the deadline and not only the first one; the others are not started.
    for (Outcome* outcome : {&sequential, &parallel}) {
        EXPECT_EQ(outcome->lines.size(), 4U);
        EXPECT_EQ(outcome->parts.size(), 4U);
        for (std::string& line : outcome->lines) {
            line.resize(std::min(line.find(" sqliteQuery ("), line.size()));
        }
    }
    EXPECT_EQ(parallel.lines, sequential.lines);
    // The list of cameras, the four lists before the deadline, and at least the first one that hangs.
    ASSERT_EQ(sequential.statements.size(), 6U);
    for (const std::string& statement : sequential.statements) {
        EXPECT_THAT(parallel.statements, testing::Contains(statement));
    }
}

}  // namespace
}  // namespace lumio
