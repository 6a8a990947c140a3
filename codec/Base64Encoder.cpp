#include "codec/Base64.h"
#include "platform/log/Log.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstring>

#ifdef __x86_64__
#include <tmmintrin.h>
#endif

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

#ifdef __x86_64__
const bool hasWideGroups = __builtin_cpu_supports("ssse3") != 0;

/// Sixteen characters of twelve of the sixteen bytes: of the first twelve, or the last. Every step works on all at
/// once.
template <int first>
__attribute__((target("ssse3"))) inline void encodeTwelve(const std::uint8_t* in, std::uint8_t* out) noexcept {
    constexpr int o = first;
    const __m128i bytes = _mm_loadu_si128(reinterpret_cast<const __m128i*>(in));
    // Each group's bytes a, b, c become the two words ab and bc, which hold two characters' bits each.
    const __m128i words =
        _mm_shuffle_epi8(bytes, _mm_setr_epi8(o + 1, o, o + 2, o + 1, o + 4, o + 3, o + 5, o + 4, o + 7, o + 6, o + 8,
                                              o + 7, o + 10, o + 9, o + 11, o + 10));
    // Multiplying shifts each word by its own count.
    const __m128i even = _mm_mulhi_epu16(_mm_and_si128(words, _mm_set1_epi32(0x0FC0FC00)), _mm_set1_epi32(0x04000040));
    const __m128i odd = _mm_mullo_epi16(_mm_and_si128(words, _mm_set1_epi32(0x003F03F0)), _mm_set1_epi32(0x01000010));
    const __m128i sextets = _mm_or_si128(even, odd);
    // The alphabet's runs have a constant distance from value to character: 0 for a-z, 1 to 10 for the digits, 11 and
    // 12 for + and /, 13 for A-Z.
    const __m128i distances = _mm_setr_epi8('a' - 26, '0' - 52, '0' - 52, '0' - 52, '0' - 52, '0' - 52, '0' - 52,
                                            '0' - 52, '0' - 52, '0' - 52, '0' - 52, '+' - 62, '/' - 63, 'A', 0, 0);
    const __m128i capital = _mm_and_si128(_mm_cmpgt_epi8(_mm_set1_epi8(26), sextets), _mm_set1_epi8(13));
    const __m128i run = _mm_or_si128(_mm_subs_epu8(sextets, _mm_set1_epi8(51)), capital);
    const __m128i text = _mm_add_epi8(sextets, _mm_shuffle_epi8(distances, run));
    _mm_storeu_si128(reinterpret_cast<__m128i*>(out), text);
}

/// The place in a text that is being encoded, and the ends of the memory that may be read and written.
struct Place {
    const std::uint8_t* in;
    const std::uint8_t* inEnd;
    std::uint8_t* out;
    std::uint8_t* outEnd;
};

/// Encodes the part of so many bytes that can be encoded twelve at a time. May encode up to nine bytes more than asked
/// for; later characters overwrite those. Returns how many of the bytes are left.
__attribute__((target("ssse3"))) std::size_t encodeWideGroups(Place& at, std::size_t length) noexcept {
    const std::uint8_t* in = at.in;
    const std::uint8_t* const end = in + length;
    std::uint8_t* out = at.out;
    for (; in < end && at.inEnd - in >= 16 && at.outEnd - out >= 16; in += 12, out += 16) {
        encodeTwelve<0>(in, out);
    }
    if (end - in >= 12 && in - at.in >= 4) {
        encodeTwelve<4>(in - 4, out);
        in += 12;
        out += 16;
    }
    if (in > end) {
        out -= (in - end) / 3 * 4;
        in = end;
    }
    at.in = in;
    at.out = out;
    return static_cast<std::size_t>(end - in);
}
#endif

/// Encodes that many bytes, a multiple of three, and moves to the place after them.
void encodeGroups(Place& at, std::size_t length) noexcept {
    std::size_t left = length;
#ifdef __x86_64__
    if (hasWideGroups) {
        left = encodeWideGroups(at, length);
    }
#endif
    for (; left > 0; left -= 3, at.in += 3, at.out += 4) {
        const std::uint32_t group = (std::uint32_t{at.in[0]} << 16U) | (std::uint32_t{at.in[1]} << 8U) | at.in[2];
        std::memcpy(at.out, pairs[group >> 12U].data(), 2);
        std::memcpy(at.out + 2, pairs[group & 0xFFFU].data(), 2);
    }
}

