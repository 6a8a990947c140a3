#include "platform/task/TaskGroup.h"
#include "tests/unit/platform/task/TaskDirectory.h"

#include <cerrno>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace adminhost;
using namespace std::chrono_literals;

namespace fs = std::filesystem;

class TaskGroupOf : public TaskDirectory {
  protected:
    void TearDown() override {
        TaskDirectory::TearDown();
        EXPECT_EQ(::waitpid(-1, nullptr, WNOHANG), -1) << "a child is left";
        EXPECT_EQ(errno, ECHILD);
    }
    [[nodiscard]] std::string place(const std::string& name) const { return _dir / name; }
};

TaskPlan shell(const std::string& script) {
    return {DiskPath("/bin/sh"), {"-c", script}};
}

/// Whether the process exists and has not been killed.
bool runs(const std::string& pid) {
    std::ifstream file("/proc/" + pid + "/status");
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    return text.find("State:\t") != std::string::npos && text.find("State:\tZ") == std::string::npos;
}

TEST_F(TaskGroupOf, OutputCollectsForAMomentBetweenTwoReadings) {
    TaskGroup group;
    std::string seen;
    TaskPlan plan = shell("echo one; until [ -e " + place("go") + " ]; do sleep 0.01; done; echo two");
    plan.outputGrows = [&](std::string_view output) { seen = output; };
    const TaskGroup::Id id = group.start(std::move(plan));
    while (seen.empty()) {
        group.wait();
    }
    EXPECT_EQ(seen, "one\n");
    std::vector<pollfd> entries;
    group.addTo(entries);
    EXPECT_EQ(entries.at(0).fd, -1) << "further output wakes nobody";
    EXPECT_TRUE(group.due()) << "the end of the moment";
    std::ofstream(place("go")) << "";
    EXPECT_EQ(group.collect(id).output, "one\ntwo\n");
    EXPECT_EQ(seen, "one\ntwo\n");
}

TEST_F(TaskGroupOf, ToolsRunAtTheSameTime) {
    // Each waits until all have started.
    TaskGroup group;
    std::vector<TaskGroup::Id> ids;
    for (int i = 0; i < 5; ++i) {
        ids.push_back(
            group.start(shell("touch " + place("started.") + std::to_string(i) + "; until [ $(ls " + _dir.string() +
                              " | wc -l) = 5 ]; do sleep 0.01; done; echo " + std::to_string(i))));
    }
    for (int i = 0; i < 5; ++i) {
        const TaskResult result = group.collect(ids.at(static_cast<std::size_t>(i)));
        EXPECT_EQ(result.status, 0);
        EXPECT_EQ(result.output, std::to_string(i) + "\n");
    }
}

TEST_F(TaskGroupOf, ResultsAreTheSequentialOnesHoweverLongEachToolTakes) {
    std::mt19937 random(1);
    for (const int count : {1, 2, 8, 40}) {
        TaskGroup group;
        std::vector<TaskGroup::Id> ids;
        for (int i = 0; i < count; ++i) {
            const std::string milliseconds = std::to_string(random() % 50);
            ids.push_back(
                group.start(shell("sleep 0.0" + milliseconds + "; echo out " + std::to_string(i) + "; echo err " +
                                  std::to_string(i) + " >&2; exit " + std::to_string(i % 7))));
        }
        for (int i = 0; i < count; ++i) {
            const TaskResult result = group.collect(ids.at(static_cast<std::size_t>(i)));
            EXPECT_EQ(result.status, i % 7);
            EXPECT_EQ(result.output, "out " + std::to_string(i) + "\n");
            EXPECT_EQ(result.error, "err " + std::to_string(i) + "\n");
        }
    }
}

TEST_F(TaskGroupOf, OutputIsPassedOnWhileTheToolIsStillWriting) {
    TaskPlan plan = shell("echo begun; until [ -e " + place("seen") + " ]; do sleep 0.01; done; echo done");
    std::vector<std::string> seen;
    plan.outputGrows = [&](std::string_view soFar) {
        seen.emplace_back(soFar);
        std::ofstream(place("seen")) << soFar;
    };
    TaskGroup group;
    const TaskResult result = group.collect(group.start(std::move(plan)));
    EXPECT_EQ(result.output, "begun\ndone\n");
    EXPECT_EQ(seen, (std::vector<std::string>{"begun\n", "begun\ndone\n"}));
}

TEST_F(TaskGroupOf, OutputAboveTheBoundIsNotPassedOn) {
    setTaskOutputBound(10);
    TaskPlan plan = shell("echo 12345; sleep 0.1; echo 67890");
    std::vector<std::string> seen;
    plan.outputGrows = [&](std::string_view soFar) { seen.emplace_back(soFar); };
    TaskGroup group;
    EXPECT_EQ(group.collect(group.start(std::move(plan))).status, -1);
    EXPECT_EQ(seen, std::vector<std::string>{"12345\n"});
}

