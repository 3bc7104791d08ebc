#include <koru/file.h>
#include <koru/string.h>

#include <iostream>

using Koru::File;

int main() {
    // Names are wide in the program and UTF-8 on the disk, in every locale.
    File::Path const path(L"\u017Eurnal \u65E5\u8A18.txt");
    File file(path);
    file.open(File::WRITE);
    file.close();
    std::cout << std::boolalpha << File::exists(path) << ' ' << path.getName().size() << ' '
              << Koru::make_string(path.getName()).size() << '\n';
    std::cout << Koru::make_string(path.getName()).c_str() << '\n';
    File::remove(path);
}
