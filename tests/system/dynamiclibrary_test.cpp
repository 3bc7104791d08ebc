// Loading libraries. The libraries are built beside this executable and report when they come and
// go; the loader's own functions are watched on their way.
#include <koru/dynamiclibrary.h>
#include <koru/string.h>

#include <dlfcn.h>
#include <link.h>
#include <stdlib.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstring>
#include <filesystem>
#include <memory>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include <doctest/doctest.h>

#include "support/subprocess.h"
#include "support/tempdir.h"

namespace {

/// What the loader is asked for while an object of this kind exists, and whether it refuses.
class LoaderCalls {
public:
    LoaderCalls() { current = this; }
    LoaderCalls(LoaderCalls const&) = delete;
    LoaderCalls& operator=(LoaderCalls const&) = delete;
    ~LoaderCalls() { current = nullptr; }

    bool refusesToOpen = false;
    bool failsToClose = false;
    std::vector<std::string> opened; ///< names
    std::vector<int> flags;
    std::vector<void*> handles; ///< that were given out
    std::vector<void*> closed;
    std::string sequence; ///< "o" for a successful open, "x" for a failed one, "c" for a close

    /// Whether every handle was given back, once.
    bool balanced() const {
        std::vector<void*> open = handles;
        for (void* const handle : closed) {
            auto const at = std::find(open.begin(), open.end(), handle);
            if (at == open.end()) return false;
            open.erase(at);
        }
        return open.empty();
    }

    static LoaderCalls* current;
};
LoaderCalls* LoaderCalls::current = nullptr;

template <class Function>
Function* next(char const* name) {
    return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

} // namespace

// Stand before the loader's functions and pass on to them.
extern "C" void* dlopen(char const* name, int flags) noexcept {
    static auto* const real = next<void*(char const*, int)>("dlopen");
    LoaderCalls* const calls = LoaderCalls::current;
    if (calls == nullptr) return real(name, flags);
    calls->opened.push_back(name == nullptr ? "<null>" : name);
    calls->flags.push_back(flags);
    void* const handle = calls->refusesToOpen ? nullptr : real(name, flags);
    if (handle != nullptr) calls->handles.push_back(handle);
    calls->sequence += handle != nullptr ? 'o' : 'x';
    return handle;
}

extern "C" int dlclose(void* handle) noexcept {
    static auto* const real = next<int(void*)>("dlclose");
    LoaderCalls* const calls = LoaderCalls::current;
    if (calls == nullptr) return real(handle);
    calls->closed.push_back(handle);
    calls->sequence += 'c';
    int const result = real(handle);
    return calls->failsToClose ? -1 : result;
}

namespace {

using Names = std::vector<std::string>;
using Koru::DynamicLibrary;

std::wstring const FIRST = Koru::make_wstring(KORU_TEST_LOADABLE_1);
std::wstring const SECOND = Koru::make_wstring(KORU_TEST_LOADABLE_2);
std::wstring const MISSING = L"/nonexistent/libmissing.so";

int numberOf(DynamicLibrary const& library) {
    void* const symbol = library.getSymbol(L"koru_loadable_number");
    return symbol == nullptr ? -1 : reinterpret_cast<int (*)()>(symbol)();
}

/// How many of the objects mapped into the process have this name at the end of theirs.
int mapped(std::string const& name) {
    std::pair<std::string, int> search(name, 0);
    ::dl_iterate_phdr(
        [](dl_phdr_info* info, std::size_t, void* data) {
            auto& found = *static_cast<std::pair<std::string, int>*>(data);
            std::string const object = info->dlpi_name;
            std::string const& end = found.first;
            if (object.size() >= end.size() &&
                object.compare(object.size() - end.size(), end.size(), end) == 0) {
                ++found.second;
            }
            return 0;
        },
        &search);
    return search.second;
}

bool isMapped(int number) {
    return mapped(number == 1 ? KORU_TEST_LOADABLE_1 : KORU_TEST_LOADABLE_2) > 0;
}

/// Where the libraries report, for a scope.
class LoadReport {
public:
    LoadReport() { ::setenv("KORU_LOADABLE_REPORT", (directory_ / "report").c_str(), 1); }
    LoadReport(LoadReport const&) = delete;
    LoadReport& operator=(LoadReport const&) = delete;
    ~LoadReport() { ::unsetenv("KORU_LOADABLE_REPORT"); }

