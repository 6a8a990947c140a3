// The state of the service while the KDC accepts connections and never replies.

#include "tests/support/DaemonProcess.h"
#include "tests/support/Kdc.h"
#include "tests/support/SampleRoot.h"
#include "tests/support/SilentServer.h"

#include <chrono>
#include <filesystem>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::test {
namespace {

using testing::HasSubstr;

/// Longer than the request's own time limit of a minute.
constexpr auto patience = std::chrono::seconds(150);

TEST(SilentKdc, DelaysOnlyTheRequestThatNeedsItAndLeavesNoCache) {
    const SilentServer listener;
    const SampleRoot root;
    root.write("/etc/krb5.conf", support::Kdc::clientConfiguration("NIMBO.TEST", listener.port()));
    root.setSwitch("nimbo.exit", "10");  // as without a ticket
    const DaemonProcess daemon(
        {{"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"},
         "[[directory.node]]\nname = \"/Local\"\nkind = \"local\"\nkerberos_realm = \"NIMBO.TEST\"\n",
         {"KRB5_CONFIG=" + root.disk("/etc/krb5.conf")},
         true,
         {}});
    UnixHttp client(daemon.socket(), patience);
    const auto start = std::chrono::steady_clock::now();
    client.begin("POST", "/v1/lumio/getState", R"({"variant":"withDetails"})");
    std::string overview;
    do {
        overview = daemon.connect().get("/v1/").body;
    } while (overview.find("getState") == std::string::npos && std::chrono::steady_clock::now() - start < patience);
    EXPECT_THAT(overview, HasSubstr("\"running\"")) << "the front replies meanwhile";

    const HttpReply reply = client.reply();
    if (reply.status == 200) {  // the library gave up in time
        EXPECT_THAT(reply.body, HasSubstr("kNimboUnavailable"));
    } else {
        EXPECT_EQ(reply.status, 504) << reply.body;
    }
    EXPECT_EQ(daemon.connect().post("/v1/lumio/getState").status, 200);
    EXPECT_FALSE(std::filesystem::exists(root.disk("/var/lumio/server/adminhostd_krb_cc")));
}

}  // namespace
}  // namespace adminhost::test
