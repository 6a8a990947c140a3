// How the daemon starts: its socket, its plug-ins and its processes.

#include "adminhostd/PluginFile.h"
#include "tests/support/TemporaryRoot.h"
#include "tests/system/host/StartFixture.h"

#include <csignal>
#include <cstdint>
#include <fstream>
#include <iterator>

#include <fcntl.h>
#include <grp.h>
#include <linux/capability.h>
#include <sys/file.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

/// A set of signals of a process, by its name in /proc.
std::uint64_t signalsOf(pid_t pid, const std::string& name) {
    std::ifstream file("/proc/" + std::to_string(pid) + "/status");
    for (std::string word; file >> word;) {
        if (word == name + ":") {
            std::uint64_t signals = ~std::uint64_t{0};
            file >> std::hex >> signals;
            return signals;
        }
    }
    return ~std::uint64_t{0};
}

constexpr std::uint64_t bitOf(int signal) {
    return std::uint64_t{1} << static_cast<unsigned>(signal - 1);
}

TEST_F(Start, SocketIsForOwnerAndGroupOnly) {
    DaemonProcess daemon(withFixture());
    struct stat status {};
    ASSERT_EQ(::stat(daemon.socket().c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0660U);
    EXPECT_EQ(status.st_uid, ::geteuid());
    for (const auto& entry : fs::directory_iterator(daemon.directory())) {
        EXPECT_FALSE(fs::exists(entry.path() / "socket")) << "the private directory is gone";
    }
}

TEST_F(Start, SocketGetsTheConfiguredGroup) {
    gid_t groups[256];
    const int count = ::getgroups(256, groups);
    // Root may set any group, an unprivileged account one of its own.
    const gid_t wanted = ::geteuid() == 0 ? 65534 : count > 0 ? groups[count - 1] : ::getegid();
    const group* entry = ::getgrgid(wanted);
    ASSERT_NE(entry, nullptr);
    DaemonProcess daemon(withFixture("socket_group = \"" + std::string(entry->gr_name) + "\"\n"));
    struct stat status {};
    ASSERT_EQ(::stat(daemon.socket().c_str(), &status), 0);
    EXPECT_EQ(status.st_gid, wanted);
    EXPECT_EQ(status.st_mode & 07777U, 0660U);
}

TEST_F(Start, DefaultSocketIsBelowTheRoot) {
    const fs::path etc = directory / "etc";
    fs::create_directories(etc);
    std::ofstream(etc / "adminhostd.toml") << "queue_limit = 3\n";
    const ProgramResult result = run({"--root", directory, "--check", "--plugin", pluginFile("fixture_good")});
    EXPECT_NE(result.output.find("Socket: " + (directory / "run/adminhostd/adminhostd.sock").string()),
              std::string::npos)
        << result.output;
    EXPECT_TRUE(fs::is_directory(directory / "run/adminhostd"));
    std::ofstream(etc / "adminhostd.toml") << "no such\n";
    EXPECT_NE(run({"--root", directory, "--check"}).output.find("etc/adminhostd.toml, line 1"), std::string::npos);
}

TEST_F(Start, RelativeRootAndPluginAreBelowTheDirectoryThatItIsStartedIn) {
    fs::create_directories(directory / "root");
    fs::copy_file(pluginFile("fixture_good"), directory / "good.so");
    const std::string command = "cd '" + directory.string() + "' && exec '" + BINARY_DIR +
                                "/bin/adminhostd' --check --root root --plugin good.so --socket socket";
    const ProgramResult result = runProgram({"/bin/sh", "-c", command}, Errors::merge);
    EXPECT_EQ(result.output, "Nothing is wrong. Plug-ins: fixture 1.2.3. Socket: socket\n");
    EXPECT_EQ(result.status, 0);
}

TEST_F(Start, WorkerAndSoItsToolsRunInTheRootDirectory) {
    const DaemonProcess daemon(withFixture());
    const Dictionary answer = dictionaryOf(daemon.connect().post("/v1/fixture/run", R"({"script": "pwd -P"})"));
    EXPECT_EQ(answer.get("output"), Value("/\n"));
}

TEST_F(Start, WhatOperationsPrintGoesToStandardOutputWhenTheLogDoesNot) {
    const std::string socket = directory / "socket";
    const std::string output = directory / "output";
    const std::string plugin = pluginFile("fixture_good");
    const std::string program = std::string(BINARY_DIR) + "/bin/adminhostd";
    const pid_t pid = ::fork();
    if (pid == 0) {
        ::dup2(::open(output.c_str(), O_WRONLY | O_CREAT, 0600), STDOUT_FILENO);
        ::execl(program.c_str(), program.c_str(), "--root", directory.c_str(), "--socket", socket.c_str(), "--plugin",
                plugin.c_str(), "--log", "syslog", nullptr);
        ::_exit(127);
    }
    ASSERT_GT(pid, 0);
    for (int tries = 0; tries < 1000 && !fs::exists(socket); ++tries) {
        std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    EXPECT_EQ(UnixHttp(socket).post("/v1/fixture/stdout").status, 204);
    ::kill(pid, SIGTERM);
    int status = -1;
    EXPECT_EQ(::waitpid(pid, &status, 0), pid);
    EXPECT_EQ(status, 0);
    std::ifstream file(output);
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), "a line on standard output\n");
}

