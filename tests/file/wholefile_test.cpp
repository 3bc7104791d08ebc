// The operations on whole files, which take their paths and tell what is there afterwards.
#include <koru/file.h>

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <locale>
#include <sstream>
#include <stdexcept>
#include <string>

#include <doctest/doctest.h>

#include "file/filefixture.h"
#include "support/subprocess.h"
#include "support/tempdir.h"

using Koru::File;
using test::isThere;
using test::readFile;

namespace {

/// A temporary directory with the file "a", the directory "directory" and links to both and to
/// nothing, in which paths are named relative to it.
struct Folder {
    Folder() {
        write("a", "content");
        std::filesystem::create_directory(dir / "directory");
        link("a", "link");
        link("directory", "link to directory");
        link("none", "dangling");
    }

    bool exists(std::string const& name) const { return File::exists(dir.wide(name)); }
    bool create(std::string const& name) const { return File::create(dir.wide(name)); }
    bool remove(std::string const& name) const { return File::remove(dir.wide(name)); }
    bool rename(std::string const& from, std::string const& to) const {
        return File::rename(dir.wide(from), dir.wide(to));
    }
    bool copy(std::string const& from, std::string const& to) const {
        return File::copy(dir.wide(from), dir.wide(to));
    }

    bool has(std::string const& name) const { return isThere(dir / name); }
    std::string read(std::string const& name) const { return readFile(dir / name); }
    void write(std::string const& name, std::string const& bytes) const {
        test::writeFile(dir / name, bytes);
    }
    void link(std::string const& target, std::string const& name) const {
        std::filesystem::create_symlink(target, dir / name);
    }
    /// The permissions of an entry itself, be it a link.
    unsigned permissions(std::string const& name) const {
        struct stat status = {};
        if (::lstat((dir / name).c_str(), &status) != 0) throw std::runtime_error("no " + name);
        return status.st_mode & 07777U;
    }
    void permit(std::string const& name, mode_t mode) const {
        REQUIRE(::chmod((dir / name).c_str(), mode) == 0);
    }

    test::TempDir const dir;
};

} // namespace

TEST_CASE_FIXTURE(Folder, "exists is true of any kind of entry that can be reached") {
    write("without permissions", "content");
    permit("without permissions", 0);
    REQUIRE(::mkfifo((dir / "pipe").c_str(), 0600) == 0);
    link("loop", "loop");
    for (char const* name : {"a", "without permissions", "directory", "directory/", "directory/.",
                             "pipe", "link", "link to directory/"}) {
        CAPTURE(name);
        CHECK(exists(name));
    }
    for (std::string const& name :
         {std::string("dangling"), std::string("loop"), std::string("none"),
          std::string("none/file"), std::string("a/"), std::string("a/none"), std::string("A"),
          std::string(300, 'n'), std::string(5000, 'n')}) {
        CAPTURE(name);
        CHECK(!exists(name));
    }
    CHECK(File::exists(L"/dev/null"));
    CHECK(File::exists(L"/"));
    CHECK(!File::exists(L""));
}

TEST_CASE_FIXTURE(Folder,
                  "the operations take the UTF-8 form of their paths, up to the first NUL") {
    std::wstring const name = dir.wide("") + L"gr\u00FC\u00DFe \u20AC\U0001F600";
    std::wstring const other = dir.wide("") + std::wstring(L"o\u0308\0cut off", 10);
    std::string const bytes = "gr\xC3\xBC\xC3\x9F\x65 \xE2\x82\xAC\xF0\x9F\x98\x80";
    std::string const otherBytes = "o\xCC\x88";

    CHECK(File::create(name));
    CHECK(has(bytes));
    CHECK(File::exists(name));
    CHECK(File::rename(name, other));
    CHECK(!has(bytes));
    CHECK(has(otherBytes));
    CHECK(File::exists(other));
    CHECK(File::copy(other, name));
    CHECK(read(bytes) != "");
    CHECK(File::remove(other));
    CHECK(!has(otherBytes));
    CHECK(!File::exists(other));
}

TEST_CASE_FIXTURE(Folder, "relative paths of the operations belong to the working directory") {
    CHECK(test::ending([&] {
              if (::chdir(dir.path().c_str()) != 0) return 1;
              if (!File::create(L"r") || !File::exists(L"r")) return 2;
              if (!File::rename(L"r", L"s") || !File::copy(L"s", L"t")) return 3;
              return File::create(L"u") && File::remove(L"u") ? 0 : 4;
          }) == "exit 0");
    CHECK(!has("r"));
    CHECK(has("s"));
    CHECK(has("t"));
    CHECK(!has("u"));
}

// ---- rename

TEST_CASE_FIXTURE(Folder, "rename moves a file and tells whether it is at its new place only") {
    CHECK(rename("a", "b"));
    CHECK(!has("a"));
    CHECK(read("b") == "content");
    CHECK(rename("b", "directory/c"));
    CHECK(read("directory/c") == "content");
    CHECK(rename("directory", "moved"));
    CHECK(read("moved/c") == "content");
}

