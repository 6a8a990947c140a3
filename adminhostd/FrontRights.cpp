#include "adminhostd/FrontRights.h"

#include "platform/files/Path.h"
#include "platform/task/Confinement.h"

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <memory>
#include <stdexcept>
#include <string>
#include <system_error>
#include <vector>

#include <fcntl.h>
#include <fmt/format.h>
#include <grp.h>
#include <linux/capability.h>
#include <pwd.h>
#include <seccomp.h>
#include <sys/ioctl.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace adminhost {
namespace {

[[noreturn]] void fail(const char* step, int number) {
    throw std::runtime_error(
        fmt::format("the front cannot give up its rights: {}: {}", step, std::generic_category().message(number)));
}

void require(bool done, const char* step) {
    if (!done) {
        fail(step, errno);
    }
}

/// While the process is still privileged: without these, not even a set-user-ID program could bring one back.
void dropBoundingSet(bool required) {
    for (unsigned long capability = 0; ::prctl(PR_CAPBSET_READ, capability, 0, 0, 0) >= 0; ++capability) {
        if (::prctl(PR_CAPBSET_DROP, capability, 0, 0, 0) != 0 && required) {
            fail("capability bounding set", errno);
        }
    }
}

void dropCapabilities() {
    // Missing in old kernels, which have no ambient capabilities.
    static_cast<void>(::prctl(PR_CAP_AMBIENT, PR_CAP_AMBIENT_CLEAR_ALL, 0, 0, 0));
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    const __user_cap_data_struct none[_LINUX_CAPABILITY_U32S_3]{};
    require(::syscall(SYS_capset, &header, none) == 0, "capabilities");
}

/// The files that the front may read; nullopt where the kernel has no Landlock. Created with the rights that the front
/// has at its start, because it may not enter every directory afterwards.
std::optional<Confinement> readableFiles(const Options& options) {
    if (!Confinement::isAvailable()) {
        return std::nullopt;
    }
    auto confinement = Confinement::create();
    if (!confinement) {
        fail("Landlock", static_cast<int>(confinement.error().code));
    }
    // Account names, their services and libraries; the configuration; processes and control groups; time zones.
    std::vector<std::string> readable = {"/etc",        "/usr",           "/lib",      "/lib64",
                                         "/proc",       "/sys/fs/cgroup", "/run/nscd", "/run/systemd/userdb",
                                         "/var/lib/sss"};
    if (!options.configuration.empty()) {
        // The directory: an editor replaces the file.
        readable.push_back(std::filesystem::path(options.configuration).parent_path());
    }
    readable.push_back(diskPath(HostPath("/etc")).text());  // accounts below another root
    for (const std::string& path : readable) {
        const int number = confinement->allowIfPresent(path, Confinement::Access::read);
        if (number != 0 && number != EACCES) {  // what cannot be reached now cannot be read later either
            fail(path.c_str(), number);
        }
    }
    return *std::move(confinement);
}

/// What an argument of a call must be. libseccomp's macros for it are expressions of C only.
constexpr scmp_arg_cmp argument(unsigned number, scmp_compare comparison, scmp_datum_t a, scmp_datum_t b = 0) {
    return {number, comparison, a, b};
}

/// Calls that are allowed whatever their arguments.
constexpr int allowedCalls[] = {
    // Descriptors that are open, and names of files.
    SCMP_SYS(read),
    SCMP_SYS(readv),
    SCMP_SYS(pread64),
    SCMP_SYS(write),
    SCMP_SYS(writev),
    SCMP_SYS(lseek),
    SCMP_SYS(close),
    SCMP_SYS(close_range),
    SCMP_SYS(dup),
    SCMP_SYS(stat),
    SCMP_SYS(fstat),
    SCMP_SYS(lstat),
    SCMP_SYS(newfstatat),
    SCMP_SYS(statx),
    SCMP_SYS(statfs),
    SCMP_SYS(fstatfs),
    SCMP_SYS(access),
    SCMP_SYS(faccessat),
    SCMP_SYS(faccessat2),
    SCMP_SYS(readlink),
    SCMP_SYS(readlinkat),
    SCMP_SYS(getdents64),
    SCMP_SYS(getcwd),
    SCMP_SYS(sendfile),
    // Memory.
    SCMP_SYS(brk),
    SCMP_SYS(munmap),
    SCMP_SYS(mremap),
    SCMP_SYS(madvise),
    SCMP_SYS(membarrier),
    // Waiting and signals of its own.
    SCMP_SYS(poll),
    SCMP_SYS(ppoll),
    SCMP_SYS(select),
    SCMP_SYS(pselect6),
    SCMP_SYS(epoll_create1),
    SCMP_SYS(epoll_ctl),
    SCMP_SYS(epoll_wait),
    SCMP_SYS(epoll_pwait),
    SCMP_SYS(epoll_pwait2),
    SCMP_SYS(eventfd2),
    SCMP_SYS(futex),
    SCMP_SYS(nanosleep),
    SCMP_SYS(clock_nanosleep),
    SCMP_SYS(restart_syscall),
    SCMP_SYS(rt_sigaction),
    SCMP_SYS(rt_sigprocmask),
    SCMP_SYS(rt_sigreturn),
    SCMP_SYS(sigaltstack),
    SCMP_SYS(signalfd4),
    // Sockets that are open. connect: see socket below.
    SCMP_SYS(accept),
    SCMP_SYS(accept4),
    SCMP_SYS(connect),
    SCMP_SYS(recvfrom),
    SCMP_SYS(recvmsg),
    SCMP_SYS(sendto),
    SCMP_SYS(sendmsg),
    SCMP_SYS(sendmmsg),
    SCMP_SYS(shutdown),
    SCMP_SYS(getsockopt),
    SCMP_SYS(setsockopt),
    SCMP_SYS(getsockname),
    SCMP_SYS(getpeername),
    SCMP_SYS(pipe2),
    // Time, and the process itself.
    SCMP_SYS(clock_gettime),
    SCMP_SYS(clock_getres),
    SCMP_SYS(gettimeofday),
    SCMP_SYS(time),
    SCMP_SYS(adjtimex),
    SCMP_SYS(clock_adjtime),
    SCMP_SYS(times),
    SCMP_SYS(getrusage),
    SCMP_SYS(getrlimit),
    SCMP_SYS(getrandom),
    SCMP_SYS(uname),
    SCMP_SYS(sysinfo),
    SCMP_SYS(sched_yield),
    SCMP_SYS(sched_getaffinity),
    SCMP_SYS(getcpu),
    SCMP_SYS(getpid),
    SCMP_SYS(getppid),
    SCMP_SYS(gettid),
    SCMP_SYS(getuid),
    SCMP_SYS(geteuid),
    SCMP_SYS(getgid),
    SCMP_SYS(getegid),
    SCMP_SYS(getgroups),
    SCMP_SYS(getresuid),
    SCMP_SYS(getresgid),
    SCMP_SYS(getpgrp),
    SCMP_SYS(getpgid),
    SCMP_SYS(getsid),
    SCMP_SYS(prctl),
    SCMP_SYS(rseq),
    SCMP_SYS(set_robust_list),
    SCMP_SYS(exit),
    SCMP_SYS(exit_group),
#ifdef ADMINHOST_SANITIZED  // the search for leaks inspects its own process from a thread
    SCMP_SYS(clone),
    SCMP_SYS(wait4),
    SCMP_SYS(ptrace),
    SCMP_SYS(kill),
    SCMP_SYS(mprotect),
#endif
};

void filterSystemCalls() {
    // A refused call fails like one that the account may not make.
    const std::unique_ptr<void, decltype(&::seccomp_release)> filter(::seccomp_init(SCMP_ACT_ERRNO(EPERM)),
                                                                     &::seccomp_release);
    int failure = filter ? 0 : -ENOMEM;
    const auto allow = [&](int call, std::initializer_list<scmp_arg_cmp> arguments = {}) {
        if (failure == 0) {
            failure = ::seccomp_rule_add_array(filter.get(), SCMP_ACT_ALLOW, call,
                                               static_cast<unsigned>(arguments.size()), arguments.begin());
        }
    };
    for (const int call : allowedCalls) {
        allow(call);
    }
    constexpr scmp_datum_t writing = O_ACCMODE | O_CREAT | O_TRUNC | (O_TMPFILE & ~O_DIRECTORY);
    allow(SCMP_SYS(open), {argument(1, SCMP_CMP_MASKED_EQ, writing, O_RDONLY)});
    allow(SCMP_SYS(openat), {argument(2, SCMP_CMP_MASKED_EQ, writing, O_RDONLY)});
    allow(SCMP_SYS(socket), {argument(0, SCMP_CMP_EQ, AF_UNIX)});
    allow(SCMP_SYS(socketpair), {argument(0, SCMP_CMP_EQ, AF_UNIX)});
    // Never memory that can be written and executed. Name services are libraries, whose files are mapped. A shared
    // mapping would show what is written to the file later.
    allow(SCMP_SYS(mmap), {argument(2, SCMP_CMP_MASKED_EQ, PROT_EXEC, 0)});
    allow(SCMP_SYS(mmap), {argument(2, SCMP_CMP_MASKED_EQ, PROT_WRITE | PROT_EXEC, PROT_EXEC),
                           argument(3, SCMP_CMP_MASKED_EQ, MAP_TYPE | MAP_ANONYMOUS, MAP_PRIVATE)});
    // Only itself: its account may have other processes.
    allow(SCMP_SYS(tgkill), {argument(0, SCMP_CMP_EQ, static_cast<scmp_datum_t>(::getpid()))});
    allow(SCMP_SYS(prlimit64), {argument(0, SCMP_CMP_EQ, 0)});
#ifndef ADMINHOST_SANITIZED
    allow(SCMP_SYS(mprotect), {argument(2, SCMP_CMP_MASKED_EQ, PROT_EXEC, 0)});
#endif
    // Not F_SETOWN: with it, the kernel sends signals to other processes of the account.
    for (const scmp_datum_t command : {F_DUPFD, F_DUPFD_CLOEXEC, F_GETFD, F_SETFD, F_GETFL, F_SETFL}) {
        allow(SCMP_SYS(fcntl), {argument(1, SCMP_CMP_EQ, command)});
    }
    for (const scmp_datum_t request : {TCGETS, FIONREAD, FIONBIO}) {
        allow(SCMP_SYS(ioctl), {argument(1, SCMP_CMP_EQ, request)});
    }
    if (failure == 0) {
        failure = ::seccomp_load(filter.get());
    }
    if (failure != 0) {
        fail("system call filter", -failure);
    }
}

}  // namespace

