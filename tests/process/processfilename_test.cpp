// The executable's own path. The interesting processes are copies of this executable, started from
// other directories and under other names; each follows the instructions in its arguments and
// answers with what it sees.
#include <koru/string.h>
#include <koru/system.h>

#include <pthread.h>
#include <sched.h>
#include <stdlib.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <iterator>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <vector>

#include <doctest/doctest.h>

#include "support/cancellation.h"
#include "support/relocate.h"
#include "support/selfexec.h"
#include "support/subprocess.h"
#include "support/tempdir.h"

// Reading and closing, of this executable and the libraries it loaded, pass through here, so that a
// test can have a thread cancelled in either, or read in pieces and to an early end.
namespace {

enum class CancelledIn { NOTHING, READ, CLOSE };
thread_local CancelledIn cancelledIn = CancelledIn::NOTHING;

thread_local std::size_t bytesAtATime = SIZE_MAX;
thread_local std::size_t bytesLeft = SIZE_MAX;

void _cancelIn(CancelledIn call) {
    if (cancelledIn != call) return;
    cancelledIn = CancelledIn::NOTHING;
    ::pthread_cancel(::pthread_self());
    ::pthread_testcancel();
}

} // namespace

extern "C" ssize_t read(int fd, void* buffer, size_t count) {
    _cancelIn(CancelledIn::READ);
    auto const arrived = static_cast<ssize_t>(
        ::syscall(SYS_read, fd, buffer, std::min({count, bytesAtATime, bytesLeft})));
    if (arrived > 0 && bytesLeft != SIZE_MAX) bytesLeft -= static_cast<std::size_t>(arrived);
    return arrived;
}

extern "C" int close(int fd) {
    _cancelIn(CancelledIn::CLOSE);
    return static_cast<int>(::syscall(SYS_close, fd));
}

namespace {

using Koru::System;
using Strings = std::vector<std::string>;

std::string processFileName() { return Koru::make_string(System::getProcessFileName()); }

/// What the executable's path has to be for an argv[0], here and now: the first 4095 bytes of it up
/// to the first blank, resolved. Where that fails, it is what `realpath` leaves in its buffer.
std::string resolved(std::string const& argv0) {
    std::string const name = argv0.substr(0, 4095);
    char buffer[4096] = {};
    static_cast<void>(::realpath(name.substr(0, name.find(' ')).c_str(), buffer) == nullptr);
    return buffer;
}

void require(bool done) {
    if (!done) throw std::runtime_error("an instruction failed");
}

/// `NAME` is what the library says, `EXPECTED=argv0` what it has to say in the same state of the
/// process; the others change that state.
void follow(std::string const& verb, std::string const& operand, char* argv0) {
    if (verb == "NAME") return test::answer(processFileName());
    if (verb == "EXPECTED")
        return test::answer(Koru::make_string(Koru::make_wstring(resolved(operand))));
    if (verb == "CHDIR") return require(::chdir(operand.c_str()) == 0);
    if (verb == "UNLINK") return require(::unlink(operand.c_str()) == 0);
    require(verb == "RETITLE" && operand.size() == std::strlen(argv0));
    std::strcpy(argv0, operand.c_str());
}

test::RegisterSelf const registration("follow", [](int count, char** instructions) {
    for (int i = 0; i < count; ++i) {
        std::istringstream instruction(instructions[i]);
        std::string verb;
        std::string operand;
        std::getline(instruction, verb, '=');
        std::getline(instruction, operand, '\0');
        follow(verb, operand, instructions[-2]); // argv[0] is two places before the first of them
    }
    return 0;
});

Strings follow(std::string const& program, std::string const& argv0, std::string const& directory,
               Strings const& instructions) {
    return test::ask(program, argv0, directory, "follow", instructions);
}

std::string nameOf(std::string const& program, std::string const& argv0,
                   std::string const& directory = "/") {
    return follow(program, argv0, directory, {"NAME"}).at(0);
}

/// For a first argument that names nothing: a program's name is what `realpath` leaves.
void checkAsRealpath(std::string const& program, std::string const& argv0,
                     std::string const& directory, Strings instructions = {}) {
    instructions.insert(instructions.end(), {"NAME", "EXPECTED=" + argv0});
    Strings const answers = follow(program, argv0, directory, instructions);
    REQUIRE(answers.size() == 2);
    CHECK(answers[0] == answers[1]);
    CHECK(answers[0] != program);
}

/// A directory with copies of this executable and other files.
struct Place : test::TempDir {
    explicit Place(Strings const& programs, Strings const& others = {}) {
        for (std::string const& name : programs) test::copyOwnExecutable(place(name));
        for (std::string const& name : others) test::writeFile(place(name), "");
    }

private:
    std::filesystem::path place(std::string const& name) const {
        std::filesystem::path const path = *this / name;
        std::filesystem::create_directories(path.parent_path());
        return path;
    }
};

std::ptrdiff_t openFiles() {
    std::filesystem::directory_iterator const first("/proc/self/fd");
    return std::distance(begin(first), end(first));
}

// Without arguments a process cannot be told by a switch what to do: an environment variable says
// it, and a static constructor of the program answers. So the name is to be had that early, too.
struct AnswerWithoutArguments {
    AnswerWithoutArguments() {
        if (::getenv("KORU_TEST_WITHOUT_ARGUMENTS") == nullptr) return;
        std::string const text = "<" + processFileName() + ">";
        ::_exit(::write(STDOUT_FILENO, text.data(), text.size()) < 0 ? 1 : 0);
    }
} const answerWithoutArguments;

std::wstring const beforeMain = System::getProcessFileName();

} // namespace

