// A settings file of any bytes loads, and what a rewrite made of it stays the same in the next one.
#include <koru/initializationfile.h>

#include <cstdint>
#include <string>
#include <vector>

#include "check.h"
#include "memoryfile.h"

namespace {

using Koru::File;
using Koru::InitializationFile;

std::vector<std::wstring> contentOf(InitializationFile& file) {
    std::vector<std::wstring> content;
    for (std::wstring const& section : file.enumerateSections()) {
        content.push_back(section);
        for (std::wstring const& key : file.enumerateKeys(section)) {
            content.push_back(key);
            content.push_back(file.getValue(section, key));
        }
    }
    return content;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    static fuzz::MemoryFile const memory;
    memory.write(data, size);
    InitializationFile file(memory.path());
    file.open(File::READ | File::WRITE);
    // The first rewrite may change the table: an overlong blank or line feed becomes a plain one.
    file.synchronize();
    std::vector<std::wstring> const once = contentOf(file);
    file.synchronize();
    std::vector<std::wstring> const twice = contentOf(file);
    // A name of brackets only grows by one each time.
    KORU_CHECK(twice.size() == once.size());
    for (std::size_t i = 0; i < once.size(); ++i) {
        KORU_CHECK(twice[i] == once[i] || twice[i] == L'[' + once[i]);
    }
    file.setMode(File::READ); // A third rewrite would only take time.
    file.close();
    return 0;
}
