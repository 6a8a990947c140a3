// The answers of each address.

#include "adminhostd/AccountNames.h"
#include "tests/system/host/Host.h"

#include <fstream>
#include <iterator>

namespace adminhost::test {
namespace {

class Answers : public ::testing::Test {
  protected:
    DaemonProcess daemon{withFixture("languages = [\"de\", \"fr\"]\n")};
    UnixHttp client = daemon.connect();
};

TEST_F(Answers, OverviewNamesPluginsCommandsAndTheQueue) {
    const HttpReply reply = client.get("/v1/");
    EXPECT_EQ(reply.status, 200);
    EXPECT_EQ(reply.headers.at("content-type"), "application/json");
    const Dictionary body = dictionaryOf(reply);
    const Dictionary& plugin = *body.get("plugins").array()->front().dictionary();
    EXPECT_EQ(plugin.text("name"), "fixture");
    EXPECT_EQ(plugin.text("version"), "1.2.3");
    EXPECT_EQ(plugin.get("commands").array()->front(), Value("echo"));
    EXPECT_EQ(body.get("waiting"), Value(0));
    EXPECT_FALSE(body.contains("running"));
    EXPECT_FALSE(body.contains("refusedPlugins"));
    EXPECT_EQ(client.get("/v1").status, 200);
}

TEST_F(Answers, OverviewShowsWhatRunsAndSinceWhenWhileItRuns) {
    UnixHttp sleeper = startSleeping(daemon, 1000);
    UnixHttp waiting = daemon.connect();
    waiting.begin("POST", "/v1/fixture/nothing");
    ASSERT_TRUE(eventually([&] { return dictionaryOf(client.get("/v1/")).get("waiting") == Value(1); }));
    const Dictionary body = dictionaryOf(client.get("/v1/"));
    ASSERT_NE(body.get("running").dictionary(), nullptr);
    EXPECT_EQ(body.at("running.command"), Value("sleep"));
    EXPECT_TRUE(body.at("running.since").date().has_value());
    EXPECT_EQ(sleeper.reply().status, 200);
    EXPECT_EQ(waiting.reply().status, 204);
}

TEST_F(Answers, PluginAnswersItsCommandDescriptions) {
    const HttpReply reply = client.get("/v1/fixture");
    EXPECT_EQ(reply.status, 200);
    const auto body = parseJson(reply.body);
    ASSERT_TRUE(body && body->array() != nullptr);
    EXPECT_EQ(body->array()->front().dictionary()->get("name"), Value("echo"));
}

TEST_F(Answers, OperationGetsItsRequestAndAnswersItsDictionary) {
    const HttpReply reply = client.post(
        "/v1/fixture/echo", R"({"a": [1, 2.5, {"$date": "2026-01-31T08:00:00Z"}], "$$b": {"$data": "AAE="}})",
        {"Content-Type: application/json; charset=utf-8"});
    EXPECT_EQ(reply.status, 200);
    EXPECT_EQ(reply.body,
              R"({"command":"echo","request":{"a":[1,2.5,{"$date":"2026-01-31T08:00:00Z"}],"$$b":{"$data":"AAE="}}})"
              "\n");
}

TEST_F(Answers, EmptyBodyIsAnEmptyDictionary) {
    EXPECT_EQ(dictionaryOf(client.post("/v1/fixture/echo")).get("request"), Value(Dictionary{}));
    client.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\n\r\n");
    EXPECT_EQ(client.reply().status, 200);
}

TEST_F(Answers, AnswerOfNothingIs204) {
    const HttpReply reply = client.post("/v1/fixture/nothing", "{}");
    EXPECT_EQ(reply.status, 204);
    EXPECT_EQ(reply.body, "");
    EXPECT_TRUE(reply.headers.contains("request-id"));
}

TEST_F(Answers, FrameworkErrorIs500WithItsTwoKeys) {
    const HttpReply reply = client.post("/v1/fixture/error");
    EXPECT_EQ(reply.status, 500);
    EXPECT_EQ(reply.body, "{\"error\":\"SOME_CODE\",\"message\":\"Some sentence.\"}\n");
}

TEST_F(Answers, WhatAPluginThrowsIsLoggedAndIs500) {
    const HttpReply reply = client.post("/v1/fixture/throw");
    expectError(reply, 500, "INTERNAL_ERROR");
    EXPECT_EQ(reply.body.find("a fault of the plug-in"), std::string::npos) << "only the log gives the reason";
    EXPECT_TRUE(daemon.waitForLog("adminhostd: fixture/throw failed: a fault of the plug-in\n")) << daemon.log();
    EXPECT_EQ(client.post("/v1/fixture/echo").status, 200);
}

TEST_F(Answers, MalformedBodyIs400WithLineAndColumn) {
    const HttpReply reply = client.post("/v1/fixture/echo", "{\n\"a\": }");
    expectError(reply, 400, "MALFORMED_BODY");
    EXPECT_NE(reply.body.find("line 2, column 6"), std::string::npos) << reply.body;
    expectError(client.post("/v1/fixture/echo", "\"text\""), 400, "MALFORMED_BODY");
    expectError(client.post("/v1/fixture/echo", "[]"), 400, "MALFORMED_BODY");
    expectError(client.post("/v1/fixture/echo", "{\"a\":\"\xff\"}"), 400, "MALFORMED_BODY");
    expectError(client.post("/v1/fixture/echo", " "), 400, "MALFORMED_BODY");
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
}

TEST_F(Answers, UnknownNamesAre404AndListTheKnownOnes) {
    const HttpReply command = client.post("/v1/fixture/fly", "{}");
    expectError(command, 404, "UNKNOWN_COMMAND");
    EXPECT_NE(command.body.find("echo, sleep, tool"), std::string::npos);
    const HttpReply plugin = client.get("/v1/other");
    expectError(plugin, 404, "UNKNOWN_PLUGIN");
    EXPECT_NE(plugin.body.find("fixture"), std::string::npos);
    const HttpReply address = client.get("/v2/");
    expectError(address, 404, "UNKNOWN_ADDRESS");
    EXPECT_NE(address.body.find("/v1/PLUGIN/COMMAND"), std::string::npos);
    expectError(client.get("/v1/requests/none"), 404, "UNKNOWN_REQUEST");
    expectError(client.get("/v1/requests"), 404, "UNKNOWN_ADDRESS");
    expectError(client.get("/v1/fixture/echo/more"), 404, "UNKNOWN_COMMAND");
}

TEST_F(Answers, OtherMethodsAre405WithAllow) {
    const HttpReply get = client.get("/v1/fixture/echo");
    expectError(get, 405, "METHOD_NOT_ALLOWED");
    EXPECT_EQ(get.headers.at("allow"), "POST");
    const HttpReply post = client.post("/v1/", "{}");
    expectError(post, 405, "METHOD_NOT_ALLOWED");
    EXPECT_EQ(post.headers.at("allow"), "GET, HEAD");
    expectError(client.request("DELETE", "/v1/fixture"), 405, "METHOD_NOT_ALLOWED");
    expectError(client.request("PUT", "/v1/fixture/echo", "{}"), 405, "METHOD_NOT_ALLOWED");
}

TEST_F(Answers, HeadAnswersWithoutBody) {
    const HttpReply reply = client.request("HEAD", "/v1/");
    EXPECT_EQ(reply.status, 200);
    EXPECT_NE(reply.headers.at("content-length"), "0");
    EXPECT_EQ(client.get("/v1/").status, 200);
}

TEST_F(Answers, OtherTypesAre415) {
    expectError(client.post("/v1/fixture/echo", "{}", {"Content-Type: text/plain"}), 415, "UNSUPPORTED_TYPE");
    expectError(client.post("/v1/fixture/echo", "{}", {"Content-Type: application/json; charset=latin1"}), 415,
                "UNSUPPORTED_TYPE");
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}", {"Content-Type: APPLICATION/JSON;charset=\"UTF-8\""}).status, 200);
}

