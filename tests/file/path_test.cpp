// File paths. Absolute ones are parsed here; relative ones depend on where the executable lies, so
// copies of it are started from elsewhere and answer with what they make of them.
#include <koru/file.h>
#include <koru/string.h>
#include <koru/system.h>

#include <stdlib.h>
#include <sys/resource.h>
#include <unistd.h>

#include <chrono>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <initializer_list>
#include <new>
#include <sstream>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <vector>

#include <doctest/doctest.h>

#include "support/relocate.h"
#include "support/selfexec.h"
#include "support/slots.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/throws.h"

// The memory of this executable and the libraries it loaded comes from here, so that a test can let
// it run out.
using test::slotOf;
namespace {

thread_local long allocationsBeforeFailure = -1; // -1: none fails

} // namespace

void* operator new(std::size_t size) {
    bool const fails = allocationsBeforeFailure >= 0 && allocationsBeforeFailure-- == 0;
    void* const memory = fails ? nullptr : std::malloc(size == 0 ? 1 : size);
    if (memory == nullptr) throw std::bad_alloc();
    return memory;
}
void operator delete(void* memory) noexcept { std::free(memory); }
void operator delete(void* memory, std::size_t) noexcept { std::free(memory); }

namespace {

using Koru::File;
using Strings = std::vector<std::string>;

char const* const EMPTY = "null or empty string passed as file path";
char const* const UNDETERMINED = "cannot determine path";

// Built before main, as an application's own static objects are.
wchar_t const separators[] = {Koru::_FSLASH, Koru::_BSLASH, Koru::_COLON};
File::Path const early(L"/early\\bird/worm.txt");
File::Path const earlyRelative("koru-none/worm.txt");

std::string directoryOf(File::Path const& path) { return Koru::make_string(path.getDirectory()); }
std::string nameOf(File::Path const& path) { return Koru::make_string(path.getName()); }
std::string textOf(File::Path const& path) { return Koru::make_string(std::wstring(path)); }

template <class Text>
std::string complaintAbout(Text const& text) {
    return test::messageOf<std::invalid_argument>([&] { File::Path const path(text); });
}

// ---- Relative paths: what a copy of this executable answers.

/// Wide text as an argument of a program, eight hexadecimal digits for each unit, so that NULs and
/// units that no UTF-8 stands for get through.
std::string toHex(std::wstring const& text) {
    std::string hex;
    for (wchar_t const c : text) {
        char digits[9];
        std::snprintf(digits, sizeof digits, "%08lx",
                      static_cast<unsigned long>(static_cast<char32_t>(c)));
        hex += digits;
    }
    return hex;
}

std::wstring fromHex(std::string const& hex) {
    std::wstring text;
    for (std::size_t i = 0; i + 8 <= hex.size(); i += 8) {
        char32_t const unit = static_cast<char32_t>(std::stoul(hex.substr(i, 8), nullptr, 16));
        text += static_cast<wchar_t>(unit);
    }
    return text;
}

bool filesAreRefused = false;

/// While it lives no file can be opened, if that is asked for, so nothing says where the executable
/// is. (The sanitizers open some themselves, so it ends before anything else is done.)
class Refusal {
public:
    Refusal() {
        ::getrlimit(RLIMIT_NOFILE, &before_);
        rlimit const none{0, before_.rlim_max};
        if (filesAreRefused) ::setrlimit(RLIMIT_NOFILE, &none);
    }
    Refusal(Refusal const&) = delete;
    Refusal& operator=(Refusal const&) = delete;
    ~Refusal() { ::setrlimit(RLIMIT_NOFILE, &before_); }

private:
    rlimit before_{};
};

File::Path parsed(std::wstring const& text) {
    Refusal const refusal;
    return File::Path(text);
}

void answerWith(std::wstring const& text) {
    try {
        File::Path const path = parsed(text);
        test::answer(directoryOf(path));
        test::answer(nameOf(path));
    } catch (std::invalid_argument const& e) {
        test::answer("invalid_argument");
        test::answer(e.what());
    }
}

/// Changes the process as an argument in capitals says. False when that fails.
bool follow(std::string const& argument) {
    std::string const operand = argument.substr(argument.find('=') + 1);
    if (argument.compare(0, 6, "CHDIR=") == 0) return ::chdir(operand.c_str()) == 0;
    if (argument.compare(0, 6, "RMDIR=") == 0) return ::rmdir(operand.c_str()) == 0;
    filesAreRefused = argument == "WITHOUT_FILES";
    return filesAreRefused;
}

/// Parses each argument and answers with directory and name, or follows it.
int parse(int count, char** arguments) {
    for (int i = 0; i < count; ++i) {
        std::string const argument = arguments[i];
        bool const isText = argument.find_first_not_of("0123456789abcdef") == std::string::npos;
        if (isText)
            answerWith(fromHex(argument));
        else if (!follow(argument))
            return 1;
    }
    return 0;
}

/// Parses the first argument followed by as many missing components as the second one says.
int parseLong(int, char** arguments) {
    std::wstring text = Koru::make_wstring(arguments[0]);
    for (long i = std::stol(arguments[1]); i > 0; --i) text += L"m/";
    answerWith(text + L"x.ini");
    return 0;
}

/// Opens the file of a relative path for reading and writing, which creates it.
int create(int, char** arguments) {
    File file{File::Path(arguments[0])};
    file.open(File::READ | File::WRITE);
    file.write("here", 4);
    file.close();
    test::answer(Koru::make_string(file.getName()));
    return 0;
}

/// The text of a relative path found the naive way: as much of the joined text as can be resolved,
/// taking off one component at a time, with the rest after it. Of a link that cannot be resolved,
/// what the C library leaves in its buffer is as much as can be.
std::string naive(std::string const& directory, std::string const& text) {
    std::string const joined = directory + text;
    std::size_t cut = joined.size();
    std::size_t missing = cut;
    char resolved[4096] = {};
    while (::realpath(joined.substr(0, cut).c_str(), resolved) == nullptr) {
        missing = cut;
        cut = joined.rfind('/', cut - 1);
        std::memset(resolved, 0, sizeof resolved);
    }
    std::string const prefix = joined.substr(0, missing);
    if (cut != joined.size() && std::filesystem::is_symlink(prefix)) {
        static_cast<void>(::realpath(prefix.c_str(), resolved) == nullptr);
        cut = missing;
    }
    std::string parsed;
    for (char const c : resolved + joined.substr(cut)) {
        char const slashed = c == '\\' ? '/' : c;
        if (slashed != '/' || parsed.empty() || parsed.back() != '/') parsed += slashed;
    }
    return parsed.rfind('/') == 0 ? UNDETERMINED : parsed;
}

/// The same by the library.
std::string parsedText(std::string const& text) {
    try {
        return textOf(File::Path(text));
    } catch (std::invalid_argument const& e) {
        return e.what();
    }
}

/// Every path of one to four of the components.
Strings combine(Strings const& components) {
    Strings paths = components;
    std::size_t begin = 0;
    for (int length = 2; length <= 4; ++length) {
        std::size_t const end = paths.size();
        for (; begin < end; ++begin) {
            for (std::string const& component : components) {
                paths.push_back(paths[begin] + "/" + component);
            }
        }
    }
    return paths;
}

/// Compares the library with `naive` on the relative ones of all paths of the components. Answers
/// with the number of these paths and with those on which the two differ.
int compareAll(int count, char** components) {
    std::string const executable = Koru::make_string(Koru::System::getProcessFileName());
    std::string const directory = executable.substr(0, executable.rfind('/') + 1);
    std::size_t compared = 0;
    Strings differing;
    for (std::string const& text : combine(Strings(components, components + count))) {
        if (text.empty() || text[0] == '/') continue;
        ++compared;
        std::string const expected = naive(directory, text);
        std::string const parsed = parsedText(text);
        if (parsed != expected) differing.push_back(text + ": " + parsed + ", not " + expected);
    }
    test::answer(std::to_string(compared));
    for (std::string const& text : differing) test::answer(text);
    return 0;
}

test::RegisterSelf const registrations[] = {
    {"parse", parse}, {"parseLong", parseLong}, {"create", create}, {"compareAll", compareAll}};

/// An application's directory and what lies around it. The application is `bin/prog`, started in
/// `elsewhere` unless a test says otherwise.
struct Installation {
    Installation() {
        for (char const* directory : {"bin/conf", "bin/sub", "shared", "elsewhere/conf"}) {
            std::filesystem::create_directories(dir / directory);
        }
        test::copyOwnExecutable(program);
        for (char const* file : {"bin/conf/app.ini", "bin/file.txt", "bin/back\\slash",
                                 "shared/data.txt", "elsewhere/conf/app.ini"}) {
            test::writeFile(dir / file, "content");
        }
        std::filesystem::create_symlink("../shared", dir / "bin/link");
        std::filesystem::create_symlink("../shared/data.txt", dir / "bin/filelink");
        std::filesystem::create_symlink("../shared/data.txt", dir / "bin/back\\link");
        std::filesystem::create_symlink("nowhere", dir / "bin/dangling");
        std::filesystem::create_symlink("loop", dir / "bin/loop");
    }

