#include "krb5/KRB5CredentialCache.h"
#include "tests/unit/krb5/Realm.h"

// Exported by the library for programs that need a fixed time, but not declared in a public header.
extern "C" krb5_error_code krb5_set_debugging_time(krb5_context, krb5_timestamp, krb5_int32);

namespace lumio {
namespace {

class Acquiring : public RealmTest {
  protected:
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
    /// A cache whose ticket ends that many seconds after the context's time, which is fixed.
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

TEST_F(Acquiring, TicketEndingIn600SecondsIsGoodEnough) {
    const auto cache = aliceWithTicketEndingIn(600);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(principal("alice").get()));
}

TEST_F(Acquiring, TicketEndingIn599SecondsOrEarlierIsReplaced) {
    for (const std::int32_t seconds : {599, 1, 0, -1, -100000}) {
        const auto cache = aliceWithTicketEndingIn(seconds);
        EXPECT_TRUE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr)) << seconds;
        EXPECT_EQ(cache->errorCode(), 0);
    }
}

TEST_F(Acquiring, RemainingTimeIsComparedInSigned32Bits) {
    const auto cache = aliceWithTicket();
    const auto ticket = cache->initialCredential();
    storeWithEnd(*cache, *ticket, INT32_MAX);
    ASSERT_EQ(krb5_set_debugging_time(_context->nativeContext(), INT32_MAX - 600, 0), 0);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    // The sum overflows to a negative number, which is not later.
    ASSERT_EQ(krb5_set_debugging_time(_context->nativeContext(), INT32_MAX - 599, 0), 0);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
}

TEST_F(Acquiring, EmptyCacheNeedsATicketAndHasNoError) {
    const auto cache = cacheOf(*principal("alice"));
    EXPECT_TRUE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_EQ(cache->initialCredential(), nullptr);
    EXPECT_EQ(cache->errorCode(), KRB5_CC_NOTFOUND);
}

TEST_F(Acquiring, NoFileAndNoPrincipalIsNotNecessary) {
    const auto cache = KRB5CredentialCache::initWithName(path("none"), "FILE", nullptr, _context);
    ASSERT_NE(cache, nullptr);
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    EXPECT_EQ(cache->errorCode(), KRB5_FCC_NOFILE);
    EXPECT_FALSE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
    EXPECT_FALSE(std::filesystem::exists(path("none")));
    EXPECT_EQ(cache->initialCredential(), nullptr);
    EXPECT_EQ(cache->principal(), nullptr);
    // For a named principal, a cache without a file has no ticket, which is not an error.
    EXPECT_TRUE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(principal("alice").get()));
    EXPECT_EQ(cache->errorCode(), 0);
}

TEST_F(Acquiring, TicketOfUnsupportedKeyTypeIsNeitherGoodNorReplaced) {
    const auto cache = aliceWithChangedTicket([](krb5_creds& ticket) { ticket.keyblock.enctype = 9999; });
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    EXPECT_EQ(cache->errorCode(), KRB5_CC_NOT_KTYPE);
    EXPECT_EQ(cache->initialCredential(), nullptr);
}

TEST_F(Acquiring, OnlyTheTicketGrantingTicketOfTheClientsRealmCounts) {
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

TEST_F(Acquiring, StartAndRenewalOfATicketPlayNoPart) {
    const auto cache = aliceWithChangedTicket([](krb5_creds& ticket) {
        ticket.times.starttime = ticket.times.endtime - 1;
        ticket.times.renew_till = ticket.times.authtime - 1;
    });
    EXPECT_FALSE(cache->initialCredentialAcquisitionIsNecessaryForPrincipal(nullptr));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_NE(cache->initialCredential(), nullptr);
}

TEST_F(Acquiring, GoodTicketMeansFalseAndNoRequest) {
    const auto cache = aliceWithTicketEndingIn(600);
    const std::string before = contentsOf(path("cc"));
    // With a wrong password any request would fail, and would have emptied the cache.
    EXPECT_FALSE(cache->acquireInitialCredentialIfNecessaryWithPassword("wrong"));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_EQ(contentsOf(path("cc")), before);
}

TEST_F(Acquiring, EndingTicketIsReplaced) {
    const auto cache = aliceWithTicketEndingIn(599);
    const auto formerEnd = *cache->initialCredential()->endTime();
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_GT(*cache->initialCredential()->endTime(), formerEnd + std::chrono::hours(1));
    EXPECT_EQ(cache->credentials().size(), 1U);
}

TEST_F(Acquiring, FailedRequestStillAnswersTrueAndLeavesAnEmptyCache) {
    const auto cache = aliceWithTicketEndingIn(599);
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword("wrong"));
    EXPECT_EQ(cache->errorCode(), KRB5KRB_AP_ERR_BAD_INTEGRITY);
    EXPECT_FALSE(cache->errorMessage().empty());
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(cache->principal()->name(), "alice");
}

