// Base64: encoded bytes decode to the same bytes, and no text decodes to more bytes than it has.

#include "codec/LumioCategories.h"

#include <algorithm>
#include <cstdlib>

namespace {

void require(bool condition) {
    if (!condition) {
        std::abort();
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace lumio;
    const Bytes input(data, size);
    const adminhost::Data original(input.begin(), input.end());

    const adminhost::Data wrapped = LumioUtilities_encodeBase64(input);
    adminhost::Data unwrapped = LumioUtilities_encodeBase64WithoutLineBreaks(input);
    require(LumioUtilities_decodeBase64(wrapped) == original);
    require(LumioUtilities_decodeBase64(unwrapped) == original);
    require(LumioUtilities_isValidBase64Data(unwrapped));
    require(unwrapped.size() == (size + 2) / 3 * 4);
    require(wrapped.size() == unwrapped.size() + size / 57);

    const adminhost::Data decoded = LumioUtilities_decodeBase64(input);
    require(decoded.size() <= size);
    if (LumioUtilities_isValidBase64Data(input)) {
        const auto pads = static_cast<std::size_t>(std::count(input.begin(), input.end(), '='));
        require(decoded.size() == size / 4 * 3 - pads);
    }
    return 0;
}
