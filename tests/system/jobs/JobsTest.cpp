// The jobs of an administrator, each in one command or two.

#include "platform/json/Json.h"
#include "tests/system/jobs/Jobs.h"

#include <algorithm>
#include <iterator>

#include <unistd.h>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::ContainsRegex;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::MatchesRegex;
using testing::Not;

std::string uuidOf(const char* kind, const char* name) {
    return SampleRoot::uuidOf(kind, name);
}

/// The document that the command line prints for programs.
Value documentOf(const Ran& ran) {
    const auto value = parseJson(ran.out);
    EXPECT_TRUE(value) << ran.out << ran.err;
    return value.value_or(Value());
}

TEST_F(Jobs, CamerasOfAPerson) {
    const Ran text = ctl({"access", "ben", "--restricted"});
    EXPECT_EQ(text.status, 0);
    EXPECT_EQ(text.err, "");
    EXPECT_THAT(text.out,
                AllOf(ContainsRegex("\ncameras +Camera 00009 +in its list\n"),
                      ContainsRegex("\ncameras +Main hall +through the group lecturers\n"),
                      ContainsRegex("\ncameras +Workshop +in its list \\(disabled\\)\n"), Not(HasSubstr("everyone"))));
    std::set<std::string> expected =
        camerasListing({uuidOf("user", "ben"), uuidOf("group", "lecturers"), uuidOf("group", "staff")});
    for (const std::string& open : sql("select name from cameras where access_control_enabled is not 't'")) {
        expected.erase(open);
    }
    std::set<std::string> shown;
    for (const std::string& line : linesOf(text.out)) {
        if (line.starts_with("cameras ")) {
            const std::size_t begin = line.find_first_not_of(' ', 7);
            shown.insert(line.substr(begin, line.find("  ", begin) - begin));
        }
    }
    EXPECT_EQ(shown, expected);
    EXPECT_GT(expected.size(), 40U);
}

TEST_F(Jobs, GroupToThreeCameras) {
    const Ran allow = ctl({"camera", "allow", "--group", "studio", "Camera 00101", "Camera 00103", "Camera 00105"});
    EXPECT_EQ(allow.status, 0);
    EXPECT_EQ(allow.err, "");
    EXPECT_EQ(allow.out,
              "cameras.\"Camera 00101\".groups.studio: (not allowed) -> (allowed): applied\n"
              "cameras.\"Camera 00103\".groups.studio: (not allowed) -> (allowed): applied\n"
              "cameras.\"Camera 00105\".groups.studio: (not allowed) -> (allowed): applied\n");
    EXPECT_THAT(camerasListing({uuidOf("group", "studio")}),
                ElementsAre("Camera 00101", "Camera 00103", "Camera 00105", "Studio A", "Studio B"));
}

TEST_F(Jobs, Leaver) {
    const std::string kiosk = uuidOf("user", "kiosk");
    const std::string others = "select * from access_control_entries where record_uuid <> '" + kiosk + "'";
    const std::vector<std::string> before = sql(others);
    std::string expected;
    for (const std::string& name : sql("select name from cameras where id in (select resource_id from "
                                       "access_control_entries where record_uuid = '" +
                                       kiosk + "') order by id")) {
        expected += "cameras.\"" + name + "\".users.kiosk: (allowed) -> (not allowed): applied\n";
    }
    const Ran revoke = ctl({"access", "kiosk", "--revoke"});
    EXPECT_EQ(revoke.status, 0);
    EXPECT_EQ(revoke.err, "");
    EXPECT_EQ(revoke.out, expected);
    EXPECT_THAT(camerasListing({kiosk}), IsEmpty());
    EXPECT_EQ(sql(others), before) << "nobody else's access changes";
    EXPECT_EQ(ctl({"access", "kiosk", "--revoke"}).out, "no change\n");
}

