// The Kerberos object layer against the library used directly, and the listing of keytabs of several sizes.

#include "krb5/KRB5CredentialCache.h"
#include "krb5/KRB5Keytab.h"
#include "tests/support/Kdc.h"
#include "tests/support/KeytabFile.h"

#include <fstream>
#include <stdexcept>
#include <string>

#include <benchmark/benchmark.h>

namespace lumio {
namespace {

constexpr const char* password = "alice secret";

void require(bool condition, const char* what) {
    if (!condition) {
        throw std::runtime_error(what);
    }
}

/// A realm for the whole program, with its environment variables set.
struct Realm {
    Realm() : environment(kdc.environment()) { kdc.admin("addprinc -pw \"alice secret\" alice\n"); }
    support::Kdc kdc;
    support::ScopedEnvironment environment;
};

Realm& realm() {
    static Realm theRealm;
    return theRealm;
}

/// Open a file cache, acquire with a password, list, destroy.
void layerOnce(const std::string& path, const std::shared_ptr<KRB5Context>& context) {
    const auto alice = KRB5Principal::initWithString("alice", context);
    const auto cache = KRB5CredentialCache::initWithName(path, KRB5CredentialCacheFileType, alice.get(), context);
    require(cache != nullptr, "open");
    require(cache->acquireInitialCredentialIfNecessaryWithPassword(password), "necessary");
    require(cache->errorCode() == 0, "acquire");
    require(cache->credentials().size() == 1, "list");
    cache->destroy();
    require(cache->errorCode() == 0, "destroy");
}

/// The same library calls, written out.
void libraryOnce(const std::string& path, krb5_context context) {
    krb5_principal alice = nullptr;
    krb5_ccache cache = nullptr;
    require(krb5_parse_name(context, "alice", &alice) == 0, "parse");
    require(krb5_cc_resolve(context, ("FILE:" + path).c_str(), &cache) == 0, "resolve");
    krb5_principal bound = nullptr;
    require(krb5_cc_get_principal(context, cache, &bound) != 0, "new");
    require(krb5_cc_initialize(context, cache, alice) == 0, "initialize");

    require(krb5_cc_get_principal(context, cache, &bound) == 0, "bound");
    krb5_creds match{};
    krb5_creds found{};
    require(krb5_copy_principal(context, bound, &match.client) == 0, "copy");
    require(krb5_build_principal_ext(context, &match.server, bound->realm.length, bound->realm.data,
                                     static_cast<unsigned int>(KRB5_TGS_NAME_SIZE), KRB5_TGS_NAME, bound->realm.length,
                                     bound->realm.data, 0) == 0,
            "build");
    require(krb5_cc_retrieve_cred(context, cache, KRB5_TC_SUPPORTED_KTYPES, &match, &found) == KRB5_CC_NOTFOUND,
            "retrieve");
    krb5_free_cred_contents(context, &match);
    require(krb5_cc_initialize(context, cache, bound) == 0, "initialize");
    krb5_get_init_creds_opt options;
    krb5_get_init_creds_opt_init(&options);
    krb5_get_init_creds_opt_set_forwardable(&options, 1);
    krb5_get_init_creds_opt_set_proxiable(&options, 1);
    krb5_creds acquired{};
    require(
        krb5_get_init_creds_password(context, &acquired, bound, password, nullptr, nullptr, 0, nullptr, &options) == 0,
        "acquire");
    require(krb5_cc_store_cred(context, cache, &acquired) == 0, "store");
    krb5_free_cred_contents(context, &acquired);
    krb5_free_principal(context, bound);

    krb5_cc_cursor cursor = nullptr;
    int count = 0;
    require(krb5_cc_start_seq_get(context, cache, &cursor) == 0, "start");
    krb5_creds next{};
    while (krb5_cc_next_cred(context, cache, &cursor, &next) == 0) {
        krb5_creds* copy = nullptr;
        require(krb5_copy_creds(context, &next, &copy) == 0, "copy");
        krb5_free_creds(context, copy);
        krb5_free_cred_contents(context, &next);
        ++count;
    }
    krb5_cc_end_seq_get(context, cache, &cursor);
    require(count == 1, "list");
    require(krb5_cc_destroy(context, cache) == 0, "destroy");
    require(krb5_cc_resolve(context, path.c_str(), &cache) == 0, "re-open");
    krb5_cc_close(context, cache);
    krb5_free_principal(context, alice);
}

template <class Action>
double millisecondsOf(Action action) {
    const auto start = std::chrono::steady_clock::now();
    action();
    return std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start).count();
}

double medianOf(std::vector<double> values) {
    std::ranges::nth_element(values, values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2));
    return values[values.size() / 2];
}

/// Times both in turn, so that disturbances on the machine affect both equally. Figures are medians.
void ticketThroughLayerAndLibrary(benchmark::State& state) {
    const std::string path = realm().kdc.directory() / "bench";
    const auto layerContext = KRB5Context::context();
    const auto libraryContext = KRB5Context::context();
    std::vector<double> layer;
    std::vector<double> library;
    for ([[maybe_unused]] auto _ : state) {
        layer.push_back(millisecondsOf([&] { layerOnce(path, layerContext); }));
        library.push_back(millisecondsOf([&] { libraryOnce(path, libraryContext->nativeContext()); }));
    }
    state.counters["layer_ms"] = medianOf(layer);
    state.counters["library_ms"] = medianOf(library);
    state.counters["ratio"] = medianOf(layer) / medianOf(library);
}

/// Argument: entries; half as many principals.
void keytabPrincipals(benchmark::State& state) {
    const auto entries = static_cast<int>(state.range(0));
    const std::string path = realm().kdc.directory() / ("keytab" + std::to_string(entries));
    std::ofstream(path, std::ios::binary) << support::keytabFile(entries, entries / 2);
    const auto keytab = KRB5Keytab::initWithName(path, KRB5KeytabFileType, KRB5Context::context());
    for ([[maybe_unused]] auto _ : state) {
        require(keytab->principals().size() == static_cast<std::size_t>(entries / 2), "principals");
    }
    state.counters["perEntry"] = benchmark::Counter(
        static_cast<double>(entries), benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
    state.SetComplexityN(state.range(0));
}

BENCHMARK(ticketThroughLayerAndLibrary)->Unit(benchmark::kMillisecond)->UseRealTime()->Iterations(500);
BENCHMARK(keytabPrincipals)->Arg(1000)->Arg(10000)->Unit(benchmark::kMillisecond)->Complexity(benchmark::oN);

}  // namespace
}  // namespace lumio

BENCHMARK_MAIN();