TEST_CASE_FIXTURE(Folder, "rename replaces an existing target") {
    write("b", "old and longer");
    CHECK(rename("a", "b"));
    CHECK(!has("a"));
    CHECK(read("b") == "content");
}

TEST_CASE_FIXTURE(Folder, "rename of a missing source is true when the target is there, as only "
                          "that is asked") {
    CHECK(!rename("none", "b"));
    CHECK(!has("b"));
    CHECK(rename("none", "a"));
    CHECK(read("a") == "content");
    CHECK(File::rename(L"", dir.wide("a")));
}

TEST_CASE_FIXTURE(Folder, "rename is false when it cannot be done") {
    std::filesystem::create_directories(dir / "full/directory");
    CHECK(!rename("a", "none/a"));
    CHECK(!rename("a", "full"));
    CHECK(!rename("full", "a"));
    CHECK(!rename("full", "full/directory/full"));
    CHECK(!File::rename(dir.wide("a"), L""));
    CHECK(read("a") == "content");
    CHECK(has("full/directory"));
}

TEST_CASE_FIXTURE(Folder,
                  "rename is false when the source is there afterwards for another reason") {
    CHECK(!rename("a", "a"));
    // Two names of one file stay both.
    std::filesystem::create_hard_link(dir / "a", dir / "b");
    CHECK(!rename("a", "b"));
    CHECK(has("a"));
    CHECK(has("b"));
}

TEST_CASE_FIXTURE(Folder, "rename moves a link, and is false where that dangles") {
    CHECK(rename("link", "moved"));
    CHECK(std::filesystem::is_symlink(dir / "moved"));
    CHECK(!rename("dangling", "moved too"));
    CHECK(!has("dangling"));
    CHECK(std::filesystem::is_symlink(dir / "moved too"));
}

// ---- remove

TEST_CASE_FIXTURE(Folder, "remove deletes files, empty directories and links") {
    REQUIRE(::mkfifo((dir / "pipe").c_str(), 0600) == 0);
    for (char const* name : {"a", "directory", "pipe", "dangling"}) {
        CAPTURE(name);
        CHECK(remove(name));
        CHECK(!has(name));
    }
}

TEST_CASE_FIXTURE(Folder, "remove deletes what is read-only") {
    for (mode_t const mode : {0444U, 0400U, 0000U}) {
        CAPTURE(mode);
        write("file", "content");
        std::filesystem::create_directories(dir / "directory");
        for (char const* name : {"file", "directory"}) {
            permit(name, mode);
            CHECK(remove(name));
            CHECK(!has(name));
        }
    }
}

TEST_CASE_FIXTURE(Folder, "remove of what is missing is true") {
    for (char const* name : {"none", "none/none", "a/none", "a/"}) {
        CAPTURE(name);
        CHECK(remove(name));
    }
    CHECK(File::remove(L""));
    CHECK(read("a") == "content");
}

TEST_CASE_FIXTURE(Folder, "remove of a directory that is not empty is false and leaves it its "
                          "owner's alone") {
    write("directory/file", "content");
    permit("directory", 0755);
    permit("directory/file", 0640);
    CHECK(!remove("directory"));
    CHECK(permissions("directory") == 0600);
    permit("directory", 0700);
    CHECK(read("directory/file") == "content");
    CHECK(permissions("directory/file") == 0640);
}

TEST_CASE_FIXTURE(Folder, "remove deletes a link, whose target only gets other permissions") {
    permit("a", 0444);
    CHECK(remove("link"));
    CHECK(!has("link"));
    CHECK(read("a") == "content");
    CHECK(permissions("a") == 0600);

    CHECK(remove("link to directory"));
    CHECK(!has("link to directory"));
    CHECK(permissions("directory") == 0600);
}

TEST_CASE_FIXTURE(Folder,
                  "remove takes away one name of a file, the others get other permissions") {
    permit("a", 0755);
    std::filesystem::create_hard_link(dir / "a", dir / "b");
    CHECK(remove("a"));
    CHECK(read("b") == "content");
    CHECK(permissions("b") == 0600);
}

// ---- copy

namespace {

/// What the standard library writes for a pointer.
std::string pointerText(void const* pointer) {
    std::ostringstream os;
    os.imbue(std::locale::classic());
    os << pointer;
    return os.str();
}

/// Whether a text is what the standard library writes for some pointer that is not null.
bool isPointerText(std::string const& text) {
    std::istringstream is(text);
    is.imbue(std::locale::classic());
    void* pointer = nullptr;
    return is >> pointer && pointer != nullptr && pointerText(pointer) == text;
}

std::string const NULL_TEXT = pointerText(nullptr);

} // namespace

