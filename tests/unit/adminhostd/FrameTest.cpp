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
