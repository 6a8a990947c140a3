#include "platform/task/StartChild.h"

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace adminhost;
namespace fs = std::filesystem;

/// Reads the child's standard output until the child and everything that it started have closed it.
struct Ended {
    std::string output;
    int status = -1;
};

Ended run(ChildPlan plan) {
    int ends[2];
    EXPECT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    const FileDescriptor reader(ends[0]);
    FileDescriptor writer(ends[1]);
    plan.descriptors.at(1) = writer.get();
    const auto child = startChild(plan);
    writer.close();
    Ended ended;
    if (!child) {
        ADD_FAILURE() << child.error().description.value_or("");
        return ended;
    }
    char buffer[4096];
    for (ssize_t count = 0; (count = ::read(reader.get(), buffer, sizeof buffer)) > 0;) {
        ended.output.append(buffer, static_cast<std::size_t>(count));
    }
    EXPECT_EQ(::waitpid(child->pid, &ended.status, 0), child->pid);
    return ended;
}

ChildPlan shell(const std::string& script) {
    ChildPlan plan;
    plan.program = "/bin/sh";
    plan.arguments = {"sh", "-c", script};
    plan.environment = {"PATH=/usr/bin:/bin"};
    return plan;
}

std::atomic<pid_t>* sharedPage() {
    void* page = ::mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    return page == MAP_FAILED ? nullptr : new (page) std::atomic<pid_t>(0);
}

/// Returns true if every child of this process ends within ten seconds; a child that does not is killed.
bool adoptedChildrenEnd() {
    const auto end = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    for (;;) {
        const pid_t pid = ::waitpid(-1, nullptr, WNOHANG);
        if (pid < 0) {
            return errno == ECHILD;
        }
        if (pid == 0 && std::chrono::steady_clock::now() > end) {
            std::ifstream file("/proc/thread-self/children");
            for (pid_t child = 0; file >> child;) {
                ::kill(child, SIGKILL);
                ::waitpid(child, nullptr, 0);
            }
            return false;
        }
        if (pid == 0) {
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        }
    }
}

TEST(StartChild, GivesTheChildItsArgumentsEnvironmentDirectoryAndUmask) {
    ChildPlan plan = shell(R"(echo "$0 $1 [$A]"; pwd -P; umask)");
    plan.arguments.insert(plan.arguments.end(), {"zero", "one two"});
    plan.environment.push_back("A=b c");
    plan.directory = "/usr";
    plan.fileModeMask = 027;
    EXPECT_EQ(run(plan).output, "zero one two [b c]\n/usr\n0027\n");
}

TEST(StartChild, WithoutDirectoryAndUmaskTheChildKeepsOurs) {
    const fs::path before = fs::current_path();
    fs::current_path("/usr");
    const mode_t mask = ::umask(031);
    const Ended ended = run(shell("pwd -P; umask"));
    ::umask(mask);
    fs::current_path(before);
    EXPECT_EQ(ended.output, "/usr\n0031\n");
}

TEST(StartChild, ChildHasAProcessGroupOfItsOwn) {
    const Ended ended = run(shell("cut -d ' ' -f 1,5 /proc/self/stat; echo $$"));
    std::istringstream words(ended.output);
    pid_t cut = 0;
    pid_t group = 0;
    pid_t self = 0;
    words >> cut >> group >> self;
    EXPECT_NE(self, 0);
    EXPECT_EQ(group, self);
    EXPECT_NE(group, ::getpgrp());
}

