#include "adminhostd/Frame.h"

#include <cstring>
#include <thread>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

namespace adminhost {
namespace {

const Value sample =
    Dictionary{{"outcome", "dictionary"}, {"response", Dictionary{{"a", Array{Value(1), Value("b")}}}}};

TEST(FrameReader, PutsFramesTogetherFromSingleBytes) {
    const std::string bytes =
        *encodeFrame({FrameType::answer, sample, {}}) + *encodeFrame({FrameType::log, Value("line"), {}});
    FrameReader reader;
    std::vector<Frame> frames;
    for (const char byte : bytes) {
        reader.append({&byte, 1});
        while (auto frame = reader.next()) {
            frames.push_back(std::move(*frame));
        }
    }
    ASSERT_EQ(frames.size(), 2U);
    EXPECT_EQ(frames[0].type, FrameType::answer);
    EXPECT_EQ(frames[0].payload, sample);
    EXPECT_EQ(frames[1].payload, Value("line"));
    EXPECT_FALSE(reader.broken());
}

TEST(FrameReader, ChangedHeaderOrPayloadIsBrokenOrAnotherValueButNeverReadPastTheEnd) {
    const std::string bytes = *encodeFrame({FrameType::answer, sample, {}});
    for (std::size_t i = 0; i < bytes.size(); ++i) {
        std::string changed = bytes;
        changed[i] = static_cast<char>(changed[i] ^ 0x55);
        FrameReader reader;
        reader.append(changed);
        const auto frame = reader.next();
        if (i < 4) {
            EXPECT_TRUE(reader.broken()) << "magic, byte " << i;
        }
        EXPECT_TRUE(reader.broken() || !frame || frame->type != FrameType::answer || frame->payload != sample) << i;
        EXPECT_FALSE(reader.broken() && frame.has_value());
    }
}

TEST(FrameReader, LengthBeyondTheMaximumIsBrokenAtOnce) {
    std::string bytes = *encodeFrame({FrameType::answer, sample, {}});
    bytes[15] = '\x7f';
    FrameReader reader;
    reader.append(bytes.substr(0, 24));
    EXPECT_FALSE(reader.next());
    EXPECT_TRUE(reader.broken());
}

TEST(FrameReader, BytesBehindThePayloadArriveInAnyPiecesAndAreFollowedByTheNextFrame) {
    const std::string stream = *encodeFrame({FrameType::answer, sample, "0123456789"}) + "0123456789" +
                               *encodeFrame({FrameType::log, Value("line"), {}}) +
                               *encodeFrame({FrameType::answer, Value(1), "x"}) + "x";
    for (std::size_t piece = 1; piece <= stream.size(); ++piece) {
        FrameReader reader;
        std::vector<Frame> frames;
        for (std::size_t at = 0; at < stream.size(); at += piece) {
            reader.append(std::string_view(stream).substr(at, piece));
            while (auto frame = reader.next()) {
                frames.push_back(std::move(*frame));
            }
        }
        ASSERT_EQ(frames.size(), 3U) << piece;
        EXPECT_EQ(frames[0].payload, sample);
        EXPECT_EQ(frames[0].bytes, "0123456789");
        EXPECT_EQ(frames[1].payload, Value("line"));
        EXPECT_EQ(frames[1].bytes, "");
        EXPECT_EQ(frames[2].bytes, "x");
    }
}

TEST(FrameReader, ReadsFramesFromASocketInPiecesOfAnySize) {
    const std::string large(700'001, 'y');
    const std::string stream = *encodeFrame({FrameType::log, Value("before"), {}}) +
                               *encodeFrame({FrameType::answer, sample, large}) + large +
                               *encodeFrame({FrameType::answer, Value(1), "x"}) + "x" +
                               *encodeFrame({FrameType::log, Value("after"), {}});
    for (const std::size_t piece : {std::size_t{7'001}, std::size_t{16'384}, std::size_t{100'000}, stream.size()}) {
        int ends[2];
        ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
        std::thread writer([&] {
            for (std::string_view left = stream; !left.empty();) {
                const ssize_t sent = ::write(ends[0], left.data(), std::min(piece, left.size()));
                ASSERT_GT(sent, 0);
                left.remove_prefix(static_cast<std::size_t>(sent));
            }
            ::close(ends[0]);
        });
        FrameReader reader;
        std::vector<Frame> frames;
        std::size_t arrived = 0;
        for (FrameReader::Reading reading; (reading = reader.readFrom(ends[1])).count > 0;) {
            arrived += static_cast<std::size_t>(reading.count);
            while (auto frame = reader.next()) {
                frames.push_back(std::move(*frame));
            }
        }
        EXPECT_EQ(arrived, stream.size());
        ASSERT_EQ(frames.size(), 4U) << piece;
        EXPECT_EQ(frames[0].payload, Value("before"));
        EXPECT_EQ(frames[1].payload, sample);
        EXPECT_TRUE(frames[1].bytes == large);
        EXPECT_EQ(frames[2].bytes, "x");
        EXPECT_EQ(frames[3].payload, Value("after"));
        writer.join();
        ::close(ends[1]);
    }
}

TEST(FrameReader, StatesWhetherThereMayBeMoreToRead) {
    int ends[2];
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, ends), 0);
    FrameReader reader;
    const std::string frame = *encodeFrame({FrameType::answer, sample, "0123456789"}) + "01234";
    ASSERT_EQ(::write(ends[0], frame.data(), frame.size()), static_cast<ssize_t>(frame.size()));
    EXPECT_FALSE(reader.readFrom(ends[1]).filled);
    EXPECT_FALSE(reader.next());
    ASSERT_EQ(::write(ends[0], "56789more", 9), 9);
    const FrameReader::Reading rest = reader.readFrom(ends[1]);
    EXPECT_EQ(rest.count, 5) << "no byte of the next frame";
    EXPECT_TRUE(rest.filled);
    EXPECT_EQ(reader.next()->bytes, "0123456789");
    EXPECT_EQ(reader.readFrom(ends[1]).count, 4);
    EXPECT_EQ(reader.readFrom(ends[1]).count, -1) << "nothing is there";
    for (const int end : ends) {
        ::close(end);
    }
}

TEST(FrameReader, PayloadAndBytesShareOneMaximum) {
    std::string bytes = *encodeFrame({FrameType::answer, sample, {}});
    const std::uint64_t most = frameMaximum;
    std::memcpy(bytes.data() + 16, &most, sizeof most);
    FrameReader reader;
    reader.append(bytes);
    EXPECT_FALSE(reader.next());
    EXPECT_TRUE(reader.broken());
    EXPECT_FALSE(encodeFrame({FrameType::answer, sample, std::string(frameMaximum, 'x')}));
}

TEST(EncodeFrame, RefusesAPayloadBeyondTheMaximum) {
    EXPECT_FALSE(encodeFrame({FrameType::answer, Value(std::string(frameMaximum + 1, 'x')), {}}));
}

TEST(WriteFrame, CarriesALargeFrameThroughASocket) {
    int ends[2];
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    const std::string large(5'000'000, 'x');
    std::thread writer([&] {
        EXPECT_TRUE(writeFrame(ends[0], {FrameType::answer, Value("head"), large}));
        ::close(ends[0]);
    });
    FrameReader reader;
    const auto frame = readFrame(ends[1], reader);
    ASSERT_TRUE(frame);
    EXPECT_EQ(frame->payload, Value("head"));
    EXPECT_TRUE(frame->bytes == large);
    EXPECT_FALSE(readFrame(ends[1], reader)) << "the end of the stream";
    writer.join();
    ::close(ends[1]);
}

TEST(WriteFrame, FailsWhenNobodyReads) {
    int ends[2];
    ASSERT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
    ::close(ends[1]);
    EXPECT_FALSE(writeFrame(ends[0], {FrameType::log, Value("line"), {}}));
    ::close(ends[0]);
}

}  // namespace
}  // namespace adminhost
