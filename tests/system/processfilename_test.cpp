// The executable's own path. The interesting processes are copies of this executable, started from
// other directories and under other names; each follows the instructions in its arguments and
// answers with what it sees.
#include <koru/string.h>
#include <koru/system.h>

#include <fcntl.h>
#include <pthread.h>
#include <sched.h>
#include <stdlib.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cstddef>
#include <cstring>
#include <filesystem>
#include <iterator>
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
// test can have a thread cancelled in either.
namespace {

enum class CancelledIn { NOTHING, READ, CLOSE };
thread_local CancelledIn cancelledIn = CancelledIn::NOTHING;

void _cancelIn(CancelledIn call) {
    if (cancelledIn != call) return;
    cancelledIn = CancelledIn::NOTHING;
    ::pthread_cancel(::pthread_self());
    ::pthread_testcancel();
}

} // namespace

extern "C" ssize_t read(int fd, void* buffer, size_t count) {
    _cancelIn(CancelledIn::READ);
    return static_cast<ssize_t>(::syscall(SYS_read, fd, buffer, count));
}

extern "C" int close(int fd) {
    _cancelIn(CancelledIn::CLOSE);
    return static_cast<int>(::syscall(SYS_close, fd));
}

namespace {

std::string processFileName() { return Koru::make_string(Koru::System::getProcessFileName()); }

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

/// The name while no file can be opened, for want of descriptors.
std::string processFileNameWithoutFiles() {
    rlimit limit{};
    require(::getrlimit(RLIMIT_NOFILE, &limit) == 0);
    rlimit const none{0, limit.rlim_max};
    require(::setrlimit(RLIMIT_NOFILE, &none) == 0);
    bool const refused = ::open("/proc/self/cmdline", O_RDONLY | O_CLOEXEC) == -1;
    std::string name = processFileName();
    require(::setrlimit(RLIMIT_NOFILE, &limit) == 0);
    require(refused);
    return name;
}

/// `NAME` is what the library says, `EXPECTED=argv0` what it has to say in the same state of the
/// process; the others change that state.
int follow(int count, char** instructions) {
    for (int i = 0; i < count; ++i) {
        std::string const instruction = instructions[i];
        std::size_t const equals = instruction.find('=');
        std::string const verb = instruction.substr(0, equals);
        std::string const operand =
            equals == std::string::npos ? "" : instruction.substr(equals + 1);
        if (verb == "NAME") {
            test::answer(processFileName());
        } else if (verb == "EXPECTED") {
            test::answer(Koru::make_string(Koru::make_wstring(resolved(operand))));
        } else if (verb == "CHDIR") {
            require(::chdir(operand.c_str()) == 0);
        } else if (verb == "UNLINK") {
            require(::unlink(operand.c_str()) == 0);
        } else if (verb == "RETITLE") {
            // argv[0], two places before the first instruction, lies where cmdline is read from.
            require(operand.size() == std::strlen(instructions[-2]));
            std::memcpy(instructions[-2], operand.data(), operand.size());
        } else if (verb == "NAME_WITHOUT_FILES") {
            test::answer(processFileNameWithoutFiles());
        } else {
            return 1;
        }
    }
    return 0;
}

test::RegisterSelf const registration("follow", follow);

using Strings = std::vector<std::string>;

Strings follow(std::string const& program, std::string const& argv0, std::string const& directory,
               Strings const& instructions) {
    return test::ask(program, argv0, directory, "follow", instructions);
}

/// A name for the program `directory`/`file` that is exactly `size` bytes long.
std::string stretched(std::string const& directory, std::string const& file, std::size_t size) {
    return directory + std::string(size - directory.size() - file.size(), '/') + file;
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

std::wstring const beforeMain = Koru::System::getProcessFileName();

} // namespace

TEST_CASE("System holds nothing and can be made and destroyed") {
    static_assert(std::is_empty<Koru::System>::value, "static functions only");
    static_assert(std::is_default_constructible<Koru::System>::value, "");
    static_assert(std::is_destructible<Koru::System>::value, "");
    Koru::System const system{};
    CHECK(system.getProcessFileName() == Koru::System::getProcessFileName());
}

TEST_CASE("getProcessFileName is a static function of no arguments that gives a wide string") {
    std::wstring (*const function)() = &Koru::System::getProcessFileName;
    CHECK(function() == Koru::System::getProcessFileName());
}

TEST_CASE("the running test's own name is its first argument, resolved") {
    std::string const commandLine = test::readFile("/proc/self/cmdline");
    CHECK(processFileName() == resolved(commandLine.c_str()));
}

TEST_CASE("the name is to be had from a static constructor of the program") {
    CHECK(beforeMain == Koru::System::getProcessFileName());
}

TEST_CASE("a program started by its absolute path yields that path from any directory") {
    test::TempDir const dir;
    std::filesystem::create_directories(dir / "a/b");
    std::filesystem::create_directories(dir / "elsewhere");
    std::string const program = dir / "a/b/prog";
    test::copyOwnExecutable(program);

    for (std::string const& directory : {dir / "a/b", dir / "a", dir / "elsewhere"}) {
        CAPTURE(directory);
        CHECK(follow(program, program, directory, {"NAME"}) == Strings{program});
    }
    CHECK(follow(program, program, dir / "a", {"NAME", "CHDIR=" + (dir / "elsewhere"), "NAME"}) ==
          Strings{program, program});
}

TEST_CASE("a program started by a relative path yields its absolute path") {
    test::TempDir const dir;
    std::filesystem::create_directories(dir / "a/b");
    std::filesystem::create_directories(dir / "a/c");
    std::string const program = dir / "a/b/prog";
    test::copyOwnExecutable(program);

    struct {
        std::string directory, argv0;
    } const rows[] = {{dir / "a/b", "./prog"},     {dir / "a/b", "prog"},
                      {dir / "a", "b/prog"},       {dir / "a", "./b/prog"},
                      {dir / "a/c", "../b/prog"},  {dir / "a/b", "../b/./prog"},
                      {dir / "a/b", ".//.//prog"}, {dir / "a/c", "./../b/prog"}};
    for (auto const& row : rows) {
        CAPTURE(row.directory);
        CAPTURE(row.argv0);
        CHECK(follow(program, row.argv0, row.directory, {"NAME"}) == Strings{program});
    }
}

TEST_CASE("a relative first argument is resolved against the working directory of the call") {
    test::TempDir const dir;
    std::filesystem::create_directories(dir / "a/b");
    std::filesystem::create_directories(dir / "other");
    std::filesystem::create_directories(dir / "empty");
    std::string const program = dir / "a/b/prog";
    test::copyOwnExecutable(program);
    test::writeFile(dir / "other/prog", "not even a program");

    Strings const answers =
        follow(program, "./prog", dir / "a/b",
               {"NAME", "CHDIR=" + (dir / "other"), "NAME", "CHDIR=" + (dir / "empty"), "NAME",
                "EXPECTED=./prog", "CHDIR=" + (dir / "a/b"), "NAME"});
    REQUIRE(answers.size() == 5);
    CHECK(answers[0] == program);
    CHECK(answers[1] == dir / "other/prog");
    CHECK(answers[2] == answers[3]);
    CHECK(answers[2] != program);
    CHECK(answers[4] == program);
}

TEST_CASE("a program found through a search path is looked for in the working directory") {
    test::TempDir const dir;
    std::filesystem::create_directories(dir / "bin");
    std::filesystem::create_directories(dir / "here");
    test::copyOwnExecutable(dir / "bin/prog");
    test::writeFile(dir / "here/prog", "");

    CHECK(follow(dir / "bin/prog", "prog", dir / "here", {"NAME"}) == Strings{dir / "here/prog"});
}

TEST_CASE("symbolic links in the program's path are resolved") {
    test::TempDir const dir;
    std::filesystem::create_directories(dir / "real/bin");
    std::filesystem::create_directories(dir / "links");
    std::string const program = dir / "real/bin/prog";
    test::copyOwnExecutable(program);
    std::filesystem::create_symlink(program, dir / "links/file");
    std::filesystem::create_symlink("../real/bin/prog", dir / "links/relative");
    std::filesystem::create_symlink("relative", dir / "links/chain");
    std::filesystem::create_directory_symlink(dir / "real", dir / "links/directory");

    for (char const* link : {"file", "relative", "chain", "directory/bin/prog"}) {
        CAPTURE(link);
        std::string const path = dir / "links/" + link;
        CHECK(follow(path, path, "/", {"NAME"}) == Strings{program});
        CHECK(follow(path, std::string("./") + link, dir / "links", {"NAME"}) == Strings{program});
    }
    CHECK(follow(program, "./prog", dir / "links/directory/bin", {"NAME"}) == Strings{program});
}

TEST_CASE("the first argument ends at its first blank") {
    test::TempDir const dir;
    std::filesystem::create_directories(dir / "my apps/bin");
    std::filesystem::create_directories(dir / "bin");
    std::filesystem::create_directories(dir / "elsewhere");
    test::copyOwnExecutable(dir / "my apps/bin/prog");
    test::copyOwnExecutable(dir / "bin/the prog");
    test::copyOwnExecutable(dir / "bin/prog");

    SUBCASE("what stands before the blank need not exist") {
        for (char const* name : {"my apps/bin/prog", "bin/the prog"}) {
            CAPTURE(name);
            std::string const program = dir / name;
            Strings const answers =
                follow(program, program, dir / "elsewhere", {"NAME", "EXPECTED=" + program});
            REQUIRE(answers.size() == 2);
            CHECK(answers[0] == answers[1]);
            CHECK(answers[0] != program);
        }
    }
    SUBCASE("what stands before the blank is resolved where it exists") {
        test::writeFile(dir / "bin/the", "");
        std::filesystem::create_directory_symlink("elsewhere", dir / "my");
        CHECK(follow(dir / "bin/the prog", dir / "bin/the prog", "/", {"NAME"}) ==
              Strings{dir / "bin/the"});
        CHECK(follow(dir / "bin/the prog", "./the prog", dir / "bin", {"NAME"}) ==
              Strings{dir / "bin/the"});
        CHECK(follow(dir / "my apps/bin/prog", dir / "my apps/bin/prog", "/", {"NAME"}) ==
              Strings{dir / "elsewhere"});
    }
    SUBCASE("a first argument that begins with a blank is empty") {
        CHECK(follow(dir / "bin/prog", " " + (dir / "bin/prog"), "/", {"NAME"}) == Strings{""});
    }
    SUBCASE("options written into the first argument are cut off") {
        CHECK(follow(dir / "bin/prog", (dir / "bin/prog") + " --daemon", "/", {"NAME"}) ==
              Strings{dir / "bin/prog"});
    }
    SUBCASE("other white space is part of the name") {
        for (char const* name : {"bin/new\nline", "bin/tab\tulator", "bin/return\r"}) {
            CAPTURE(name);
            std::string const program = dir / name;
            std::filesystem::rename(dir / "bin/prog", program);
            CHECK(follow(program, program, "/", {"NAME"}) == Strings{program});
            std::filesystem::rename(program, dir / "bin/prog");
        }
    }
    SUBCASE("blanks in the other arguments do not matter") {
        CHECK(follow(dir / "bin/prog", dir / "bin/prog", "/",
                     {"CHDIR=" + (dir / "my apps/bin"), "NAME"}) == Strings{dir / "bin/prog"});
    }
}

TEST_CASE("the name is UTF-8 decoded to wide characters") {
    test::TempDir const dir;
    std::string const directory = dir / "Gr\xC3\xB6\xC3\x9F"
                                        "e\xE2\x82\xAC";
    std::filesystem::create_directories(directory);
    std::string const program = directory + "/\xF0\x9F\x98\x80";
    test::copyOwnExecutable(program);

    CHECK(follow(program, program, "/", {"NAME"}) == Strings{program});
    CHECK(follow(program, "./\xF0\x9F\x98\x80", directory, {"NAME"}) == Strings{program});

    // Cut short, the last character comes out as the decoder's question mark.
    test::copyOwnExecutable(dir / "cut\xC3");
    CHECK(follow(dir / "cut\xC3", dir / "cut\xC3", "/", {"NAME"}) == Strings{dir / "cut?"});
}

TEST_CASE("a first argument that names nothing gives what realpath leaves behind") {
    test::TempDir const dir;
    std::filesystem::create_directories(dir / "bin");
    std::string const program = dir / "bin/prog";
    test::copyOwnExecutable(program);
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
        Strings const answers =
            follow(program, row.argv0, dir.path(), {"NAME", "EXPECTED=" + row.argv0});
        REQUIRE(answers.size() == 2);
        CHECK(answers[0] == answers[1]);
        CHECK(answers[0] != program);
    }
}

