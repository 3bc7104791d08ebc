// Loading libraries. The libraries are built beside this executable and report when they come and
// go; the loader's own functions are watched on their way.
#include <koru/dynamiclibrary.h>
#include <koru/string.h>

#include <dlfcn.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstring>
#include <filesystem>
#include <memory>
#include <string>
#include <type_traits>
#include <vector>

#include <doctest/doctest.h>

#include "support/slots.h"
#include "support/subprocess.h"
#include "support/tempdir.h"

namespace {

using Names = std::vector<std::string>;
using Numbers = std::vector<int>;
using Koru::DynamicLibrary;

std::wstring const FIRST = Koru::make_wstring(KORU_TEST_LOADABLE_1);
std::wstring const SECOND = Koru::make_wstring(KORU_TEST_LOADABLE_2);
std::wstring const MISSING = L"/nonexistent/libmissing.so";

/// What the loader is asked for while an object of this kind exists, and whether it refuses. In the
/// end the calls expected, where they are told, have to be all there were, and every handle given
/// back.
class Loader {
public:
    explicit Loader(char const* expectedCalls = nullptr) : expectedCalls_(expectedCalls) {
        current = this;
    }
    Loader(Loader const&) = delete;
    Loader& operator=(Loader const&) = delete;
    ~Loader() {
        current = nullptr;
        if (expectedCalls_ != nullptr) CHECK(calls == expectedCalls_);
        CHECK(std::is_permutation(handles.begin(), handles.end(), closed.begin(), closed.end()));
    }

    bool refusesToOpen = false;
    bool failsToClose = false;
    std::string calls; ///< "o" for a successful open, "x" for a failed one, "c" for a close
    Names opened;
    Numbers flags;
    std::vector<void*> handles; ///< that were given out
    std::vector<void*> closed;
    Numbers report; ///< of the libraries: 1 when the first is loaded, -1 when it is unloaded

    inline static Loader* current = nullptr;

private:
    char const* expectedCalls_;
};

template <class Function>
Function* real(char const* name) {
    return reinterpret_cast<Function*>(::dlsym(RTLD_NEXT, name));
}

} // namespace

extern "C" __attribute__((visibility("default"))) void koru_loadable_report(int number);
extern "C" void koru_loadable_report(int number) {
    if (Loader::current != nullptr) Loader::current->report.push_back(number);
}

extern "C" void* dlopen(char const* name, int flags) noexcept {
    static auto* const open = real<void*(char const*, int)>("dlopen");
    Loader* const loader = Loader::current;
    if (loader == nullptr) return open(name, flags);
    loader->opened.push_back(name == nullptr ? "<null>" : name);
    loader->flags.push_back(flags);
    void* const handle = loader->refusesToOpen ? nullptr : open(name, flags);
    if (handle != nullptr) loader->handles.push_back(handle);
    loader->calls += handle != nullptr ? 'o' : 'x';
    return handle;
}

extern "C" int dlclose(void* handle) noexcept {
    static auto* const close = real<int(void*)>("dlclose");
    Loader* const loader = Loader::current;
    if (loader == nullptr) return close(handle);
    loader->closed.push_back(handle);
    loader->calls += 'c';
    int const result = close(handle);
    return loader->failsToClose ? -1 : result;
}

namespace {

int numberOf(DynamicLibrary const& library) {
    void* const symbol = library.getSymbol(L"koru_loadable_number");
    return symbol == nullptr ? -1 : reinterpret_cast<int (*)()>(symbol)();
}

void checkUnloaded(DynamicLibrary const& library, std::wstring const& name) {
    CHECK(library.getFileName() == name);
    CHECK(!library.isLoaded());
    CHECK(library.getHandle() == nullptr);
    CHECK(numberOf(library) == -1);
}

void checkLoaded(DynamicLibrary const& library, std::wstring const& name) {
    CHECK(library.getFileName() == name);
    CHECK(library.isLoaded());
    CHECK(library.getHandle() != nullptr);
    CHECK(numberOf(library) == (name == FIRST ? 1 : 2));
}

struct Loaded : DynamicLibrary {
    explicit Loaded(std::wstring const& name) : DynamicLibrary(name) {
        CHECK(DynamicLibrary::load());
    }
};

/// Records the calls of its overrides, which may pass on or not.
struct Watched : DynamicLibrary {
    using DynamicLibrary::DynamicLibrary;
    explicit Watched(DynamicLibrary const& other) : DynamicLibrary(other) {}

