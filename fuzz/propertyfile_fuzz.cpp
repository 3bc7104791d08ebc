// A property file of any bytes loads, and what a rewrite made of it stays the same in the next one.
#include <koru/propertyfile.h>
#include <koru/string.h>

#include <cstdint>
#include <string>
#include <vector>

#include "check.h"
#include "memoryfile.h"

namespace {

using Koru::File;
using Koru::PropertyFile;

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
    static fuzz::MemoryFile const memory;
    memory.write(data, size);
    PropertyFile file(memory.path());
    file.open(File::READ);
    std::string const text = drain(file);
    file.close();

    file.open(File::READ | File::WRITE);
    // The first rewrite may change the list: an overlong blank or line feed becomes a plain one.
    file.synchronize();
    KORU_CHECK(memory.bytes() == text);
    file.synchronize();
    std::string const once = memory.bytes();
    KORU_CHECK(drain(file) == once); // So the next rewrite would write the same.
    file.close();
    KORU_CHECK(memory.bytes().empty());
    return 0;
}
