#include <koru/initializationfile.h>
#include <koru/string.h>

#include <cstdlib>
#include <iostream>
#include <string>

using Koru::File;
using Settings = Koru::InitializationFile;

// A value as it is, or the default where the key is missing or empty.
std::wstring text(Settings& settings, std::wstring const& section, std::wstring const& key,
                  std::wstring const& otherwise) {
    std::wstring const value = settings.getValue(section, key);
    return value.empty() ? otherwise : value;
}

long number(Settings& settings, std::wstring const& section, std::wstring const& key,
            long otherwise) {
    std::string const value = Koru::make_string(settings.getValue(section, key));
    char* end = nullptr;
    long const result = std::strtol(value.c_str(), &end, 10);
    return end == value.c_str() || *end != '\0' ? otherwise : result;
}

bool flag(Settings& settings, std::wstring const& section, std::wstring const& key,
          bool otherwise) {
    std::wstring const value = settings.getValue(section, key);
    for (wchar_t const* yes : {L"1", L"yes", L"true", L"on"}) {
        if (Koru::compare(value, std::wstring(yes)) == 0) return true;
    }
    return value.empty() ? otherwise : false;
}

int main() {
    Settings settings(File::Path("app.ini"));
    settings.open(File::READ | File::WRITE);
    settings.setValue(L"Window", L"width", L"1024");
    settings.setValue(L"Window", L"height", L"tall");
    settings.setValue(L"Window", L"maximised", L"Yes");
    std::cout << number(settings, L"Window", L"width", 800) << ' '
              << number(settings, L"Window", L"height", 600) << ' '
              << flag(settings, L"Window", L"maximised", false) << ' '
              << flag(settings, L"Window", L"framed", true) << ' '
              << Koru::make_string(text(settings, L"Window", L"title", L"untitled")).c_str()
              << '\n';
}