    bool load() override {
        calls += 'l';
        return passesOn && DynamicLibrary::load();
    }
    bool unload() override {
        calls += 'u';
        return passesOn && DynamicLibrary::unload();
    }

    inline static std::string calls;
    bool passesOn = true;
};

} // namespace

TEST_CASE("a library object holds a name and a handle besides its virtual table") {
    struct Members {
        void* virtualTable;
        std::wstring fileName;
        void* handle;
    };
    CHECK(sizeof(DynamicLibrary) == sizeof(Members));
    CHECK(std::has_virtual_destructor_v<DynamicLibrary>);
    CHECK(std::is_default_constructible_v<DynamicLibrary>);
    CHECK(std::is_copy_constructible_v<DynamicLibrary>);
    CHECK(std::is_copy_assignable_v<DynamicLibrary>);
}

TEST_CASE("the virtual functions are load, unload and isLoaded, after the destructor's two") {
    CHECK(test::slotOf(&DynamicLibrary::load) == 2);
    CHECK(test::slotOf(&DynamicLibrary::unload) == 3);
    CHECK(test::slotOf(&DynamicLibrary::isLoaded) == 4);
}

TEST_CASE("an override is called in the place of what it overrides") {
    Watched::calls.clear();
    Watched watched(FIRST);
    DynamicLibrary& library = watched;
    CHECK(library.load());
    CHECK(library.unload());
    CHECK(Watched::calls == "lu");
}

TEST_CASE("a derived object is destroyed through a pointer to its base, which unloads it") {
    Loader loader("oc");
    Watched::calls.clear();
    std::unique_ptr<DynamicLibrary> library(new Watched(FIRST));
    CHECK(library->load());
    library.reset();
    CHECK(Watched::calls == "l"); // The destructor uses the class's own unload.
}

TEST_CASE("a default object has no name and nothing loaded") {
    Loader loader("");
    checkUnloaded(DynamicLibrary(), L"");
}

TEST_CASE("a name does not load anything") {
    Loader loader("");
    checkUnloaded(DynamicLibrary(FIRST), FIRST);
}

TEST_CASE("load binds functions lazily and keeps the library's symbols to itself") {
    Loader loader("oc");
    DynamicLibrary library(FIRST);
    CHECK(library.load());
    checkLoaded(library, FIRST);
    CHECK(loader.opened == Names{KORU_TEST_LOADABLE_1});
    CHECK(loader.flags == Numbers{1});
    CHECK(RTLD_LAZY == 1);
    CHECK(loader.handles == std::vector<void*>{library.getHandle()});
    CHECK(::dlsym(RTLD_DEFAULT, "koru_loadable_number") == nullptr);
}

TEST_CASE("the second load of a loaded library returns true and does not open it again") {
    Loader loader("oc");
    Loaded library(FIRST);
    CHECK(library.load());
    CHECK(library.load());
    CHECK(loader.handles == std::vector<void*>{library.getHandle()});
    CHECK(library.unload());
    CHECK(loader.report == Numbers{1, -1});
}

TEST_CASE("unload gives the handle back and returns true") {
    Loader loader("oc");
    Loaded library(FIRST);
    CHECK(library.unload());
    CHECK(loader.closed == loader.handles);
    checkUnloaded(library, FIRST);
}

TEST_CASE("unload of what is not loaded returns true and gives nothing back") {
    Loader loader("oc");
    DynamicLibrary nameless;
    DynamicLibrary never(FIRST);
    Loaded noMore(FIRST);
    CHECK(nameless.unload());
    CHECK(never.unload());
    CHECK(noMore.unload());
    CHECK(noMore.unload());
}

TEST_CASE("unload returns true and leaves nothing loaded even when the loader reports a failure") {
    Loader loader("oc");
    loader.failsToClose = true;
    Loaded library(FIRST);
    CHECK(library.unload());
    checkUnloaded(library, FIRST);
}

TEST_CASE("the destructor gives back what is loaded, and only that") {
    Loader loader("oocxc");
    Loaded const loaded(FIRST);
    Loaded unloaded(SECOND);
    DynamicLibrary failed(MISSING);
    CHECK(unloaded.unload());
    CHECK(!failed.load());
    CHECK(loader.report == Numbers{1, 2, -2});
}

TEST_CASE("a library may be loaded and unloaded any number of times by one object") {
    Loader loader("ocococ");
    DynamicLibrary library(FIRST);
    for (int round = 0; round < 3; ++round) {
        CHECK(library.load());
        CHECK(numberOf(library) == 1);
        CHECK(library.unload());
    }
    CHECK(loader.report == Numbers{1, -1, 1, -1, 1, -1});
}