TEST_CASE("System holds nothing and can be made and destroyed") {
    static_assert(std::is_empty_v<System>, "static functions only");
    static_assert(std::is_destructible_v<System>);
    System const system{};
    CHECK(system.getProcessFileName() == System::getProcessFileName());
}

TEST_CASE("getProcessFileName is a static function of no arguments that gives a wide string") {
    std::wstring (*const function)() = &System::getProcessFileName;
    CHECK(function() == System::getProcessFileName());
}

TEST_CASE("the running test's own name is its first argument, resolved") {
    std::string const commandLine = test::readFile("/proc/self/cmdline");
    CHECK(processFileName() == resolved(commandLine.c_str()));
}

TEST_CASE("a command line that arrives in pieces is the same") {
    std::string const whole = processFileName();
    for (std::size_t const size : {1U, 2U, 3U, 7U}) {
        CAPTURE(size);
        bytesAtATime = size;
        std::string const name = processFileName();
        bytesAtATime = SIZE_MAX;
        CHECK(name == whole);
    }
}

TEST_CASE("a command line that ends without a zero byte is read to its end") {
    std::string const commandLine = test::readFile("/proc/self/cmdline");
    for (std::size_t const size : {0U, 1U, 5U}) {
        CAPTURE(size);
        bytesLeft = size;
        std::string const name = processFileName();
        bytesLeft = SIZE_MAX;
        CHECK(name == resolved(commandLine.substr(0, size)));
    }
}

TEST_CASE("the name is to be had from a static constructor of the program") {
    CHECK(beforeMain == System::getProcessFileName());
}

TEST_CASE("a program started by its absolute path yields that path from any directory") {
    Place const dir({"a/b/prog"}, {"elsewhere/file"});
    std::string const program = dir / "a/b/prog";
    for (char const* directory : {"a/b", "a", "elsewhere"}) {
        CAPTURE(directory);
        CHECK(nameOf(program, program, dir / directory) == program);
    }
    CHECK(follow(program, program, dir / "a", {"NAME", "CHDIR=" + (dir / "elsewhere"), "NAME"}) ==
          Strings{program, program});
}

