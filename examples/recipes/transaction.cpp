#include <koru/initializationfile.h>
#include <koru/string.h>

#include <iostream>
#include <stdexcept>

using Koru::File;

// Makes two changes that belong together. The destructor writes the file, after an exception too:
// without the mode it writes nothing, and the file stays as it was.
void change(File::Path const& path, bool fails) {
    Koru::InitializationFile settings(path);
    settings.open(File::READ | File::WRITE);
    try {
        settings.setValue(L"Server", L"host", L"example.org");
        if (fails) throw std::runtime_error("no port");
        settings.setValue(L"Server", L"port", L"8080");
        settings.close();
    } catch (...) {
        settings.setMode(0);
        throw;
    }
}

int main() {
    File::Path const path("server.ini");
    change(path, false);
    File::Path const other("other.ini");
    try {
        change(other, true);
    } catch (std::runtime_error const& e) {
        std::cout << e.what() << '\n';
    }
    Koru::InitializationFile settings(path);
    settings.open(File::READ);
    std::cout << Koru::make_string(settings.getValue(L"Server", L"port")).c_str() << '\n';
    Koru::InitializationFile untouched(other);
    untouched.open(File::READ);
    std::cout << untouched.enumerateSections().size() << " sections\n";
}
