#pragma once

// The internals of the base64 operations: the table, the encoder with its growing buffer, the decoding of a line's last
// characters. For the tests; other code uses LumioCategories.h.

#include "codec/LumioCategories.h"

#include <array>
#include <cstddef>
#include <exception>
#include <utility>

namespace lumio {

/// In the order of their 6 bits' values.
constexpr std::string_view base64Alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

constexpr std::int8_t base64Invalid = -1;
constexpr std::int8_t base64LineFeed = -2;
constexpr std::int8_t base64CarriageReturn = -3;
constexpr std::int8_t base64Blank = -4;
constexpr std::int8_t base64Pad = -5;

/// By a byte's low 7 bits: its 6 bits' value (0 to 63), or its class (below 0).
extern const std::array<std::int8_t, 128> base64DecodeTable;

/// Output bytes that grow by doubling. A buffer that cannot grow drops further bytes, with one log line for each.
class ByteBuffer {
  public:
    /// How a buffer grows; tests substitute one that fails.
    struct Growth {
        std::size_t limit = 0x7FFFFFFF;  ///< a full buffer of so many bytes does not grow
        /// Makes room for that many bytes in all; returns false, with the bytes unchanged, if that fails.
        bool (*reserve)(adminhost::Data& bytes, std::size_t capacity) noexcept = reserveBytes;
    };

    explicit ByteBuffer(std::size_t capacity) : ByteBuffer(capacity, Growth{}) {}
    ByteBuffer(std::size_t capacity, Growth growth) : _growth(growth) { reserveBytes(_bytes, capacity); }

    void append(std::uint8_t byte) noexcept {
        if (_bytes.size() == _bytes.capacity() && !grow()) {
            drop();
            return;
        }
        _bytes.push_back(byte);
    }

    /// Lengthens the bytes, growing just as that many single bytes would; the caller fills them. Returns null and
    /// appends no byte if there is not enough room for all.
    [[nodiscard]] std::uint8_t* extend(std::size_t length) noexcept {
        while (_bytes.capacity() - _bytes.size() < length) {
            if (!grow()) {
                return nullptr;
            }
        }
        const std::size_t used = _bytes.size();
        _bytes.resize(used + length);
        return _bytes.data() + used;
    }

    /// Moves the bytes to the caller, without a copy.
    [[nodiscard]] adminhost::Data take() && noexcept { return std::move(_bytes); }

    static bool reserveBytes(adminhost::Data& bytes, std::size_t capacity) noexcept {
        try {
            bytes.reserve(capacity);
            return true;
        } catch (const std::exception&) {
            return false;  // no memory, or more than a vector can hold
        }
    }

  private:
    [[nodiscard]] bool grow() noexcept;
    void drop() noexcept;

    adminhost::Data _bytes;
    Growth _growth;
};

struct EncoderOptions {
    bool lineBreaks = true;
    bool standardAlphabet = true;  ///< off: every "/" is written as ","
    std::uint8_t pad = '=';        ///< 0: no pads are written
    ByteBuffer::Growth growth{};
};

[[nodiscard]] adminhost::Data encodeBase64Data(Bytes data, const EncoderOptions& options);

/// Writes the bytes of the characters after a line's last whole group of four (at most 3, all of the alphabet) and
/// returns the place after those bytes. One character alone encodes no byte and cannot come from a valid line: it is
/// only logged, with characterCount, the number of the line's characters before its pads.
[[nodiscard]] std::uint8_t* decodeRemainder(Bytes remainder, std::size_t characterCount, std::uint8_t* out);

}  // namespace lumio