TEST_F(Jobs, WhoChangedASettingYesterday) {
    ASSERT_EQ(ctl({"settings", "set", "tunnel_timeout_seconds", "45"}).status, 0);
    // The change becomes one of yesterday.
    const char* const program =
        "import datetime, glob, plistlib, sys\n"
        "day = datetime.date.today()\n"
        "noon = datetime.datetime.combine(day - datetime.timedelta(days=1), datetime.time(12)).astimezone()\n"
        "for path in glob.glob(sys.argv[1] + '/var/lib/adminhostd/history/lumio/[0-9]*/about.plist'):\n"
        "    entry = plistlib.load(open(path, 'rb'))\n"
        "    if entry['changes'][0]['key'] == 'tunnel_timeout_seconds':\n"
        "        entry['when'] = noon.astimezone(datetime.timezone.utc).replace(tzinfo=None)\n"
        "        plistlib.dump(entry, open(path, 'wb'))\n"
        "print(day)\n";
    const std::vector<std::string> backdate{"/usr/bin/python3", "-S", "-c", program, root->path()};
    Ran yesterday;
    Ran today;
    for (std::string day; day != runBare(backdate).out;) {  // again if midnight comes meanwhile
        day = runBare(backdate).out;
        yesterday = history("tunnel_timeout_seconds", "yesterday");
        today = history("tunnel_timeout_seconds", "today");
    }
    EXPECT_EQ(yesterday.status, 0);
    EXPECT_EQ(yesterday.err, "");
    const std::vector<std::string> lines = linesOf(yesterday.out);
    ASSERT_EQ(lines.size(), 4U) << yesterday.out;
    EXPECT_THAT(lines[0], MatchesRegex("NUMBER +WHEN +WHO +CHANGED"));
    EXPECT_THAT(lines[1], MatchesRegex(" *[0-9]+  [0-9]+ [A-Z][a-z]+ [0-9]+, 12:00:00 [^ ]+  .*\\(uid " +
                                       std::to_string(::geteuid()) + "\\)  tunnel_timeout_seconds: 30 s -> 45 s"));
    EXPECT_EQ(today.out, "No such change has been recorded.\n");
}

TEST_F(Jobs, PortAndCertificateAndWhetherARestartFollows) {
    const std::string certificate = "/etc/ssl/certs/web.pem";
    const Ran port = ctl({"settings", "set", "server_port", "8443"});
    EXPECT_EQ(port.status, 0);
    EXPECT_EQ(port.err, "");
    EXPECT_EQ(port.out, "settings.server_port: 8170 -> 8443: applied\n");
    const Ran file = ctl({"settings", "set", "ssl_certificate_file", certificate});
    EXPECT_EQ(file.status, 0);
    EXPECT_EQ(file.err, "");
    EXPECT_EQ(file.out,
              "settings.ssl_certificate_file: \"/etc/ssl/certs/media1.pem\" -> \"/etc/ssl/certs/web.pem\": applied\n");
    EXPECT_EQ(valueIn(root->memberPreferencesPath(), "server_port"), "8443");
    EXPECT_EQ(valueIn(root->memberPreferencesPath(), "ssl_certificate_file"), certificate);
    // A setting that takes effect after a restart only has a line that says what to run.
    const Ran controller = ctl({"settings", "set", "nimbo_client_username", "grid2"});
    EXPECT_EQ(controller.status, 0);
    EXPECT_EQ(controller.err, "");
    EXPECT_EQ(controller.out,
              "settings.nimbo_client_username: \"lumiogrid\" -> \"grid2\": applied\n"
              "the service has to be restarted for this to take effect: adminhostctl stopService, then startService\n");
    EXPECT_THAT(ctl({"explain", "server_port"}).out, ContainsRegex("\nrestart +not needed\n"));
}

