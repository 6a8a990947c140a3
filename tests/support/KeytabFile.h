#pragma once

// Writes keytab files byte by byte, because adding many entries one by one would be too slow.

#include <cstdint>
#include <string>
#include <string_view>

namespace support {

/// A file keytab (format 5.2) with that many entries of AES-256 keys, their principals service0/host@REALM,
/// service1/host@REALM, ... taken in turn and starting again after the given number of principals.
inline std::string keytabFile(int entries, int principals, std::string_view realm = "NIMBO.TEST") {
    const auto number = [](std::string& bytes, std::uint32_t value, int size) {
        for (int shift = 8 * (size - 1); shift >= 0; shift -= 8) {
            bytes.push_back(static_cast<char>((value >> shift) & 0xff));
        }
    };
    const auto counted = [&](std::string& bytes, std::string_view text) {
        number(bytes, static_cast<std::uint32_t>(text.size()), 2);
        bytes.append(text);
    };
    std::string file("\x05\x02", 2);
    for (int i = 0; i < entries; ++i) {
        const auto vno = static_cast<std::uint32_t>(i / principals + 1);
        std::string entry;
        number(entry, 2, 2);  // components
        counted(entry, realm);
        counted(entry, "service" + std::to_string(i % principals));
        counted(entry, "host");
        number(entry, 1, 4);                                                 // name type
        number(entry, 1700000000U + static_cast<std::uint32_t>(i), 4);       // timestamp
        number(entry, vno, 1);                                               // short version number
        number(entry, 18, 2);                                                // aes256-cts-hmac-sha1-96
        counted(entry, std::string(32, static_cast<char>('A' + (i % 26))));  // key
        number(entry, vno, 4);
        number(file, static_cast<std::uint32_t>(entry.size()), 4);
        file += entry;
    }
    return file;
}

}  // namespace support
