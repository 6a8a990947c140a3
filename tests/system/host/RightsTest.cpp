// The rights of monitor, front, worker and tools: what the kernel shows of the running processes, and what a front that
// was taken over by a client could do.

#include "adminhostd/FrontRights.h"
#include "adminhostd/ListeningSocket.h"
#include "platform/files/FileDescriptor.h"
#include "tests/support/OwnMounts.h"
#include "tests/support/Program.h"
#include "tests/support/TemporaryRoot.h"
#include "tests/system/host/Host.h"

#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iostream>
#include <iterator>
#include <map>
#include <optional>
#include <sstream>
#include <stdexcept>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <pwd.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/ptrace.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::Not;

constexpr const char* otherAccount = "nobody";
constexpr const char* ofOtherAccount = "account = \"nobody\"\n";

#ifdef ADMINHOST_SANITIZED
constexpr bool sanitized = true;  // the search for leaks starts a thread
#else
constexpr bool sanitized = false;
#endif

using Status = std::map<std::string, std::string>;

/// The lines of /proc/PID/status, blanks replaced by single ones.
Status statusIn(std::istream&& lines) {
    Status status;
    for (std::string line; std::getline(lines, line);) {
        const std::size_t colon = line.find(':');
        std::istringstream words(line.substr(std::min(line.size(), colon + 1)));
        std::string value;
        for (std::string word; words >> word;) {
            value += (value.empty() ? "" : " ") + word;
        }
        status[line.substr(0, colon)] = value;
    }
    return status;
}

Status statusOf(pid_t pid) {
    return statusIn(std::ifstream("/proc/" + std::to_string(pid) + "/status"));
}

constexpr const char* shownLines[] = {"Uid", "Gid", "Groups", "CapEff", "CapBnd", "NoNewPrivs", "Seccomp"};

void print(const char* process, const Status& status) {
    std::cout << process << ':';
    for (const char* line : shownLines) {
        const auto found = status.find(line);
        std::cout << "  " << line << ' ' << (found == status.end() ? "?" : found->second);
    }
    std::cout << '\n';
}

std::string four(unsigned id) {
    std::string text = std::to_string(id);
    return text + ' ' + text + ' ' + text + ' ' + text;
}

/// The start of this account's range in /etc/subuid or /etc/subgid; nullopt if there is none.
std::optional<std::string> subordinateRange(const char* file) {
    const passwd* const account = ::getpwuid(::getuid());
    const std::string name = account == nullptr ? "" : account->pw_name;
    std::ifstream lines(file);
    for (std::string line; std::getline(lines, line);) {
        const std::size_t first = line.find(':');
        const std::size_t second = line.find(':', first + 1);
        if (second != std::string::npos &&
            (line.substr(0, first) == name || line.substr(0, first) == std::to_string(::getuid())) &&
            std::stoul(line.substr(second + 1)) >= 65535) {
            return line.substr(first + 1, second - first - 1);
        }
    }
    return std::nullopt;
}

/// Maps 65536 ids into the user namespace of the process, 0 to this account. Returns what is missing; empty on success.
std::string mapIds(pid_t pid) {
    const std::string place = "/proc/" + std::to_string(pid);
    if (::geteuid() == 0) {
        for (const char* map : {"/uid_map", "/gid_map"}) {
            std::ofstream file(place + map);
            file << "0 0 65536\n";
            if (!file.flush()) {
                return place + map + ": " + std::strerror(errno) + "; root needs CAP_SETUID and CAP_SETGID";
            }
        }
        return {};
    }
    for (const auto& [program, file, id] :
         {std::tuple("newuidmap", "/etc/subuid", ::getuid()), {"newgidmap", "/etc/subgid", ::getgid()}}) {
        const auto start = subordinateRange(file);
        if (!start) {
            return std::string("no range of 65535 ids for this account in ") + file +
                   "; add one (usermod --add-subuids 100000-165535 --add-subgids 100000-165535 NAME)";
        }
        const ProgramResult result = runProgram(
            {program, std::to_string(pid), "0", std::to_string(id), "1", "1", *start, "65535"}, Errors::merge);
        if (result.status != 0) {
            return std::string(program) + ": " + result.output + "; install uidmap";
        }
    }
    return {};
}

