#include "adminhostd/BegunRequest.h"
#include "adminhostd/ChangeNotes.h"
#include "adminhostd/ForwardingSink.h"
#include "adminhostd/Frame.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

constexpr const char* notes = "/var/lib/adminhostd/begun";

class BegunRequests : public testing::Test {
  protected:
    static protocol::Unfinished about(const std::string& request) {
        protocol::Unfinished about;
        about.request = request;
        about.plugin = "p";
        about.command = "c";
        about.access = Access::write;
        about.caller = {1000, 42, 1005, "session-3.scope"};
        about.user = "anna";
        about.loginUser = "eva";
        return about;
    }

    const test::TemporaryRoot root;
};

TEST_F(BegunRequests, NoteHasTheRequestItsReportsAndItsEnd) {
    protocol::Unfinished expected = about("1-1");
    {
        BegunRequest request(about("1-1"), Redaction());
        EXPECT_EQ(request.problem(), "");
        expected.end = "its operation was interrupted";
        EXPECT_EQ(BegunRequest::left().notes, std::vector{expected}) << "nothing is known yet";
        request.add(Change{"settings", "", "", "port", 80, 443, false, Dictionary{{"port", 80}}});
        request.add(NotDone{"configuration.x", "not known", "words"});
        expected.changes = {Change{"settings", "", "", "port", 80, 443, false, {}, false}};
        expected.notDone = {NotDone{"configuration.x", "not known", "words"}};
        EXPECT_EQ(BegunRequest::left().notes, std::vector{expected});
        request.ended("its operation failed");
    }
    expected.end = "its operation failed";
    EXPECT_EQ(BegunRequest::left().notes, std::vector{expected});
    BegunRequest::remove("1-1");
    EXPECT_THAT(BegunRequest::left().notes, IsEmpty());
    BegunRequest::remove("1-1");
}

TEST_F(BegunRequests, EachAccessIsNotedAndAnUnknownOneCountsAsThatOfAccounts) {
    for (const Access access : {Access::read, Access::write, Access::control, Access::account}) {
        protocol::Unfinished one = about("1-1");
        one.access = access;
        const BegunRequest request(one, Redaction());
        ASSERT_EQ(BegunRequest::left().notes.size(), 1U);
        EXPECT_EQ(BegunRequest::left().notes[0].access, access);
    }
    std::string note = root.read(std::string(notes) + "/1-1");
    note.replace(note.find("\"account\""), 9, "\"another\"");
    root.write(std::string(notes) + "/1-1", note);
    ASSERT_EQ(BegunRequest::left().notes.size(), 1U);
    EXPECT_EQ(BegunRequest::left().notes[0].access, Access::account);
}

TEST_F(BegunRequests, NotesAreForTheDaemonAlone) {
    const BegunRequest request(about("1-1"), Redaction());
    struct stat status {};
    ASSERT_EQ(::stat(root.path(notes).c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0700U);
    ASSERT_EQ(::stat((root.path(notes) / "1-1").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0600U);
}

TEST_F(BegunRequests, NoteHoldsNoSecret) {
    Command command;
    command.description.set("keys", Array{Dictionary{{"path", "password"}, {"secret", true}}});
    BegunRequest request(about("1-1"), Redaction(command, {{"password", "hunter2"}}));
    request.add(Change{"settings", "", "", "password", "old", "hunter2", false, {}});
    request.add(NotDone{"x", "hunter2", "it was hunter2"});
    EXPECT_EQ(root.read(std::string(notes) + "/1-1").find("hunter2"), std::string::npos);
    EXPECT_EQ(root.read(std::string(notes) + "/1-1").find("old"), std::string::npos);
}

TEST_F(BegunRequests, LastLineMayBeIncompleteAndOtherFilesAreRemovedOrIgnored) {
    BegunRequest(about("1-1"), Redaction()).add(NotDone{"x", "why", ""});
    const std::string whole = root.read(std::string(notes) + "/1-1");
    root.write(std::string(notes) + "/1-1", whole + "{\"change\": {\"sec");
    root.write(std::string(notes) + "/1-2", "garbage\n");
    root.write(std::string(notes) + "/1-3", whole);
    root.write(std::string(notes) + "/not a request", "kept");
    const auto all = BegunRequest::left().notes;
    ASSERT_EQ(all.size(), 1U);
    EXPECT_EQ(all[0].request, "1-1");
    EXPECT_EQ(all[0].notDone.size(), 1U);
    EXPECT_FALSE(fs::exists(root.path(std::string(notes) + "/1-2")));
    EXPECT_FALSE(fs::exists(root.path(std::string(notes) + "/1-3"))) << "it is about another request";
    EXPECT_TRUE(fs::exists(root.path(std::string(notes) + "/not a request")));
}

TEST_F(BegunRequests, NotesOfALaterReleaseStayForItAndTheirNumberIsLoggedOnce) {
    const std::string later = R"({"format": 2, "request": "1-1", "more": true})"
                              "\n";
    root.write(std::string(notes) + "/1-1", later);
    root.write(std::string(notes) + "/1-2", later);
    root.write(std::string(notes) + "/1-3", "{\"format\": 0}\n");
    root.write(std::string(notes) + "/1-4", "{\"format\": \"2\"}\n");
    int pair[2] = {-1, -1};
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair), 0);
    const FileDescriptor ours(pair[0]);
    const FileDescriptor fronts(pair[1]);
    ForwardingSink sink(ours.get());
    FrameReader reader;
    ChangeNotes changes(ours.get(), reader, sink);
    const test::CapturedLog log;
    changes.reportUnfinished();
    changes.reportUnfinished();
    EXPECT_THAT(log.lines,
                ElementsAre("adminhostd: /var/lib/adminhostd/begun: notes of a later release, which are kept "
                            "until it is started again: 2"));
    EXPECT_EQ(root.read(std::string(notes) + "/1-1"), later);
    EXPECT_TRUE(fs::exists(root.path(std::string(notes) + "/1-2")));
    EXPECT_FALSE(fs::exists(root.path(std::string(notes) + "/1-3")));
    EXPECT_FALSE(fs::exists(root.path(std::string(notes) + "/1-4")));
}

