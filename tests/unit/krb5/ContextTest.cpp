#include "krb5/KRB5Context.h"
#include "krb5/KRB5CredentialCache.h"
#include "krb5/KRB5Keytab.h"
#include "tests/unit/krb5/Realm.h"

#include <gssapi/gssapi_krb5.h>

namespace lumio {
namespace {

class Context : public RealmTest {};

TEST_F(Context, NewContextHasHandleAndSuccess) {
    const auto context = KRB5Context::init();
    ASSERT_NE(context, nullptr);
    EXPECT_NE(context->nativeContext(), nullptr);
    EXPECT_EQ(context->errorCode(), 0);
    EXPECT_EQ(context->errorMessage(), "Success");
    EXPECT_NE(context, KRB5Context::context());
}

TEST_F(Context, DefaultContextIsOneForTheProcess) {
    const auto context = KRB5Context::defaultContext();
    ASSERT_NE(context, nullptr);
    EXPECT_EQ(context, KRB5Context::defaultContext());
    EXPECT_NE(context, KRB5Context::context());
}

TEST_F(Context, MalformedConfigurationGivesContextWithErrorCodeThatEveryObjectSurvives) {
    write(path("bad.conf"), "[libdefaults\n default_realm = {\n");
    const support::ScopedEnvironment bad({{"KRB5_CONFIG", path("bad.conf")}});
    const auto context = KRB5Context::init();
    ASSERT_NE(context, nullptr);
    EXPECT_EQ(context->nativeContext(), nullptr);
    EXPECT_EQ(context->errorCode(), KRB5_CONFIG_BADFORMAT);
    EXPECT_FALSE(context->errorMessage().empty());
    EXPECT_EQ(context->defaultRealm(), std::nullopt);
    EXPECT_EQ(context->defaultKeytab(), nullptr);
    EXPECT_EQ(context->defaultCredentialCache(), nullptr);
    context->setDefaultRealm("OTHER.TEST");
    context->setDefaultCredentialCache(nullptr);
    EXPECT_EQ(context->errorCode(), KRB5_CONFIG_BADFORMAT);

    const auto broken = KRB5Principal::initWithString("alice", context);
    ASSERT_NE(broken, nullptr);
    EXPECT_EQ(broken->errorCode(), KRB5_CONFIG_BADFORMAT);
    EXPECT_EQ(broken->stringValue(), std::nullopt);
    const auto keytab = KRB5Keytab::initWithName(path("kt"), std::nullopt, context);
    ASSERT_NE(keytab, nullptr);
    EXPECT_EQ(keytab->errorCode(), KRB5_CONFIG_BADFORMAT);
    EXPECT_TRUE(keytab->entries().empty());
    EXPECT_EQ(KRB5CredentialCache::initWithName(path("cc"), "FILE", nullptr, context), nullptr);
    EXPECT_EQ(KRB5CredentialCache::initWithNativeCredentialCache(nullptr, context), nullptr);
    EXPECT_EQ(KRB5KeytabEntry::initWithNativeKeytabEntry({}, context), nullptr);
    EXPECT_EQ(KRB5Credential::initWithNativeCredential(nullptr, context)->nativeCredential(), nullptr);
}

TEST_F(Context, ObjectsSurviveAMissingContext) {
    EXPECT_EQ(KRB5Principal::initWithString("alice", nullptr)->errorCode(), EINVAL);
    EXPECT_FALSE(KRB5Principal::initWithString("alice", nullptr)->errorMessage().empty());
    EXPECT_EQ(KRB5Keytab::initWithName(path("kt"), std::nullopt, nullptr)->errorCode(), EINVAL);
    EXPECT_EQ(KRB5CredentialCache::initWithName(path("cc"), "FILE", nullptr, nullptr), nullptr);
    EXPECT_EQ(KRB5CredentialCache::initWithNativeCredentialCache(nullptr, nullptr), nullptr);
    EXPECT_EQ(KRB5Principal::initWithNativePrincipal(principal("alice")->nativePrincipal(), nullptr), nullptr);
}

TEST_F(Context, ObjectsKeepTheirContextAlive) {
    auto context = KRB5Context::context();
    const std::weak_ptr<KRB5Context> watched = context;
    auto alice = KRB5Principal::initWithString("alice", context);
    context.reset();
    EXPECT_FALSE(watched.expired());
    EXPECT_EQ(alice->stringValue(), "alice@NIMBO.TEST");
    alice.reset();
    EXPECT_TRUE(watched.expired());
}

TEST_F(Context, DefaultRealmIsTheConfiguredOneUntilSet) {
    EXPECT_EQ(_context->defaultRealm(), "NIMBO.TEST");
    EXPECT_EQ(_context->errorCode(), 0);
    _context->setDefaultRealm("OTHER.TEST");
    EXPECT_EQ(_context->errorCode(), 0);
    EXPECT_EQ(_context->defaultRealm(), "OTHER.TEST");
    EXPECT_EQ(principal("alice")->realm(), "OTHER.TEST");
}

TEST_F(Context, DefaultRealmWithNulInsideIsRefused) {
    _context->setDefaultRealm(std::string("EVIL\0.TEST", 10));
    EXPECT_EQ(_context->errorCode(), EINVAL);
    EXPECT_EQ(_context->defaultRealm(), "NIMBO.TEST");
}

TEST_F(Context, UnconfiguredRealmIsNullWithTheLibrarysMessage) {
    write(path("empty.conf"), "[libdefaults]\n dns_lookup_realm = false\n");
    const support::ScopedEnvironment scoped({{"KRB5_CONFIG", path("empty.conf")}});
    const auto context = KRB5Context::context();
    EXPECT_EQ(context->defaultRealm(), std::nullopt);
    EXPECT_EQ(context->errorCode(), KRB5_CONFIG_NODEFREALM);
    EXPECT_NE(context->errorMessage().find("default realm"), std::string::npos) << context->errorMessage();
}

TEST_F(Context, DefaultKeytabIsTheOneOfTheEnvironment) {
    const auto keytab = _context->defaultKeytab();
    ASSERT_NE(keytab, nullptr);
    EXPECT_EQ(keytab->name(), (realm().directory() / "krb5.keytab").string());
    EXPECT_EQ(keytab->context(), _context);
}

TEST_F(Context, SetDefaultKeytabWithNullRemovesTheVariable) {
    ASSERT_NE(std::getenv("KRB5_KTNAME"), nullptr);
    _context->setDefaultKeytab(nullptr);
    EXPECT_EQ(std::getenv("KRB5_KTNAME"), nullptr);
}

TEST_F(Context, SetDefaultKeytabWithFileKeytabSetsTypeAndPath) {
    const auto keytab = KRB5Keytab::initWithName(path("kt"), std::nullopt, _context);
    _context->setDefaultKeytab(keytab.get());
    EXPECT_EQ(std::getenv("KRB5_KTNAME"), "FILE:" + path("kt"));
    EXPECT_EQ(_context->defaultKeytab()->name(), path("kt"));
}

TEST_F(Context, DefaultCacheIsNullUntilItHoldsAPrincipal) {
    const support::ScopedEnvironment scoped({{"KRB5CCNAME", "FILE:" + path("default")}});
    const auto context = KRB5Context::context();
    EXPECT_EQ(context->defaultCredentialCache(), nullptr);
    const auto alice = principal("alice");
    ASSERT_NE(cacheOf(*alice, "default"), nullptr);
    const auto cache = context->defaultCredentialCache();
    ASSERT_NE(cache, nullptr);
    EXPECT_EQ(cache->name(), path("default"));
    EXPECT_EQ(*cache->principal(), *alice);
}

TEST_F(Context, SetDefaultCredentialCacheTakesTheBareName) {
    const auto cache = cacheOf(*principal("alice"));
    _context->setDefaultRealm(std::string(1, '\0'));
    ASSERT_NE(_context->errorCode(), 0);
    _context->setDefaultCredentialCache(cache.get());
    EXPECT_EQ(_context->errorCode(), 0);
    EXPECT_EQ(std::string(krb5_cc_default_name(_context->nativeContext())), path("cc"));
    EXPECT_EQ(_context->defaultCredentialCache()->name(), path("cc"));
    _context->setDefaultCredentialCache(nullptr);
    EXPECT_EQ(std::string(krb5_cc_default_name(_context->nativeContext())),
              "FILE:" + (realm().directory() / "cc").string());
}

TEST_F(Context, SetDefaultGssCacheMakesGssApiUseIt) {
    const auto cache = cacheOf(*principal("alice"));
    cache->acquireInitialCredentialWithPassword(alicePassword);
    ASSERT_EQ(cache->errorCode(), 0) << cache->errorMessage();
    ASSERT_EQ(KRB5Context::setDefaultGSSCredentialCache(cache.get()), static_cast<std::uint32_t>(GSS_S_COMPLETE));
    OM_uint32 minor = 0;
    gss_cred_id_t credential = GSS_C_NO_CREDENTIAL;
    ASSERT_EQ(gss_acquire_cred(&minor, GSS_C_NO_NAME, GSS_C_INDEFINITE, GSS_C_NO_OID_SET, GSS_C_INITIATE, &credential,
                               nullptr, nullptr),
              static_cast<OM_uint32>(GSS_S_COMPLETE));
    gss_name_t name = GSS_C_NO_NAME;
    EXPECT_EQ(gss_inquire_cred(&minor, credential, &name, nullptr, nullptr, nullptr), 0U);
    gss_buffer_desc text = GSS_C_EMPTY_BUFFER;
    EXPECT_EQ(gss_display_name(&minor, name, &text, nullptr), 0U);
    EXPECT_EQ(std::string(static_cast<const char*>(text.value), text.length), "alice@NIMBO.TEST");
    gss_release_buffer(&minor, &text);
    gss_release_name(&minor, &name);
    gss_release_cred(&minor, &credential);

    const char* bareName = nullptr;
    EXPECT_EQ(KRB5Context::setDefaultGSSCredentialCache(cache.get()), 0U);
    EXPECT_EQ(gss_krb5_ccache_name(&minor, nullptr, &bareName), 0U);
    EXPECT_EQ(std::string(bareName), path("cc"));
    EXPECT_EQ(KRB5Context::setDefaultGSSCredentialCache(nullptr), 0U);
}

}  // namespace
}  // namespace lumio
