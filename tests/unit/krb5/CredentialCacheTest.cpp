#include "krb5/KRB5CredentialCache.h"
#include "platform/value/Text.h"
#include "tests/unit/krb5/Realm.h"

#include <stdexcept>

#include <dlfcn.h>

// Exported by the library for programs that need a clock that stands still, but declared in no public header.
extern "C" krb5_error_code krb5_set_debugging_time(krb5_context, krb5_timestamp, krb5_int32);

namespace {

bool resolvesToNothing = false;

}  // namespace

/// In front of the library's function of that name, to answer what the real one never does: success and no handle.
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

class CredentialCache : public RealmTest {
  protected:
    [[nodiscard]] std::unique_ptr<KRB5CredentialCache> aliceWithTicket() const {
        auto cache = cacheOf(*principal("alice"));
        cache->acquireInitialCredentialWithPassword(alicePassword);
        EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
        return cache;
    }
    /// The cache with a ticket whose record was changed, and nothing else.
    template <class Change>
    [[nodiscard]] std::unique_ptr<KRB5CredentialCache> aliceWithChangedTicket(Change change) const {
        auto cache = aliceWithTicket();
        const auto ticket = cache->initialCredential();
        krb5_creds changed = *ticket->nativeCredential();
        change(changed);
        EXPECT_EQ(krb5_cc_initialize(_context->nativeContext(), cache->nativeCredentialCache(), changed.client), 0);
        EXPECT_EQ(krb5_cc_store_cred(_context->nativeContext(), cache->nativeCredentialCache(), &changed), 0);
        return cache;
    }
    /// A cache whose ticket ends that many seconds from the context's now, which stands still.
    [[nodiscard]] std::unique_ptr<KRB5CredentialCache> aliceWithTicketEndingIn(std::int32_t seconds) const {
        auto cache = aliceWithTicket();
        const auto ticket = cache->initialCredential();
        krb5_timestamp now = 0;
        EXPECT_EQ(krb5_timeofday(_context->nativeContext(), &now), 0);
        EXPECT_EQ(krb5_set_debugging_time(_context->nativeContext(), now, 0), 0);
        storeWithEnd(*cache, *ticket, now + seconds);
        return cache;
    }
};

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

TEST_F(CredentialCache, TicketEndingIn600SecondsIsGoodEnough) {
    const auto cache = aliceWithTicketEndingIn(600);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(principal("alice").get()));
}

TEST_F(CredentialCache, TicketEndingIn599SecondsOrEarlierIsReplaced) {
    for (const std::int32_t seconds : {599, 1, 0, -1, -100000}) {
        const auto cache = aliceWithTicketEndingIn(seconds);
        EXPECT_TRUE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr)) << seconds;
        EXPECT_EQ(cache->errorCode(), 0);
    }
}

TEST_F(CredentialCache, RemainingTimeIsComparedInSigned32Bits) {
    const auto cache = aliceWithTicket();
    const auto ticket = cache->initialCredential();
    storeWithEnd(*cache, *ticket, INT32_MAX);
    ASSERT_EQ(krb5_set_debugging_time(_context->nativeContext(), INT32_MAX - 600, 0), 0);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    // The sum wraps to a negative number, which is not later.
    ASSERT_EQ(krb5_set_debugging_time(_context->nativeContext(), INT32_MAX - 599, 0), 0);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
}

TEST_F(CredentialCache, EmptyCacheNeedsATicketAndHasNoError) {
    const auto cache = cacheOf(*principal("alice"));
    EXPECT_TRUE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_EQ(cache->initialCredential(), nullptr);
    EXPECT_EQ(cache->errorCode(), KRB5_CC_NOTFOUND);
}

TEST_F(CredentialCache, NoFileAndNoPrincipalIsNotNecessary) {
    const auto cache = KRB5CredentialCache::initWithName(path("none"), "FILE", nullptr, _context);
    ASSERT_NE(cache, nullptr);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    EXPECT_EQ(cache->errorCode(), KRB5_FCC_NOFILE);
    EXPECT_FALSE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
    EXPECT_FALSE(std::filesystem::exists(path("none")));
    EXPECT_EQ(cache->initialCredential(), nullptr);
    EXPECT_EQ(cache->principal(), nullptr);
    // Asked for a principal, a cache without a file simply has no ticket of it.
    EXPECT_TRUE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(principal("alice").get()));
    EXPECT_EQ(cache->errorCode(), 0);
}

