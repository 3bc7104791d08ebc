// Any two texts compare as the C library compares them, and the other way round.
#include <koru/string.h>

#include <strings.h>
#include <wchar.h>

#include <clocale>
#include <cstdint>
#include <string>

#include "check.h"
#include "input.h"

namespace {

int sign(int value) { return (value > 0) - (value < 0); }

/// `reversed` is not always the opposite of `expected`: the C library's difference of wide characters
/// wraps, and half of their range is negative both ways.
template <class String>
void check(String const& a, String const& b, int expected, int reversed) {
    KORU_CHECK(sign(Koru::compare(a, b)) == sign(expected));
    KORU_CHECK(sign(Koru::compare(b, a)) == sign(reversed));
    KORU_CHECK(sign(Koru::compare(a.c_str(), b.c_str())) == sign(expected));
    KORU_CHECK(Koru::compare(a, a) == 0);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    fuzz::Input input(data, size);
    static_cast<void>(std::setlocale(LC_ALL, input.below(2) == 0 ? "C" : "C.UTF-8"));
    while (!input.isAtEnd()) {
        // What both begin with, then what each has of its own.
        std::string const common = input.bytes();
        std::string const a = common + input.bytes();
        std::string const b = common + input.bytes();
        check(a, b, ::strcasecmp(a.c_str(), b.c_str()), ::strcasecmp(b.c_str(), a.c_str()));

        std::wstring const wideCommon = input.text();
        std::wstring const x = wideCommon + input.text();
        std::wstring const y = wideCommon + input.text();
        check(x, y, ::wcscasecmp(x.c_str(), y.c_str()), ::wcscasecmp(y.c_str(), x.c_str()));
    }
    return 0;
}
