#include "krb5/KRB5CredentialCache.h"
#include "tests/unit/krb5/Realm.h"

#include <stdexcept>

#include <dlfcn.h>

namespace {

bool resolvesToNothing = false;

}  // namespace

/// Replaces the library's function of that name, to return what the real one never does: success without a handle.
extern "C" krb5_error_code krb5_cc_resolve(krb5_context context, const char* name, krb5_ccache* cache) {
    if (resolvesToNothing) {
        *cache = nullptr;
        return 0;
    }
    return reinterpret_cast<decltype(&krb5_cc_resolve)>(dlsym(RTLD_NEXT, "krb5_cc_resolve"))(context, name, cache);
}

namespace lumio {
namespace {

class ResolvingToNothing {
  public:
    ResolvingToNothing() { resolvesToNothing = true; }
    ResolvingToNothing(const ResolvingToNothing&) = delete;
    ResolvingToNothing& operator=(const ResolvingToNothing&) = delete;
    ~ResolvingToNothing() { resolvesToNothing = false; }
};

using CredentialCache = RealmTest;

TEST_F(CredentialCache, NewFileCacheIsOpenAndBoundToThePrincipal) {
    const auto alice = principal("alice");
    const auto cache =
        KRB5CredentialCache::initWithName(path("cc"), KRB5CredentialCacheFileType, alice.get(), _context);
    ASSERT_NE(cache, nullptr);
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_EQ(cache->name(), path("cc"));
    EXPECT_EQ(cache->type(), "FILE");
    EXPECT_EQ(*cache->principal(), *alice);
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_TRUE(std::filesystem::exists(path("cc")));
}

TEST_F(CredentialCache, OtherPrincipalEmptiesAndRebindsSamePrincipalKeeps) {
    const auto alice = principal("alice");
    static_cast<void>(aliceWithTicket());
    EXPECT_EQ(cacheOf(*alice)->credentials().size(), 1U);
    const auto paul = principal("paul");
    const auto rebound = cacheOf(*paul);
    EXPECT_EQ(*rebound->principal(), *paul);
    EXPECT_TRUE(rebound->credentials().empty());
    EXPECT_EQ(rebound->errorCode(), 0);
    EXPECT_EQ(*cacheOf(*alice)->principal(), *alice);
}

TEST_F(CredentialCache, SetPrincipalEmptiesOnlyForAnother) {
    const auto cache = aliceWithTicket();
    cache->setPrincipal(*principal("alice"));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_EQ(cache->credentials().size(), 1U);
    cache->setPrincipal(*principal("paul"));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(cache->principal()->name(), "paul");
}

TEST_F(CredentialCache, SetPrincipalMakesACacheThatIsMissing) {
    const auto cache = KRB5CredentialCache::initWithName(path("none"), "FILE", nullptr, _context);
    cache->setPrincipal(*principal("alice"));
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_EQ(*cache->principal(), *principal("alice"));
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(cache->errorCode(), 0);
}

TEST_F(CredentialCache, AfterDestroyListsEmptyWithoutError) {
    const auto cache = aliceWithTicket();
    cache->destroy();
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_FALSE(std::filesystem::exists(path("cc")));
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_EQ(cache->name(), path("cc"));
    EXPECT_EQ(cache->type(), "FILE");
}

TEST_F(CredentialCache, DestroyedCacheCanBeUsedAgainAndThenReportsAMissingFile) {
    const auto cache = aliceWithTicket();
    cache->destroy();
    cache->acquireInitialCredentialWithPrincipal(principal("alice").get(), nullptr, alicePassword);
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_EQ(cache->credentials().size(), 1U);
    std::filesystem::remove(path("cc"));
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(cache->errorCode(), KRB5_FCC_NOFILE);
}

TEST_F(CredentialCache, MissingFileIsReportedUnlessDestroyed) {
    const auto cache = KRB5CredentialCache::initWithName(path("none"), "FILE", nullptr, _context);
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(cache->errorCode(), KRB5_FCC_NOFILE);
}

TEST_F(CredentialCache, DestroyedFileCacheWithAColonInItsPathIsNotReopened) {
    // Without a type, the library reads the text before the colon as the type.
    const auto alice = principal("alice");
    const auto cache = cacheOf(*alice, "with:colon");
    cache->destroy();
    EXPECT_FALSE(std::filesystem::exists(path("with:colon")));
    EXPECT_EQ(cache->errorCode(), KRB5_CC_UNKNOWN_TYPE);
    EXPECT_EQ(cache->nativeCredentialCache(), nullptr);
    EXPECT_TRUE(cache->credentials().empty());
}

TEST_F(CredentialCache, ReopeningThatGivesNeitherCacheNorErrorIsAGenericError) {
    const auto cache = aliceWithTicket();
    const ResolvingToNothing nothing;
    cache->destroy();
    EXPECT_EQ(cache->errorCode(), KRB5KRB_ERR_GENERIC);
    EXPECT_EQ(cache->errorCode(), -1765328324);
    EXPECT_EQ(cache->nativeCredentialCache(), nullptr);
    EXPECT_TRUE(cache->credentials().empty());
}

TEST_F(CredentialCache, FailedDestroyLeavesAnObjectThatEveryOperationSurvives) {
    const auto cache = KRB5CredentialCache::initWithName(path("none"), "FILE", nullptr, _context);
    cache->destroy();
    EXPECT_EQ(cache->errorCode(), KRB5_FCC_NOFILE);
    EXPECT_EQ(cache->nativeCredentialCache(), nullptr);
    EXPECT_EQ(cache->name(), std::nullopt);
    EXPECT_EQ(cache->type(), std::nullopt);
    EXPECT_EQ(cache->principal(), nullptr);
    EXPECT_EQ(cache->initialCredential(), nullptr);
    const auto alice = principal("alice");
    cache->setPrincipal(*alice);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(alice.get()));
    EXPECT_FALSE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
    EXPECT_FALSE(cache->acquireInitialCredentialIfNecessaryWithKeytab(nullptr));
    EXPECT_FALSE(cache->acquireInitialCredentialIfNecessaryWithPrincipal(alice.get(), nullptr, alicePassword));
    cache->acquireInitialCredentialWithPassword(alicePassword);
    cache->acquireInitialCredentialWithKeytab(nullptr);
    cache->acquireInitialCredentialWithPrincipal(alice.get(), nullptr, alicePassword);
    EXPECT_TRUE(cache->credentials().empty());
    cache->destroy();
    EXPECT_EQ(cache->errorCode(), KRB5_FCC_NOFILE);
    EXPECT_FALSE(std::filesystem::exists(path("none")));
    _context->setDefaultCredentialCache(cache.get());
    EXPECT_EQ(_context->errorCode(), 0);
}

TEST_F(CredentialCache, TwoCredentialsAreBothListedWithoutError) {
    const auto cache = aliceWithTicket();
    const auto done = runTool({"/usr/bin/kvno", "-c", path("cc"), "host/localhost"});
    ASSERT_EQ(done.status, 0) << done.output;
    EXPECT_EQ(done.output, "host/localhost@NIMBO.TEST: kvno = 2\n");
    const auto credentials = cache->credentials();
    EXPECT_EQ(cache->errorCode(), 0);
    ASSERT_EQ(credentials.size(), 2U);
    EXPECT_EQ(credentials[0].serverPrincipal()->stringValue(), "krbtgt/NIMBO.TEST@NIMBO.TEST");
    EXPECT_EQ(credentials[1].serverPrincipal()->stringValue(), "host/localhost@NIMBO.TEST");
}

TEST_F(CredentialCache, ListingClosesTheFile) {
    const auto cache = aliceWithTicket();
    const int before = openDescriptors();
    EXPECT_EQ(cache->credentials().size(), 1U);
    std::filesystem::resize_file(path("cc"), std::filesystem::file_size(path("cc")) - 20);
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(openDescriptors(), before);
}

TEST_F(CredentialCache, ListingAgreesWithTheLibrarysTool) {
    const auto cache = aliceWithTicket();
    ASSERT_EQ(runTool({"/usr/bin/kvno", "-c", path("cc"), "host/localhost", "nimbo/admin"}).status, 0);
    const support::ScopedEnvironment scoped({{"LC_ALL", "C"}, {"TZ", "Europe/Paris"}});
    const auto theirs = runTool({"/usr/bin/klist", "-c", "FILE:" + path("cc")});
    const auto ours = runTool({KRB5_LIST, "cache", "FILE", path("cc")});
    ASSERT_EQ(theirs.status, 0) << theirs.output;
    EXPECT_EQ(ours.status, 0);
    EXPECT_EQ(ours.output, theirs.output);
    EXPECT_NE(ours.output.find("nimbo/admin@NIMBO.TEST"), std::string::npos);
}

TEST_F(CredentialCache, ListingOfTicketWithoutRenewalAgreesWithTheLibrarysTool) {
    const auto done =
        runTool({"/usr/bin/kinit", "-l", "1h", "-c", path("cc"), "alice"}, alicePassword + std::string("\n"));
    ASSERT_EQ(done.status, 0) << done.output;
    const support::ScopedEnvironment scoped({{"LC_ALL", "C"}, {"TZ", "UTC"}});
    const auto ours = runTool({KRB5_LIST, "cache", "FILE", path("cc")});
    EXPECT_EQ(ours.output, runTool({"/usr/bin/klist", "-c", "FILE:" + path("cc")}).output);
    EXPECT_EQ(ours.output.find("renew until"), std::string::npos) << ours.output;
    EXPECT_NE(ours.output.find("krbtgt/NIMBO.TEST"), std::string::npos) << ours.output;
}

TEST_F(CredentialCache, NeitherNameNorPrincipalThrows) {
    try {
        static_cast<void>(KRB5CredentialCache::initWithName(std::nullopt, "FILE", nullptr, _context));
        FAIL() << "nothing thrown";
    } catch (const std::invalid_argument& error) {
        EXPECT_STREQ(error.what(), "at least one of name and principal must be set");
    }
    EXPECT_THROW(static_cast<void>(KRB5CredentialCache::initWithType(std::nullopt, nullptr, _context)),
                 std::invalid_argument);
}

TEST_F(CredentialCache, NamelessFileCacheIsAFileBelowTheCurrentDirectory) {
    const auto former = std::filesystem::current_path();
    std::filesystem::current_path(_directory);
    const auto alice = principal("alice");
    const auto cache = KRB5CredentialCache::initWithType(KRB5CredentialCacheFileType, alice.get(), _context);
    std::filesystem::current_path(former);
    ASSERT_NE(cache, nullptr);
    EXPECT_EQ(cache->name(), "alice@NIMBO.TEST");
    EXPECT_TRUE(std::filesystem::exists(path("alice@NIMBO.TEST")));
}

TEST_F(CredentialCache, NamelessMemoryCacheIsNamedByThePrincipal) {
    const auto alice = principal("alice");
    const auto cache = KRB5CredentialCache::initWithType(KRB5CredentialCacheMemoryType, alice.get(), _context);
    ASSERT_NE(cache, nullptr);
    EXPECT_EQ(cache->name(), "alice@NIMBO.TEST");
    EXPECT_EQ(cache->type(), "MEMORY");
    cache->acquireInitialCredentialWithPassword(alicePassword);
    EXPECT_EQ(cache->credentials().size(), 1U);
    EXPECT_EQ(cache->errorCode(), 0);
}

TEST_F(CredentialCache, DestroyedMemoryCacheComesBackAsFileCache) {
    const auto alice = principal("alice");
    const auto cache = KRB5CredentialCache::initWithName(path("memory"), "MEMORY", alice.get(), _context);
    ASSERT_NE(cache, nullptr);
    cache->destroy();
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_EQ(cache->type(), "FILE");
    EXPECT_EQ(cache->name(), path("memory"));
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(cache->errorCode(), 0);
}

TEST_F(CredentialCache, SystemServiceTypeIsNotOffered) {
    const auto alice = principal("alice");
    EXPECT_EQ(KRB5CredentialCache::initWithName(std::nullopt, KRB5CredentialCacheAPIType, alice.get(), _context),
              nullptr);
    EXPECT_EQ(KRB5CredentialCache::initWithName("x", KRB5CredentialCacheAPIType, alice.get(), _context), nullptr);
    EXPECT_EQ(KRB5CredentialCache::initWithName("x", KRB5CredentialCacheAPIType, nullptr, _context), nullptr);
    EXPECT_EQ(KRB5CredentialCache::initWithType(std::nullopt, alice.get(), _context), nullptr) << "the default type";
    EXPECT_EQ(KRB5CredentialCache::initWithName("x", "NOSUCHTYPE", nullptr, _context), nullptr);
}

TEST_F(CredentialCache, PrincipalThatCannotBeParsedIsNeverUsed) {
    const auto bad = principal("a@b@c");
    EXPECT_EQ(KRB5CredentialCache::initWithName(path("cc"), "FILE", bad.get(), _context), nullptr);
    EXPECT_EQ(KRB5CredentialCache::initWithType("FILE", bad.get(), _context), nullptr);
    EXPECT_FALSE(std::filesystem::exists(path("cc")));
    const auto cache = aliceWithTicket();
    cache->setPrincipal(*bad);
    EXPECT_EQ(cache->errorCode(), EINVAL);
    cache->acquireInitialCredentialWithPrincipal(bad.get(), nullptr, alicePassword);
    EXPECT_EQ(cache->errorCode(), EINVAL);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(bad.get()));
    EXPECT_EQ(cache->errorCode(), EINVAL);
    EXPECT_EQ(cache->credentials().size(), 1U) << "the ticket is still there";
}

