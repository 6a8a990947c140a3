#include "platform/log/JournalSocket.h"
#include "platform/log/Log.h"
#include "platform/log/QueuedSink.h"
#include "platform/log/StandardError.h"
#include "platform/log/SystemLog.h"

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

using namespace adminhost;

class Recorder final : public LogSink {
  public:
    void write(std::string_view event) noexcept override { _events.emplace_back(event); }
    [[nodiscard]] const std::vector<std::string>& events() const noexcept { return _events; }

  private:
    std::vector<std::string> _events;
};

class Log : public testing::Test {
  protected:
    void TearDown() override { setLogSink(standardErrorSink()); }
};

TEST_F(Log, FirstSinkIsStandardErrorWithTheExactTextAndALineFeed) {
    testing::internal::CaptureStderr();
    logEvent("adminhost_lumio: capturing% %s %n \\ à");
    logEvent("");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "adminhost_lumio: capturing% %s %n \\ à\n\n");
}

TEST_F(Log, TextWithoutControlCharactersIsLoggedAsItIs) {
    for (const char* text :
         {"", "adminhost_lumio: start result: 0", "100% %s %n \\n \\ \"\" à 日本 \xf0\x9f\x8e\xac \xc2\xa0"}) {
        EXPECT_EQ(logTextOf(text), text);
    }
}

TEST_F(Log, ControlCharactersAndBrokenUtf8AreEscaped) {
    using namespace std::string_view_literals;
    EXPECT_EQ(logTextOf("a\tb\rc\x1b[2Jd\0e\x07\x7f"sv), "a\\tb\\rc\\x1b[2Jd\\x00e\\x07\\x7f");
    EXPECT_EQ(logTextOf("\xc2\x80 \xc2\x85 \xc2\x9b\xc2\x9f"), "\\u0080 \\u0085 \\u009b\\u009f");
    EXPECT_EQ(logTextOf("\x9b \xff \xc3"), "\\x9b \\xff \\xc3");
    EXPECT_EQ(logTextOf("\xe0\x80\x80"), "\\xe0\\x80\\x80") << "an overlong form";
    EXPECT_EQ(logTextOf("\xed\xa0\x80"), "\\xed\\xa0\\x80") << "a surrogate";
    for (int byte = 0; byte < 256; ++byte) {
        const std::string text = logTextOf(std::string(1, static_cast<char>(byte)) + "x");
        for (const char c : text) {
            EXPECT_TRUE(c == '\n' ? byte == '\n' : c >= 0x20 && c < 0x7f) << byte;
        }
    }
}

TEST_F(Log, LinesAfterTheFirstAreIndentedSoThatNoneLooksLikeAnEvent) {
    EXPECT_EQ(logTextOf("{\n    a = 1;\n}"), "{\n        a = 1;\n    }");
    EXPECT_EQ(logTextOf("name\nadminhostd: forged"), "name\n    adminhostd: forged");
    EXPECT_EQ(logTextOf("two\n\n"), "two");
    EXPECT_EQ(logTextOf("\nadminhostd: forged"), "\n    adminhostd: forged");
    testing::internal::CaptureStderr();
    standardErrorSink().write("name\nadminhostd: forged\n");
    standardErrorSink().write("next");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "name\n    adminhostd: forged\nnext\n");
}

TEST_F(Log, LongEventArrivesWhole) {
    const std::string event(1'000'000, 'x');
    testing::internal::CaptureStderr();
    logEvent(event);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), event + "\n");
}

TEST_F(Log, EventsGoToTheSinkThatIsSetOneByOne) {
    Recorder recorder;
    setLogSink(recorder);
    logEvent("one");
    logEvent("two\n");
    setLogSink(standardErrorSink());
    testing::internal::CaptureStderr();
    logEvent("three");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "three\n");
    EXPECT_EQ(recorder.events(), (std::vector<std::string>{"one", "two\n"}));
}

/// While it exists, standard error is a pipe or socket of the test.
class RedirectedError {
  public:
    explicit RedirectedError(int descriptor) : _before(::dup(STDERR_FILENO)) { ::dup2(descriptor, STDERR_FILENO); }
    RedirectedError(const RedirectedError&) = delete;
    RedirectedError& operator=(const RedirectedError&) = delete;
    ~RedirectedError() {
        ::dup2(_before, STDERR_FILENO);
        ::close(_before);
    }