TEST_F(TaskGroupOf, ResultsCanBeCollectedInAnyOrderAndToolsStartedInBetween) {
    TaskGroup group;
    const auto first = group.start(shell("echo 1"));
    const auto second = group.start(shell("echo 2"));
    EXPECT_EQ(group.collect(second).output, "2\n");
    const auto third = group.start(shell("echo 3"));
    EXPECT_EQ(group.collect(third).output, "3\n");
    EXPECT_EQ(group.collect(first).output, "1\n");
}

TEST_F(TaskGroupOf, MegabytesFromAllAtOnceArriveWholeInWhicheverOrderTheyAreCollected) {
    TaskGroup group;
    const auto first = group.start(shell("head -c 3000000 /dev/zero | tr '\\0' a"));
    const auto second = group.start(shell("head -c 3000000 /dev/zero | tr '\\0' b >&2"));
    TaskPlan plan{DiskPath("/bin/cat"), {}};
    plan.input = std::string(3'000'000, 'c');
    const auto third = group.start(std::move(plan));
    EXPECT_EQ(group.collect(third).output, std::string(3'000'000, 'c'));
    EXPECT_EQ(group.collect(first).output, std::string(3'000'000, 'a'));
    EXPECT_EQ(group.collect(second).error, std::string(3'000'000, 'b'));
}

TEST_F(TaskGroupOf, AKilledToolCostsOnlyItself) {
    TaskGroup group;
    std::vector<TaskGroup::Id> ids;
    for (int i = 0; i < 5; ++i) {
        ids.push_back(group.start(shell(i == 2 ? "echo $$; kill -KILL $$" : "sleep 0.1; echo done")));
    }
    for (int i = 0; i < 5; ++i) {
        const TaskResult result = group.collect(ids.at(static_cast<std::size_t>(i)));
        EXPECT_EQ(result.status, i == 2 ? 128 + SIGKILL : 0);
        EXPECT_EQ(result.output == "done\n", i != 2);
    }
}

TEST_F(TaskGroupOf, AToolThatCannotBeStartedCostsOnlyItself) {
    TaskGroup group;
    const auto first = group.start(shell("echo 1"));
    const auto second = group.start({DiskPath("/missing"), {}});
    EXPECT_TRUE(group.ended(second));
    const TaskResult missing = group.collect(second);
    EXPECT_EQ(missing.status, -1);
    EXPECT_EQ(missing.error, "/missing: No such file or directory");
    EXPECT_EQ(group.collect(first).output, "1\n");
}

TEST_F(TaskGroupOf, OnlyToolsThatWereStartedAreCounted) {
    const std::uint64_t before = startedTasks();
    TaskGroup group;
    TaskPlan refused = shell("exit 0");
    refused.refusal = "not allowed";
    EXPECT_EQ(group.collect(group.start(std::move(refused))).status, -1);
    EXPECT_EQ(group.collect(group.start({DiskPath("/missing"), {}})).status, -1);
    EXPECT_EQ(startedTasks(), before);
    EXPECT_EQ(group.collect(group.start(shell("exit 1"))).status, 1);
    EXPECT_EQ(startedTasks(), before + 1);
    setTaskDeadline(std::chrono::steady_clock::now());
    EXPECT_EQ(group.collect(group.start(shell("exit 0"))).status, -1);
    EXPECT_EQ(startedTasks(), before + 1);
}

TEST_F(TaskGroupOf, TheDeadlineKillsTheToolsThatStillRunAndTheirGroupsAndKeepsTheOthersResults) {
    setTaskDeadline(std::chrono::steady_clock::now() + 500ms);
    TaskGroup group;
    const auto quick = group.start(shell("echo quick"));
    const auto slow = group.start(shell("sleep 300 & echo $!; sleep 300"));
    const auto other = group.start(shell("echo begun; sleep 300"));
    const TaskResult slowResult = group.collect(slow);
    EXPECT_EQ(slowResult.status, 128 + SIGKILL);
    ASSERT_NE(slowResult.output, "");
    EXPECT_TRUE(isGoneSoon(static_cast<pid_t>(std::stol(slowResult.output))));
    const TaskResult otherResult = group.collect(other);
    EXPECT_EQ(otherResult.status, 128 + SIGKILL);
    EXPECT_EQ(otherResult.output, "begun\n");
    const auto late = group.start(shell("touch " + place("late")));
    EXPECT_EQ(group.collect(late).error, "/bin/sh: not started: the time allowed for the request is over");
    EXPECT_FALSE(fs::exists(place("late")));
    const TaskResult quickResult = group.collect(quick);
    EXPECT_EQ(quickResult.status, 0);
    EXPECT_EQ(quickResult.output, "quick\n");
}

