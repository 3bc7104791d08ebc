#include "access.h"

#include <koru/string.h>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <system_error>

#include "failure.h"
#include "lint.h"
#include "text.h"

namespace fs = std::filesystem;
using Koru::File;

namespace tool {

namespace {

int const MAX_LINKS = 40; // as many as the kernel follows

[[noreturn]] void _fail(int error) { throw std::system_error(error, std::generic_category()); }

/// Where the links lead; a link that leads nowhere names the file that is to be created.
fs::path _withoutLinks(fs::path path) {
    for (int links = 0; fs::is_symlink(fs::symlink_status(path)); ++links) {
        if (links == MAX_LINKS) _fail(ELOOP);
        path = path.parent_path() / fs::read_symlink(path);
    }
    return path;
}

void _open(Table& table, unsigned long mode) {
    errno = 0;
    try {
        table.file().open(mode);
    } catch (std::runtime_error const&) {
        if (errno != 0) _fail(errno);
        throw; // The system is not to blame.
    }
}

/// Holds a folder's lock, so that commands change its files one after the other. It needs no file of
/// its own and ends with the process.
class FolderLock {
public:
    explicit FolderLock(fs::path const& folder)
        : descriptor_(::open(folder.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC)) {
        if (descriptor_ < 0) failBySystem("cannot open its folder");
        if (::flock(descriptor_, LOCK_EX) != 0) failBySystem("cannot lock its folder");
    }
    FolderLock(FolderLock const&) = delete;
    FolderLock& operator=(FolderLock const&) = delete;
    ~FolderLock() { ::close(descriptor_); }

private:
    int descriptor_;
};

/// A folder beside the file, where the new one is made. Nobody else may enter it, so no other user
/// reads the new file before it has its permissions, or puts another in its place.
class Workshop {
public:
    explicit Workshop(fs::path const& folder) {
        std::string name = folder / ".koru-XXXXXX";
        if (::mkdtemp(&name[0]) == nullptr) failBySystem("cannot make a folder beside it");
        path_ = name;
    }
    Workshop(Workshop const&) = delete;
    Workshop& operator=(Workshop const&) = delete;
    ~Workshop() {
        std::error_code ignored;
        fs::remove_all(path_, ignored);
    }
    fs::path const& path() const { return path_; }

private:
    fs::path path_;
};

/// Brings a file to the disk, as a rename may reach it before what was written.
void _synchronize(fs::path const& file) {
    int const descriptor = ::open(file.c_str(), O_RDONLY | O_CLOEXEC);
    bool const isOnDisk = descriptor >= 0 && ::fsync(descriptor) == 0;
    if (!isOnDisk) failBySystem("cannot bring the new file to the disk");
    ::close(descriptor);
}

std::vector<Entry> _sorted(std::vector<Entry> entries) {
    std::sort(entries.begin(), entries.end());
    return entries;
}

std::vector<Entry> _read(Family const& family, fs::path const& path) {
    auto const table = family.make(verbatim(path));
    _open(*table, File::READ);
    return table->entries();
}

/// Changes the file itself, which is nobody else's yet. Returns what is in it then.
std::vector<Entry> _rewrite(Family const& family, fs::path const& path,
                            std::function<void(Table&)> const& action) {
    auto const table = family.make(verbatim(path));
    _open(*table, File::READ | File::WRITE);
    action(*table);
    std::vector<Entry> entries = _sorted(table->entries());
    table->file().close();
    if (table->file().fail()) throw Failure(FAILED, "failed to close the new file");
    if (_sorted(_read(family, path)) != entries)
        throw Failure(REFUSED, "it would not be read as it was set");
    return entries;
}

/// Copies the file that the change begins with, unless it begins with an empty table.
void _copy(Family const& family, fs::path const& path, fs::path const& fresh, Options options) {
    if (options.isToReplace) return;
    fs::copy_file(path, fresh);
    bool const isText = family.text == &family;
    if (isText && !options.mayLose) refuseLoss(readAll(fresh), family.hasSections);
}

/// Gives the new file the permissions, the group and, where the system lets us, the owner of the
/// old one.
void _takeOver(fs::path const& old, fs::path const& fresh) {
    struct stat status = {};
    if (::stat(old.c_str(), &status) != 0) failBySystem("cannot tell its permissions");
    uid_t const anyOwner = static_cast<uid_t>(-1);
    if (::chown(fresh.c_str(), status.st_uid, status.st_gid) != 0 &&
        ::chown(fresh.c_str(), anyOwner, status.st_gid) != 0)
        failBySystem("cannot keep its group");
    if (::chmod(fresh.c_str(), status.st_mode & 07777U) != 0)
        failBySystem("cannot keep its permissions");
}

/// Whether the file is there, as one that may be changed.
bool _isThere(fs::path const& path) {
    fs::file_status const status = fs::status(path);
    if (!fs::exists(status)) return false;
    if (fs::is_directory(status)) _fail(EISDIR);
    if (!fs::is_regular_file(status)) throw Failure(FAILED, "it is no regular file");
    // Replacing it needs no such permission, but it tells what its owner wants.
    if (::access(path.c_str(), W_OK) != 0) _fail(errno);
    return true;
}

} // namespace

File::Path verbatim(fs::path const& path) {
    File::Path result;
    result.setName(wide(path.string()));
    return result;
}

std::vector<Entry> read(Family const& family, std::string const& file) {
    return _read(family, fs::absolute(file));
}

void change(Family const& family, std::string const& file, Options options,
            std::function<void(Table&)> const& action) {
    fs::path const path = _withoutLinks(fs::absolute(file));
    FolderLock const lock(path.parent_path());
    bool const isThere = _isThere(path);
    if (!isThere && !options.mayCreate) _fail(ENOENT);
    Workshop const workshop(path.parent_path());
    fs::path const fresh = workshop.path() / path.filename();
    if (isThere) _copy(family, path, fresh, options);
    std::vector<Entry> const entries = _rewrite(family, fresh, action);
    if (isThere && entries == _sorted(_read(family, path))) return;
    if (isThere) _takeOver(path, fresh);
    _synchronize(fresh);
    if (!File::rename(wide(fresh.string()), wide(path.string())))
        throw Failure(FAILED, "failed to put the new file in its place");
}

} // namespace tool
