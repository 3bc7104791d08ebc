#include <koru/dynamiclibrary.h>

#include <iostream>

int main() {
    Koru::DynamicLibrary mathematics(L"libm.so.6"); // searched for as the loader does it
    if (!mathematics.load()) return 1;
    auto const cube = reinterpret_cast<double (*)(double)>(mathematics.getSymbol(L"cbrt"));
    if (cube == nullptr) return 1;
    std::cout << cube(27) << '\n';
    std::cout << std::boolalpha << (mathematics.getSymbol(L"no_such_function") == nullptr) << '\n';
    // The function may be called until the last object that has loaded the library unloads it.
    mathematics.unload();
}
