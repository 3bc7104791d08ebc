#include <koru/file.h>

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <locale>
#include <stdexcept>

#include <koru/string.h>

#include "concurrency/cancellation.h"
#include "concurrency/timeout.h"
#include "file/fileguard.h"
#include "file/openbuffer.h"

namespace Koru {

// For callers who take their addresses; the values are in the header.
unsigned long const File::READ;
unsigned long const File::WRITE;
unsigned long const File::BINARY;

namespace {

std::ios::openmode _openMode(unsigned long mode) {
    std::ios::openmode result{};
    if (mode & File::READ) result |= std::ios::in;
    if (mode & File::WRITE) result |= std::ios::out;
    if (mode & File::BINARY) result |= std::ios::binary;
    return result;
}

} // namespace

File::File() : mode_(0) {}

File::File(std::wstring const& name) : name_(name), mode_(0) {}

File::~File() {
    quietly([this] {
        if (is_open()) File::close();
    });
}

void File::open(unsigned long mode) {
    FileGuard const guard(*this);
    std::string const name = make_string(name_);
    std::ios::openmode const openMode = _openMode(mode);
    errno = 0;
    bool const opened = openBuffer(*rdbuf(), name, openMode);
    // Only a missing file may be truncated: after any other failure, such as a lack of memory or
    // descriptors, a signal or a disk error, it may well exist.
    bool const missing = !is_open() && errno == ENOENT;
    if (!opened) setstate(std::ios::failbit);
    if (missing && (mode & WRITE) != 0) {
        // Opening for update does not create a file; opening with truncation does.
        if (openBuffer(*rdbuf(), name, openMode | std::ios::trunc))
            clear();
        else
            setstate(std::ios::failbit);
    }
    // Intended: a file that was open already stays open as it was, and takes the new mode.
    if (!is_open()) throw std::runtime_error("failed to open file.");
    mode_.store(mode, std::memory_order_relaxed);
}

void File::close() {
    FileGuard const guard(*this);
    if (rdbuf()->close() == nullptr) setstate(std::ios::failbit);
    if (is_open()) throw std::runtime_error("failed to close file.");
    mode_.store(0, std::memory_order_relaxed);
}

void File::synchronize() {
    FileGuard const guard(*this);
    if (!is_open()) return;
    unsigned long const mode = File::getMode();
    close();
    open(mode);
}

unsigned long File::getMode() const { return mode_.load(std::memory_order_relaxed); }

void File::setMode(unsigned long mode) { mode_.store(mode, std::memory_order_relaxed); }

bool File::lock() {
    return attempt(
        [this] {
            lock_.lock(WITHOUT_LIMIT);
            return true;
        },
        [] { return false; });
}

// Unlocking throws nothing.
bool File::unlock() {
    lock_.unlock();
    return true;
}

std::wstring File::getName() const { return name_; }

bool File::exists(std::wstring const& path) {
    return ::access(make_string(path).c_str(), F_OK) == 0;
}

// Intended, here and below: the results of the calls are ignored; what exists afterwards counts.
bool File::rename(std::wstring const& from, std::wstring const& to) {
    static_cast<void>(std::rename(make_string(from).c_str(), make_string(to).c_str()));
    return !exists(from) && exists(to);
}

bool File::remove(std::wstring const& path) {
    std::string const name = make_string(path);
    static_cast<void>(::chmod(name.c_str(), S_IRUSR | S_IWUSR));
    // Only a failure leaves open whether the file still exists.
    return std::remove(name.c_str()) == 0 || !exists(path);
}

bool File::copy(std::wstring const& from, std::wstring const& to) {
    std::ifstream const source(make_string(from));
    std::ofstream target(make_string(to));
    target.imbue(std::locale::classic());
    // Intended: what is written is the source's truth value as a pointer, never its content.
    std::ios const* const marker = source.fail() ? nullptr : &source;
    target << static_cast<void const*>(marker);
    target.close();
    return exists(from) && exists(to);
}

bool File::create(std::wstring const& path) {
    std::ofstream(make_string(path)).close();
    return exists(path);
}

} // namespace Koru