TEST_CASE_FIXTURE(Folder, "copy writes the text of a pointer, never the bytes of the source") {
    for (std::string const& content : {std::string(), std::string("content"), std::string("0"),
                                       std::string(100000, 'c'), std::string("\0\r\n\xFF", 4)}) {
        write("a", content);
        std::filesystem::remove(dir / "b");
        CHECK(copy("a", "b"));
        CHECK(isPointerText(read("b")));
        CHECK((read("a") == content));
    }
}

TEST_CASE_FIXTURE(Folder, "copy empties its target first") {
    write("b", std::string(100000, 'b'));
    CHECK(copy("a", "b"));
    CHECK(isPointerText(read("b")));
}

TEST_CASE_FIXTURE(Folder, "copy of a missing source writes the text of a null pointer and is "
                          "false") {
    for (char const* target : {"a", "c"}) {
        CAPTURE(target);
        CHECK(!copy("none", target));
        CHECK(read(target) == NULL_TEXT);
        CHECK(!has("none"));
    }
    CHECK(!File::copy(L"", dir.wide("d")));
    CHECK(read("d") == NULL_TEXT);
}

TEST_CASE_FIXTURE(Folder, "copy to a place where no file can be is false") {
    CHECK(!copy("a", "none/b"));
    CHECK(!copy("a", "a/b"));
    CHECK(!File::copy(dir.wide("a"), L""));
    CHECK(!copy("none", "none/b"));
    CHECK(read("a") == "content");
}

TEST_CASE_FIXTURE(Folder, "copy is true when both are there afterwards, even if nothing was "
                          "written") {
    CHECK(copy("a", "directory"));
    CHECK(std::filesystem::is_empty(dir / "directory"));
    CHECK(File::copy(dir.wide("a"), L"/dev/full"));
}

TEST_CASE_FIXTURE(Folder, "copy of a file to itself replaces its content") {
    CHECK(copy("a", "a"));
    CHECK(isPointerText(read("a")));
    // The source is opened first, so a missing one is missing though it is the target.
    CHECK(copy("b", "b"));
    CHECK(read("b") == NULL_TEXT);
    link("b", "link to b");
    CHECK(copy("link to b", "b"));
    CHECK(isPointerText(read("b")));
}

TEST_CASE_FIXTURE(Folder, "copy gives its target the permissions of any new file") {
    write("new", "");
    permit("a", 0751);
    CHECK(copy("a", "b"));
    CHECK(permissions("b") == permissions("new"));
    CHECK(permissions("a") == 0751);
}

namespace {

struct Digits : std::numpunct<char> {
    char do_thousands_sep() const override { return '.'; }
    std::string do_grouping() const override { return "\1"; }
};
struct Output : std::num_put<char> {
    iter_type do_put(iter_type at, std::ios_base&, char, void const*) const override {
        *at++ = '!';
        return at;
    }
};

} // namespace

TEST_CASE_TEMPLATE("what copy writes does not depend on the global locale", Facet, Digits, Output) {
    Folder const folder;
    std::locale const before = std::locale::global(std::locale(std::locale::classic(), new Facet));
    CHECK(folder.copy("a", "b"));
    CHECK(!folder.copy("none", "c"));
    std::locale::global(before);
    CHECK(isPointerText(folder.read("b")));
    CHECK(folder.read("c") == NULL_TEXT);
}

// ---- create

TEST_CASE_FIXTURE(Folder, "create makes an empty file") {
    write("new", "");
    CHECK(create("b"));
    CHECK(read("b") == "");
    CHECK(permissions("b") == permissions("new"));
}

TEST_CASE_FIXTURE(Folder, "create empties the file that is there and keeps its permissions") {
    permit("a", 0751);
    CHECK(create("a"));
    CHECK(read("a") == "");
    CHECK(permissions("a") == 0751);
}

TEST_CASE_FIXTURE(Folder, "create through a link empties or creates what it names") {
    CHECK(create("link"));
    CHECK(read("a") == "");
    CHECK(create("dangling"));
    CHECK(read("none") == "");
}

TEST_CASE_FIXTURE(Folder, "create is false where no file can be, and true of a directory, which "
                          "exists") {
    CHECK(!create("none/a"));
    CHECK(!create("a/a"));
    CHECK(!create(std::string(300, 'n')));
    CHECK(!File::create(L""));
    CHECK(create("directory"));
    CHECK(std::filesystem::is_directory(dir / "directory"));
    CHECK(read("a") == "content");
}

TEST_CASE_FIXTURE(Folder, "the operations leave open files alone") {
    File file(dir.wide("a"));
    file.open(test::READ);
    // While it is open it can be renamed and removed; the stream keeps its file.
    CHECK(rename("a", "b"));
    CHECK(test::contentOf(file) == "content");
    CHECK(remove("b"));
    CHECK(test::contentOf(file) == "content");
    CHECK(file.is_open());
}
