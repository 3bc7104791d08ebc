// The operations on whole files, which take their paths and tell what is there afterwards.
#include <koru/file.h>

#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <locale>
#include <map>
#include <sstream>
#include <stdexcept>
#include <string>

#include <doctest/doctest.h>

#include "file/filefixture.h"
#include "support/subprocess.h"
#include "support/tempdir.h"

using Koru::File;

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

/// What a file holds, or what sort of entry it is.
std::string shown(std::filesystem::path const& path) {
    auto const type = std::filesystem::symlink_status(path).type();
    if (type == std::filesystem::file_type::directory) return "directory";
    if (type == std::filesystem::file_type::symlink) return "link";
    if (type == std::filesystem::file_type::fifo) return "pipe";
    std::string const content = test::readFile(path.string());
    if (isPointerText(content)) return "<pointer>";
    if (content == pointerText(nullptr)) return "<null>";
    return content.empty() ? "<empty>" : content;
}

/// A temporary directory with the file "a", the directory "d" and links to both and to nothing, in
/// which paths are named. Operations are told by their result and what they changed: what is gone
/// has a minus, what is new or different is shown.
class Folder {
public:
    Folder() {
        write("a", "content");
        mkdir("d");
        link("a", "link");
        link("d", "link-to-d");
        link("none", "dangling");
    }

    /// The path of an entry; no path for an empty name.
    std::wstring wide(std::string const& name) const { return name.empty() ? L"" : dir.wide(name); }

    bool exists(std::string const& name) const { return File::exists(wide(name)); }
    std::string rename(std::string const& from, std::string const& to) const {
        return did([&] { return File::rename(wide(from), wide(to)); });
    }
    std::string remove(std::string const& name) const {
        return did([&] { return File::remove(wide(name)); });
    }
    std::string copy(std::string const& from, std::string const& to) const {
        return did([&] { return File::copy(wide(from), wide(to)); });
    }
    std::string create(std::string const& name) const {
        return did([&] { return File::create(wide(name)); });
    }

    void write(std::string const& name, std::string const& bytes) const {
        test::writeFile(dir / name, bytes);
    }
    void mkdir(std::string const& name) const { std::filesystem::create_directories(dir / name); }
    void link(std::string const& target, std::string const& name) const {
        std::filesystem::create_symlink(target, dir / name);
    }
    void pipe(std::string const& name) const { REQUIRE(::mkfifo((dir / name).c_str(), 0600) == 0); }
    void permit(std::string const& name, mode_t mode) const {
        REQUIRE(::chmod((dir / name).c_str(), mode) == 0);
    }
    /// The permissions of an entry itself, be it a link.
    unsigned permissions(std::string const& name) const {
        struct stat status = {};
        if (::lstat((dir / name).c_str(), &status) != 0) throw std::runtime_error("no " + name);
        return status.st_mode & 07777U;
    }

    test::TempDir const dir;

private:
    using Entries = std::map<std::string, std::string>;

    Entries entries() const {
        Entries all;
        for (auto const& entry : std::filesystem::recursive_directory_iterator(
                 dir.path(), std::filesystem::directory_options::skip_permission_denied))
            all[entry.path().lexically_relative(dir.path()).string()] = shown(entry.path());
        return all;
    }

    template <class Operation>
    std::string did(Operation operation) const {
        Entries const before = entries();
        std::string result = operation() ? "true" : "false";
        Entries const after = entries();
        for (auto const& [name, content] : before) {
            if (after.count(name) == 0) result += " -" + name;
        }
        for (auto const& [name, content] : after) {
            if (before.count(name) == 0 || before.at(name) != content)
                result += " " + name + "=" + content;
        }
        return result;
    }
};

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

TEST_CASE_FIXTURE(Folder, "exists is true of any kind of entry that can be reached") {
    write("without permissions", "content");
    permit("without permissions", 0);
    pipe("pipe");
    for (std::string const name :
         {"a", "without permissions", "d", "d/", "d/.", "pipe", "link", "link-to-d/"}) {
        CAPTURE(name);
        CHECK(exists(name));
    }
    CHECK(File::exists(L"/dev/null"));
    CHECK(File::exists(L"/"));
}

TEST_CASE_FIXTURE(Folder, "exists is false of what is missing, dangling or no path at all") {
    link("loop", "loop");
    for (std::string const& name :
         {std::string(), std::string("dangling"), std::string("loop"), std::string("none"),
          std::string("none/file"), std::string("a/"), std::string("a/none"), std::string("A"),
          std::string(300, 'n'), std::string(5000, 'n')}) {
        CAPTURE(name);
        CHECK(!exists(name));
    }
}