TEST_F(CredentialCache, NameWithNulIsRefusedInsteadOfCut) {
    EXPECT_EQ(KRB5CredentialCache::initWithName(path("cc") + std::string("\0x", 2), "FILE", nullptr, _context),
              nullptr);
}

TEST_F(CredentialCache, NativeCacheIsOpenedOnceMore) {
    const auto cache = aliceWithTicket();
    const auto second = KRB5CredentialCache::initWithNativeCredentialCache(cache->nativeCredentialCache(), _context);
    ASSERT_NE(second, nullptr);
    EXPECT_NE(second->nativeCredentialCache(), cache->nativeCredentialCache());
    EXPECT_EQ(second->name(), path("cc"));
    EXPECT_EQ(second->credentials().size(), 1U);
    EXPECT_EQ(cache->credentials().size(), 1U) << "the handle passed in is still open";
}

TEST_F(CredentialCache, NativeCacheWithoutPrincipalGivesNull) {
    const auto cache = KRB5CredentialCache::initWithName(path("none"), "FILE", nullptr, _context);
    EXPECT_EQ(KRB5CredentialCache::initWithNativeCredentialCache(cache->nativeCredentialCache(), _context), nullptr);
}

TEST_F(CredentialCache, TypesHaveTheLibrarysNames) {
    EXPECT_STREQ(KRB5CredentialCacheAPIType, "API");
    EXPECT_STREQ(KRB5CredentialCacheMemoryType, "MEMORY");
    EXPECT_STREQ(KRB5CredentialCacheFileType, "FILE");
}

}  // namespace
}  // namespace lumio
