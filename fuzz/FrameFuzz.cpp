// Frames of a broken worker, in two pieces. An accepted payload is encoded and decoded to the same bytes.

#include "adminhostd/Frame.h"
#include "platform/value/ValueCodec.h"

#include <cstdint>
#include <cstdlib>
#include <string>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace adminhost;
    const std::string_view bytes(reinterpret_cast<const char*>(data), size);
    FrameReader reader;
    for (const std::string_view piece : {bytes.substr(0, size / 2), bytes.substr(size / 2)}) {
        reader.append(piece);
        while (const auto frame = reader.next()) {
            std::string encoded;
            encodeValue(frame->payload, encoded);
            const auto again = decodeValue(encoded);
            std::string twice;
            if (again) {
                encodeValue(*again, twice);
            }
            if (encoded != twice) {
                std::abort();
            }
        }
    }
    return 0;
}