    /// Directory and name, or "invalid_argument" and the message.
    Strings parsed(std::wstring const& text) const {
        return test::ask(program, program, dir / "elsewhere", "parse", {toHex(text)});
    }

    test::TempDir const dir;
    std::string const program = dir / "bin/prog";
};

/// A row of a table: a relative text and the path it stands for, below the temporary directory.
struct Relative {
    std::wstring text;
    char const *directory, *name;
};

void check(Installation const& installation, std::initializer_list<Relative> rows) {
    for (Relative const& row : rows) {
        std::string const text = Koru::make_string(row.text);
        CAPTURE(text);
        CHECK(installation.parsed(row.text) ==
              Strings{installation.dir.path() + row.directory, row.name});
    }
}

} // namespace

TEST_CASE("the separators are slash, backslash and colon, also in static constructors") {
    CHECK(separators[0] == L'/');
    CHECK(separators[1] == L'\\');
    CHECK(separators[2] == L':');
    CHECK(Koru::_FSLASH == L'/');
    CHECK(Koru::_BSLASH == L'\\');
    CHECK(Koru::_COLON == L':');
    static_assert(std::is_same<decltype(Koru::_FSLASH), wchar_t const>::value, "");
    static_assert(std::is_same<decltype(Koru::_BSLASH), wchar_t const>::value, "");
    static_assert(std::is_same<decltype(Koru::_COLON), wchar_t const>::value, "");
}

TEST_CASE("paths can be built in static constructors") {
    CHECK(textOf(early) == "/early/bird/worm.txt");
    CHECK(textOf(earlyRelative) == textOf(File::Path("koru-none/worm.txt")));
    CHECK(nameOf(earlyRelative) == "worm.txt");
}

TEST_CASE("a path is a table pointer and three wide strings: volume, directory, name") {
    static_assert(std::is_polymorphic<File::Path>::value, "");
    static_assert(std::has_virtual_destructor<File::Path>::value, "");
    static_assert(sizeof(File::Path) == sizeof(void*) + 3 * sizeof(std::wstring), "");

    File::Path path;
    path.setVolume(L"v");
    path.setDirectory(L"d");
    path.setName(L"n");
    unsigned char const* const bytes = reinterpret_cast<unsigned char const*>(&path);
    auto const member = [&](std::size_t index) {
        return reinterpret_cast<std::wstring const*>(bytes + sizeof(void*) +
                                                     index * sizeof(std::wstring));
    };
    CHECK(member(0) == &path.getVolume());
    CHECK(member(1) == &path.getDirectory());
    CHECK(member(2) == &path.getName());
}

TEST_CASE("the virtual functions of a path are in the order of the published table") {
    // The destructor takes the first two places.
    CHECK(slotOf(&File::Path::getVolume) == 2);
    CHECK(slotOf(&File::Path::setVolume) == 3);
    CHECK(slotOf(&File::Path::getDirectory) == 4);
    CHECK(slotOf(&File::Path::setDirectory) == 5);
    CHECK(slotOf(&File::Path::getName) == 6);
    CHECK(slotOf(&File::Path::setName) == 7);
}

TEST_CASE("a path is made of every kind of string without a cast, and becomes a wide one") {
    static_assert(std::is_convertible<std::wstring, File::Path>::value, "");
    static_assert(std::is_convertible<wchar_t const*, File::Path>::value, "");
    static_assert(std::is_convertible<std::string, File::Path>::value, "");
    static_assert(std::is_convertible<char const*, File::Path>::value, "");
    static_assert(std::is_convertible<File::Path, std::wstring>::value, "");

    auto const text = [](File::Path const& path) -> std::wstring { return path; };
    CHECK(text(L"/a/b") == L"/a/b");
    CHECK(text("/a/b") == L"/a/b");
    CHECK(text(std::wstring(L"/a/b")) == L"/a/b");
    CHECK(text(std::string("/a/b")) == L"/a/b");
}

TEST_CASE("a default path has three empty parts") {
    File::Path const path;
    CHECK(path.getVolume() == L"");
    CHECK(path.getDirectory() == L"");
    CHECK(path.getName() == L"");
    CHECK(std::wstring(path) == L"");
}

