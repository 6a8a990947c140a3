#pragma once

// Frames: the units in which front and worker exchange messages (Protocol.h) over their socket pair.
//
// A frame is a header (magic, type, two lengths), a payload (one encoded value) and bytes that are passed on unchanged.
// Both ends are processes of one build; the checks turn a broken peer into an error instead of a misreading. Requests
// may hold secrets: a reader's memory is cleared once it is no longer needed.

#include "platform/value/Value.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include <sys/types.h>

namespace adminhost {

enum class FrameType : std::uint32_t {
    configure = 1,
    perform,
    findAccounts,
    readHistory,
    hello,
    log,
    change,
    notDone,
    answer,
    diagnose,
    readLog,
    secretPart,
    proceed,
    recorded,
    begun,
    unfinished,
    readAudit,
    last = readAudit,
};

constexpr std::size_t frameMaximum = std::size_t{128} << 20U;  ///< bytes of payload and bytes together

struct Frame {
    FrameType type = FrameType::configure;
    Value payload;
    std::string bytes;
    std::size_t size = 0;  ///< of a frame that was read: its bytes on the way
};

/// The frame's header and payload; its bytes follow. Returns nullopt if they are together above the maximum.
[[nodiscard]] std::optional<std::string> encodeFrame(const Frame& frame);

/// Builds frames from the bytes in the order of their arrival.
class FrameReader {
  public:
    FrameReader() = default;
    FrameReader(const FrameReader&) = delete;
    FrameReader& operator=(const FrameReader&) = delete;
    ~FrameReader();

    void append(std::string_view bytes);
    struct Reading {
        ssize_t count = 0;    ///< of read(2), which sets errno
        bool filled = false;  ///< as many as were asked for: there may be more
    };
    /// Appends what one read(2) returns. Bytes of a frame whose head is known are read to their place, not copied.
    Reading readFrom(int descriptor);
    /// The next whole frame; nullopt if bytes are missing, or if the stream is broken.
    [[nodiscard]] std::optional<Frame> next();
    /// Returns true if the stream has contained something that is not a frame. Nothing after it can be read.
    [[nodiscard]] bool broken() const noexcept { return _broken; }

  private:
    std::string _bytes;           ///< headers and payloads, and what follows them in the same reading
    std::size_t _read = 0;        ///< how many of them belong to frames that were returned
    std::optional<Frame> _begun;  ///< lacks some of its bytes; they are appended to it and not to _bytes
    std::size_t _missing = 0;
    bool _broken = false;
};

/// Blocks, on a descriptor. Returns false if the frame is too large, or the other end is closed.
[[nodiscard]] bool writeFrame(int descriptor, const Frame& frame);
/// Blocks. Returns the next frame; nullopt at the end of the stream or if it is broken.
[[nodiscard]] std::optional<Frame> readFrame(int descriptor, FrameReader& reader);

}  // namespace adminhost