/// Runs tests of this program again as the superuser of a user namespace with a mapped range.
void runInUserNamespace(const std::string& filter) {
    std::array<int, 2> ready{};
    std::array<int, 2> mapped{};
    ASSERT_EQ(::pipe2(ready.data(), O_CLOEXEC) | ::pipe2(mapped.data(), O_CLOEXEC), 0);
    const pid_t child = ::fork();
    if (child == 0) {
        const char answer = ::unshare(CLONE_NEWUSER) == 0 ? 'y' : 'n';
        char go = 0;
        if (::write(ready[1], &answer, 1) != 1 || ::read(mapped[0], &go, 1) != 1 || go != 'y' ||
            ::setresgid(0, 0, 0) != 0 || ::setresuid(0, 0, 0) != 0) {
            ::_exit(126);
        }
        const std::string argument = "--gtest_filter=" + filter;
        ::execl("/proc/self/exe", "system_host", argument.c_str(), "--gtest_brief=1", nullptr);
        ::_exit(127);
    }
    char answer = 0;
    EXPECT_EQ(::read(ready[0], &answer, 1), 1);
    const std::string problem =
        answer == 'y' ? mapIds(child)
                      : "a user namespace cannot be created; allow it (sysctl kernel.unprivileged_userns_clone=1 and "
                        "kernel.apparmor_restrict_unprivileged_userns=0, in a container --security-opt "
                        "seccomp=unconfined)";
    EXPECT_EQ(problem, "");
    EXPECT_EQ(::write(mapped[1], problem.empty() ? "y" : "n", 1), 1);
    int status = -1;
    EXPECT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0) << "the tests in the namespace failed";
    for (const int descriptor : {ready[0], ready[1], mapped[0], mapped[1]}) {
        ::close(descriptor);
    }
}

/// The tests of accounts run as the superuser: of the machine, or of a user namespace.
class AccountRights : public ::testing::Test {
  protected:
    /// Returns true if the test can run here; otherwise it has run in a namespace.
    static bool isSuperuser() {
        if (::geteuid() == 0) {
            return true;
        }
        const auto* const test = ::testing::UnitTest::GetInstance()->current_test_info();
        runInUserNamespace(std::string(test->test_suite_name()) + '.' + test->name());
        return false;
    }
};

TEST_F(AccountRights, FrontHasAnAccountOfItsOwnAndNoRightAndTheOthersHaveTheDaemons) {
    if (!isSuperuser()) {
        return;
    }
    const DaemonProcess daemon(withFixture(ofOtherAccount));
    const passwd* const account = ::getpwnam(otherAccount);
    ASSERT_NE(account, nullptr);
    const Status monitor = statusOf(daemon.pid());
    Status front = statusOf(daemon.frontPid());
    const Status worker = statusOf(daemon.workerPid());
    const Dictionary answer =
        dictionaryOf(daemon.connect().post("/v1/fixture/run", R"({"script": "cat /proc/self/status"})"));
    const Status tool = statusIn(std::istringstream(std::string(answer.text("output"))));
    print("monitor", monitor);
    print("front", front);
    print("worker", worker);
    print("tool", tool);

    EXPECT_EQ(front["Uid"], four(account->pw_uid));
    EXPECT_EQ(front["Gid"], four(account->pw_gid));
    EXPECT_EQ(front["Groups"], "");
    for (const char* set : {"CapInh", "CapPrm", "CapEff", "CapBnd", "CapAmb"}) {
        EXPECT_EQ(front[set], "0000000000000000") << set;
    }
    EXPECT_EQ(front["NoNewPrivs"], "1");
    EXPECT_EQ(front["Seccomp"], "2");

    const Status own = statusOf(::getpid());
    for (const Status& status : {monitor, worker, tool}) {
        for (const char* line : {"Uid", "Gid", "Groups", "CapEff", "CapBnd", "NoNewPrivs", "Seccomp"}) {
            EXPECT_EQ(status.at(line), own.at(line)) << status.at("Name") << ' ' << line;
        }
    }
}

