// What docs/ warns of where several things meet: a file object and an exception, a child process, a
// dead thread or a full disk; and a log in several processes.
#include <doctest/doctest.h>

#include <dlfcn.h>
#include <pthread.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <vector>

#include <koru/dynamiclibrary.h>
#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/logfile.h>
#include <koru/mutex.h>
#include <koru/propertyfile.h>

#include "support/cancellation.h"
#include "support/subprocess.h"
#include "support/systemcalls.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::InitializationFile;
using Koru::LogFile;
using test::Call;
using test::FailingCall;
using test::messageOf;
using test::readFile;
using test::TempDir;
using test::writeFile;

namespace {

unsigned int const READ_WRITE = 3;

std::atomic<int> errorOfClosing{0};

void put(std::ostream& os, std::string const& text) {
    os.write(text.data(), static_cast<std::streamsize>(text.size()));
}

} // namespace

// The last of the system's answers about a file: what a quota or a server refuses is told by
// close(2), after all has been written.
extern "C" int fclose(FILE* stream) {
    int const result = test::realFunction<int (*)(FILE*)>("fclose")(stream);
    if (errorOfClosing == 0) return result;
    errno = errorOfClosing;
    return EOF;
}

// ----------------------------------------------------------------------------------- declarations

TEST_CASE("parentheses around a path of a variable declare a function, braces make a file") {
    TempDir const directory;
    std::wstring const name = directory.wide("app.ini");
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wvexing-parse"
    InitializationFile function(Koru::File::Path(name));
#pragma GCC diagnostic pop
    static_assert(std::is_function<decltype(function)>::value, "");
    InitializationFile braces{Koru::File::Path(name)};
    InitializationFile text(name);
    static_assert(std::is_same<decltype(braces), InitializationFile>::value, "");
    bool const same = braces.getName() == name && text.getName() == name;
    CHECK(same);
}

// ------------------------------------------------------------------------------------ odd lines

TEST_CASE("a header of brackets alone keeps those that one trim at each end leaves") {
    struct Row {
        char const* header;
        std::wstring section;
    };
    TempDir const directory;
    std::string const path = directory / "app.ini";
    for (Row const& row : {Row{"[]", L"["}, Row{"[]]", L"["}, Row{"[[]]", L"[["}, Row{"[[", L"[["},
                           Row{"[][", L"]["}, Row{"[]x", L"]x"}, Row{"[x[]", L"x["}}) {
        CAPTURE(row.header);
        writeFile(path, std::string(row.header) + "\nk=v\n");
        InitializationFile file(path);
        file.open(Koru::File::READ);
        bool const named = file.enumerateSections() == std::vector<std::wstring>{row.section};
        CHECK(named);
    }
}

TEST_CASE("a NUL in a line is text, up to which names and values count") {
    using namespace std::string_literals;
    TempDir const directory;
    std::string const path = directory / "app.ini";
    writeFile(path, "[s\0]]\na\0b=1\nc=2 \0 \n\0d=3\ne\0#=4\n[\0t]\nf=5\n"s);
    InitializationFile sections(path);
    sections.open(Koru::File::READ);
    using Texts = std::vector<std::wstring>;
    bool const headers = sections.enumerateSections() == Texts{L"s"};
    bool const keys = sections.enumerateKeys(L"s") == Texts{L"a", L"c", L"e"};
    CHECK(headers);
    CHECK(keys);
    Koru::PropertyFile properties(path);
    properties.open(Koru::File::READ);
    bool const flat = properties.enumerateKeys() == Texts{L"a", L"c", L"e", L"f"};
    bool const blank = properties.getValue(L"c") == L"2 ";
    CHECK(flat);
    CHECK(blank);
}

// ----------------------------------------------------------- an exception, a child, a dead thread

namespace {

/// Sets a value, then fails before the second one is set.
void change(std::string const& path, bool givesUp) {
    InitializationFile settings(path);
    settings.open(READ_WRITE);
    try {
        settings.setValue(L"net", L"host", L"new");
        throw std::runtime_error("no port");
    } catch (...) {
        if (givesUp) settings.setMode(0);
        throw;
    }
}

} // namespace

