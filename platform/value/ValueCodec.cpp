#include "platform/value/ValueCodec.h"

#include <algorithm>
#include <bit>
#include <cstring>

namespace adminhost {
namespace {

enum class ValueTag : unsigned char {
    null,
    no,
    yes,
    integer,
    unsignedInteger,
    real,
    string,
    date,
    data,
    array,
    dictionary,
};

void putTag(ValueTag tag, std::string& bytes) {
    bytes += static_cast<char>(tag);
}

/// Eight bytes in the machine's order: both ends are one machine.
void putWord(std::uint64_t word, std::string& bytes) {
    char buffer[sizeof word];
    std::memcpy(buffer, &word, sizeof word);
    bytes.append(buffer, sizeof buffer);
}

/// Seven bits a byte, lowest first.
void putSize(std::size_t size, std::string& bytes) {
    for (; size >= 0x80U; size >>= 7U) {
        bytes += static_cast<char>(size | 0x80U);
    }
    bytes += static_cast<char>(size);
}

void putText(std::string_view text, std::string& bytes) {
    putSize(text.size(), bytes);
    bytes += text;
}

class ValueDecoder {
  public:
    explicit ValueDecoder(std::string_view bytes) : _bytes(bytes) {}

    bool value(Value& value, std::size_t depth);
    [[nodiscard]] bool atEnd() const { return _bytes.empty(); }

  private:
    bool word(std::uint64_t& word);
    bool size(std::size_t& size);
    bool text(std::string_view& text);
    bool array(Value& value, std::size_t depth);
    bool dictionary(Value& value, std::size_t depth);

    std::string_view _bytes;
};

bool ValueDecoder::word(std::uint64_t& word) {
    if (_bytes.size() < sizeof word) {
        return false;
    }
    std::memcpy(&word, _bytes.data(), sizeof word);
    _bytes.remove_prefix(sizeof word);
    return true;
}

bool ValueDecoder::size(std::size_t& size) {
    size = 0;
    for (unsigned shift = 0; shift < 35 && !_bytes.empty(); shift += 7) {
        const auto byte = static_cast<unsigned char>(_bytes.front());
        _bytes.remove_prefix(1);
        size |= std::size_t{byte & 0x7fU} << shift;
        if (byte < 0x80U) {
            return true;
        }
    }
    return false;
}

bool ValueDecoder::text(std::string_view& text) {
    std::size_t length = 0;
    if (!size(length) || length > _bytes.size()) {
        return false;
    }
    text = _bytes.substr(0, length);
    _bytes.remove_prefix(length);
    return true;
}

bool ValueDecoder::array(Value& value, std::size_t depth) {
    std::size_t count = 0;
    // Every element occupies at least one byte, so a forged count cannot make this allocate much memory.
    if (depth == codecMaximumDepth || !size(count) || count > _bytes.size()) {
        return false;
    }
    Array array;
    array.reserve(std::min<std::size_t>(count, 4096));
    for (std::size_t i = 0; i < count; ++i) {
        if (!this->value(array.emplace_back(), depth + 1)) {
            return false;
        }
    }
    value = std::move(array);
    return true;
}

bool ValueDecoder::dictionary(Value& value, std::size_t depth) {
    std::size_t count = 0;
    if (depth == codecMaximumDepth || !size(count) || count > _bytes.size()) {
        return false;
    }
    Dictionary dictionary;
    for (std::size_t i = 0; i < count; ++i) {
        std::string_view key;
        Value entry;
        if (!text(key) || !this->value(entry, depth + 1)) {
            return false;
        }
        dictionary.set(key, std::move(entry));
    }
    // A null entry or a repeated key would leave fewer.
    if (dictionary.size() != count) {
        return false;
    }
    value = std::move(dictionary);
    return true;
}

bool ValueDecoder::value(Value& value, std::size_t depth) {
    if (_bytes.empty()) {
        return false;
    }
    const auto tag = static_cast<ValueTag>(_bytes.front());
    _bytes.remove_prefix(1);
    std::uint64_t bits = 0;
    std::string_view bytes;
    switch (tag) {
        case ValueTag::null:
            value = nullptr;
            return true;
        case ValueTag::no:
        case ValueTag::yes:
            value = tag == ValueTag::yes;
            return true;
        case ValueTag::integer:
            value = word(bits) ? Value(static_cast<std::int64_t>(bits)) : Value();
            return !value.isNull();
        case ValueTag::unsignedInteger:
            value = word(bits) ? Value(bits) : Value();
            return !value.isNull();
        case ValueTag::real:
            value = word(bits) ? Value(std::bit_cast<double>(bits)) : Value();
            return !value.isNull();
        case ValueTag::date:
            value = word(bits) ? Value(Date(std::chrono::seconds(static_cast<std::int64_t>(bits)))) : Value();
            return !value.isNull();
        case ValueTag::string:
            value = text(bytes) ? Value(bytes) : Value();
            return !value.isNull();
        case ValueTag::data:
            value = text(bytes) ? Value(Data(bytes.begin(), bytes.end())) : Value();
            return !value.isNull();
        case ValueTag::array:
            return array(value, depth);
        case ValueTag::dictionary:
            return dictionary(value, depth);
    }
    return false;
}

}  // namespace

void encodeValue(const Value& value, std::string& bytes) {
    switch (value.type()) {
        case Value::Type::null:
            putTag(ValueTag::null, bytes);
            return;
        case Value::Type::boolean:
            putTag(*value.boolean() ? ValueTag::yes : ValueTag::no, bytes);
            return;
        case Value::Type::integer:
            if (const auto number = value.integer()) {
                putTag(ValueTag::integer, bytes);
                putWord(static_cast<std::uint64_t>(*number), bytes);
            } else {
                putTag(ValueTag::unsignedInteger, bytes);
                putWord(*value.unsignedInteger(), bytes);
            }
            return;
        case Value::Type::real:
            putTag(ValueTag::real, bytes);
            putWord(std::bit_cast<std::uint64_t>(*value.real()), bytes);
            return;
        case Value::Type::string:
            putTag(ValueTag::string, bytes);
            putText(*value.string(), bytes);
            return;
        case Value::Type::date:
            putTag(ValueTag::date, bytes);
            putWord(static_cast<std::uint64_t>(value.date()->time_since_epoch().count()), bytes);
            return;
        case Value::Type::data:
            putTag(ValueTag::data, bytes);
            putSize(value.data()->size(), bytes);
            bytes.append(value.data()->begin(), value.data()->end());
            return;
        case Value::Type::array:
            putTag(ValueTag::array, bytes);
            putSize(value.array()->size(), bytes);
            for (const Value& element : *value.array()) {
                encodeValue(element, bytes);
            }
            return;
        case Value::Type::dictionary:
            putTag(ValueTag::dictionary, bytes);
            putSize(value.dictionary()->size(), bytes);
            for (const DictionaryEntry& entry : *value.dictionary()) {
                putText(entry.key, bytes);
                encodeValue(entry.value, bytes);
            }
            return;
    }
}

std::optional<Value> decodeValue(std::string_view bytes) {
    ValueDecoder decoder(bytes);
    Value value;
    if (!decoder.value(value, 0) || !decoder.atEnd()) {
        return std::nullopt;
    }
    return value;
}

}  // namespace adminhost