  private:
    int _before;
};

/// What can be read at once.
std::string readable(int descriptor) {
    std::string text;
    char buffer[64 << 10];
    pollfd entry{descriptor, POLLIN, 0};
    while (::poll(&entry, 1, 0) == 1) {
        const ssize_t count = ::read(descriptor, buffer, sizeof buffer);
        if (count <= 0) {
            break;
        }
        text.append(buffer, static_cast<std::size_t>(count));
    }
    return text;
}

/// Logs far more than fits into the output and the queue, then reads all of it: every event is there or counted.
void expectNothingLostUncounted(int reader) {
    constexpr std::size_t events = 60'000;
    const std::string padding(40, 'x');
    for (std::size_t i = 0; i < events; ++i) {
        logEvent(padding + std::to_string(i));  // blocks for ever if the sink blocks
    }
    std::string text;
    for (int tries = 0; tries < 10'000 && text.find("events were lost") == std::string::npos; ++tries) {
        text += readable(reader);
        flushLog();
    }
    logEvent("after");
    text += readable(reader);
    const std::size_t at = text.find("adminhost: ");
    ASSERT_NE(at, std::string::npos) << text.substr(0, 300);
    const std::size_t lost = std::stoul(text.substr(at + 11));
    EXPECT_EQ(text.substr(text.find('\n', at) + 1), "after\n");
    std::size_t kept = 0;
    for (std::size_t line = 0; line < at; line = text.find('\n', line) + 1) {
        ASSERT_EQ(text.compare(line, padding.size(), padding), 0) << text.substr(line, 100);
        EXPECT_EQ(text.substr(line + padding.size(), text.find('\n', line) - line - padding.size()),
                  std::to_string(kept));
        ++kept;
    }
    EXPECT_EQ(kept + lost, events);
    EXPECT_GT(kept * (padding.size() + 1), QueuedSink::maximum / 2) << "a queue that is used";
}

TEST_F(Log, PipeThatNobodyReadsDoesNotBlockAndLostEventsAreCounted) {
    int ends[2];
    ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    {
        const RedirectedError redirected(ends[1]);
        expectNothingLostUncounted(ends[0]);
    }
    EXPECT_EQ(::fcntl(ends[1], F_GETFL) & O_NONBLOCK, 0) << "other processes that share the pipe still wait";
    ::close(ends[0]);
    ::close(ends[1]);
}

TEST_F(Log, SocketThatNobodyReadsDoesNotBlockAndLostEventsAreCounted) {
    int ends[2];
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    {
        const RedirectedError redirected(ends[1]);
        expectNothingLostUncounted(ends[0]);
    }
    ::close(ends[0]);
    ::close(ends[1]);
}

TEST_F(Log, LongEventGoesThroughAPipeInParts) {
    int ends[2];
    ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
    const std::string event(3'000'000, 'x');
    std::string text;
    {
        const RedirectedError redirected(ends[1]);
        logEvent(event);
        while (!flushLog()) {
            text += readable(ends[0]);
        }
        text += readable(ends[0]);
    }
    EXPECT_EQ(text, event + "\n");
    ::close(ends[0]);
    ::close(ends[1]);
}

TEST_F(Log, EventsThatCannotBeWrittenAtAllAreCounted) {
    using Written = QueuedSink::Written;
    bool works = false;
    std::string text;
    QueuedSink sink([&](std::string_view line) {
        if (!works) {
            return Written{QueuedSink::Outcome::failed};
        }
        text += line;
        return Written{QueuedSink::Outcome::written};
    });
    for (int i = 0; i < 5; ++i) {
        sink.write("unwritten");
    }
    works = true;
    sink.write("first");
    EXPECT_EQ(text, "adminhost: 5 events were lost: the log could not be written\nfirst\n");
}

/// A syslog socket for one test.
class SystemLogSocket : public Log {
  protected:
    SystemLogSocket() { listen(); }
    ~SystemLogSocket() override {
        ::close(socket);
        std::filesystem::remove_all(directory);
    }
    SystemLogSocket(const SystemLogSocket&) = delete;
    SystemLogSocket& operator=(const SystemLogSocket&) = delete;

