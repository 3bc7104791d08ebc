// Loads a shared library and calls a function in it.
//
//     plugin LIBRARY FUNCTION
//
// The function takes no arguments and returns text. The system's loader searches for a library
// whose name has no slash; a name with one is a path, and a relative path counts from the working
// directory.
#include <koru/dynamiclibrary.h>
#include <koru/string.h>

#include <dlfcn.h>

#include <iostream>
#include <string>

int main(int argc, char** argv) {
    if (argc != 3) {
        std::cerr << "usage: plugin LIBRARY FUNCTION\n";
        return 2;
    }
    Koru::DynamicLibrary library(Koru::make_wstring(argv[1]));
    if (!library.load()) {
        char const* const reason = ::dlerror(); // Told once, right after a failed load.
        std::cerr << "plugin: " << (reason == nullptr ? "cannot load" : reason) << '\n';
        return 1;
    }
    void* const symbol = library.getSymbol(Koru::make_wstring(argv[2]));
    if (symbol == nullptr) {
        std::cerr << "plugin: no function " << argv[2] << '\n';
        return 1;
    }
    auto* const function = reinterpret_cast<char const* (*)()>(symbol);
    // The text is in the library, which stays loaded until this function ends.
    std::cout << function() << '\n';
    return 0;
}
