// DynamicLibrary: looking up a symbol, and loading a library that the process has already.
#include <koru/dynamiclibrary.h>

#include <dlfcn.h>

#include <string>

#include "harness.h"

namespace {

using bench::Work;

constexpr char FILE_NAME[] = "libm.so.6";
constexpr wchar_t WIDE_FILE_NAME[] = L"libm.so.6";

void _symbol(bench::Report& report) {
    Koru::DynamicLibrary library(WIDE_FILE_NAME);
    bench::require(library.load(), "cannot load the library");
    void* const handle = library.getHandle();
    std::wstring const wide = L"nextafter";
    std::string const narrow = "nextafter";
    bench::require(library.getSymbol(wide) != nullptr &&
                       library.getSymbol(wide) == ::dlsym(handle, narrow.c_str()),
                   "the symbol was found somewhere else");
    report.compare(
        "symbol", Work::repeated([&] { return library.getSymbol(wide); }),
        {bench::peer("dlsym", Work::repeated([&] { return ::dlsym(handle, narrow.c_str()); }))},
        1.2);
}

void _load(bench::Report& report) {
    auto const ours = [] {
        Koru::DynamicLibrary library(WIDE_FILE_NAME);
        bool const loaded = library.load();
        library.unload();
        return loaded;
    };
    auto const calls = [] {
        void* const handle = ::dlopen(FILE_NAME, RTLD_LAZY);
        ::dlclose(handle);
        return handle;
    };
    report.compare("construct + load + unload", Work::repeated(ours),
                   {bench::limit("dlopen + dlclose", Work::repeated(calls), 1.6)});
}

} // namespace

int main(int argc, char** argv) {
    // The library stays in the process: the first load reads a file, and is not what is compared.
    bench::require(::dlopen(FILE_NAME, RTLD_LAZY) != nullptr, "there is no mathematics library");
    bench::Report report("libraries", bench::Options(argc, argv));
    _symbol(report);
    _load(report);
}
