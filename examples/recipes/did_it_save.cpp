#include <koru/initializationfile.h>

#include <iostream>
#include <stdexcept>

using Koru::File;

int main() {
    Koru::InitializationFile settings(File::Path("app.ini"));
    try {
        settings.open(File::READ | File::WRITE);
        settings.setValue(L"Window", L"width", L"1024");
        settings.close(); // throws where it cannot write; the destructor would say nothing
        // What only the system's own close finds, such as a full quota, is in the stream's state.
        std::cout << (settings.fail() ? "perhaps not saved" : "saved") << '\n';
    } catch (std::runtime_error const& e) {
        std::cout << "not saved: " << e.what() << '\n';
    }
}
