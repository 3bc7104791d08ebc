// Lists, gets and sets values in a settings file with sections.
//
//     settings FILE list
//     settings FILE get SECTION KEY
//     settings FILE set SECTION KEY VALUE
//
// Text on the command line and on the terminal is UTF-8. Setting a value rewrites the whole file:
// comments, blank lines and the order of its lines are lost.
#include <koru/initializationfile.h>
#include <koru/string.h>

#include <exception>
#include <filesystem>
#include <iostream>
#include <string>

namespace {

using Koru::File;
using Koru::InitializationFile;
using Koru::make_string;
using Koru::make_wstring;

/// The library resolves relative paths against the executable; a user of the command line means
/// the working directory.
File::Path pathOf(char const* argument) {
    return File::Path(std::filesystem::absolute(argument).string());
}

int list(InitializationFile& settings) {
    settings.open(File::READ);
    for (std::wstring const& section : settings.enumerateSections()) {
        std::cout << '[' << make_string(section) << "]\n";
        for (std::wstring const& key : settings.enumerateKeys(section)) {
            std::cout << make_string(key) << '=' << make_string(settings.getValue(section, key))
                      << '\n';
        }
    }
    settings.close();
    return 0;
}

int get(InitializationFile& settings, char** names) {
    settings.open(File::READ);
    std::cout << make_string(settings.getValue(make_wstring(names[0]), make_wstring(names[1])))
              << '\n';
    settings.close();
    return 0;
}

int set(InitializationFile& settings, char** words) {
    settings.open(File::READ | File::WRITE);
    settings.setValue(make_wstring(words[0]), make_wstring(words[1]), make_wstring(words[2]));
    settings.close(); // Writes the file. The destructor would too, but could not report a failure.
    return 0;
}

int usage() {
    std::cerr << "usage: settings FILE list\n"
                 "       settings FILE get SECTION KEY\n"
                 "       settings FILE set SECTION KEY VALUE\n";
    return 2;
}

int run(int argc, char** argv) {
    std::string const command = argc > 2 ? argv[2] : "";
    bool const known = (command == "list" && argc == 3) || (command == "get" && argc == 5) ||
                       (command == "set" && argc == 6);
    if (!known) return usage();
    InitializationFile settings(pathOf(argv[1]));
    if (command == "list") return list(settings);
    if (command == "get") return get(settings, argv + 3);
    return set(settings, argv + 3);
}

} // namespace

int main(int argc, char** argv) {
    try {
        return run(argc, argv);
    } catch (std::exception const& e) {
        std::cerr << "settings: " << e.what() << '\n';
        return 1;
    }
}