TEST_F(CredentialCache, TicketOfUnsupportedKeyTypeIsNeitherGoodNorReplaced) {
    const auto cache = aliceWithChangedTicket([](krb5_creds& ticket) { ticket.keyblock.enctype = 9999; });
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    EXPECT_EQ(cache->errorCode(), KRB5_CC_NOT_KTYPE);
    EXPECT_EQ(cache->initialCredential(), nullptr);
}

TEST_F(CredentialCache, OnlyTheTicketGrantingTicketOfTheClientsRealmCounts) {
    for (const char* server : {"host/localhost", "krbtgt/OTHER.TEST@NIMBO.TEST", "krbtgt/NIMBO.TEST@OTHER.TEST",
                               "krbtgt/NIMBO.TEST/more", "krbtgt"}) {
        const auto other = principal(server);
        const auto cache =
            aliceWithChangedTicket([&](krb5_creds& ticket) { ticket.server = other->nativePrincipal(); });
        ASSERT_EQ(cache->credentials().size(), 1U) << server;
        EXPECT_TRUE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr)) << server;
        EXPECT_EQ(cache->errorCode(), 0);
        EXPECT_EQ(cache->initialCredential(), nullptr) << server;
        EXPECT_EQ(cache->errorCode(), KRB5_CC_NOTFOUND);
    }
}

TEST_F(CredentialCache, StartAndRenewalOfATicketPlayNoPart) {
    const auto cache = aliceWithChangedTicket([](krb5_creds& ticket) {
        ticket.times.starttime = ticket.times.endtime - 1;
        ticket.times.renew_till = ticket.times.authtime - 1;
    });
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_NE(cache->initialCredential(), nullptr);
}

TEST_F(CredentialCache, GoodTicketMeansFalseAndNoRequest) {
    const auto cache = aliceWithTicketEndingIn(600);
    const std::string before = contentsOf(path("cc"));
    // With a wrong password any request would fail, and would have emptied the cache.
    EXPECT_FALSE(cache->acquireInitialCredentialIfNecessaryWithPassword("wrong"));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_EQ(contentsOf(path("cc")), before);
}

TEST_F(CredentialCache, EndingTicketIsReplaced) {
    const auto cache = aliceWithTicketEndingIn(599);
    const auto formerEnd = *cache->initialCredential()->endTime();
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_GT(*cache->initialCredential()->endTime(), formerEnd + std::chrono::hours(1));
    EXPECT_EQ(cache->credentials().size(), 1U);
}

TEST_F(CredentialCache, FailedRequestStillAnswersTrueAndLeavesAnEmptyCache) {
    const auto cache = aliceWithTicketEndingIn(599);
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword("wrong"));
    EXPECT_EQ(cache->errorCode(), KRB5KRB_AP_ERR_BAD_INTEGRITY);
    EXPECT_FALSE(cache->errorMessage().empty());
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(cache->principal()->name(), "alice");
}

TEST_F(CredentialCache, AcquiresForwardableProxiableTicketOfDefaultLifetime) {
    const auto cache = aliceWithTicket();
    const auto ticket = cache->initialCredential();
    ASSERT_NE(ticket, nullptr);
    EXPECT_EQ(ticket->clientPrincipal()->stringValue(), "alice@NIMBO.TEST");
    EXPECT_EQ(ticket->serverPrincipal()->stringValue(), "krbtgt/NIMBO.TEST@NIMBO.TEST");
    EXPECT_NE(ticket->nativeCredential()->ticket_flags & TKT_FLG_FORWARDABLE, 0);
    EXPECT_NE(ticket->nativeCredential()->ticket_flags & TKT_FLG_PROXIABLE, 0);
    EXPECT_GT(*ticket->endTime() - *ticket->startTime(), std::chrono::hours(9));
    EXPECT_EQ(*ticket->renewUntil(),
              adminhost::Date(std::chrono::seconds(ticket->nativeCredential()->times.renew_till)));
    EXPECT_EQ(ticket->context(), _context);
}

