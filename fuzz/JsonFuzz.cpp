// JSON texts: an accepted text can be written and reads back as the same text, in both layouts. The error of a rejected
// text has a line and column and is valid UTF-8.

#include "platform/json/Json.h"
#include "platform/text/Utf8.h"

#include <cstdint>
#include <cstdlib>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace adminhost;
    const auto value = parseJson({reinterpret_cast<const char*>(data), size});
    if (!value) {
        const Error& error = value.error();
        if (!error.description || !error.description->starts_with("line ") || !isUtf8(*error.description)) {
            std::abort();
        }
        return 0;
    }
    const std::string text = jsonOf(*value);
    const auto again = parseJson(text);
    const auto pretty = parseJson(jsonOf(*value, true));
    if (!again || !pretty || jsonOf(*again) != text || jsonOf(*pretty) != text) {
        std::abort();
    }
    return 0;
}
