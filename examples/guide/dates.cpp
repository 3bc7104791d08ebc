#include <koru/datetime.h>

#include <iostream>
#include <string>

using Koru::DateTime;

int main() {
    // From text and back. A date and a time are parts; one of them may be missing.
    DateTime const release("2026-11-22 14:30:05");
    std::cout << release << '\n';
    std::cout << DateTime("2026-11-22", DateTime::DATE) << '\n';

    // The fields can be read and changed.
    DateTime later = release;
    later.setHour(18);
    std::cout << later << ' ' << int{later.getDay()} << '.' << int{later.getMonth()} << ".\n";
    std::cout << std::boolalpha << (release < later) << '\n';

    // As seconds since 1970 and as text. Write the type: a string made with braces would be one
    // character, which the seconds convert to.
    std::cout << static_cast<long>(later) - static_cast<long>(release) << " seconds\n";
    std::string const text = static_cast<std::string>(release);
    std::cout << text.size() << " characters\n";
}