std::optional<FrontAccount> frontAccount(const Options& options) {
    if (::geteuid() != 0 || (options.account.empty() && options.root != "/")) {
        return std::nullopt;
    }
    const std::string name = options.account.empty() ? "adminhost" : options.account;
    const passwd* const entry = ::getpwnam(name.c_str());
    if (entry == nullptr) {
        throw std::runtime_error(
            fmt::format("the account \"{}\" does not exist; create it (systemd-sysusers creates \"adminhost\"), or "
                        "correct account in the configuration",
                        name));
    }
    if (entry->pw_uid == 0 || entry->pw_gid == 0) {
        throw std::runtime_error(
            fmt::format("the account \"{}\" is the superuser's or in its group; name another account in "
                        "the configuration",
                        name));
    }
    return FrontAccount{entry->pw_uid, entry->pw_gid};
}

void dropFrontRights(const std::optional<FrontAccount>& account, const Options& options) {
    const auto readable = readableFiles(options);
    dropBoundingSet(account.has_value());
    if (account) {
        require(::setgroups(0, nullptr) == 0, "groups");
        require(::setresgid(account->group, account->group, account->group) == 0, "group");
        require(::setresuid(account->user, account->user, account->user) == 0, "account");
#ifdef ADMINHOST_SANITIZED
        ::prctl(PR_SET_DUMPABLE, 1);
#endif
    }
    dropCapabilities();
    require(::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0, "no new privileges");
    if (readable) {
        require(::syscall(SYS_landlock_restrict_self, readable->descriptor(), 0) == 0, "Landlock");
    }
    filterSystemCalls();
}

}  // namespace adminhost