TEST_CASE("an empty first argument gives an empty name") {
    test::TempDir const dir;
    test::copyOwnExecutable(dir / "prog");
    CHECK(follow(dir / "prog", "", dir.path(), {"NAME"}) == Strings{""});
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
    test::TempDir const dir;
    std::string const program = dir / "prog";
    test::copyOwnExecutable(program);
    test::writeFile(dir / "pro", "");

    struct {
        char const* label;
        std::string argv0, expected;
    } const rows[] = {
        {"all of 4094 bytes", stretched(dir.path(), "prog", 4094), program},
        {"all of 4095 bytes", stretched(dir.path(), "prog", 4095), program},
        {"all but the last of 4096 bytes", stretched(dir.path(), "prog", 4096), dir / "pro"},
        {"4095 bytes before others", stretched(dir.path(), "prog", 4095) + "ression", program},
        {"4095 bytes before a directory", stretched(dir.path(), "prog", 4095) + "/x/y", program},
        {"4095 bytes before a blank", stretched(dir.path(), "prog", 4095) + " x", program},
        {"a blank as byte 4095", stretched(dir.path(), "prog", 4094) + " x", program},
        {"4095 bytes of 100000", stretched(dir.path(), "prog", 4095) + std::string(95905, 'x'),
         program},
        {"a relative one", "./" + std::string(4089, '/') + "prog" + std::string(5000, 'x'),
         program}};
    for (auto const& row : rows) {
        CAPTURE(row.label);
        CHECK(follow(program, row.argv0, dir.path(), {"NAME"}) == Strings{row.expected});
    }

    std::string const nothing = dir / std::string(5000, 'x');
    Strings const answers = follow(program, nothing, "/", {"NAME", "EXPECTED=" + nothing});
    REQUIRE(answers.size() == 2);
    CHECK(answers[0] == answers[1]);
    CHECK(answers[0] != program);
}