TEST_F(Jobs, SettingsUnderVersionControlForASecondHostWithTwoDifferences) {
    const std::string base = root->directory() + "/base.toml";
    const Ran exported = ctl({"export", base});
    EXPECT_EQ(exported.status, 0);
    EXPECT_EQ(exported.err, "");
    EXPECT_EQ(exported.out, "");
    const std::string text = contentOf(base);
    EXPECT_THAT(text, AllOf(HasSubstr("\n[settings]\n"), HasSubstr("\nagent_timeout_seconds = 60\n"),
                            HasSubstr("\n[cameras.\"Camera 00988\"]\n"), Not(HasSubstr("correct horse"))));
    EXPECT_EQ(ctl({"export", "-"}).out, text) << "no difference for version control while nothing changes";

    // The second host has cameras of its own.
    const SampleRoot secondRoot;
    DaemonProcess::Options options;
    options.arguments = {"--root", secondRoot.path(), "--plugin", BINARY_DIR "/lib/adminhost_lumio.so"};
    const DaemonProcess second(options);
    const auto onSecond = [&](std::vector<std::string> words) {
        words.insert(words.begin(), {ctlProgram, "--socket", second.socket()});
        return runBare(words);
    };
    secondRoot.sql("update properties set value = 'fr' where name = 'default_language'");
    const std::string host =
        file("host2.toml", "[settings]\nserver_host = \"media2.example.org\"\nserver_port = 8171\n");
    const Ran plan = onSecond({"plan", base, host, "--only", "settings,properties"});
    EXPECT_EQ(plan.status, 0);
    EXPECT_THAT(plan.out,
                AllOf(HasSubstr("settings.server_host: \"media1.example.org\" -> \"media2.example.org\"\n"),
                      HasSubstr("settings.server_port: 8170 -> 8171\n"),
                      HasSubstr("properties.default_language.value: \"fr\" -> \"de\"\n"), Not(HasSubstr("cameras"))));
    EXPECT_EQ(valueIn(secondRoot.memberPreferencesPath(), "server_port"), "8170");
    const Ran apply = onSecond({"apply", base, host, "--only", "settings,properties"});
    EXPECT_EQ(apply.status, 0) << apply.err;
    for (const std::string& line : linesOf(plan.out)) {
        EXPECT_THAT(apply.out, HasSubstr(line.find(" -> ") == std::string::npos ? line : line + ": applied\n"));
    }
    EXPECT_EQ(valueIn(secondRoot.memberPreferencesPath(), "server_host"), "media2.example.org");
    EXPECT_EQ(valueIn(secondRoot.memberPreferencesPath(), "server_port"), "8171");
    EXPECT_EQ(valueIn(secondRoot.clusterPreferencesPath(), "agent_timeout_seconds"), "60");
    EXPECT_EQ(secondRoot.sql("select value from properties where name = 'default_language'"), "de\n");
    EXPECT_EQ(onSecond({"apply", base, host, "--only", "settings,properties"}).out, "no change\n");
}

TEST_F(Jobs, PasswordRotation) {
    const Ran grid = ctl({"settings", "set", "nimbo_client_password", "@" + file("grid", "new grid password\n")});
    EXPECT_EQ(grid.status, 0);
    EXPECT_EQ(grid.err, "");
    EXPECT_THAT(grid.out, testing::StartsWith("settings.nimbo_client_password: (secret) -> (secret): applied\n"));
    EXPECT_EQ(decipheredText(valueIn(root->clusterPreferencesPath(), "nimbo_client_password")), "new grid password");
    const Ran mail = ctl({"property", "set", "mail_password", "@" + file("mail", "new mail password\n")});
    EXPECT_EQ(mail.status, 0);
    EXPECT_EQ(mail.err, "");
    EXPECT_EQ(mail.out, "properties.mail_password.value: (secret) -> (secret): applied\n");
    EXPECT_EQ(decipheredText(root->sql("select value from properties where name = 'mail_password'")),
              "new mail password");
}

TEST_F(Jobs, WhyAChangeWasNotApplied) {
    root->setSwitch("lumioconfig.error", "cannot connect to the service's database");
    root->setSwitch("lumioconfig.exit", "3");
    const Ran allow = ctl({"camera", "allow", "Camera 00111", "carla"});
    root->clearSwitches();
    EXPECT_EQ(allow.status, 1);
    EXPECT_EQ(
        allow.out,
        "cameras.\"Camera 00111\".users.carla: (not allowed) -> (allowed): FAILED: not added: the configuration tool "
        "failed with status 3 (cannot connect to the service's database)\n");
    EXPECT_EQ(allow.err, "the request logged nothing\n");
    EXPECT_THAT(camerasListing({uuidOf("user", "carla")}), Not(testing::Contains("Camera 00111")));
}

