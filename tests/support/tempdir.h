// A temporary directory of a test's own, and reading and writing whole files in it.
#ifndef KORU_TESTS_TEMPDIR_H
#define KORU_TESTS_TEMPDIR_H

#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <string>
#include <system_error>

namespace test {

/// Lets the owner into a directory again: File::remove shuts all but root out of one that it cannot
/// delete.
inline void letIn(std::filesystem::path const& directory) {
    std::filesystem::permissions(directory, std::filesystem::perms::owner_all,
                                 std::filesystem::perm_options::add);
}

/// Lets the owner into a directory and all below it.
inline void letInEverywhere(std::filesystem::path const& directory) {
    letIn(directory);
    for (auto const& entry : std::filesystem::directory_iterator(directory)) {
        if (!entry.is_symlink() && entry.is_directory()) letInEverywhere(entry.path());
    }
}

/// Removes a directory with all its content, wherever its owner was shut out.
inline void removeTree(std::filesystem::path const& directory) {
    std::error_code failure;
    std::filesystem::remove_all(directory, failure);
    if (!failure) return;
    letInEverywhere(directory);
    std::filesystem::remove_all(directory);
}

/// Made on construction, removed with its content on destruction.
class TempDir {
public:
    TempDir() {
        std::string name = std::filesystem::temp_directory_path().string() + "/koru-test-XXXXXX";
        if (::mkdtemp(&name[0]) == nullptr) throw std::runtime_error("mkdtemp failed");
        path_ = std::filesystem::canonical(name).string();
    }
    TempDir(TempDir const&) = delete;
    TempDir& operator=(TempDir const&) = delete;
    ~TempDir() {
        try {
            removeTree(path_);
        } catch (std::filesystem::filesystem_error const&) { // A test has removed it.
        }
    }

    /// The directory, without a slash at its end.
    std::string const& path() const { return path_; }
    /// The path of an entry below it.
    std::string operator/(std::string const& name) const { return path_ + "/" + name; }
    /// The same as a wide string. For ASCII names, which the directory's own is.
    std::wstring wide(std::string const& name) const {
        std::string const narrow = *this / name;
        return std::wstring(narrow.begin(), narrow.end());
    }

private:
    std::string path_;
};

inline void writeFile(std::string const& path, std::string const& bytes) {
    std::ofstream out(path, std::ios::binary | std::ios::trunc);
    out.write(bytes.data(), static_cast<std::streamsize>(bytes.size()));
    out.close();
    if (!out) throw std::runtime_error("cannot write " + path);
}

inline std::string readFile(std::string const& path) {
    std::ifstream in(path, std::ios::binary);
    if (!in) throw std::runtime_error("cannot read " + path);
    std::ostringstream bytes;
    bytes << in.rdbuf();
    return bytes.str();
}

/// A file's place in a directory of its own, without the file at first.
class Place {
public:
    std::string const& path() const { return path_; }
    TempDir const& directory() const { return directory_; }
    /// Writes a new file; some file systems are slow in emptying one that is there.
    void write(std::string const& bytes) const {
        std::filesystem::remove(path_);
        writeFile(path_, bytes);
    }
    std::string bytes() const { return readFile(path_); }
    bool exists() const { return std::filesystem::exists(path_); }

private:
    TempDir directory_;
    std::string path_ = directory_ / "file";
};

/// The base of a file object that makes its place before it and removes it after it.
struct HasPlace {
    Place const place{};
};

} // namespace test

#endif
