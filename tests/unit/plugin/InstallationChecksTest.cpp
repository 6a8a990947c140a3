// The plug-in's checks of the installation: whole, and with each part broken once.

#include "adminhostd/PluginFile.h"
#include "platform/files/Path.h"
#include "tests/support/Environment.h"
#include "tests/support/TemporaryRoot.h"

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <memory>
#include <stdexcept>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <openssl/evp.h>
#include <openssl/pem.h>
#include <openssl/x509v3.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;
using testing::AllOf;
using testing::HasSubstr;
using Health = Diagnosis::Health;

constexpr std::string_view certificateFile = "/etc/ssl/server.pem";
constexpr std::string_view keyFile = "/etc/ssl/server.key";
constexpr std::string_view memberFile = "/shared/Server/member_preferences_M.plist";
constexpr std::string_view kekFile = "/shared/Server/Secrets/kek.plist";
constexpr long day = 24L * 60 * 60;

using Key = std::unique_ptr<EVP_PKEY, decltype(&EVP_PKEY_free)>;

Key newKey() {
    return {::EVP_EC_gen("P-256"), &EVP_PKEY_free};
}

template <class Write>
std::string pemOf(Write write) {
    const std::unique_ptr<BIO, decltype(&BIO_free)> text(::BIO_new(::BIO_s_mem()), &BIO_free);
    char* bytes = nullptr;
    if (write(text.get()) != 1) {
        throw std::runtime_error("cannot write PEM");
    }
    const long length = ::BIO_get_mem_data(text.get(), &bytes);
    return {bytes, static_cast<std::size_t>(length)};
}

/// A certificate that the key has signed itself, valid between two moments in seconds from now.
std::string certificateOf(const Key& key, const std::string& host, long from, long to) {
    const std::unique_ptr<X509, decltype(&X509_free)> made(::X509_new(), &X509_free);
    ::X509_set_version(made.get(), 2);
    ::X509_gmtime_adj(::X509_getm_notBefore(made.get()), from);
    ::X509_gmtime_adj(::X509_getm_notAfter(made.get()), to);
    ::X509_set_pubkey(made.get(), key.get());
    const std::string names = "DNS:" + host;
    const std::unique_ptr<X509_EXTENSION, decltype(&X509_EXTENSION_free)> extension(
        ::X509V3_EXT_conf_nid(nullptr, nullptr, NID_subject_alt_name, names.c_str()), &X509_EXTENSION_free);
    ::X509_add_ext(made.get(), extension.get(), -1);
    ::X509_sign(made.get(), key.get(), ::EVP_sha256());
    return pemOf([&](BIO* text) { return ::PEM_write_bio_X509(text, made.get()); });
}

std::string keyText(const Key& key, const char* passphrase = nullptr) {
    return pemOf([&](BIO* text) {
        return ::PEM_write_bio_PKCS8PrivateKey(text, key.get(), passphrase == nullptr ? nullptr : ::EVP_aes_128_cbc(),
                                               passphrase, passphrase == nullptr ? 0 : 6, nullptr, nullptr);
    });
}

class InstallationChecks : public testing::Test {
  protected:
    void SetUp() override {
        const auto loaded = loadPlugin(DiskPath(PLUGIN));
        ASSERT_TRUE(loaded) << loaded.error().description.value_or("");
        plugin = loaded->plugin;
        for (const char* tool : {"/usr/sbin/lumioctl", "/usr/bin/lumioconfig", "/usr/bin/nimbo",
                                 "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_preferences",
                                 "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_library"}) {
            root.writeTool(tool, "#!/bin/sh\necho run >> " + root.path("/runs").string() + "\n");
        }
        root.writePropertyList("/Library/Preferences/com.brenn.lumioserverd.plist",
                               "<key>shared_filesystem</key><string>/shared</string><key>member_uuid</key>"
                               "<string>M</string>");
        root.writePropertyList("/shared/Server/cluster_preferences.plist", "");
        root.writePropertyList("/shared/lumioserverd.plist", "");
        root.writePropertyList(kekFile, "<key>lumio_secret</key><string>AAECAwQFBgcICQoLDA0ODw==</string>");
        fs::permissions(root.path(kekFile), fs::perms(0600));
        root.write("/shared/Server/db.sqlite3", "");
        member("server.example", certificateFile, keyFile);
        install(0, 365 * day);
        fs::create_directories(root.path("/var/lumio/server"));
        fs::create_directories(root.path("/Library/Logs/lumioserverd"));
        root.write("/krb5.conf", "[libdefaults]\ndefault_realm = EXAMPLE.ORG\n");
    }
    void TearDown() override {
        EXPECT_FALSE(fs::exists(root.path("/runs"))) << "none of the service's tools is run";
        EXPECT_FALSE(log.contains("PRIVATE KEY"));
    }