TEST_F(Jobs, RecoveryFromAWrongChangeOfSettings) {
    ASSERT_EQ(ctl({"settings", "set", "tunnel_server_host", "wrong.example.org"}).status, 0);
    const Ran changes = history("tunnel_server_host", "1h");
    EXPECT_THAT(changes.out, ContainsRegex("tunnel_server_host: \"tunnel.example.org\" -> \"wrong.example.org\"\n"));
    const std::string row = linesOf(changes.out).at(1);
    const std::size_t begin = row.find_first_not_of(' ');
    const Ran rollback = ctl({"rollback", row.substr(begin, row.find(' ', begin) - begin)});
    EXPECT_EQ(rollback.status, 0);
    EXPECT_EQ(rollback.err, "");
    EXPECT_EQ(rollback.out, "settings.tunnel_server_host: \"wrong.example.org\" -> \"tunnel.example.org\": applied\n");
    EXPECT_EQ(valueIn(root->memberPreferencesPath(), "tunnel_server_host"), "tunnel.example.org");
}

TEST_F(Jobs, RecoveryFromAWrongChangeOfAccess) {
    ASSERT_EQ(ctl({"camera", "deny", "Lecture hall 1", "lecturers"}).status, 0);
    ASSERT_THAT(camerasListing({uuidOf("group", "lecturers")}), Not(testing::Contains("Lecture hall 1")));
    const Ran changes = history("Lecture hall 1", "1h");
    EXPECT_EQ(changes.err, "");
    const std::vector<std::string> lines = linesOf(changes.out);
    ASSERT_EQ(lines.size(), 4U) << changes.out;
    EXPECT_THAT(lines[1], AllOf(testing::StartsWith("r"),
                                testing::EndsWith("  cameras.\"Lecture hall 1\".groups.lecturers: (allowed) -> (not "
                                                  "allowed)")));
    const Ran rollback = ctl({"rollback", lines[1].substr(0, lines[1].find(' '))});
    EXPECT_EQ(rollback.status, 0);
    EXPECT_EQ(rollback.err, "");
    EXPECT_EQ(rollback.out, "cameras.\"Lecture hall 1\".groups.lecturers: (not allowed) -> (allowed): applied\n");
    EXPECT_THAT(camerasListing({uuidOf("group", "lecturers")}), testing::Contains("Lecture hall 1"));
}

TEST_F(Jobs, HealthCheckInAScript) {
    const Ran stopped = script("if $CTL status >/dev/null; then echo running; else echo \"not running: $?\"; fi");
    EXPECT_EQ(stopped.out, "not running: 3\n");
    EXPECT_EQ(stopped.err, "");
    const Ran started = script("$CTL start && $CTL status >/dev/null && echo running");
    EXPECT_EQ(started.out, "The service has been started.\nrunning\n");
    EXPECT_NE(root->read("/var/run/lumioserverd.pid"), "");
    EXPECT_EQ(script("$CTL stop && $CTL status >/dev/null; echo $?").out, "The service has been stopped.\n3\n");

    const Ran doctor = ctl({"--format", "json", "doctor"});
    EXPECT_EQ(doctor.err, "");
    const Value document = documentOf(doctor);
    const Array checks = *document.dictionary()->get("checks").array();
    const auto has = [&](const char* state) {
        return std::any_of(checks.begin(), checks.end(),
                           [&](const Value& check) { return check.dictionary()->text("state") == state; });
    };
    EXPECT_EQ(doctor.status, has("failure") ? 2 : has("warning") ? 1 : 0);
    EXPECT_TRUE(has("ok"));
    for (const Value& check : checks) {
        const bool isOk = check.dictionary()->text("state") == "ok";
        EXPECT_EQ(check.dictionary()->text("fix").empty(), isOk) << doctor.out;
    }
}

