// A path is refused with one of two messages, or parsed into a directory between slashes and a name
// without one, and its text parses into an equal path again.
#include <koru/file.h>
#include <koru/string.h>

#include <cstdint>
#include <stdexcept>
#include <string>

#include "check.h"

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    std::string const text(reinterpret_cast<char const*>(data), size);
    try {
        Koru::File::Path const path(text);
        std::wstring const& directory = path.getDirectory();
        KORU_CHECK(directory.size() >= 3);
        KORU_CHECK(directory.front() == L'/' && directory.back() == L'/');
        KORU_CHECK(directory.find(L"//") == std::wstring::npos);
        KORU_CHECK(path.getName().find_first_of(L"/\\") == std::wstring::npos);
        KORU_CHECK(path.getVolume().empty());
        std::wstring const whole = path;
        KORU_CHECK(std::wstring(Koru::File::Path(whole)) == whole);
    } catch (std::invalid_argument const& e) {
        std::string const message = e.what();
        KORU_CHECK(message == "null or empty string passed as file path" ||
                   message == "cannot determine path");
    }
    return 0;
}