TEST(StartChild, DescriptorsAreTheOnesOfThePlanAlsoWhenTheyAreTheirOwnTargets) {
    const std::string place = fs::temp_directory_path() / "start-child-XXXXXX";
    std::string directory = place;
    ASSERT_NE(::mkdtemp(directory.data()), nullptr);
    const FileDescriptor first(::open((directory + "/first").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    const FileDescriptor second(::open((directory + "/second").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    // Enough that each has a number to which another one is moved.
    const int count = std::max(first.get(), second.get()) + 1;
    ChildPlan plan = shell("for fd in /proc/$$/fd/*; do echo ${fd##*/} $(readlink $fd); done");
    plan.program = "/bin/bash";  // dash opens descriptor 10 for itself
    plan.arguments.front() = "bash";
    plan.descriptors.assign(static_cast<std::size_t>(count), -1);
    plan.descriptors.at(static_cast<std::size_t>(first.get())) = second.get();
    plan.descriptors.at(static_cast<std::size_t>(second.get())) = first.get();
    const Ended ended = run(plan);
    const std::string output = "\n" + ended.output;
    EXPECT_NE(output.find("\n0 /dev/null\n"), std::string::npos) << output;
    EXPECT_NE(output.find("\n" + std::to_string(first.get()) + " " + directory + "/second\n"), std::string::npos)
        << output;
    EXPECT_NE(output.find("\n" + std::to_string(second.get()) + " " + directory + "/first\n"), std::string::npos)
        << output;
    fs::remove_all(directory);
}

TEST(StartChild, NoOtherDescriptorIsInherited) {
    const int inheritable = ::open("/dev/null", O_RDONLY);
    const int high = ::fcntl(inheritable, F_DUPFD, 200);
    ChildPlan plan = shell("exec ls /proc/self/fd");
    const Ended ended = run(plan);
    ::close(inheritable);
    ::close(high);
    EXPECT_EQ(ended.output, "0\n1\n2\n3\n");  // 3 is the listing's own
}

TEST(StartChild, SignalsAreAtTheirDefaultAndUnblockedAndOurMaskStays) {
    sigset_t blocked{};
    sigset_t before{};
    sigset_t after{};
    ::sigemptyset(&blocked);
    ::sigaddset(&blocked, SIGTERM);
    ASSERT_EQ(::pthread_sigmask(SIG_BLOCK, &blocked, &before), 0);
    const auto old = std::signal(SIGUSR1, SIG_IGN);
    const Ended ended = run(shell("exec grep -E '^Sig(Blk|Ign)' /proc/self/status"));
    (void)std::signal(SIGUSR1, old);
    ::pthread_sigmask(SIG_SETMASK, &before, &after);
    EXPECT_EQ(ended.output, "SigBlk:\t0000000000000000\nSigIgn:\t0000000000000000\n");
    EXPECT_TRUE(::sigismember(&after, SIGTERM));
    EXPECT_FALSE(::sigismember(&after, SIGINT));
}

TEST(StartChild, ChildHasAProcessGroupOfItsOwnUnlessThePlanKeepsOurs) {
    ChildPlan plan = shell("ps -o pgid= -p $$");
    EXPECT_NE(std::stoi(run(plan).output), ::getpgrp());
    plan.ownGroup = false;
    EXPECT_EQ(std::stoi(run(plan).output), ::getpgrp());
}

TEST(StartChild, ProgramThatCannotBeExecutedIsAnErrorAndNoChildIsLeft) {
    const std::size_t before =
        static_cast<std::size_t>(std::distance(fs::directory_iterator("/proc/self/fd"), fs::directory_iterator{}));
    ChildPlan plan = shell("");
    plan.program = "/missing";
    const auto child = startChild(plan);
    ASSERT_FALSE(child);
    EXPECT_EQ(child.error(), (Error{"posix", ENOENT, "No such file or directory"}));
    plan = shell("");
    plan.directory = "/missing";
    EXPECT_EQ(startChild(plan).error().code, ENOENT);
    plan = shell("");
    plan.descriptors.push_back(999);
    EXPECT_EQ(startChild(plan).error().code, EBADF);
    EXPECT_EQ(::waitpid(-1, nullptr, WNOHANG), -1);
    EXPECT_EQ(errno, ECHILD);
    EXPECT_EQ(std::distance(fs::directory_iterator("/proc/self/fd"), fs::directory_iterator{}),
              static_cast<std::ptrdiff_t>(before));
}

TEST(StartChild, NulInATextAndARelativeProgramAreRejected) {
    for (const auto& change : std::vector<void (*)(ChildPlan&)>{
             [](ChildPlan& plan) { plan.program = "bin/sh"; },
             [](ChildPlan& plan) { plan.program = std::string("/bin/sh\0x", 9); },
             [](ChildPlan& plan) { plan.arguments.emplace_back("a\0b", 3); },
             [](ChildPlan& plan) { plan.environment.emplace_back("A=\0b", 4); },
             [](ChildPlan& plan) { plan.directory = std::string("/\0", 2); },
         }) {
        ChildPlan plan = shell("");
        change(plan);
        const auto child = startChild(plan);
        ASSERT_FALSE(child);
        EXPECT_EQ(child.error().code, EINVAL);
    }
}

TEST(StartChild, TheExitDescriptorIsReadableOnlyAfterTheExit) {
    int ends[2];
    ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    const FileDescriptor reader(ends[0]);
    FileDescriptor writer(ends[1]);
    ChildPlan plan = shell("read -r line");
    plan.descriptors.at(0) = reader.get();
    const auto child = startChild(plan);
    ASSERT_TRUE(child);
    pollfd entry{child->exit.get(), POLLIN, 0};
    EXPECT_EQ(::poll(&entry, 1, 50), 0);
    writer.close();
    EXPECT_EQ(::poll(&entry, 1, 10'000), 1);
    EXPECT_EQ(::waitpid(child->pid, nullptr, 0), child->pid);
}

TEST(StartChild, TheChildIsRegisteredBeforeItExecutesItsProgramAndNeverAfterAFailure) {
    std::atomic<pid_t>* slot = sharedPage();
    ASSERT_NE(slot, nullptr);
    ChildPlan plan = shell("exit 3");
    plan.registration = slot;
    auto child = startChild(plan);
    ASSERT_TRUE(child);
    EXPECT_EQ(slot->load(), child->pid);
    EXPECT_EQ(::waitpid(child->pid, nullptr, 0), child->pid);
    plan.program = "/missing";
    EXPECT_FALSE(startChild(plan));
    EXPECT_EQ(slot->load(), 0);
    ::munmap(slot, 4096);
}

TEST(StartChild, AChildWhoseParentIsKilledIsEitherRegisteredOrGone) {
    ASSERT_EQ(::prctl(PR_SET_CHILD_SUBREAPER, 1), 0);
    std::atomic<pid_t>* slot = sharedPage();
    ASSERT_NE(slot, nullptr);
    int unregistered = 0;
    for (int round = 0; round < 100; ++round) {
        slot->store(0);
        const pid_t parent = ::fork();
        if (parent == 0) {
            ::setpgid(0, 0);
            ChildPlan plan;
            plan.program = "/bin/sleep";
            plan.arguments = {"sleep", "300"};
            plan.registration = slot;
            (void)startChild(plan);
            ::pause();
        }
        std::this_thread::sleep_for(std::chrono::microseconds(round * 20));
        ::kill(parent, SIGKILL);
        ASSERT_EQ(::waitpid(parent, nullptr, 0), parent);
        const pid_t registered = slot->load();
        if (registered != 0) {
            ::kill(registered, SIGKILL);
        } else {
            ++unregistered;
        }
        ASSERT_TRUE(adoptedChildrenEnd()) << "a child that is not registered runs on";
    }
    RecordProperty("unregistered", unregistered);
    ::prctl(PR_SET_CHILD_SUBREAPER, 0);
    ::munmap(slot, 4096);
}

TEST(StartChild, RightsAreDroppedBeforeTheProgram) {
    ChildPlan plan = shell("grep -E '^(Uid|Gid|Groups):' /proc/self/status");
    // An unprivileged account can only keep its own groups.
    const bool root = ::geteuid() == 0;
    if (root) {
        plan.rights = ChildRights{65534, 65533, {7, 9}};
        EXPECT_EQ(run(plan).output,
                  "Uid:\t65534\t65534\t65534\t65534\nGid:\t65533\t65533\t65533\t65533\nGroups:\t7 9 \n");
        EXPECT_EQ(::geteuid(), 0U);
        EXPECT_EQ(::prctl(PR_GET_DUMPABLE), 1) << "the account of a child must not be visible in its parent";
    } else {
        plan.rights = ChildRights{0, 0, {}};
        const auto child = startChild(plan);
        ASSERT_FALSE(child);
        EXPECT_EQ(child.error().code, EPERM);
    }
}

}  // namespace
