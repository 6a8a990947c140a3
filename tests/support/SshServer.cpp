#include "tests/support/SshServer.h"

#include "tests/support/Program.h"

#include <cerrno>
#include <csignal>
#include <cstring>
#include <fstream>
#include <sstream>
#include <stdexcept>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

namespace support {
namespace {

using adminhost::test::Errors;
using adminhost::test::runProgram;
namespace fs = std::filesystem;

constexpr const char* serverProgram = "/usr/sbin/sshd";
constexpr const char* runDirectory = "/run/sshd";

void run(const std::vector<std::string>& command) {
    const auto done = runProgram(command, Errors::merge, "");
    if (done.status != 0) {
        throw std::runtime_error(command[0] + ": " + done.output);
    }
}

bool isRoot() {
    return ::geteuid() == 0;
}

constexpr const char* accountName = "tester";  // of another account than root, in the server's own list of accounts

/// Runs the command with another list of accounts.
std::vector<std::string> withAccounts(const fs::path& accounts, const std::vector<std::string>& command) {
    std::vector<std::string> all{"/usr/bin/unshare",
                                 "--user",
                                 "--map-current-user",
                                 "--mount",
                                 "--keep-caps",
                                 "/bin/sh",
                                 "-c",
                                 "mount --bind \"$0\" /etc/passwd && "
                                 "exec setpriv --pdeathsig KILL --inh-caps=-all --ambient-caps=-all \"$@\"",
                                 accounts};
    all.insert(all.end(), command.begin(), command.end());
    return all;
}

std::vector<std::string> linesOf(const fs::path& path) {
    std::vector<std::string> lines;
    std::ifstream file(path);
    for (std::string line; std::getline(file, line);) {
        lines.push_back(line);
    }
    return lines;
}

/// The server's processes below this one, the innermost first.
void collectSessions(pid_t parent, std::vector<pid_t>& all) {
    std::istringstream children(runProgram({"pgrep", "-P", std::to_string(parent), "-x", "sshd"}).output);
    for (pid_t child = 0; children >> child;) {
        collectSessions(child, all);
        all.push_back(child);
    }
}

}  // namespace

/// The directory without which the server does not start as root. Programs that run at the same time share one that is
/// created here, which its mode shows, and the last one removes it.
class SshServer::RunDirectory {
  public:
    RunDirectory() {
        while (!tryToShare()) {  // another program has just removed it
            ::close(_descriptor);
        }
    }
    ~RunDirectory() {
        struct stat now {};
        if (::flock(_descriptor, LOCK_EX | LOCK_NB) == 0 && ::fstat(_descriptor, &now) == 0 &&
            (now.st_mode & 07777U) == ourMode) {
            ::rmdir(runDirectory);
        }
        ::close(_descriptor);
    }
    RunDirectory(const RunDirectory&) = delete;
    RunDirectory& operator=(const RunDirectory&) = delete;

  private:
    [[nodiscard]] bool tryToShare() {
        struct stat ours {};
        struct stat there {};
        if (::mkdir(runDirectory, ourMode) == 0) {
            ::chmod(runDirectory, ourMode);
        } else if (errno != EEXIST) {
            fail();
        }
        _descriptor = ::open(runDirectory, O_RDONLY | O_DIRECTORY | O_CLOEXEC);
        if (_descriptor < 0 && errno == ENOENT) {
            return false;
        }
        if (_descriptor < 0 || ::flock(_descriptor, LOCK_SH) != 0 || ::fstat(_descriptor, &ours) != 0) {
            fail();
        }
        return ::stat(runDirectory, &there) == 0 && ours.st_ino == there.st_ino;
    }
    [[noreturn]] static void fail() {
        throw std::runtime_error(std::string(runDirectory) + ": " + std::strerror(errno));
    }

