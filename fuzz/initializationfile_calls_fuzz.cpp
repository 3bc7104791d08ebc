// Any calls on a sectioned settings file do what they do to the plain model of it, from any bytes
// at the start to the bytes at the end.
#include <koru/initializationfile.h>

#include <cstdint>
#include <string>

#include "check.h"
#include "input.h"
#include "memoryfile.h"
#include "support/settingsmodel.h"

namespace {

using Koru::File;
using Koru::InitializationFile;
using Model = test::SettingsFileModel;

void change(fuzz::Input& input, InitializationFile& file, Model& model) {
    unsigned const what = input.below(5);
    std::wstring const section = input.name();
    std::wstring const key = input.name();
    std::wstring const value = input.text();
    switch (what) {
    case 0:
        file.createSection(section);
        model.createSection(section);
        break;
    case 1:
        file.removeSection(section);
        model.removeSection(section);
        break;
    case 2:
        file.createKey(section, key);
        model.createKey(section, key);
        break;
    case 3:
        file.removeKey(section, key);
        model.removeKey(section, key);
        break;
    default:
        file.setValue(section, key, value);
        model.setValue(section, key, value);
        break;
    }
    KORU_CHECK(file.getValue(section, key) == model.getValue(section, key));
    KORU_CHECK(file.enumerateKeys(section) == model.enumerateKeys(section));
    KORU_CHECK(file.enumerateSections() == model.enumerateSections());
}

void moveOn(fuzz::Input& input, InitializationFile& file, Model& model) {
    unsigned long const mode = 1 + input.below(3);
    switch (input.below(4)) {
    case 0:
        if (model.isOpen()) break;
        file.open(mode);
        model.open(mode);
        break;
    case 1:
        file.close();
        model.close();
        break;
    case 2:
        file.setMode(mode);
        model.setMode(mode);
        break;
    default:
        file.synchronize();
        model.synchronize();
        break;
    }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    static fuzz::MemoryFile const memory;
    fuzz::Input input(data, size);
    Model model;
    model.exists = true;
    for (unsigned pieces = input.below(8); pieces > 0; --pieces) model.bytes += input.bytes();
    memory.write(model.bytes);
    {
        InitializationFile file(memory.path());
        file.open(File::READ | File::WRITE);
        model.open(File::READ | File::WRITE);
        while (!input.isAtEnd()) {
            if (input.below(4) == 0)
                moveOn(input, file, model);
            else
                change(input, file, model);
            KORU_CHECK(file.is_open() == model.isOpen() && file.getMode() == model.getMode());
        }
        // The destructor closes the file, and writes one that is closed too if the mode says so.
        model.close();
    }
    KORU_CHECK(memory.bytes() == model.bytes);
    return 0;
}