TEST_F(Jobs, Completion) {
    const Ran bash = runBare({"/bin/bash", "-c",
                              "PATH=" BINARY_DIR "/bin:/usr/bin\n"
                              "source " SOURCE_DIR "/packaging/completion/adminhostctl\n"
                              "COMP_WORDS=(adminhostctl --timeout 60 --socket " +
                                  daemon->socket() +
                                  " camera show 'Camera\\ 0098') COMP_CWORD=7 COMPREPLY=()\n"
                                  "_adminhostctl\nprintf '%s\\n' \"${COMPREPLY[@]}\"\n"});
    EXPECT_EQ(bash.status, 0);
    EXPECT_EQ(bash.err, "");
    std::vector<std::string> expected = sql("select name from cameras where name like 'Camera 0098%' order by id");
    for (std::string& name : expected) {
        name.insert(name.find(' '), 1, '\\');
    }
    EXPECT_EQ(linesOf(bash.out), expected);
    EXPECT_EQ(expected.size(), 9U);
}

TEST_F(Jobs, ManPage) {
    const Ran man = runBare({"/usr/bin/man", "-l", SOURCE_DIR "/packaging/man/adminhostctl.1"});
    EXPECT_EQ(man.status, 0);
    EXPECT_EQ(man.err, "");
    EXPECT_THAT(man.out, AllOf(HasSubstr("EXIT STATUS"), ContainsRegex("camera allow camera name")));
    const std::string help = ctl({"help"}).out;
    std::size_t verbs = 0;
    for (const std::string& line : linesOf(help.substr(help.find("\nVerbs:\n") + 8))) {
        if (line.empty()) {
            break;
        }
        if (line.find_first_not_of(' ') == 2) {
            EXPECT_THAT(man.out, ContainsRegex("\n +" + line.substr(2, line.find(' ', 2) - 2) + "[ \n]"));
            ++verbs;
        }
    }
    EXPECT_GT(verbs, 20U);
}

TEST_F(Jobs, AnswerForJq) {
    const Ran paused = script(
        "$CTL --format json camera list --columns name,recording_status | "
        "/usr/bin/jq -r '.[] | select(.recording_status == \"paused\") | .name'");
    EXPECT_EQ(paused.status, 0);
    EXPECT_EQ(paused.err, "");
    EXPECT_EQ(linesOf(paused.out),
              sql("select name from cameras where recording_status = 'paused' and disabled is not 't' order by id"));
}

TEST_F(Jobs, UnattendedRun) {
    const Ran removed = script("exec $CTL property remove episode_author </dev/null");
    EXPECT_EQ(removed.status, 0);
    EXPECT_EQ(removed.err, "");
    EXPECT_EQ(removed.out, "properties.episode_author: \"Academy of Examples\" -> (removed): applied\n");
    EXPECT_THAT(sql("select name from properties where name = 'episode_author'"), IsEmpty());
    // It never waits for a word that nobody types.
    const std::string before = root->sql("select value from properties where name = 'upload_token'");
    const Ran secret = script("exec $CTL property set upload_token </dev/null");
    EXPECT_EQ(secret.status, 2);
    EXPECT_EQ(secret.out, "");
    EXPECT_EQ(secret.err, "adminhostctl: the value of \"upload_token\": the value is missing; use @FILE or @-\n");
    const Ran empty = script("exec $CTL property set upload_token @- </dev/null");
    EXPECT_EQ(empty.status, 2);
    EXPECT_THAT(empty.err, HasSubstr("the value is empty"));
    EXPECT_EQ(root->sql("select value from properties where name = 'upload_token'"), before);
}

TEST_F(Jobs, ThousandCameras) {
    const Ran list = ctl({"camera", "list", "--columns", "name,status", "--sort", "name"});
    EXPECT_EQ(list.status, 0);
    EXPECT_EQ(list.err, "");
    std::vector<std::string> lines = linesOf(list.out);
    ASSERT_FALSE(lines.empty());
    EXPECT_THAT(lines.front(), MatchesRegex("NAME +STATUS"));
    lines.erase(lines.begin());
    for (std::string& line : lines) {
        line.resize(std::min(line.size(), line.find("  ")));
    }
    EXPECT_EQ(lines, sql("select name from cameras where disabled is not 't' order by name collate binary"));
    EXPECT_GT(lines.size(), 990U);
}

}  // namespace
}  // namespace adminhost::test