    std::string text() const {
        std::string const path = directory_ / "report";
        return std::filesystem::exists(path) ? test::readFile(path) : "";
    }

private:
    test::TempDir directory_;
};

/// Counts the calls of its overrides, which may pass on or not.
class Watched : public DynamicLibrary {
public:
    explicit Watched(std::wstring const& name) : DynamicLibrary(name) {}
    explicit Watched(DynamicLibrary const& other) : DynamicLibrary(other) {}
    Watched(Watched const&) = default;
    Watched& operator=(Watched const&) = default;
    ~Watched() override = default;

    bool load() override {
        calls += 'l';
        return passesOn && DynamicLibrary::load();
    }
    bool unload() override {
        calls += 'u';
        return passesOn && DynamicLibrary::unload();
    }

    static std::string calls;
    bool passesOn = true;
};
std::string Watched::calls;

/// An object's virtual table, and a function in it called.
void* const* tableOf(DynamicLibrary const& library) {
    void* const* table = nullptr;
    std::memcpy(&table, static_cast<void const*>(&library), sizeof table);
    return table;
}
bool callSlot(DynamicLibrary& library, int slot) {
    return reinterpret_cast<bool (*)(DynamicLibrary*)>(tableOf(library)[slot])(&library);
}

/// A loader error that stays to be fetched until the loader is called again.
void leaveLoaderError() {
    static_cast<void>(::dlerror());
    REQUIRE(::dlopen("/nonexistent/left-behind.so", RTLD_LAZY) == nullptr);
}
bool loaderErrorIsLeft() {
    char const* const error = ::dlerror();
    return error != nullptr && std::strstr(error, "left-behind") != nullptr;
}

} // namespace

// ========================================================================================= shape

TEST_CASE("a library object holds a name and a handle besides its virtual table") {
    struct Members {
        void* virtualTable;
        std::wstring fileName;
        void* handle;
    };
    CHECK(sizeof(DynamicLibrary) == sizeof(Members));
    CHECK(std::has_virtual_destructor<DynamicLibrary>::value);
    CHECK(std::is_default_constructible<DynamicLibrary>::value);
    CHECK(std::is_copy_constructible<DynamicLibrary>::value);
    CHECK(std::is_copy_assignable<DynamicLibrary>::value);
}

TEST_CASE("the virtual functions are load, unload and isLoaded, behind the destructor's two") {
    LoaderCalls calls;
    DynamicLibrary library(FIRST);
    CHECK(!callSlot(library, 4));
    CHECK(callSlot(library, 2));
    CHECK(calls.sequence == "o");
    CHECK(callSlot(library, 4));
    CHECK(callSlot(library, 3));
    CHECK(calls.sequence == "oc");
    CHECK(!callSlot(library, 4));
    CHECK(calls.balanced());
}

TEST_CASE("an override is called in the place of what it overrides") {
    Watched::calls.clear();
    Watched watched(FIRST);
    DynamicLibrary& library = watched;
    CHECK(library.load());
    CHECK(callSlot(library, 3));
    CHECK(callSlot(library, 2));
    CHECK(library.unload());
    CHECK(Watched::calls == "lulu");
}

TEST_CASE("a derived object is destroyed through a pointer to its base, which unloads it") {
    LoaderCalls calls;
    Watched::calls.clear();
    std::unique_ptr<DynamicLibrary> library(new Watched(FIRST));
    CHECK(library->load());
    library.reset();
    CHECK(calls.sequence == "oc");
    CHECK(Watched::calls == "l"); // The destructor uses the class's own unload.
}

// ========================================================================================= loading

TEST_CASE("a default object has no name and nothing loaded") {
    LoaderCalls calls;
    {
        DynamicLibrary const library;
        CHECK(library.getFileName().empty());
        CHECK(!library.isLoaded());
        CHECK(library.getHandle() == nullptr);
    }
    CHECK(calls.sequence.empty());
}

TEST_CASE("a name does not load anything") {
    LoaderCalls calls;
    {
        DynamicLibrary const library(FIRST);
        bool const same = library.getFileName() == FIRST;
        CHECK(same);
        CHECK(!library.isLoaded());
        CHECK(library.getHandle() == nullptr);
    }
    CHECK(calls.sequence.empty());
}

TEST_CASE("load binds functions lazily and keeps the library's symbols to itself") {
    LoaderCalls calls;
    DynamicLibrary library(FIRST);
    CHECK(library.load());
    CHECK(library.isLoaded());
    CHECK(calls.opened == Names{KORU_TEST_LOADABLE_1});
    CHECK(calls.flags == std::vector<int>{1});
    CHECK(RTLD_LAZY == 1);
    REQUIRE(calls.handles.size() == 1);
    CHECK(library.getHandle() == calls.handles[0]);
    CHECK(::dlsym(RTLD_DEFAULT, "koru_loadable_number") == nullptr);
}

TEST_CASE("the second load of a loaded library returns true and does not open it again") {
    LoaderCalls calls;
    DynamicLibrary library(FIRST);
    CHECK(library.load());
    void* const handle = library.getHandle();
    CHECK(library.load());
    CHECK(library.load());
    CHECK(calls.sequence == "o");
    CHECK(library.getHandle() == handle);
    CHECK(library.unload());
    CHECK(calls.sequence == "oc");
    CHECK(!isMapped(1));
}

TEST_CASE("unload gives the handle back and returns true") {
    LoaderCalls calls;
    DynamicLibrary library(FIRST);
    CHECK(library.load());
    void* const handle = library.getHandle();
    CHECK(library.unload());
    CHECK(calls.closed == std::vector<void*>{handle});
    CHECK(!library.isLoaded());
    CHECK(library.getHandle() == nullptr);
    bool const same = library.getFileName() == FIRST;
    CHECK(same);
}

TEST_CASE("unload of what is not loaded returns true and gives nothing back") {
    LoaderCalls calls;
    DynamicLibrary nameless;
    DynamicLibrary never(FIRST);
    DynamicLibrary noMore(FIRST);
    CHECK(nameless.unload());
    CHECK(never.unload());
    CHECK(noMore.load());
    CHECK(noMore.unload());
    CHECK(noMore.unload());
    CHECK(calls.sequence == "oc");
}

TEST_CASE("unload returns true and leaves nothing loaded even when the loader reports a failure") {
    LoaderCalls calls;
    calls.failsToClose = true;
    {
        DynamicLibrary library(FIRST);
        CHECK(library.load());
        CHECK(library.unload());
        CHECK(!library.isLoaded());
        CHECK(library.getHandle() == nullptr);
    }
    CHECK(calls.sequence == "oc");
}

TEST_CASE("the destructor gives back what is loaded, and only that") {
    LoadReport const report;
    LoaderCalls calls;
    {
        DynamicLibrary loaded(FIRST);
        DynamicLibrary unloaded(SECOND);
        DynamicLibrary failed(MISSING);
        CHECK(loaded.load());
        CHECK(unloaded.load());
        CHECK(unloaded.unload());
        CHECK(!failed.load());
        CHECK(report.text() == "+1+2-2");
    }
    CHECK(report.text() == "+1+2-2-1");
    CHECK(calls.sequence == "oocxc");
    CHECK(calls.balanced());
}

TEST_CASE("a library may be loaded and unloaded any number of times by one object") {
    LoadReport const report;
    LoaderCalls calls;
    DynamicLibrary library(FIRST);
    for (int round = 0; round < 3; ++round) {
        CHECK(library.load());
        CHECK(numberOf(library) == 1);
        CHECK(library.unload());
    }
    CHECK(report.text() == "+1-1+1-1+1-1");
    CHECK(calls.sequence == "ocococ");
}

TEST_CASE("a failed load leaves nothing loaded and may be repeated until the file is there") {
    test::TempDir const directory;
    LoaderCalls calls;
    DynamicLibrary library(directory.wide("later.so"));
    CHECK(!library.load());
    CHECK(!library.isLoaded());
    CHECK(library.getHandle() == nullptr);
    CHECK(library.unload());
    CHECK(!library.load());
    test::writeFile(directory / "later.so", "not a library");
    CHECK(!library.load());
    std::filesystem::copy_file(KORU_TEST_LOADABLE_1, directory / "later.so",
                               std::filesystem::copy_options::overwrite_existing);
    CHECK(library.load());
    CHECK(numberOf(library) == 1);
    CHECK(library.unload());
    CHECK(calls.sequence == "xxxoc");
}

TEST_CASE("what is no library is not loaded") {
    test::TempDir const directory;
    test::writeFile(directory / "empty.so", "");
    test::writeFile(directory / "text.so", "some text\n");
    test::writeFile(directory / "cut.so", test::readFile(KORU_TEST_LOADABLE_1).substr(0, 100));
    for (char const* name : {"empty.so", "text.so", "cut.so", "absent.so", "", "absent/x.so"}) {
        CAPTURE(name);
        DynamicLibrary library(directory.wide(name));
        CHECK(!library.load());
        CHECK(!library.isLoaded());
    }
}

TEST_CASE("the loader tells why a load failed, right after it") {
    DynamicLibrary library(MISSING);
    CHECK(!library.load());
    char const* const error = ::dlerror();
    REQUIRE(error != nullptr);
    CHECK(std::string(error).find("libmissing.so") != std::string::npos);
}

TEST_CASE("a name without a slash is searched for as the loader does") {
    LoaderCalls calls;
    DynamicLibrary mathematics(L"libm.so.6");
    CHECK(mathematics.load());
    void* const symbol = mathematics.getSymbol(L"ldexp");
    REQUIRE(symbol != nullptr);
    CHECK(reinterpret_cast<double (*)(double, int)>(symbol)(0.75, 2) == 3.0);
    CHECK(calls.opened == Names{"libm.so.6"});
    CHECK(mathematics.unload());

    DynamicLibrary absent(L"libkoru-absent.so.6");
    CHECK(!absent.load());
}

TEST_CASE("a relative name counts from the working directory, not from the executable's") {
    test::TempDir const directory;
    std::filesystem::copy_file(KORU_TEST_LOADABLE_2, directory / "here.so");
    test::Outcome const outcome = test::inChild([&] {
        DynamicLibrary library(L"./here.so");
        if (library.load()) return 1;
        if (::chdir(directory.path().c_str()) != 0) return 2;
        if (!library.load()) return 3;
        return numberOf(library) == 2 ? 0 : 4;
    });
    CHECK(outcome.exitCode == 0);
}

TEST_CASE("a name beyond ASCII is given to the loader as UTF-8") {
    test::TempDir const directory;
    std::string const name = "gr\303\266\303\237e \342\202\254 \360\237\230\200.so";
    std::filesystem::copy_file(KORU_TEST_LOADABLE_2, directory / name);
    LoaderCalls calls;
    DynamicLibrary library(directory.wide("") + L"gr\u00F6\u00DFe \u20AC \U0001F600.so");
    CHECK(library.load());
    CHECK(numberOf(library) == 2);
    CHECK(calls.opened == Names{directory / name});
}

TEST_CASE("names that do not narrow cleanly come to the loader as make_string makes them") {
    LoaderCalls calls;
    calls.refusesToOpen = true;
    std::wstring const surrogate = {L'/', static_cast<wchar_t>(0xD800), L'x'};
    std::wstring const largest = {L'/', static_cast<wchar_t>(0x7FFFFFFF)};
    std::wstring const beyond = {L'/', static_cast<wchar_t>(0x80000041)};
    for (std::wstring const& name : {surrogate, largest, beyond}) {
        DynamicLibrary library(name);
        CHECK(!library.load());
    }
    CHECK(calls.opened == Names{"/\355\240\200x", "/\375\277\277\277\277\277", "/A"});
}

TEST_CASE("the loader sees a name up to its first NUL, and the object keeps the whole of it") {
    LoaderCalls calls;
    std::wstring const name = FIRST + std::wstring(1, L'\0') + L"ignored";
    DynamicLibrary library(name);
    CHECK(library.load());
    CHECK(calls.opened == Names{KORU_TEST_LOADABLE_1});
    bool const kept = library.getFileName() == name;
    CHECK(kept);
    DynamicLibrary const copy(library);
    bool const copied = copy.getFileName() == name;
    CHECK(copied);
    CHECK(copy.isLoaded());
}

TEST_CASE("an empty name is the running program for the loader, and for load") {
    LoaderCalls calls;
    DynamicLibrary program;
    CHECK(program.load());
    CHECK(program.isLoaded());
    CHECK(calls.opened == Names{""});
    CHECK(program.getSymbol(L"malloc") != nullptr);
    CHECK(program.unload());
    CHECK(calls.balanced());
}

TEST_CASE("the file name is returned as a copy") {
    DynamicLibrary const library(L"one.so");
    std::wstring name = library.getFileName();
    name += L".2";
    bool const same = library.getFileName() == L"one.so";
    CHECK(same);
}

TEST_CASE("two objects with the same name hold a handle each") {
    LoadReport const report;
    LoaderCalls calls;
    DynamicLibrary one(FIRST);
    DynamicLibrary two(FIRST);
    CHECK(one.load());
    CHECK(two.load());
    CHECK(calls.sequence == "oo");
    CHECK(one.unload());
    CHECK(numberOf(two) == 1);
    CHECK(report.text() == "+1");
    CHECK(two.unload());
    CHECK(report.text() == "+1-1");
    CHECK(calls.balanced());
}

// ========================================================================================= symbols

TEST_CASE("symbols of functions and data are found in the object's own library") {
    DynamicLibrary first(FIRST);
    DynamicLibrary second(SECOND);
    CHECK(first.load());
    CHECK(second.load());
    CHECK(numberOf(first) == 1);
    CHECK(numberOf(second) == 2);
    int* const data = static_cast<int*>(second.getSymbol(L"koru_loadable_data"));
    REQUIRE(data != nullptr);
    CHECK(*data == 200);
    CHECK(first.getSymbol(L"koru_loadable_data") ==
          ::dlsym(first.getHandle(), "koru_loadable_data"));
    CHECK(first.getSymbol(L"koru_loadable_data") != second.getSymbol(L"koru_loadable_data"));
}

TEST_CASE("a symbol's name is narrowed to UTF-8 and ends at its first NUL") {
    DynamicLibrary library(SECOND);
    CHECK(library.load());
    void* const symbol = library.getSymbol(L"gr\u00F6\u00DFe");
    REQUIRE(symbol != nullptr);
    CHECK(reinterpret_cast<int (*)()>(symbol)() == 2000);
    std::wstring const name = L"koru_loadable_data";
    CHECK(library.getSymbol(name + std::wstring(1, L'\0') + L"x") == library.getSymbol(name));
    CHECK(library.getSymbol(name) != nullptr);
}

TEST_CASE("a missing symbol gives null") {
    DynamicLibrary library(FIRST);
    CHECK(library.load());
    CHECK(library.getSymbol(L"koru_loadable_absent") == nullptr);
    CHECK(library.getSymbol(L"KORU_LOADABLE_NUMBER") == nullptr);
    CHECK(library.getSymbol(L"loaded") == nullptr); // There, but not exported.
    CHECK(library.getSymbol(L"") == nullptr);
    CHECK(library.isLoaded());
    CHECK(numberOf(library) == 1);
}

TEST_CASE("getSymbol of what is not loaded gives null and does not call the loader") {
    // The loader would take the null handle for the whole program, where malloc is found. It also
    // drops the error that waits to be fetched, whenever it is called.
    leaveLoaderError();
    static_cast<void>(::dlsym(RTLD_DEFAULT, "malloc"));
    REQUIRE(!loaderErrorIsLeft());

    DynamicLibrary const nameless;
    DynamicLibrary const never(FIRST);
    DynamicLibrary noMore(FIRST);
    DynamicLibrary failed(MISSING);
    CHECK(noMore.load());
    CHECK(noMore.unload());
    CHECK(!failed.load());
    leaveLoaderError();
    std::vector<DynamicLibrary const*> const libraries = {&nameless, &never, &noMore, &failed};
    for (DynamicLibrary const* library : libraries) {
        CHECK(library->getSymbol(L"malloc") == nullptr);
        CHECK(library->getSymbol(L"koru_loadable_number") == nullptr);
        CHECK(library->getSymbol(L"") == nullptr);
    }
    CHECK(loaderErrorIsLeft());
}

// ========================================================================================= copies

TEST_CASE("a copy of a loaded library has a handle of its own and survives the original") {
    LoadReport const report;
    LoaderCalls calls;
    std::unique_ptr<DynamicLibrary> original(new DynamicLibrary(FIRST));
    CHECK(original->load());
    {
        DynamicLibrary const copy(*original);
        CHECK(calls.opened == Names{KORU_TEST_LOADABLE_1, KORU_TEST_LOADABLE_1});
        CHECK(calls.flags == std::vector<int>{1, 1});
        CHECK(copy.isLoaded());
        bool const same = copy.getFileName() == FIRST;
        CHECK(same);
        original.reset();
        CHECK(copy.isLoaded());
        CHECK(numberOf(copy) == 1);
        CHECK(report.text() == "+1");
    }
    CHECK(report.text() == "+1-1");
    CHECK(calls.sequence == "oocc");
    CHECK(calls.balanced());
}

TEST_CASE("the original survives its copy") {
    LoaderCalls calls;
    DynamicLibrary original(FIRST);
    CHECK(original.load());
    {
        DynamicLibrary copy(original);
        CHECK(copy.unload());
        CHECK(original.isLoaded());
        CHECK(copy.load());
    }
    CHECK(numberOf(original) == 1);
    CHECK(original.unload());
    CHECK(calls.balanced());
}

TEST_CASE("a copy of what is not loaded is not loaded") {
    LoaderCalls calls;
    DynamicLibrary const original(FIRST);
    DynamicLibrary copy(original);
    CHECK(!copy.isLoaded());
    CHECK(copy.getHandle() == nullptr);
    bool const same = copy.getFileName() == FIRST;
    CHECK(same);
    CHECK(calls.sequence.empty());
    CHECK(copy.load());
    CHECK(!original.isLoaded());
}

TEST_CASE("a copy that cannot be loaded has the name and nothing loaded") {
    LoaderCalls calls;
    DynamicLibrary original(FIRST);
    CHECK(original.load());
    {
        calls.refusesToOpen = true;
        DynamicLibrary copy(original);
        CHECK(!copy.isLoaded());
        CHECK(copy.getHandle() == nullptr);
        bool const same = copy.getFileName() == FIRST;
        CHECK(same);
        CHECK(original.isLoaded());
        calls.refusesToOpen = false;
        CHECK(copy.load());
    }
    CHECK(calls.sequence == "oxoc");
}

TEST_CASE("copying calls the class's own load, not an override") {
    Watched original(FIRST);
    CHECK(original.load());
    Watched::calls.clear();
    {
        Watched const copy(original);
        DynamicLibrary const sliced(original);
        Watched const fromBase(sliced);
        CHECK(copy.isLoaded());
        CHECK(sliced.isLoaded());
        CHECK(fromBase.isLoaded());
    }
    CHECK(Watched::calls.empty());
    CHECK(original.isLoaded());
}

TEST_CASE("libraries stay loaded when the vector that holds them grows, and none is left behind") {
    LoadReport const report;
    LoaderCalls calls;
    {
        std::vector<DynamicLibrary> libraries;
        for (int i = 0; i < 20; ++i) {
            libraries.push_back(DynamicLibrary(i % 2 == 0 ? FIRST : SECOND));
            CHECK(libraries.back().load());
        }
        for (std::size_t i = 0; i < libraries.size(); ++i) {
            CHECK(numberOf(libraries[i]) == (i % 2 == 0 ? 1 : 2));
        }
        libraries.erase(libraries.begin(), libraries.begin() + 19);
        CHECK(numberOf(libraries[0]) == 2);
        CHECK(isMapped(2));
        CHECK(!isMapped(1));
    }
    CHECK(report.text() == "+1+2-1-2");
    CHECK(calls.balanced());
    CHECK(!isMapped(2));
}

// =========================================================================================
// assigning

TEST_CASE("assigning unloads what was loaded, takes the name and loads what the other has loaded") {
    struct Row {
        char const* label;
        bool targetLoaded;
        bool sourceLoaded;
        char const* sequence;
    };
    Row const rows[] = {
        {"neither loaded", false, false, ""},
        {"the source loaded", false, true, "o"},
        {"the target loaded", true, false, "c"},
        {"both loaded", true, true, "co"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.label);
        LoadReport const report;
        LoaderCalls calls;
        {
            DynamicLibrary target(FIRST);
            DynamicLibrary source(SECOND);
            if (row.targetLoaded) CHECK(target.load());
            if (row.sourceLoaded) CHECK(source.load());
            calls.sequence.clear();
            DynamicLibrary& result = (target = source);
            CHECK(&result == &target);
            CHECK(calls.sequence == row.sequence);
            CHECK(target.isLoaded() == row.sourceLoaded);
            CHECK((target.getHandle() != nullptr) == row.sourceLoaded);
            CHECK(source.isLoaded() == row.sourceLoaded);
            bool const renamed = target.getFileName() == SECOND;
            CHECK(renamed);
            CHECK(!isMapped(1));
            CHECK(source.unload());
            CHECK(numberOf(target) == (row.sourceLoaded ? 2 : -1));
        }
        CHECK(calls.balanced());
        CHECK(report.text() == std::string(row.targetLoaded ? "+1" : "") +
                                   (row.sourceLoaded ? "+2" : "") + (row.targetLoaded ? "-1" : "") +
                                   (row.sourceLoaded ? "-2" : ""));
    }
}

TEST_CASE("assigning an object to itself does nothing") {
    LoaderCalls calls;
    DynamicLibrary loaded(FIRST);
    DynamicLibrary unloaded(SECOND);
    CHECK(loaded.load());
    void* const handle = loaded.getHandle();
    DynamicLibrary& sameLoaded = loaded;
    DynamicLibrary& sameUnloaded = unloaded;
    CHECK(&(loaded = sameLoaded) == &loaded);
    CHECK(&(unloaded = sameUnloaded) == &unloaded);
    CHECK(calls.sequence == "o");
    CHECK(loaded.getHandle() == handle);
    CHECK(!unloaded.isLoaded());
    bool const same = loaded.getFileName() == FIRST && unloaded.getFileName() == SECOND;
    CHECK(same);
}

TEST_CASE("assigning the same library from another object unloads and loads it again") {
    LoaderCalls calls;
    DynamicLibrary target(FIRST);
    DynamicLibrary source(FIRST);
    CHECK(target.load());
    CHECK(source.load());
    target = source;
    CHECK(calls.sequence == "ooco");
    CHECK(target.isLoaded());
    CHECK(source.unload());
    CHECK(numberOf(target) == 1);
}

TEST_CASE("an assignment that cannot load leaves the target unloaded with the new name") {
    LoaderCalls calls;
    {
        DynamicLibrary target(FIRST);
        DynamicLibrary source(SECOND);
        CHECK(target.load());
        CHECK(source.load());
        calls.refusesToOpen = true;
        target = source;
        CHECK(!target.isLoaded());
        bool const renamed = target.getFileName() == SECOND;
        CHECK(renamed);
        CHECK(source.isLoaded());
        calls.refusesToOpen = false;
        CHECK(target.load());
        CHECK(numberOf(target) == 2);
    }
    CHECK(calls.sequence == "oocxocc");
    CHECK(calls.balanced());
}

TEST_CASE("assigning calls the target's unload and load through the virtual table") {
    DynamicLibrary loaded(SECOND);
    CHECK(loaded.load());
    DynamicLibrary const unloaded(SECOND);
    struct Row {
        char const* label;
        bool targetLoaded;
        DynamicLibrary const& source;
        char const* calls;
    };
    Row const rows[] = {
        {"neither loaded", false, unloaded, ""},
        {"the source loaded", false, loaded, "l"},
        {"the target loaded", true, unloaded, "u"},
        {"both loaded", true, loaded, "ul"},
    };
    for (Row const& row : rows) {
        CAPTURE(row.label);
        Watched watched(FIRST);
        if (row.targetLoaded) CHECK(watched.load());
        Watched::calls.clear();
        DynamicLibrary& target = watched;
        target = row.source;
        CHECK(Watched::calls == row.calls);
        CHECK(target.isLoaded() == row.source.isLoaded());
    }
}

TEST_CASE("a target whose load override does not load stays unloaded after an assignment") {
    LoaderCalls calls;
    DynamicLibrary source(SECOND);
    CHECK(source.load());
    Watched watched(FIRST);
    watched.passesOn = false;
    DynamicLibrary& target = watched;
    target = source;
    CHECK(calls.sequence == "o");
    CHECK(!target.isLoaded());
    bool const renamed = target.getFileName() == SECOND;
    CHECK(renamed);
}

TEST_CASE("a temporary may be assigned") {
    LoaderCalls calls;
    DynamicLibrary library(FIRST);
    CHECK(library.load());
    library = DynamicLibrary(SECOND);
    CHECK(!library.isLoaded());
    CHECK(library.load());
    CHECK(numberOf(library) == 2);
    library = DynamicLibrary();
    CHECK(!library.isLoaded());
    CHECK(library.getFileName().empty());
    CHECK(calls.balanced());
}
