// Property lists of both forms: an accepted list can be written, unless it has text that XML cannot carry, and reads
// back as the same text.

#include "platform/plist/PropertyList.h"

#include <cstdint>
#include <cstdlib>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace adminhost;
    const auto value = parsePropertyList({reinterpret_cast<const char*>(data), size});
    if (!value) {
        return 0;
    }
    const bool isXml = size < 6 || data[0] != 'b';
    const auto text = xmlPropertyList(*value);
    if (!text) {
        if (isXml) {
            std::abort();  // this text came from XML, so XML can carry it
        }
        return 0;
    }
    const auto again = parsePropertyList(*text);
    if (!again || xmlPropertyList(*again) != text) {
        std::abort();
    }
    return 0;
}