TEST_F(Answers, RefusedRequestIs422WithTheFindings) {
    const HttpReply reply = client.post("/v1/fixture/echo", R"({"bad": 1})");
    expectError(reply, 422, "REQUEST_REFUSED");
    EXPECT_EQ(dictionaryOf(reply).get("findings"),
              Value(Array{Value(Dictionary{{"keyPath", "bad"}, {"rule", "is bad"}, {"advice", "leave it out"}}),
                          Value(Dictionary{{"keyPath", "bad.too"}, {"rule", "is worse"}, {"advice", "think again"}})}));
}

TEST_F(Answers, BodyBeyondItsBoundIs413) {
    UnixHttp announcing = daemon.connect();
    announcing.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nContent-Length: 8388609\r\n\r\n{");
    expectError(announcing.reply(), 413, "BODY_TOO_LARGE");
    UnixHttp absurd = daemon.connect();
    absurd.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nContent-Length: 9999999999999999999999\r\n\r\n");
    EXPECT_EQ(absurd.reply().status, 413);

    client.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nTransfer-Encoding: chunked\r\n\r\n");
    const std::string chunk(1 << 20, ' ');
    for (int i = 0; i < 9; ++i) {
        client.send("100000\r\n" + chunk + "\r\n");
    }
    client.send("0\r\n\r\n");
    expectError(client.reply(), 413, "BODY_TOO_LARGE");
    EXPECT_EQ(client.get("/v1/").status, 200) << "the connection is usable afterwards";
}

TEST_F(Answers, BodyAtItsBoundIsServed) {
    const std::string head = "{\"a\":\"";
    const std::string body = head + std::string((8 << 20) - head.size() - 2, 'x') + "\"}";
    const HttpReply reply = client.post("/v1/fixture/echo", body);
    EXPECT_EQ(reply.status, 200);
    EXPECT_GT(reply.body.size(), body.size());
}

TEST_F(Answers, ChunkedBodyIsServed) {
    client.send(
        "POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nTransfer-Encoding: "
        "chunked\r\n\r\n3\r\n{\"a\r\n4\r\n\":1}\r\n0\r\n\r\n");
    EXPECT_EQ(dictionaryOf(client.reply()).at("request.a"), Value(1));
}

TEST_F(Answers, ClientThatAsksFirstIsToldToContinue) {
    client.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nExpect: 100-continue\r\nContent-Length: 2\r\n\r\n");
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    client.send("{}");
    EXPECT_EQ(client.reply().status, 200);
}

TEST_F(Answers, PropertyListsAreTheSecondForm) {
    const std::string body =
        "<?xml version=\"1.0\"?><plist "
        "version=\"1.0\"><dict><key>a</key><date>2026-01-31T08:00:00Z</date></dict></plist>";
    const HttpReply json = client.post("/v1/fixture/echo", body, {"Content-Type: application/x-plist"});
    EXPECT_EQ(json.body, "{\"command\":\"echo\",\"request\":{\"a\":{\"$date\":\"2026-01-31T08:00:00Z\"}}}\n");
    const HttpReply list =
        client.post("/v1/fixture/echo", body, {"Content-Type: application/x-plist", "Accept: application/x-plist"});
    EXPECT_EQ(list.headers.at("content-type"), "application/x-plist");
    EXPECT_NE(list.body.find("<date>2026-01-31T08:00:00Z</date>"), std::string::npos) << list.body;
    expectError(client.post("/v1/fixture/echo", "<plist>", {"Content-Type: application/x-plist"}), 400,
                "MALFORMED_BODY");
    const HttpReply error = client.get("/v1/other");
    EXPECT_EQ(error.headers.at("content-type"), "application/json");
}

TEST_F(Answers, FormOfTheAnswerIsTheOneThatAcceptPrefers) {
    const auto type = [&](const char* accept) {
        return client.post("/v1/fixture/echo", "{}", {std::string("Accept: ") + accept}).headers.at("content-type");
    };
    EXPECT_EQ(type("Application/X-Plist"), "application/x-plist");
    EXPECT_EQ(type("application/json, application/x-plist;q=0"), "application/json");
    EXPECT_EQ(type("*/*"), "application/json");
    EXPECT_EQ(type("text/html"), "application/json") << "an answer in another form is better than none";
}

TEST_F(Answers, BodyOfTooManyValuesIs413InBothForms) {
    std::string json = "{\"a\":[0";
    std::string list = "<plist><dict><key>a</key><array>";
    for (int i = 0; i < 100'000; ++i) {
        json += ",0";
        list += "<true/>";
    }
    const HttpReply reply = client.post("/v1/fixture/echo", json + "]}");
    expectError(reply, 413, "BODY_TOO_LARGE");
    EXPECT_NE(reply.body.find("more than 100000 values"), std::string::npos) << reply.body;
    expectError(
        client.post("/v1/fixture/echo", list + "</array></dict></plist>", {"Content-Type: application/x-plist"}), 413,
        "BODY_TOO_LARGE");
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
}

TEST_F(Answers, ZeroByteInAnAddressDoesNotEndIt) {
    expectError(client.post("/v1/fixture/echo%00more", "{}"), 404, "UNKNOWN_COMMAND");
    EXPECT_EQ(client.post("/v1/f%69xture/ec%68o", "{}").status, 200);
    expectError(client.get("/v1/%zz%"), 404, "UNKNOWN_PLUGIN");
}

TEST_F(Answers, WholeAddressIsServedAsItsPath) {
    EXPECT_EQ(client.get("http://localhost/v1/").status, 200);
    EXPECT_EQ(client.post("http://localhost/v1/fixture/echo", "{}").status, 200);
    expectError(client.get("http://localhost"), 404, "UNKNOWN_ADDRESS");
}

TEST_F(Answers, QueryThatIsNotUtf8Is400) {
    expectError(client.get("/v1/directory?match=%ff"), 400, "MALFORMED_ADDRESS");
    EXPECT_EQ(client.get("/v1/directory?match=%c3%a4").status, 200);
}

TEST_F(Answers, MissingHostAndUnknownCodingAreErrorsOfTheUsualForm) {
    UnixHttp nameless = daemon.connect();
    nameless.send("GET /v1/ HTTP/1.1\r\n\r\n");
    expectError(nameless.reply(), 400, "MALFORMED_HEAD");
    UnixHttp old = daemon.connect();
    old.send("GET /v1/ HTTP/1.0\r\n\r\n");
    EXPECT_EQ(old.reply().status, 200);
    UnixHttp packed = daemon.connect();
    packed.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nTransfer-Encoding: gzip\r\n\r\n{}");
    expectError(packed.reply(), 400, "MALFORMED_HEAD");
}

TEST_F(Answers, ClientThatAsksFirstIsRefusedBeforeItSendsABody) {
    client.send("POST /v1/fixture/fly HTTP/1.1\r\nHost: x\r\nExpect: 100-continue\r\nContent-Length: 2\r\n\r\n");
    expectError(client.reply(), 404, "UNKNOWN_COMMAND");
}

TEST_F(Answers, RevisionTravelsAsETagAndGuardsAChange) {
    const HttpReply look = client.post("/v1/fixture/look");
    ASSERT_TRUE(look.headers.contains("etag"));
    const std::string tag = look.headers.at("etag");
    EXPECT_EQ(tag, "\"r1\"");
    EXPECT_FALSE(client.post("/v1/fixture/echo").headers.contains("etag"));
    EXPECT_EQ(client.post("/v1/fixture/change", "{}", {"If-Match: \"r0\", " + tag}).status, 200);
    expectError(client.post("/v1/fixture/change", "{}", {"If-Match: " + tag}), 412, "REVISION_CHANGED");
    EXPECT_EQ(client.post("/v1/fixture/look").headers.at("etag"), "\"r2\"") << "the refused change did not happen";
    EXPECT_EQ(client.post("/v1/fixture/change", "{}", {"If-Match: *"}).status, 200);
    expectError(client.post("/v1/fixture/change", "{}", {"If-Match: r3"}), 400, "PRECONDITION_NOT_UNDERSTOOD");
    expectError(client.post("/v1/fixture/echo", "{}", {"If-Match: \"r3\""}), 400, "PRECONDITION_NOT_UNDERSTOOD");
}

TEST_F(Answers, EmptyConditionIsNeverAnUnguardedChange) {
    using namespace std::string_literals;
    for (const std::string& header : {"If-Match:"s, "If-Match: "s, "If-Match:\t"s, "If-Match: \0"s,
                                      "If-Match: \0\"r1\""s, "If-Match: ,"s, "If-Match:\r\nIf-Match: \"r1\""s}) {
        UnixHttp other = daemon.connect();
        other.begin("POST", "/v1/fixture/change", "{}", {header});
        const HttpReply reply = other.reply();
        EXPECT_EQ(reply.status, 400) << header;
    }
    EXPECT_EQ(client.post("/v1/fixture/look").headers.at("etag"), "\"r1\"") << "nothing was changed";
}

TEST_F(Answers, TwoReadingsOfTheBodysLengthAreRefusedAndTheConnectionIsClosed) {
    const std::string chunks = "2\r\n{}\r\n0\r\n\r\n";
    for (const char* text :
         {"Content-Length: 2\r\nContent-Length: 3\r\n\r\n{}", "Content-Length: 3\r\nContent-Length: 2\r\n\r\n{} ",
          "Content-Length: 0\r\nContent-Length: 2\r\n\r\n{}", "Content-Length: 2\r\nContent-length: 02\r\n\r\n{}"}) {
        UnixHttp other = daemon.connect();
        other.send(std::string("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\n") + text);
        expectError(other.reply(), 400, "MALFORMED_HEAD");
        EXPECT_TRUE(other.closedWithin(std::chrono::seconds(5))) << text;
    }
    for (const char* text : {"Transfer-Encoding: chunked\r\nContent-Length: 2\r\n\r\n",
                             "Content-Length: 2\r\nTransfer-Encoding: chunked\r\n\r\n",
                             "Transfer-Encoding: chunked\r\nTransfer-Encoding: chunked\r\n\r\n",
                             "Transfer-Encoding: gzip\r\nTransfer-Encoding: chunked\r\n\r\n",
                             "Transfer-Encoding: chunked\r\nTransfer-Encoding: identity\r\n\r\n"}) {
        UnixHttp other = daemon.connect();
        other.send(std::string("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\n") + text + chunks);
        expectError(other.reply(), 400, "MALFORMED_HEAD");
        EXPECT_TRUE(other.closedWithin(std::chrono::seconds(5))) << text;
    }
    client.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nContent-Length: 2\r\nContent-Length: 2\r\n\r\n{}");
    EXPECT_EQ(client.reply().status, 200) << "the same length twice has one reading";
}

TEST_F(Answers, RequestIsRememberedWithDurationResultAndLogLines) {
    const HttpReply reply = client.post("/v1/fixture/log", R"({"lines": ["one", "two %s\twith tab", ""]})");
    ASSERT_EQ(reply.status, 204);
    const Dictionary record = dictionaryOf(client.get("/v1/requests/" + reply.headers.at("request-id")));
    EXPECT_EQ(record.text("command"), "log");
    EXPECT_EQ(record.text("plugin"), "fixture");
    EXPECT_EQ(record.text("state"), "done");
    EXPECT_EQ(record.get("status"), Value(204));
    EXPECT_EQ(record.get("uid"), Value(::getuid()));
    EXPECT_GT(record.get("milliseconds").real().value_or(0), 0);
    EXPECT_EQ(record.get("log"), Value(Array{Value("one"), Value("two %s\twith tab"), Value("")}));
    EXPECT_FALSE(record.contains("error"));

    const HttpReply refused = client.post("/v1/fixture/fly", "{}");
    const Dictionary other = dictionaryOf(client.get("/v1/requests/" + refused.headers.at("request-id")));
    EXPECT_EQ(other.text("error"), "UNKNOWN_COMMAND");
    EXPECT_EQ(other.get("status"), Value(404));
}

TEST_F(Answers, TheLatest200RequestsAreRemembered) {
    const std::string first = client.post("/v1/fixture/nothing").headers.at("request-id");
    for (int i = 0; i < 199; ++i) {
        client.post("/v1/fixture/nothing");
    }
    EXPECT_EQ(client.get("/v1/requests/" + first).status, 200);
    client.post("/v1/fixture/nothing");
    EXPECT_EQ(client.get("/v1/requests/" + first).status, 404);
}

TEST_F(Answers, RememberedLogIsBoundedAndFurtherLinesAreCounted) {
    const HttpReply reply = client.post("/v1/fixture/log", R"({"lines": [")" + std::string(60'000, 'x') + R"(", ")" +
                                                               std::string(10'000, 'y') + R"("]})");
    const Dictionary record = dictionaryOf(client.get("/v1/requests/" + reply.headers.at("request-id")));
    EXPECT_EQ(record.get("log").array()->size(), 1U);
    EXPECT_EQ(record.get("logLinesDropped"), Value(1));
    EXPECT_TRUE(daemon.waitForLog(std::string(10'000, 'y'))) << "the system log has all of it";
}

TEST_F(Answers, LogTextArrivesExactlyAsItWasGivenButForControlCharacters) {
    client.post("/v1/fixture/log",
                R"({"lines": ["adminhost_lumio: 100% ä [x]", "a\nadminhostd: forged", "b\u001b[2J\r\u009b"]})");
    ASSERT_TRUE(daemon.waitForLog("fixture/log"));
    EXPECT_NE(daemon.log().find("adminhost_lumio: 100% ä [x]\na\n    adminhostd: forged\nb\\x1b[2J\\r\\u009b\n"),
              std::string::npos)
        << daemon.log();
}

TEST_F(Answers, AuditNamesWhoAskedWhatAndTheResultButNoValue) {
    const HttpReply reply = client.post("/v1/fixture/error", R"({"password": "hunter2"})");
    const std::string expected = "adminhostd: request " + reply.headers.at("request-id") + " fixture/error by " +
                                 uidText(::getuid(), AccountNames().of(::getuid())) + " pid " +
                                 std::to_string(::getpid()) + ": 500 SOME_CODE in ";
    EXPECT_TRUE(daemon.waitForLog(expected)) << daemon.log();
    EXPECT_EQ(daemon.log().find("hunter2"), std::string::npos);
}

TEST_F(Answers, StrangeNamesAreNotLogged) {
    client.post("/v1/fixture/x%0Aadminhostd:%20forged", "{}");
    EXPECT_TRUE(daemon.waitForLog("fixture/(unknown) by uid")) << daemon.log();
    EXPECT_EQ(daemon.log().find("forged"), std::string::npos) << "a name that does not exist may be anything";
}

TEST_F(Answers, StandardOutputOfAnOperationDisturbsNothing) {
    EXPECT_EQ(client.post("/v1/fixture/stdout").status, 204);
    EXPECT_TRUE(daemon.waitForLog("a line on standard output"));
    EXPECT_EQ(client.post("/v1/fixture/nothing").status, 204);
}

TEST_F(Answers, ToolsFindAPrivateDirectoryWithTheFilesThatThePluginGives) {
    const std::string text(dictionaryOf(client.post("/v1/fixture/environment", R"({"files": true})")).text("output"));
    const std::size_t at = text.find("XDG_CONFIG_HOME=");
    ASSERT_NE(at, std::string::npos) << text;
    const std::filesystem::path directory = text.substr(at + 16, text.find('\n', at) - at - 16);
    EXPECT_EQ(std::filesystem::status(directory).permissions(), std::filesystem::perms(0711))
        << "a tool that runs as another account opens its file by name, and nobody else lists the directory";
    std::ifstream file(directory / "tool" / "rc");
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), "of the plug-in\n");
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.wait(), 0);
    EXPECT_FALSE(std::filesystem::exists(directory));
}

TEST(ToolEnvironment, HasNeitherThePrivateDirectoryNorTheDaemonsCredentials) {
    auto options = withFixture();
    options.environment = {"CREDENTIALS_DIRECTORY=/credentials",
                           "LISTEN_PID=1",
                           "LISTEN_FDS=1",
                           "KRB5CCNAME=FILE:/a",
                           "KRB5_CLIENT_KTNAME=/keys",
                           "LDAPURI=ldap://a",
                           "XDG_CONFIG_HOME=/the-account"};
    const DaemonProcess daemon(options);
    const std::string text(dictionaryOf(daemon.connect().post("/v1/fixture/environment")).text("output"));
    EXPECT_NE(text.find("XDG_CONFIG_HOME=/the-account\n"), std::string::npos) << text;
    for (const char* name : {"CREDENTIALS_DIRECTORY", "LISTEN_", "KRB5CCNAME", "KRB5_CLIENT_KTNAME", "LDAP"}) {
        EXPECT_EQ(text.find(name), std::string::npos) << text;
    }
}

TEST_F(Answers, ConfiguredLanguagesReachThePlugins) {
    EXPECT_EQ(dictionaryOf(client.post("/v1/fixture/languages")).get("languages"),
              Value(Array{Value("de"), Value("fr")}));
}

TEST(Languages, ComeFromTheEnvironmentWithoutTheirEncodings) {
    auto options = withFixture();
    options.environment = {"LANGUAGE=", "LC_ALL=de_DE.UTF-8@euro", "LANG=fr_FR.UTF-8"};
    DaemonProcess daemon(options);
    EXPECT_EQ(dictionaryOf(daemon.connect().post("/v1/fixture/languages")).get("languages"),
              Value(Array{Value("de_DE@euro")}));
    options.environment = {"LANGUAGE=uk:ru.KOI8-R", "LC_ALL=", "LC_MESSAGES=", "LANG=C"};
    DaemonProcess second(options);
    EXPECT_EQ(dictionaryOf(second.connect().post("/v1/fixture/languages")).get("languages"),
              Value(Array{Value("uk"), Value("ru")}));
    options.environment = {"LANGUAGE=", "LC_ALL=", "LC_MESSAGES=", "LANG=C.UTF-8"};
    DaemonProcess third(options);
    EXPECT_EQ(dictionaryOf(third.connect().post("/v1/fixture/languages")).get("languages"), Value(Array{}));
}

TEST_F(Answers, LargeAnswerArrivesWhole) {
    const HttpReply reply = client.post("/v1/fixture/large", R"({"bytes": 30000000})");
    EXPECT_EQ(reply.status, 200);
    EXPECT_GT(reply.body.size(), 30'000'000U);
}

TEST_F(Answers, AnswerThatIsTooLargeIsAClearError) {
    expectError(client.post("/v1/fixture/large", R"({"bytes": 140000000})"), 500, "WORKER_FAILED");
    EXPECT_EQ(client.post("/v1/fixture/nothing").status, 204);
}

}  // namespace
}  // namespace adminhost::test
