#include <koru/initializationfile.h>
#include <koru/string.h>

#include <iostream>
#include <string>

using Koru::File;
using Koru::make_string;

int main() {
    Koru::InitializationFile settings(File::Path("app.ini"));
    settings.open(File::READ | File::WRITE); // reads all of it; an empty one if it is missing
    settings.setValue(L"Window", L"width", L"1024");
    settings.setValue(L"Window", L"title", L"Übersicht");
    settings.setValue(L"Network", L"proxy", L"");
    settings.close(); // writes all of it, sorted

    settings.open(File::READ);
    for (std::wstring const& section : settings.enumerateSections()) {
        std::cout << '[' << make_string(section).c_str() << "]\n";
        for (std::wstring const& key : settings.enumerateKeys(section)) {
            std::wstring const value = settings.getValue(section, key);
            std::cout << make_string(key).c_str() << '=' << make_string(value).c_str() << '\n';
        }
    }
    // Names match whatever their case; what is missing is empty.
    std::cout << make_string(settings.getValue(L"WINDOW", L"Width")).c_str() << '\n';
    std::cout << settings.getValue(L"Window", L"height").empty() << '\n';
}