TEST_F(AccountRights, FrontThatIsStartedAgainHasItsAccountToo) {
    if (!isSuperuser()) {
        return;
    }
    const DaemonProcess daemon(withFixture(ofOtherAccount));
    const pid_t first = daemon.frontPid();
    ::kill(first, SIGKILL);
    ASSERT_EQ(daemon.connect().get("/v1/").status, 200);
    EXPECT_NE(daemon.frontPid(), first);
    EXPECT_EQ(statusOf(daemon.frontPid())["Uid"], four(::getpwnam(otherAccount)->pw_uid));
}

TEST_F(AccountRights, DaemonWithAnAccountForItsFrontServesWhatItServesWithout) {
    if (!isSuperuser()) {
        return;
    }
    DaemonProcess daemon(withFixture(ofOtherAccount));
    EXPECT_EQ(daemon.connect().post("/v1/fixture/runWrite", R"({"script": "exit 0"})").status, 200);
    const HttpReply doctor = daemon.connect().get("/v1/doctor");
    EXPECT_EQ(doctor.status, 200);
    const uid_t uid = ::getpwnam(otherAccount)->pw_uid;
    EXPECT_THAT(doctor.body, HasSubstr("as root, its front as uid " + std::to_string(uid)));
    EXPECT_THAT(doctor.body, HasSubstr("The front's account (uid " + std::to_string(uid) + ") cannot read it"));
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.wait(), 0);
}

/// A temporary directory that every account can reach, for this process and as long as the object exists: TMPDIR is
/// often closed to others.
class OpenTemporaryDirectory {
  public:
    OpenTemporaryDirectory() : _former(fs::temp_directory_path()) {
        if (::unshare(CLONE_NEWNS) != 0 || ::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0) {
            throw std::runtime_error(std::string("a mount namespace cannot be created; in a container, allow it with "
                                                 "its option for unshare and mount: ") +
                                     std::strerror(errno));
        }
        _mount.emplace("/media", "mode=1777");
        ::setenv("TMPDIR", "/media", 1);
    }
    OpenTemporaryDirectory(const OpenTemporaryDirectory&) = delete;
    OpenTemporaryDirectory& operator=(const OpenTemporaryDirectory&) = delete;
    ~OpenTemporaryDirectory() { ::setenv("TMPDIR", _former.c_str(), 1); }

  private:
    fs::path _former;
    std::optional<Mount> _mount;
};

