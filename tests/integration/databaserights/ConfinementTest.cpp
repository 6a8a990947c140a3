// Valgrind does not know Landlock, so these are not among the unit tests.

#include "platform/task/Confinement.h"
#include "platform/task/ProgramLoader.h"
#include "platform/task/TaskGroup.h"

#include <array>
#include <cerrno>
#include <cstddef>
#include <filesystem>
#include <fstream>
#include <string>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;
using Access = Confinement::Access;

/// A shell that may read and execute what it needs itself.
class Confined : public testing::Test {
  protected:
    void SetUp() override {
        ASSERT_TRUE(Confinement::isAvailable()) << "this test needs a kernel with Landlock (lsm=landlock,...)";
        std::string pattern = (fs::temp_directory_path() / "confined-XXXXXX").string();
        ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
        directory = pattern;
        for (const char* name : {"/open", "/closed"}) {
            fs::create_directory(directory + name);
            std::ofstream(directory + name + "/file") << "text\n";
        }
        auto created = Confinement::create();
        ASSERT_TRUE(created);
        confinement = std::make_shared<Confinement>(*std::move(created));
        for (const char* path : {"/usr/lib", "/lib", "/lib64", "/etc/ld.so.cache", "/dev/null"}) {
            ASSERT_EQ(confinement->allowIfPresent(path, Access::read), 0) << path;
        }
        for (const std::string& program : {std::string("/bin/sh"), loaderOf(DiskPath("/bin/sh")).value_or("")}) {
            ASSERT_EQ(confinement->allowIfPresent(program, Access::execute), 0) << program;
        }
    }
    void TearDown() override {
        if (!directory.empty()) {
            fs::remove_all(directory);
        }
    }

    /// Runs the script in the directory and returns its status and output.
    [[nodiscard]] std::string run(const std::string& script) const {
        TaskGroup group;
        const auto result = group.collect(group.start({.tool = DiskPath("/bin/sh"),
                                                       .arguments = {"-c", "cd '" + directory + "'\n" + script},
                                                       .noNewPrivileges = true,
                                                       .confinement = confinement}));
        return std::to_string(result.status) + ' ' + result.output;
    }

    std::string directory;
    std::shared_ptr<Confinement> confinement;
};

TEST_F(Confined, ChildUsesWhatIsAllowedAndNothingElse) {
    ASSERT_EQ(confinement->allowIfPresent(directory + "/open", Access::write), 0);
    EXPECT_EQ(run("read line < open/file && echo \"$line\""), "0 text\n");
    EXPECT_EQ(run("echo new > open/new && read line < open/new && echo \"$line\""), "0 new\n");
    EXPECT_EQ(run("echo longer > open/file && echo x >> open/file && echo done"), "0 done\n")
        << "truncates and appends";
    EXPECT_EQ(run("read line < closed/file || echo refused"), "0 refused\n");
    EXPECT_EQ(run("(echo x >> closed/file) || echo refused"), "0 refused\n");
    EXPECT_EQ(run("(echo x > closed/new) || echo refused"), "0 refused\n");
    EXPECT_EQ(run("/bin/true || echo refused"), "0 refused\n") << "another program";
    EXPECT_EQ(run("set -- /* && echo $#"), "0 1\n") << "a directory cannot be listed";
    EXPECT_EQ(std::ifstream(directory + "/closed/file").get(), 't');
    EXPECT_FALSE(fs::exists(directory + "/closed/new"));
}

TEST_F(Confined, FileThatMayOnlyBeReadCannotBeWrittenTruncatedOrRemoved) {
    ASSERT_EQ(confinement->allowIfPresent(directory + "/open", Access::read), 0);
    for (const char* program : {"/bin/rm", "/usr/bin/truncate"}) {
        ASSERT_EQ(confinement->allowIfPresent(program, Access::execute), 0);
    }
    EXPECT_EQ(run("read line < open/file && echo \"$line\""), "0 text\n");
    EXPECT_EQ(run("(echo x > open/file) || echo refused"), "0 refused\n");
    EXPECT_EQ(run("truncate -s 0 open/file || echo refused"), "0 refused\n");
    EXPECT_EQ(run("rm -f open/file || echo refused"), "0 refused\n");
    EXPECT_EQ(fs::file_size(directory + "/open/file"), 5U);
}

