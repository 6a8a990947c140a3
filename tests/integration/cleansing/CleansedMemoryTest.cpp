// Checks that freed memory holds no key and no plain text. The program has its own new and delete for that, which read
// whole blocks, written or not. So it is not part of the unit programs, which also run below valgrind.

#include "platform/directory/Directory.h"
#include "platform/directory/LdapNode.h"
#include "tests/support/SilentServer.h"
#include "tests/unit/resources/PropertyFixture.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cstdlib>
#include <filesystem>
#include <new>
#include <string_view>
#include <thread>

#include <malloc.h>
#include <sys/socket.h>
#include <unistd.h>

namespace {

constexpr std::string_view plainText = "a plain text that nobody else is to see, longer than a string's own room";
constexpr std::string_view secretBytes = "lumio-sample-key";
constexpr std::string_view secretText = "bHVtaW8tc2FtcGxlLWtleQ==";

std::atomic<bool> watching = false;
std::atomic<int> seenInFreedMemory = 0;

void lookThrough(const void* block) noexcept {
    const std::string_view bytes(static_cast<const char*>(block), ::malloc_usable_size(const_cast<void*>(block)));
    for (const std::string_view secret : {plainText, secretBytes, secretText}) {
        seenInFreedMemory += bytes.find(secret) != std::string_view::npos ? 1 : 0;
    }
}

void release(void* block) noexcept {
    if (watching && block != nullptr) {
        lookThrough(block);
    }
    std::free(block);
}

}  // namespace

// This program's memory: each block is searched before it is freed.
void* operator new(std::size_t size, const std::nothrow_t&) noexcept {
    return std::malloc(std::max<std::size_t>(size, 1));
}
void* operator new(std::size_t size) {
    void* block = ::operator new(size, std::nothrow);
    return block != nullptr ? block : throw std::bad_alloc();
}
void operator delete(void* block) noexcept {
    release(block);
}
void operator delete(void* block, std::size_t) noexcept {
    release(block);
}

namespace lumio {
namespace {

class CleansedMemory : public PropertyFixture {
  protected:
    void TearDown() override { watching = false; }

    template <class Work>
    static int seenWhile(Work work) {
        seenInFreedMemory = 0;
        watching = true;
        work();
        watching = false;
        return seenInFreedMemory;
    }
};

TEST_F(CleansedMemory, WhatIsFreedUncleansedIsSeen) {
    EXPECT_EQ(seenWhile([] { const std::string freed(plainText); }), 1);
}

TEST_F(CleansedMemory, ProtectingLeavesNeitherKeyNorPlainTextBehind) {
    const Value plain(plainText);
    std::optional<std::string> stored;
    EXPECT_EQ(seenWhile([&] { stored = Property::encryptValue(plain); }), 0);
    EXPECT_TRUE(stored);
}

TEST_F(CleansedMemory, ReadingLeavesNeitherKeyNorPlainTextBehind) {
    const Value stored = *Property::encryptValue(plainText);
    std::optional<std::string> plain;
    EXPECT_EQ(seenWhile([&] { plain = Property::decryptValue(stored); }), 0);
    EXPECT_EQ(plain, plainText);
}

TEST_F(CleansedMemory, WritingAProtectedPropertyLeavesNeitherBehind) {
    Dictionary request{{"name", "n"}, {"value", plainText}, {"protect", true}};
    EXPECT_EQ(seenWhile([&] { EXPECT_EQ(insert(request), std::nullopt); }), 0);
    EXPECT_EQ(row("protect"), "t");
    request.set("_id_", "1");
    request.remove("protect");
    EXPECT_EQ(seenWhile([&] { EXPECT_EQ(change(request), std::nullopt); }), 0);
    EXPECT_EQ(Property::decryptValue(storedValue()), plainText);
}

TEST_F(CleansedMemory, WritingThatEndsEarlyLeavesNeitherBehind) {
    ASSERT_EQ(insert({{"name", "taken"}, {"value", "v"}}), std::nullopt);
    Dictionary request{{"name", "taken"}, {"value", plainText}, {"protect", true}};
    EXPECT_EQ(seenWhile([&] { EXPECT_TRUE(insert(request)) << "another property has the name"; }), 0);
    useSecret("dG9vIHNob3J0");
    request.set("name", "free");
    EXPECT_EQ(seenWhile([&] { EXPECT_TRUE(insert(request)) << "the key cannot be used"; }), 0);
    request.set("_id_", "1");
    EXPECT_EQ(seenWhile([&] { EXPECT_TRUE(change(request)); }), 0);
    request.set("_id_", "77");
    EXPECT_EQ(seenWhile([&] { EXPECT_TRUE(change(request)); }), 0);
}

TEST_F(CleansedMemory, PlainTextThatCannotBeStoredIsNotLeftBehind) {
    const std::string quoted = std::string(plainText) + '"';
    ASSERT_EQ(insert({{"name", "n"}, {"value", quoted}, {"protect", true}}), std::nullopt);
    EXPECT_EQ(seenWhile([&] { EXPECT_TRUE(change({{"_id_", "1"}, {"protect", false}})); }), 0);
}

TEST_F(CleansedMemory, SigningInToADirectoryServerLeavesNoPasswordBehind) {
    constexpr std::string_view administrator = "cn=admin,dc=nimbo,dc=test";
    adminhost::LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    settings.uris = {"ldap://127.0.0.1:1"};
    // In clear text, so that it is refused.
    EXPECT_EQ(seenWhile([&] {
                  EXPECT_FALSE(adminhost::ldapNode(settings).open().value()->authenticate(administrator, plainText));
              }),
              0);
}

TEST_F(CleansedMemory, PasswordFileOfADirectoryServerIsNotLeftBehind) {
    // A server that accepts the connection and ends it when the password arrives.
    const adminhost::test::SilentServer listening;
    bool isSent = false;
    std::thread server([&] {
        const int client = ::accept(listening.socket(), nullptr, nullptr);
        std::array<char, 4096> received{};
        const ssize_t size = ::read(client, received.data(), received.size());
        isSent =
            std::string_view(received.data(), static_cast<std::size_t>(std::max<ssize_t>(size, 0))).find(plainText) !=
            std::string_view::npos;
        ::close(client);
    });
    root.write("/password", plainText);
    std::filesystem::permissions(root.path("/password"), std::filesystem::perms(0600));
    adminhost::LdapNodeSettings settings;
    settings.name = "/LDAP";
    settings.base = "dc=nimbo,dc=test";
    settings.uris = {"ldap://127.0.0.1:" + std::to_string(listening.port())};
    settings.bindDn = "cn=reader,dc=nimbo,dc=test";
    settings.bindPasswordFile = adminhost::HostPath("/password");
    adminhost::DirectoryQuery query;
    query.recordTypes = {std::string(adminhost::directory::users)};
    query.attribute = adminhost::directory::recordName;
    query.values = {"anna"};
    EXPECT_EQ(seenWhile([&] { EXPECT_FALSE(adminhost::ldapNode(settings).open().value()->records(query)); }), 0);
    server.join();
    EXPECT_TRUE(isSent);
}

}  // namespace
}  // namespace lumio