TEST_F(AccountRights, DirectoryOfTheFrontsAccountIsAFailureOfTheDoctor) {
    if (!isSuperuser()) {
        return;
    }
    const OpenTemporaryDirectory open;
    const TemporaryRoot root;
    const passwd* const account = ::getpwnam(otherAccount);
    ASSERT_NE(account, nullptr);
    fs::permissions(root.path("/"), fs::perms(0755));
    root.write("/var/lib/adminhostd/file", "");
    ASSERT_EQ(::chown(root.path("/var/lib/adminhostd").c_str(), account->pw_uid, account->pw_gid), 0);
    auto options = withFixture(ofOtherAccount);
    options.arguments.insert(options.arguments.end(), {"--root", root.path("/")});
    const DaemonProcess daemon(options);
    EXPECT_THAT(daemon.connect().get("/v1/doctor").body,
                HasSubstr("belongs to uid " + std::to_string(account->pw_uid) + R"(.","fix":"chown it to root")"));
}

TEST_F(AccountRights, SocketThatTheFrontCannotReachIsNotCalledRemoved) {
    if (!isSuperuser()) {
        return;
    }
    const DaemonProcess daemon(withFixture(ofOtherAccount));
    fs::permissions(daemon.directory(), fs::perms::owner_all);
    const std::string doctor = daemon.connect().get("/v1/doctor").body;
    EXPECT_THAT(doctor, HasSubstr(daemon.socket() + ": Permission denied."));
    EXPECT_THAT(doctor, Not(HasSubstr("has been removed")));
}

TEST_F(AccountRights, FrontThatCannotReadTheFileGetsTheConfigurationAtAReload) {
    if (!isSuperuser()) {
        return;
    }
    const DaemonProcess daemon(withFixture(ofOtherAccount));
    const fs::path file = daemon.directory() / "config";
    std::ofstream(file) << ofOtherAccount << "request_deadline_seconds = 30\nlanguages = [\"fr\"]\n";
    fs::permissions(file, fs::perms(0600));
    daemon.signal(SIGHUP);
    ASSERT_TRUE(daemon.waitForLog("the configuration has been read again")) << daemon.log();
    EXPECT_EQ(dictionaryOf(daemon.connect().get("/v1/")).get("deadlineSeconds").real(), 30.0);
    EXPECT_EQ(daemon.connect().post("/v1/fixture/languages", "{}").body, "{\"languages\":[\"fr\"]}\n");
    EXPECT_THAT(daemon.connect().get("/v1/doctor").body, HasSubstr("as root, its front as uid"));
    const pid_t front = daemon.frontPid();
    ::kill(front, SIGKILL);
    EXPECT_TRUE(eventually([&] { return daemon.frontPid() > 0 && daemon.frontPid() != front; }));
    EXPECT_EQ(dictionaryOf(daemon.connect().get("/v1/")).get("deadlineSeconds").real(), 30.0) << daemon.log();
    EXPECT_EQ(statusOf(daemon.frontPid())["Uid"], four(::getpwnam(otherAccount)->pw_uid));
}

TEST_F(AccountRights, AccountThatIsMissingOrTheSuperusersIsAnErrorAtTheStart) {
    if (!isSuperuser()) {
        return;
    }
    for (const auto& [name, expected] :
         {std::pair("no-such-account", "the account \"no-such-account\" does not exist; create it"),
          {"root", "the account \"root\" is the superuser's or in its group; name another account"}}) {
        auto options = withFixture(std::string("account = \"") + name + "\"\n");
        options.waitUntilReady = false;
        DaemonProcess daemon(options);
        EXPECT_EQ(daemon.wait(), 1);
        EXPECT_THAT(daemon.log(), HasSubstr(expected));
    }
}

/// The message with which a daemon of the other account fails to create its socket; empty if it does not fail.
std::string socketProblemOfOther(const std::string& path) {
    std::array<int, 2> ends{};
    EXPECT_EQ(::pipe2(ends.data(), O_CLOEXEC), 0);
    const passwd* const account = ::getpwnam(otherAccount);
    const pid_t child = ::fork();
    if (child == 0) {
        std::string problem;
        try {
            if (::setresgid(account->pw_gid, account->pw_gid, account->pw_gid) != 0 ||
                ::setresuid(account->pw_uid, account->pw_uid, account->pw_uid) != 0) {
                throw std::runtime_error("the account cannot be changed");
            }
            const ListeningSocket socket(path, ListeningSocket::sameGroup);
        } catch (const std::exception& error) {
            problem = error.what();
        }
        ::_exit(::write(ends[1], problem.data(), problem.size()) == static_cast<ssize_t>(problem.size()) ? 0 : 1);
    }
    ::close(ends[1]);
    std::string problem(4096, '\0');
    const ssize_t count = ::read(ends[0], problem.data(), problem.size());
    problem.resize(count < 0 ? 0 : static_cast<std::size_t>(count));
    ::close(ends[0]);
    int status = -1;
    EXPECT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    return problem;
}

TEST_F(AccountRights, SocketOfAnotherAccountIsNeverReplacedAndTheMessageHasAFix) {
    if (!isSuperuser()) {
        return;
    }
    const OpenTemporaryDirectory open;
    const TemporaryRoot root;
    fs::permissions(root.path("/"), fs::perms(0755));
    const std::string path = root.path("/open/socket");
    fs::create_directory(root.path("/open"));
    fs::permissions(root.path("/open"), fs::perms(01777));
    {
        const ListeningSocket live(path, ListeningSocket::sameGroup);
        fs::create_hard_link(path, path + ".stale");
        fs::permissions(path, fs::perms(0600));
        EXPECT_EQ(socketProblemOfOther(path),
                  "cannot find out whether a daemon serves " + path +
                      ", which belongs to uid 0: Permission denied; stop that daemon and remove the socket, or choose "
                      "another path");
        fs::permissions(path, fs::perms(0666));
        EXPECT_EQ(socketProblemOfOther(path), "another daemon serves " + path + "; stop it or choose another path");
    }
    fs::rename(path + ".stale", path);
    EXPECT_EQ(socketProblemOfOther(path), "cannot replace the socket " + path +
                                              ", which belongs to uid 0: Operation not permitted; remove it, or choose "
                                              "another path");
    EXPECT_TRUE(fs::is_socket(path));
    fs::remove(path);
    EXPECT_EQ(socketProblemOfOther(path), "");
}

TEST(UserNamespace, WithAMappedRangeHasTheSameRights) {
    runInUserNamespace("AccountRights.*");
}

TEST(FrontRights, OfADaemonWithOneAccountAreGivenUpToo) {
    const DaemonProcess daemon(withFixture());
    Status front = statusOf(daemon.frontPid());
    print("front", front);
    EXPECT_EQ(front["Uid"], four(::geteuid()));
    EXPECT_EQ(front["CapEff"], "0000000000000000");
    EXPECT_EQ(front["CapPrm"], "0000000000000000");
    if (::geteuid() == 0) {
        EXPECT_EQ(front["CapBnd"], "0000000000000000");
    }
    EXPECT_EQ(front["NoNewPrivs"], "1");
    EXPECT_EQ(front["Seccomp"], "2");
}

// What code that runs in the front can do.

/// Runs the attempt in a process with the front's rights, and returns the error number that it ended with: 0 if the
/// attempt succeeded.
int attemptAsFront(const std::function<bool()>& attempt, bool ofOther = ::geteuid() == 0) {
    const pid_t child = ::fork();
    if (child == 0) {
        Options options;
        options.account = otherAccount;
        try {
            dropFrontRights(ofOther ? frontAccount(options) : std::nullopt, options);
            errno = 0;
            ::_exit(attempt() ? 0 : errno);
        } catch (const std::exception& error) {
            std::cerr << error.what() << '\n';
        }
        ::_exit(255);
    }
    int status = -1;
    EXPECT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_TRUE(WIFEXITED(status));
    return WEXITSTATUS(status);
}

bool opens(const std::string& path, int flags) {
    return ::open(path.c_str(), flags | O_CLOEXEC, 0600) >= 0;
}

TEST_F(AccountRights, CodeInTheFrontCannotReadWhatIsForRootOrInspectAndSignalTheOthers) {
    if (!isSuperuser()) {
        return;
    }
    const DaemonProcess daemon(withFixture(ofOtherAccount));
    const pid_t worker = daemon.workerPid();
    EXPECT_EQ(attemptAsFront([] { return opens("/etc/shadow", O_RDONLY); }), EACCES);
    EXPECT_EQ(attemptAsFront([] { return ::setresuid(0, 0, 0) == 0; }), EPERM);
    EXPECT_EQ(attemptAsFront([&] { return opens("/proc/" + std::to_string(daemon.pid()) + "/mem", O_RDONLY); }),
              EACCES);
    EXPECT_NE(attemptAsFront([&] { return ::kill(worker, SIGKILL) == 0; }), 0);
    EXPECT_EQ(attemptAsFront([] { return ::mount("none", "/tmp", "tmpfs", 0, nullptr) == 0; }), EPERM);
}

TEST(FrontRights, CodeInTheFrontCannotStartAProgramOrAProcess) {
    EXPECT_EQ(attemptAsFront([] {
                  const char* const arguments[] = {"true", nullptr};
                  return ::execve("/bin/true", const_cast<char* const*>(arguments), nullptr) == 0;
              }),
              EPERM);
    EXPECT_EQ(attemptAsFront([] { return ::syscall(SYS_execveat, AT_FDCWD, "/bin/true", nullptr, nullptr, 0) == 0; }),
              EPERM);
    if (!sanitized) {
        EXPECT_EQ(attemptAsFront([] { return ::fork() >= 0; }), EPERM);
        EXPECT_EQ(attemptAsFront([] { return ::ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) == 0; }), EPERM);
    }
}

