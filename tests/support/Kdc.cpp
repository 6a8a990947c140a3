#include "tests/support/Kdc.h"

#include "tests/support/Program.h"

#include <stdexcept>

namespace support {

using adminhost::test::Errors;
using adminhost::test::runProgram;

Kdc::Kdc(std::string realm) : _realm(std::move(realm)), _directory(createTemporaryDirectory("kdc")) {
    try {
        createDatabase();
        for (int attempt = 0; !_server.isRunning(); ++attempt) {
            if (!start(freePort()) && attempt == 5) {
                throw std::runtime_error("krb5kdc: " + contentsOf(_directory / "kdc.out"));
            }
        }
    } catch (...) {
        _server.stop();
        std::filesystem::remove_all(_directory);
        throw;
    }
}

Kdc::~Kdc() {
    _server.stop();
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
    writeFile(configuration(), clientConfiguration(_realm, 1));
    writeFile(_directory / "kdc.conf", "[realms]\n " + _realm + " = {\n  database_name = " + directory +
                                           "/principal\n  key_stash_file = " + directory + "/stash\n  acl_file = " +
                                           directory + "/kadm5.acl\n  max_life = 10h\n  max_renewable_life = 7d\n" +
                                           "  supported_enctypes = aes256-cts-hmac-sha1-96:normal "
                                           "aes128-cts-hmac-sha1-96:normal\n }\n[logging]\n kdc = FILE:" +
                                           directory + "/kdc.log\n admin_server = FILE:" + directory + "/kadmin.log\n");
    writeFile(_directory / "kadm5.acl", "");
    const ScopedEnvironment scoped(environment());
    const auto created =
        runProgram({"/usr/sbin/kdb5_util", "create", "-s", "-r", _realm, "-P", "master"}, Errors::merge);
    if (created.status != 0) {
        throw std::runtime_error("kdb5_util: " + created.output);
    }
}

bool Kdc::start(int port) {
    writeFile(configuration(), clientConfiguration(_realm, port));
    const ScopedEnvironment scoped(environment());
    const std::string address = "127.0.0.1:" + std::to_string(port);
    std::string kdcConfiguration = contentsOf(_directory / "kdc.conf");
    kdcConfiguration = kdcConfiguration.substr(kdcConfiguration.find("[realms]"));
    writeFile(_directory / "kdc.conf",
              "[kdcdefaults]\n kdc_listen = " + address + "\n kdc_tcp_listen = " + address + "\n" + kdcConfiguration);
    return _server.start({"/usr/sbin/krb5kdc", "-n"}, _directory / "kdc.out", port);
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
