#include <koru/file.h>

#include <stdlib.h>
#include <unistd.h>

#include <climits>
#include <stdexcept>
#include <string_view>

#include <koru/string.h>
#include <koru/system.h>

namespace Koru {

// Constants of the program text, so that they hold their values before any constructor runs.
wchar_t const _FSLASH = L'/';
wchar_t const _BSLASH = L'\\';
wchar_t const _COLON = L':';

namespace {

/// The resolved form of a path, or an empty string.
std::string _resolve(std::string const& path) {
    char buffer[PATH_MAX];
    return ::realpath(path.c_str(), buffer) == nullptr ? std::string() : std::string(buffer);
}

/// The length of the longest part of the path, cut before a slash, that exists. `known` is the
/// length of a part to begin with, so that each component behind it is looked up once at the most,
/// and none behind the first that is missing.
std::size_t _existingLength(std::string const& path, std::size_t known) {
    std::size_t existing = known;
    for (;;) {
        std::size_t const slash = path.find('/', existing + 1);
        if (slash == std::string::npos) return existing;
        if (::access(path.substr(0, slash).c_str(), F_OK) != 0) return existing;
        existing = slash;
    }
}

/// Resolves a path below the executable's directory, of which `prefix` bytes name that directory:
/// what exists through the system, the rest appended as it is, since most files that a program
/// writes do not exist yet.
std::string _resolveBelow(std::string const& path, std::size_t prefix) {
    std::string whole = _resolve(path);
    if (!whole.empty()) return whole;
    std::size_t const existing = _existingLength(path, prefix == 0 ? 0 : prefix - 1);
    std::string const start = path[0] == '/' ? "/" : ".";
    std::string const base = _resolve(existing == 0 ? start : path.substr(0, existing));
    if (base.empty()) return path;
    return base + '/' + path.substr(existing);
}

std::wstring _relativeToExecutable(std::wstring const& text) {
    std::wstring directory = System::getProcessFileName();
    directory.resize(directory.rfind(_FSLASH) + 1); // to nothing when there is no slash
    std::string const prefix = make_string(directory);
    return make_wstring(_resolveBelow(prefix + make_string(text), prefix.size()));
}

/// The directory part of a path, which ends behind its last separator, with one forward slash at
/// its beginning and between any two segments.
std::wstring _directory(std::wstring_view part) {
    std::wstring directory;
    directory.reserve(part.size() + 1);
    directory += _FSLASH;
    for (wchar_t const c : part) {
        bool const separator = c == _FSLASH || c == _BSLASH;
        if (!separator)
            directory += c;
        else if (directory.back() != _FSLASH)
            directory += _FSLASH;
    }
    return directory;
}

} // namespace

File::Path::Path() = default;

File::Path::Path(std::wstring const& text) {
    std::size_t const size = length(text);
    if (size == 0) throw std::invalid_argument("null or empty string passed as file path");
    std::wstring resolved;
    std::wstring_view path(text.data(), size);
    // Intended: decided before backslashes count as slashes, so a path that begins with one is
    // relative. An absolute path is taken as it is.
    if (path[0] != _FSLASH) {
        resolved = _relativeToExecutable(text);
        path = resolved;
    }
    std::size_t const nameStart = path.find_last_of(L"/\\") + 1;
    directory_ = _directory(path.substr(0, nameStart));
    // Intended: a file directly below the root cannot be represented.
    if (directory_.size() == 1) throw std::invalid_argument("cannot determine path");
    name_ = path.substr(nameStart);
}

File::Path::Path(wchar_t const* text) : Path(make_wstring(text)) {}

File::Path::Path(std::string const& text) : Path(make_wstring(text)) {}

File::Path::Path(char const* text) : Path(make_wstring(text)) {}

File::Path::Path(Path const& other) = default;

// All or nothing: what needs memory is done before this path changes.
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
    std::wstring whole;
    whole.reserve(volume_.size() + directory_.size() + name_.size());
    return whole.append(volume_).append(directory_).append(name_);
}

std::ostream& operator<<(std::ostream& os, File::Path const& path) {
    return os << static_cast<std::wstring>(path);
}

bool operator==(File::Path const& a, File::Path const& b) {
    return compare(static_cast<std::wstring>(a), static_cast<std::wstring>(b)) == 0;
}

bool operator!=(File::Path const& a, File::Path const& b) { return !(a == b); }

} // namespace Koru
