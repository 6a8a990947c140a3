#include "platform/directory/LdapNode.h"
#include "platform/text/FilterSyntax.h"

#include <string>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

TEST(FilterSyntax, FiltersOfEveryKindAreAccepted) {
    for (const char* filter : {"(uid=anna)",
                               "(objectClass=*)",
                               "(cn=a*b*c)",
                               "(cn=*b)",
                               "(cn=)",
                               "(&)",
                               "(|)",
                               "(&(a=b)(!(c=d)))",
                               "(| (a=b)\n (c>=d) )",
                               "(! (a=b))",
                               "(a~=b)",
                               "(a<=b)",
                               "(cn;lang-de=x)",
                               "(2.5.4.3=x)",
                               "(cn=a\\2ab\\29)",
                               "(cn:caseExactMatch:=x)",
                               "(cn:dn:=x)",
                               "(:dn:2.4.6:=x)",
                               "(:caseExactMatch:=x)",
                               "(memberOf=cn=a,dc=example)",
                               "(cn=a&b|c!)",
                               "(cn=\xC3\xA4)",
                               "(userAccountControl:1.2.840.113556.1.4.803:=2)"}) {
        const auto problem = ldapFilterProblem(filter);
        EXPECT_FALSE(problem) << filter << " at " << (problem ? problem->offset : 0);
        LdapNodeSettings settings;
        settings.name = "/Example";
        settings.uris = {"ldap://localhost"};
        settings.base = "dc=example";
        settings.userFilter = filter;
        EXPECT_TRUE(checkLdapNodeSettings(settings)) << filter << ": the LDAP library does not accept it";
    }
}

TEST(FilterSyntax, FirstMistakeIsFoundAtItsPlace) {
    struct {
        std::string filter;
        std::size_t offset;
    } const cases[] = {
        {"", 0},
        {"uid=anna", 0},
        {"()", 1},
        {"(uid)", 1},
        {"(=x)", 1},
        {"(u id=x)", 1},
        {"(uid=anna", 9},
        {"(uid=anna))", 10},
        {"(uid=(x))", 5},
        {"(uid=a\\2)", 6},
        {"(uid=a\\)", 6},
        {"(uid=a\\zz)", 6},
        {"(uid>=a*)", 7},
        {std::string("(uid=a\0b)", 9), 6},
        {"(&(a=b)", 7},
        {"(&(a=b)x)", 7},
        {"(!)", 2},
        {"(!(a=b)(c=d))", 7},
        {"(cn:=", 5},
        {"(:=x)", 1},
        {"(:dn:=x)", 1},
        {"(cn::=x)", 1},
        {"(1..2=x)", 1},
        {"(cn;=x)", 1},
        {"(cn:dn:2.4.6=x)", 1},
    };
    for (const auto& entry : cases) {
        const auto problem = ldapFilterProblem(entry.filter);
        ASSERT_TRUE(problem) << entry.filter;
        EXPECT_EQ(problem->offset, entry.offset) << entry.filter << ": " << problem->expected;
        EXPECT_FALSE(problem->expected.empty());
    }
}

TEST(FilterSyntax, NestingHasABound) {
    const auto nested = [](std::size_t depth) {
        std::string filter = "(a=b)";
        for (std::size_t i = 0; i < depth; ++i) {
            filter = "(!" + filter + ")";
        }
        return filter;
    };
    EXPECT_FALSE(ldapFilterProblem(nested(100)));
    EXPECT_TRUE(ldapFilterProblem(nested(101)));
    EXPECT_TRUE(ldapFilterProblem(std::string(1'000'000, '(')));
}

TEST(FilterSyntax, AttributesAreNamesOrNumbersWithOptions) {
    for (const char* name : {"uid", "a-1", "2.5.4.3", "0", "cn;lang-de", "cn;a;b", "krbPrincipalName"}) {
        EXPECT_TRUE(isLdapAttribute(name)) << name;
    }
    for (const char* name : {"", "-a", "1a", "1.", ".1", "a b", "a*", "cn;", "cn;;a", "a_b", "\xC3\xA4"}) {
        EXPECT_FALSE(isLdapAttribute(name)) << name;
    }
}

}  // namespace
}  // namespace adminhost