    void listen() {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path().copy(address.sun_path, sizeof address.sun_path - 1);
        ::unlink(path().c_str());
        socket = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
        EXPECT_EQ(::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    }
    std::string path() const { return directory + "/log"; }
    /// One message; nullopt when there is none.
    std::optional<std::string> message() const {
        std::string buffer(std::size_t{1} << 20U, '\0');
        const ssize_t size = ::recv(socket, buffer.data(), buffer.size(), 0);
        return size < 0 ? std::nullopt : std::optional(buffer.substr(0, static_cast<std::size_t>(size)));
    }

    static std::string newDirectory() {
        std::string path = (std::filesystem::temp_directory_path() / "log.XXXXXX").string();
        EXPECT_NE(::mkdtemp(path.data()), nullptr);
        return path;
    }

    std::string directory = newDirectory();
    int socket = -1;
    SystemLog log{path()};
    QueuedSink sink{[this](std::string_view text) { return log.write(text); }};
};

TEST_F(SystemLogSocket, EventIsOneMessageWithPriorityTimeAndProgram) {
    sink.write("adminhost_lumio: 100% %s\n}\n");
    const auto text = message();
    ASSERT_TRUE(text);
    EXPECT_THAT(*text, testing::MatchesRegex("<29>[A-Z][a-z][a-z] [ 1-3][0-9] [0-9][0-9]:[0-9][0-9]:[0-9][0-9] "
                                             "unit_platform_log: adminhost_lumio: 100% %s\n    }"));
    EXPECT_FALSE(message());
}

TEST_F(SystemLogSocket, ReaderThatIsStuckDoesNotBlockAndLostEventsAreCounted) {
    constexpr std::size_t events = 60'000;
    for (std::size_t i = 0; i < events; ++i) {
        sink.write("event " + std::to_string(i) + std::string(40, 'x'));
    }
    std::size_t kept = 0;
    std::size_t lost = 0;
    for (int idle = 0; idle < 2;) {
        sink.flush();
        const auto text = message();
        idle = text ? 0 : idle + 1;
        if (text && text->find(": adminhost: ") != std::string::npos) {
            lost = std::stoul(text->substr(text->find(": adminhost: ") + 13));
        } else if (text) {
            EXPECT_NE(text->find("event " + std::to_string(kept) + "x"), std::string::npos) << *text;
            ++kept;
        }
    }
    EXPECT_EQ(kept + lost, events);
    EXPECT_GT(lost, 0U);
    EXPECT_EQ(sink.lostInTotal(), lost);
}

TEST_F(SystemLogSocket, RestartedReaderGetsWhatWasLoggedMeanwhile) {
    sink.write("one");
    ASSERT_TRUE(message());
    ::close(socket);
    sink.write("two");
    EXPECT_FALSE(sink.flush());
    listen();
    EXPECT_TRUE(sink.flush());
    EXPECT_THAT(message().value_or(""), testing::EndsWith(": two"));
}

TEST_F(SystemLogSocket, TextThatIsTooLongIsCutBetweenCharacters) {
    std::string event;
    while (event.size() < 3'000'000) {
        event += "日本x";
    }
    sink.write(event);
    const std::string text = message().value_or("");
    ASSERT_THAT(text, testing::EndsWith(" more bytes)"));
    const std::size_t begin = text.find("日");
    const std::size_t end = text.rfind(" (");
    EXPECT_EQ(event.compare(0, end - begin, text, begin, end - begin), 0);
    EXPECT_EQ(std::stoul(text.substr(end + 2)), event.size() - (end - begin));
}

/// The journal's end of its socket is the same kind of socket.
class JournalEnd : public SystemLogSocket {
  protected:
    JournalSocket journal{path(), std::chrono::milliseconds(0)};
};

TEST_F(JournalEnd, EntryIsOneDatagramWithItsFields) {
    using namespace std::string_literals;
    ASSERT_TRUE(journal.write("a message", {{"ADMINHOST_A", "1"}, {"ADMINHOST_B", "two\nlines"}, {"ADMINHOST_A", ""}}));
    EXPECT_EQ(message(),
              "MESSAGE=a message\nPRIORITY=5\nSYSLOG_FACILITY=3\nSYSLOG_IDENTIFIER=unit_platform_log\nADMINHOST_A=1\n"
              "ADMINHOST_B\n\x09\0\0\0\0\0\0\0two\nlines\nADMINHOST_A=\n"s);
    EXPECT_TRUE(journal.isThere());
    EXPECT_EQ(journal.lostInTotal(), 0U);
}

TEST_F(JournalEnd, JournalThatIsStuckDoesNotBlockAndLostEntriesAreCounted) {
    constexpr std::size_t entries = 40'000;
    for (std::size_t i = 0; i < entries; ++i) {
        ASSERT_TRUE(journal.write("entry " + std::to_string(i), {}));
    }
    EXPECT_FALSE(journal.flush());
    std::size_t kept = 0;
    for (int idle = 0; idle < 2;) {
        journal.flush();
        const auto text = message();
        idle = text ? 0 : idle + 1;
        if (text) {
            EXPECT_NE(text->find("MESSAGE=entry " + std::to_string(kept) + "\n"), std::string::npos) << *text;
            ++kept;
        }
    }
    EXPECT_TRUE(journal.flush());
    EXPECT_GT(journal.lostInTotal(), 0U);
    EXPECT_EQ(kept + journal.lostInTotal(), entries);
}

TEST_F(JournalEnd, RestartedJournalIsFoundAgainAndAMissingOneLeavesTheEntryToTheCaller) {
    ASSERT_TRUE(journal.write("one", {}));
    ASSERT_TRUE(message());
    ::close(socket);
    EXPECT_FALSE(journal.write("two", {}));
    EXPECT_FALSE(journal.isThere());
    listen();
    EXPECT_TRUE(journal.write("three", {}));
    EXPECT_THAT(message().value_or(""), testing::StartsWith("MESSAGE=three\n"));
    EXPECT_EQ(journal.lostInTotal(), 0U);
}

TEST_F(JournalEnd, MissingJournalIsLookedForAgainAfterAPauseOnly) {
    JournalSocket patient(path(), std::chrono::hours(1));
    ::close(socket);
    EXPECT_FALSE(patient.write("one", {}));
    listen();
    EXPECT_FALSE(patient.write("two", {}));
    EXPECT_TRUE(JournalSocket(path()).write("three", {}));
    EXPECT_TRUE(journal.write("four", {}));
}

TEST_F(JournalEnd, EntryThatIsTooLargeIsLostAndCounted) {
    EXPECT_TRUE(journal.write(std::string(JournalSocket::entryMaximum, 'x'), {}));
    EXPECT_EQ(journal.lostInTotal(), 1U);
    EXPECT_FALSE(message());
    EXPECT_TRUE(journal.write("small", {}));
    EXPECT_TRUE(message());
}

TEST_F(Log, EntryWithoutAJournalIsAnEventOfTheSink) {
    Recorder recorder;
    setLogSink(recorder);
    logEntry("an entry", {{"ADMINHOST_A", "1"}});
    EXPECT_THAT(recorder.events(), testing::ElementsAre("an entry"));
}

TEST_F(Log, StandardErrorIsTheJournalOnlyIfTheServiceManagerHasConnectedIt) {
    struct stat status {};
    ASSERT_EQ(::fstat(STDERR_FILENO, &status), 0);
    const std::string own = std::to_string(status.st_dev) + ':' + std::to_string(status.st_ino);
    ::setenv("JOURNAL_STREAM", own.c_str(), 1);
    EXPECT_TRUE(standardErrorIsTheJournal());
    ::setenv("JOURNAL_STREAM", "1:1", 1);
    EXPECT_FALSE(standardErrorIsTheJournal()) << "it has been redirected";
    ::unsetenv("JOURNAL_STREAM");
    EXPECT_FALSE(standardErrorIsTheJournal());
}

TEST_F(Log, SystemLogSinkIsNotStandardError) {
    EXPECT_NE(&syslogSink(), &standardErrorSink());
    setLogSink(syslogSink());
    testing::internal::CaptureStderr();
    logEvent("adminhost test: 100% %s");
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "");
}

}  // namespace
