// Daemons that are not as this release's: of another version, slow, or something else on the socket.

#include "tests/support/PlayedServer.h"
#include "tests/support/Program.h"

#include <chrono>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::Contains;
using testing::ContainsRegex;
using testing::EndsWith;
using testing::HasSubstr;
using testing::Not;

ProgramResult ctl(const PlayedServer& server, std::vector<std::string> words) {
    words.insert(words.begin(), {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", server.path()});
    return runProgram(words, Errors::merge);
}

/// A later version: members that this release does not know, new words and types, and members that are missing.
std::string laterVersion(const std::string& request) {
    if (request.starts_with("GET /v1/ ")) {
        return PlayedServer::reply(
            R"({"release": "9.0.0", "interface": 7, "deadlineSeconds": 20, "waiting": 0, "mood": {"good": true},)"
            R"( "plugins": [{"name": "later", "version": "9.0.0", "colour": "blue"}, {"version": "nameless"}, 5]})");
    }
    if (request.starts_with("GET /v1/later ")) {
        return PlayedServer::reply(
            R"([{"name": "paint", "summary": "Paint.", "access": "telepathy", "cost": 5, "state": "later",)"
            R"( "keys": [{"path": "shade", "type": "colour", "help": "Which.", "unit": "angstroms", "rules": ["x", 7]},)"
            R"( {"path": "count", "type": "integer", "minimum": "few", "allowed": {}}, "not a key", {}],)"
            R"( "answer": [{"path": "done", "type": "percentage"}], "errors": [{"what": 1}, "code"], "example": []},)"
            R"( {"name": "bare"}, {"summary": "no name"}, "not a command"])");
    }
    if (request.starts_with("GET /v1/doctor ")) {
        return PlayedServer::reply(R"({"checks": [{"name": "moon", "state": "splendid"}, {}, 5], "more": 1})");
    }
    if (request.starts_with("POST /v1/later/")) {
        return PlayedServer::reply(R"({"done": 0.5, "news": [{"a": 1}, 2]})");
    }
    return "HTTP/1.1 404 Not Found\r\nContent-Length: 20\r\n\r\n{\"error\": \"UNKNOWN\"}";
}

TEST(OtherVersion, CommandsWithUnknownClassesTypesAndMembersAreListedDescribedAndSent) {
    const PlayedServer server(laterVersion);
    EXPECT_THAT(ctl(server, {"commands"}).output, AllOf(HasSubstr("paint"), HasSubstr("Paint."), HasSubstr("bare")));
    const ProgramResult help = ctl(server, {"help", "paint"});
    EXPECT_EQ(help.status, 0);
    EXPECT_THAT(help.output, AllOf(HasSubstr("shade (colour, angstroms)"), HasSubstr("count (whole number)")));
    EXPECT_EQ(ctl(server, {"help", "bare"}).status, 0);
    EXPECT_THAT(ctl(server, {"daemon"}).output, AllOf(HasSubstr("9.0.0"), HasSubstr("mood")));

    const ProgramResult paint = ctl(server, {"paint", "shade=red", "count=3"});
    EXPECT_EQ(paint.status, 0) << paint.output;
    EXPECT_THAT(paint.output, HasSubstr("done  0.5\n"));
    EXPECT_THAT(server.requests(),
                Contains(AllOf(HasSubstr("POST /v1/later/paint "), EndsWith(R"({"shade":"red","count":3})"))));
    EXPECT_EQ(ctl(server, {"paint", "count=three"}).status, 2);
    EXPECT_EQ(ctl(server, {"bare"}).status, 0);
}

TEST(OtherVersion, VerbsThatNeedACommandWhichIsMissingSaySo) {
    const PlayedServer server(laterVersion);
    for (const auto& [words, message] : std::vector<std::pair<std::vector<std::string>, std::string>>{
             {{"camera", "list"}, "command not found: getCameras"},
             {{"access", "anna"}, "command not found: getAccess"},
             {{"settings", "get"}, "no plug-in of the daemon has a state that can be"},
             {{"plan", "/dev/null"}, "no plug-in of the daemon has a state that can be"},
             {{"history"}, "no plug-in of the daemon has a state that can be"},
             {{"explain", "port"}, "no plug-in of the daemon has a state that can be"}}) {
        const ProgramResult result = ctl(server, words);
        EXPECT_EQ(result.status, 2) << words[0];
        EXPECT_THAT(result.output, HasSubstr(message));
    }
}

TEST(OtherVersion, DoctorComparesTheReleasesAndDoesNotTakeAnUnknownStateForGood) {
    const PlayedServer server(laterVersion);
    const ProgramResult doctor = ctl(server, {"doctor"});
    EXPECT_EQ(doctor.status, 2);
    EXPECT_THAT(doctor.output, AllOf(HasSubstr("FAILURE  moon"), HasSubstr("and the daemon 9.0.0."),
                                     HasSubstr("3 checks: 0 ok, 1 warnings, 2 failures\n")));
}

TEST(OtherVersion, AnswerOfAnyFormEndsInAMessageAndAStatus) {
    for (const std::string body :
         {"{}", "[]", "null", "5", "\"text\"", "", "{\"plugins\": 5}",
          "{\"plugins\": [{\"name\": \"x\"}], \"entries\": 7}", "<html>It works!</html>",
          "{\"a\": ", "{\"entries\": [1, null, {}], \"checks\": [1, {}], \"logs\": [{}, 2]}"}) {
        const PlayedServer server([&](const std::string&) { return PlayedServer::reply(body); });
        for (const std::vector<std::string>& words : {std::vector<std::string>{"status"},
                                                      {"doctor"},
                                                      {"daemon"},
                                                      {"commands"},
                                                      {"logs"},
                                                      {"whois", "anna"},
                                                      {"audit"},
                                                      {"camera", "list"},
                                                      {"settings", "get"},
                                                      {"complete", "--", "whois", "a"}}) {
            const ProgramResult result = ctl(server, words);
            EXPECT_LE(result.status, 4) << body << ' ' << words[0] << '\n' << result.output;
            EXPECT_THAT(result.output, AllOf(Not(HasSubstr("std::")), Not(HasSubstr("terminate"))));
            if (result.status != 0) {
                EXPECT_NE(result.output, "") << body << ' ' << words[0];
            }
        }
    }
}

/// A change that is still running, although an account that may not do so has tried to cancel it.
std::string auditOfARunningChange(const std::string&) {
    return PlayedServer::reply(
        R"({"more": false, "next": "n", "entries": [)"
        R"({"event": "begun", "request": "1", "plugin": "p", "command": "change", "uid": 0, "user": "root"},)"
        R"({"event": "cancelled", "request": "1", "plugin": "p", "command": "change", "uid": 20002, "user": "bert",)"
        R"( "status": 403, "result": "NOT_PERMITTED"},)"
        R"({"event": "begun", "request": "2", "plugin": "p", "command": "done", "uid": 0, "user": "root"},)"
        R"({"event": "ended", "request": "2", "plugin": "p", "command": "done", "uid": 0, "user": "root",)"
        R"( "status": 200, "changes": [)"
        R"({"section": "cameras", "name": "Gate", "key": "", "from": "a", "to": null, "unverified": true},)"
        R"({"section": "cameras", "name": "Roof", "key": "", "from": "a", "to": "b"}]}]})");
}

TEST(AuditVerb, RefusedCancellationIsShownAsSuchBesideTheChangeThatIsStillRunning) {
    const PlayedServer server(auditOfARunningChange);
    const std::string table = ctl(server, {"audit"}).output;
    EXPECT_THAT(table, HasSubstr("is not cancelled; 403 NOT_PERMITTED"));
    EXPECT_THAT(table, AllOf(ContainsRegex("root +p/change +begins"), Not(ContainsRegex("root +p/done +begins"))));
}

TEST(AuditVerb, ChangesHaveTheWordsOfTheDaemonsLog) {
    const PlayedServer server(auditOfARunningChange);
    EXPECT_THAT(ctl(server, {"audit"}).output,
                AllOf(HasSubstr("cameras Gate: removed (if it exists)"), HasSubstr("cameras Roof: replaced")));
}

TEST(SlowDaemon, AnswerThatComesByteByByteIsReadToItsEnd) {
    const PlayedServer server(laterVersion, std::chrono::microseconds(100));
    const ProgramResult paint = ctl(server, {"paint", "shade=red"});
    EXPECT_EQ(paint.status, 0) << paint.output;
    EXPECT_THAT(paint.output, HasSubstr("done  0.5\n"));
}

TEST(SlowDaemon, AnswerThatNeverEndsIsGivenUpAfterTheTimeout) {
    // 200 bytes would need 20 seconds.
    const PlayedServer server(laterVersion, std::chrono::milliseconds(100));
    const ProgramResult result = ctl(server, {"--timeout", "0.5", "commands"});
    EXPECT_EQ(result.status, 3);
    EXPECT_THAT(result.output, HasSubstr("the daemon has not answered within 0.5 s"));
}

}  // namespace
}  // namespace adminhost::test
