#include <koru/logfile.h>

#include <iostream>
#include <stdexcept>
#include <string>

#include <koru/string.h>

#include "file/openbuffer.h"

namespace Koru {

// For callers who take its address; the value is in the header.
unsigned int const LogFile::MAX_LINE_LENGTH;

namespace {

/// Writes one line to standard output. Not with `<<`: in this namespace that counts with 8 bits.
void _report(std::string const& name) {
    std::string const line = "File::open() failed to open " + name;
    std::cout.write(line.data(), static_cast<std::streamsize>(line.size())) << std::endl;
}

} // namespace

LogFile::LogFile() = default;

LogFile::LogFile(File::Path const& path) : File(static_cast<std::wstring>(path)) {}

LogFile::~LogFile() = default;

void LogFile::open(unsigned int mode) {
    // This creates or empties the file, as the mode says, and checks that it can be opened.
    File::open(mode);
    File::close();
    std::string const name = make_string(getName());
    // Intended: the mode stays 0, and without WRITE the file is not opened again.
    std::ios::openmode const append =
        (mode & WRITE) != 0 ? std::ios::out | std::ios::app : std::ios::openmode{};
    if (openBuffer(*rdbuf(), name, append)) return;
    setstate(std::ios::failbit);
    _report(name);
    throw std::runtime_error("failed to open file.");
}

} // namespace Koru
