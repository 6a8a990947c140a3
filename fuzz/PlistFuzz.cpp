// Property lists of either form: whatever is accepted can be written, unless it holds text that XML cannot carry, and
// reads back as the same text.

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
            std::abort();  // XML carried it once
        }
        return 0;
    }
    const auto again = parsePropertyList(*text);
    if (!again || xmlPropertyList(*again) != text) {
        std::abort();
    }
    return 0;
}
