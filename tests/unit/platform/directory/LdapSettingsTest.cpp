// What a configuration of an LDAP node may hold.

#include "platform/directory/KerberosAuthority.h"
#include "platform/directory/LdapNode.h"

#include <functional>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost {
namespace {

using testing::StartsWith;

LdapNodeSettings valid() {
    LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.uris = {"ldaps://ldap.example.com"};
    settings.base = "dc=example,dc=com";
    return settings;
}

/// The description of what is wrong; empty if nothing is.
std::string problemAfter(const std::function<void(LdapNodeSettings&)>& change) {
    LdapNodeSettings settings = valid();
    change(settings);
    const auto checked = checkLdapNodeSettings(settings);
    return checked ? "" : checked.error().description.value_or("no description");
}

TEST(LdapSettings, OrdinarySettingsAreAccepted) {
    using Change = std::function<void(LdapNodeSettings&)>;
    for (const Change& change : {Change([](auto&) {}), Change([](auto& s) {
                                     s.uris = {"ldap://one:3890", "ldap://[::1]", "ldapi://%2Frun%2Fldapi"};
                                     s.startTls = true;
                                 }),
                                 Change([](auto& s) {
                                     s.userBase = "ou=p,dc=a";
                                     s.groupBase = "ou=g,dc=a";
                                     s.base = "";
                                 }),
                                 Change([](auto& s) { s.userFilter = "(&(objectClass=a)(!(uid=\\28*)))"; }),
                                 Change([](auto& s) { s.groupFilter = "objectClass=posixGroup"; }), Change([](auto& s) {
                                     s.bindDn = "cn=reader,dc=a";
                                     s.bindPasswordFile = HostPath("/etc/secret");
                                 }),
                                 Change([](auto& s) {
                                     s.sasl = LdapNodeSettings::Sasl::gssapi;
                                     s.keytab = HostPath("/etc/keytab");
                                 }),
                                 Change([](auto& s) {
                                     s.userMap = {{"RecordName", "cn"}, {"KerberosPrincipal", "x-princ"}};
                                     s.groupMap = {{"GroupMembership", "memberUid"}};
                                 })}) {
        EXPECT_EQ(problemAfter(change), "");
    }
}

TEST(LdapSettings, MistakesAreNamedByTheirKey) {
    using Change = std::function<void(LdapNodeSettings&)>;
    const std::vector<std::pair<const char*, Change>> mistakes = {
        {"name: ", [](auto& s) { s.name = ""; }},
        {"name: ", [](auto& s) { s.name = "/Search"; }},
        {"uri: ", [](auto& s) { s.uris = {}; }},
        {"uri: ", [](auto& s) { s.uris = {"ldap.example.com"}; }},
        {"uri: ", [](auto& s) { s.uris = {"http://ldap.example.com"}; }},
        {"uri: ", [](auto& s) { s.uris = {"ldap://ldap.example.com/dc=example,dc=com"}; }},
        {"uri: ", [](auto& s) { s.uris = {"ldap://one ldap://two"}; }},
        {"starttls: ", [](auto& s) { s.startTls = true; }},
        {"base: ", [](auto& s) { s.base = ""; }},
        {"base: ", [](auto& s) { s.base = "example.com"; }},
        {"user_base: ", [](auto& s) { s.userBase = "people"; }},
        {"group_base: ", [](auto& s) { s.groupBase = "groups"; }},
        {"create_base: ", [](auto& s) { s.createBase = "people"; }},
        {"bind_dn: ", [](auto& s) { s.bindDn = "reader"; }},
        {"bind_dn: ", [](auto& s) { s.bindDn = "cn=reader"; }},
        {"bind_dn: ", [](auto& s) { s.bindPasswordFile = HostPath("/x"); }},
        {"bind_password_file: ",
         [](auto& s) {
             s.bindDn = "cn=reader";
             s.bindPasswordFile = HostPath("/x");
             s.bindPasswordCredential = "x";
         }},
        {"bind_password_credential: ", [](auto& s) { s.bindPasswordCredential = "../x"; }},
        {"sasl: ",
         [](auto& s) {
             s.sasl = LdapNodeSettings::Sasl::external;
             s.bindDn = "cn=reader";
             s.bindPasswordFile = HostPath("/x");
         }},
        {"keytab: ", [](auto& s) { s.sasl = LdapNodeSettings::Sasl::gssapi; }},
        {"key_file: ", [](auto& s) { s.certFile = HostPath("/x"); }},
        {"cert_file: ", [](auto& s) { s.keyFile = HostPath("/x"); }},
        {"user_filter: ", [](auto& s) { s.userFilter = "(objectClass=a"; }},
        {"user_filter: ", [](auto& s) { s.userFilter = "(a=*)(b=*)"; }},
        {"group_filter: ", [](auto& s) { s.groupFilter = "(|(a=b)"; }},
        {"map.users.Shoe: ",
         [](auto& s) {
             s.userMap = {{"Shoe", "size"}};
         }},
        {"map.users.RecordName: ",
         [](auto& s) {
             s.userMap = {{"RecordName", "uid)(x=*"}};
         }},
        {"map.groups.RecordName: ",
         [](auto& s) {
             s.groupMap = {{"RecordName", ""}};
         }},
        {"timeout_seconds: ", [](auto& s) { s.timeout = std::chrono::seconds(0); }},
        {"object_classes: ", [](auto& s) { s.objectClasses = {}; }},
        {"create_attributes.a b: ",
         [](auto& s) {
             s.createAttributes = {{"a b", {"x"}}};
         }},
        {"create_attributes.cn: ",
         [](auto& s) {
             s.createAttributes = {{"cn", {}}};
         }},
    };
    for (const auto& [key, change] : mistakes) {
        EXPECT_THAT(problemAfter(change), StartsWith(key));
    }
}

TEST(KerberosAuthority, RealmIsWhatFollowsTheLastUnquotedAt) {
    EXPECT_EQ(kerberosAuthority("anna@A.TEST", "D"), ";Kerberosv5;;anna@A.TEST;A.TEST;");
    EXPECT_EQ(kerberosAuthority("a\\@b@A.TEST", "D"), ";Kerberosv5;;a\\@b@A.TEST;A.TEST;");
    EXPECT_EQ(kerberosAuthority("a@b@A.TEST", "D"), ";Kerberosv5;;a@b@A.TEST;A.TEST;");
    EXPECT_EQ(kerberosAuthority("anna", "D"), ";Kerberosv5;;anna;D;");
    EXPECT_EQ(kerberosAuthority("a\\@b", "D"), ";Kerberosv5;;a\\@b;D;");
}

TEST(KerberosAuthority, PrincipalThatWouldBreakTheFieldsHasNone) {
    EXPECT_FALSE(kerberosAuthority("a;b@A.TEST", "D"));
    EXPECT_FALSE(kerberosAuthority("", "D"));
}

TEST(KerberosAuthority, NameIsQuotedInItsPrincipal) {
    EXPECT_EQ(kerberosPrincipalOf("anna", "A.TEST"), "anna@A.TEST");
    EXPECT_EQ(kerberosPrincipalOf("a@b/c\\d", "A.TEST"), "a\\@b\\/c\\\\d@A.TEST");
}

}  // namespace
}  // namespace adminhost