    void member(std::string_view host, std::string_view certificate, std::string_view key) const {
        const auto entry = [](std::string_view name, std::string_view value) {
            return value.empty() ? std::string()
                                 : "<key>" + std::string(name) + "</key><string>" + std::string(value) + "</string>";
        };
        root.writePropertyList(memberFile, entry("server_host", host) + entry("ssl_certificate_file", certificate) +
                                               entry("ssl_certificate_key_file", key));
    }
    /// A certificate and its key for "server.example".
    void install(long from, long to) const {
        const Key key = newKey();
        root.write(certificateFile, certificateOf(key, "server.example", from, to));
        root.write(keyFile, keyText(key));
        fs::permissions(root.path(keyFile), fs::perms(0600));
    }
    [[nodiscard]] std::vector<Diagnosis> all() const {
        const support::ScopedEnvironment scoped({{"KRB5_CONFIG", root.path("/krb5.conf").string()}});
        return plugin->diagnose();
    }
    [[nodiscard]] Diagnosis checkNamed(const std::string& name) const {
        const auto checks = all();
        const auto found =
            std::find_if(checks.begin(), checks.end(), [&](const Diagnosis& one) { return one.name == name; });
        return found == checks.end() ? Diagnosis{Health::ok, "missing", "", ""} : *found;
    }
    /// The check of this name has this result and these words; a fix is there exactly if something is wrong.
    void expect(const std::string& name, Health health, std::string_view words) const {
        const Diagnosis check = checkNamed(name);
        EXPECT_EQ(check.name, name);
        EXPECT_EQ(static_cast<int>(check.health), static_cast<int>(health)) << name << ": " << check.found;
        EXPECT_THAT(check.found, HasSubstr(std::string(words))) << name;
        EXPECT_EQ(check.fix.empty(), health == Health::ok) << name << ": " << check.fix;
        EXPECT_TRUE(check.found.ends_with('.')) << check.found;
    }

    test::TemporaryRoot root;
    test::CapturedLog log;
    Plugin* plugin = nullptr;
};

TEST_F(InstallationChecks, WholeInstallationPassesAllOfThem) {
    const auto checks = all();
    EXPECT_GT(checks.size(), 15U);
    for (const Diagnosis& check : checks) {
        // The machine that runs the tests may have little room.
        EXPECT_TRUE(check.health == Health::ok || check.name == "free space") << check.name << ": " << check.found;
        EXPECT_TRUE(check.found.ends_with('.')) << check.found;
    }
}

TEST_F(InstallationChecks, MissingUnusableAndUnsafeToolsAreFailures) {
    fs::remove(root.path("/usr/bin/nimbo"));
    expect("tool /usr/bin/nimbo", Health::failure, "/usr/bin/nimbo: No such file or directory");
    fs::permissions(root.path("/usr/sbin/lumioctl"), fs::perms(0644));
    expect("tool /usr/sbin/lumioctl", Health::failure, "is not an executable file");
    fs::permissions(root.path("/usr/bin/lumioconfig"), fs::perms(0775));
    expect("tool /usr/bin/lumioconfig", Health::failure,
           "Others than root can change /usr/bin/lumioconfig: it belongs to");
    if (::geteuid() == 0) {
        fs::permissions(root.path("/usr/bin/lumioconfig"), fs::perms(0755));
        ASSERT_EQ(::chown(root.path("/usr/bin/lumioconfig").c_str(), 4711, 0), 0);
        expect("tool /usr/bin/lumioconfig", Health::failure, "the user id 4711");
    }
}

TEST_F(InstallationChecks, DatabaseToolIsTriedForReal) {
    expect("database tool", Health::ok, "accepts double-quoted text");
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\necho 'a: b'\n");
    expect("database tool", Health::failure, "does not print rows in the form that this release reads");
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nexit 1\n");
    expect("database tool", Health::failure, "failed with status 1");
    fs::remove(root.path("/usr/bin/sqlite3"));
    expect("database tool", Health::failure, "cannot be run");
}

TEST_F(InstallationChecks, DatabaseToolThatHangsIsGivenUpSoon) {
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nexec sleep 100\n");
    const auto start = std::chrono::steady_clock::now();
    expect("database tool", Health::warning, "was ended before it had finished");
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(30)) << "the bound is 2 seconds";
}

TEST_F(InstallationChecks, MissingDatabaseIsAWarningAndItsToolIsTriedAllTheSame) {
    fs::remove(root.path("/shared/Server/db.sqlite3"));
    expect("database", Health::warning, "/shared/Server/db.sqlite3 does not exist");
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nexit 1\n");
    expect("database tool", Health::failure, "failed with status 1");
}