    static constexpr mode_t ourMode = 0711;  // packages use 0755
    int _descriptor = -1;
};

SshServer::SshServer() : _directory(createTemporaryDirectory("ssh")) {
    try {
        prepare();
        if (isRoot()) {
            _runDirectory = std::make_unique<RunDirectory>();
        }
        for (int attempt = 0; !_server.isRunning(); ++attempt) {
            _port = freePort();
            if (!tryToStart() && attempt == 5) {
                throw std::runtime_error(std::string(serverProgram) + ": " + log());
            }
        }
    } catch (...) {
        _server.stop();
        fs::remove_all(_directory);
        throw;
    }
}

SshServer::~SshServer() {
    stop();
    std::error_code ignored;
    fs::remove_all(_directory, ignored);
}

void SshServer::prepare() const {
    if (!fs::exists(serverProgram)) {
        throw std::runtime_error(std::string(serverProgram) + " is not installed: run scripts/bootstrap");
    }
    fs::create_directory(toolDirectory());
    fs::create_directory(_directory / "there");
    for (const char* const key : {"server_key", "user_key"}) {
        run({"ssh-keygen", "-q", "-t", "ed25519", "-N", "", "-C", "test", "-f", (_directory / key).string()});
    }
    writeFile(_directory / "authorized_keys", contentsOf(_directory / "user_key.pub"));
    if (!isRoot()) {
        if (const std::string problem = adminhost::test::namespaceProblem(); !problem.empty()) {
            throw std::runtime_error(problem);
        }
        writeFile(_directory / "passwd", std::string(accountName) + ":x:" + std::to_string(::geteuid()) + ':' +
                                             std::to_string(::getegid()) + "::/:/bin/sh\n");
    }
    const std::string directory = _directory;
    writeFile(toolDirectory() / "ssh",
              "#!/bin/sh\n"
              "printf '%s\\n' \"$*\" >>'" +
                  directory +
                  "/calls'\n"
                  "readlink /proc/self/fd/0 >>'" +
                  directory +
                  "/inputs'\n"
                  "exec /usr/bin/ssh -F '" +
                  directory + "/config' \"$@\"\n");
    fs::permissions(toolDirectory() / "ssh", fs::perms(0755));
}

bool SshServer::tryToStart() {
    const std::string directory = _directory;
    const std::string port = std::to_string(_port);
    writeFile(_directory / "known_hosts", "[127.0.0.1]:" + port + ' ' + contentsOf(_directory / "server_key.pub"));
    writeFile(_directory / "config", "Host " + std::string(host) + "\nHostName 127.0.0.1\nPort " + port + "\nUser " +
                                         (isRoot() ? "root" : accountName) + "\nIdentityFile " + directory +
                                         "/user_key\nIdentitiesOnly yes\nIdentityAgent none\nUserKnownHostsFile " +
                                         directory +
                                         "/known_hosts\nGlobalKnownHostsFile /dev/null\nUpdateHostKeys no\n");
    writeFile(_directory / "sshd_config",
              "Port " + port + "\nListenAddress 127.0.0.1\nHostKey " + directory +
                  "/server_key\nPidFile none\nAuthorizedKeysFile " + directory +
                  "/authorized_keys\nStrictModes no\nUsePAM no\nPasswordAuthentication no\n"
                  "KbdInteractiveAuthentication no\nPermitRootLogin yes\nUseDNS no\nMaxStartups 200\n"
                  "LogLevel VERBOSE\nSetEnv PATH=" +
                  directory + "/there:/usr/local/bin:/usr/bin:/bin\n");
    const std::vector<std::string> command{serverProgram, "-D", "-e", "-f", (_directory / "sshd_config").string()};
    return _server.start(isRoot() ? command : withAccounts(_directory / "passwd", command), _directory / "sshd.out",
                         _port);
}

void SshServer::start() {
    if (!tryToStart()) {
        throw std::runtime_error(std::string(serverProgram) + ": " + log());
    }
}

void SshServer::installThere(const std::string& name, const std::string& script) const {
    const fs::path file = _directory / "there" / name;
    writeFile(file, "#!/bin/sh\n" + script);
    fs::permissions(file, fs::perms(0755));
}

std::vector<std::string> SshServer::calls() const {
    return linesOf(_directory / "calls");
}

std::vector<std::string> SshServer::inputs() const {
    return linesOf(_directory / "inputs");
}

void SshServer::configure(const std::string& lines) const {
    std::ofstream(_directory / "config", std::ios::app) << lines;
}

void SshServer::setPassphrase(const std::string& passphrase) const {
    run({"ssh-keygen", "-q", "-p", "-P", "", "-N", passphrase, "-f", (_directory / "user_key").string()});
}

void SshServer::stop() {
    if (_server.isRunning()) {
        ::kill(_server.pid(), SIGSTOP);  // no session is added
        std::vector<pid_t> sessions;
        collectSessions(_server.pid(), sessions);
        _server.stop();
        for (const pid_t session : sessions) {
            ::kill(session, SIGKILL);
        }
    }
}

void SshServer::breakSessions() const {
    std::vector<pid_t> sessions;
    collectSessions(_server.pid(), sessions);
    for (const pid_t session : sessions) {
        ::kill(session, SIGKILL);
    }
}

}  // namespace support
