#include <koru/file.h>

#include <cxxabi.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <locale>
#include <stdexcept>

#include <koru/string.h>

#include "file/fileguard.h"
#include "file/quiet.h"

namespace Koru {

// For callers who take their addresses; the values stand in the header.
unsigned long const File::READ;
unsigned long const File::WRITE;
unsigned long const File::BINARY;

namespace {

constexpr unsigned long WAIT_WITHOUT_LIMIT = 0xFFFFFFFFUL;

std::ios::openmode _openMode(unsigned long mode) {
    std::ios::openmode result{};
    if (mode & File::READ) result |= std::ios::in;
    if (mode & File::WRITE) result |= std::ios::out;
    if (mode & File::BINARY) result |= std::ios::binary;
    return result;
}

/// Opens the buffer and tells whether that went well. Where memory for it runs out the standard
/// library leaves the file open without a buffer; it is closed then.
bool _openBuffer(std::filebuf& buffer, std::string const& name, std::ios::openmode mode) {
    try {
        return buffer.open(name, mode) != nullptr;
    } catch (...) {
        buffer.close();
        throw;
    }
}

/// Runs a step and tells whether it went without an exception. The unwinding of a cancelled thread
/// is no failure and passes: to stop it would end the process. It carries no object, which the
/// sanitizer takes for a null reference.
template <class Step>
__attribute__((no_sanitize("undefined"))) bool _succeeds(Step step) {
    try {
        step();
        return true;
    } catch (abi::__forced_unwind const&) {
        throw;
    } catch (...) {
        return false;
    }
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
    if (!_openBuffer(*rdbuf(), name, openMode)) setstate(std::ios::failbit);
    if (!is_open() && (mode & WRITE) != 0) {
        // The stream's mode for update does not create a file; the one for truncation does.
        if (_openBuffer(*rdbuf(), name, openMode | std::ios::trunc))
            clear();
        else
            setstate(std::ios::failbit);
    }
    // Intended: a file that was open already stays open as it was, and takes the new mode.
    if (!is_open()) throw std::runtime_error("failed to open file.");
    mode_ = mode;
}

void File::close() {
    FileGuard const guard(*this);
    if (rdbuf()->close() == nullptr) setstate(std::ios::failbit);
    if (is_open()) throw std::runtime_error("failed to close file.");
    mode_ = 0;
}

void File::synchronize() {
    FileGuard const guard(*this);
    if (!is_open()) return;
    unsigned long const mode = mode_;
    close();
    open(mode);
}

unsigned long File::getMode() const { return mode_; }

void File::setMode(unsigned long mode) { mode_ = mode; }

bool File::lock() {
    return _succeeds([this] { lock_.lock(WAIT_WITHOUT_LIMIT); });
}

bool File::unlock() {
    return _succeeds([this] { lock_.unlock(); });
}

std::wstring File::getName() const { return name_; }

bool File::exists(std::wstring const& path) {
    return ::access(make_string(path).c_str(), F_OK) == 0;
}

// Intended, here and below: what the calls say is not asked; only what exists afterwards counts.
bool File::rename(std::wstring const& from, std::wstring const& to) {
    static_cast<void>(std::rename(make_string(from).c_str(), make_string(to).c_str()));
    return !exists(from) && exists(to);
}

bool File::remove(std::wstring const& path) {
    std::string const name = make_string(path);
    static_cast<void>(::chmod(name.c_str(), S_IRUSR | S_IWUSR));
    static_cast<void>(std::remove(name.c_str()));
    return !exists(path);
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