TEST_CASE("a failed load leaves nothing loaded and may be repeated until the file is there") {
    test::TempDir const directory;
    Loader loader("xxxoc");
    DynamicLibrary library(directory.wide("later.so"));
    CHECK(!library.load());
    checkUnloaded(library, directory.wide("later.so"));
    CHECK(library.unload());
    CHECK(!library.load());
    test::writeFile(directory / "later.so", "not a library");
    CHECK(!library.load());
    test::writeFile(directory / "later.so", test::readFile(KORU_TEST_LOADABLE_1));
    CHECK(library.load());
    CHECK(numberOf(library) == 1);
    CHECK(library.unload());
}

TEST_CASE("what is not a library is not loaded") {
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
    Loader loader("oxc");
    Loaded const mathematics(L"libm.so.6");
    void* const symbol = mathematics.getSymbol(L"ldexp");
    REQUIRE(symbol != nullptr);
    CHECK(reinterpret_cast<double (*)(double, int)>(symbol)(0.75, 2) == 3.0);
    CHECK(loader.opened == Names{"libm.so.6"});
    CHECK(!DynamicLibrary(L"libkoru-absent.so.6").load());
}

TEST_CASE("a relative name counts from the working directory, not from the executable's") {
    test::TempDir const directory;
    std::filesystem::copy_file(KORU_TEST_LOADABLE_2, directory / "here.so");
    test::Outcome const outcome = test::inChild([&] {
        DynamicLibrary library(L"./here.so");
        if (library.load()) return 1;
        if (::chdir(directory.path().c_str()) != 0) return 2;
        return library.load() && numberOf(library) == 2 ? 0 : 3;
    });
    CHECK(outcome.exitCode == 0);
}

TEST_CASE("a name beyond ASCII is given to the loader as UTF-8") {
    test::TempDir const directory;
    std::string const name = "gr\303\266\303\237e \342\202\254 \360\237\230\200.so";
    std::filesystem::copy_file(KORU_TEST_LOADABLE_2, directory / name);
    Loader loader("oc");
    Loaded const library(directory.wide("") + L"gr\u00F6\u00DFe \u20AC \U0001F600.so");
    CHECK(numberOf(library) == 2);
    CHECK(loader.opened == Names{directory / name});
}

TEST_CASE("names that do not narrow cleanly come to the loader as make_string makes them") {
    Loader loader("xxx");
    loader.refusesToOpen = true;
    std::wstring const surrogate = {L'/', static_cast<wchar_t>(0xD800), L'x'};
    std::wstring const largest = {L'/', static_cast<wchar_t>(0x7FFFFFFF)};
    std::wstring const beyond = {L'/', static_cast<wchar_t>(0x80000041)};
    for (std::wstring const& name : {surrogate, largest, beyond})
        CHECK(!DynamicLibrary(name).load());
    CHECK(loader.opened == Names{"/\355\240\200x", "/\375\277\277\277\277\277", "/A"});
}

TEST_CASE("the loader sees a name up to its first NUL, and the object keeps the whole of it") {
    Loader loader("oocc");
    std::wstring const name = FIRST + std::wstring(1, L'\0') + L"ignored";
    Loaded const library(name);
    DynamicLibrary const copy(library);
    CHECK(loader.opened == Names{KORU_TEST_LOADABLE_1, KORU_TEST_LOADABLE_1});
    CHECK(library.getFileName() == name);
    CHECK(copy.getFileName() == name);
    CHECK(copy.isLoaded());
}

TEST_CASE("an empty name is the running program for the loader, and for load") {
    Loader loader("oc");
    DynamicLibrary program;
    CHECK(program.load());
    CHECK(program.isLoaded());
    CHECK(loader.opened == Names{""});
    CHECK(program.getSymbol(L"malloc") != nullptr);
    CHECK(program.unload());
}

TEST_CASE("the file name is returned as a copy") {
    DynamicLibrary const library(L"one.so");
    library.getFileName() += L".2";
    CHECK(library.getFileName() == L"one.so");
}

TEST_CASE("two objects with the same name hold a handle each") {
    Loader loader("oocc");
    Loaded one(FIRST);
    Loaded two(FIRST);
    CHECK(one.unload());
    CHECK(numberOf(two) == 1);
    CHECK(loader.report == Numbers{1});
    CHECK(two.unload());
    CHECK(loader.report == Numbers{1, -1});
}

