#include "krb5/KRB5Principal.h"
#include "tests/unit/krb5/Realm.h"

#include <optional>
#include <string>
#include <type_traits>
#include <unordered_set>
#include <vector>

namespace lumio {
namespace {

class Principal : public RealmTest {};

template <class T>
concept ComparableWithPrincipal = requires(const KRB5Principal& principal, const T& other) {
    principal == other;
};

TEST_F(Principal, NeverEqualsATextBecauseTheTwoCannotBeCompared) {
    EXPECT_TRUE(ComparableWithPrincipal<KRB5Principal>);
    EXPECT_FALSE(ComparableWithPrincipal<std::string>);
    EXPECT_FALSE(ComparableWithPrincipal<std::optional<std::string>>);
    EXPECT_FALSE(ComparableWithPrincipal<const char*>);
}

TEST_F(Principal, IsMovedAndNeverCopied) {
    EXPECT_FALSE(std::is_copy_constructible_v<KRB5Principal>);
    EXPECT_FALSE(std::is_copy_assignable_v<KRB5Principal>);
    EXPECT_TRUE(std::is_nothrow_move_constructible_v<KRB5Principal>);
}

TEST_F(Principal, TwoComponentsAreNameAndInstance) {
    const auto host = principal("host/server.example@OTHER.TEST");
    EXPECT_EQ(host->errorCode(), 0);
    EXPECT_EQ(host->name(), "host");
    EXPECT_EQ(host->instance(), "server.example");
    EXPECT_EQ(host->realm(), "OTHER.TEST");
    EXPECT_TRUE(host->isHostPrincipal());
    EXPECT_FALSE(host->isClientPrincipal());

    const auto service = principal("hosts/server.example@OTHER.TEST");
    EXPECT_FALSE(service->isHostPrincipal());
    EXPECT_FALSE(service->isClientPrincipal());
}

TEST_F(Principal, OneComponentIsAClient) {
    const auto alice = principal("alice@OTHER.TEST");
    EXPECT_EQ(alice->name(), "alice");
    EXPECT_EQ(alice->instance(), std::nullopt);
    EXPECT_TRUE(alice->isClientPrincipal());
    EXPECT_FALSE(principal("host@OTHER.TEST")->isHostPrincipal());
}

TEST_F(Principal, ComponentsBeyondTheSecondAreNotExposed) {
    const auto deep = principal("a/b/c/d@R");
    EXPECT_EQ(deep->name(), "a");
    EXPECT_EQ(deep->instance(), "b");
    EXPECT_EQ(deep->stringValue(), "a/b/c/d@R");
}

TEST_F(Principal, MissingRealmIsTheDefaultRealm) {
    EXPECT_EQ(principal("alice")->stringValue(), "alice@NIMBO.TEST");
}

TEST_F(Principal, EmptyRealmIsNull) {
    const auto referral = principal("alice@");
    EXPECT_EQ(referral->errorCode(), 0);
    EXPECT_EQ(referral->realm(), std::nullopt);
    EXPECT_EQ(referral->name(), "alice");
}

TEST_F(Principal, EqualAcrossContextsWithEqualHashes) {
    const auto one = KRB5Principal::initWithString("host/a@R");
    const auto two = KRB5Principal::initWithString("host/a@R");
    ASSERT_NE(one->context(), two->context());
    EXPECT_NE(one->context(), KRB5Context::defaultContext());
    EXPECT_TRUE(*one == *two);
    EXPECT_EQ(std::hash<KRB5Principal>{}(*one), std::hash<KRB5Principal>{}(*two));
    EXPECT_FALSE(*one == *KRB5Principal::initWithString("host/b@R"));
}

TEST_F(Principal, StandsInHashedContainers) {
    std::unordered_set<KRB5Principal> set;
    set.insert(std::move(*principal("alice")));
    set.insert(std::move(*principal("alice@NIMBO.TEST")));
    set.insert(std::move(*principal("bob")));
    EXPECT_EQ(set.size(), 2U);
    EXPECT_TRUE(set.contains(*KRB5Principal::initWithString("bob")));
}

TEST_F(Principal, TextThatCannotBeParsedGivesObjectWithErrorCode) {
    for (const char* text : {"a@b@c", "a\\", "alice@R/X", "a@R@"}) {
        const auto bad = principal(text);
        ASSERT_NE(bad, nullptr) << text;
        EXPECT_EQ(bad->errorCode(), KRB5_PARSE_MALFORMED) << text;
        EXPECT_FALSE(bad->errorMessage().empty());
        EXPECT_EQ(bad->nativePrincipal(), nullptr);
        EXPECT_EQ(bad->stringValue(), std::nullopt);
        EXPECT_EQ(bad->description(), std::nullopt);
        EXPECT_EQ(bad->realm(), std::nullopt);
        EXPECT_EQ(bad->name(), std::nullopt);
        EXPECT_EQ(bad->instance(), std::nullopt);
        EXPECT_FALSE(bad->isHostPrincipal());
        EXPECT_TRUE(bad->isClientPrincipal());
        EXPECT_EQ(bad->errorCode(), KRB5_PARSE_MALFORMED) << "reading leaves it alone";
    }
}

TEST_F(Principal, WithoutTextEqualsOnlyItself) {
    const auto one = principal("a@b@c");
    EXPECT_TRUE(*one == *one);
    EXPECT_FALSE(*one == *principal("a@b@c"));
    EXPECT_FALSE(*one == *principal("alice"));
}

TEST_F(Principal, TextWithNulIsRefusedInsteadOfCut) {
    const auto bad = principal(std::string("alice\0@R", 8));
    EXPECT_EQ(bad->errorCode(), EINVAL);
    EXPECT_EQ(bad->stringValue(), std::nullopt);
}

TEST_F(Principal, TextThatIsNotUtf8HasNoText) {
    const auto latin = principal("ren\xe9@R");
    EXPECT_NE(latin->nativePrincipal(), nullptr);
    EXPECT_EQ(latin->stringValue(), std::nullopt);
    EXPECT_EQ(latin->name(), std::nullopt);
    EXPECT_EQ(latin->realm(), "R");
    EXPECT_EQ(KRB5Principal::initWithNativePrincipal(latin->nativePrincipal(), _context), nullptr);
}

TEST_F(Principal, UnparsesAsTheLibraryDoesAndRoundTrips) {
    const std::vector<std::string> texts = {"alice@R",
                                            "alice",
                                            "",
                                            "@",
                                            "@R",
                                            "/@R",
                                            "a/@R",
                                            "/a@R",
                                            "a//b@R",
                                            "a/b/c/d/e/f/g/h/i/j@R",
                                            R"(a\/b@R)",
                                            R"(a\@b@R)",
                                            R"(a\\b@R)",
                                            R"(a\nb\tc\bd@R)",
                                            R"(a\0b@R)",
                                            R"(a@R\@S)",
                                            R"(a@R\/S)",
                                            R"(a@R\\S)",
                                            R"(a@"quoted realm")",
                                            R"(a@R S)",
                                            "a b@R",
                                            R"(\a@R)",
                                            "host/server.example@EXAMPLE.TEST",
                                            "élise/管理@RÉALM",
                                            "a@R.with.many.dots-and_others",
                                            R"(a@\0)",
                                            "a\nb@R",
                                            "a/b\\/c/d@R"};
    for (const std::string& text : texts) {
        krb5_principal native = nullptr;
        ASSERT_EQ(krb5_parse_name(_context->nativeContext(), text.c_str(), &native), 0) << text;
        char* unparsed = nullptr;
        ASSERT_EQ(krb5_unparse_name(_context->nativeContext(), native, &unparsed), 0);
        const auto parsed = principal(text);
        EXPECT_EQ(parsed->stringValue(), std::string(unparsed)) << text;
        const auto again = principal(*parsed->stringValue());
        EXPECT_EQ(again->stringValue(), parsed->stringValue()) << text;
        EXPECT_TRUE(krb5_principal_compare(_context->nativeContext(), native, again->nativePrincipal())) << text;
        const auto copied = KRB5Principal::principalWithNativePrincipal(native, _context);
        ASSERT_NE(copied, nullptr) << text;
        EXPECT_EQ(*copied, *parsed);
        EXPECT_NE(copied->nativePrincipal(), native);
        krb5_free_unparsed_name(_context->nativeContext(), unparsed);
        krb5_free_principal(_context->nativeContext(), native);
    }
}

TEST_F(Principal, EscapedNulIsPartOfTheName) {
    EXPECT_EQ(principal(R"(a\0b@R)")->name(), std::string("a\0b", 3));
}

TEST_F(Principal, NullNativePrincipalGivesNull) {
    EXPECT_EQ(KRB5Principal::initWithNativePrincipal(nullptr, _context), nullptr);
    EXPECT_EQ(KRB5Principal::principalWithNativePrincipal(nullptr, _context), nullptr);
}

TEST_F(Principal, MovedFromPrincipalIsEmpty) {
    auto alice = principal("alice");
    const KRB5Principal taken(std::move(*alice));
    EXPECT_EQ(taken.stringValue(), "alice@NIMBO.TEST");
    EXPECT_EQ(alice->stringValue(), std::nullopt);
}

}  // namespace
}  // namespace lumio
