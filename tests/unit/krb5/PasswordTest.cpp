// Follows a password through the layer: the library's call and the wiping function are defined here once more, in
// front of the real ones.

#include "krb5/KRB5CredentialCache.h"
#include "tests/unit/krb5/Realm.h"

#include <vector>

#include <dlfcn.h>

namespace {

struct Wiped {
    const void* start;
    std::size_t size;
};

/// The record, from the library's call on; null outside of the tests that use it, because the program still wipes
/// memory after its last test.
struct Recording {
    const char* password = nullptr;
    std::string passwordText;
    std::vector<Wiped> wiped;
};

Recording* recording = nullptr;

void wipe(void* start, std::size_t size) {
    auto* bytes = static_cast<volatile char*>(start);
    for (std::size_t i = 0; i < size; ++i) {
        bytes[i] = 0;
    }
    if (recording != nullptr && recording->password != nullptr) {
        recording->wiped.push_back({start, size});
    }
}

}  // namespace

extern "C" {

krb5_error_code krb5_get_init_creds_password(krb5_context context, krb5_creds* creds, krb5_principal client,
                                             const char* password, krb5_prompter_fct prompter, void* data,
                                             krb5_deltat start_time, const char* in_tkt_service,
                                             krb5_get_init_creds_opt* options) {
    if (recording != nullptr) {
        recording->password = password;
        recording->passwordText = password;
    }
    const auto real =
        reinterpret_cast<decltype(&krb5_get_init_creds_password)>(dlsym(RTLD_NEXT, "krb5_get_init_creds_password"));
    return real(context, creds, client, password, prompter, data, start_time, in_tkt_service, options);
}

// Named as in the object file, because the C library's header defines them inline in fortified builds.
void wipePlain(void* start, std::size_t size) noexcept __asm__("explicit_bzero");
void wipeChecked(void* start, std::size_t size, std::size_t room) noexcept __asm__("__explicit_bzero_chk");

void wipePlain(void* start, std::size_t size) noexcept {
    wipe(start, size);
}
void wipeChecked(void* start, std::size_t size, std::size_t /*room*/) noexcept {
    wipe(start, size);
}
}

namespace lumio {
namespace {

class Password : public RealmTest {};

TEST_F(Password, CopyGivenToTheLibraryIsWipedWholeWhetherTheRequestSucceedsOrFails) {
    for (const std::string text : {alicePassword, "a wrong one"}) {
        const auto cache = cacheOf(*principal("alice"));
        Recording seen;
        recording = &seen;
        cache->acquireInitialCredentialWithPassword(text);
        recording = nullptr;
        EXPECT_EQ(cache->errorCode() == 0, text == alicePassword);
        ASSERT_NE(seen.password, nullptr);
        EXPECT_EQ(seen.passwordText, text);
        bool found = false;
        for (const Wiped& area : seen.wiped) {
            found = found || (area.start == seen.password && area.size >= text.size() + 1);
        }
        EXPECT_TRUE(found) << text;
    }
}

}  // namespace
}  // namespace lumio
