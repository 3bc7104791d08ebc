#include <koru/file.h>

#include <iostream>
#include <string>

using Koru::File;

int main() {
    File::Path const path("notes.txt"); // beside the executable

    // A file is a stream of the standard library with a mode of its own.
    File file(path);
    file.open(File::READ | File::WRITE); // creates what is missing
    file << "first line\n" << 2 << " lines\n";
    file.seekg(0);
    for (std::string line; std::getline(file, line);) std::cout << line << '\n';
    file.close();

    // Whole files.
    File::Path const other("renamed.txt");
    std::cout << std::boolalpha << File::rename(path, other) << ' ' << File::exists(path) << ' '
              << File::exists(other) << ' ' << File::remove(other) << '\n';
}
