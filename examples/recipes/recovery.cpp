#include <koru/initializationfile.h>

#include <cerrno>
#include <cstring>
#include <iostream>
#include <stdexcept>

using Koru::File;

int main() {
    Koru::InitializationFile settings(File::Path("missing/app.ini"));
    try {
        settings.open(File::READ);
    } catch (std::runtime_error const& e) {
        // errno still has the reason of the system call that failed.
        std::cout << e.what() << ' ' << std::strerror(errno) << '\n';
    }
    // The object is closed and as usable as before: go on with defaults, or open again. A failed
    // "failed to read from file" is another matter: there the file is open and the table partial,
    // so call setMode(0) before you close it.
    std::cout << std::boolalpha << settings.is_open() << ' ' << settings.getMode() << '\n';
}