TEST_CASE("an absolute path is split at its last slash, slashes made one, nothing resolved") {
    struct {
        std::wstring text;
        wchar_t const *directory, *name;
    } const rows[] = {
        {L"/etc/app/app.ini", L"/etc/app/", L"app.ini"},
        {L"//etc///app//x.log", L"/etc/app/", L"x.log"},
        {L"/etc/app/", L"/etc/app/", L""},
        {L"/etc/app///", L"/etc/app/", L""},
        {L"/a/./b/../c.txt", L"/a/./b/../", L"c.txt"},
        {L"/a/b", L"/a/", L"b"},
        {L"/a/", L"/a/", L""},
        {L"/./x", L"/./", L"x"},
        {L"/../x", L"/../", L"x"},
        {L"/a/.", L"/a/", L"."},
        {L"/a/..", L"/a/", L".."},
        {L"/a\\b\\c.txt", L"/a/b/", L"c.txt"},
        {L"/a/b\\", L"/a/b/", L""},
        {L"/a\\\\/\\b", L"/a/", L"b"},
        {L"/\\a\\b", L"/a/", L"b"},
        {L"/C:/x.txt", L"/C:/", L"x.txt"},
        {L"/a:b/c:d", L"/a:b/", L"c:d"},
        {L"/ a b / c.txt ", L"/ a b /", L" c.txt "},
        {L"/a\n/b\t", L"/a\n/", L"b\t"},
        {L"/~/x", L"/~/", L"x"},
        {L"/Mixed/CASE.Txt", L"/Mixed/", L"CASE.Txt"},
        {L"/\u00FC/\u20AC\U0001F600", L"/\u00FC/", L"\u20AC\U0001F600"},
        {std::wstring(L"/a/b\0c", 6), L"/a/", L"b"},
        {std::wstring(L"/a/b\0/c/d", 9), L"/a/", L"b"},
        {std::wstring(L"/a/\0b", 5), L"/a/", L""},
    };
    for (auto const& row : rows) {
        std::string const text = Koru::make_string(row.text);
        CAPTURE(text);
        File::Path const path(row.text);
        CHECK(path.getVolume() == L"");
        CHECK(path.getDirectory() == row.directory);
        CHECK(path.getName() == row.name);
        CHECK(std::wstring(path) == std::wstring(row.directory) + row.name);

        File::Path const again{std::wstring(path)};
        CHECK(again.getDirectory() == row.directory);
        CHECK(again.getName() == row.name);
    }
}

namespace {

/// Every text of up to so many characters out of some.
std::vector<std::wstring> texts(std::wstring const& characters, std::size_t longest) {
    std::vector<std::wstring> all{L""};
    for (std::size_t i = 0; i < all.size() && all[i].size() < longest; ++i) {
        for (wchar_t const c : characters) all.push_back(all[i] + c);
    }
    return all;
}

/// Directory and name of an absolute path by the plain rule: every segment before a separator that
/// is not empty, and what comes after the last separator.
struct Split {
    explicit Split(std::wstring const& text) {
        for (wchar_t const c : text) {
            name += c;
            if (c != L'/' && c != L'\\') continue;
            name.pop_back();
            if (!name.empty()) directory += name + L"/";
            name.clear();
        }
    }
    std::wstring directory = L"/";
    std::wstring name;
};

} // namespace

TEST_CASE("every short absolute path is split as the plain rule says") {
    for (std::wstring const& text : texts(L"/\\a.", 6)) {
        std::string const narrow = "/" + Koru::make_string(text);
        CAPTURE(narrow);
        Split const split(L"/" + text);
        if (split.directory == L"/") {
            CHECK(complaintAbout(L"/" + text) == UNDETERMINED);
            continue;
        }
        File::Path const path(L"/" + text);
        CHECK(path.getDirectory() == split.directory);
        CHECK(path.getName() == split.name);
    }
}

TEST_CASE("a path without a directory below the root cannot be represented") {
    for (std::wstring const& text :
         {std::wstring(L"/x.txt"), std::wstring(L"/"), std::wstring(L"//"), std::wstring(L"///x"),
          std::wstring(L"/\\"), std::wstring(L"/\\x"), std::wstring(L"/."), std::wstring(L"/.."),
          std::wstring(L"/x\0/y", 5), std::wstring(L"/\0a/b", 5)}) {
        std::string const narrow = Koru::make_string(text);
        CAPTURE(narrow);
        CHECK(complaintAbout(text) == UNDETERMINED);
        CHECK(complaintAbout(text.c_str()) == UNDETERMINED);
        CHECK(complaintAbout(narrow) == UNDETERMINED);
        CHECK(complaintAbout(narrow.c_str()) == UNDETERMINED);
    }
}

TEST_CASE("null and empty strings are refused as paths") {
    CHECK(complaintAbout(static_cast<wchar_t const*>(nullptr)) == EMPTY);
    CHECK(complaintAbout(static_cast<char const*>(nullptr)) == EMPTY);
    CHECK(complaintAbout(L"") == EMPTY);
    CHECK(complaintAbout("") == EMPTY);
    CHECK(complaintAbout(std::wstring()) == EMPTY);
    CHECK(complaintAbout(std::string()) == EMPTY);
    CHECK(complaintAbout(std::wstring(L"\0/a/b", 5)) == EMPTY);
    CHECK(complaintAbout(std::string("\0/a/b", 5)) == EMPTY);
    // An overlong zero decodes to nothing.
    CHECK(complaintAbout("\xC0\x80/a/b") == EMPTY);
}

TEST_CASE("narrow paths are UTF-8, decoded as make_wstring decodes") {
    for (std::string const& text :
         {std::string("/\xC3\xBC/\xE2\x82\xAC\xF0\x9F\x98\x80.txt"), std::string("/a/b\xC3"),
          std::string("/a/\x80"
                      "bcdefg"),
          std::string("/a/b\0c", 6)}) {
        std::wstring const wide = Koru::make_wstring(text);
        CHECK(std::wstring(File::Path(text)) == wide);
        CHECK(std::wstring(File::Path(text.c_str())) == wide);
    }
    CHECK(File::Path("/\xC3\xBC/\xE2\x82\xAC").getDirectory() == L"/\u00FC/");
    CHECK(File::Path("/\xC3\xBC/\xE2\x82\xAC").getName() == L"\u20AC");
    CHECK(File::Path(std::string("/a/b\xC3")).getName() == L"b?");
}

TEST_CASE("an overlong slash splits a narrow path, as it is decoded before") {
    CHECK(File::Path("/a/b\xC0\xAF"
                     "c")
              .getDirectory() == L"/a/b/");
    CHECK(File::Path("\xC0\xAF"
                     "a/b")
              .getDirectory() == L"/a/");
}