TEST_CASE("a working directory too deep for a path gives what realpath leaves behind") {
    test::TempDir const dir;
    test::copyOwnExecutable(dir / "prog");
    std::string const component(250, 'd');
    int at = ::open(dir.path().c_str(), O_DIRECTORY | O_RDONLY | O_CLOEXEC);
    Strings instructions;
    for (int depth = 0; depth < 18; ++depth) {
        REQUIRE(::mkdirat(at, component.c_str(), 0700) == 0);
        int const below = ::openat(at, component.c_str(), O_DIRECTORY | O_RDONLY | O_CLOEXEC);
        REQUIRE(below >= 0);
        ::close(at);
        at = below;
        instructions.push_back("CHDIR=" + component);
    }
    ::close(at);
    instructions.insert(instructions.end(), {"NAME", "EXPECTED=prog"});

    Strings const answers = follow(dir / "prog", "prog", dir.path(), instructions);
    REQUIRE(answers.size() == 2);
    CHECK(answers[0] == answers[1]);
}

TEST_CASE("the file system is asked at every call") {
    test::TempDir const dir;
    std::string const program = dir / "prog";
    test::copyOwnExecutable(program);
    test::writeFile(dir / "real", "");
    std::filesystem::create_symlink("real", dir / "link");

    Strings const answers = follow(program, dir / "link", dir.path(),
                                   {"NAME", "UNLINK=link", "NAME", "EXPECTED=" + (dir / "link")});
    REQUIRE(answers.size() == 3);
    CHECK(answers[0] == dir / "real");
    CHECK(answers[1] == answers[2]);
    CHECK(answers[1] != answers[0]);
}

