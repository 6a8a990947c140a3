#include "codec/Base64.h"
#include "platform/log/Log.h"

#include <algorithm>

#include <fmt/format.h>

namespace lumio {
namespace {

constexpr std::array<std::int8_t, 128> makeTable() {
    std::array<std::int8_t, 128> table{};
    table.fill(base64Invalid);
    for (std::size_t i = 0; i < base64Alphabet.size(); ++i) {
        table[static_cast<unsigned char>(base64Alphabet[i])] = static_cast<std::int8_t>(i);
    }
    table['='] = base64Pad;
    table[' '] = base64Blank;
    table['\t'] = base64Blank;
    table['\r'] = base64CarriageReturn;
    table['\n'] = base64LineFeed;
    return table;
}

constexpr std::uint32_t notASextet = 0x80000000U;

/// For each of a group's four places, a whole byte's 6 bits shifted to where the place has them, or notASextet.
using Places = std::array<std::array<std::uint32_t, 256>, 4>;
constexpr Places makePlaces() {
    Places places{};
    const auto table = makeTable();
    for (std::size_t byte = 0; byte < 256; ++byte) {
        const std::int8_t entry = table[byte & 0x7FU];
        for (std::size_t place = 0; place < 4; ++place) {
            places[place][byte] = entry < 0 ? notASextet : static_cast<std::uint32_t>(entry) << (18 - 6 * place);
        }
    }
    return places;
}
constexpr Places places = makePlaces();

std::uint32_t groupOf(const std::uint8_t* in) noexcept {
    return places[0][in[0]] | places[1][in[1]] | places[2][in[2]] | places[3][in[3]];
}

/// Decodes groups of four while they are characters of the alphabet alone. Returns the place where it stopped.
const std::uint8_t* decodeGroups(const std::uint8_t* in, const std::uint8_t* end, std::uint8_t*& out) noexcept {
    while (end - in >= 4) {
        const std::uint32_t group = groupOf(in);
        if ((group & notASextet) != 0) {
            break;
        }
        out[0] = static_cast<std::uint8_t>(group >> 16U);
        out[1] = static_cast<std::uint8_t>(group >> 8U);
        out[2] = static_cast<std::uint8_t>(group);
        out += 3;
        in += 4;
    }
    return in;
}

std::int8_t entryOf(std::uint8_t byte) noexcept {
    return base64DecodeTable[byte & 0x7FU];
}

struct Line {
    bool valid = true;
    const std::uint8_t* dataEnd = nullptr;  ///< after the data part, pads included
    const std::uint8_t* next = nullptr;     ///< after the line end
    std::size_t pads = 0;
};

/// Classifies the rest of a line from a place before which there are only characters of the alphabet.
Line scanLine(const std::uint8_t* start, const std::uint8_t* at, const std::uint8_t* end) noexcept {
    Line line;
    const std::uint8_t* firstBlank = nullptr;
    const std::uint8_t* lineEnd = end;
    line.next = end;
    for (; at != end; ++at) {
        const std::int8_t entry = entryOf(*at);
        if (entry == base64CarriageReturn || entry == base64LineFeed) {
            lineEnd = at;
            line.next = at + 1;
            if (entry == base64CarriageReturn && line.next != end && entryOf(*line.next) == base64LineFeed) {
                ++line.next;
            }
            break;
        }
        if (!line.valid) {
            continue;
        }
        if (entry == base64Pad) {
            ++line.pads;
            line.valid = firstBlank == nullptr && line.pads < 3;
        } else if (entry == base64Blank) {
            firstBlank = firstBlank == nullptr ? at : firstBlank;
        } else {
            line.valid = entry >= 0 && firstBlank == nullptr && line.pads == 0;
        }
    }
    line.dataEnd = line.valid && firstBlank != nullptr ? firstBlank : lineEnd;
    line.valid = line.valid && (line.dataEnd - start) % 4 == 0;
    return line;
}

}  // namespace

const std::array<std::int8_t, 128> base64DecodeTable = makeTable();

std::uint8_t* decodeRemainder(Bytes remainder, std::size_t characterCount, std::uint8_t* out) {
    std::uint32_t bits = 0;
    for (const std::uint8_t character : remainder) {
        bits = bits * 64 + static_cast<std::uint32_t>(entryOf(character));
    }
    switch (remainder.size()) {
        case 1:
            adminhost::logEvent(fmt::format("*** {}: i={}, k={:x}", "_decodeBase64Data", characterCount, bits));
            break;
        case 2:
            *out++ = static_cast<std::uint8_t>(bits >> 4U);
            break;
        case 3:
            *out++ = static_cast<std::uint8_t>(bits >> 10U);
            *out++ = static_cast<std::uint8_t>(bits >> 2U);
            break;
        default:
            break;
    }
    return out;
}

adminhost::Data LumioUtilities_decodeBase64(Bytes text) {
    const std::uint8_t* at = text.data();
    const std::uint8_t* const end = at + text.size();
    const auto decodedLength = [&](const std::uint8_t* from) { return static_cast<std::size_t>(end - from) / 4 * 3; };
    // Everything that decodes fits into what is reserved; only lines that are copied unchanged need more.
    adminhost::Data result(decodedLength(at));
    std::size_t used = 0;
    while (at != end) {
        // Whole groups are decoded at once. If the line turns out not to be base64, their bytes are dropped.
        std::uint8_t* out = result.data() + used;
        const std::uint8_t* const rest = decodeGroups(at, end, out);
        const Line line = scanLine(at, rest, end);
        if (line.valid) {
            const std::uint8_t* const charactersEnd = line.dataEnd - line.pads;
            out = decodeRemainder({rest, charactersEnd}, static_cast<std::size_t>(charactersEnd - at), out);
            used = static_cast<std::size_t>(out - result.data());
        } else {
            const auto length = static_cast<std::size_t>(line.next - at);
            result.resize(std::max(result.size(), used + length + decodedLength(line.next)));
            std::copy(at, line.next, result.data() + used);
            used += length;
        }
        at = line.next;
    }
    result.resize(used);
    return result;
}

}  // namespace lumio