TEST_CASE("a program started by a relative path yields its absolute path") {
    Place const dir({"a/b/prog"}, {"a/c/file"});
    std::string const program = dir / "a/b/prog";
    struct {
        char const* directory;
        char const* argv0;
    } const rows[] = {{"a/b", "./prog"},     {"a/b", "prog"},       {"a", "b/prog"},
                      {"a", "./b/prog"},     {"a/c", "../b/prog"},  {"a/b", "../b/./prog"},
                      {"a/b", ".//.//prog"}, {"a/c", "./../b/prog"}};
    for (auto const& row : rows) {
        CAPTURE(row.directory);
        CAPTURE(row.argv0);
        CHECK(nameOf(program, row.argv0, dir / row.directory) == program);
    }
}

TEST_CASE("a relative first argument is resolved against the working directory of the call") {
    Place const dir({"a/b/prog"}, {"other/prog", "empty/file"});
    std::string const program = dir / "a/b/prog";
    Strings const answers =
        follow(program, "./prog", dir / "a/b",
               {"NAME", "CHDIR=" + (dir / "other"), "NAME", "CHDIR=" + (dir / "empty"), "NAME",
                "EXPECTED=./prog", "CHDIR=" + (dir / "a/b"), "NAME"});
    REQUIRE(answers.size() == 5);
    CHECK(answers == Strings{program, dir / "other/prog", answers[3], answers[3], program});
    CHECK(answers[3] != program);
}

TEST_CASE("a program found through a search path is looked for in the working directory") {
    Place const dir({"bin/prog"}, {"here/prog"});
    CHECK(nameOf(dir / "bin/prog", "prog", dir / "here") == dir / "here/prog");
}

TEST_CASE("symbolic links in the program's path are resolved") {
    Place const dir({"real/bin/prog"}, {"links/file"});
    std::string const program = dir / "real/bin/prog";
    std::filesystem::create_symlink(program, dir / "links/absolute");
    std::filesystem::create_symlink("../real/bin/prog", dir / "links/relative");
    std::filesystem::create_symlink("relative", dir / "links/chain");
    std::filesystem::create_directory_symlink(dir / "real", dir / "links/directory");
    for (char const* link : {"absolute", "relative", "chain", "directory/bin/prog"}) {
        CAPTURE(link);
        std::string const path = dir / "links/" + link;
        CHECK(nameOf(path, path) == program);
        CHECK(nameOf(path, std::string("./") + link, dir / "links") == program);
    }
    CHECK(nameOf(program, "./prog", dir / "links/directory/bin") == program);
}

TEST_CASE("the first argument ends at its first blank") {
    Place const dir({"my apps/bin/prog", "bin/the prog", "bin/prog"}, {"elsewhere/file"});
    std::string const program = dir / "bin/prog";
    std::string const spaced = dir / "bin/the prog";
    std::string const below = dir / "my apps/bin/prog";

    SUBCASE("what comes before the blank need not exist") {
        checkAsRealpath(spaced, spaced, dir / "elsewhere");
        checkAsRealpath(below, below, dir / "elsewhere");
    }
    SUBCASE("what comes before the blank is resolved where it exists") {
        test::writeFile(dir / "bin/the", "");
        std::filesystem::create_directory_symlink("elsewhere", dir / "my");
        CHECK(nameOf(spaced, spaced) == dir / "bin/the");
        CHECK(nameOf(spaced, "./the prog", dir / "bin") == dir / "bin/the");
        CHECK(nameOf(below, below) == dir / "elsewhere");
    }
    SUBCASE("a first argument that begins with a blank is empty") {
        CHECK(nameOf(program, " " + program).empty());
    }
    SUBCASE("options written into the first argument are cut off") {
        CHECK(nameOf(program, program + " --daemon") == program);
    }
    SUBCASE("other white space is part of the name") {
        for (char const* name : {"bin/new\nline", "bin/tab\tulator", "bin/return\r"}) {
            CAPTURE(name);
            test::copyOwnExecutable(dir / name);
            CHECK(nameOf(dir / name, dir / name) == dir / name);
        }
    }
    SUBCASE("blanks in the other arguments do not matter") {
        CHECK(follow(program, program, "/", {"CHDIR=" + (dir / "my apps/bin"), "NAME"}) ==
              Strings{program});
    }
}

