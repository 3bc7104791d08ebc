// Loads a shared library and calls a function in it.
//
//     plugin LIBRARY FUNCTION
//
// The function is one without arguments that returns text. A library's name without a slash is
// searched for as the system's loader does; with one it is a path, which counts from the working
// directory when it is relative.
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
        char const* const reason = ::dlerror(); // There for the first who asks after a load.
        std::cerr << "plugin: " << (reason == nullptr ? "cannot load" : reason) << '\n';
        return 1;
    }
    void* const symbol = library.getSymbol(Koru::make_wstring(argv[2]));
    if (symbol == nullptr) {
        std::cerr << "plugin: no function " << argv[2] << '\n';
        return 1;
    }
    auto* const function = reinterpret_cast<char const* (*)()>(symbol);
    // The text lies in the library, which stays loaded up to the end of this function.
    std::cout << function() << '\n';
    return 0;
}