TEST(FrontRights, CodeInTheFrontCanSignalAndLimitNoOtherProcessOfItsAccount) {
    const pid_t other = ::getpid();  // of the attempts
    EXPECT_EQ(attemptAsFront([&] { return ::syscall(SYS_tgkill, other, other, 0) == 0; }, false), EPERM);
    constexpr int absent = 1 << 30;  // the kernel would return ESRCH
    EXPECT_EQ(attemptAsFront([] { return ::syscall(SYS_tgkill, absent, absent, 0) == 0; }, false), EPERM);
    EXPECT_EQ(attemptAsFront([] { return ::syscall(SYS_tgkill, ::getpid(), ::getpid(), 0) == 0; }, false), 0)
        << "abort() needs it";
    EXPECT_EQ(attemptAsFront(
                  [&] {
                      std::array<int, 2> ends{};
                      return ::socketpair(AF_UNIX, SOCK_STREAM, 0, ends.data()) == 0 &&
                             ::fcntl(ends[0], F_SETOWN, other) == 0;  // and O_ASYNC would signal it
                  },
                  false),
              EPERM);
    EXPECT_EQ(attemptAsFront(
                  [&] {
                      rlimit bound{};
                      return ::prlimit(other, RLIMIT_NOFILE, nullptr, &bound) == 0;
                  },
                  false),
              EPERM);
    EXPECT_EQ(attemptAsFront(
                  [] {
                      rlimit bound{};
                      return ::getrlimit(RLIMIT_NOFILE, &bound) == 0;
                  },
                  false),
              0);
}

