// Any calls on a sectioned settings file do what they do to the plain model of it.
#include <koru/initializationfile.h>

#include <cstdint>
#include <string>

#include "check.h"
#include "input.h"
#include "settingsplay.h"
#include "support/settingsmodel.h"

namespace {

using Koru::InitializationFile;
using Model = test::SettingsFileModel;

/// A name whose characters are 31 bits at most, as those from a file are. Beyond that they have no
/// consistent order, since the difference of two wraps, and then any order of the entries is right.
std::wstring nameOf(fuzz::Input& input) {
    std::wstring name = input.name();
    for (wchar_t& c : name) c &= 0x7FFFFFFF;
    return name;
}

void change(fuzz::Input& input, InitializationFile& file, Model& model) {
    unsigned const what = input.below(5);
    std::wstring const section = nameOf(input);
    std::wstring const key = nameOf(input);
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

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    fuzz::playSettings<InitializationFile, Model>(data, size, change);
    return 0;
}
