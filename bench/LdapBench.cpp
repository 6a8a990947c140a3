// Look-ups of people in a real LDAP server, as a listing of 1000 resources with 5 access entries each makes them: one
// look-up for each resource.
//
// Expansion times each look-up against the same search by bare calls of libldap on a connection that is kept. The
// counters are the medians for one look-up and their ratio. Connect times a new connection with a bind and one look-up.

#include "bench/Alternating.h"
#include "platform/directory/Directory.h"
#include "platform/directory/LdapNode.h"
#include "tests/support/Slapd.h"

#include <array>
#include <stdexcept>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <ldap.h>

namespace {

using namespace adminhost;

constexpr int people = 1000;
constexpr int resources = 1000;
constexpr int entriesOfAResource = 5;

std::string uuidOfPerson(int number) {
    const std::string digits = std::to_string(number);
    return "00000000-0000-4000-8000-" + std::string(12 - digits.size(), '0') + digits;
}

class Server {
  public:
    Server() {
        std::string ldif = "dn: dc=nimbo,dc=test\nobjectClass: domain\ndc: nimbo\n\n";
        for (int i = 0; i < people; ++i) {
            const std::string name = "user" + std::to_string(i);
            ldif += "dn: uid=" + name +
                    ",dc=nimbo,dc=test\nobjectClass: account\nobjectClass: posixAccount\nuid: " + name +
                    "\ncn: User Number " + std::to_string(i) + "\nuidNumber: " + std::to_string(10'000 + i) +
                    "\ngidNumber: 100\nhomeDirectory: /home/" + name + "\nentryUUID: " + uuidOfPerson(i) + "\n\n";
        }
        _slapd.add(ldif);
    }
    [[nodiscard]] LdapNodeSettings settings() const {
        LdapNodeSettings settings;
        settings.name = "/LDAP";
        settings.uris = {_slapd.uri()};
        settings.base = support::Slapd::suffix;
        return settings;
    }

  private:
    support::Slapd _slapd;
};

std::vector<std::string> accessListOf(int resource) {
    std::vector<std::string> uuids;
    for (int i = 0; i < entriesOfAResource; ++i) {
        uuids.push_back(uuidOfPerson((resource * 7 + i * 131) % people));
    }
    return uuids;
}

void lookUp(int resource) {
    DirectoryQuery query;
    query.recordTypes = {std::string(directory::users), std::string(directory::groups)};
    query.attribute = directory::generatedUID;
    query.values = accessListOf(resource);
    query.attributes = {std::string(directory::recordName), std::string(directory::realName),
                        std::string(directory::generatedUID)};
    const auto records = searchDirectory(query);
    if (!records || records->size() != entriesOfAResource) {
        throw std::runtime_error("not all entries were found");
    }
}

/// The floor: one search with the attributes that are needed, and their values copied.
class BareConnection {
  public:
    explicit BareConnection(const std::string& uri) {
        const int version = LDAP_VERSION3;
        berval nobody{0, nullptr};
        if (::ldap_initialize(&_ldap, uri.c_str()) != LDAP_SUCCESS ||
            ::ldap_set_option(_ldap, LDAP_OPT_PROTOCOL_VERSION, &version) != LDAP_OPT_SUCCESS ||
            ::ldap_sasl_bind_s(_ldap, "", LDAP_SASL_SIMPLE, &nobody, nullptr, nullptr, nullptr) != LDAP_SUCCESS) {
            throw std::runtime_error("the server cannot be reached");
        }
    }
    BareConnection(const BareConnection&) = delete;
    BareConnection& operator=(const BareConnection&) = delete;
    ~BareConnection() { ::ldap_unbind_ext(_ldap, nullptr, nullptr); }

    void lookUp(int resource) {
        std::string filter = "(|";
        for (const std::string& uuid : accessListOf(resource)) {
            filter += "(entryUUID=" + uuid + ")";
        }
        filter += ")";
        static std::array<std::string, 4> names{"uid", "cn", "entryUUID", "objectClass"};
        std::array<char*, 5> attributes{names[0].data(), names[1].data(), names[2].data(), names[3].data(), nullptr};
        LDAPMessage* result = nullptr;
        if (::ldap_search_ext_s(_ldap, support::Slapd::suffix.data(), LDAP_SCOPE_SUBTREE, filter.c_str(),
                                attributes.data(), 0, nullptr, nullptr, nullptr, 0, &result) != LDAP_SUCCESS) {
            throw std::runtime_error("the search failed");
        }
        std::vector<std::string> values;
        for (LDAPMessage* entry = ::ldap_first_entry(_ldap, result); entry != nullptr;
             entry = ::ldap_next_entry(_ldap, entry)) {
            for (const std::string& name : names) {
                berval** const found = ::ldap_get_values_len(_ldap, entry, name.c_str());
                for (berval** value = found; value != nullptr && *value != nullptr; ++value) {
                    values.emplace_back((*value)->bv_val, (*value)->bv_len);
                }
                ::ldap_value_free_len(found);
            }
        }
        ::ldap_msgfree(result);
        benchmark::DoNotOptimize(values);
        if (values.size() != entriesOfAResource * 5) {  // two object classes
            throw std::runtime_error("not all entries were found");
        }
    }

  private:
    LDAP* _ldap = nullptr;
};

void Expansion(benchmark::State& state) {
    const Server server;
    setDirectoryNodes({ldapNode(server.settings())});
    lookUp(0);  // connects; from here on the connection is kept
    BareConnection bare(server.settings().uris.front());
    int ours = 0;
    int floor = 0;
    bench::alternate(
        state, bench::Clock::wall, [&] { lookUp(ours++ % resources); }, [&] { bare.lookUp(floor++ % resources); },
        [] {});
    state.counters["all_1000_ms"] = state.counters["ours_us"].value * resources / 1000;
}

void Connect(benchmark::State& state) {
    const Server server;
    bench::alternate(
        state, bench::Clock::wall,
        [&] {
            setDirectoryNodes({ldapNode(server.settings())});
            lookUp(1);
        },
        [&] { BareConnection(server.settings().uris.front()).lookUp(1); }, [] {});
}

BENCHMARK(Expansion)->UseManualTime()->Iterations(resources)->Unit(benchmark::kMicrosecond);
BENCHMARK(Connect)->UseManualTime()->Iterations(100)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