TEST(FrontRights, CodeInTheFrontCannotWriteFilesOrReadThoseOfOtherPlaces) {
    const TemporaryRoot root;
    root.write("/file", "content");
    const std::string file = root.path("/file");
    EXPECT_EQ(attemptAsFront([&] { return opens(file, O_RDONLY); }), EACCES) << "by Landlock";
    EXPECT_EQ(attemptAsFront([&] { return opens(file, O_WRONLY); }), EPERM);
    EXPECT_EQ(attemptAsFront([&] { return opens(file, O_RDWR); }), EPERM);
    EXPECT_EQ(attemptAsFront([&] { return opens(file, O_RDONLY | O_TRUNC); }), EPERM);
    EXPECT_EQ(attemptAsFront([&] { return opens(file + ".new", O_RDONLY | O_CREAT); }), EPERM);
    EXPECT_EQ(attemptAsFront([&] { return ::unlink(file.c_str()) == 0; }), EPERM);
    EXPECT_EQ(attemptAsFront([&] { return ::chmod(file.c_str(), 0777) == 0; }), EPERM);
    EXPECT_EQ(attemptAsFront([] { return opens("/etc/passwd", O_RDONLY); }), 0) << "names of accounts can be read";
}

TEST(FrontRights, CodeInTheFrontCanOpenUnixSocketsOnlyAndNoExecutableMemory) {
    for (const int family : {AF_INET, AF_INET6, AF_NETLINK, AF_PACKET, AF_VSOCK}) {
        EXPECT_EQ(attemptAsFront([&] { return ::socket(family, SOCK_STREAM, 0) >= 0; }), EPERM) << family;
    }
    EXPECT_EQ(attemptAsFront([] { return ::socket(AF_UNIX, SOCK_DGRAM, 0) >= 0; }), 0) << "the log";
    EXPECT_EQ(attemptAsFront([] {
                  return ::mmap(nullptr, 4096, PROT_READ | PROT_WRITE | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1,
                                0) != MAP_FAILED;
              }),
              EPERM);
    EXPECT_EQ(attemptAsFront([] { return ::memfd_create("code", 0) >= 0; }), EPERM);
    const FileDescriptor passed(::memfd_create("code", MFD_CLOEXEC));  // as another process could send it
    ASSERT_EQ(::ftruncate(passed.get(), 4096), 0);
    EXPECT_EQ(attemptAsFront([&] { return ::ftruncate(passed.get(), 8192) == 0; }), EPERM);
    for (const int shared : {MAP_SHARED, MAP_SHARED_VALIDATE}) {
        EXPECT_EQ(attemptAsFront([&] {
                      return ::mmap(nullptr, 4096, PROT_READ | PROT_EXEC, shared, passed.get(), 0) != MAP_FAILED;
                  }),
                  EPERM)
            << "the front's own bytes";
    }
    EXPECT_EQ(attemptAsFront([] {
                  return ::mmap(nullptr, 4096, PROT_READ | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0) != MAP_FAILED;
              }),
              EPERM);
    if (!sanitized) {
        EXPECT_EQ(attemptAsFront([] {
                      void* const page =
                          ::mmap(nullptr, 4096, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0);
                      return ::mprotect(page, 4096, PROT_READ | PROT_EXEC) == 0;
                  }),
                  EPERM);
    }
}

}  // namespace
}  // namespace adminhost::test
