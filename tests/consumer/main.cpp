// An application that uses the library the way its own build found it: writes a setting, reads it
// back through a second object and fails when it differs. In C++11, the oldest version that
// is supported.
#include <iostream>
#include <string>

#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/string.h>

int main(int argc, char** argv) {
    if (argc != 2) {
        std::cerr << "usage: consumer FILE\n";
        return 2;
    }
    Koru::File::Path const path(argv[1]);
    std::wstring const written = L"K\u014dru";
    {
        Koru::InitializationFile file(path);
        file.open(Koru::File::READ | Koru::File::WRITE);
        file.setValue(L"library", L"name", written);
        file.close();
    }
    Koru::InitializationFile file(path);
    file.open(Koru::File::READ);
    std::wstring const found = file.getValue(L"Library", L"Name");
    std::cout << "name=" << Koru::make_string(found).c_str() << '\n';
    return found == written ? 0 : 1;
}