TEST_CASE_FIXTURE(Folder,
                  "the operations take the UTF-8 form of their paths, up to the first NUL") {
    std::wstring const name = dir.wide("") + L"gr\u00FC\u00DFe \u20AC\U0001F600";
    std::wstring const other = dir.wide("") + std::wstring(L"o\u0308\0cut off", 10);
    std::string const bytes = dir / "gr\xC3\xBC\xC3\x9F\x65 \xE2\x82\xAC\xF0\x9F\x98\x80";
    std::string const otherBytes = dir / "o\xCC\x88";

    CHECK(File::create(name));
    CHECK(test::isThere(bytes));
    CHECK(File::exists(name));
    CHECK(File::rename(name, other));
    CHECK(!test::isThere(bytes));
    CHECK(test::isThere(otherBytes));
    CHECK(File::exists(other));
    CHECK(File::copy(other, name));
    CHECK(shown(bytes) == "<pointer>");
    CHECK(File::remove(other));
    CHECK(!test::isThere(otherBytes));
    CHECK(!File::exists(other));
}

TEST_CASE_FIXTURE(Folder, "relative paths of the operations belong to the working directory") {
    CHECK(test::ending([&] {
              if (::chdir(dir.path().c_str()) != 0) return 1;
              if (!File::create(L"r") || !File::exists(L"r")) return 2;
              if (!File::rename(L"r", L"s") || !File::copy(L"s", L"t")) return 3;
              return File::create(L"u") && File::remove(L"u") ? 0 : 4;
          }) == "exit 0");
    CHECK(!exists("r"));
    CHECK(shown(dir / "s") == "<empty>");
    CHECK(shown(dir / "t") == "<pointer>");
    CHECK(!exists("u"));
}

TEST_CASE_FIXTURE(Folder, "rename moves a file and tells whether it is at its new place only") {
    CHECK(rename("a", "b") == "true -a b=content");
    CHECK(rename("b", "d/c") == "true -b d/c=content");
    CHECK(rename("d", "moved") == "true -d -d/c moved=directory moved/c=content");
}

TEST_CASE_FIXTURE(Folder, "rename replaces an existing target") {
    write("b", "old and longer");
    CHECK(rename("a", "b") == "true -a b=content");
}

TEST_CASE_FIXTURE(Folder, "rename of a missing source is true when the target is there, as only "
                          "that is asked") {
    CHECK(rename("none", "b") == "false");
    CHECK(rename("none", "a") == "true");
    CHECK(rename("", "a") == "true");
}

TEST_CASE_FIXTURE(Folder, "rename is false when it cannot be done") {
    mkdir("full/d");
    CHECK(rename("a", "none/a") == "false");
    CHECK(rename("a", "full") == "false");
    CHECK(rename("full", "a") == "false");
    CHECK(rename("full", "full/d/full") == "false");
    CHECK(rename("a", "") == "false");
}

TEST_CASE_FIXTURE(Folder,
                  "rename is false when the source is there afterwards for another reason") {
    CHECK(rename("a", "a") == "false");
    // Two names of one file stay both.
    std::filesystem::create_hard_link(dir / "a", dir / "b");
    CHECK(rename("a", "b") == "false");
}

TEST_CASE_FIXTURE(Folder, "rename moves a link, and is false where that dangles") {
    CHECK(rename("link", "moved") == "true -link moved=link");
    CHECK(rename("dangling", "moved too") == "false -dangling moved too=link");
}

TEST_CASE_FIXTURE(Folder, "remove deletes files, empty directories and links") {
    pipe("pipe");
    CHECK(remove("d") == "true -d");
    CHECK(remove("pipe") == "true -pipe");
    CHECK(remove("dangling") == "true -dangling");
    CHECK(remove("a") == "true -a");
}

TEST_CASE_FIXTURE(Folder, "remove deletes what is read-only") {
    for (mode_t const mode : {0444U, 0400U, 0000U}) {
        CAPTURE(mode);
        mkdir("read-only");
        permit("read-only", mode);
        CHECK(remove("read-only") == "true -read-only");
        write("file", "content");
        permit("file", mode);
        CHECK(File::remove(dir.wide("file")));
        CHECK(!exists("file"));
    }
}

TEST_CASE_FIXTURE(Folder, "remove of what is missing is true") {
    for (std::string const name : {"none", "none/none", "a/none", "a/", ""}) {
        CAPTURE(name);
        CHECK(remove(name) == "true");
    }
}

TEST_CASE_FIXTURE(Folder, "remove of a directory that is not empty is false and leaves it with "
                          "mode 0600") {
    write("d/file", "content");
    permit("d", 0755);
    permit("d/file", 0640);
    CHECK(!File::remove(dir.wide("d")));
    CHECK(permissions("d") == 0600);
    permit("d", 0700);
    CHECK(shown(dir / "d/file") == "content");
    CHECK(permissions("d/file") == 0640);
}

