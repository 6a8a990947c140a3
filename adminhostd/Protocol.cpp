#include "adminhostd/Protocol.h"

#include "adminhostd/MessageMembers.h"

#include <array>
#include <limits>
#include <map>
#include <optional>
#include <string_view>
#include <type_traits>

#include <fmt/format.h>

namespace adminhost::protocol {
namespace {

constexpr std::int64_t longestDeadline = 1'000'000;  ///< seconds; a longer one would overflow in computations

template <class E>
struct Word {
    E value;
    std::string_view text;
};

/// Null for a number that is no outcome. The compiler rejects the switch if it lacks one.
constexpr const char* wordOf(Outcome outcome) {
    switch (outcome) {
        case Outcome::nothing:
            return "nothing";
        case Outcome::answered:
            return "answered";
        case Outcome::error:
            return "error";
        case Outcome::later:
            return "later";
        case Outcome::refused:
            return "refused";
        case Outcome::conflict:
            return "conflict";
        case Outcome::overrun:
            return "overrun";
        case Outcome::locked:
            return "locked";
        case Outcome::broken:
            return "broken";
        case Outcome::absent:
            return "absent";
        case Outcome::checked:
            return "checked";
    }
    return nullptr;
}

/// Every outcome: they count from 0 without a gap.
constexpr auto outcomeWords = [] {
    constexpr std::size_t count = [] {
        std::size_t counted = 0;
        while (wordOf(static_cast<Outcome>(counted)) != nullptr) {
            ++counted;
        }
        return counted;
    }();
    std::array<Word<Outcome>, count> words{};
    for (std::size_t i = 0; i < count; ++i) {
        words[i] = {static_cast<Outcome>(i), wordOf(static_cast<Outcome>(i))};
    }
    return words;
}();
constexpr Word<BodyForm> formWords[] = {{BodyForm::json, "json"}, {BodyForm::propertyList, "propertyList"}};
constexpr Word<Access> accessWords[] = {
    {Access::read, "read"}, {Access::write, "write"}, {Access::control, "control"}, {Access::account, "account"}};

constexpr Word<Diagnosis::Health> healthWords[] = {
    {Diagnosis::Health::ok, "ok"}, {Diagnosis::Health::warning, "warning"}, {Diagnosis::Health::failure, "failure"}};

constexpr Word<ServiceManager> managerWords[] = {{ServiceManager::systemd, "systemd"},
                                                 {ServiceManager::pidFile, "pidfile"}};

constexpr auto& wordsOf(ServiceManager) {
    return managerWords;
}
constexpr auto& wordsOf(Diagnosis::Health) {
    return healthWords;
}
constexpr auto& wordsOf(Access) {
    return accessWords;
}
constexpr auto& wordsOf(Outcome) {
    return outcomeWords;
}
constexpr auto& wordsOf(BodyForm) {
    return formWords;
}
constexpr auto& wordsOf(LdapNodeSettings::Sasl) {
    return saslWords;
}
constexpr auto& wordsOf(LdapNodeSettings::Verify) {
    return verifyWords;
}
constexpr auto& wordsOf(LdapNodeSettings::Schema) {
    return schemaWords;
}
constexpr auto& wordsOf(LdapNodeSettings::UuidForm) {
    return uuidFormWords;
}

template <class T>
constexpr bool isStruct = !std::is_same_v<std::remove_cvref_t<decltype(members<T>)>, std::nullptr_t>;
template <class T>
constexpr bool isVector = false;
template <class T>
constexpr bool isVector<std::vector<T>> = true;
template <class T>
constexpr bool isMap = false;
template <class T>
constexpr bool isMap<std::map<std::string, T>> = true;
template <class T>
constexpr bool isOptional = false;
template <class T>
constexpr bool isOptional<std::optional<T>> = true;

// A null Value is an absent member.

Value encoded(Value value) {
    return value;
}
Value encoded(std::string text) {
    return text;
}
Value encoded(Dictionary dictionary) {
    return dictionary;
}
Value encoded(Date date) {
    return date;
}
Value encoded(std::chrono::seconds duration) {
    return duration.count();
}
Value encoded(const HostPath& path) {
    return path.text();
}

template <class T>
Value encoded(T message) {
    if constexpr (std::is_integral_v<T>) {
        return message;
    } else if constexpr (std::is_enum_v<T>) {
        for (const auto& word : wordsOf(message)) {
            if (word.value == message) {
                return std::string(word.text);
            }
        }
        return {};
    } else if constexpr (isVector<T>) {
        Array array;
        array.reserve(message.size());
        for (auto& element : message) {
            array.push_back(encoded(std::move(element)));
        }
        return array;
    } else if constexpr (isMap<T>) {
        Dictionary dictionary;
        for (auto& [key, value] : message) {
            dictionary.set(key, encoded(std::move(value)));
        }
        return dictionary;
    } else if constexpr (isOptional<T>) {
        return message ? encoded(*std::move(message)) : Value();
    } else {
        static_assert(isStruct<T>);
        Dictionary dictionary;
        std::apply(
            [&](const auto&... each) { (dictionary.set(each.name, encoded(std::move(message.*each.place))), ...); },
            members<T>);
        return dictionary;
    }
}

/// Reads members out of their encoding. Keeps the name of the first that is missing or wrong.
class MessageDecoder {
  public:
    [[nodiscard]] const std::string& problem() const noexcept { return _problem; }
    bool fail(std::string problem) {
        _problem = std::move(problem);
        return false;
    }

