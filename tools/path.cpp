// What a path is for the library.
#include <koru/file.h>
#include <koru/string.h>

#include <unistd.h>

#include <stdexcept>

#include "commands.h"
#include "text.h"

namespace tool {

namespace {

/// Starts this program again under the name of the other one: that decides where the library looks
/// for relative paths.
void _restartAs(std::string program, Arguments const& arguments) {
    if (::access(program.c_str(), F_OK) != 0) failBySystem("cannot find " + program);
    std::string command = "path";
    std::string end = "--";
    std::string text = arguments.file;
    char* words[] = {&program[0], &command[0], &end[0], &text[0], nullptr};
    ::execv("/proc/self/exe", words);
    failBySystem("cannot start again");
}

Koru::File::Path _parse(std::string const& text) {
    try {
        return {wide(text)};
    } catch (std::invalid_argument const& e) {
        throw Failure(NOT_FOUND, e.what());
    }
}

} // namespace

void path(Arguments const& arguments) {
    if (!arguments.program.empty()) _restartAs(arguments.program, arguments);
    print(narrow(_parse(arguments.file)) + "\n");
}

} // namespace tool