TEST_CASE("an absolute path keeps units that are no characters") {
    std::wstring const name = {static_cast<wchar_t>(0x80000041U), static_cast<wchar_t>(0x8000002FU),
                               static_cast<wchar_t>(0xD800), static_cast<wchar_t>(0x7FFFFFFF)};
    CHECK(File::Path(L"/a/" + name).getDirectory() == L"/a/");
    CHECK(File::Path(L"/a/" + name).getName() == name);
}

TEST_CASE("an absolute path may be longer than the system takes") {
    std::wstring directory = L"/";
    for (int i = 0; i < 20000; ++i) directory += L"component/";
    File::Path const path(directory + L"name");
    CHECK(path.getDirectory() == directory);
    CHECK(path.getName() == L"name");
}

TEST_CASE("links in an absolute path stay unresolved, whether it exists or not") {
    Installation const installation;
    for (char const* name : {"bin/link/data.txt", "bin/filelink", "bin/dangling", "none/x.ini"}) {
        std::string const text = installation.dir / name;
        CHECK(textOf(File::Path(text)) == text);
    }
    // Nor is a directory told from a file: the trailing slash decides.
    CHECK(directoryOf(File::Path(installation.dir / "bin")) == installation.dir / "");
    CHECK(directoryOf(File::Path(installation.dir / "bin/")) == installation.dir / "bin/");
}

TEST_CASE("setters store their argument verbatim, getters give the stored part") {
    std::wstring const odd[] = {L"",   L"plain", L"/with/slashes/",       L"back\\slash", L"//a//",
                                L"..", L" ",     std::wstring(L"a\0b", 3)};
    File::Path path(L"/a/b");
    for (std::wstring const& text : odd) {
        path.setVolume(text);
        path.setDirectory(text + L"1");
        path.setName(text + L"2");
        CHECK(path.getVolume() == text);
        CHECK(path.getDirectory() == text + L"1");
        CHECK(path.getName() == text + L"2");
        CHECK(std::wstring(path) == text + text + L"1" + text + L"2");
    }
}

TEST_CASE("a setter changes its part only") {
    File::Path path(L"/a/b");
    path.setVolume(L"C:");
    CHECK(std::wstring(path) == L"C:/a/b");
    path.setName(L"/c/d");
    CHECK(std::wstring(path) == L"C:/a//c/d");
    CHECK(path.getDirectory() == L"/a/");
    path.setDirectory(L"");
    CHECK(std::wstring(path) == L"C:/c/d");
    CHECK(path.getName() == L"/c/d");
}

#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
TEST_CASE("a path too long for a wide string is std::bad_alloc") {
    // Where it would need more memory than there is, nothing can be told.
    if (sizeof(std::size_t) > 4) return;
    std::size_t const half = std::wstring().max_size() / 2 + 1;
    File::Path path;
    path.setDirectory(std::wstring(half, L'd'));
    path.setName(path.getDirectory());
    CHECK(test::messageOf<std::bad_alloc>([&] { static_cast<void>(std::wstring(path)); }) ==
          std::bad_alloc().what());
}
#endif

TEST_CASE("setters never add a separator") {
    File::Path path;
    path.setDirectory(L"dir");
    path.setName(L"f");
    CHECK(std::wstring(path) == L"dirf");
}

TEST_CASE("getters give references that stay valid and follow the setters") {
    File::Path path(L"/a/b");
    std::wstring const& volume = path.getVolume();
    std::wstring const& directory = path.getDirectory();
    std::wstring const& name = path.getName();
    path.setVolume(L"v");
    path.setDirectory(L"d");
    path.setName(L"n");
    CHECK(volume == L"v");
    CHECK(directory == L"d");
    CHECK(name == L"n");
    path.setName(path.getDirectory());
    CHECK(name == L"d");
    path.setName(path.getName());
    CHECK(name == L"d");
}

TEST_CASE("the parts of a path can be overridden") {
    struct Renamed : File::Path {
        std::wstring const& getName() const override { return other; }
        void setName(std::wstring const& name) override { other = name; }
        std::wstring other = L"other";
    };
    Renamed renamed;
    File::Path& path = renamed;
    CHECK(path.getName() == L"other");
    path.setName(L"another");
    CHECK(path.getName() == L"another");
    CHECK(path.getDirectory() == L"");
}

TEST_CASE("copies have all three parts, the volume too, and are independent") {
    File::Path original(L"/a/b");
    original.setVolume(L"C:");

    File::Path const copy(original);
    File::Path assigned(L"/c/d");
    CHECK(&(assigned = original) == &assigned);
    original.setVolume(L"D:");
    original.setDirectory(L"/e/");
    original.setName(L"f");

    for (File::Path const* path : {&copy, static_cast<File::Path const*>(&assigned)}) {
        CHECK(path->getVolume() == L"C:");
        CHECK(path->getDirectory() == L"/a/");
        CHECK(path->getName() == L"b");
    }
}

TEST_CASE("assigning a path without a volume empties the volume") {
    File::Path path(L"/a/b");
    path.setVolume(L"C:");
    path = L"/c/d";
    CHECK(std::wstring(path) == L"/c/d");
    CHECK(path.getVolume() == L"");
}

TEST_CASE("a path assigned to itself stays as it is") {
    File::Path path(L"/a/b");
    path.setVolume(L"C:");
    File::Path const& same = path;
    CHECK(&(path = same) == &path);
    CHECK(std::wstring(path) == L"C:/a/b");
}

TEST_CASE("a refused text leaves the path it was to be assigned to as it was") {
    File::Path path(L"/a/b");
    CHECK(test::messageOf<std::invalid_argument>([&] { path = L"/x"; }) == UNDETERMINED);
    CHECK(test::messageOf<std::invalid_argument>([&] { path = ""; }) == EMPTY);
    CHECK(std::wstring(path) == L"/a/b");
}

namespace {

/// Assigns with allocation number `before` (from 0) failing; whether there was memory enough.
template <class Source>
bool assign(File::Path& path, Source const& source, long before) {
    allocationsBeforeFailure = before;
    try {
        path = source;
        allocationsBeforeFailure = -1;
        return true;
    } catch (std::bad_alloc const&) {
        allocationsBeforeFailure = -1;
        return false;
    }
}

/// Lets each allocation of the assignment fail in turn and tells how many there are.
template <class Source>
long checkAssignment(Source const& source, File::Path const& expected) {
    for (long before = 0;; ++before) {
        CAPTURE(before);
        File::Path path(L"/a/b");
        path.setVolume(L"C:");
        bool const done = assign(path, source, before);
        bool const isNew = path.getVolume() == expected.getVolume() &&
                           path.getDirectory() == expected.getDirectory() &&
                           path.getName() == expected.getName();
        CHECK(isNew == done);
        if (done) return before;
        CHECK(path.getVolume() == L"C:");
        CHECK(path.getDirectory() == L"/a/");
        CHECK(path.getName() == L"b");
    }
}

} // namespace

