#include "tests/unit/krb5/Realm.h"

#include "tests/support/CapturedLog.h"

#include <cstdlib>
#include <fstream>
#include <iterator>
#include <optional>

#include <gmock/gmock.h>

namespace lumio {
namespace {

std::unique_ptr<support::Kdc> startRealm() {
    auto kdc = std::make_unique<support::Kdc>();
    const std::string directory = kdc->directory();
    const std::string password = alicePassword;
    kdc->admin("addprinc -pw \"" + password + "\" alice\n" +                      //
               "addprinc -pw \"" + password + "\" +requires_preauth paul\n" +     //
               "addprinc -pw \"" + password + "\" -expire yesterday expired\n" +  //
               "addprinc -pw \"" + password + "\" -pwexpire yesterday oldpw\n" +  //
               "addprinc -pw \"" + password + "\" -allow_tix locked\n" +          //
               "addprinc -pw \"" + password + "\" -maxlife 10seconds short\n" +   //
               "addprinc -randkey robot\naddprinc -randkey host/localhost\naddprinc -randkey nimbo/admin\n" +
               "ktadd -k " + directory + "/client.keytab robot\n" +         //
               "ktadd -k " + directory + "/krb5.keytab host/localhost\n" +  //
               "ktadd -k " + directory + "/krb5.keytab nimbo/admin\n");
    return kdc;
}

std::filesystem::path makeDirectory() {
    std::string pattern = std::filesystem::temp_directory_path() / "krb5test.XXXXXX";
    if (mkdtemp(pattern.data()) == nullptr) {
        throw std::runtime_error("mkdtemp failed");
    }
    return pattern;
}

}  // namespace

namespace {

/// Checks during every test that the layer logs nothing itself: statuses and texts are for its callers.
class SilenceWatch final : public testing::EmptyTestEventListener {
    void OnTestStart(const testing::TestInfo& /*test*/) override { _log.emplace(); }
    void OnTestEnd(const testing::TestInfo& /*test*/) override {
        EXPECT_THAT(_log->lines, testing::IsEmpty());
        _log.reset();
    }

    std::optional<adminhost::test::CapturedLog> _log;
};

const bool watched = (testing::UnitTest::GetInstance()->listeners().Append(new SilenceWatch), true);

}  // namespace

support::Kdc& realm() {
    static const std::unique_ptr<support::Kdc> kdc = startRealm();
    return *kdc;
}

RealmTest::RealmTest()
    : _environment(realm().environment()), _directory(makeDirectory()), _context(KRB5Context::context()) {}

RealmTest::~RealmTest() {
    std::error_code ignored;
    std::filesystem::remove_all(_directory, ignored);
}

std::unique_ptr<KRB5CredentialCache> RealmTest::cacheOf(const KRB5Principal& principal, const std::string& name) const {
    auto cache = KRB5CredentialCache::initWithName(path(name), KRB5CredentialCacheFileType, &principal, _context);
    if (!cache) {
        throw std::runtime_error("cannot open cache " + path(name));
    }
    return cache;
}

std::unique_ptr<KRB5CredentialCache> RealmTest::aliceWithTicket() const {
    auto cache = cacheOf(*principal("alice"));
    cache->acquireInitialCredentialWithPassword(alicePassword);
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    return cache;
}

std::unique_ptr<KRB5Principal> RealmTest::principal(const std::string& text) const {
    return KRB5Principal::initWithString(text, _context);
}

void RealmTest::storeWithEnd(KRB5CredentialCache& cache, const KRB5Credential& credential, krb5_timestamp end) const {
    krb5_context native = _context->nativeContext();
    krb5_creds changed = *credential.nativeCredential();
    changed.times.endtime = end;
    ASSERT_EQ(krb5_cc_initialize(native, cache.nativeCredentialCache(), changed.client), 0);
    ASSERT_EQ(krb5_cc_store_cred(native, cache.nativeCredentialCache(), &changed), 0);
}

adminhost::test::ProgramResult runTool(const std::vector<std::string>& command, std::string_view input) {
    return adminhost::test::runProgram(command, adminhost::test::Errors::merge, input);
}

int openDescriptors() {
    const std::filesystem::directory_iterator all("/proc/self/fd");
    return static_cast<int>(std::distance(begin(all), end(all)));
}

std::string contentsOf(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

void write(const std::string& path, const std::string& bytes) {
    // Create a new file: some file systems wait for the disk when an existing one is overwritten.
    std::filesystem::remove(path);
    std::ofstream file(path, std::ios::binary);
    file << bytes;
    ASSERT_TRUE(file.flush()) << path;
}

}  // namespace lumio
