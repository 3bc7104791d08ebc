// Any bytes are decoded as the plain way does it, and what came of them survives being encoded and
// decoded again.
#include <koru/string.h>

#include <cstdint>
#include <sstream>
#include <string>

#include "check.h"
#include "textmodel.h"

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    std::string const bytes(reinterpret_cast<char const*>(data), size);
    std::wstring const wide = Koru::make_wstring(bytes);
    KORU_CHECK(wide == fuzz::decoded(bytes));
    KORU_CHECK(wide == Koru::make_wstring(bytes.c_str()));
    KORU_CHECK(Koru::length(wide) == wide.size());
    std::string const narrow = Koru::make_string(wide);
    KORU_CHECK(narrow == fuzz::encoded(wide));
    KORU_CHECK(Koru::make_wstring(narrow) == wide);
    KORU_CHECK(Koru::compare(wide, Koru::make_wstring(narrow)) == 0);
    std::ostringstream os;
    Koru::operator<<(os, wide);
    KORU_CHECK(os.str().size() == wide.size());
    return 0;
}
