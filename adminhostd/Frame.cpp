#include "adminhostd/Frame.h"

#include "platform/value/ValueCodec.h"

#include <cerrno>
#include <cstring>
#include <utility>

#include <sys/socket.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr std::uint32_t magic = 0x46484144;

struct Header {
    std::uint32_t magic;
    std::uint32_t type;
    std::uint64_t length;
};

/// A buffer that once held a large frame gives its memory back.
constexpr std::size_t keptCapacity = std::size_t{256} << 10U;

}  // namespace

std::optional<std::string> encodeFrame(FrameType type, const Value& payload) {
    std::string bytes(sizeof(Header), '\0');
    encodeValue(payload, bytes);
    const Header header{magic, static_cast<std::uint32_t>(type), bytes.size() - sizeof(Header)};
    if (header.length > frameMaximum) {
        return std::nullopt;
    }
    std::memcpy(bytes.data(), &header, sizeof header);
    return bytes;
}

void FrameReader::append(std::string_view bytes) {
    // Done here and not frame by frame, which for many small ones would move what follows again and again.
    _bytes.erase(0, std::exchange(_read, 0));
    if (_bytes.empty() && _bytes.capacity() > keptCapacity) {
        _bytes.shrink_to_fit();
    }
    _bytes.append(bytes);
}

std::optional<Frame> FrameReader::next() {
    Header header{};
    const std::string_view bytes = std::string_view(_bytes).substr(_read);
    if (_broken || bytes.size() < sizeof header) {
        return std::nullopt;
    }
    std::memcpy(&header, bytes.data(), sizeof header);
    if (header.magic != magic || header.type < static_cast<std::uint32_t>(FrameType::configure) ||
        header.type > static_cast<std::uint32_t>(FrameType::answer) || header.length > frameMaximum) {
        _broken = true;
        return std::nullopt;
    }
    if (bytes.size() < sizeof header + header.length) {
        return std::nullopt;
    }
    auto payload = decodeValue(bytes.substr(sizeof header, header.length));
    if (!payload) {
        _broken = true;
        return std::nullopt;
    }
    _read += sizeof header + header.length;
    if (_read == _bytes.size() && _bytes.capacity() > keptCapacity) {
        std::string().swap(_bytes);
        _read = 0;
    }
    return Frame{static_cast<FrameType>(header.type), std::move(*payload)};
}

bool writeFrame(int descriptor, FrameType type, const Value& payload) {
    const auto bytes = encodeFrame(type, payload);
    if (!bytes) {
        return false;
    }
    std::string_view left = *bytes;
    while (!left.empty()) {
        const ssize_t written = ::send(descriptor, left.data(), left.size(), MSG_NOSIGNAL);
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written <= 0) {
            return false;
        }
        left.remove_prefix(static_cast<std::size_t>(written));
    }
    return true;
}

std::optional<Frame> readFrame(int descriptor, FrameReader& reader) {
    for (;;) {
        if (auto frame = reader.next()) {
            return frame;
        }
        char buffer[16 << 10];
        const ssize_t count = reader.broken() ? 0 : ::read(descriptor, buffer, sizeof buffer);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count <= 0) {
            return std::nullopt;
        }
        reader.append({buffer, static_cast<std::size_t>(count)});
    }
}

}  // namespace adminhost