TEST_CASE("symbols of functions and data are found in the object's own library") {
    Loaded const first(FIRST);
    Loaded const second(SECOND);
    CHECK(numberOf(first) == 1);
    CHECK(numberOf(second) == 2);
    void* const data = second.getSymbol(L"koru_loadable_data");
    REQUIRE(data != nullptr);
    CHECK(*static_cast<int*>(data) == 200);
    CHECK(first.getSymbol(L"koru_loadable_data") != data);
    CHECK(first.getSymbol(L"koru_loadable_data") ==
          ::dlsym(first.getHandle(), "koru_loadable_data"));
}

TEST_CASE("a symbol's name is narrowed to UTF-8 and ends at its first NUL") {
    Loaded const library(SECOND);
    void* const symbol = library.getSymbol(L"gr\u00F6\u00DFe");
    REQUIRE(symbol != nullptr);
    CHECK(reinterpret_cast<int (*)()>(symbol)() == 2000);
    std::wstring const name = L"koru_loadable_data";
    CHECK(library.getSymbol(name + std::wstring(1, L'\0') + L"x") == library.getSymbol(name));
    CHECK(library.getSymbol(name) != nullptr);
}

TEST_CASE("a missing symbol gives null") {
    Loaded const library(FIRST);
    CHECK(library.getSymbol(L"koru_loadable_absent") == nullptr);
    CHECK(library.getSymbol(L"KORU_LOADABLE_NUMBER") == nullptr);
    CHECK(library.getSymbol(L"loaded") == nullptr); // There, but not exported.
    CHECK(library.getSymbol(L"") == nullptr);
    checkLoaded(library, FIRST);
}

TEST_CASE("getSymbol of what is not loaded gives null and does not call the loader") {
    DynamicLibrary const nameless;
    DynamicLibrary const never(FIRST);
    Loaded noMore(FIRST);
    DynamicLibrary failed(MISSING);
    CHECK(noMore.unload());
    CHECK(!failed.load());
    // The loader would take the null handle for the whole program, where malloc is found. It also
    // drops the error that waits to be fetched, whenever it is called.
    auto const leavesError = [](auto call) {
        static_cast<void>(::dlopen("/nonexistent/left-behind.so", RTLD_LAZY));
        call();
        char const* const error = ::dlerror();
        return error != nullptr && std::strstr(error, "left-behind") != nullptr;
    };
    REQUIRE(!leavesError([] { static_cast<void>(::dlsym(RTLD_DEFAULT, "malloc")); }));
    std::vector<DynamicLibrary const*> const libraries = {&nameless, &never, &noMore, &failed};
    for (DynamicLibrary const* library : libraries) {
        for (wchar_t const* name : {L"malloc", L"koru_loadable_number", L""})
            CHECK(leavesError([&] { CHECK(library->getSymbol(name) == nullptr); }));
    }
}

TEST_CASE("a copy of a loaded library has a handle of its own and survives the original") {
    Loader loader("oocc");
    auto original = std::make_unique<Loaded>(FIRST);
    {
        DynamicLibrary const copy(*original);
        CHECK(loader.opened == Names{KORU_TEST_LOADABLE_1, KORU_TEST_LOADABLE_1});
        CHECK(loader.flags == Numbers{1, 1});
        checkLoaded(copy, FIRST);
        original.reset();
        checkLoaded(copy, FIRST);
        CHECK(loader.report == Numbers{1});
    }
    CHECK(loader.report == Numbers{1, -1});
}

TEST_CASE("the original survives its copy") {
    Loader loader("oococc");
    Loaded original(FIRST);
    DynamicLibrary copy(original);
    CHECK(copy.unload());
    CHECK(original.isLoaded());
    CHECK(copy.load());
    checkLoaded(original, FIRST);
    CHECK(original.unload());
}

TEST_CASE("a copy of what is not loaded is not loaded") {
    Loader loader("oc");
    DynamicLibrary const original(FIRST);
    DynamicLibrary copy(original);
    checkUnloaded(copy, FIRST);
    CHECK(copy.load());
    CHECK(!original.isLoaded());
}