TEST_CASE("when memory runs out, a path that is assigned to keeps all of its parts") {
    std::wstring const text = L"/" + std::wstring(100, L'd') + L"/" + std::wstring(100, L'n');
    std::string const narrow = Koru::make_string(text);
    File::Path const path(text);
    CHECK(checkAssignment(text, path) >= 2);
    CHECK(checkAssignment(text.c_str(), path) >= 2);
    CHECK(checkAssignment(narrow, path) >= 2);
    CHECK(checkAssignment(narrow.c_str(), path) >= 2);
    File::Path withVolume(text);
    withVolume.setVolume(std::wstring(100, L'v'));
    CHECK(checkAssignment(withVolume, withVolume) == 3);
    std::wstring const relative = std::wstring(100, L'r') + L"/x.ini";
    CHECK(checkAssignment(relative, File::Path(relative)) >= 2);
}

TEST_CASE("a path is written to a stream as the low bytes of its characters") {
    File::Path path(L"/gr\u00FC\u00DF/\u20AC\U0001F641.txt");
    std::ostringstream os;
    CHECK(&(os << path) == &os);
    CHECK(os.str() == "/gr\xFC\xDF/\xAC"
                      "A.txt");

    path.setVolume(std::wstring(L"C\0:", 3));
    os.str("");
    os << path << '|' << 1;
    CHECK(os.str() == std::string("C\0:", 3) + "/gr\xFC\xDF/\xAC"
                                               "A.txt|1");

    os.str("");
    os << File::Path();
    CHECK(os.str() == "");
}

TEST_CASE("paths are equal when their texts are, without regard to case") {
    auto const made = [](wchar_t const* volume, std::wstring const& directory,
                         std::wstring const& name) {
        File::Path path;
        path.setVolume(volume);
        path.setDirectory(directory);
        path.setName(name);
        return path;
    };
    struct {
        char const* label;
        File::Path a, b;
        bool equal;
    } const rows[] = {
        {"the same", L"/a/b.txt", L"/a/b.txt", true},
        {"another case", L"/A/B.TXT", L"/a/b.txt", true},
        {"another name", L"/a/b.txt", L"/a/c.txt", false},
        {"another directory", L"/a/b.txt", L"/c/b.txt", false},
        {"a beginning", L"/a/b.txt", L"/a/b.tx", false},
        {"a directory", L"/a/b", L"/a/b/", false},
        {"other slashes", L"/a/b.txt", L"//a\\b.txt", true},
        {"unresolved", L"/a/./b.txt", L"/a/b.txt", false},
        {"default paths", File::Path(), File::Path(), true},
        {"a default path", File::Path(), L"/a/b", false},
        {"split elsewhere", made(L"", L"/a/", L"b"), made(L"/", L"a", L"/b"), true},
        {"a volume", made(L"C:", L"/a/", L"b"), L"/a/b", false},
        {"a volume's case", made(L"C:", L"/a/", L"b"), made(L"c:", L"/A/", L"B"), true},
        {"up to a NUL", made(L"", std::wstring(L"/a/\0x", 5), L"b"),
         made(L"", L"/A/", std::wstring(L"\0y", 2)), true},
    };
    for (auto const& row : rows) {
        CAPTURE(row.label);
        CHECK((row.a == row.b) == row.equal);
        CHECK((row.b == row.a) == row.equal);
        CHECK((row.a != row.b) == !row.equal);
        CHECK((row.b != row.a) == !row.equal);
        CHECK((row.a == row.a));
        CHECK(!(row.a != row.a));
    }
    CHECK((File::Path(L"/a/b") == L"/A/B"));
    CHECK(("/A/B" == File::Path(L"/a/b")));
    CHECK((File::Path(L"/a/b") != std::string("/a/c")));
}

TEST_CASE("paths of any parts are equal when compare finds their texts equal") {
    std::vector<File::Path> paths;
    std::vector<std::wstring> const parts = texts(std::wstring(L"aA\0", 3), 1);
    for (std::wstring const& volume : parts) {
        for (std::wstring const& directory : texts(std::wstring(L"aB\0", 3), 2)) {
            for (std::wstring const& name : parts) {
                paths.emplace_back();
                paths.back().setVolume(volume);
                paths.back().setDirectory(directory);
                paths.back().setName(name);
            }
        }
    }
    std::size_t wrong = 0;
    for (File::Path const& a : paths) {
        for (File::Path const& b : paths) {
            bool const equal = Koru::compare(std::wstring(a), std::wstring(b)) == 0;
            if ((a == b) != equal || (a != b) == equal) ++wrong;
        }
    }
    CHECK(wrong == 0);
}

TEST_CASE("equality takes the parts that a path converts to, not what overrides give") {
    struct Renamed : File::Path {
        using File::Path::Path;
        std::wstring const& getName() const override { return other; }
        std::wstring other = L"other";
    };
    Renamed const renamed(L"/a/b");
    CHECK((renamed == File::Path(L"/a/b")));
    CHECK((renamed != File::Path(L"/a/other")));
}

TEST_CASE("a relative path is joined to the executable's directory and resolved") {
    Installation const installation;
    check(installation, {{L"conf/app.ini", "/bin/conf/", "app.ini"},
                         {L"file.txt", "/bin/", "file.txt"},
                         {L"./conf/../conf//app.ini", "/bin/conf/", "app.ini"},
                         {L"link/data.txt", "/shared/", "data.txt"},
                         {L"filelink", "/shared/", "data.txt"},
                         {L"../shared/data.txt", "/shared/", "data.txt"},
                         {L"link/../elsewhere/conf/app.ini", "/elsewhere/conf/", "app.ini"}});
}

TEST_CASE("a relative path to an existing directory names it without its slash") {
    Installation const installation;
    check(installation, {{L"conf", "/bin/", "conf"},
                         {L"conf/", "/bin/", "conf"},
                         {L"conf/.", "/bin/", "conf"},
                         {L"conf/..", "/", "bin"},
                         {L".", "/", "bin"},
                         {L"./", "/", "bin"},
                         {L"link", "/", "shared"},
                         {L"link/", "/", "shared"}});
    std::filesystem::path const root = installation.dir.path();
    Strings const parent{root.parent_path().string() + "/", root.filename().string()};
    CHECK(installation.parsed(L"..") == parent);
    CHECK(installation.parsed(L"link/..") == parent);
}

