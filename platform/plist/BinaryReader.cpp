#include "platform/plist/PropertyList.h"
#include "platform/plist/Readers.h"
#include "platform/text/IsoDate.h"
#include "platform/text/Utf8.h"

#include <bit>
#include <cmath>
#include <cstdint>
#include <utility>
#include <vector>

#include <fmt/format.h>

namespace adminhost::plist {
namespace {

constexpr std::size_t headerSize = 8;
constexpr std::size_t trailerSize = 32;
constexpr std::int64_t epochOfDates = 978'307'200;  // 2001-01-01T00:00:00Z
/// The size of one value, besides its bytes, in the bound on the whole list.
constexpr std::size_t costOfValue = 8;

/// Reads the objects that the offset table points to. Every number in the file is checked before it is used; the first
/// failure stops everything.
class BinaryReader {
  public:
    BinaryReader(std::string_view bytes, std::size_t valuesMaximum) noexcept
        : _bytes(bytes), _valuesMaximum(valuesMaximum) {}

    Result<Value> parse() {
        auto value = readTrailer() ? countedObject(_top, 0) : std::nullopt;
        if (!value) {
            return failure(std::move(_error));
        }
        return *std::move(value);
    }

  private:
    std::nullopt_t fail(std::size_t at, std::string_view what) {
        _error = contentError(fmt::format("byte {}: {}", at, what));
        return std::nullopt;
    }

    [[nodiscard]] std::uint8_t byteAt(std::size_t at) const noexcept { return static_cast<std::uint8_t>(_bytes[at]); }

    /// Big-endian, of at most 8 bytes that are inside the file.
    [[nodiscard]] std::uint64_t numberAt(std::size_t at, std::size_t size) const noexcept {
        std::uint64_t number = 0;
        for (std::size_t i = 0; i < size; ++i) {
            number = number << 8U | byteAt(at + i);
        }
        return number;
    }

    bool readTrailer() {
        if (_bytes.size() < headerSize + trailerSize + 1 || !_bytes.starts_with("bplist00")) {
            fail(0, "not a binary property list of version 00");
            return false;
        }
        const std::size_t trailer = _bytes.size() - trailerSize;
        _offsetSize = byteAt(trailer + 6);
        _referenceSize = byteAt(trailer + 7);
        _count = numberAt(trailer + 8, 8);
        _top = numberAt(trailer + 16, 8);
        _table = numberAt(trailer + 24, 8);
        if (_offsetSize < 1 || _offsetSize > 8 || _referenceSize < 1 || _referenceSize > 8) {
            fail(trailer + 6, "sizes of offsets or references outside 1 to 8");
            return false;
        }
        // The table fills the room up to the trailer exactly, so a list that was cut or lengthened is noticed.
        if (_table <= headerSize || _table > trailer || _count == 0 || (trailer - _table) % _offsetSize != 0 ||
            (trailer - _table) / _offsetSize != _count) {
            fail(trailer + 8, "the offset table does not fit the file");
            return false;
        }
        if (_top >= _count) {
            fail(trailer + 16, "the top object does not exist");
            return false;
        }
        _open.resize(_count);
        return true;
    }

    /// Adds to the size of the whole list. Objects may be referred to many times, so it is not bounded by the file's.
    bool spend(std::size_t at, std::size_t bytes) {
        _spent += costOfValue + bytes;
        if (_spent > plistMaximumSize) {
            fail(at, "more content than a property list may have");
            return false;
        }
        return true;
    }

    /// An object that becomes a value, as all but keys do.
    std::optional<Value> countedObject(std::uint64_t number, int depth) {
        if (++_values > _valuesMaximum) {
            fail(_table + number * _offsetSize, tooManyValues(_valuesMaximum));
            _error.code = plistTooManyValues;
            return std::nullopt;
        }
        return object(number, depth);
    }

