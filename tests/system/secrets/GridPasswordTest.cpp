// The grid password on its way through the real daemon and its worker: its plain text is kept or passed on nowhere.

#include "tests/support/DaemonProcess.h"
#include "tests/support/SampleRoot.h"

#include <filesystem>
#include <fstream>
#include <iterator>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::Not;

constexpr const char* planted = "planted-grid-secret-7261";

std::string bytesOf(const fs::path& file) {
    std::ifstream in(file, std::ios::binary);
    return {std::istreambuf_iterator<char>(in), {}};
}

/// How many regular files below the directory were read; each must not hold the password.
int searchBelow(const fs::path& directory) {
    int files = 0;
    for (const auto& entry : fs::recursive_directory_iterator(directory)) {
        if (entry.is_regular_file() && !entry.is_symlink()) {
            ++files;
            EXPECT_EQ(bytesOf(entry.path()).find(planted), std::string::npos) << entry.path();
        }
    }
    return files;
}

TEST(GridPassword, PlantedValueIsInNoFileLogLineArgumentListEnvironmentOrRecord) {
    const SampleRoot root;
    // Between the daemon and the real tool, each run's arguments and environment are recorded.
    const std::string record = root.directory() + "/recorded";
    root.write("/usr/bin/sqlite3",
               "#!/bin/sh\n{ /usr/bin/tr '\\0' '\\n' </proc/$$/cmdline; /usr/bin/tr '\\0' '\\n' "
               "</proc/$$/environ; } >>" +
                   record + "\nexec /usr/bin/sqlite3 \"$@\"\n");
    fs::permissions(root.disk("/usr/bin/sqlite3"), fs::perms(0755));
    root.recordToolCalls();
    const DaemonProcess daemon(
        {{"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"}, "", {}, true, {}});
    const std::string before = bytesOf(root.clusterPreferencesPath());
    const std::string body = std::string(R"({"configuration":{"nimbo_client_password":")") + planted +
                             R"(","server_port":8171},"optionalArguments":{"variant":"getConfig"}})";
    UnixHttp client(daemon.socket(), std::chrono::seconds(60));
    const HttpReply reply = client.post("/v1/lumio/writeSettings", body);
    ASSERT_EQ(reply.status, 200) << reply.body;
    EXPECT_THAT(reply.body, HasSubstr("\"writeStatus\":0"));
    EXPECT_THAT(reply.body, Not(HasSubstr(planted)));
    const std::string after = bytesOf(root.clusterPreferencesPath());
    EXPECT_NE(after, before);
    EXPECT_THAT(after, HasSubstr("nimbo_client_password"));

    ASSERT_TRUE(reply.headers.contains("request-id"));
    const HttpReply remembered = client.get("/v1/requests/" + reply.headers.at("request-id"));
    EXPECT_EQ(remembered.status, 200);
    EXPECT_THAT(remembered.body, Not(HasSubstr(planted)));
    for (const char* target : {"/v1/", "/v1/lumio", "/v1/lumio/history"}) {
        const HttpReply other = client.get(target);
        EXPECT_EQ(other.status, 200) << target;
        EXPECT_THAT(other.body, Not(HasSubstr(planted))) << target;
    }

    EXPECT_THAT(bytesOf(record), HasSubstr("PATH=")) << "environments were recorded";
    EXPECT_THAT(bytesOf(record), HasSubstr("sqlite3")) << "so were arguments";
    EXPECT_GE(root.toolCalls().size(), 3U) << "the scripts' runs were recorded";
    EXPECT_FALSE(daemon.log().empty());
    EXPECT_GT(searchBelow(root.directory()), 20) << "the root and the records";
    EXPECT_GE(searchBelow(daemon.directory()), 1) << "the log among them";
}

}  // namespace
}  // namespace adminhost::test