TEST_F(InstallationChecks, SettingsFilesThatAreMissingAreWarningsAndUnreadableOnesFailures) {
    root.write("/shared/Server/cluster_preferences.plist", "no property list");
    expect("cluster preferences", Health::failure, "/shared/Server/cluster_preferences.plist");
    fs::remove(root.path("/shared/Server/cluster_preferences.plist"));
    expect("cluster preferences", Health::warning, "does not exist");
    fs::remove(root.path(memberFile));
    expect("member preferences", Health::warning, "does not exist");
    fs::remove(root.path("/shared/lumioserverd.plist"));
    expect("library information", Health::warning, "does not exist");
    fs::remove(root.path("/Library/Preferences/com.brenn.lumioserverd.plist"));
    expect("identity preferences", Health::warning, "does not exist");
}

TEST_F(InstallationChecks, KeyFileMustHoldAKeyThatOnlyItsOwnerReads) {
    expect("key file", Health::ok, "holds a usable key");
    fs::permissions(root.path(kekFile), fs::perms(0644));
    expect("key file", Health::warning, "Others can read the key");
    root.writePropertyList(kekFile, "");
    expect("key file", Health::failure, "does not hold a usable key");
    fs::remove(root.path(kekFile));
    expect("key file", Health::failure, "No such file or directory");
}

TEST_F(InstallationChecks, CertificateMustBeValidForTheHostAndBelongToItsKey) {
    expect("certificate", Health::ok, "is valid until");
    install(-10 * day, -day);
    expect("certificate", Health::failure, "so not today");
    install(day, 10 * day);
    expect("certificate", Health::failure, "so not today");
    install(0, 10 * day);
    expect("certificate", Health::warning, "ends on");
    install(0, 365 * day);
    member("other.example", certificateFile, keyFile);
    expect("certificate", Health::failure, "is not for the host name other.example");
    member("server.example", certificateFile, keyFile);
    root.write(keyFile, keyText(newKey()));
    expect("certificate", Health::failure, "does not belong to the key");
    install(0, 365 * day);
    fs::permissions(root.path(keyFile), fs::perms(0644));
    expect("certificate", Health::warning, "Others can read the key");
}

TEST_F(InstallationChecks, CertificateAndKeyMustBeThereAndReadable) {
    root.write(keyFile, keyText(newKey(), "secret"));
    expect("certificate", Health::failure, "protected by a passphrase");
    root.write(keyFile, "garbage");
    expect("certificate", Health::failure, "does not hold a private key");
    root.write(certificateFile, "garbage");
    expect("certificate", Health::failure, "does not hold a certificate");
    fs::remove(root.path(certificateFile));
    expect("certificate", Health::failure, "cannot read /etc/ssl/server.pem: No such file or directory");
    member("server.example", certificateFile, "");
    expect("certificate", Health::failure, "Only one of certificate and key is set");
    member("server.example", "", "");
    expect("certificate", Health::ok, "No certificate is set");
}

TEST_F(InstallationChecks, MissingKerberosRealmIsAWarningAndABrokenConfigurationAFailure) {
    expect("Kerberos realm", Health::ok, "EXAMPLE.ORG");
    root.write("/krb5.conf", "[libdefaults]\ndns_lookup_realm = false\n");
    expect("Kerberos realm", Health::warning, "no default Kerberos realm");
    root.write("/krb5.conf", "[libdefaults\n");
    expect("Kerberos realm", Health::failure, "cannot be read");
}

TEST_F(InstallationChecks, DirectoriesMustBeThereAndOnlyRootsToChange) {
    expect("state directory", Health::ok, "mode 0755");
    fs::permissions(root.path("/var/lumio/server"), fs::perms(0777));
    expect("state directory", Health::warning, "Others than root can create files in /var/lumio/server");
    fs::remove_all(root.path("/var/lumio"));
    expect("state directory", Health::warning, "does not exist");
    root.write("/var/lumio/server", "a file");
    expect("state directory", Health::failure, "Not a directory");
    fs::remove_all(root.path("/Library/Logs"));
    expect("log directory", Health::warning, "does not exist");
}

TEST_F(InstallationChecks, MissingSharedFileSystemIsAFailureOfItsFreeSpace) {
    fs::remove_all(root.path("/shared"));
    expect("shared file system", Health::warning, "/shared does not exist");
    expect("free space", Health::failure, "cannot be examined");
}

TEST_F(InstallationChecks, LogsAreThoseThatTheCommandNames) {
    const auto logs = plugin->logs();
    ASSERT_EQ(logs.size(), 6U);
    EXPECT_EQ(logs.front().name, "startup_log");
    EXPECT_EQ(logs.front().path, HostPath("/Library/Logs/lumioserverd/startup.log"));
    EXPECT_EQ(plugin->perform("getLogPaths", {}).dictionary().size(), logs.size());
}

}  // namespace
}  // namespace adminhost