TEST_CASE("the first argument is read at every call, as the process may overwrite it") {
    test::TempDir const dir;
    test::copyOwnExecutable(dir / "prog1");
    test::writeFile(dir / "prog2", "");

    CHECK(
        follow(dir / "prog1", dir / "prog1", "/", {"NAME", "RETITLE=" + (dir / "prog2"), "NAME"}) ==
        Strings{dir / "prog1", dir / "prog2"});
}

TEST_CASE("a process that can open no file has an empty name") {
    test::TempDir const dir;
    test::copyOwnExecutable(dir / "prog");
    CHECK(follow(dir / "prog", dir / "prog", "/", {"NAME", "NAME_WITHOUT_FILES", "NAME"}) ==
          Strings{dir / "prog", "", dir / "prog"});
}

namespace {

std::ptrdiff_t openFiles() {
    std::filesystem::directory_iterator const first("/proc/self/fd");
    return std::distance(begin(first), end(first));
}

} // namespace

TEST_CASE("getProcessFileName leaves no file open") {
    auto const before = openFiles();
    for (int i = 0; i < 20; ++i) static_cast<void>(Koru::System::getProcessFileName());
    CHECK(openFiles() == before);
}

TEST_CASE("a thread cancelled in getProcessFileName leaves no file open") {
    for (CancelledIn const call : {CancelledIn::READ, CancelledIn::CLOSE}) {
        CAPTURE(call == CancelledIn::READ);
        auto const before = openFiles();
        bool const cancelled = test::endsCancelled(
            [call] {
                cancelledIn = call;
                static_cast<void>(Koru::System::getProcessFileName());
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
                for (;;) static_cast<void>(Koru::System::getProcessFileName());
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
    std::wstring const expected = Koru::System::getProcessFileName();
    std::array<int, 4> correct{};
    std::vector<std::thread> threads;
    for (int& count : correct) {
        threads.emplace_back([&count, &expected] {
            for (int i = 0; i < 200; ++i) {
                count += Koru::System::getProcessFileName() == expected ? 1 : 0;
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    CHECK(correct == std::array<int, 4>{200, 200, 200, 200});
}
