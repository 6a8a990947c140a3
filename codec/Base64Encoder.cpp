#include "codec/Base64.h"
#include "platform/log/Log.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstring>

#include <endian.h>

namespace lumio {
namespace {

using Pair = std::array<std::uint8_t, 2>;

/// Two characters for every 12 bits: two look-ups instead of four for a group of three bytes.
constexpr std::array<Pair, 4096> makePairs() {
    std::array<Pair, 4096> pairs{};
    for (std::size_t i = 0; i < pairs.size(); ++i) {
        pairs[i] = {static_cast<std::uint8_t>(base64Alphabet[i >> 6U]),
                    static_cast<std::uint8_t>(base64Alphabet[i & 63U])};
    }
    return pairs;
}
constexpr std::array<Pair, 4096> pairs = makePairs();

std::uint64_t bigEndianAt(const std::uint8_t* in) noexcept {
    std::uint64_t bits = 0;
    std::memcpy(&bits, in, sizeof bits);
    return be64toh(bits);
}

/// Encodes a multiple of three bytes: two groups at a time out of eight bytes, of which the first six count.
void encodeGroups(const std::uint8_t* in, std::size_t length, std::uint8_t* out) noexcept {
    const std::uint8_t* const begin = in;
    const std::uint8_t* const end = in + length;
    while (end - in >= 6) {
        std::uint64_t bits = 0;
        if (end - in >= 8) {
            bits = bigEndianAt(in);
        } else if (in != begin) {
            bits = bigEndianAt(in - 2) << 16U;  // nothing behind the input is looked at
        } else {
            break;
        }
        std::memcpy(out, pairs[bits >> 52U].data(), 2);
        std::memcpy(out + 2, pairs[(bits >> 40U) & 0xFFFU].data(), 2);
        std::memcpy(out + 4, pairs[(bits >> 28U) & 0xFFFU].data(), 2);
        std::memcpy(out + 6, pairs[(bits >> 16U) & 0xFFFU].data(), 2);
        in += 6;
        out += 8;
    }
    for (; in != end; in += 3, out += 4) {
        const std::uint32_t group = (std::uint32_t{in[0]} << 16U) | (std::uint32_t{in[1]} << 8U) | in[2];
        std::memcpy(out, pairs[group >> 12U].data(), 2);
        std::memcpy(out + 2, pairs[group & 0xFFFU].data(), 2);
    }
}

void useComma(std::uint8_t* text, std::size_t length) noexcept {
    std::replace(text, text + length, '/', ',');
}

}  // namespace

bool ByteBuffer::grow() noexcept {
    const std::size_t full = _bytes.capacity();
    return full < _growth.limit && _growth.reserve(_bytes, 2 * full) && _bytes.capacity() > full;
}

void ByteBuffer::drop() noexcept {
    // Written without allocating: this is where memory has run out.
    char event[96];
    static_cast<void>(
        std::snprintf(event, sizeof event, "Cannot append any more bytes to buffer at %p.", static_cast<void*>(this)));
    adminhost::logEvent(event);
}

adminhost::Data encodeBase64Data(Bytes data, const EncoderOptions& options) {
    const std::size_t lineLimit = options.lineBreaks ? 76 : 0x7FFFFFFF;
    // A line ends behind the first group that brings it to the limit.
    const std::size_t lineInput = (lineLimit + 3) / 4 * 3;
    ByteBuffer buffer(std::max<std::size_t>(4 * data.size() / 3, 1), options.growth);

    const std::uint8_t* in = data.data();
    std::size_t left = data.size();
    while (left >= 3) {
        const std::size_t length = std::min(left / 3 * 3, lineInput);
        const std::size_t textLength = length / 3 * 4;
        if (std::uint8_t* out = buffer.extend(textLength)) {
            encodeGroups(in, length, out);
            if (!options.standardAlphabet) {
                useComma(out, textLength);
            }
        } else {
            for (std::size_t i = 0; i < length; i += 3) {
                std::uint8_t group[4];
                encodeGroups(in + i, 3, group);
                if (!options.standardAlphabet) {
                    useComma(group, sizeof group);
                }
                std::for_each(std::begin(group), std::end(group), [&](std::uint8_t c) { buffer.append(c); });
            }
        }
        in += length;
        left -= length;
        if (length == lineInput) {
            buffer.append('\n');
        }
    }
    if (left > 0) {
        const std::uint8_t last[3] = {in[0], left == 2 ? in[1] : std::uint8_t{0}, 0};
        std::uint8_t group[4];
        encodeGroups(last, 3, group);
        if (!options.standardAlphabet) {
            useComma(group, sizeof group);
        }
        for (std::size_t i = 0; i <= left; ++i) {
            buffer.append(group[i]);
        }
        for (std::size_t i = left; i < 3 && options.pad != 0; ++i) {
            buffer.append(options.pad);
        }
    }
    return std::move(buffer).take();
}

}  // namespace lumio