TEST_F(Start, ClosedStandardDescriptorsAreTheNullDeviceInBothProcesses) {
    const std::string socket = directory / "socket";
    const std::string plugin = pluginFile("fixture_good");
    const std::string program = std::string(BINARY_DIR) + "/bin/adminhostd";
    const pid_t pid = ::fork();
    if (pid == 0) {
        for (int i = 0; i < 3; ++i) {
            ::close(i);
        }
        ::execl(program.c_str(), program.c_str(), "--root", directory.c_str(), "--socket", socket.c_str(), "--plugin",
                plugin.c_str(), "--log", "stderr", nullptr);
        ::_exit(127);
    }
    ASSERT_GT(pid, 0);
    ASSERT_TRUE(eventually([&] { return fs::exists(socket); }));
    UnixHttp client(socket);
    EXPECT_EQ(client.post("/v1/fixture/stdout").status, 204) << "what it prints does not reach the conversation";
    const auto worker = dictionaryOf(client.get("/v1/")).get("workerPid").integer();
    for (const auto process : {std::int64_t{pid}, worker.value_or(std::int64_t{-1})}) {
        for (int i = 0; i < 3 && ::geteuid() == 0; ++i) {  // only root may look at them
            std::error_code problem;
            EXPECT_EQ(fs::read_symlink("/proc/" + std::to_string(process) + "/fd/" + std::to_string(i), problem),
                      "/dev/null")
                << problem.message();
        }
    }
    ::kill(pid, SIGTERM);
    int status = -1;
    EXPECT_EQ(::waitpid(pid, &status, 0), pid);
    EXPECT_EQ(status, 0);
}

