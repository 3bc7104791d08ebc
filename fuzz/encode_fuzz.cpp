// Any 32-bit characters are encoded as the plain way does it, and written to a stream as their low
// bytes.
#include <koru/string.h>

#include <algorithm>
#include <cstdint>
#include <sstream>
#include <string>

#include "check.h"
#include "input.h"
#include "textmodel.h"

namespace {

/// Characters of one byte of input each, of two, or of four.
std::wstring characters(fuzz::Input& input) {
    unsigned const width = 1U << input.below(3);
    std::wstring result;
    while (!input.isAtEnd()) {
        std::uint32_t value = 0;
        for (unsigned i = 0; i < width; ++i) value = value << 8 | input.byte();
        result += static_cast<wchar_t>(value);
    }
    return result;
}

void checkInserters(std::wstring const& wide, std::string const& narrow) {
    std::string lowBytes;
    for (wchar_t const c : wide) lowBytes += static_cast<char>(static_cast<std::uint32_t>(c));
    std::ostringstream os;
    Koru::operator<<(os, wide);
    KORU_CHECK(os.str() == lowBytes);

    // It counts with a signed byte.
    std::size_t const count = narrow.size() % 256;
    os.str("");
    Koru::operator<<(os, narrow);
    KORU_CHECK(os.str() == narrow.substr(0, count < 128 ? count : 0));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    fuzz::Input input(data, size);
    std::wstring const wide = characters(input);
    std::string const narrow = Koru::make_string(wide);
    KORU_CHECK(narrow == fuzz::encoded(wide));
    KORU_CHECK(narrow == Koru::make_string(wide.c_str()));
    KORU_CHECK(Koru::length(wide) == fuzz::upToNul(wide).size());
    bool const survives = std::all_of(wide.begin(), wide.end(), [](wchar_t c) { return c > 0; });
    if (survives) KORU_CHECK(Koru::make_wstring(narrow) == wide);
    checkInserters(wide, narrow);
    return 0;
}