TEST_CASE("of a relative path what exists is resolved and the rest is appended") {
    Installation const installation;
    check(installation,
          {{L"new.ini", "/bin/", "new.ini"},
           {L"./new.ini", "/bin/", "new.ini"},
           {L"conf/new.ini", "/bin/conf/", "new.ini"},
           {L"link/new.ini", "/shared/", "new.ini"},
           {L"link/../new.ini", "/", "new.ini"},
           {L"sub/../new.ini", "/bin/", "new.ini"},
           {L"../new.ini", "/", "new.ini"},
           {L"new/sub/deep/x.ini", "/bin/new/sub/deep/", "x.ini"},
           {L"link/new/sub/x.ini", "/shared/new/sub/", "x.ini"},
           {L"../new/x.ini", "/new/", "x.ini"},
           {L"new/", "/bin/new/", ""},
           {L"link/new/", "/shared/new/", ""},
           {L"new//sub///x.ini", "/bin/new/sub/", "x.ini"},
           {L"~/x.ini", "/bin/~/", "x.ini"},
           {L" a b / x .ini ", "/bin/ a b /", " x .ini "},
           {L"C:/x.ini", "/bin/C:/", "x.ini"},
           {L"\u00FC/\u20AC\U0001F600", "/bin/\xC3\xBC/", "\xE2\x82\xAC\xF0\x9F\x98\x80"}});
}

TEST_CASE("the missing part of a relative path is appended verbatim") {
    Installation const installation;
    check(installation, {{L"new/../x.ini", "/bin/new/../", "x.ini"},
                         {L"new/./x.ini", "/bin/new/./", "x.ini"},
                         {L"new/..", "/bin/new/", ".."},
                         {L"new/.", "/bin/new/", "."},
                         {L"link/new/../data.txt", "/shared/new/../", "data.txt"},
                         {L"new/../conf/app.ini", "/bin/new/../conf/", "app.ini"}});
}

TEST_CASE("a relative path through a dangling link is the path that the link leads to") {
    Installation const installation;
    auto const link = [&](char const* target, char const* name) {
        std::filesystem::create_symlink(target, installation.dir / name);
    };
    link("dangling", "bin/again");
    link("again", "bin/and-again");
    link("sub/new.ini", "shared/to-new");
    link("none/at/all.ini", "bin/far");
    link("../none//", "bin/slashes");
    link("conf/../new.ini", "bin/around");
    link("file.txt/new.ini", "bin/below-file");
    link((installation.dir / "else/new.ini").c_str(), "bin/absolute");
    check(installation, {{L"dangling", "/bin/", "nowhere"},
                         {L"dangling/x.ini", "/bin/nowhere/", "x.ini"},
                         {L"dangling/../x.ini", "/bin/nowhere/../", "x.ini"},
                         {L"link/../bin/dangling/", "/bin/nowhere/", ""},
                         {L"again", "/bin/", "nowhere"},
                         {L"and-again", "/bin/", "nowhere"},
                         {L"and-again/sub/x.ini", "/bin/nowhere/sub/", "x.ini"},
                         {L"link/to-new", "/shared/sub/", "new.ini"},
                         {L"../shared/to-new", "/shared/sub/", "new.ini"},
                         {L"far", "/bin/none/at/", "all.ini"},
                         {L"far/x.ini", "/bin/none/at/all.ini/", "x.ini"},
                         {L"slashes", "/none/", ""},
                         {L"slashes/x.ini", "/none/", "x.ini"},
                         {L"around", "/bin/", "new.ini"},
                         {L"below-file", "/bin/file.txt/", "new.ini"},
                         {L"absolute", "/else/", "new.ini"},
                         {L"absolute/x.ini", "/else/new.ini/", "x.ini"},
                         {L"dangling/dangling", "/bin/nowhere/", "dangling"}});
}

TEST_CASE("links that lead back to themselves stay in a relative path") {
    Installation const installation;
    std::filesystem::create_symlink("ring2", installation.dir / "bin/ring1");
    std::filesystem::create_symlink("ring1", installation.dir / "bin/ring2");
    std::filesystem::create_symlink("loop", installation.dir / "bin/to-loop");
    std::filesystem::create_symlink("longer/x", installation.dir / "bin/longer");
    check(installation, {{L"loop", "/bin/", "loop"},
                         {L"loop/x.ini", "/bin/loop/", "x.ini"},
                         {L"ring1/x.ini", "/bin/ring1/", "x.ini"},
                         {L"conf/../ring2/x.ini", "/bin/ring2/", "x.ini"},
                         {L"conf/../to-loop/x.ini", "/bin/to-loop/", "x.ini"},
                         {L"longer", "/bin/", "longer"}});
}

TEST_CASE("a chain of links is followed as far as the system does it") {
    Installation const installation;
    for (int i = 1; i <= 50; ++i) {
        std::string const target = i == 1 ? "nowhere" : "chain" + std::to_string(i - 1);
        std::filesystem::create_symlink(target,
                                        installation.dir / ("bin/chain" + std::to_string(i)));
    }
    check(installation, {{L"chain1/x.ini", "/bin/nowhere/", "x.ini"},
                         {L"chain40", "/bin/", "nowhere"},
                         {L"conf/../chain40/x.ini", "/bin/nowhere/", "x.ini"},
                         {L"chain50/x.ini", "/bin/chain50/", "x.ini"}});
}

TEST_CASE("a file is created where a dangling link leads to") {
    Installation const installation;
    CHECK(test::ask(installation.program, installation.program, "/", "create", {"dangling"}) ==
          Strings{installation.dir / "bin/nowhere"});
    CHECK(test::readFile(installation.dir / "bin/nowhere") == "here");
    CHECK(std::filesystem::is_symlink(installation.dir / "bin/dangling"));
}

TEST_CASE("a relative path is refused when neither executable nor working directory can be told") {
    Installation const installation;
    std::string const gone = installation.dir / "gone";
    Strings const refused{"invalid_argument", UNDETERMINED};
    for (char const* argv0 : {"", "prog", "./prog", "../bin/prog"}) {
        for (wchar_t const* text :
             {L"x.ini", L"conf/app.ini", L"../bin/conf/app.ini", L".", L"\\"}) {
            std::filesystem::create_directory(gone);
            std::string const narrow = Koru::make_string(text);
            CAPTURE(argv0);
            CAPTURE(narrow);
            CHECK(test::ask(installation.program, argv0, gone, "parse",
                            {"RMDIR=" + gone, toHex(text)}) == refused);
            std::filesystem::create_directory(gone);
            CHECK(test::ask(installation.program, argv0, gone, "parse",
                            {"RMDIR=" + gone, "WITHOUT_FILES", toHex(text)}) == refused);
        }
    }
}