/// A text of so many characters, which fits the buffer's first capacity, is written without the buffer. Most values are
/// short, and the buffer would cost as much time as their encoding.
constexpr std::size_t shortText = 256;

struct Layout {
    std::size_t lineInput;   ///< bytes of a full line
    std::size_t textLength;  ///< of the whole text
};

/// A line ends after the first group that brings it to its limit of characters.
constexpr std::size_t lineInputOf(std::size_t lineLimit) noexcept {
    return (lineLimit + 3) / 4 * 3;
}
constexpr std::size_t brokenLineInput = lineInputOf(76);
constexpr std::size_t unbrokenLineInput = lineInputOf(0x7FFFFFFF);

Layout layoutOf(std::size_t length, const EncoderOptions& options) noexcept {
    const std::size_t lineFeeds = options.lineBreaks ? length / brokenLineInput : length / unbrokenLineInput;
    const std::size_t tail = length % 3;
    const std::size_t tailLength = tail == 0 ? 0 : options.pad != 0 ? 4 : tail + 1;
    return {options.lineBreaks ? brokenLineInput : unbrokenLineInput, length / 3 * 4 + lineFeeds + tailLength};
}

/// Writes the text, whose length is in its layout.
void encodeText(Bytes data, const EncoderOptions& options, const Layout& layout, std::uint8_t* out) noexcept {
    Place at{data.data(), data.data() + data.size(), out, out + layout.textLength};
    std::size_t left = data.size();
    while (left >= 3) {
        const std::size_t length = std::min(left - left % 3, layout.lineInput);
        encodeGroups(at, length);
        left -= length;
        if (length == layout.lineInput) {
            *at.out++ = '\n';
        }
    }
    if (left > 0) {
        const std::array<std::uint8_t, 3> last{at.in[0], left == 2 ? at.in[1] : std::uint8_t{0}, 0};
        std::array<std::uint8_t, 4> group{};
        Place tail{last.data(), last.data() + last.size(), group.data(), group.data() + group.size()};
        encodeGroups(tail, last.size());
        at.out = std::copy_n(group.begin(), left + 1, at.out);
    }
    if (!options.standardAlphabet) {
        std::replace(out, at.out, '/', ',');
    }
    std::fill(at.out, at.outEnd, options.pad);
}

/// Encodes into a buffer that has no room for the whole text: fills it piece after piece.
[[gnu::noinline]] void appendPieces(Bytes data, EncoderOptions options, std::size_t lineInput, ByteBuffer& buffer) {
    options.lineBreaks = false;  // a piece never goes beyond its line
    const std::size_t pieceInput = std::min<std::size_t>(lineInput, 3072);
    for (std::size_t at = 0; at < data.size();) {
        const Bytes piece = data.subspan(at, std::min({pieceInput, lineInput - at % lineInput, data.size() - at}));
        const Layout layout = layoutOf(piece.size(), options);
        std::array<std::uint8_t, 4096> text;
        encodeText(piece, options, layout, text.data());
        std::for_each_n(text.begin(), layout.textLength, [&](std::uint8_t c) { buffer.append(c); });
        at += piece.size();
        if (at % lineInput == 0) {
            buffer.append('\n');
        }
    }
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
    const Layout layout = layoutOf(data.size(), options);
    const std::size_t capacity = std::max<std::size_t>(4 * data.size() / 3, 1);
    if (layout.textLength <= capacity && capacity <= shortText) {
        adminhost::Data text(layout.textLength);
        encodeText(data, options, layout, text.data());
        return text;
    }
    ByteBuffer buffer(capacity, options.growth);
    if (std::uint8_t* out = buffer.extend(layout.textLength)) {
        encodeText(data, options, layout, out);
        return std::move(buffer).take();
    }
    appendPieces(data, options, layout.lineInput, buffer);
    return std::move(buffer).take();
}

std::string base64EncodedString(Bytes data) {
    const EncoderOptions options;
    const Layout layout = layoutOf(data.size(), options);
    if (layout.textLength > options.growth.limit) {
        const adminhost::Data text = LumioUtilities_encodeBase64(data);  // shortened
        return {reinterpret_cast<const char*>(text.data()), text.size()};
    }
    std::string text(layout.textLength, '\0');
    encodeText(data, options, layout, reinterpret_cast<std::uint8_t*>(text.data()));
    return text;
}

}  // namespace lumio