TEST_CASE("what was set before an exception is written, unless the mode is set to 0") {
    TempDir const directory;
    std::string const path = directory / "app.ini";
    std::string const old = "[net]\nhost=old\nport=1\n";
    writeFile(path, old);
    CHECK(messageOf<std::runtime_error>([&] { change(path, true); }) == "no port");
    CHECK(readFile(path) == old);
    CHECK(messageOf<std::runtime_error>([&] { change(path, false); }) == "no port");
    CHECK(readFile(path) == "[net]\nhost=new\nport=1\n");
}

namespace {

/// Opens and changes a file that lives as long as the process, and has a child end.
/// @return what the file holds afterwards, as far as the parent has not closed it
template <class Ending>
std::string writtenByChild(std::string const& path, Ending ending) {
    test::Outcome const outcome = test::inChild([&] {
        static InitializationFile settings(path);
        settings.open(READ_WRITE);
        settings.setValue(L"s", L"k", L"unfinished");
        pid_t const child = ::fork();
        if (child == 0) ending();
        int status = -1;
        ::waitpid(child, &status, 0);
        settings.setMode(0);
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    });
    CHECK(outcome.exitCode == 0);
    return readFile(path);
}

} // namespace

TEST_CASE("a child that calls exit writes the files of static objects, one that calls _exit none") {
    TempDir const directory;
    std::string const path = directory / "app.ini";
    writeFile(path, "[s]\nk=old\n");
    CHECK(writtenByChild(path, [] { ::_exit(0); }) == "[s]\nk=old\n");
    CHECK(writtenByChild(path, [] { std::exit(0); }) == "[s]\nk=unfinished\n");
}