TEST_F(Acquiring, AcquiresForwardableProxiableTicketOfDefaultLifetime) {
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

TEST_F(Acquiring, AcquiresWithPreauthentication) {
    const auto cache = cacheOf(*principal("paul"));
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_NE(cache->initialCredential(), nullptr);
    EXPECT_TRUE(cache->credentials().size() == 1 && cache->errorCode() == 0);
}

TEST_F(Acquiring, RefusalsKeepTheLibrarysStatus) {
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

TEST_F(Acquiring, EmptyPasswordFailsWithoutPrompting) {
    const auto cache = cacheOf(*principal("alice"));
    cache->acquireInitialCredentialWithPassword("");
    EXPECT_NE(cache->errorCode(), 0);
    EXPECT_TRUE(cache->credentials().empty());
}

TEST_F(Acquiring, PasswordWithNulIsRefusedInsteadOfCut) {
    const auto cache = cacheOf(*principal("alice"));
    cache->acquireInitialCredentialWithPassword(alicePassword + std::string("\0x", 2));
    EXPECT_EQ(cache->errorCode(), EINVAL);
    EXPECT_TRUE(cache->credentials().empty());
}

TEST_F(Acquiring, ShortTicketIsReplacedEveryTime) {
    const auto cache = cacheOf(*principal("short"));
    for (int round = 0; round < 2; ++round) {
        EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPassword(alicePassword));
        ASSERT_EQ(cache->errorCode(), 0) << cache->errorMessage();
        const auto ticket = cache->initialCredential();
        EXPECT_EQ(*ticket->endTime() - *ticket->startTime(), std::chrono::seconds(10));
    }
}

TEST_F(Acquiring, AcquiresWithKeytabOnlyIfNecessary) {
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

TEST_F(Acquiring, NeitherKeytabNorPasswordMeansTheDefaultKeytab) {
    const auto cache = cacheOf(*principal("host/localhost"));
    cache->acquireInitialCredentialWithPrincipal(nullptr, nullptr, std::nullopt);
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_EQ(cache->credentials().size(), 1U);
}

TEST_F(Acquiring, KeytabThatCouldNotBeOpenedMeansTheDefaultKeytab) {
    const auto broken = KRB5Keytab::initWithName(path("kt"), "NOSUCHTYPE", _context);
    ASSERT_EQ(broken->nativeKeytab(), nullptr);
    const auto cache = cacheOf(*principal("host/localhost"));
    cache->acquireInitialCredentialWithKeytab(broken.get());
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    EXPECT_EQ(cache->credentials().size(), 1U);
}

TEST_F(Acquiring, PasswordWinsOverKeytab) {
    const auto keytab =
        KRB5Keytab::initWithName((realm().directory() / "client.keytab").string(), std::nullopt, _context);
    const auto cache = cacheOf(*principal("alice"));
    cache->acquireInitialCredentialWithPrincipal(nullptr, keytab.get(), alicePassword);
    EXPECT_EQ(cache->errorCode(), 0) << cache->errorMessage();
}

TEST_F(Acquiring, KeytabWithoutTheClientsKeyFails) {
    const auto keytab = KRB5Keytab::initWithName(path("missing"), std::nullopt, _context);
    const auto cache = cacheOf(*principal("robot"));
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithKeytab(keytab.get()));
    EXPECT_EQ(cache->errorCode(), ENOENT);
}

TEST_F(Acquiring, FailedKeytabRequestEmptiesTheCache) {
    const auto cache = aliceWithTicketEndingIn(599);
    const auto keytab =
        KRB5Keytab::initWithName((realm().directory() / "client.keytab").string(), std::nullopt, _context);
    ASSERT_EQ(cache->credentials().size(), 1U);
    cache->acquireInitialCredentialWithKeytab(keytab.get());
    EXPECT_EQ(cache->errorCode(), KRB5_KT_NOTFOUND) << cache->errorMessage();
    EXPECT_TRUE(cache->credentials().empty());
    EXPECT_EQ(cache->principal()->name(), "alice");
}

TEST_F(Acquiring, AcquiringForAnotherPrincipalRebindsTheCache) {
    const auto cache = aliceWithTicket();
    const auto paul = principal("paul");
    EXPECT_TRUE(cache->acquireInitialCredentialIfNecessaryWithPrincipal(paul.get(), nullptr, alicePassword));
    EXPECT_EQ(cache->errorCode(), 0);
    EXPECT_EQ(*cache->principal(), *paul);
    EXPECT_EQ(cache->credentials().size(), 1U);
}

}  // namespace
}  // namespace lumio
