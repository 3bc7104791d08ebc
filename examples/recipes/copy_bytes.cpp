#include <koru/file.h>

#include <fstream>
#include <iostream>

using Koru::File;

// File::copy copies no content; it writes the text of a pointer to the target. This copies the bytes.
bool copyBytes(File::Path const& from, File::Path const& to) {
    File source(from);
    File target(to);
    source.open(File::READ);
    target.open(File::WRITE);
    if (source.peek() != std::char_traits<char>::eof()) target << source.rdbuf();
    target.flush();
    return target.good() && !source.bad();
}

int main() {
    std::ofstream("from.txt") << "a few bytes\n";
    File::Path const to("to.txt");
    std::cout << std::boolalpha << copyBytes(File::Path("from.txt"), to) << '\n';
    std::ifstream copied("to.txt");
    std::cout << copied.rdbuf();
}
