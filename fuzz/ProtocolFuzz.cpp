// Frames of a broken peer, for both sides. An accepted message can be encoded, and decodes to the same message.

#include "adminhostd/Protocol.h"

#include <cstdint>
#include <cstdlib>
#include <string>

namespace {

using namespace adminhost;

void check(const Frame& frame, auto decode) {
    const auto message = decode(frame);
    if (!message) {
        return;
    }
    const Frame once = protocol::frameOf(*message);
    const auto again = decode(once);
    if (!again || *encodeFrame(protocol::frameOf(*again)) != *encodeFrame(once) || once.bytes != frame.bytes) {
        std::abort();
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    FrameReader reader;
    reader.append({reinterpret_cast<const char*>(data), size});
    while (const auto frame = reader.next()) {
        check(*frame, protocol::toWorker);
        check(*frame, protocol::toFront);
    }
    return 0;
}