TEST_CASE_FIXTURE(Folder, "remove deletes a link, whose target only gets other permissions") {
    permit("a", 0444);
    CHECK(remove("link") == "true -link");
    CHECK(permissions("a") == 0600);
    CHECK(remove("link-to-d") == "true -link-to-d");
    CHECK(permissions("d") == 0600);
}

TEST_CASE_FIXTURE(Folder,
                  "remove takes away one name of a file, the others get other permissions") {
    permit("a", 0755);
    std::filesystem::create_hard_link(dir / "a", dir / "b");
    CHECK(remove("a") == "true -a");
    CHECK(permissions("b") == 0600);
}

TEST_CASE_FIXTURE(Folder, "copy writes the text of a pointer, never the bytes of the source") {
    for (std::string const& content : {std::string(), std::string("content"), std::string("0"),
                                       std::string(100000, 'c'), std::string("\0\r\n\xFF", 4)}) {
        write("a", content);
        std::filesystem::remove(dir / "b");
        CHECK(copy("a", "b") == "true b=<pointer>");
    }
}

TEST_CASE_FIXTURE(Folder, "copy empties its target first") {
    write("b", std::string(100000, 'b'));
    CHECK(copy("a", "b") == "true b=<pointer>");
}

TEST_CASE_FIXTURE(Folder, "copy of a missing source writes the text of a null pointer and is "
                          "false") {
    CHECK(copy("none", "a") == "false a=<null>");
    CHECK(copy("none", "c") == "false c=<null>");
    CHECK(copy("", "d/e") == "false d/e=<null>");
}

TEST_CASE_FIXTURE(Folder, "copy to a place where no file can be is false") {
    CHECK(copy("a", "none/b") == "false");
    CHECK(copy("a", "a/b") == "false");
    CHECK(copy("a", "") == "false");
    CHECK(copy("none", "none/b") == "false");
}

TEST_CASE_FIXTURE(Folder, "copy is true when both are there afterwards, even if nothing was "
                          "written") {
    CHECK(copy("a", "d") == "true");
    CHECK(File::copy(dir.wide("a"), L"/dev/full"));
}

TEST_CASE_FIXTURE(Folder, "copy of a file to itself replaces its content") {
    CHECK(copy("a", "a") == "true a=<pointer>");
    // The source is opened first, so a missing one is missing though it is the target.
    CHECK(copy("b", "b") == "true b=<null>");
    link("b", "link-to-b");
    CHECK(copy("link-to-b", "b") == "true b=<pointer>");
}

TEST_CASE_FIXTURE(Folder, "copy gives its target the permissions of any new file") {
    write("new", "");
    permit("a", 0751);
    CHECK(copy("a", "b") == "true b=<pointer>");
    CHECK(permissions("b") == permissions("new"));
    CHECK(permissions("a") == 0751);
}

TEST_CASE_TEMPLATE("what copy writes does not depend on the global locale", Facet, Digits, Output) {
    Folder const folder;
    std::locale const before = std::locale::global(std::locale(std::locale::classic(), new Facet));
    std::string const copied = folder.copy("a", "b");
    std::string const missing = folder.copy("none", "c");
    std::locale::global(before);
    CHECK(copied == "true b=<pointer>");
    CHECK(missing == "false c=<null>");
}

TEST_CASE_FIXTURE(Folder, "create makes an empty file") {
    write("new", "");
    CHECK(create("b") == "true b=<empty>");
    CHECK(permissions("b") == permissions("new"));
}

TEST_CASE_FIXTURE(Folder, "create empties the file that is there and keeps its permissions") {
    permit("a", 0751);
    CHECK(create("a") == "true a=<empty>");
    CHECK(permissions("a") == 0751);
}

TEST_CASE_FIXTURE(Folder, "create through a link empties or creates what it names") {
    CHECK(create("link") == "true a=<empty>");
    CHECK(create("dangling") == "true none=<empty>");
}

TEST_CASE_FIXTURE(Folder, "create is false where no file can be, and true of a directory, which "
                          "exists") {
    CHECK(create("none/a") == "false");
    CHECK(create("a/a") == "false");
    CHECK(create(std::string(300, 'n')) == "false");
    CHECK(create("") == "false");
    CHECK(create("d") == "true");
}

TEST_CASE_FIXTURE(Folder, "the operations leave open files alone") {
    File file(dir.wide("a"));
    file.open(test::READ);
    // While it is open it can be renamed and removed; the stream keeps its file.
    CHECK(rename("a", "b") == "true -a b=content");
    CHECK(test::contentOf(file) == "content");
    CHECK(remove("b") == "true -b");
    CHECK(test::contentOf(file) == "content");
    CHECK(file.is_open());
}