TEST_CASE("one of executable and working directory is enough for a relative path") {
    Installation const installation;
    std::string const gone = installation.dir / "gone";
    std::filesystem::create_directory(gone);
    CHECK(test::ask(installation.program, installation.program, gone, "parse",
                    {"RMDIR=" + gone, toHex(L"conf/app.ini"), toHex(L"new.ini"),
                     toHex(L"/a/b.ini")}) == Strings{installation.dir / "bin/conf/", "app.ini",
                                                     installation.dir / "bin/", "new.ini", "/a/",
                                                     "b.ini"});
    CHECK(test::ask(installation.program, installation.program, installation.dir / "elsewhere",
                    "parse", {"WITHOUT_FILES", toHex(L"conf/app.ini"), toHex(L"new/x.ini")}) ==
          Strings{installation.dir / "elsewhere/conf/", "app.ini",
                  installation.dir / "elsewhere/new/", "x.ini"});
}

TEST_CASE("what lies below a file counts as missing") {
    Installation const installation;
    check(installation, {{L"file.txt/x.ini", "/bin/file.txt/", "x.ini"},
                         {L"file.txt/new/x.ini", "/bin/file.txt/new/", "x.ini"},
                         {L"file.txt/", "/bin/file.txt/", ""},
                         {L"file.txt/../x.ini", "/bin/file.txt/../", "x.ini"},
                         {L"filelink/x.ini", "/shared/data.txt/", "x.ini"},
                         {L"filelink/", "/shared/data.txt/", ""}});
}

TEST_CASE("a name too long for the file system counts as missing") {
    Installation const installation;
    std::string const name(300, 'n');
    check(installation, {{std::wstring(300, L'n'), "/bin/", name.c_str()},
                         {L"link/" + std::wstring(300, L'n') + L"/x.ini",
                          ("/shared/" + name + "/").c_str(), "x.ini"}});
}

TEST_CASE("a path that begins with a backslash is relative") {
    Installation const installation;
    check(installation, {{L"\\\\srv\\share\\f.txt", "/bin/srv/share/", "f.txt"},
                         {L"\\\\srv\\\\share\\\\f.txt", "/bin/srv/share/", "f.txt"},
                         {L"\\f.txt", "/bin/", "f.txt"},
                         {L"\\", "/bin/", ""},
                         {L"\\etc/passwd", "/bin/etc/", "passwd"},
                         {L"C:\\x\\y.ini", "/bin/C:/x/", "y.ini"}});
}

TEST_CASE("backslashes are rewritten after a relative path is resolved") {
    Installation const installation;
    check(installation, {{L"conf\\app.ini", "/bin/conf/", "app.ini"},
                         {L"link\\data.txt", "/bin/link/", "data.txt"},
                         {L"conf\\..\\app.ini", "/bin/conf/../", "app.ini"},
                         {L"link/new\\x.ini", "/shared/new/", "x.ini"},
                         {L"back\\slash", "/bin/back/", "slash"},
                         {L"back\\link", "/shared/", "data.txt"},
                         {L"conf\\", "/bin/conf/", ""}});
}

TEST_CASE("a backslash in the executable's directory becomes a slash as well") {
    Installation const installation;
    std::filesystem::create_directories(installation.dir / "o\\dd");
    std::string const program = installation.dir / "o\\dd/prog";
    test::copyOwnExecutable(program);
    CHECK(test::ask(program, program, "/", "parse", {toHex(L"x.ini")}) ==
          Strings{installation.dir / "o/dd/", "x.ini"});
}

TEST_CASE("a relative path ends at its first NUL") {
    Installation const installation;
    check(installation, {{std::wstring(L"conf\0/app.ini", 13), "/bin/", "conf"},
                         {std::wstring(L"new/\0x.ini", 10), "/bin/new/", ""},
                         {std::wstring(L"x.ini\0", 6), "/bin/", "x.ini"}});
    CHECK(installation.parsed(std::wstring(L"\0conf", 5)) == Strings{"invalid_argument", EMPTY});
}

TEST_CASE("a relative path takes the way through UTF-8, in which odd units are bytes") {
    Installation const installation;
    wchar_t const letter = static_cast<wchar_t>(0x80000041U);
    wchar_t const slash = static_cast<wchar_t>(0x8000002FU);
    wchar_t const backslash = static_cast<wchar_t>(0x8000005CU);
    wchar_t const zero = static_cast<wchar_t>(0x80000000U);
    check(installation, {{{letter}, "/bin/", "A"},
                         {std::wstring(L"link") + slash + L"data.txt", "/shared/", "data.txt"},
                         {{slash, L'x'}, "/bin/", "x"},
                         {std::wstring(L"conf") + backslash + L"x", "/bin/conf/", "x"},
                         {std::wstring(L"new") + zero + L"er", "/bin/", "new"},
                         {{zero}, "/", "bin"},
                         {{static_cast<wchar_t>(0x7FFFFFFF)}, "/bin/", "\xFD\xBF\xBF\xBF\xBF\xBF"},
                         {{static_cast<wchar_t>(0xD800)}, "/bin/", "\xED\xA0\x80"}});
}

TEST_CASE("a relative path is refused when nothing but the root remains") {
    // The executable's directory is the root where its name cannot be resolved beyond it.
    Installation const installation;
    auto const parsed = [&](wchar_t const* text) {
        return test::ask(installation.program, "/koru-none", installation.dir.path(), "parse",
                         {toHex(text)});
    };
    CHECK(parsed(L"x.ini") == Strings{"invalid_argument", UNDETERMINED});
    CHECK(parsed(L".") == Strings{"invalid_argument", UNDETERMINED});
    CHECK(parsed(L"koru-none-either/x.ini") == Strings{"/koru-none-either/", "x.ini"});
}

TEST_CASE("every short relative path gives what resolving it piece by piece gives") {
    Installation const installation;
    Strings const answers = test::ask(
        installation.program, installation.program, installation.dir / "elsewhere", "compareAll",
        {"conf", "link", "filelink", "dangling", "new", "..", ".", "", "back\\slash"});
    REQUIRE(!answers.empty());
    // All but those that begin with the empty component.
    CHECK(answers[0] == std::to_string(8 + 8 * 9 + 8 * 9 * 9 + 8 * 9 * 9 * 9));
    CHECK(answers.size() == 1);
    for (std::size_t i = 1; i < answers.size() && i < 10; ++i) MESSAGE(answers[i]);
}