    // Each gets the member's value, null if it is absent, and returns whether it fits.
    bool read(Value* found, std::string& into) { return take(found == nullptr ? nullptr : text(*found), into); }
    bool read(Value* found, Dictionary& into) { return take(found == nullptr ? nullptr : found->dictionary(), into); }
    bool read(Value* found, Value& into) {
        if (found != nullptr) {
            into = std::move(*found);
        }
        return true;
    }
    bool read(Value* found, Date& into) {
        const auto date = found == nullptr ? std::nullopt : found->date();
        into = date.value_or(Date());
        return date.has_value();
    }
    bool read(Value* found, std::chrono::seconds& into) {
        const auto count = found == nullptr ? std::nullopt : found->integer();
        into = std::chrono::seconds(count.value_or(0));
        return count && *count >= 0 && *count <= longestDeadline;
    }
    bool read(Value* found, bool& into) {
        const auto boolean = found == nullptr ? std::nullopt : found->boolean();
        into = boolean.value_or(false);
        return boolean.has_value();
    }
    bool read(Value* found, HostPath& into) {
        const std::string* path = found == nullptr ? nullptr : found->string();
        into = HostPath(path == nullptr ? std::string() : *path);
        return path != nullptr;
    }

    template <class T>
    bool read(Value* found, T& into) {
        if constexpr (isOptional<T>) {
            return found == nullptr || read(found, into.emplace());
        } else {
            return found != nullptr && readPresent(found, into);
        }
    }

  private:
    template <class T>
    bool readPresent(Value* found, T& into) {
        if constexpr (std::is_integral_v<T>) {
            return readNumber(*found, into);
        } else if constexpr (std::is_enum_v<T>) {
            for (const auto& word : wordsOf(into)) {
                if (found->string() != nullptr && *found->string() == word.text) {
                    into = word.value;
                    return true;
                }
            }
            return false;
        } else if constexpr (isVector<T>) {
            Array* array = found->array();
            if (array == nullptr) {
                return false;
            }
            into.clear();
            for (Value& element : *array) {
                if (!read(&element, into.emplace_back())) {
                    return false;
                }
            }
            return true;
        } else if constexpr (isMap<T>) {
            Dictionary* dictionary = found->dictionary();
            if (dictionary == nullptr) {
                return false;
            }
            into.clear();
            for (const DictionaryEntry& entry : *dictionary) {
                if (!read(dictionary->find(entry.key), into[entry.key])) {
                    return false;
                }
            }
            return true;
        } else {
            static_assert(isStruct<T>);
            return readStruct(*found, into);
        }
    }

    template <class T>
    static bool take(T* found, T& into) {
        if (found == nullptr) {
            return false;
        }
        into = std::move(*found);
        return true;
    }

    static std::string* text(Value& value) {
        // The value is a frame's own and about to be dropped: its text is moved, not copied.
        return const_cast<std::string*>(value.string());
    }

    template <class T>
    static bool readNumber(const Value& found, T& into) {
        if constexpr (std::is_unsigned_v<T>) {
            const auto number = found.unsignedInteger();
            into = static_cast<T>(number.value_or(0));
            return number && *number <= std::numeric_limits<T>::max();
        } else {
            const auto number = found.integer();
            into = static_cast<T>(number.value_or(0));
            return number && *number <= std::numeric_limits<T>::max() && *number >= std::numeric_limits<T>::min();
        }
    }

