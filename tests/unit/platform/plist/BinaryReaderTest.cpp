#include "tests/unit/platform/plist/PlistTestSupport.h"

#include <bit>
#include <chrono>
#include <cmath>

#include <gmock/gmock.h>

namespace {

using namespace adminhost;
using namespace std::chrono;
using namespace std::string_literals;

std::string bigEndian(std::uint64_t number, std::size_t size) {
    std::string bytes;
    while (size-- > 0) {
        bytes += static_cast<char>(number >> (8 * size));
    }
    return bytes;
}

/// A list of the given objects, the first on top, with references of refSize bytes.
std::string binary(const std::vector<std::string>& objects, std::size_t refSize = 1) {
    std::string bytes = "bplist00";
    std::string table;
    for (const std::string& object : objects) {
        table += bigEndian(bytes.size(), 4);
        bytes += object;
    }
    const std::size_t tableAt = bytes.size();
    bytes += table + std::string(6, '\0') + bigEndian(4, 1) + bigEndian(refSize, 1);
    return bytes + bigEndian(objects.size(), 8) + bigEndian(0, 8) + bigEndian(tableAt, 8);
}

std::string realBytes(double number) {
    return bigEndian(std::bit_cast<std::uint64_t>(number), 8);
}

std::string errorOf(std::string_view bytes) {
    const auto value = parsePropertyList(bytes);
    return value ? "accepted" : value.error().description.value_or("");
}

Value valueOf(std::string_view bytes) {
    auto value = parsePropertyList(bytes);
    EXPECT_TRUE(value) << value.error().description.value_or("");
    return value.value_or(nullptr);
}

class BinaryReaderOracle : public PlistTest {
  protected:
    /// The list in binary form, as plistlib writes it.
    std::string binaryOf(const Value& value) {
        writeBytes("xml", xmlPropertyList(value).value_or(""));
        python(
            "value = plistlib.load(open(sys.argv[1], 'rb'))\n"
            "plistlib.dump(value, open(sys.argv[2], 'wb'), fmt=plistlib.FMT_BINARY, sort_keys=False)\n",
            {path("xml"), path("binary")});
        return readBytes("binary");
    }
};

Value everyType() {
    Array many;
    for (int i = 0; i < 300; ++i) {
        many.emplace_back("text " + std::to_string(i));
    }
    return Dictionary{{"b", true},
                      {"f", false},
                      {"i", Array{0, 255, 256, 65535, 65536, 4294967296, -1, INT64_MIN, INT64_MAX, UINT64_MAX}},
                      {"r", Array{0.1, -HUGE_VAL, 1e300}},
                      {"s", "plain"},
                      {"u", "àé€😀 of more than fifteen"},
                      {"d", sys_seconds(sys_days(1999y / December / 31) + 8h)},
                      {"x", Data(1000, 7)},
                      {"many", many},
                      {"e", Array{Dictionary{}, Array{}, "", Data{}}}};
}

TEST_F(BinaryReaderOracle, ReadsWhatPlistlibWrites) {
    const Value value = everyType();
    EXPECT_EQ(valueOf(binaryOf(value)), value);
    EXPECT_EQ(valueOf(binaryOf("alone")), Value("alone"));
}

TEST_F(BinaryReaderOracle, KeepsTheOrderOfKeys) {
    const Value read = valueOf(binaryOf(Dictionary{{"z", 1}, {"a", 2}, {"m", 3}}));
    std::string order;
    for (const DictionaryEntry& entry : *read.dictionary()) {
        order += entry.key;
    }
    EXPECT_EQ(order, "zam");
}

TEST_F(BinaryReaderOracle, IsChosenByItsFirstBytesAlsoInFiles) {
    ASSERT_FALSE(binaryOf(Dictionary{{"a", 1}}).empty());
    EXPECT_EQ(readPropertyList(DiskPath(path("binary"))), Value(Dictionary{{"a", 1}}));
}

TEST_F(BinaryReaderOracle, ListCutAtAnyByteIsRefused) {
    const std::string bytes = binaryOf(everyType());
    ASSERT_EQ(errorOf(bytes), "accepted");
    for (std::size_t length = 6; length < bytes.size(); ++length) {
        ASSERT_THAT(errorOf(bytes.substr(0, length)), testing::StartsWith("byte ")) << length;
    }
    EXPECT_THAT(errorOf(bytes + '\0'), testing::StartsWith("byte "));
    EXPECT_THAT(errorOf(bytes + bytes), testing::StartsWith("byte "));
}

TEST_F(BinaryReaderOracle, EveryByteChangedIsReadOrRefusedWithoutHarm) {
    const std::string bytes = binaryOf(
        Dictionary{{"a", Array{1, "é", 0.5, Data{1, 2}, true, Dictionary{{"b", -1}}}}, {"d", sys_seconds(seconds(0))}});
    int refused = 0;
    for (std::size_t at = 6; at < bytes.size(); ++at) {
        for (int byte = 0; byte < 256; ++byte) {
            std::string changed = bytes;
            changed[at] = static_cast<char>(byte);
            refused += errorOf(changed) == "accepted" ? 0 : 1;
        }
    }
    EXPECT_GT(refused, 1000);
    EXPECT_EQ(errorOf(bytes), "accepted");
}

TEST_F(BinaryReaderOracle, ObjectIdentifiersAreRefused) {
    python("plistlib.dump([plistlib.UID(1)], open(sys.argv[1], 'wb'), fmt=plistlib.FMT_BINARY)\n", {path("binary")});
    EXPECT_EQ(errorOf(readBytes("binary")), "byte 10: an object identifier, which no plain property list has");
}

TEST_F(BinaryReaderOracle, DepthOf512IsReadAnd513IsRefused) {
    for (const int depth : {512, 513}) {
        python(
            "value = []\n"
            "for i in range(int(sys.argv[2]) - 1): value = [value]\n"
            "sys.setrecursionlimit(10000)\n"
            "plistlib.dump(value, open(sys.argv[1], 'wb'), fmt=plistlib.FMT_BINARY)\n",
            {path("binary"), std::to_string(depth)});
        const std::string error = errorOf(readBytes("binary"));
        EXPECT_TRUE(depth == 512 ? error == "accepted" : error.ends_with(": nested more than 512 deep")) << error;
    }
}

TEST(BinaryReader, IntegersOfOneToSixteenBytes) {
    EXPECT_EQ(valueOf(binary({"\x10\xFF"})), Value(255));
    EXPECT_EQ(valueOf(binary({"\x11\xFF\xFF"})), Value(65535));
    EXPECT_EQ(valueOf(binary({"\x12\xFF\xFF\xFF\xFF"})), Value(4294967295));
    EXPECT_EQ(valueOf(binary({"\x13" + bigEndian(UINT64_MAX, 8)})), Value(-1));
    EXPECT_EQ(valueOf(binary({"\x14" + bigEndian(0, 8) + bigEndian(UINT64_MAX, 8)})), Value(UINT64_MAX));
    EXPECT_EQ(valueOf(binary({"\x14" + bigEndian(UINT64_MAX, 8) + bigEndian(1ULL << 63U, 8)})), Value(INT64_MIN));
}

TEST(BinaryReader, IntegersOutsideTheRangeAreRefused) {
    EXPECT_EQ(errorOf(binary({"\x14" + bigEndian(1, 8) + bigEndian(0, 8)})),
              "byte 8: an integer outside the 64-bit range");
    EXPECT_EQ(errorOf(binary({"\x14" + bigEndian(UINT64_MAX, 8) + bigEndian(INT64_MAX, 8)})),
              "byte 8: an integer outside the 64-bit range");
    EXPECT_EQ(errorOf(binary({"\x15" + std::string(32, '\0')})), "byte 8: unknown object type 0x15");
}

TEST(BinaryReader, RealsOfFourAndEightBytes) {
    EXPECT_EQ(valueOf(binary({"\x22" + bigEndian(std::bit_cast<std::uint32_t>(1.5F), 4)})), Value(1.5));
    EXPECT_EQ(valueOf(binary({"\x23" + realBytes(0.1)})), Value(0.1));
    EXPECT_EQ(errorOf(binary({"\x21\x01\x01"})), "byte 8: unknown object type 0x21");
}

TEST(BinaryReader, DatesCountFrom2001AndLoseTheirFraction) {
    const sys_seconds epoch = sys_days(2001y / January / 1);
    EXPECT_EQ(valueOf(binary({"\x33" + realBytes(0)})), Value(epoch));
    EXPECT_EQ(valueOf(binary({"\x33" + realBytes(1.9)})), Value(epoch + 1s));
    EXPECT_EQ(valueOf(binary({"\x33" + realBytes(-0.1)})), Value(epoch - 1s));
    for (const double bad : {HUGE_VAL, -HUGE_VAL, static_cast<double>(NAN), 1e300, 3e11, -3e11}) {
        EXPECT_EQ(errorOf(binary({"\x33" + realBytes(bad)})), "byte 8: a date outside the years 0000 to 9999") << bad;
    }
}

TEST(BinaryReader, TextsOfBothKinds) {
    EXPECT_EQ(valueOf(binary({"\x53"s + "abc"})), Value("abc"));
    EXPECT_EQ(valueOf(binary({"\x62\xD8\x3D\xDE\x00"s})), Value("😀"));
    EXPECT_EQ(errorOf(binary({"\x51\xE0"})), "byte 8: a text of ASCII with other characters");
    EXPECT_EQ(errorOf(binary({"\x62\x00\x41\xD8\x3D"s})), "byte 11: invalid UTF-16");
    EXPECT_EQ(errorOf(binary({"\x71\x41"})), "byte 8: unknown object type 0x71");
}

TEST(BinaryReader, CountsOfTheirOwnMayHaveEightBytes) {
    EXPECT_EQ(valueOf(binary({"\x5F\x10\x02"s + "ab"})), Value("ab"));
    EXPECT_EQ(valueOf(binary({"\x5F\x13"s + bigEndian(2, 8) + "ab"})), Value("ab"));
    EXPECT_EQ(errorOf(binary({"\x5F\x51"s + "ab"})), "byte 9: a count that is not an integer");
    EXPECT_EQ(errorOf(binary({"\x5F\x14"s + bigEndian(0, 8) + bigEndian(2, 8) + "ab"})),
              "byte 9: a count that is not an integer");
}

TEST(BinaryReader, ObjectsThatReachBeyondTheOthersAreRefused) {
    const std::string what = "byte 8: an object that reaches beyond the objects";
    EXPECT_EQ(errorOf(binary({"\x54"s + "abc"})), what);
    EXPECT_EQ(errorOf(binary({"\x44"s + "abc"})), what);
    EXPECT_EQ(errorOf(binary({"\x62\x00\x41\x00"s})), what);
    EXPECT_EQ(errorOf(binary({"\x13\x01"s})), what);
    EXPECT_EQ(errorOf(binary({"\x23\x01"s})), what);
    EXPECT_EQ(errorOf(binary({"\x33\x01"s})), what);
    EXPECT_EQ(errorOf(binary({"\xA2\x00"s})), what);
    EXPECT_EQ(errorOf(binary({"\xD1\x00"s})), what);
    EXPECT_EQ(errorOf(binary({"\x5F"s})), what);
    EXPECT_EQ(errorOf(binary({"\x5F\x13\x01"s})), "byte 9: an object that reaches beyond the objects");
    EXPECT_EQ(errorOf(binary({"\x5F\x13"s + bigEndian(UINT64_MAX, 8)})), what);
    EXPECT_EQ(errorOf(binary({"\x6F\x13"s + bigEndian(1ULL << 63U, 8)})), what);
    EXPECT_EQ(errorOf(binary({"\xAF\x13"s + bigEndian(UINT64_MAX / 2, 8)})), what);
}

TEST(BinaryReader, NullFillAndSetAreRefused) {
    EXPECT_EQ(errorOf(binary({"\x00"s})), "byte 8: unknown object type 0x00");
    EXPECT_EQ(errorOf(binary({"\x0F"})), "byte 8: unknown object type 0x0F");
    EXPECT_EQ(errorOf(binary({"\xC0"})), "byte 8: unknown object type 0xC0");
}

TEST(BinaryReader, ContainersInsideThemselvesAreRefused) {
    EXPECT_EQ(errorOf(binary({"\xA1\x00"s})), "byte 8: a container inside itself");
    EXPECT_EQ(errorOf(binary({"\xA1\x01"s, "\xA1\x00"s})), "byte 8: a container inside itself");
    EXPECT_EQ(errorOf(binary({"\xD1\x01\x00"s, "\x51k"s})), "byte 8: a container inside itself");
    EXPECT_EQ(errorOf(binary({"\xD1\x00\x01"s, "\x51k"s})), "byte 8: a container inside itself");
}

TEST(BinaryReader, OneObjectMayStandInSeveralPlaces) {
    EXPECT_EQ(valueOf(binary({"\xA2\x01\x01"s, "\xA1\x02"s, "\x51x"s})), Value(Array{Array{"x"}, Array{"x"}}));
}

TEST(BinaryReader, ObjectsThatMultiplyThemselvesAreRefused) {
    std::vector<std::string> doubling;
    for (char i = 1; i <= 60; ++i) {
        doubling.push_back("\xA2"s + i + i);
    }
    doubling.push_back("\x51x");
    EXPECT_THAT(errorOf(binary(doubling)), testing::EndsWith("more content than a property list may have"));

    std::string references;
    for (int i = 0; i < 1000; ++i) {
        references += '\x01';
    }
    EXPECT_THAT(errorOf(binary({"\xAF\x11\x03\xE8" + references,
                                "\x4F\x12" + bigEndian(1 << 20U, 4) + std::string(1 << 20U, 'x')})),
                testing::EndsWith("more content than a property list may have"));
}

TEST(BinaryReader, NumberOfValuesIsBoundedByTheCallerHoweverOftenOneObjectStands) {
    // A dictionary whose key is a list of three texts, which is not a valid key.
    const std::string bytes = binary({"\xD1\x01\x02"s, "\x51k"s, "\xA3\x01\x01\x01"s});
    EXPECT_TRUE(parsePropertyList(bytes, 5));
    const auto tooMany = parsePropertyList(bytes, 4);
    ASSERT_FALSE(tooMany);
    EXPECT_EQ(tooMany.error().code, plistTooManyValues);
    EXPECT_THAT(tooMany.error().description.value_or(""), testing::EndsWith(": there are more than 4 values"));
}

TEST(BinaryReader, ReferencesAndOffsetsToNothingAreRefused) {
    EXPECT_EQ(errorOf(binary({"\xA1\x05"s})), "byte 9: a reference to an object that does not exist");
    EXPECT_EQ(errorOf(binary({"\xD1\x05\x00"s})), "byte 9: a reference to an object that does not exist");
    std::string bytes = binary({"\x51x"});
    bytes[bytes.size() - 32 - 1] = 3;  // into the header
    EXPECT_EQ(errorOf(bytes), "byte 10: an offset outside the objects");
    bytes[bytes.size() - 32 - 1] = 100;
    EXPECT_EQ(errorOf(bytes), "byte 10: an offset outside the objects");
    bytes[bytes.size() - 32 - 4] = '\x7F';
    EXPECT_EQ(errorOf(bytes), "byte 10: an offset outside the objects");
}

TEST(BinaryReader, KeysAreTextsThatStandOnce) {
    EXPECT_EQ(errorOf(binary({"\xD1\x01\x01"s, "\x10\x01"s})), "byte 8: a key that is not a text");
    EXPECT_EQ(errorOf(binary({"\xD2\x01\x01\x01\x01"s, "\x51k"s})), "byte 8: a key that occurs twice");
}

TEST(BinaryReader, WideReferencesAreRead) {
    EXPECT_EQ(valueOf(binary({"\xA1"s + bigEndian(1, 8), "\x51x"s}, 8)), Value(Array{"x"}));
}

TEST(BinaryReader, TrailerThatDoesNotFitIsRefused) {
    EXPECT_EQ(errorOf("bplist00"), "byte 0: not a binary property list of version 00");
    EXPECT_EQ(errorOf("bplist01" + binary({"\x51x"}).substr(8)), "byte 0: not a binary property list of version 00");
    const std::string good = binary({"\x51x"});
    const std::size_t trailer = good.size() - 32;
    const auto changed = [&](std::size_t at, char byte) {
        std::string bytes = good;
        bytes[trailer + at] = byte;
        return errorOf(bytes);
    };
    EXPECT_EQ(changed(6, 0), "byte 20: sizes of offsets or references outside 1 to 8");
    EXPECT_EQ(changed(6, 9), "byte 20: sizes of offsets or references outside 1 to 8");
    EXPECT_EQ(changed(7, 0), "byte 20: sizes of offsets or references outside 1 to 8");
    EXPECT_EQ(changed(15, 0), "byte 22: the offset table does not fit the file");
    EXPECT_EQ(changed(15, 2), "byte 22: the offset table does not fit the file");
    EXPECT_EQ(changed(8, '\x40'), "byte 22: the offset table does not fit the file");
    EXPECT_EQ(changed(23, 1), "byte 30: the top object does not exist");
    EXPECT_EQ(changed(31, 9), "byte 22: the offset table does not fit the file");
    EXPECT_EQ(changed(24, '\xFF'), "byte 22: the offset table does not fit the file");
}

}  // namespace