TEST_CASE("any number of components may be missing") {
    Installation const installation;
    auto const parsed = [&](char const* start, std::size_t count) {
        return test::ask(installation.program, installation.program, "/", "parseLong",
                         {start, std::to_string(count)});
    };
    auto const expected = [&](char const* start, std::size_t count) {
        std::string directory = installation.dir / start;
        for (std::size_t i = 0; i < count; ++i) directory += "m/";
        return Strings{directory, "x.ini"};
    };
    CHECK((parsed("", 20000) == expected("bin/", 20000)));
    CHECK((parsed("link/", 20000) == expected("shared/", 20000)));
    CHECK((parsed("filelink/", 20000) == expected("shared/data.txt/", 20000)));
    CHECK((parsed("conf/../dangling/", 20000) == expected("bin/nowhere/", 20000)));

    // About a second's work; if each component cost a look at all of them, it would be hours.
    auto const begin = std::chrono::steady_clock::now();
    CHECK((parsed("link/", 1000000) == expected("shared/", 1000000)));
    CHECK(std::chrono::steady_clock::now() - begin < std::chrono::seconds(60));
}

TEST_CASE("a relative path does not depend on the working directory") {
    Installation const installation;
    for (std::string const& directory : {installation.dir / "elsewhere", installation.dir / "bin",
                                         installation.dir / "bin/conf", std::string("/")}) {
        CAPTURE(directory);
        CHECK(test::ask(installation.program, installation.program, directory, "parse",
                        {toHex(L"conf/app.ini"), toHex(L"new.ini"),
                         "CHDIR=" + (installation.dir / "elsewhere"), toHex(L"conf/app.ini")}) ==
              Strings{installation.dir / "bin/conf/", "app.ini", installation.dir / "bin/",
                      "new.ini", installation.dir / "bin/conf/", "app.ini"});
    }
}

TEST_CASE("the executable's directory is the one its links lead to") {
    Installation const installation;
    std::filesystem::create_directories(installation.dir / "links");
    std::filesystem::create_symlink("../bin/prog", installation.dir / "links/prog");
    std::filesystem::create_directory_symlink("../bin", installation.dir / "links/bin");
    for (char const* name : {"links/prog", "links/bin/prog"}) {
        CAPTURE(name);
        std::string const program = installation.dir / name;
        CHECK(test::ask(program, program, "/", "parse", {toHex(L"conf/app.ini"), toHex(L"x/y")}) ==
              Strings{installation.dir / "bin/conf/", "app.ini", installation.dir / "bin/x/", "y"});
    }
}

TEST_CASE("a program started as ./prog finds its files until it changes its directory") {
    Installation const installation;
    CHECK(test::ask(installation.program, "./prog", installation.dir / "bin", "parse",
                    {toHex(L"link/data.txt"), "CHDIR=" + (installation.dir / "elsewhere"),
                     toHex(L"conf/app.ini"), toHex(L"link/data.txt")}) ==
          Strings{installation.dir / "shared/", "data.txt", installation.dir / "elsewhere/conf/",
                  "app.ini", installation.dir / "elsewhere/link/", "data.txt"});
}

TEST_CASE("a program below a directory with a blank looks beside that directory") {
    Installation const installation;
    std::filesystem::create_directories(installation.dir / "my apps/bin/conf");
    std::string const program = installation.dir / "my apps/bin/prog";
    test::copyOwnExecutable(program);
    CHECK(test::ask(program, program, "/", "parse", {toHex(L"conf/app.ini")}) ==
          Strings{installation.dir / "conf/", "app.ini"});
}

TEST_CASE("a program in a directory with other characters than ASCII finds its files") {
    Installation const installation;
    std::string const directory = installation.dir / "\xC3\xBC\xE2\x82\xAC\xF0\x9F\x98\x80";
    std::filesystem::create_directories(directory);
    test::copyOwnExecutable(directory + "/prog");
    std::filesystem::create_symlink("../shared", directory + "/\xC3\x9F");
    CHECK(test::ask(directory + "/prog", directory + "/prog", "/", "parse",
                    {toHex(L"new/x.ini"), toHex(L"\u00DF/data.txt")}) ==
          Strings{directory + "/new/", "x.ini", installation.dir / "shared/", "data.txt"});
}

TEST_CASE("a program without a name of its own resolves against the working directory") {
    Installation const installation;
    CHECK(test::ask(installation.program, "", installation.dir / "elsewhere", "parse",
                    {toHex(L"conf/app.ini"), toHex(L"../shared/data.txt"), toHex(L"new.ini"),
                     toHex(L"conf/new/x.ini"), toHex(L"new/x.ini")}) ==
          Strings{installation.dir / "elsewhere/conf/", "app.ini",   //
                  installation.dir / "shared/", "data.txt",          //
                  installation.dir / "elsewhere/", "new.ini",        //
                  installation.dir / "elsewhere/conf/new/", "x.ini", //
                  installation.dir / "elsewhere/new/", "x.ini"});
}

TEST_CASE("a program under a false name looks in that name's directory") {
    Installation const installation;
    auto const parsed = [&](std::string const& argv0) {
        return test::ask(installation.program, argv0, "/", "parse", {toHex(L"conf/app.ini")});
    };
    CHECK(parsed(installation.dir / "elsewhere/none") ==
          Strings{installation.dir / "elsewhere/conf/", "app.ini"});
    CHECK(parsed(installation.dir / "elsewhere/conf/app.ini") ==
          Strings{installation.dir / "elsewhere/conf/conf/", "app.ini"});
    // Of what is missing in it, the first component counts as the executable.
    CHECK(parsed(installation.dir / "none/at/all") ==
          Strings{installation.dir / "conf/", "app.ini"});
}

TEST_CASE("a file of a relative path is created beside the executable") {
    Installation const installation;
    CHECK(test::ask(installation.program, installation.program, installation.dir / "elsewhere",
                    "create",
                    {"conf/fresh.ini"}) == Strings{installation.dir / "bin/conf/fresh.ini"});
    CHECK(test::readFile(installation.dir / "bin/conf/fresh.ini") == "here");
    CHECK(!std::filesystem::exists(installation.dir / "elsewhere/conf/fresh.ini"));
}

TEST_CASE("in the running test a relative path is joined to the test's own directory") {
    std::wstring const executable = Koru::System::getProcessFileName();
    std::wstring const directory = executable.substr(0, executable.rfind(L'/') + 1);
    CHECK(std::wstring(File::Path(L"koru-none/x.ini")) == directory + L"koru-none/x.ini");
    CHECK(std::wstring(File::Path("koru-none/x.ini")) == directory + L"koru-none/x.ini");
    CHECK(std::wstring(File::Path(std::string("koru-none"))) == directory + L"koru-none");
    CHECK(std::wstring(File::Path(std::wstring(L"koru-none/"))) == directory + L"koru-none/");
}
