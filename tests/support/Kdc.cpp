#include "tests/support/Kdc.h"

#include "tests/support/Program.h"

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <fstream>
#include <stdexcept>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <netinet/in.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

extern char** environ;

namespace support {

using adminhost::test::Errors;
using adminhost::test::runProgram;

namespace {

/// A descriptor that its destructor closes.
class Descriptor {
  public:
    explicit Descriptor(int number) : _number(number) {}
    Descriptor(const Descriptor&) = delete;
    Descriptor& operator=(const Descriptor&) = delete;
    ~Descriptor() {
        if (_number >= 0) {
            close(_number);
        }
    }
    [[nodiscard]] int get() const { return _number; }

  private:
    int _number;
};

/// Starts the program with empty input and its output in the file.
pid_t spawn(const std::vector<std::string>& arguments, const std::filesystem::path& output) {
    std::vector<char*> argv;
    argv.reserve(arguments.size() + 1);
    for (const std::string& argument : arguments) {
        argv.push_back(const_cast<char*>(argument.c_str()));
    }
    argv.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_addopen(&actions, 1, output.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
    posix_spawn_file_actions_adddup2(&actions, 1, 2);
    pid_t pid = 0;
    const int error = posix_spawn(&pid, argv[0], &actions, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    if (error != 0) {
        throw std::runtime_error(arguments[0] + ": " + std::strerror(error));
    }
    return pid;
}

std::string contentsOf(const std::filesystem::path& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

void write(const std::filesystem::path& path, std::string_view text) {
    std::ofstream file(path, std::ios::binary);
    file << text;
    if (!file.flush()) {
        throw std::runtime_error("cannot write " + path.string());
    }
}

std::filesystem::path makeTemporaryDirectory() {
    std::string pattern = std::filesystem::temp_directory_path() / "kdc.XXXXXX";
    if (mkdtemp(pattern.data()) == nullptr) {
        throw std::runtime_error("mkdtemp: " + std::string(std::strerror(errno)));
    }
    return pattern;
}

sockaddr_in loopback(int port) {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    address.sin_port = htons(static_cast<std::uint16_t>(port));
    return address;
}

int bindTo(int socket, int port) {
    const sockaddr_in address = loopback(port);
    return bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address);
}

/// A port that is free for TCP and UDP at the moment.
int freePort() {
    for (int attempt = 0; attempt < 100; ++attempt) {
        const Descriptor stream(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        const Descriptor datagram(socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        sockaddr_in address{};
        socklen_t length = sizeof address;
        if (bindTo(stream.get(), 0) == 0 &&
            getsockname(stream.get(), reinterpret_cast<sockaddr*>(&address), &length) == 0 &&
            bindTo(datagram.get(), ntohs(address.sin_port)) == 0) {
            return ntohs(address.sin_port);
        }
    }
    throw std::runtime_error("no free port");
}

bool accepts(int port) {
    const Descriptor stream(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const sockaddr_in address = loopback(port);
    return connect(stream.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0;
}

}  // namespace

Kdc::Kdc(std::string realm) : _realm(std::move(realm)), _directory(makeTemporaryDirectory()) {
    try {
        createDatabase();
        for (int attempt = 0; _pid == 0; ++attempt) {
            if (!start(freePort()) && attempt == 5) {
                throw std::runtime_error("krb5kdc: " + contentsOf(_directory / "kdc.out"));
            }
        }
    } catch (...) {
        stop();
        std::filesystem::remove_all(_directory);
        throw;
    }
}

Kdc::~Kdc() {
    stop();
    std::error_code ignored;
    std::filesystem::remove_all(_directory, ignored);
}

ScopedEnvironment::Changes Kdc::environment() const {
    const std::string directory = _directory;
    return {{"KRB5_CONFIG", configuration()},
            {"KRB5_KDC_PROFILE", directory + "/kdc.conf"},
            {"KRB5CCNAME", "FILE:" + directory + "/cc"},
            {"KRB5_KTNAME", "FILE:" + directory + "/krb5.keytab"},
            {"KRB5_CLIENT_KTNAME", "FILE:" + directory + "/client.keytab"},
            {"KRB5RCACHEDIR", directory},
            {"KRB5_TRACE", std::nullopt}};
}

std::string Kdc::clientConfiguration(const std::string& realm, int port, const std::string& libdefaults) {
    // No name is looked up outside, and TCP fails at once if no KDC listens.
    return "[libdefaults]\n default_realm = " + realm +
           "\n dns_lookup_realm = false\n dns_lookup_kdc = false\n dns_canonicalize_hostname = false\n"
           " rdns = false\n udp_preference_limit = 1\n" +
           libdefaults + "[realms]\n " + realm + " = {\n  kdc = 127.0.0.1:" + std::to_string(port) +
           "\n }\n[domain_realm]\n localhost = " + realm + "\n";
}

void Kdc::createDatabase() const {
    const std::string directory = _directory;
    write(configuration(), clientConfiguration(_realm, 1));
    write(_directory / "kdc.conf", "[realms]\n " + _realm + " = {\n  database_name = " + directory +
                                       "/principal\n  key_stash_file = " + directory + "/stash\n  acl_file = " +
                                       directory + "/kadm5.acl\n  max_life = 10h\n  max_renewable_life = 7d\n" +
                                       "  supported_enctypes = aes256-cts-hmac-sha1-96:normal "
                                       "aes128-cts-hmac-sha1-96:normal\n }\n[logging]\n kdc = FILE:" +
                                       directory + "/kdc.log\n admin_server = FILE:" + directory + "/kadmin.log\n");
    write(_directory / "kadm5.acl", "");
    const ScopedEnvironment scoped(environment());
    const auto created =
        runProgram({"/usr/sbin/kdb5_util", "create", "-s", "-r", _realm, "-P", "master"}, Errors::merge);
    if (created.status != 0) {
        throw std::runtime_error("kdb5_util: " + created.output);
    }
}

bool Kdc::start(int port) {
    write(configuration(), clientConfiguration(_realm, port));
    const ScopedEnvironment scoped(environment());
    const std::string address = "127.0.0.1:" + std::to_string(port);
    std::string kdcConfiguration = contentsOf(_directory / "kdc.conf");
    kdcConfiguration = kdcConfiguration.substr(kdcConfiguration.find("[realms]"));
    write(_directory / "kdc.conf",
          "[kdcdefaults]\n kdc_listen = " + address + "\n kdc_tcp_listen = " + address + "\n" + kdcConfiguration);
    // If the test program crashes, its KDC is killed too.
    _pid = spawn({"/usr/bin/setpriv", "--pdeathsig", "KILL", "/usr/sbin/krb5kdc", "-n"}, _directory / "kdc.out");
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
    while (std::chrono::steady_clock::now() < deadline) {
        if (waitpid(_pid, nullptr, WNOHANG) == _pid) {
            _pid = 0;
            return false;
        }
        if (accepts(port)) {
            return true;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    stop();
    return false;
}

void Kdc::stop() noexcept {
    if (_pid > 0) {
        kill(_pid, SIGKILL);
        while (waitpid(_pid, nullptr, 0) < 0 && errno == EINTR) {
        }
        _pid = 0;
    }
}

void Kdc::admin(std::string_view commands) const {
    const ScopedEnvironment scoped(environment());
    const auto done = runProgram({"/usr/sbin/kadmin.local"}, Errors::merge, commands);
    // The tool's exit status does not show failures. They are lines such as "add_principal: Principal or policy already
    // exists while creating "alice@R"."
    if (done.status != 0 || done.output.find(" while ") != std::string::npos ||
        done.output.find("unknown request") != std::string::npos || done.output.find("usage:") != std::string::npos) {
        throw std::runtime_error("kadmin.local: " + done.output);
    }
}

}  // namespace support
