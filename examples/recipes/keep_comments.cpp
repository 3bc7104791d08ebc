#include <koru/initializationfile.h>
#include <koru/string.h>

#include <fstream>
#include <iostream>
#include <string>

using Koru::File;

// Saving loses comments. So users write to one file, which the program only reads, and the program
// saves to another; the user's settings win.
std::wstring get(std::wstring const& section, std::wstring const& key) {
    for (char const* name : {"user.ini", "program.ini"}) {
        File::Path const path(name);
        if (!File::exists(path)) continue;
        Koru::InitializationFile settings(path);
        settings.open(File::READ); // never written without WRITE
        std::wstring const value = settings.getValue(section, key);
        if (!value.empty()) return value;
    }
    return L"";
}

int main() {
    std::ofstream("user.ini") << "# my own\n[Window]\nwidth=800\n";
    {
        Koru::InitializationFile own(File::Path("program.ini"));
        own.open(File::READ | File::WRITE);
        own.setValue(L"Window", L"width", L"1024");
        own.setValue(L"Window", L"height", L"768");
        own.close();
    }
    std::cout << Koru::make_string(get(L"Window", L"width")).c_str() << " x "
              << Koru::make_string(get(L"Window", L"height")).c_str() << '\n';
    std::ifstream user("user.ini");
    std::string line;
    std::getline(user, line);
    std::cout << line << '\n';
}
