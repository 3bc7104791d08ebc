#include <koru/file.h>

#include <stdlib.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstring>
#include <new>
#include <stdexcept>

#include <koru/string.h>
#include <koru/system.h>

#include "text/convert.h"

namespace Koru {

// Initialised at compile time, so they have their values before any constructor runs.
wchar_t const _FSLASH = L'/';
wchar_t const _BSLASH = L'\\';
wchar_t const _COLON = L':';

namespace {

constexpr int MOST_LINKS = 40; // in one path, as many as the system follows

/// The resolved path, or the path itself if it cannot be resolved.
std::string _resolve(std::string const& path) {
    char buffer[PATH_MAX];
    return ::realpath(path.c_str(), buffer) == nullptr ? path : std::string(buffer);
}

/// The text of a link; an empty string if it is not a link.
std::string _targetOf(std::string const& link) {
    char buffer[PATH_MAX];
    ssize_t const size = ::readlink(link.c_str(), buffer, sizeof buffer);
    return size <= 0 ? std::string() : std::string(buffer, static_cast<std::size_t>(size));
}

/// The length of the longest existing part of the path that ends before a slash. Looks up each
/// component once, up to the first that is missing.
std::size_t _existingLength(std::string const& path) {
    std::size_t existing = 0;
    for (;;) {
        std::size_t const slash = path.find('/', existing + 1);
        if (slash == std::string::npos) return existing;
        if (::access(path.substr(0, slash).c_str(), F_OK) != 0) return existing;
        existing = slash;
    }
}

/// The path, joined to the directory if it is relative.
std::string _below(std::string const& directory, std::string const& path) {
    return path[0] == '/' ? path : directory + '/' + path;
}

/// Resolves the part of the path that exists and appends the rest as it is. If the first missing
/// component is a link, its text takes its place; `links` limits how often that happens.
std::string _resolveExisting(std::string path, int links) {
    for (;; --links) {
        std::size_t const existing = _existingLength(path);
        std::size_t const end = std::min(path.find('/', existing + 1), path.size());
        std::string const base = _resolve(path.substr(0, existing));
        std::string const target = links == 0 ? std::string() : _targetOf(path.substr(0, end));
        if (target.empty()) return base + path.substr(existing);
        path.replace(0, end, _below(base, target));
    }
}

/// Resolves an absolute path whose end may be missing: a file that is to be written often does not
/// exist yet.
std::string _resolveMissing(std::string const& path) {
    char buffer[PATH_MAX] = {};
    if (::realpath(path.c_str(), buffer) != nullptr) return buffer;
    // Links that lead back to themselves are not followed.
    int const links = errno == ELOOP ? 0 : MOST_LINKS;
    // The C library leaves in the buffer how far it got before something was missing. If the path
    // begins with just that, there is nothing to resolve in it.
    std::size_t const size = std::strlen(buffer);
    bool const isBeginning = size != 0 && path.compare(0, size, buffer) == 0 &&
                             (path.size() == size || path[size] == '/');
    return isBeginning ? path : _resolveExisting(path, links);
}

std::string _workingDirectory() {
    std::string directory = _resolve(".");
    if (directory[0] != '/') throw std::invalid_argument("cannot determine path");
    return directory;
}

std::wstring _relativeToExecutable(std::wstring const& text) {
    std::wstring directory = System::getProcessFileName();
    directory.resize(directory.rfind(_FSLASH) + 1); // empty if there is no slash
    std::string path = make_string(directory) + make_string(text);
    if (path[0] != '/') path = _below(_workingDirectory(), path);
    return make_wstring(_resolveMissing(path));
}

bool _isSeparator(wchar_t c) { return c == _FSLASH || c == _BSLASH; }

/// The directory part of a path, which ends after its last separator: a forward slash at its start
/// and one after each segment. Writes into a string of the full size, since appending character by
/// character takes longer.
std::wstring _directory(wchar_t const* part, wchar_t const* end) {
    std::wstring directory(static_cast<std::size_t>(end - part) + 1, _FSLASH);
    wchar_t* last = &directory[0];
    for (; part != end; ++part) {
        if (!_isSeparator(*part))
            *++last = *part;
        else if (*last != _FSLASH)
            *++last = _FSLASH;
    }
    directory.resize(static_cast<std::size_t>(last - directory.data()) + 1);
    return directory;
}

} // namespace

File::Path::Path() = default;

File::Path::Path(std::wstring const& text) {
    std::size_t const size = length(text);
    if (size == 0) throw std::invalid_argument("null or empty string passed as file path");
    std::wstring resolved;
    wchar_t const* path = text.data();
    wchar_t const* end = path + size;
    // Intended: backslashes do not count as slashes yet, so a path that begins with one is
    // relative. An absolute path is not resolved.
    if (*path != _FSLASH) {
        resolved = _relativeToExecutable(text);
        path = resolved.data();
        end = path + resolved.size();
    }
    wchar_t const* name = end;
    while (!_isSeparator(name[-1])) --name; // The first character is a separator.
    directory_ = _directory(path, name);
    // Intended: a file directly below the root cannot be represented.
    if (directory_.size() == 1) throw std::invalid_argument("cannot determine path");
    name_ = wideString(name, static_cast<std::size_t>(end - name));
}

File::Path::Path(wchar_t const* text) : Path(make_wstring(text)) {}

File::Path::Path(std::string const& text) : Path(make_wstring(text)) {}

File::Path::Path(char const* text) : Path(make_wstring(text)) {}

File::Path::Path(Path const& other) = default;

// All or nothing: the copy takes its memory before this path changes.
File::Path& File::Path::operator=(Path const& other) {
    Path copy(other);
    volume_.swap(copy.volume_);
    directory_.swap(copy.directory_);
    name_.swap(copy.name_);
    return *this;
}

File::Path::~Path() = default;

std::wstring const& File::Path::getVolume() const { return volume_; }

void File::Path::setVolume(std::wstring const& volume) { volume_ = volume; }

std::wstring const& File::Path::getDirectory() const { return directory_; }

void File::Path::setDirectory(std::wstring const& directory) { directory_ = directory; }

std::wstring const& File::Path::getName() const { return name_; }

void File::Path::setName(std::wstring const& name) { name_ = name; }

File::Path::operator std::wstring() const {
    std::size_t const size = volume_.size() + directory_.size() + name_.size();
    if (size > volume_.max_size()) throw std::bad_alloc();
    std::wstring whole(size, L'\0');
    wchar_t* to = &whole[0];
    for (std::wstring const* const part : {&volume_, &directory_, &name_}) {
        to = std::copy(part->begin(), part->end(), to);
    }
    return whole;
}

std::ostream& operator<<(std::ostream& os, File::Path const& path) {
    return os << static_cast<std::wstring>(path);
}

namespace {

bool _equalAsWholes(File::Path const& a, File::Path const& b) {
    return compare(static_cast<std::wstring>(a), static_cast<std::wstring>(b)) == 0;
}

} // namespace

bool operator==(File::Path const& a, File::Path const& b) {
    // Calls no overrides of a derived class: the conversion to text calls none either.
    std::wstring const* const parts[][2] = {
        {&a.File::Path::getVolume(), &b.File::Path::getVolume()},
        {&a.File::Path::getDirectory(), &b.File::Path::getDirectory()},
        {&a.File::Path::getName(), &b.File::Path::getName()}};
    for (auto const& [x, y] : parts) {
        // Parts of different sizes may still make the same whole.
        if (x->size() != y->size()) return _equalAsWholes(a, b);
        if (compare(*x, *y) != 0) return false;
        if (length(*x) != x->size()) return true; // Nothing counts after a NUL.
    }
    return true;
}

bool operator!=(File::Path const& a, File::Path const& b) { return !(a == b); }

} // namespace Koru
