// What docs/ warns of where several things meet: a file object and an exception, a child process, a
// dead thread or a full disk; and a log in several processes.
#include <doctest/doctest.h>

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

#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/logfile.h>
#include <koru/mutex.h>
#include <koru/propertyfile.h>
#include <koru/string.h>

#include "support/cancellation.h"
#include "support/skip.h"
#include "support/subprocess.h"
#include "support/systemcalls.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::InitializationFile;
using Koru::LogFile;
using test::Call;
using test::FailingCall;
using test::messageOf;

namespace {

using Texts = std::vector<std::wstring>;
unsigned int const READ_WRITE = 3;

/// A file's place in a directory of its own.
struct Place {
    Place() = default;
    explicit Place(std::string const& text) { write(text); }
    void write(std::string const& text) const { test::writeFile(path, text); }
    std::string text() const { return test::readFile(path); }

    test::TempDir directory;
    std::string path = directory / "file";
};

void put(std::ostream& os, std::string const& text) {
    os.write(text.data(), static_cast<std::streamsize>(text.size()));
}

/// A log that is open in the place.
struct OpenLog : LogFile {
    explicit OpenLog(Place const& place) : LogFile(place.path) { open(READ_WRITE); }
};

} // namespace

TEST_CASE("parentheses around a path of a variable declare a function, braces make a file") {
    test::TempDir const directory;
    std::wstring const name = directory.wide("app.ini");
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wvexing-parse"
    InitializationFile function(Koru::File::Path(name));
#pragma GCC diagnostic pop
    static_assert(std::is_function_v<decltype(function)>);
    InitializationFile braces{Koru::File::Path(name)};
    InitializationFile text(name);
    CHECK(braces.getName() == name);
    CHECK(text.getName() == name);
}

TEST_CASE("a header of brackets alone keeps those that one trim at each end leaves") {
    struct Row {
        std::string header;
        std::wstring section;
    };
    for (Row const& row : {Row{"[]", L"["}, Row{"[]]", L"["}, Row{"[[]]", L"[["}, Row{"[[", L"[["},
                           Row{"[][", L"]["}, Row{"[]x", L"]x"}, Row{"[x[]", L"x["}}) {
        CAPTURE(row.header);
        Place const place(row.header + "\nk=v\n");
        InitializationFile file(place.path);
        file.open(Koru::File::READ);
        CHECK(file.enumerateSections() == Texts{row.section});
    }
}

namespace {

using namespace std::string_literals;
std::string const LINES_WITH_NUL = "[s\0]]\na\0b=1\nc=2 \0 \n\0d=3\ne\0#=4\n[\0t]\nf=5\n"s;

} // namespace

TEST_CASE("a NUL in a line is text, up to which names and values count") {
    Place const place(LINES_WITH_NUL);
    InitializationFile file(place.path);
    file.open(Koru::File::READ);
    CHECK(file.enumerateSections() == Texts{L"s"});
    CHECK(file.enumerateKeys(L"s") == Texts{L"a", L"c", L"e"});
}

TEST_CASE("a NUL in a line of a property file is text, too") {
    Place const place(LINES_WITH_NUL);
    Koru::PropertyFile file(place.path);
    file.open(Koru::File::READ);
    CHECK(file.enumerateKeys() == Texts{L"a", L"c", L"e", L"f"});
    CHECK(file.getValue(L"c") == L"2 ");
}

TEST_CASE("what was set before an exception is written, unless the mode is set to 0") {
    std::string const old = "[net]\nhost=old\nport=1\n";
    for (bool const givesUp : {true, false}) {
        Place const place(old);
        auto const change = [&] {
            InitializationFile settings(place.path);
            settings.open(READ_WRITE);
            settings.setValue(L"net", L"host", L"new");
            if (givesUp) settings.setMode(0);
            throw std::runtime_error("no port");
        };
        CHECK(messageOf<std::runtime_error>(change) == "no port");
        CHECK(place.text() == (givesUp ? old : "[net]\nhost=new\nport=1\n"));
    }
}