TEST_F(BegunRequests, RequestThatCannotBeNotedSaysWhy) {
    root.write(notes, "a file in the place of the directory");
    BegunRequest request(about("1-1"), Redaction());
    EXPECT_THAT(request.problem(), HasSubstr("begun"));
    request.add(NotDone{"x", "why", ""});
    request.ended("its operation failed");
    EXPECT_THAT(BegunRequest::left().notes, IsEmpty());
    EXPECT_NE(BegunRequest(about("../../etc/passwd"), Redaction()).problem(), "");
}

TEST_F(BegunRequests, NoteIsBounded) {
    BegunRequest request(about("1-1"), Redaction());
    for (int i = 0; i < 100; ++i) {
        request.add(NotDone{"x", std::string(100'000, 'x'), ""});
    }
    EXPECT_LE(fs::file_size(root.path(std::string(notes) + "/1-1")), BegunRequest::noteMaximum);
    EXPECT_EQ(BegunRequest::left().notes.size(), 1U);
}

TEST_F(BegunRequests, NoteOfARequestThatIsRepeatedIsNotTakenForItsFormerOne) {
    BegunRequest(about("1-1"), Redaction()).ended("its operation failed");
    BegunRequest(about("1-2"), Redaction()).ended("its operation failed");
    int pair[2] = {-1, -1};
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair), 0);
    const FileDescriptor ours(pair[0]);
    const FileDescriptor fronts(pair[1]);
    {
        ForwardingSink sink(ours.get());
        FrameReader reader;
        ChangeNotes changes(ours.get(), reader, sink);
        changes.reportUnfinished();
        for (const char* request : {"1-1", "1-2"}) {
            ASSERT_TRUE(writeFrame(fronts.get(), protocol::frameOf(protocol::Recorded{request})));
        }
        ASSERT_TRUE(writeFrame(fronts.get(), protocol::frameOf(protocol::Proceed{"1-1"})));
        protocol::Perform order;
        order.request = "1-1";
        order.command = "again";
        EXPECT_TRUE(changes.begin(LoadedPlugin(), order));
        ASSERT_EQ(BegunRequest::left().notes.size(), 1U);
        EXPECT_EQ(BegunRequest::left().notes.front().request, "1-1");
        EXPECT_EQ(BegunRequest::left().notes.front().command, "again");
        changes.end(protocol::Outcome::answered);
    }
}

TEST_F(BegunRequests, WorkerDoesNotReportItsOwnNotesAsThoseOfAnEarlierWorker) {
    int pair[2] = {-1, -1};
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair), 0);
    FileDescriptor ours(pair[0]);
    const FileDescriptor fronts(pair[1]);
    std::vector<std::string> unfinished;
    {
        ForwardingSink sink(ours.get());
        FrameReader reader;
        ChangeNotes changes(ours.get(), reader, sink);
        protocol::Perform order;
        order.command = "c";
        for (const char* request : {"1-1", "1-2"}) {
            ASSERT_TRUE(writeFrame(fronts.get(), protocol::frameOf(protocol::Proceed{request})));
            order.request = request;
            changes.reportUnfinished();
            EXPECT_TRUE(changes.begin(LoadedPlugin(), order));
            changes.end(protocol::Outcome::answered);
        }
        changes.reportUnfinished();
    }
    ours.close();
    FrameReader reader;
    while (auto frame = readFrame(fronts.get(), reader)) {
        const auto message = protocol::toFront(*std::move(frame));
        ASSERT_TRUE(message);
        if (const auto* one = std::get_if<protocol::Unfinished>(&*message)) {
            unfinished.push_back(one->request);
        }
    }
    EXPECT_THAT(unfinished, IsEmpty()) << "the front has still to log the ends that it knows";
    EXPECT_EQ(BegunRequest::left().notes.size(), 2U) << "a next worker reports them";
}

}  // namespace
}  // namespace adminhost
