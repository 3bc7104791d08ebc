// A property file of any bytes loads, and what a rewrite made of it stays the same in the next one.
#include <koru/propertyfile.h>
#include <koru/string.h>
#include <stdlib.h>
#include <unistd.h>

#include <cstdint>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "check.h"

namespace {

using Koru::File;
using Koru::PropertyFile;

std::string const& fileName() {
    static std::string const name = [] {
        char pattern[] = "/tmp/koru-fuzz-XXXXXX";
        int const descriptor = ::mkstemp(pattern);
        KORU_CHECK(descriptor >= 0);
        ::close(descriptor);
        static std::string path;
        path = pattern;
        std::atexit([] { ::unlink(path.c_str()); });
        return path;
    }();
    return name;
}

std::string bytesOnDisk() {
    std::ifstream in(fileName(), std::ios::binary);
    return {std::istreambuf_iterator<char>(in), {}};
}

/// Takes the list apart from its front and returns the text that it should be written as.
std::string drain(PropertyFile& file) {
    std::string text;
    for (std::wstring const& key : file.enumerateKeys()) {
        KORU_CHECK(!key.empty());
        text += Koru::make_string(key) + "=" + Koru::make_string(file.getValue(key)) + "\n";
        file.removeKey(key);
    }
    KORU_CHECK(file.enumerateKeys().empty());
    return text;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    std::ofstream(fileName(), std::ios::binary | std::ios::trunc)
        .write(reinterpret_cast<char const*>(data), static_cast<std::streamsize>(size));
    PropertyFile file{File::Path(fileName())};
    file.open(File::READ);
    std::string const text = drain(file);
    file.close();

    file.open(File::READ | File::WRITE);
    // The first rewrite may change the list: an overlong blank or line feed becomes a plain one.
    file.synchronize();
    KORU_CHECK(bytesOnDisk() == text);
    file.synchronize();
    std::string const once = bytesOnDisk();
    file.synchronize();
    KORU_CHECK(bytesOnDisk() == once);
    KORU_CHECK(drain(file) == once);
    file.close();
    KORU_CHECK(bytesOnDisk().empty());
    return 0;
}
