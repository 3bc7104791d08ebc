#include <koru/file.h>
#include <koru/string.h>

#include <iostream>
#include <sstream>
#include <string>

int main() {
    // The narrow inserter of the library counts with 8 bits. Every file object of the library
    // takes it once <koru/string.h> is included.
    std::string const text(200, 'x');
    std::ostringstream lost;
    Koru::operator<<(lost, text);
    std::cout << lost.str().size() << '\n';

    // These write all of it, on every stream.
    std::ostringstream whole;
    whole.write(text.data(), static_cast<std::streamsize>(text.size()));
    whole << text.c_str();
    std::cout << whole.str().size() << '\n';
}
