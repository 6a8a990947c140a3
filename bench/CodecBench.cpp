// Base64 and the cipher of protected values against the libraries used directly, in one run.
//
// Every base64 operation allocates a new result, in our code and in the other libraries. EvpInto... are OpenSSL's calls
// into an existing buffer. Lengths are those of the plain bytes. Cipher: the operation of protected values against one
// EVP pass with a fetched cipher, a new context and a result buffer of the right size.

#include "codec/LumioAESCategories.h"
#include "codec/LumioCategories.h"

#include <memory>

#include <benchmark/benchmark.h>
#include <glib.h>
#include <openssl/evp.h>

namespace {

using adminhost::Data;
using lumio::Bytes;

Data plain(benchmark::State& state) {
    Data data(static_cast<std::size_t>(state.range(0)));
    std::uint32_t random = 12345;
    for (std::uint8_t& byte : data) {
        random = random * 1664525U + 1013904223U;
        byte = static_cast<std::uint8_t>(random >> 24U);
    }
    return data;
}

void count(benchmark::State& state) {
    state.SetBytesProcessed(state.iterations() * state.range(0));
}

void EncodeWrapped(benchmark::State& state) {
    const Data data = plain(state);
    for (auto _ : state) {
        benchmark::DoNotOptimize(lumio::LumioUtilities_encodeBase64(data));
    }
    count(state);
}

void EncodeUnwrapped(benchmark::State& state) {
    const Data data = plain(state);
    for (auto _ : state) {
        benchmark::DoNotOptimize(lumio::LumioUtilities_encodeBase64WithoutLineBreaks(data));
    }
    count(state);
}

void EncodeEvp(benchmark::State& state) {
    const Data data = plain(state);
    for (auto _ : state) {
        Data out((data.size() + 2) / 3 * 4 + 1);
        benchmark::DoNotOptimize(EVP_EncodeBlock(out.data(), data.data(), static_cast<int>(data.size())));
    }
    count(state);
}

void EncodeEvpIntoBuffer(benchmark::State& state) {
    const Data data = plain(state);
    Data out((data.size() + 2) / 3 * 4 + 1);
    for (auto _ : state) {
        benchmark::DoNotOptimize(EVP_EncodeBlock(out.data(), data.data(), static_cast<int>(data.size())));
        benchmark::ClobberMemory();
    }
    count(state);
}

void EncodeGlib(benchmark::State& state) {
    const Data data = plain(state);
    for (auto _ : state) {
        g_free(g_base64_encode(data.data(), data.size()));
    }
    count(state);
}

void DecodeWrapped(benchmark::State& state) {
    const Data text = lumio::LumioUtilities_encodeBase64(plain(state));
    for (auto _ : state) {
        benchmark::DoNotOptimize(lumio::LumioUtilities_decodeBase64(text));
    }
    count(state);
}

void DecodeUnwrapped(benchmark::State& state) {
    const Data text = lumio::LumioUtilities_encodeBase64WithoutLineBreaks(plain(state));
    for (auto _ : state) {
        benchmark::DoNotOptimize(lumio::LumioUtilities_decodeBase64(text));
    }
    count(state);
}

void DecodeEvp(benchmark::State& state) {
    const Data text = lumio::LumioUtilities_encodeBase64WithoutLineBreaks(plain(state));
    for (auto _ : state) {
        Data out(text.size() / 4 * 3);
        benchmark::DoNotOptimize(EVP_DecodeBlock(out.data(), text.data(), static_cast<int>(text.size())));
    }
    count(state);
}

void DecodeEvpIntoBuffer(benchmark::State& state) {
    const Data text = lumio::LumioUtilities_encodeBase64WithoutLineBreaks(plain(state));
    Data out(text.size() / 4 * 3);
    for (auto _ : state) {
        benchmark::DoNotOptimize(EVP_DecodeBlock(out.data(), text.data(), static_cast<int>(text.size())));
        benchmark::ClobberMemory();
    }
    count(state);
}

void DecodeGlib(benchmark::State& state) {
    Data text = lumio::LumioUtilities_encodeBase64WithoutLineBreaks(plain(state));
    text.push_back(0);
    for (auto _ : state) {
        gsize length = 0;
        g_free(g_base64_decode(reinterpret_cast<const gchar*>(text.data()), &length));
    }
    count(state);
}

const Data key(16, 'k');

struct Evp {
    static void free(EVP_CIPHER* cipher) { EVP_CIPHER_free(cipher); }
    static void free(EVP_CIPHER_CTX* context) { EVP_CIPHER_CTX_free(context); }
    template <class Type>
    void operator()(Type* object) const {
        free(object);
    }
};

void evpPass(benchmark::State& state, const Data& in, bool encrypt) {
    const std::unique_ptr<EVP_CIPHER, Evp> cipher(EVP_CIPHER_fetch(nullptr, "AES-128-CBC", nullptr));
    const lumio::InitialisationVector vector = lumio::initialisationVector();
    for (auto _ : state) {
        Data out(in.size() + 16);
        int moved = 0;
        int rest = 0;
        const std::unique_ptr<EVP_CIPHER_CTX, Evp> context(EVP_CIPHER_CTX_new());
        const bool good =
            EVP_CipherInit_ex2(context.get(), cipher.get(), key.data(), vector.data(), encrypt ? 1 : 0, nullptr) == 1 &&
            EVP_CipherUpdate(context.get(), out.data(), &moved, in.data(), static_cast<int>(in.size())) == 1 &&
            EVP_CipherFinal_ex(context.get(), out.data() + moved, &rest) == 1;
        if (!good) {
            state.SkipWithError("the cipher failed");
            return;
        }
        benchmark::DoNotOptimize(out);
    }
    count(state);
}

void Encrypt(benchmark::State& state) {
    const Data data = plain(state);
    for (auto _ : state) {
        benchmark::DoNotOptimize(lumio::aes128cbcEncryptDataWithKey(data, key));
    }
    count(state);
}

void EncryptEvp(benchmark::State& state) {
    evpPass(state, plain(state), true);
}

/// Protects a value as Property does, without reading the key file.
void EncryptToText(benchmark::State& state) {
    const Data data = plain(state);
    for (auto _ : state) {
        benchmark::DoNotOptimize(lumio::base64EncodedString(*lumio::aes128cbcEncryptDataWithKey(data, key)));
    }
    count(state);
}

void Decrypt(benchmark::State& state) {
    const Data cipher = *lumio::aes128cbcEncryptDataWithKey(plain(state), key);
    for (auto _ : state) {
        benchmark::DoNotOptimize(lumio::aes128cbcDecryptDataWithKey(cipher, key));
    }
    count(state);
}

void DecryptEvp(benchmark::State& state) {
    evpPass(state, *lumio::aes128cbcEncryptDataWithKey(plain(state), key), false);
}

void lengths(benchmark::internal::Benchmark* benchmark) {
    benchmark->Arg(24)->Arg(1000)->Arg(1'000'000);
}
void cipherLengths(benchmark::internal::Benchmark* benchmark) {
    benchmark->Arg(24)->Arg(1000)->Arg(64 << 10);
}

BENCHMARK(EncodeUnwrapped)->Apply(lengths);
BENCHMARK(EncodeWrapped)->Apply(lengths);
BENCHMARK(EncodeEvp)->Apply(lengths);
BENCHMARK(EncodeEvpIntoBuffer)->Apply(lengths);
BENCHMARK(EncodeGlib)->Apply(lengths);
BENCHMARK(DecodeUnwrapped)->Apply(lengths);
BENCHMARK(DecodeWrapped)->Apply(lengths);
BENCHMARK(DecodeEvp)->Apply(lengths);
BENCHMARK(DecodeEvpIntoBuffer)->Apply(lengths);
BENCHMARK(DecodeGlib)->Apply(lengths);
BENCHMARK(Encrypt)->Apply(cipherLengths);
BENCHMARK(EncryptToText)->Apply(cipherLengths);
BENCHMARK(EncryptEvp)->Apply(cipherLengths);
BENCHMARK(Decrypt)->Apply(cipherLengths);
BENCHMARK(DecryptEvp)->Apply(cipherLengths);

}  // namespace

BENCHMARK_MAIN();
