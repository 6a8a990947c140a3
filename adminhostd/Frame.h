#pragma once

// Frames: what front and worker say to each other over their socket pair.
//
// A frame is a header (magic, type, length of the payload) and a payload, one encoded value. Both ends are processes of
// one build; the checks are there so that a broken peer costs an error and never a misreading.

#include "platform/value/Value.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

enum class FrameType : std::uint32_t {
    configure = 1,  ///< front to worker, first: what to load and where
    hello = 2,      ///< worker to front: what was loaded
    perform = 3,    ///< front to worker: one operation
    log = 4,        ///< worker to front: one event of the system log, a text
    answer = 5,     ///< worker to front: the operation's outcome
};

constexpr std::size_t frameMaximum = std::size_t{128} << 20U;  ///< bytes of a payload

struct Frame {
    FrameType type = FrameType::configure;
    Value payload;
};

/// The frame's bytes; nothing when the payload is above the maximum.
[[nodiscard]] std::optional<std::string> encodeFrame(FrameType type, const Value& payload);

/// Puts frames together from the bytes as they arrive.
class FrameReader {
  public:
    void append(std::string_view bytes);
    /// The next whole frame; nothing while bytes are missing, or when the stream is broken.
    [[nodiscard]] std::optional<Frame> next();
    /// Whether what arrived is no frame; nothing that comes later can be read.
    [[nodiscard]] bool broken() const noexcept { return _broken; }

  private:
    std::string _bytes;
    std::size_t _read = 0;  ///< how many of them belong to frames that were taken
    bool _broken = false;
};

/// Blocking, on a descriptor: whether the whole frame was written.
[[nodiscard]] bool writeFrame(int descriptor, FrameType type, const Value& payload);
/// Blocking: the next frame; nothing at the end of the stream or when it is broken.
[[nodiscard]] std::optional<Frame> readFrame(int descriptor, FrameReader& reader);

}  // namespace adminhost