TEST_F(TaskGroupOf, OneBoundHoldsForTheBytesOfAllTools) {
    setTaskOutputBound(100'000);
    TaskGroup group;
    const auto first = group.start(shell("head -c 60000 /dev/zero"));
    while (!group.ended(first)) {
        group.serve();
    }
    const auto second = group.start(shell("head -c 60000 /dev/zero; sleep 300"));
    const TaskResult over = group.collect(second);
    EXPECT_EQ(over.status, -1);
    EXPECT_EQ(over.output, "");
    EXPECT_EQ(over.error, "/bin/sh: stopped: it and the tools beside it wrote more than 100000 bytes");
    // The bytes of the failed tool and the collected bytes no longer count.
    const auto third = group.start(shell("head -c 40000 /dev/zero"));
    EXPECT_EQ(group.collect(third).output.size(), 40'000U);
    EXPECT_EQ(group.collect(first).output.size(), 60'000U);
    const auto fourth = group.start(shell("head -c 60000 /dev/zero; head -c 40000 /dev/zero >&2"));
    const TaskResult whole = group.collect(fourth);
    EXPECT_EQ(whole.status, 0);
    EXPECT_EQ(whole.output.size() + whole.error.size(), 100'000U);
}

TEST_F(TaskGroupOf, StandardOutputAndErrorOfOneToolShareTheBound) {
    setTaskOutputBound(100'000);
    TaskGroup group;
    const TaskResult result = group.collect(group.start(shell("head -c 60000 /dev/zero; head -c 40001 /dev/zero >&2")));
    EXPECT_EQ(result.status, -1);
    EXPECT_EQ(result.error, "/bin/sh: stopped: it wrote more than 100000 bytes");
}

TEST_F(TaskGroupOf, ACallerCanPollItsOwnDescriptorsBesideTheGroups) {
    TaskGroup group;
    EXPECT_FALSE(group.due());
    const auto first = group.start(shell("sleep 0.05; echo 1"));
    const auto second = group.start(shell("sleep 0.1; echo 2; sleep 300 & echo $! >&2"));
    EXPECT_FALSE(group.due()) << "no deadline";
    int rounds = 0;
    for (; !group.ended(first) || !group.ended(second); ++rounds) {
        std::vector<pollfd> entries;
        group.addTo(entries);
        const auto due = group.due();
        const auto left = due ? std::chrono::ceil<std::chrono::milliseconds>(*due - std::chrono::steady_clock::now())
                              : std::chrono::milliseconds(10'000);
        ASSERT_GE(::poll(entries.data(), entries.size(), std::max(0, static_cast<int>(left.count()))), 0);
        group.serve();
    }
    EXPECT_LT(rounds, 50) << "it spins";
    EXPECT_EQ(group.collect(first).output, "1\n");
    const TaskResult result = group.collect(second);
    EXPECT_EQ(result.output, "2\n");
    const std::string daemon = result.error.substr(0, result.error.find('\n'));
    EXPECT_TRUE(runs(daemon)) << "the daemon was left alone";
    ::kill(static_cast<pid_t>(std::stol(daemon)), SIGKILL);
    EXPECT_FALSE(group.due());
}

TEST_F(TaskGroupOf, ToolsThatNobodyCollectsAreKilledWithTheirGroups) {
    const auto before = openDescriptors();
    {
        TaskGroup group;
        (void)group.start(shell("sleep 300 & echo $! > " + place("pid.new") + "; mv " + place("pid.new") + " " +
                                place("pid") + "; sleep 300"));
        (void)group.start(shell("exit 0"));
        while (!fs::exists(place("pid"))) {
            group.serve();
        }
    }
    std::string pid;
    std::ifstream(place("pid")) >> pid;
    EXPECT_TRUE(isGoneSoon(static_cast<pid_t>(std::stol(pid))));
    EXPECT_EQ(openDescriptors(), before);
}

TEST_F(TaskGroupOf, ADaemonThatAToolLeftIsNotKilledWithAGroupThatNobodyCollects) {
    std::string pid;
    {
        TaskGroup group;
        (void)group.start(shell("sleep 300 > /dev/null 2>&1 & echo $! > " + place("pid.new") + "; mv " +
                                place("pid.new") + " " + place("pid")));
        while (!fs::exists(place("pid"))) {
            std::this_thread::sleep_for(1ms);
        }
        std::this_thread::sleep_for(50ms);  // the tool has exited, and nothing has noticed it yet
    }
    std::ifstream(place("pid")) >> pid;
    std::this_thread::sleep_for(50ms);
    EXPECT_TRUE(runs(pid));
    ::kill(static_cast<pid_t>(std::stol(pid)), SIGKILL);
}

}  // namespace
