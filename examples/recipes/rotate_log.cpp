#include <koru/logfile.h>

#include <iostream>

using Koru::File;

// Begins a new log when this one has reached a size. One program may do so; with several, the
// others go on writing to the renamed file until they open the log again.
void rotate(Koru::LogFile& log, File::Path const& path, std::streamoff limit) {
    if (log.tellp() < limit) return;
    File::Path old(path);
    old.setName(path.getName() + L".old");
    log.close();
    File::rename(path, old); // replaces an older one
    log.open(File::WRITE);
}

int main() {
    File::Path const path("program.log");
    Koru::LogFile log(path);
    log.open(File::WRITE);
    for (int i = 0; i < 10; ++i) {
        log << "line " << i << '\n' << std::flush;
        rotate(log, path, 50);
    }
    File::Path const old("program.log.old");
    std::cout << std::boolalpha << File::exists(old) << ' ' << log.tellp() << '\n';
}
