#include "platform/directory/NameBasedUuid.h"
#include "platform/task/Task.h"

#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

TEST(Uuid, TextIsReadInEitherCaseAndWrittenInUpperCase) {
    const auto uuid = uuidOf("3f0e2a54-8c5b-5d0e-9A41-6D1F0C7B2E90");
    ASSERT_TRUE(uuid);
    EXPECT_EQ(*uuid, localAccountsNamespace);
    EXPECT_EQ(textOf(*uuid), "3F0E2A54-8C5B-5D0E-9A41-6D1F0C7B2E90");
}

TEST(Uuid, AnyOtherTextIsNone) {
    for (const char* text : {"", "x", "3f0e2a54-8c5b-5d0e-9a41-6d1f0c7b2e9", "3f0e2a54-8c5b-5d0e-9a41-6d1f0c7b2e900",
                             "3f0e2a548c5b5d0e9a416d1f0c7b2e90", "3f0e2a54-8c5b-5d0e-9a41-6d1f0c7b2eg0",
                             "{3f0e2a54-8c5b-5d0e-9a41-6d1f0c7b2e9}", "3f0e2a54 8c5b-5d0e-9a41-6d1f0c7b2e90",
                             " 3f0e2a54-8c5b-5d0e-9a41-6d1f0c7b2e90"}) {
        EXPECT_FALSE(uuidOf(text)) << text;
    }
    EXPECT_FALSE(uuidOf(std::string_view("3f0e2a54-8c5b-5d0e-9a41-6d1f0c7b2e9\0", 36)));
}

TEST(Uuid, NameBasedUuidsAreThoseOfAnIndependentImplementation) {
    // "www.example.com" in the DNS namespace is the published example of version 5.
    const Uuid dns = *uuidOf("6ba7b810-9dad-11d1-80b4-00c04fd430c8");
    EXPECT_EQ(textOf(nameBasedUuid(dns, "www.example.com")), "2ED6657D-E927-568B-95E1-2665A8AEA6A2");

    const std::vector<std::string> names = {"user:anna",
                                            "group:editors",
                                            "user:",
                                            "user:root",
                                            "user:a b",
                                            "user:\xC3\xA5sa",
                                            "group:" + std::string(300, 'x')};
    std::string list;
    std::string expected;
    for (const std::string& name : names) {
        list += "'" + name + "',";
        expected += textOf(nameBasedUuid(localAccountsNamespace, name)) + "\n";
    }
    std::string output;
    ASSERT_EQ(
        launch_task(DiskPath("/usr/bin/python3"),
                    {"-c", "import uuid\nspace = uuid.UUID('3f0e2a54-8c5b-5d0e-9a41-6d1f0c7b2e90')\nfor name in [" +
                               list + "]: print(str(uuid.uuid5(space, name)).upper())"},
                    &output, nullptr),
        0);
    EXPECT_EQ(output, expected);
}

}  // namespace
}  // namespace adminhost