namespace {

/// Opens and changes a file that lives as long as the process, and has a child end.
/// @return what the file holds afterwards, as far as the parent has not closed it
template <class Ending>
std::string writtenByChild(Ending ending) {
    Place const place("[s]\nk=old\n");
    test::Outcome const outcome = test::inChild([&] {
        static InitializationFile settings(place.path);
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
    return place.text();
}

} // namespace

TEST_CASE("a child that calls exit writes the files of static objects, one that calls _exit none") {
    CHECK(writtenByChild([] { ::_exit(0); }) == "[s]\nk=old\n");
    CHECK(writtenByChild([] { std::exit(0); }) == "[s]\nk=unfinished\n");
}

TEST_CASE("a child that calls exit writes out what its parent had buffered, as the parent does") {
    Place const place;
    test::Outcome const outcome = test::inChild([&] {
        static OpenLog log(place);
        put(log, "line\n");
        pid_t const child = ::fork();
        if (child == 0) std::exit(0);
        ::waitpid(child, nullptr, 0);
        log.close();
        return 0;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(place.text() == "line\nline\n");
}

TEST_CASE("a child has lost the lock that the forking thread held") {
    Koru::Mutex mutex;
    mutex.lock();
    test::Outcome const outcome = test::inChild([&] {
        mutex.unlock(); // gives nothing back, as the child's thread does not hold it
        std::string const message = messageOf<std::runtime_error>([&] { mutex.lock(3); });
        return message == "failed to obtain mutex within timeout" ? 0 : 1;
    });
    CHECK(outcome.exitCode == 0);
    mutex.lock(1); // which the parent still holds
    mutex.unlock();
    mutex.unlock();
}

TEST_CASE("destroying an open file waits for a lock that a dead thread holds") {
    test::TempDir const directory;
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
    Place const place;
    Koru::File file(Koru::make_wstring(place.path));
    file.open(Koru::File::WRITE);
    put(file, "buffered");
    CHECK(test::endsCancelled(
        [&] {
            test::callsBeforeCancellation = 0;
            file.close();
        },
        [](pthread_t) {}));
    CHECK(!file.is_open());
    CHECK(place.text().empty());
}

TEST_CASE_TEMPLATE("what only closing finds is in the fail state, and the table is gone", Family,
                   InitializationFile, Koru::PropertyFile) {
    Place const place("[s]\nk=1\n");
    Family file(place.path);
    file.open(READ_WRITE);
    {
        FailingCall const fault(Call::CLOSE, EDQUOT, 0, FailingCall::FOR_EVER);
        CHECK(messageOf<std::runtime_error>([&] { file.close(); }) == "<nothing>");
    }
    CHECK(file.fail());
    CHECK(!file.is_open());
    CHECK(file.getMode() == 0);
    file.setMode(Koru::File::WRITE); // which would write the table
    file.close();
    CHECK(place.text().empty());
}

TEST_CASE("close of a file that was written without an error leaves no fail state") {
    Place const place;
    InitializationFile file(place.path);
    file.open(READ_WRITE);
    file.setstate(std::ios::failbit); // which writing clears
    file.close();
    CHECK(!file.fail());
}

TEST_CASE("a file that can be neither deleted nor opened stays as it was") {
    if (::getuid() != 0) {
        test::skipped("only root has a file that another user can but read");
        return;
    }
    Place const place("[s]\nk=1\n");
    ::chmod(place.directory.path().c_str(), 0755);
    ::chmod(place.path.c_str(), 0644);
    test::Outcome const outcome = test::inChild([&] {
        if (::setuid(65534) != 0) return 1;
        InitializationFile file(place.path);
        file.open(Koru::File::READ);
        file.setMode(READ_WRITE);
        std::string const message = messageOf<std::runtime_error>([&] { file.close(); });
        bool const whole = file.getValue(L"s", L"k") == L"1";
        return message == "failed to open file." && whole && file.getMode() == 0 ? 0 : 2;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(place.text() == "[s]\nk=1\n");
}

TEST_CASE("a log that another creates between the two attempts to open it is emptied") {
    Place const place("the other's line\n");
    FailingCall const missingAtFirst(Call::OPEN, ENOENT);
    OpenLog const log(place);
    CHECK(place.text().empty());
}

TEST_CASE("a log that was open when it was opened writes nothing until its state is cleared") {
    Place const place;
    OpenLog log(place);
    log.open(READ_WRITE);
    CHECK(log.fail());
    put(log, "lost\n");
    log.clear();
    put(log, "kept\n");
    log.close();
    CHECK(place.text() == "kept\n");
}

TEST_CASE("a line of one write and one flush reaches the system at once, however long it is") {
    Place const place;
    for (std::size_t const size : {1UL, 1023UL, 1024UL, 8191UL, 8192UL, 300000UL}) {
        CAPTURE(size);
        place.write("");
        OpenLog log(place);
        FailingCall const writes(Call::WRITE, 0, 1000);
        put(log, std::string(size - 1, 'l') + '\n');
        log.flush();
        CHECK(writes.made() == 1);
        CHECK(place.text().size() == size);
    }
}

TEST_CASE("a piece of 1,024 bytes or more reaches the system before the rest of its line") {
    struct Row {
        std::size_t piece;
        std::size_t seen;
        long writes;
    };
    for (Row const& row : {Row{1023, 0, 1}, Row{1024, 1027, 2}, Row{8000, 8003, 2}}) {
        CAPTURE(row.piece);
        Place const place;
        OpenLog log(place);
        FailingCall const writes(Call::WRITE, 0, 1000);
        put(log, "at ");
        put(log, std::string(row.piece, 'l'));
        CHECK(place.text().size() == row.seen);
        put(log, "\n");
        log.flush();
        CHECK(writes.made() == row.writes);
    }
}

TEST_CASE("short pieces reach the system together, up to what the buffer takes") {
    for (int const pieces : {80, 90}) {
        CAPTURE(pieces);
        Place const place;
        OpenLog log(place);
        FailingCall const writes(Call::WRITE, 0, 1000);
        for (int i = 0; i < pieces; ++i) put(log, std::string(100, 'l'));
        log.flush();
        CHECK(writes.made() == (pieces == 80 ? 1 : 2));
    }
}