    std::optional<Value> object(std::uint64_t number, int depth) {
        const std::uint64_t at = numberAt(_table + number * _offsetSize, _offsetSize);
        if (at < headerSize || at >= _table) {
            return fail(_table + number * _offsetSize, "an offset outside the objects");
        }
        const std::uint8_t marker = byteAt(at);
        switch (marker >> 4U) {
            case 0x0:
                return marker == 0x08 || marker == 0x09 ? constant(at, marker) : unknown(at, marker);
            case 0x1:
                return marker <= 0x14 ? integer(at, std::size_t{1} << (marker & 0x0FU)) : unknown(at, marker);
            case 0x2:
                return marker == 0x22 || marker == 0x23 ? real(at, marker) : unknown(at, marker);
            case 0x3:
                return marker == 0x33 ? date(at) : unknown(at, marker);
            case 0x4:
            case 0x5:
            case 0x6:
                return text(at, marker >> 4U);
            case 0x8:
                return fail(at, "an object identifier, which no plain property list has");
            case 0xA:
            case 0xD:
                return container(number, at, marker >> 4U == 0xD, depth);
            default:
                return unknown(at, marker);
        }
    }

    std::nullopt_t unknown(std::size_t at, std::uint8_t marker) {
        return fail(at, fmt::format("unknown object type 0x{:02X}", marker));
    }

    std::optional<Value> constant(std::size_t at, std::uint8_t marker) {
        return spend(at, 0) ? std::optional<Value>(marker == 0x09) : std::nullopt;
    }

    /// Returns true if size bytes follow the first one of the object.
    bool holds(std::size_t at, std::uint64_t size) {
        if (size > _table - at - 1) {
            fail(at, "an object that reaches beyond the objects");
            return false;
        }
        return true;
    }

    std::optional<Value> integer(std::size_t at, std::size_t size) {
        if (!holds(at, size) || !spend(at, 0)) {
            return std::nullopt;
        }
        if (size < 8) {
            return Value(numberAt(at + 1, size));  // the short forms have no sign
        }
        if (size == 8) {
            return Value(static_cast<std::int64_t>(numberAt(at + 1, 8)));
        }
        const std::uint64_t high = numberAt(at + 1, 8);
        const std::uint64_t low = numberAt(at + 9, 8);
        if (high == 0) {
            return Value(low);
        }
        if (high == UINT64_MAX && low > static_cast<std::uint64_t>(INT64_MAX)) {
            return Value(static_cast<std::int64_t>(low));
        }
        return fail(at, "an integer outside the 64-bit range");
    }

    std::optional<Value> real(std::size_t at, std::uint8_t marker) {
        const std::size_t size = marker == 0x22 ? 4 : 8;
        if (!holds(at, size) || !spend(at, 0)) {
            return std::nullopt;
        }
        if (size == 4) {
            return Value(static_cast<double>(std::bit_cast<float>(static_cast<std::uint32_t>(numberAt(at + 1, 4)))));
        }
        return Value(std::bit_cast<double>(numberAt(at + 1, 8)));
    }

    std::optional<Value> date(std::size_t at) {
        if (!holds(at, 8) || !spend(at, 0)) {
            return std::nullopt;
        }
        const double seconds = std::floor(std::bit_cast<double>(numberAt(at + 1, 8)));
        constexpr double farthest = 1e12;  // seconds; far outside the calendar, far inside the integers
        if (!(std::abs(seconds) < farthest)) {
            return fail(at, "a date outside the years 0000 to 9999");
        }
        const Date date(std::chrono::seconds(static_cast<std::int64_t>(seconds) + epochOfDates));
        if (!hasFourDigitYear(date)) {
            return fail(at, "a date outside the years 0000 to 9999");
        }
        return Value(date);
    }

    struct Extent {
        std::size_t count = 0;  ///< of elements
        std::size_t begin = 0;  ///< of the first element
    };

    /// Count and place of an object's elements of the given size in bytes.
    std::optional<Extent> extent(std::size_t at, std::size_t elementSize) {
        Extent extent{byteAt(at) & 0x0FU, at + 1};
        if (extent.count == 0x0F) {  // the count is an integer object of its own
            if (!holds(at, 1)) {
                return std::nullopt;
            }
            const std::uint8_t marker = byteAt(at + 1);
            if (marker < 0x10 || marker > 0x13) {
                return fail(at + 1, "a count that is not an integer");
            }
            const std::size_t size = std::size_t{1} << (marker & 0x0FU);
            if (!holds(at + 1, size)) {
                return std::nullopt;
            }
            extent.count = numberAt(at + 2, size);
            extent.begin = at + 2 + size;
        }
        if (extent.count > (_table - extent.begin) / elementSize) {
            return fail(at, "an object that reaches beyond the objects");
        }
        return extent;
    }

