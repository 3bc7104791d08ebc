#include <koru/propertyfile.h>
#include <koru/string.h>

#include <iostream>
#include <string>

using Koru::File;
using Koru::make_string;

int main() {
    // Lines of key=value without sections. They keep their order.
    Koru::PropertyFile properties(File::Path("app.properties"));
    properties.open(File::READ | File::WRITE);
    properties.setValue(L"language", L"sr");
    properties.setValue(L"country", L"RS");
    properties.setValue(L"LANGUAGE", L"de"); // the same key, whatever its case
    properties.removeKey(L"country");
    properties.setValue(L"currency", L"€");
    properties.close();

    properties.open(File::READ);
    for (std::wstring const& key : properties.enumerateKeys()) {
        std::cout << make_string(key).c_str() << " is "
                  << make_string(properties.getValue(key)).c_str() << '\n';
    }
}