TEST_F(Start, StaleSocketIsReplacedAndALiveOneIsAnError) {
    const fs::path path = directory / "socket";
    const int stale = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    path.string().copy(address.sun_path, sizeof address.sun_path - 1);
    ASSERT_EQ(::bind(stale, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    ASSERT_EQ(::listen(stale, 1), 0);
    const ProgramResult live = run({"--socket", path, "--plugin", pluginFile("fixture_good")});
    EXPECT_EQ(live.status, 1);
    EXPECT_NE(live.output.find("another daemon serves"), std::string::npos) << live.output;
    ::close(stale);
    auto options = withFixture();
    options.socket = path;
    DaemonProcess daemon(options);
    EXPECT_EQ(daemon.connect().get("/v1/").status, 200);
}

TEST_F(Start, FileThatIsNotASocketIsNeverReplaced) {
    const fs::path path = directory / "socket";
    std::ofstream(path) << "precious";
    const ProgramResult result = run({"--socket", path, "--plugin", pluginFile("fixture_good")});
    EXPECT_EQ(result.status, 1);
    EXPECT_NE(result.output.find("is not a socket"), std::string::npos) << result.output;
    EXPECT_EQ(fs::file_size(path), 8U);
}

TEST_F(Start, PathThatNoSocketCanHaveIsAClearError) {
    const ProgramResult result =
        run({"--socket", "/tmp/" + std::string(120, 'x'), "--plugin", pluginFile("fixture_good")});
    EXPECT_EQ(result.status, 1);
    EXPECT_NE(result.output.find("choose a shorter one"), std::string::npos) << result.output;
    EXPECT_EQ(run({"--socket", directory / "none" / "socket"}).status, 1);
}

TEST_F(Start, DamagedPluginFilesAreRefusedAtEveryLength) {
    std::ifstream file(pluginFile("fixture_other_build"), std::ios::binary);
    const std::string whole{std::istreambuf_iterator<char>(file), {}};
    const fs::path cut = directory / "cut.so";
    for (const std::size_t length : {0UL, 1UL, 16UL, 63UL, 64UL, 65UL, 120UL, 400UL, 700UL}) {
        std::ofstream(cut, std::ios::binary) << whole.substr(0, length);
        const auto identity = buildIdentityOf(DiskPath(cut));
        ASSERT_FALSE(identity) << length;
        EXPECT_TRUE(identity.error().description->starts_with(cut.string())) << *identity.error().description;
    }
    for (std::size_t at = 0; at < 1024; ++at) {
        std::string damaged = whole;
        damaged[at] = static_cast<char>(damaged[at] ^ 0x41);
        std::ofstream(cut, std::ios::binary) << damaged;
        EXPECT_NE(buildIdentityOf(DiskPath(cut)).value_or(""), ADMINHOST_BUILD_IDENTITY) << at;
    }
    EXPECT_EQ(buildIdentityOf(DiskPath(pluginFile("fixture_good"))).value_or(""), ADMINHOST_BUILD_IDENTITY);
}

TEST_F(Start, PluginDirectoryMustBeTrustworthyAsAWhole) {
    const fs::path plugins = directory / "plugins";
    fs::create_directory(plugins);
    fs::copy_file(pluginFile("fixture_good"), plugins / "good.so");
    std::ofstream(plugins / "notes.txt") << "no plug-in";
    ASSERT_EQ(::chmod((plugins / "good.so").c_str(), 0644), 0);
    ASSERT_EQ(::chmod(plugins.c_str(), 0755), 0);
    const std::string file = configuration("account = \"nobody\"\nplugin_directory = \"" + plugins.string() + "\"\n");
    const std::vector<std::string> command = {"--check", "--config", file, "--socket", directory / "socket"};
    const ProgramResult good = run(command);
    EXPECT_EQ(good.status, 0) << good.output;
    EXPECT_NE(good.output.find("fixture 1.2.3"), std::string::npos) << good.output;

    ASSERT_EQ(::chmod((plugins / "good.so").c_str(), 0664), 0);
    const ProgramResult writable = run(command);
    EXPECT_EQ(writable.status, 1);
    EXPECT_NE(writable.output.find("good.so may be written by group or others; chmod go-w it"), std::string::npos)
        << writable.output;
    ASSERT_EQ(::chmod((plugins / "good.so").c_str(), 0644), 0);
    ASSERT_EQ(::chmod(plugins.c_str(), 0777), 0);
    EXPECT_NE(run(command).output.find("plugins may be written by group or others"), std::string::npos);
    ASSERT_EQ(::chmod(plugins.c_str(), 0755), 0);
    if (::geteuid() == 0) {
        ASSERT_EQ(::chown((plugins / "good.so").c_str(), 65534, 65534), 0);
        EXPECT_NE(run(command).output.find("good.so belongs to uid 65534; chown it to root"), std::string::npos);
    }
    fs::remove(plugins / "good.so");
    EXPECT_NE(run(command).output.find("No plug-in found in"), std::string::npos);
    fs::remove_all(plugins);
    EXPECT_NE(run(command).output.find("No such file or directory"), std::string::npos);
}

TEST_F(Start, PluginThatEverybodyMayWriteIsRefused) {
    const fs::path file = directory / "open.so";
    fs::copy_file(pluginFile("fixture_good"), file);
    ASSERT_EQ(::chmod(file.c_str(), 0646), 0);
    const ProgramResult result =
        run({"--root", directory, "--check", "--plugin", file, "--socket", directory / "socket"});
    EXPECT_EQ(result.status, 1);
    EXPECT_NE(result.output.find("may be written by everybody"), std::string::npos) << result.output;
    expectRefusedForRoot(file, {"--plugin", file, "--socket", directory / "socket"});
}

TEST_F(Start, LockOfAStrangerOnTheSocketsDirectoryDoesNotMatter) {
    const int stranger = ::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    ASSERT_EQ(::flock(stranger, LOCK_EX), 0);
    auto options = withFixture();
    options.socket = directory / "socket";
    {
        DaemonProcess daemon(options);
        EXPECT_EQ(daemon.connect().get("/v1/").status, 200);
        EXPECT_EQ(std::distance(fs::directory_iterator(directory), {}), 2)
            << "the socket and the private directory: no lock is left behind";
        daemon.signal(SIGTERM);
        EXPECT_EQ(daemon.wait(), 0);
    }
    ::close(stranger);
}

TEST_F(Start, LockIsAPrivateFileAndWaitingForItHasABound) {
    const fs::path path = directory / "socket.lock";
    const std::vector<std::string> command = {"--socket", directory / "socket", "--plugin", pluginFile("fixture_good")};
    const int holder = ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    ASSERT_EQ(::flock(holder, LOCK_EX), 0);
    const ProgramResult held = run(command);
    EXPECT_EQ(held.status, 1);
    EXPECT_NE(held.output.find("another process holds a lock on " + path.string()), std::string::npos) << held.output;

    // Anyone who may open it may lock it.
    ASSERT_EQ(::fchmod(holder, 0644), 0);
    const ProgramResult open = run(command);
    EXPECT_EQ(open.status, 1);
    EXPECT_NE(open.output.find("socket.lock is not a private file of this account; remove it"), std::string::npos)
        << open.output;
    ::close(holder);
    fs::remove(path);
    std::ofstream(directory / "target") << "precious";
    fs::create_symlink("target", path);
    EXPECT_EQ(run(command).status, 1) << "a link is not followed";
}

TEST_F(Start, WhatTheParentLeftOpenReachesNoTool) {
    int ends[2];
    ASSERT_EQ(::pipe(ends), 0);  // inherited by every process that this test starts
    DaemonProcess daemon(withFixture());
    ::close(ends[1]);
    // The daemon itself still has it.
    const std::string listing = "for fd in /proc/self/fd/*; do readlink $fd; done";
    const Dictionary answer =
        dictionaryOf(daemon.connect().post("/v1/fixture/run", "{\"script\": \"" + listing + "\"}"));
    const std::string pipe = fs::read_symlink("/proc/self/fd/" + std::to_string(ends[0]));
    EXPECT_EQ(answer.text("output").find(pipe + "\n"), std::string::npos) << answer.text("output");
    EXPECT_NE(answer.text("output").find("/dev/null\n"), std::string::npos) << answer.text("output");
    ::close(ends[0]);
}

TEST_F(Start, SignalsThatTheParentIgnoredOrBlockedAreAtTheirDefaultInAllProcesses) {
    sigset_t blocked{};
    sigset_t unblocked{};
    ::sigemptyset(&blocked);
    ::sigaddset(&blocked, SIGUSR2);
    ASSERT_EQ(::pthread_sigmask(SIG_BLOCK, &blocked, &unblocked), 0);
    const auto before = std::signal(SIGCHLD, SIG_IGN);
    DaemonProcess daemon(withFixture());
    static_cast<void>(std::signal(SIGCHLD, before));
    ::pthread_sigmask(SIG_SETMASK, &unblocked, nullptr);
    for (const pid_t pid : {daemon.pid(), daemon.frontPid(), daemon.workerPid()}) {
        EXPECT_EQ(signalsOf(pid, "SigIgn") & bitOf(SIGCHLD), 0U);
        EXPECT_EQ(signalsOf(pid, "SigBlk") & bitOf(SIGUSR2), 0U);
    }
}

/// Returns true if this process may inspect another one.
bool inspects(pid_t pid) {
    char buffer[8];
    return ::readlink(("/proc/" + std::to_string(pid) + "/exe").c_str(), buffer, sizeof buffer) > 0;
}

/// Drops root's right to inspect every process, for this process and its children.
bool inspectNoLongerAsRoot() {
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct capabilities[_LINUX_CAPABILITY_U32S_3]{};
    if (::geteuid() != 0) {
        return true;
    }
    if (::prctl(PR_CAPBSET_DROP, CAP_SYS_PTRACE, 0, 0, 0) != 0 || ::syscall(SYS_capget, &header, capabilities) != 0) {
        return false;
    }
    for (auto* set : {&capabilities[0].effective, &capabilities[0].permitted, &capabilities[0].inheritable}) {
        *set &= ~(1U << CAP_SYS_PTRACE);
    }
    return ::syscall(SYS_capset, &header, capabilities) == 0;
}

TEST_F(Start, OtherProcessesOfTheAccountCannotInspectFrontAndWorkerOnlyTheirTools) {
#ifdef ADMINHOST_SANITIZED
    constexpr bool expected = true;  // a sanitizer inspects its own process
#else
    constexpr bool expected = false;
#endif
    const pid_t child = ::fork();
    if (child == 0) {
        int status = 1;
        if (inspectNoLongerAsRoot()) {
            try {
                DaemonProcess daemon(withFixture());
                const pid_t worker = daemon.workerPid();
                const std::string mark = daemon.directory() / "tool";
                UnixHttp client = daemon.connect();
                client.begin("POST", "/v1/fixture/run",
                             "{\"script\": \"echo $$ > " + mark + ".new; mv " + mark + ".new " + mark +
                                 "; read line < /dev/zero\"}");
                pid_t tool = 0;
                status = eventually([&] { return fs::exists(mark); }) && std::ifstream(mark) >> tool ? 0 : 2;
                status += inspects(daemon.pid()) == expected && inspects(daemon.frontPid()) == expected ? 0 : 10;
                status += inspects(worker) == expected ? 0 : 20;
                status += inspects(tool) ? 0 : 40;
                ::kill(tool, SIGKILL);
            } catch (const std::exception&) {
                status = 3;
            }
        }
        ::_exit(status);
    }
    int status = -1;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0) << WEXITSTATUS(status);
}

}  // namespace
}  // namespace adminhost::test