TEST_CASE("the name is UTF-8 decoded to wide characters") {
    std::string const folder = "Gr\303\266\303\237e\342\202\254";
    std::string const file = "\360\237\230\200";
    Place const dir({folder + "/" + file, "cut\303"});
    std::string const program = dir / folder + "/" + file;
    CHECK(nameOf(program, program) == program);
    CHECK(nameOf(program, "./" + file, dir / folder) == program);
    // Cut short, the last character comes out as the decoder's question mark.
    CHECK(nameOf(dir / "cut\303", dir / "cut\303") == dir / "cut?");
}

TEST_CASE("a first argument that names nothing gives what realpath leaves behind") {
    Place const dir({"bin/prog"});
    std::string const program = dir / "bin/prog";
    std::filesystem::create_symlink("nowhere/at/all", dir / "dangling");
    std::filesystem::create_symlink("loop", dir / "loop");
    struct {
        char const* label;
        std::string argv0;
    } const rows[] = {{"nothing there", dir / "bin/none"},
                      {"no directory there", dir / "none/at/all"},
                      {"far away", "/koru-none/bin/prog"},
                      {"relative", "none/at/all"},
                      {"a file in the directory's place", program + "/prog"},
                      {"a dangling link", dir / "dangling"},
                      {"a link to itself", dir / "loop"},
                      {"a component too long", dir / std::string(300, 'x') + "/prog"},
                      {"a shell's way of naming", "-prog"}};
    for (auto const& row : rows) {
        CAPTURE(row.label);
        checkAsRealpath(program, row.argv0, dir.path());
    }
}

TEST_CASE("an empty first argument gives an empty name") {
    Place const dir({"prog"});
    CHECK(nameOf(dir / "prog", "", dir.path()).empty());
}

