// Changes one setting so that the file is never lost, neither to a crash nor to a full disk.
//
//     safesave FILE SECTION KEY VALUE
//
// A settings file is deleted before it is written again. So the change is made to a copy, FILE.new,
// which takes the place of FILE in one step when it is complete. Whenever the program is stopped,
// FILE is the old one or the new one; a FILE.new that is left is replaced by the next change.
// Two programs that change one file at the same time need a lock of their own.
#include <koru/initializationfile.h>
#include <koru/string.h>

#include <fcntl.h>
#include <unistd.h>

#include <exception>
#include <filesystem>
#include <iostream>
#include <stdexcept>
#include <string>

namespace {

namespace fs = std::filesystem;
using Koru::File;
using Koru::InitializationFile;
using Koru::make_wstring;

void check(bool condition, char const* complaint) {
    if (!condition) throw std::runtime_error(complaint);
}

/// Makes the change in a file that nobody else needs, and sees that it arrived on the disk.
void change(fs::path const& file, char** words) {
    InitializationFile settings(File::Path(file.string()));
    settings.open(File::READ | File::WRITE);
    settings.setValue(make_wstring(words[0]), make_wstring(words[1]), make_wstring(words[2]));
    settings.close();
    // What only the system's close finds, a full quota for example, is told by the stream alone.
    check(!settings.fail(), "failed to close the new file");
    // Against power failures: a rename may reach the disk before what was written.
    int const descriptor = ::open(file.c_str(), O_RDONLY | O_CLOEXEC);
    bool const isOnDisk = descriptor >= 0 && ::fsync(descriptor) == 0;
    ::close(descriptor);
    check(isOnDisk, "failed to bring the new file to the disk");
}

void save(fs::path const& file, char** words) {
    fs::path const fresh = file.string() + ".new";
    fs::remove(fresh);
    bool const isThere = fs::exists(file); // If not, the copy begins empty.
    if (isThere) fs::copy_file(file, fresh);
    change(fresh, words);
    // The change made a new file of the copy, with permissions of its own.
    if (isThere) fs::permissions(fresh, fs::status(file).permissions());
    check(File::rename(fresh.wstring(), file.wstring()), "failed to rename the new file");
}

} // namespace

int main(int argc, char** argv) {
    if (argc != 5) {
        std::cerr << "usage: safesave FILE SECTION KEY VALUE\n";
        return 2;
    }
    try {
        save(fs::absolute(argv[1]), argv + 2);
        return 0;
    } catch (std::exception const& e) {
        std::cerr << "safesave: " << e.what() << '\n';
        return 1;
    }
}