    template <class T>
    bool readStruct(Value& value, T& into) {
        Dictionary* dictionary = value.dictionary();
        if (dictionary == nullptr) {
            return false;
        }
        std::size_t known = 0;
        const auto one = [&](const auto& each) {
            Value* found = dictionary->find(each.name);
            known += found == nullptr ? 0 : 1;
            if (read(found, into.*each.place)) {
                return true;
            }
            return _problem.empty() ? fail(fmt::format("{} is missing or wrong", each.name)) : false;
        };
        if (!std::apply([&](const auto&... each) { return (one(each) && ...); }, members<T>)) {
            return false;
        }
        return known == dictionary->size() || fail("a dictionary has a surplus member");
    }

    std::string _problem;
};

template <class T>
constexpr FrameType typeOf = FrameType::configure;
template <>
constexpr FrameType typeOf<Perform> = FrameType::perform;
template <>
constexpr FrameType typeOf<FindAccounts> = FrameType::findAccounts;
template <>
constexpr FrameType typeOf<ReadHistory> = FrameType::readHistory;
template <>
constexpr FrameType typeOf<Diagnose> = FrameType::diagnose;
template <>
constexpr FrameType typeOf<ReadLog> = FrameType::readLog;
template <>
constexpr FrameType typeOf<ReadAudit> = FrameType::readAudit;
template <>
constexpr FrameType typeOf<Proceed> = FrameType::proceed;
template <>
constexpr FrameType typeOf<Recorded> = FrameType::recorded;
template <>
constexpr FrameType typeOf<Begun> = FrameType::begun;
template <>
constexpr FrameType typeOf<Unfinished> = FrameType::unfinished;
template <>
constexpr FrameType typeOf<Hello> = FrameType::hello;
template <>
constexpr FrameType typeOf<Log> = FrameType::log;
template <>
constexpr FrameType typeOf<Change> = FrameType::change;
template <>
constexpr FrameType typeOf<NotDone> = FrameType::notDone;
template <>
constexpr FrameType typeOf<SecretPart> = FrameType::secretPart;
template <>
constexpr FrameType typeOf<Answer> = FrameType::answer;

Frame encodedFrame(auto message) {
    return std::visit(
        []<class T>(T&& one) {
            Frame frame;
            frame.type = typeOf<T>;
            if constexpr (std::is_same_v<T, Answer>) {
                frame.bytes = std::move(one.bytes);
            }
            frame.payload = encoded(std::forward<T>(one));
            return frame;
        },
        std::move(message));
}

/// Fills the alternative of the frame's type; returns false if no alternative has that type.
template <class T>
bool decodeAs(Frame& frame, auto& message, MessageDecoder& decoder, bool& fits) {
    if (frame.type != typeOf<T>) {
        return false;
    }
    T& one = message.template emplace<T>();
    fits = decoder.read(&frame.payload, one);
    if constexpr (std::is_same_v<T, Answer>) {
        one.bytes = std::move(frame.bytes);
        if (fits && one.outcome == Outcome::refused && one.findings.empty()) {
            fits = decoder.fail("a refusal has no finding");
        }
    } else if (fits && !frame.bytes.empty()) {
        fits = decoder.fail("bytes follow a message that has none");
    }
    return true;
}

template <class... Ts>
Result<std::variant<Ts...>> decoded(Frame& frame) {
    std::variant<Ts...> message;
    MessageDecoder decoder;
    bool fits = false;
    if (!(decodeAs<Ts>(frame, message, decoder, fits) || ...)) {
        return failure({"protocol", 1, "a message of this type is not for this side"});
    }
    if (!fits) {
        return failure(
            {"protocol", 2, decoder.problem().empty() ? "the message is not a dictionary" : decoder.problem()});
    }
    return message;
}

template <class... Ts>
Result<std::variant<Ts...>> decodedLike(Frame& frame, const std::variant<Ts...>*) {
    return decoded<Ts...>(frame);
}

}  // namespace

std::vector<Outcome> outcomes() {
    std::vector<Outcome> all;
    all.reserve(outcomeWords.size());
    for (const auto& word : outcomeWords) {
        all.push_back(word.value);
    }
    return all;
}

Frame frameOf(ToWorker message) {
    return encodedFrame(std::move(message));
}

Frame frameOf(ToFront message) {
    return encodedFrame(std::move(message));
}

Result<ToWorker> toWorker(Frame frame) {
    return decodedLike(frame, static_cast<const ToWorker*>(nullptr));
}

Result<ToFront> toFront(Frame frame) {
    return decodedLike(frame, static_cast<const ToFront*>(nullptr));
}

}  // namespace adminhost::protocol