TEST_F(CredentialCache, AcquiresWithPreauthentication) {
    const auto cache = cacheOf(*principal("paul"));
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_NE(cache->initialCredential(), nullptr);
    EXPECT_TRUE(cache->credentials().size() == 1 && cache->errorCode() == 0);
}

TEST_F(CredentialCache, RefusalsKeepTheLibrarysStatus) {
    const struct {
        const char* client;
        std::string password;
        std::int64_t status;
    } cases[] = {{"alice", "wrong", -1765328353},
                 {"paul", "wrong", -1765328360},
                 {"nobody", alicePassword, KRB5KDC_ERR_C_PRINCIPAL_UNKNOWN},
                 {"expired", alicePassword, KRB5KDC_ERR_NAME_EXP},
                 {"oldpw", alicePassword, KRB5KDC_ERR_KEY_EXP},
                 {"locked", alicePassword, KRB5KDC_ERR_CLIENT_REVOKED},
                 {"alice@NOWHERE.TEST", alicePassword, KRB5_REALM_UNKNOWN}};
    for (const auto& refusal : cases) {
        const auto cache = cacheOf(*principal(refusal.client));
        EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword(refusal.password)) << refusal.client;
        EXPECT_EQ(cache->errorCode(), refusal.status) << refusal.client << ": " << cache->errorMessage();
        EXPECT_FALSE(cache->errorMessage().empty());
        EXPECT_TRUE(cache->credentials().empty());
        EXPECT_EQ(cache->errorCode(), 0);
    }
}

TEST_F(CredentialCache, EmptyPasswordFailsWithoutPrompting) {
    const auto cache = cacheOf(*principal("alice"));
    cache->acquireInitialCredentialWithPassword("");
    EXPECT_NE(cache->errorCode(), 0);
    EXPECT_TRUE(cache->credentials().empty());
}

TEST_F(CredentialCache, PasswordWithNulIsRefusedInsteadOfCut) {
    const auto cache = cacheOf(*principal("alice"));
    cache->acquireInitialCredentialWithPassword(alicePassword + std::string("\0x", 2));
    EXPECT_EQ(cache->errorCode(), EINVAL);
    EXPECT_TRUE(cache->credentials().empty());
}

TEST_F(CredentialCache, ShortTicketIsReplacedEveryTime) {
    const auto cache = cacheOf(*principal("short"));
    for (int round = 0; round < 2; ++round) {
        EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
        ASSERT_EQ(cache->errorCode(), 0) << cache->errorMessage();
        const auto ticket = cache->initialCredential();
        EXPECT_EQ(*ticket->endTime() - *ticket->startTime(), std::chrono::seconds(10));
    }
}

TEST_F(CredentialCache, AcquiresWithKeytabOnlyIfNecessary) {
    const auto keytab =
        KRB5Keytab::initWithName((realm().directory() / "client.keytab").string(), std::nullopt, _context);
    const auto cache = cacheOf(*principal("robot"));
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithKeytab(keytab.get()));
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_EQ(cache->initialCredential()->clientPrincipal()->name(), "robot");
    EXPECT_FALSE(cache->acquireInitialCredentialIfNecessaryWithKeytab(keytab.get()));
    cache->acquireInitialCredentialWithKeytab(keytab.get());
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
}

TEST_F(CredentialCache, NeitherKeytabNorPasswordMeansTheDefaultKeytab) {
    const auto cache = cacheOf(*principal("host/localhost"));
    cache->acquireInitialCredentialWithPrincipal(nullptr, nullptr, std::nullopt);
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_EQ(cache->credentials().size(), 1U);
}

TEST_F(CredentialCache, KeytabThatCouldNotBeOpenedMeansTheDefaultKeytab) {
    const auto broken = KRB5Keytab::initWithName(path("kt"), "NOSUCHTYPE", _context);
    ASSERT_EQ(broken->nativeKeytab(), nullptr);
    const auto cache = cacheOf(*principal("host/localhost"));
    cache->acquireInitialCredentialWithKeytab(broken.get());
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_EQ(cache->credentials().size(), 1U);
}

