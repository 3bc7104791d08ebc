#include <koru/file.h>
#include <koru/string.h>

#include <iostream>

using Koru::make_string;

int main() {
    // An absolute path in its parts.
    Koru::File::Path path("/srv/reports/2026/march.txt");
    std::cout << make_string(path.getDirectory()).c_str() << '\n'
              << make_string(path.getName()).c_str() << '\n';

    // One part changes, the others stay.
    path.setName(L"april.txt");
    std::cout << make_string(path).c_str() << '\n';

    // A relative path starts at the folder of the executable, wherever the program was started.
    Koru::File::Path const beside("app.ini");
    std::cout << make_string(beside.getName()).c_str() << '\n';
    std::cout << std::boolalpha << (beside == Koru::File::Path("./APP.INI")) << '\n';
}
