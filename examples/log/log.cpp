// Appends a line with the local time to a log file:
//
//     log FILE TEXT...
//
// Any number of processes may write to one file at once; no line is lost or torn.
#include <koru/logfile.h>
#include <koru/string.h>

#include <ctime>
#include <exception>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <stdexcept>
#include <string>

namespace {

using Koru::File;
using Koru::LogFile;

/// The library resolves relative paths against the executable; a user of the command line means
/// the working directory.
File::Path pathOf(char const* argument) {
    return File::Path(std::filesystem::absolute(argument).string());
}

/// YYYY-MM-DD HH:MM:SS, local time.
std::string timeStamp() {
    std::time_t const now = std::time(nullptr);
    char text[32];
    std::size_t const size = std::strftime(text, sizeof text, "%F %T", std::localtime(&now));
    return std::string(text, size);
}

void append(LogFile& log, std::string const& line) {
    // Creates a missing file: the log itself might empty one that another process has just created.
    std::ofstream const created(Koru::make_string(log.getName()), std::ios::app);
    log.open(File::READ | File::WRITE); // WRITE alone would empty the file
    // One unformatted write, so that a line of any length goes to the system in one piece.
    log.write(line.data(), static_cast<std::streamsize>(line.size())).flush();
    if (!log) throw std::runtime_error("failed to write to file");
    log.close();
}

} // namespace

int main(int argc, char** argv) {
    if (argc < 3) {
        std::cerr << "usage: log FILE TEXT...\n";
        return 2;
    }
    try {
        LogFile log(pathOf(argv[1]));
        std::string line = timeStamp();
        for (int i = 2; i < argc; ++i) line += std::string(" ") + argv[i];
        append(log, line + '\n');
        return 0;
    } catch (std::exception const& e) {
        std::cerr << "log: " << e.what() << '\n';
        return 1;
    }
}