    std::optional<Value> text(std::size_t at, unsigned type) {
        const auto place = extent(at, type == 0x6 ? 2 : 1);
        if (!place || !spend(at, type == 0x6 ? place->count * 2 : place->count)) {
            return std::nullopt;
        }
        if (type == 0x4) {
            const auto bytes = _bytes.substr(place->begin, place->count);
            return Value(Data(bytes.begin(), bytes.end()));
        }
        if (type == 0x5) {
            const std::string_view ascii = _bytes.substr(place->begin, place->count);
            for (const char c : ascii) {
                if (static_cast<unsigned char>(c) > 0x7F) {
                    return fail(at, "a text of ASCII with other characters");
                }
            }
            return Value(ascii);
        }
        FromUtf16 converted = utf8OfUtf16(_bytes.substr(place->begin, place->count * 2), true);
        if (converted.end < place->count * 2) {
            return fail(place->begin + converted.end, "invalid UTF-16");
        }
        return Value(std::move(converted.text));
    }

    /// The number of the object that a reference at the place points to.
    std::optional<std::uint64_t> reference(std::size_t at) {
        const std::uint64_t number = numberAt(at, _referenceSize);
        if (number >= _count) {
            return fail(at, "a reference to an object that does not exist");
        }
        return number;
    }

    std::optional<Value> container(std::uint64_t number, std::size_t at, bool isDictionary, int depth) {
        if (depth == plistMaximumDepth) {
            return fail(at, fmt::format("nested more than {} deep", plistMaximumDepth));
        }
        if (_open[number]) {
            return fail(at, "a container inside itself");
        }
        const auto place = extent(at, _referenceSize * (isDictionary ? 2 : 1));
        if (!place || !spend(at, 0)) {
            return std::nullopt;
        }
        _open[number] = true;
        auto value = isDictionary ? dictionary(at, *place, depth) : array(*place, depth);
        _open[number] = false;
        return value;
    }

    std::optional<Value> array(const Extent& place, int depth) {
        Array array;
        for (std::size_t i = 0; i < place.count; ++i) {
            const auto target = reference(place.begin + i * _referenceSize);
            auto value = target ? countedObject(*target, depth + 1) : std::nullopt;
            if (!value) {
                return std::nullopt;
            }
            array.push_back(std::move(*value));
        }
        return Value(std::move(array));
    }

    std::optional<Value> dictionary(std::size_t at, const Extent& place, int depth) {
        Dictionary dictionary;
        const std::size_t values = place.begin + place.count * _referenceSize;
        for (std::size_t i = 0; i < place.count; ++i) {
            const auto keyTarget = reference(place.begin + i * _referenceSize);
            const auto key = keyTarget ? object(*keyTarget, depth + 1) : std::nullopt;
            if (!key) {
                return std::nullopt;
            }
            if (key->string() == nullptr) {
                return fail(at, "a key that is not a text");
            }
            const auto target = reference(values + i * _referenceSize);
            auto value = target ? countedObject(*target, depth + 1) : std::nullopt;
            if (!value) {
                return std::nullopt;
            }
            dictionary.set(*key->string(), std::move(*value));
            if (dictionary.size() != i + 1) {
                return fail(at, "a key that occurs twice");
            }
        }
        return Value(std::move(dictionary));
    }

    std::string_view _bytes;
    Error _error;  ///< why a reading function returned nullopt
    std::size_t _offsetSize = 0;
    std::size_t _referenceSize = 0;
    std::uint64_t _count = 0;
    std::uint64_t _top = 0;
    std::uint64_t _table = 0;  ///< where the offset table begins and the objects end
    std::vector<bool> _open;   ///< the containers that are being read
    std::size_t _spent = 0;
    std::size_t _valuesMaximum;
    std::size_t _values = 0;
};

}  // namespace

Result<Value> parseBinary(std::string_view bytes, std::size_t valuesMaximum) {
    return BinaryReader(bytes, valuesMaximum).parse();
}

}  // namespace adminhost::plist