TEST_CASE("a child that calls exit writes out what its parent had buffered, as the parent does") {
    TempDir const directory;
    std::string const path = directory / "program.log";
    test::Outcome const outcome = test::inChild([&] {
        static LogFile log(path);
        log.open(READ_WRITE);
        put(log, "line\n");
        pid_t const child = ::fork();
        if (child == 0) std::exit(0);
        ::waitpid(child, nullptr, 0);
        log.close();
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(readFile(path) == "line\nline\n");
}

TEST_CASE("a child has lost the lock that the thread held which forked it") {
    Koru::Mutex mutex;
    mutex.lock();
    test::Outcome const outcome = test::inChild([&] {
        mutex.unlock(); // gives nothing back, as the child's thread does not hold it
        return messageOf<std::runtime_error>([&] { mutex.lock(3); }) ==
                       "failed to obtain mutex within timeout"
                   ? 0
                   : 1;
    });
    CHECK(outcome.exitCode == 0);
    mutex.lock(1); // which the parent still holds
    mutex.unlock();
    mutex.unlock();
}

TEST_CASE("destroying an open file waits for a lock that a dead thread holds") {
    TempDir const directory;
    test::Outcome const outcome = test::inChild([&] {
        std::signal(SIGALRM, SIG_DFL);
        Koru::File file(directory.wide("file"));
        file.open(Koru::File::WRITE);
        std::thread([&] { file.lock(); }).join();
        ::alarm(1);
        return 0;
    });
    CHECK(outcome.signal == SIGALRM);
}

TEST_CASE("a file whose thread is cancelled while close writes is closed without its last text") {
    TempDir const directory;
    std::string const path = directory / "file";
    Koru::File file(directory.wide("file"));
    file.open(Koru::File::WRITE);
    put(file, "buffered");
    CHECK(test::endsCancelled(
        [&] {
            test::callsBeforeCancellation = 0;
            file.close();
        },
        [](pthread_t) {}));
    CHECK(!file.is_open());
    CHECK(readFile(path).empty());
}

// ------------------------------------------------------------------------------ what close reports

TEST_CASE_TEMPLATE("what only closing finds is in the fail state, and the table is gone", Family,
                   InitializationFile, Koru::PropertyFile) {
    TempDir const directory;
    std::string const path = directory / "file";
    writeFile(path, "[s]\nk=1\n");
    Family file(path);
    file.open(READ_WRITE);
    errorOfClosing = EDQUOT;
    CHECK(messageOf<std::runtime_error>([&] { file.close(); }) == "<nothing>");
    errorOfClosing = 0;
    CHECK(file.fail());
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0);
    file.setMode(Koru::File::WRITE); // which would write the table
    file.close();
    CHECK(readFile(path).empty());
}

TEST_CASE("close of a file that was written without an error leaves no fail state") {
    TempDir const directory;
    InitializationFile file(directory / "app.ini");
    file.open(READ_WRITE);
    file.setstate(std::ios::failbit); // which writing clears
    file.close();
    CHECK(!file.fail());
}

TEST_CASE("a file that can be neither deleted nor opened stays as it was") {
    if (::getuid() != 0) return; // only root has a file that another user can but read
    TempDir const directory;
    std::string const path = directory / "app.ini";
    writeFile(path, "[s]\nk=1\n");
    ::chmod(directory.path().c_str(), 0755);
    ::chmod(path.c_str(), 0644);
    test::Outcome const outcome = test::inChild([&] {
        if (::setuid(65534) != 0) return 1;
        InitializationFile file(path);
        file.open(Koru::File::READ);
        file.setMode(READ_WRITE);
        std::string const message = messageOf<std::runtime_error>([&] { file.close(); });
        bool const whole = file.getValue(L"s", L"k") == L"1";
        return message == "failed to open file." && whole && file.getMode() == 0 ? 0 : 2;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(readFile(path) == "[s]\nk=1\n");
}

// -------------------------------------------------------------------------------------------- logs

TEST_CASE("a log that another creates between the two attempts to open it is emptied") {
    TempDir const directory;
    std::string const path = directory / "program.log";
    writeFile(path, "the other's line\n");
    LogFile log(path);
    FailingCall const missingAtFirst(Call::OPEN, ENOENT);
    log.open(READ_WRITE);
    CHECK(readFile(path).empty());
}

TEST_CASE("a log that was open when it was opened writes nothing until its state is cleared") {
    TempDir const directory;
    std::string const path = directory / "program.log";
    LogFile log(path);
    log.open(READ_WRITE);
    log.open(READ_WRITE);
    CHECK(log.fail());
    put(log, "lost\n");
    log.clear();
    put(log, "kept\n");
    log.close();
    CHECK(readFile(path) == "kept\n");
}

TEST_CASE("a line of one write and one flush reaches the system at once, however long it is") {
    TempDir const directory;
    std::string const path = directory / "program.log";
    for (std::size_t const size : {1UL, 1023UL, 1024UL, 8191UL, 8192UL, 300000UL}) {
        CAPTURE(size);
        LogFile log(path);
        log.open(Koru::File::WRITE);
        FailingCall const writes(Call::WRITE, 0, 1000);
        put(log, std::string(size - 1, 'l') + '\n');
        log.flush();
        CHECK(writes.made() == 1);
        CHECK(readFile(path).size() == size);
    }
}

TEST_CASE("a piece of 1,024 bytes or more reaches the system before the rest of its line") {
    TempDir const directory;
    std::string const path = directory / "program.log";
    struct Row {
        std::size_t piece;
        std::size_t seen;
        long writes;
    };
    for (Row const& row : {Row{1023, 0, 1}, Row{1024, 1027, 2}, Row{8000, 8003, 2}}) {
        CAPTURE(row.piece);
        LogFile log(path);
        log.open(Koru::File::WRITE);
        FailingCall const writes(Call::WRITE, 0, 1000);
        put(log, "at ");
        put(log, std::string(row.piece, 'l'));
        CHECK(readFile(path).size() == row.seen);
        put(log, "\n");
        log.flush();
        CHECK(writes.made() == row.writes);
    }
}

TEST_CASE("short pieces reach the system together, up to what the buffer takes") {
    TempDir const directory;
    std::string const path = directory / "program.log";
    for (bool const fits : {true, false}) {
        LogFile log(path);
        log.open(Koru::File::WRITE);
        FailingCall const writes(Call::WRITE, 0, 1000);
        for (std::size_t size = 0; size < (fits ? 8000U : 9000U); size += 100)
            put(log, std::string(100, 'l'));
        log.flush();
        CHECK(writes.made() == (fits ? 1 : 2));
    }
}

// --------------------------------------------------------------------------------------- libraries

// The sanitizers call the loader in the program's place, and it searches for them.
TEST_CASE("a name without a slash is not searched for in the program's own folders" *
          doctest::skip(!test::MALLOC_CAN_FAIL)) {
    CHECK(!Koru::DynamicLibrary(L"libkoru.so").load());
    CHECK(Koru::DynamicLibrary(L"$ORIGIN/libkoru.so").load()); // which lies beside itself
    void* const own = ::dlopen("libkoru.so", RTLD_LAZY);
    CHECK(own != nullptr);
    if (own != nullptr) ::dlclose(own);
}
