// File::Path: parsing an absolute path, and resolving paths relative to the executable.
#include <koru/file.h>

#include <fcntl.h>
#include <unistd.h>

#include <climits>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <utility>

#include "harness.h"

#ifdef KORU_BENCH_HAS_GLIB
#include <glib.h>
#endif

namespace {

using bench::Work;

std::string _executable() { return std::filesystem::read_symlink("/proc/self/exe").string(); }

std::wstring _widen(std::string const& ascii) { return std::wstring(ascii.begin(), ascii.end()); }

/// A path taken apart as File::Path does.
struct Parts {
    std::string directory;
    std::string name;
};

Parts _split(std::filesystem::path const& path) {
    return {path.parent_path().string(), path.filename().string()};
}

/// GLib's way to clean an absolute path and take it apart.
bench::Peer _glib(std::string const& text) {
#ifdef KORU_BENCH_HAS_GLIB
    return bench::peer("GLib", Work::repeated([text] {
                           char* const path = g_canonicalize_filename(text.c_str(), nullptr);
                           char* const directory = g_path_get_dirname(path);
                           char* const name = g_path_get_basename(path);
                           bench::keep(*directory);
                           bench::keep(*name);
                           g_free(name);
                           g_free(directory);
                           g_free(path);
                           return 0;
                       }));
#else
    static_cast<void>(text);
    return bench::missing("GLib");
#endif
}

void _absolute(bench::Report& report) {
    std::string const text = "/usr/share/application/settings/main.ini";
    std::wstring const wide = _widen(text);
    report.compare(
        "absolute", Work::repeated([wide] { return Koru::File::Path(wide); }),
        {_glib(text), bench::peer("std lexically_normal", Work::repeated([text] {
                                      return _split(std::filesystem::path(text).lexically_normal());
                                  }))},
        0.95);
}

/// The limit is what it costs to ask both for their directory and name, and to compare those
/// copies.
void _equal(bench::Report& report) {
    std::wstring const directory = L"usr/share/application/settings";
    std::wstring const name = L"main.ini";
    Koru::File::Path const a(L"/" + directory + L"/" + name);
    Koru::File::Path const b(a);
    auto const ours = [&] {
        bench::keep(a);
        bench::keep(b);
        return a == b;
    };
    auto const copies = [&] {
        auto const left = std::make_pair(directory, name);
        auto const right = std::make_pair(directory, name);
        bench::keep(left);
        bench::keep(right);
        return left == right;
    };
    report.compare("==, equal", Work::repeated(ours),
                   {bench::limit("comparing two copies", Work::repeated(copies), 0.4)});
}

/// The system calls that the result depends on, and nothing else.
Work _systemCalls(std::string const& relative) {
    std::string const resolved = _executable();
    std::string const path = resolved.substr(0, resolved.rfind('/') + 1) + relative;
    return Work::repeated([path] {
        char commandLine[PATH_MAX];
        char resolvedPath[PATH_MAX];
        int const file = ::open("/proc/self/cmdline", O_RDONLY | O_CLOEXEC);
        ssize_t const n = ::read(file, commandLine, sizeof commandLine);
        ::close(file);
        bench::require(n > 0, "cannot read the command line");
        bool found = ::realpath(commandLine, resolvedPath) != nullptr;
        found = ::realpath(path.c_str(), resolvedPath) != nullptr && found;
        bench::keep(resolvedPath);
        return found;
    });
}

/// The standard library's way to the same answer.
Work _weaklyCanonical(std::string const& relative) {
    return Work::repeated([relative] {
        auto const directory = std::filesystem::read_symlink("/proc/self/exe").parent_path();
        return _split(std::filesystem::weakly_canonical(directory / relative));
    });
}

/// The same without the question where the executable is.
Work _weaklyCanonical(std::filesystem::path const& directory, std::string const& relative) {
    return Work::repeated([directory, relative] {
        return _split(std::filesystem::weakly_canonical(directory / relative));
    });
}

void _relative(bench::Report& report, std::string const& row, std::string const& relative,
               double peerGoal, double limitGoal) {
    std::wstring const wide = _widen(relative);
    std::filesystem::path const directory = std::filesystem::path(_executable()).parent_path();
    Koru::File::Path const ours(wide);
    bench::require(static_cast<std::wstring>(ours) == _widen((directory / relative).string()),
                   "the relative path was resolved to somewhere else");
    report.compare(row, Work::repeated([wide] { return Koru::File::Path(wide); }),
                   {bench::peer("std weakly_canonical", _weaklyCanonical(relative)),
                    bench::limit("same, directory known", _weaklyCanonical(directory, relative)),
                    bench::limit("its system calls", _systemCalls(relative), limitGoal)},
                   peerGoal);
}

} // namespace

int main(int argc, char** argv) {
    // The first argument is what the library finds the executable by, so it is made absolute.
    std::string executable = _executable();
    if (executable != argv[0]) {
        argv[0] = &executable[0];
        ::execv(executable.c_str(), argv);
        return 1;
    }
    bench::Report report("paths", bench::Options(argc, argv));
    _absolute(report);
    _equal(report);
    _relative(report, "relative, existing", "path_bench", 0, 1.05);
    _relative(report, "relative, missing", "conf/missing.ini", 0.75, 1.1);
}
