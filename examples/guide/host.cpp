#include <koru/file.h>
#include <koru/string.h>
#include <koru/system.h>

#include <iostream>

using Koru::System;

int main() {
    Koru::File::Path const program(System::getProcessFileName());
    std::cout << Koru::make_string(program.getName()).c_str() << '\n';
    std::cout << std::boolalpha << System::existsFile(program) << '\n';
    std::cout << !System::getName().empty() << '\n'; // the host's own name for itself
}
