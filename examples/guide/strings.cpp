#include <koru/string.h>

#include <iostream>
#include <string>

int main() {
    // The library's text is wide; make_string and make_wstring convert from and to UTF-8.
    std::wstring const greeting = Koru::make_wstring("Grüße");
    std::cout << greeting.size() << " characters, " << Koru::make_string(greeting).size()
              << " bytes\n";

    // Comparison ignores case. The result is negative, zero or positive, as that of strcmp.
    std::cout << std::boolalpha << (Koru::compare("Title", "TITLE") == 0) << '\n';
    std::cout << (Koru::compare(L"apple", L"Banana") < 0) << '\n';

    // A null pointer is an empty text.
    char const* const nothing = nullptr;
    std::cout << Koru::length(nothing) << ' ' << Koru::make_wstring(nothing).size() << '\n';
}
