// The revision that goes with settings that were read, and what a write with it does.

#include "tests/system/settings/SettingsFixture.h"

#include <filesystem>

#include <gmock/gmock.h>

namespace adminhost {
namespace {

using test::HttpReply;
using test::Settings;
using testing::HasSubstr;

TEST_F(Settings, ReadCarriesTheRevisionThatGuardsAWrite) {
    const HttpReply read = post("readSettings", R"({"optionalArguments":{"variant":"getConfig"}})");
    ASSERT_EQ(read.status, 200);
    const std::string revision = read.headers.at("etag");
    EXPECT_EQ(post("writeSettings", R"({"configuration":{"server_port":9001}})", {"If-Match: " + revision}).status,
              200);
    const std::string before = root.read("/Library/Preferences/com.brenn.lumioserverd.plist");
    const HttpReply stale =
        post("writeSettings", R"({"configuration":{"member_uuid":"X"}})", {"If-Match: " + revision});
    EXPECT_EQ(stale.status, 412);
    EXPECT_EQ(valueOf(stale).dictionary()->get("error"), Value("REVISION_CHANGED"));
    EXPECT_EQ(root.read("/Library/Preferences/com.brenn.lumioserverd.plist"), before);
}

TEST_F(Settings, RevisionOfAReadIsOfWhatItsSetupScriptLeft) {
    const std::string script = "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_preferences";
    const std::string file = "/Library/SorvaneProducer/Shared/Server/cluster_preferences.plist";
    root.write("/pending.plist",
               "<plist><dict><key>submissions_groupname</key><string>of the script</string></dict></plist>");
    std::string text = root.read(script);
    text.insert(text.find('\n') + 1, "[ ! -f '" + root.disk("/pending.plist") + "' ] || /bin/mv '" +
                                         root.disk("/pending.plist") + "' '" + root.disk(file) + "'\n");
    root.write(script, text);
    const HttpReply read = post("readSettings", R"({"optionalArguments":{"variant":"getConfig"}})");
    EXPECT_THAT(read.body, HasSubstr("of the script"));
    EXPECT_EQ(post("readSettings", "").headers.at("etag"), read.headers.at("etag"));
    EXPECT_EQ(
        post("writeSettings", R"({"configuration":{"server_port":9001}})", {"If-Match: " + read.headers.at("etag")})
            .status,
        200);
}

TEST_F(Settings, WriteWithTheRevisionOfAReadIsRefusedIfTheServiceWroteWhileThatWasReading) {
    // The service, which writes as soon as the cameras are read, once.
    const std::string file = "/Library/SorvaneProducer/Shared/Server/cluster_preferences.plist";
    root.write("/pending.plist",
               "<plist><dict><key>submissions_groupname</key><string>of the service</string></dict></plist>");
    root.write("/usr/bin/sqlite3",
               "#!/bin/sh\n"
               "for statement; do :; done\n"
               "case \"$statement\" in\n"
               "*' as kind'*) ;;\n"
               "*cameras*) [ ! -f '" +
                   root.disk("/pending.plist") + "' ] || /bin/mv '" + root.disk("/pending.plist") + "' '" +
                   root.disk(file) +
                   "' ;;\n"
                   "esac\n"
                   "exec /usr/bin/sqlite3 \"$@\"\n");
    std::filesystem::permissions(root.disk("/usr/bin/sqlite3"), std::filesystem::perms(0755));
    const HttpReply read = post("readSettings", "");
    ASSERT_EQ(read.status, 200) << read.body;
    EXPECT_THAT(root.read(file), HasSubstr("of the service"));
    const std::string write = R"({"configuration":{"server_port":9001}})";
    EXPECT_EQ(post("writeSettings", write, {"If-Match: " + read.headers.at("etag")}).status, 412);
    const HttpReply again = post("readSettings", "");
    EXPECT_THAT(again.body, HasSubstr("of the service"));
    EXPECT_EQ(post("writeSettings", write, {"If-Match: " + again.headers.at("etag")}).status, 200);
}

}  // namespace
}  // namespace adminhost
