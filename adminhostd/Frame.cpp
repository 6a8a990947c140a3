#include "adminhostd/Frame.h"

#include "platform/value/ValueCodec.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

#include <sys/socket.h>
#include <sys/uio.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr std::uint32_t magic = 0x46484145;

struct Header {
    std::uint32_t magic;
    std::uint32_t type;
    std::uint64_t payload;  ///< length
    std::uint64_t bytes;    ///< length
};

/// Above this capacity, a reader's buffer is freed once its content has been read.
constexpr std::size_t keptCapacity = std::size_t{256} << 10U;
/// Bytes of one reading to their place. Memory is used for what has arrived, not for what is announced.
constexpr std::size_t pieceMaximum = std::size_t{256} << 10U;

bool fits(const Header& header) {
    return header.payload <= frameMaximum && header.bytes <= frameMaximum - header.payload;
}

void clear(std::string& bytes) {
    ::explicit_bzero(bytes.data(), bytes.size());
    bytes.clear();
    if (bytes.capacity() > keptCapacity) {
        bytes.shrink_to_fit();
    }
}

}  // namespace

std::optional<std::string> encodeFrame(const Frame& frame) {
    std::string bytes(sizeof(Header), '\0');
    encodeValue(frame.payload, bytes);
    const Header header{magic, static_cast<std::uint32_t>(frame.type), bytes.size() - sizeof(Header),
                        frame.bytes.size()};
    if (!fits(header)) {
        return std::nullopt;
    }
    std::memcpy(bytes.data(), &header, sizeof header);
    return bytes;
}

FrameReader::~FrameReader() {
    clear(_bytes);
}

void FrameReader::append(std::string_view bytes) {
    const std::string_view ofBegun = bytes.substr(0, _missing);
    if (!ofBegun.empty()) {
        _begun->bytes += ofBegun;
        _missing -= ofBegun.size();
        bytes.remove_prefix(ofBegun.size());
    }
    // Done here and not for each frame: many small frames would move the rest again and again.
    if (const std::size_t read = std::exchange(_read, 0); read == _bytes.size()) {
        clear(_bytes);
    } else {
        _bytes.erase(0, read);
    }
    _bytes += bytes;
}

FrameReader::Reading FrameReader::readFrom(int descriptor) {
    if (_missing > 0) {
        std::string& bytes = _begun->bytes;
        const std::size_t had = bytes.size();
        const std::size_t wanted = std::min(_missing, pieceMaximum);
        bytes.resize(had + wanted);
        const ssize_t count = ::read(descriptor, bytes.data() + had, wanted);
        const std::size_t arrived = count > 0 ? static_cast<std::size_t>(count) : 0;
        bytes.resize(had + arrived);
        _missing -= arrived;
        return {count, arrived == wanted};
    }
    char buffer[16 << 10];
    const ssize_t count = ::read(descriptor, buffer, sizeof buffer);
    if (count > 0) {
        append({buffer, static_cast<std::size_t>(count)});
        ::explicit_bzero(buffer, static_cast<std::size_t>(count));
    }
    return {count, count == sizeof buffer};
}

std::optional<Frame> FrameReader::next() {
    if (_broken || _missing > 0) {
        return std::nullopt;
    }
    if (_begun) {
        return std::exchange(_begun, std::nullopt);
    }
    Header header{};
    std::string_view bytes = std::string_view(_bytes).substr(_read);
    if (bytes.size() < sizeof header) {
        return std::nullopt;
    }
    std::memcpy(&header, bytes.data(), sizeof header);
    if (header.magic != magic || header.type < static_cast<std::uint32_t>(FrameType::configure) ||
        header.type > static_cast<std::uint32_t>(FrameType::last) || !fits(header)) {
        _broken = true;
        return std::nullopt;
    }
    bytes.remove_prefix(sizeof header);
    if (bytes.size() < header.payload) {
        return std::nullopt;
    }
    auto payload = decodeValue(bytes.substr(0, header.payload));
    if (!payload) {
        _broken = true;
        return std::nullopt;
    }
    bytes.remove_prefix(header.payload);
    Frame frame{
        static_cast<FrameType>(header.type), std::move(*payload), {}, sizeof header + header.payload + header.bytes};
    const std::string_view here = bytes.substr(0, header.bytes);
    // Reserved memory that is not written to costs nothing.
    frame.bytes.reserve(header.bytes);
    frame.bytes = here;
    _read += sizeof header + header.payload + here.size();
    _missing = header.bytes - here.size();
    if (_read == _bytes.size()) {
        clear(_bytes);
        _read = 0;
    }
    if (_missing > 0) {
        _begun = std::move(frame);
        return std::nullopt;
    }
    return frame;
}

bool writeFrame(int descriptor, const Frame& frame) {
    auto head = encodeFrame(frame);
    if (!head) {
        return false;
    }
    std::string_view pieces[] = {*head, frame.bytes};
    bool written = true;
    while (written && !(pieces[0].empty() && pieces[1].empty())) {
        iovec places[] = {{const_cast<char*>(pieces[0].data()), pieces[0].size()},
                          {const_cast<char*>(pieces[1].data()), pieces[1].size()}};
        msghdr message{};
        message.msg_iov = places;
        message.msg_iovlen = std::size(places);
        const ssize_t count = ::sendmsg(descriptor, &message, MSG_NOSIGNAL);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        written = count > 0;
        std::size_t sent = written ? static_cast<std::size_t>(count) : 0;
        for (std::string_view& piece : pieces) {
            const std::size_t ofPiece = std::min(sent, piece.size());
            piece.remove_prefix(ofPiece);
            sent -= ofPiece;
        }
    }
    return written;
}

std::optional<Frame> readFrame(int descriptor, FrameReader& reader) {
    for (;;) {
        if (auto frame = reader.next()) {
            return frame;
        }
        const ssize_t count = reader.broken() ? 0 : reader.readFrom(descriptor).count;
        if (count == 0 || (count < 0 && errno != EINTR)) {
            return std::nullopt;
        }
    }
}

}  // namespace adminhost