TEST_CASE("a copy that cannot be loaded has the name and nothing loaded") {
    Loader loader("oxocc");
    Loaded const original(FIRST);
    loader.refusesToOpen = true;
    DynamicLibrary copy(original);
    checkUnloaded(copy, FIRST);
    CHECK(original.isLoaded());
    loader.refusesToOpen = false;
    CHECK(copy.load());
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
    Loader loader;
    {
        std::vector<DynamicLibrary> libraries;
        for (int i = 0; i < 20; ++i) {
            libraries.push_back(DynamicLibrary(i % 2 == 0 ? FIRST : SECOND));
            CHECK(libraries.back().load());
        }
        for (std::size_t i = 0; i < libraries.size(); ++i)
            CHECK(numberOf(libraries[i]) == (i % 2 == 0 ? 1 : 2));
        libraries.erase(libraries.begin(), libraries.begin() + 19);
        CHECK(numberOf(libraries[0]) == 2);
        CHECK(loader.report == Numbers{1, 2, -1});
    }
    CHECK(loader.report == Numbers{1, 2, -1, -2});
}

namespace {

/// Runs a check for each state that two objects can be in before one is assigned to the other.
template <class Check>
void forEachAssignment(Check check) {
    for (bool const targetLoaded : {false, true}) {
        CAPTURE(targetLoaded);
        for (bool const sourceLoaded : {false, true}) {
            CAPTURE(sourceLoaded);
            DynamicLibrary source(SECOND);
            if (sourceLoaded) CHECK(source.load());
            check(targetLoaded, source);
        }
    }
}

} // namespace

TEST_CASE("assigning unloads what was loaded, takes the name and loads what the other has loaded") {
    forEachAssignment([](bool targetLoaded, DynamicLibrary const& source) {
        std::string const calls =
            std::string(targetLoaded ? "oc" : "") + (source.isLoaded() ? "oc" : "");
        Loader loader(calls.c_str());
        DynamicLibrary target(FIRST);
        if (targetLoaded) CHECK(target.load());
        bool const sourceLoaded = source.isLoaded();
        CHECK(&(target = source) == &target);
        CHECK(loader.report == (targetLoaded ? Numbers{1, -1} : Numbers{}));
        CHECK(source.isLoaded() == sourceLoaded);
        (sourceLoaded ? checkLoaded : checkUnloaded)(target, SECOND);
    });
}

TEST_CASE("assigning calls the target's unload and load through the virtual table") {
    forEachAssignment([](bool targetLoaded, DynamicLibrary const& source) {
        Watched watched(FIRST);
        if (targetLoaded) CHECK(watched.load());
        Watched::calls.clear();
        static_cast<DynamicLibrary&>(watched) = source;
        CHECK(Watched::calls ==
              std::string(targetLoaded ? "u" : "") + (source.isLoaded() ? "l" : ""));
        CHECK(watched.isLoaded() == source.isLoaded());
    });
}

TEST_CASE("assigning an object to itself does nothing") {
    Loader loader("oc");
    Loaded loaded(FIRST);
    DynamicLibrary unloaded(SECOND);
    DynamicLibrary& sameLoaded = loaded;
    DynamicLibrary& sameUnloaded = unloaded;
    CHECK(&(sameLoaded = loaded) == &loaded);
    CHECK(&(sameUnloaded = unloaded) == &unloaded);
    CHECK(loader.handles == std::vector<void*>{loaded.getHandle()});
    checkLoaded(loaded, FIRST);
    checkUnloaded(unloaded, SECOND);
}

TEST_CASE("assigning the same library from another object unloads and loads it again") {
    Loader loader("oococc");
    Loaded target(FIRST);
    Loaded source(FIRST);
    target = source;
    CHECK(source.unload());
    checkLoaded(target, FIRST);
}

TEST_CASE("an assignment that cannot load leaves the target unloaded with the new name") {
    Loader loader("oocxocc");
    Loaded target(FIRST);
    Loaded const source(SECOND);
    loader.refusesToOpen = true;
    target = source;
    checkUnloaded(target, SECOND);
    CHECK(source.isLoaded());
    loader.refusesToOpen = false;
    CHECK(target.load());
    checkLoaded(target, SECOND);
}

TEST_CASE("a target whose load override does not load stays unloaded after an assignment") {
    Loader loader("oc");
    Loaded const source(SECOND);
    Watched watched(FIRST);
    watched.passesOn = false;
    static_cast<DynamicLibrary&>(watched) = source;
    checkUnloaded(watched, SECOND);
}

TEST_CASE("a temporary may be assigned") {
    Loader loader("ococ");
    Loaded loaded(FIRST);
    DynamicLibrary& library = loaded;
    library = DynamicLibrary(SECOND);
    CHECK(!library.isLoaded());
    CHECK(library.load());
    checkLoaded(library, SECOND);
    library = DynamicLibrary();
    checkUnloaded(library, L"");
}
