// "explain KEY": everything about one setting.

#include "tests/system/apply/ControlledService.h"

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::Not;

using Explain = ControlledService;

TEST_F(Explain, SettingIsShownWithRangeValueRestartAndLastChange) {
    EXPECT_THAT(ctl({"explain", "server_port"}).output,
                AllOf(ContainsRegex("meaning +Port of the web application.\n"), ContainsRegex("type +whole number\n"),
                      ContainsRegex("range +1 to 65534\n"), ContainsRegex("value +8170\n"),
                      ContainsRegex("restart +not needed\n"), ContainsRegex("last change +not in the history\n")));
    ASSERT_EQ(ctl({"settings", "set", "server_port", "8180"}).status, 0);
    ASSERT_EQ(ctl({"settings", "set", "max_file_size_in_mb", "100"}).status, 0);
    EXPECT_THAT(ctl({"explain", "server_port"}).output,
                ContainsRegex("last change +[0-9]+ (second|minute)s? ago, .*by .*\\(uid [0-9]+\\): 8170 -> 8180\n"));
    EXPECT_THAT(ctl({"explain", "max_file_size_in_mb"}).output, ContainsRegex("unit +megabytes\n"));
}

TEST_F(Explain, DefaultIsTheServicesWhereTheDaemonKnowsIt) {
    EXPECT_THAT(ctl({"explain", "shared_filesystem"}).output,
                AllOf(ContainsRegex("default +/Library/SorvaneProducer/Shared\n"),
                      ContainsRegex("restart +needed: adminhostctl stopService, then startService\n")));
    EXPECT_THAT(ctl({"explain", "http_auth_type"}).output, ContainsRegex("default +the service's own"));
    EXPECT_THAT(ctl({"explain", "web_app_url"}).output, ContainsRegex("written +by the service only\n"));
}

TEST_F(Explain, SecretIsNotShown) {
    ASSERT_EQ(ctl({"settings", "set", "nimbo_client_password", "@" + file("new", "hunter2")}).status, 0);
    EXPECT_THAT(
        ctl({"explain", "nimbo_client_password"}).output,
        AllOf(ContainsRegex("type +text, secret\n"), ContainsRegex("value +\\(secret\\)\n"),
              ContainsRegex("last change .*: \\(secret\\)\n"), Not(HasSubstr("hunter2")), Not(HasSubstr("default"))));
}

TEST_F(Explain, NameThatIsNotASettingIsUsage) {
    for (const char* name : {"server_prt", "cameras", "workflows[].name", ""}) {
        EXPECT_EQ(ctl({"explain", name}).status, 2) << name;
    }
    EXPECT_THAT(ctl({"explain", "server_prt"}).output, HasSubstr("did you mean \"server_port\"?"));
}

}  // namespace
}  // namespace adminhost::test