TEST_F(CredentialCache, PasswordWinsOverKeytab) {
    const auto keytab =
        KRB5Keytab::initWithName((realm().directory() / "client.keytab").string(), std::nullopt, _context);
    const auto cache = cacheOf(*principal("alice"));
    cache->acquireInitialCredentialWithPrincipal(nullptr, keytab.get(), alicePassword);
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
}

TEST_F(CredentialCache, KeytabWithoutTheClientsKeyFails) {
    const auto keytab = KRB5Keytab::initWithName(path("missing"), std::nullopt, _context);
    const auto cache = cacheOf(*principal("robot"));
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithKeytab(keytab.get()));
    EXPECT_EQ(cache->errorCode(), ENOENT);
}

TEST_F(CredentialCache, AcquiringForAnotherPrincipalRebindsTheCache) {
    const auto cache = aliceWithTicket();
    const auto paul = principal("paul");
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPrincipal(paul.get(), nullptr, alicePassword));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_EQ(*cache->principal(), *paul);
    EXPECT_EQ(cache->credentials().size(), 1U);
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
    // Without the type in front, the library takes what stands before the colon for one.
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

TEST_F(CredentialCache, CredentialDescribesItself) {
    const auto ticket = aliceWithTicket()->initialCredential();
    krb5_creds changed = *ticket->nativeCredential();
    changed.times = {1700000000, 0, 1700000600, 0};
    const auto copy = KRB5Credential::initWithNativeCredential(&changed, _context);
    EXPECT_EQ(copy->startTime(), adminhost::Date(std::chrono::seconds(1700000000))) << "the authentication time";
    EXPECT_EQ(copy->description(),
              "client='alice@NIMBO.TEST' server='krbtgt/NIMBO.TEST@NIMBO.TEST' start='2023-11-14 22:13:20 +0000' "
              "end='2023-11-14 22:23:20 +0000' renew='1970-01-01 00:00:00 +0000'");
    changed.times.starttime = 1700000001;
    EXPECT_EQ(KRB5Credential::initWithNativeCredential(&changed, _context)->startTime(),
              adminhost::Date(std::chrono::seconds(1700000001)));
}

TEST_F(CredentialCache, CredentialWithoutRecordAnswersNull) {
    const krb5_creds nobodys{};
    for (const krb5_creds* native : {static_cast<const krb5_creds*>(nullptr), &nobodys}) {
        const auto empty = KRB5Credential::initWithNativeCredential(native, _context);
        ASSERT_NE(empty, nullptr);
        EXPECT_EQ(empty->nativeCredential(), nullptr);
        EXPECT_EQ(empty->clientPrincipal(), nullptr);
        EXPECT_EQ(empty->serverPrincipal(), nullptr);
        EXPECT_EQ(empty->startTime(), std::nullopt);
        EXPECT_EQ(empty->endTime(), std::nullopt);
        EXPECT_EQ(empty->renewUntil(), std::nullopt);
        EXPECT_EQ(empty->description(), "client='(null)' server='(null)' start='(null)' end='(null)' renew='(null)'");
    }
}

TEST_F(CredentialCache, CredentialWithoutOneOfItsPrincipalsIsNotCopied) {
    const auto ticket = aliceWithTicket()->initialCredential();
    krb5_creds changed = *ticket->nativeCredential();
    changed.client = nullptr;
    EXPECT_EQ(KRB5Credential::initWithNativeCredential(&changed, _context)->nativeCredential(), nullptr);
    changed = *ticket->nativeCredential();
    changed.server = nullptr;
    EXPECT_EQ(KRB5Credential::initWithNativeCredential(&changed, _context)->nativeCredential(), nullptr);
}

TEST_F(CredentialCache, TypesHaveTheLibrarysNames) {
    EXPECT_STREQ(KRB5CredentialCacheAPIType, "API");
    EXPECT_STREQ(KRB5CredentialCacheMemoryType, "MEMORY");
    EXPECT_STREQ(KRB5CredentialCacheFileType, "FILE");
}

}  // namespace
}  // namespace lumio