TEST_F(Confined, WritingADirectoryCreatesNoDirectoryLinkOrPipe) {
    ASSERT_EQ(confinement->allowIfPresent(directory + "/open", Access::write), 0);
    for (const char* program : {"/bin/mkdir", "/bin/ln", "/usr/bin/mkfifo", "/bin/rm", "/bin/mv"}) {
        ASSERT_EQ(confinement->allowIfPresent(program, Access::execute), 0);
    }
    EXPECT_EQ(run("mkdir open/directory || echo refused"), "0 refused\n");
    EXPECT_EQ(run("ln -s file open/link || echo refused"), "0 refused\n");
    EXPECT_EQ(run("mkfifo open/pipe || echo refused"), "0 refused\n");
    EXPECT_EQ(run("mv open/file closed/moved || echo refused"), "0 refused\n");
    EXPECT_EQ(run("rm -f open/file && echo removed"), "0 removed\n");
}

TEST_F(Confined, ProgramThatIsNotAllowedIsNotStarted) {
    TaskGroup group;
    const auto result = group.collect(group.start(
        {.tool = DiskPath("/bin/true"), .arguments = {}, .noNewPrivileges = true, .confinement = confinement}));
    EXPECT_EQ(result.status, -1);
    EXPECT_EQ(result.error, "/bin/true: Permission denied");
}

TEST_F(Confined, ChildGetsNoNewPrivilegesAndNotTheDescriptorOfItsConfinement) {
    ASSERT_EQ(confinement->allowIfPresent("/proc", Access::read), 0);
    for (const char* program : {"/bin/grep", "/bin/ls"}) {
        ASSERT_EQ(confinement->allowIfPresent(program, Access::execute), 0);
    }
    EXPECT_EQ(run("grep NoNewPrivs /proc/self/status"), "0 NoNewPrivs:\t1\n");
    EXPECT_EQ(run("ls /proc/self/fd"), "0 0\n1\n2\n3\n") << "3 is the listing's own";
}

TEST_F(Confined, ConfinementWithALowDescriptorIsMovedOutOfTheWay) {
    // Numbers below those of the child's own descriptors would be overwritten by them.
    const int low = ::fcntl(confinement->descriptor(), F_DUPFD_CLOEXEC, 0);
    ChildPlan plan;
    plan.program = "/bin/sh";
    plan.arguments = {"sh", "-c", "read line < " + directory + "/closed/file; exit $?"};
    plan.descriptors.assign(static_cast<std::size_t>(low) + 1, -1);
    plan.noNewPrivileges = true;
    plan.confinement = low;
    const auto child = startChild(plan);
    ::close(low);
    ASSERT_TRUE(child) << child.error().description.value_or("");
    int status = 0;
    ASSERT_EQ(::waitpid(child->pid, &status, 0), child->pid);
    EXPECT_NE(WEXITSTATUS(status), 0) << "the child is confined";
}

TEST_F(Confined, PathThatDoesNotExistIsAllowedWithoutEffectAndOneThatCannotBeOpenedIsNot) {
    EXPECT_EQ(confinement->allowIfPresent(directory + "/missing", Access::read), 0);
    EXPECT_EQ(confinement->allowIfPresent(directory + "/open/file/below", Access::read), 0);
    EXPECT_EQ(confinement->allowIfPresent(std::string(5000, 'x'), Access::read), ENAMETOOLONG);
    EXPECT_NE(confinement->allow(-1, Access::read), 0);
}

/// Makes a call of the kernel fail as in a kernel without it, for the rest of this process.
bool removeCall(unsigned number, unsigned error) {
    std::array filter{sock_filter{BPF_LD | BPF_W | BPF_ABS, 0, 0, offsetof(seccomp_data, nr)},
                      sock_filter{BPF_JMP | BPF_JEQ | BPF_K, 0, 1, number},
                      sock_filter{BPF_RET | BPF_K, 0, 0, SECCOMP_RET_ERRNO | error},
                      sock_filter{BPF_RET | BPF_K, 0, 0, SECCOMP_RET_ALLOW}};
    sock_fprog program{static_cast<unsigned short>(filter.size()), filter.data()};
    return ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 && ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
}

TEST(ConfinementOf, KernelWithoutLandlockIsNotAvailable) {
    for (const unsigned error : {ENOSYS, EOPNOTSUPP}) {
        const pid_t child = ::fork();
        if (child == 0) {
            const bool removed = removeCall(SYS_landlock_create_ruleset, error);
            const auto created = Confinement::create();
            ::_exit(!removed ? 2
                    : !Confinement::isAvailable() && !created &&
                            created.error().code == static_cast<std::int32_t>(error)
                        ? 0
                        : 1);
        }
        int status = 0;
        ASSERT_EQ(::waitpid(child, &status, 0), child);
        EXPECT_EQ(WEXITSTATUS(status), 0) << error;
    }
}

}  // namespace
}  // namespace adminhost
