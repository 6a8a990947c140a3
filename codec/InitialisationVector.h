#pragma once

// The initialisation vector of protected values.
//
// THESE SIXTEEN BYTES MUST EQUAL THE SERVICE'S OWN DEFINITION of the protected-value format. A value that was protected
// with one vector cannot be read with another, so a change makes all stored values unreadable. No other file contains
// them; docs/protected-values.md describes the whole format.

#include <array>
#include <cstdint>

namespace lumio {

constexpr std::uint8_t ivByte0 = 0x4C;   // L
constexpr std::uint8_t ivByte1 = 0x75;   // u
constexpr std::uint8_t ivByte2 = 0x6D;   // m
constexpr std::uint8_t ivByte3 = 0x69;   // i
constexpr std::uint8_t ivByte4 = 0x6F;   // o
constexpr std::uint8_t ivByte5 = 0x50;   // P
constexpr std::uint8_t ivByte6 = 0x72;   // r
constexpr std::uint8_t ivByte7 = 0x6F;   // o
constexpr std::uint8_t ivByte8 = 0x70;   // p
constexpr std::uint8_t ivByte9 = 0x65;   // e
constexpr std::uint8_t ivByte10 = 0x72;  // r
constexpr std::uint8_t ivByte11 = 0x74;  // t
constexpr std::uint8_t ivByte12 = 0x79;  // y
constexpr std::uint8_t ivByte13 = 0x49;  // I
constexpr std::uint8_t ivByte14 = 0x56;  // V
constexpr std::uint8_t ivByte15 = 0x31;  // 1

using InitialisationVector = std::array<std::uint8_t, 16>;

[[nodiscard]] inline InitialisationVector initialisationVector() noexcept {
    return {ivByte0, ivByte1, ivByte2,  ivByte3,  ivByte4,  ivByte5,  ivByte6,  ivByte7,
            ivByte8, ivByte9, ivByte10, ivByte11, ivByte12, ivByte13, ivByte14, ivByte15};
}

}  // namespace lumio
