// Any calls on a flat settings file do what they do to the plain model of it.
#include <koru/propertyfile.h>

#include <cstdint>
#include <string>
#include <vector>

#include "check.h"
#include "input.h"
#include "settingsplay.h"
#include "support/propertymodel.h"

namespace {

using Koru::PropertyFile;
using Model = test::PropertyFileModel;

void change(fuzz::Input& input, PropertyFile& file, Model& model) {
    unsigned const what = input.below(3);
    std::wstring const key = input.name();
    std::wstring const value = input.text();
    switch (what) {
    case 0:
        file.createKey(key);
        model.createKey(key);
        break;
    case 1:
        file.removeKey(key);
        model.removeKey(key);
        break;
    default:
        file.setValue(key, value);
        model.setValue(key, value);
        break;
    }
    KORU_CHECK(file.getValue(key) == model.getValue(key));
    std::vector<std::wstring> keys;
    for (test::Property const& entry : model.list) keys.push_back(entry.key);
    KORU_CHECK(file.enumerateKeys() == keys);
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    fuzz::playSettings<PropertyFile, Model>(data, size, change);
    return 0;
}