TEST_CASE("a process without arguments has an empty name") {
    // Newer kernels put an empty first argument there; older ones leave cmdline empty.
    test::Outcome const outcome = test::inChild([] {
        std::string const program = test::ownExecutable();
        char* const none[] = {nullptr};
        if (::setenv("KORU_TEST_WITHOUT_ARGUMENTS", "1", 1) != 0) return 126;
        ::execv(program.c_str(), none);
        return 127;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "<>");
}

TEST_CASE("of a long first argument 4095 bytes count") {
    Place const dir({"prog"}, {"pro"});
    std::string const program = dir / "prog";
    auto const stretched = [&](std::size_t size) {
        return dir.path() + std::string(size - dir.path().size() - 4, '/') + "prog";
    };
    struct {
        char const* label;
        std::string argv0, expected;
    } const rows[] = {{"all of 4094 bytes", stretched(4094), program},
                      {"all of 4095 bytes", stretched(4095), program},
                      {"all but the last of 4096 bytes", stretched(4096), dir / "pro"},
                      {"4095 bytes before others", stretched(4095) + "ression", program},
                      {"4095 bytes before a directory", stretched(4095) + "/x/y", program},
                      {"4095 bytes before a blank", stretched(4095) + " x", program},
                      {"a blank as byte 4095", stretched(4094) + " x", program},
                      {"4095 bytes of 100000", stretched(4095) + std::string(95905, 'x'), program},
                      {"a relative one",
                       "./" + std::string(4089, '/') + "prog" + std::string(5000, 'x'), program}};
    for (auto const& row : rows) {
        CAPTURE(row.label);
        CHECK(nameOf(program, row.argv0, dir.path()) == row.expected);
    }
    checkAsRealpath(program, dir / std::string(5000, 'x'), "/");
}

TEST_CASE("a working directory too deep for a path gives what realpath leaves behind") {
    Place const dir({"prog"});
    std::string const component(250, 'd');
    std::filesystem::path const before = std::filesystem::current_path();
    std::filesystem::current_path(dir.path());
    Strings const instructions(18, "CHDIR=" + component);
    for (std::size_t depth = 0; depth < instructions.size(); ++depth) {
        CHECK(std::filesystem::create_directory(component));
        CHECK(::chdir(component.c_str()) == 0);
    }
    std::filesystem::current_path(before);
    checkAsRealpath(dir / "prog", "prog", dir.path(), instructions);
}

TEST_CASE("the file system is asked at every call") {
    Place const dir({"prog"}, {"real"});
    std::filesystem::create_symlink("real", dir / "link");
    Strings const answers = follow(dir / "prog", dir / "link", dir.path(),
                                   {"NAME", "UNLINK=link", "NAME", "EXPECTED=" + (dir / "link")});
    REQUIRE(answers.size() == 3);
    CHECK(answers[0] == dir / "real");
    CHECK(answers[1] == answers[2]);
    CHECK(answers[1] != answers[0]);
}

TEST_CASE("the first argument is read at every call, as the process may overwrite it") {
    Place const dir({"prog1"}, {"prog2"});
    CHECK(
        follow(dir / "prog1", dir / "prog1", "/", {"NAME", "RETITLE=" + (dir / "prog2"), "NAME"}) ==
        Strings{dir / "prog1", dir / "prog2"});
}

namespace {

/// Leaves text where the stack of the next call will be.
[[gnu::noinline]] void soilStack() {
    char text[32 * 1024];
    std::memset(text, '/', sizeof text);
    asm volatile("" : : "r"(text) : "memory");
}

} // namespace

TEST_CASE("a process that can open no file has an empty name") {
    test::Outcome const outcome = test::inChild([] {
        soilStack();
        rlimit limit{0, 0};
        ::getrlimit(RLIMIT_NOFILE, &limit);
        rlimit const none{0, limit.rlim_max}; // descriptors
        if (::setrlimit(RLIMIT_NOFILE, &none) != 0 || !processFileName().empty()) return 1;
        if (::setrlimit(RLIMIT_NOFILE, &limit) != 0 || processFileName().empty()) return 2;
        return 0;
    });
    CHECK(outcome.exitCode == 0);
}

TEST_CASE("getProcessFileName leaves no file open") {
    auto const before = openFiles();
    for (int i = 0; i < 20; ++i) static_cast<void>(System::getProcessFileName());
    CHECK(openFiles() == before);
}

TEST_CASE("a thread cancelled in getProcessFileName leaves no file open") {
    for (CancelledIn const call : {CancelledIn::READ, CancelledIn::CLOSE}) {
        CAPTURE(call == CancelledIn::READ);
        auto const before = openFiles();
        bool const cancelled = test::endsCancelled(
            [call] {
                cancelledIn = call;
                static_cast<void>(System::getProcessFileName());
                ::pthread_testcancel();
            },
            [](pthread_t) {});
        CHECK(cancelled);
        CHECK(openFiles() == before);
    }
}

TEST_CASE("a thread that asks for nothing but the name can be cancelled, and leaves no file open") {
    auto const before = openFiles();
    for (int i = 0; i < 40; ++i) {
        bool const cancelled = test::endsCancelled(
            [] {
                for (;;) static_cast<void>(System::getProcessFileName());
            },
            [i](pthread_t thread) {
                for (int turn = 0; turn < i % 8; ++turn) ::sched_yield();
                ::pthread_cancel(thread);
            });
        REQUIRE(cancelled);
    }
    CHECK(openFiles() == before);
}

TEST_CASE("several threads may ask for the name at once") {
    std::wstring const expected = System::getProcessFileName();
    std::array<int, 4> correct{};
    std::vector<std::thread> threads;
    for (int& count : correct) {
        threads.emplace_back([&count, &expected] {
            for (int i = 0; i < 200; ++i) count += System::getProcessFileName() == expected;
        });
    }
    for (std::thread& thread : threads) thread.join();
    CHECK(correct == std::array<int, 4>{200, 200, 200, 200});
}
