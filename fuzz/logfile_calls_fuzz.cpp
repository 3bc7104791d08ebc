// Any calls on a log leave the bytes in the file that a plain string would hold: what was there
// stays unless the mode is to write alone, and all output goes to the end.
#include <koru/logfile.h>

#include <cstdint>
#include <cstdio>
#include <stdexcept>
#include <string>

#include "check.h"
#include "input.h"
#include "memoryfile.h"

namespace {

using Koru::File;
using Koru::LogFile;

/// An open log knows no mode, whatever it was opened with.
void checkOpen(LogFile& log, unsigned mode, bool& isOpen, std::string& content) {
    bool const wasOpen = isOpen;
    bool opened = true;
    try {
        log.open(mode);
    } catch (std::runtime_error const& e) {
        KORU_CHECK(e.what() == std::string("failed to open file."));
        opened = false;
    }
    // The first of its two opens finds an open file open and closes it.
    bool const writes = (mode & File::WRITE) != 0;
    KORU_CHECK(opened == writes);
    if (writes && (mode & File::READ) == 0 && !wasOpen) content.clear();
    isOpen = opened;
    log.clear();
}

void callOne(fuzz::Input& input, LogFile& log, bool& isOpen, std::string& content) {
    switch (input.below(6)) {
    case 0:
        return checkOpen(log, input.below(4), isOpen, content);
    case 1:
        log.close();
        log.clear();
        isOpen = false;
        return;
    case 2:
        // It is opened again with the mode, which is 0.
        try {
            log.synchronize();
            KORU_CHECK(!isOpen);
        } catch (std::runtime_error const& e) {
            KORU_CHECK(isOpen && e.what() == std::string("failed to open file."));
        }
        log.clear();
        isOpen = false;
        return;
    case 3:
        log.flush();
        return;
    default:
        break;
    }
    std::string const text = input.bytes();
    log.write(text.data(), static_cast<std::streamsize>(text.size()));
    KORU_CHECK(log.good() == (isOpen || text.empty()));
    log.clear();
    if (isOpen) content += text;
}

} // namespace

// A log that cannot be opened says so on the standard output.
extern "C" int LLVMFuzzerInitialize(int*, char***) {
    KORU_CHECK(std::freopen("/dev/null", "w", stdout) != nullptr);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(std::uint8_t const* data, std::size_t size) {
    static fuzz::MemoryFile const memory;
    fuzz::Input input(data, size);
    std::string content = input.bytes();
    memory.write(content);
    {
        LogFile log(memory.path());
        bool isOpen = false;
        while (!input.isAtEnd()) {
            callOne(input, log, isOpen, content);
            KORU_CHECK(log.is_open() == isOpen && log.getMode() == 0);
        }
    }
    KORU_CHECK(memory.bytes() == content);
    return 0;
}
