#include <koru/datetime.h>
#include <koru/logfile.h>

#include <ctime>
#include <fstream>
#include <iostream>
#include <string>

int main() {
    Koru::LogFile log(Koru::File::Path("program.log"));
    log.open(Koru::File::WRITE); // appends; creates the file if it is missing
    // Other programs may write to the same log: one write and one flush keep a line whole.
    log << "started\n" << std::flush;
    log << Koru::DateTime(static_cast<long>(0)) << " was the beginning\n" << std::flush;
    log.close();

    std::ifstream written("program.log");
    for (std::string line; std::getline(written, line);) std::cout << line << '\n';
}
