// Any calls on files and on one of them as a stream do what they do to a plain map of names and
// contents.
#include <koru/file.h>
#include <stdlib.h>
#include <unistd.h>

#include <cstdint>
#include <iterator>
#include <map>
#include <stdexcept>
#include <string>

#include "check.h"
#include "input.h"

namespace {

using Koru::File;
using Disk = std::map<std::wstring, std::string>;

std::wstring const names[] = {L"a", L"b", L"\u00E9 c"};

std::string makeFolder() {
    for (std::string pattern : {"/dev/shm/koru-fuzz-XXXXXX", "/tmp/koru-fuzz-XXXXXX"}) {
        if (::mkdtemp(&pattern[0]) != nullptr) return pattern;
    }
    return "";
}

/// A folder in memory where there is one, removed in the end.
std::wstring const& folder() {
    static std::wstring const path = [] {
        static std::string const made = makeFolder();
        KORU_CHECK(!made.empty());
        std::atexit([] {
            for (std::wstring const& name : names) File::remove(folder() + name);
            ::rmdir(made.c_str());
        });
        return std::wstring(made.begin(), made.end()) + L"/";
    }();
    return path;
}

bool isThere(Disk const& disk, std::wstring const& name) { return disk.count(name) == 1; }

std::string contentOf(std::wstring const& name) {
    File file(folder() + name);
    file.open(File::READ);
    return {std::istreambuf_iterator<char>(file), {}};
}

/// What a copy leaves is not content, but where a pointer was.
bool isPointerText(std::string const& text) {
    return !text.empty() && text.find_first_not_of("0123456789abcdefx") == std::string::npos;
}

void callStatic(fuzz::Input& input, Disk& disk) {
    unsigned const what = input.below(5);
    std::wstring const name = names[input.below(3)];
    std::wstring const to = names[input.below(3)];
    switch (what) {
    case 0:
        KORU_CHECK(File::exists(folder() + name) == isThere(disk, name));
        break;
    case 1:
        KORU_CHECK(File::remove(folder() + name));
        disk.erase(name);
        break;
    case 2:
        KORU_CHECK(File::create(folder() + name));
        disk[name] = "";
        break;
    case 3: {
        bool const isMoved = name != to && isThere(disk, name);
        bool const expected = name != to && (isMoved || isThere(disk, to));
        KORU_CHECK(File::rename(folder() + name, folder() + to) == expected);
        if (!isMoved) break;
        disk[to] = disk[name];
        disk.erase(name);
        break;
    }
    default:
        KORU_CHECK(File::copy(folder() + name, folder() + to) ==
                   (isThere(disk, name) || name == to));
        disk[to] = contentOf(to);
        KORU_CHECK(isPointerText(disk[to]));
    }
}

/// Opens a file, writes or reads, and closes it or lets the destructor do that.
void useStream(fuzz::Input& input, Disk& disk) {
    std::wstring const name = names[input.below(3)];
    unsigned long const mode = input.below(4);
    bool const reads = (mode & File::READ) != 0;
    bool const writes = (mode & File::WRITE) != 0;
    File file(folder() + name);
    try {
        file.open(mode);
        KORU_CHECK(writes || (reads && isThere(disk, name)));
    } catch (std::runtime_error const& e) {
        KORU_CHECK(!writes && !(reads && isThere(disk, name)));
        KORU_CHECK(e.what() == std::string("failed to open file."));
        return;
    }
    KORU_CHECK(file.getMode() == mode && file.is_open());
    std::string& content = disk[name];
    if (!reads) content.clear();
    std::string const text = input.bytes();
    if (writes) {
        file.write(text.data(), static_cast<std::streamsize>(text.size()));
        content.replace(0, text.size(), text);
    } else {
        KORU_CHECK(std::string(std::istreambuf_iterator<char>(file), {}) == content);
    }
    if (input.below(2) == 0) {
        file.synchronize();
        // Opened to be written alone, it is emptied.
        if (!reads) content.clear();
    }
    if (input.below(2) == 0) file.close();
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    fuzz::Input input(data, size);
    for (std::wstring const& name : names) File::remove(folder() + name);
    Disk disk;
    while (!input.isAtEnd()) {
        if (input.below(2) == 0)
            callStatic(input, disk);
        else
            useStream(input, disk);
    }
    for (std::wstring const& name : names) {
        KORU_CHECK(File::exists(folder() + name) == isThere(disk, name));
        if (isThere(disk, name)) KORU_CHECK(contentOf(name) == disk[name]);
    }
    return 0;
}
