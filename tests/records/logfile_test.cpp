// The log file: opening, appending alone and together with others, and what it says when it cannot.
#include <doctest/doctest.h>

#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstddef>
#include <filesystem>
#include <fstream>
#include <memory>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <vector>

#include <koru/logfile.h>
#include <koru/string.h>

#include "support/filesizelimit.h"
#include "support/ownfile.h"
#include "support/selfexec.h"
#include "support/slots.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::File;
using Koru::LogFile;
using test::Place;
using test::slotOf;
using test::toldByChild;
using OwnLog = test::OwnFile<LogFile>;
using namespace std::string_literals;

namespace {

unsigned int const READ = 1;
unsigned int const WRITE = 2;
unsigned int const READ_WRITE = 3;
unsigned int const BINARY = 0x80000000U;

char const* const NOT_OPENED = "failed to open file.";

template <class Callable>
std::string complaint(Callable callable) {
    return test::messageOf<std::runtime_error>(callable);
}

void put(std::ostream& log, std::string const& text) {
    log.write(text.data(), static_cast<std::streamsize>(text.size()));
}

/// Writes at once.
void putNow(std::ostream& log, std::string const& text) {
    put(log, text);
    log.flush();
}

void openPutAndClose(LogFile& log, unsigned int mode, std::string const& text) {
    log.open(mode);
    put(log, text);
    log.close();
}

/// What opening the log prints, and in brackets what it throws.
std::string toldByOpening(std::string const& path, unsigned int mode) {
    return toldByChild([&] {
        LogFile log(path);
        return "[" + complaint([&] { log.open(mode); }) + "]";
    });
}

/// The line that a log prints which the base can open but the log cannot.
std::string failureLine(std::string const& path) {
    return "File::open() failed to open " + path + "\n";
}

bool isClosed(LogFile const& log) { return !log.is_open() && log.getMode() == 0UL; }

} // namespace

TEST_CASE("a log file is a file, a stream, not copyable and no larger than a file") {
    static_assert(std::is_base_of<File, LogFile>::value, "");
    static_assert(std::is_convertible<LogFile*, std::fstream*>::value, "");
    static_assert(!std::is_copy_constructible<LogFile>::value, "");
    static_assert(!std::is_copy_assignable<LogFile>::value, "");
    static_assert(std::has_virtual_destructor<LogFile>::value, "");
    static_assert(std::is_nothrow_destructible<LogFile>::value, "");
    static_assert(std::is_constructible<LogFile, File::Path const&>::value, "");
    CHECK(sizeof(LogFile) == sizeof(File));
}

TEST_CASE("MAX_LINE_LENGTH is a constant of 32 bits, in the header and in the library") {
    static_assert(std::is_same<decltype(LogFile::MAX_LINE_LENGTH), unsigned int const>::value, "");
    static_assert(LogFile::MAX_LINE_LENGTH == 1024, "");
    static_assert(sizeof(LogFile::MAX_LINE_LENGTH) == 4, "");
    unsigned int const volatile* const looked = &LogFile::MAX_LINE_LENGTH;
    CHECK(*looked == 1024U);
}

TEST_CASE("open of a log is a virtual operation of its own after those of a file") {
    CHECK(test::slotOfOpen<File>() == 2);
    CHECK(slotOf(&LogFile::close) == 3);
    CHECK(slotOf(&LogFile::synchronize) == 4);
    CHECK(slotOf(&LogFile::getMode) == 5);
    CHECK(slotOf(&LogFile::setMode) == 6);
    CHECK(slotOf(&LogFile::open) == 7);
    static_assert(std::is_same<decltype(&LogFile::open), void (LogFile::*)(unsigned int)>::value,
                  "");
}

TEST_CASE("a new log is closed, has mode 0 and the path's name, and opens nothing") {
    LogFile const nameless;
    CHECK(isClosed(nameless));
    CHECK(nameless.getName().empty());
    Place const place;
    File::Path const path(place.path());
    LogFile const log(path);
    CHECK(isClosed(log));
    CHECK((log.getName() == static_cast<std::wstring>(path)));
    CHECK(!place.exists());
}

TEST_CASE("opening for writing alone empties a log, for reading and writing keeps it") {
    struct Row {
        char const* label;
        unsigned int mode;
        std::string kept;
    };
    for (Row const& row : std::vector<Row>{
             {"writing", WRITE, ""},
             {"reading and writing", READ_WRITE, "before\n"},
             {"writing, binary", WRITE | BINARY, ""},
             {"reading and writing, binary", READ_WRITE | BINARY, "before\n"},
             {"writing, other bits", WRITE | 0x7FFFFFFCU, ""},
             {"reading and writing, other bits", 0x7FFFFFFFU, "before\n"},
         }) {
        CAPTURE(row.label);
        OwnLog log("before\n", row.mode);
        CHECK(log.is_open());
        CHECK(log.good());
        CHECK(log.getMode() == 0UL);
        CHECK(log.bytes() == row.kept);
        put(log, "after\n");
        log.close();
        CHECK(log.bytes() == row.kept + "after\n");
        CHECK(isClosed(log));
    }
}

TEST_CASE("either mode creates a missing log") {
    for (unsigned int const mode : {WRITE, READ_WRITE}) {
        OwnLog log(mode);
        CHECK(log.bytes() == "");
        putNow(log, "line\n");
        CHECK(log.bytes() == "line\n");
    }
}

TEST_CASE("output follows that of earlier openings") {
    OwnLog log;
    std::string expected;
    for (int i = 0; i < 20; ++i) {
        std::string const line = "line " + std::to_string(i) + "\n";
        openPutAndClose(log, READ_WRITE, line);
        expected += line;
        CHECK(log.bytes() == expected);
    }
}

TEST_CASE("output before close, before destruction and before a flush is in the file afterwards") {
    Place const place;
    {
        LogFile log(place.path());
        log.open(READ_WRITE);
        putNow(log, "one\n");
        CHECK(place.bytes() == "one\n");
        put(log, "two\n");
    }
    CHECK(place.bytes() == "one\ntwo\n");
    std::string const large(300000, 'x');
    {
        auto log = std::make_unique<LogFile>(place.path());
        log->open(WRITE);
        put(*log, large);
        std::unique_ptr<File> const destroyedAsFile = std::move(log);
    }
    bool const same = place.bytes() == large;
    CHECK(same);
}

TEST_CASE("nothing is added to what the caller writes") {
    std::string text;
    for (int i = 0; i < 256; ++i) text += static_cast<char>(i);
    text += std::string(3UL * LogFile::MAX_LINE_LENGTH, 'l'); // no limit is imposed
    OwnLog log;
    for (std::string const& written : {""s, text}) {
        openPutAndClose(log, WRITE, written);
        CHECK(log.bytes() == written);
    }
}

TEST_CASE("seeking does not move where output goes") {
    OwnLog log("before\n", READ_WRITE);
    log.seekp(0);
    putNow(log, "one\n");
    log.seekp(2);
    put(log, "two\n");
    log.close();
    CHECK(log.bytes() == "before\none\ntwo\n");
}

TEST_CASE("a log cannot be read, whatever its mode was") {
    OwnLog log("before\n", READ_WRITE);
    log.seekg(0);
    CHECK(log.rdbuf()->sgetc() == std::char_traits<char>::eof());
}

TEST_CASE("what others write or delete meanwhile does not hide output") {
    OwnLog log(WRITE);
    putNow(log, "one\n");
    std::ofstream(log.place.path(), std::ios::app) << "other\n";
    putNow(log, "two\n");
    CHECK(log.bytes() == "one\nother\ntwo\n");
    std::filesystem::resize_file(log.place.path(), 0);
    putNow(log, "three\n");
    CHECK(log.bytes() == "three\n");
}

TEST_CASE("two logs of one file append by turns") {
    OwnLog a(WRITE);
    LogFile b(a.place.path());
    b.open(READ_WRITE);
    std::string expected;
    for (int i = 0; i < 50; ++i) {
        LogFile& log = i % 3 == 0 ? a : b;
        std::string const line = std::to_string(i) + " of one of them\n";
        putNow(log, line);
        expected += line;
    }
    CHECK(a.bytes() == expected);
}

namespace {

int const LINES = 3000;

/// A line of a writer: its length differs, its end can be told.
std::string lineOf(std::string const& writer, int i) {
    return writer + " " + std::to_string(i) + " " +
           std::string(static_cast<std::size_t>(i * 37 % 800), writer[0]) + ".\n";
}

int appendLines(std::string const& path, std::string const& writer) {
    LogFile log(path);
    log.open(READ_WRITE);
    for (int i = 0; i < LINES; ++i) {
        putNow(log, lineOf(writer, i));
        if (!log.good()) return 1;
    }
    return 0;
}

test::RegisterSelf const appender("append lines", [](int argc, char** argv) {
    return argc == 2 ? appendLines(argv[0], argv[1]) : 2;
});

/// Runs these writers' work in threads of their own, and checks that the file then has every line
/// of each, whole and in order.
template <class Work>
void checkLinesOf(Place const& place, std::vector<std::string> const& writers, Work work) {
    std::vector<std::thread> threads;
    for (std::string const& writer : writers) threads.emplace_back([&] { work(writer); });
    for (std::thread& thread : threads) thread.join();
    std::vector<int> next(writers.size(), 0);
    std::istringstream lines(place.bytes());
    std::string line;
    while (std::getline(lines, line)) {
        bool known = false;
        for (std::size_t w = 0; w < writers.size() && !known; ++w) {
            known = next[w] < LINES && line + "\n" == lineOf(writers[w], next[w]);
            if (known) ++next[w];
        }
        if (!known) REQUIRE(line == "a whole line of one of them, the next one");
    }
    for (int const n : next) CHECK(n == LINES);
}

} // namespace

TEST_CASE("lines of several processes are neither lost nor torn when each is flushed") {
    Place const place;
    place.write(""); // of several that create it at once, one may empty what another has written
    checkLinesOf(place, {"a", "b", "c"}, [&](std::string const& writer) {
        test::Outcome const outcome = test::execute(
            test::ownExecutable(), {"test", "--self=append lines", place.path(), writer});
        CHECK(outcome.exitCode == 0);
    });
}

TEST_CASE("threads share a log when they guard it with its lock") {
    OwnLog log(READ_WRITE);
    checkLinesOf(log.place, {"x", "y"}, [&](std::string const& writer) {
        for (int i = 0; i < LINES; ++i) {
            log.lock();
            put(log, lineOf(writer, i));
            if (i == LINES - 1) log.flush();
            log.unlock();
        }
    });
}

TEST_CASE("the library's inserters write to a log") {
    OwnLog log(WRITE);
    Koru::operator<<(log, L"wide \u00E9"s) << '\n';
    Koru::operator<<(log, std::string(300, 'n')) << '\n'; // counted with 8 bits
    Koru::operator<<(log, File::Path("/dir/name")) << std::endl;
    log << 42 << ' ' << std::hex << 255 << '\n';
    log.close();
    CHECK(log.bytes() == "wide \xE9\n" + std::string(44, 'n') + "\n/dir/name\n42 ff\n");
}

TEST_CASE("a log without the write bit prints its whole name on standard output and fails") {
    test::TempDir const directory;
    for (std::string const& name :
         {"a.log"s, "\xC3\xA9t\xC3\xA9 \xE2\x82\xAC \xF0\x9F\x99\x82.log"s,
          "with blanks %s %n.log"s}) {
        CAPTURE(name);
        std::string const path = directory / name;
        test::writeFile(path, "kept\n");
        for (unsigned int const mode : {READ, READ | BINARY, READ | 0x70U}) {
            CHECK(toldByOpening(path, mode) == failureLine(path) + "[failed to open file.]");
        }
        CHECK(test::readFile(path) == "kept\n");
    }
}

TEST_CASE("the line has the whole name, however long that and its path are") {
    test::TempDir const directory;
    std::string folder = directory.path();
    std::vector<std::string> paths;
    for (int depth = 0; depth < 4; ++depth) {
        for (std::size_t size = 1; size <= 255; ++size) {
            if (size != 100) paths.push_back(folder + "/" + std::string(size, 'n'));
        }
        folder += "/" + std::string(100, 'n');
    }
    std::filesystem::create_directories(folder);
    CHECK(paths.back().size() >= 550);
    std::string expected;
    for (std::string const& path : paths) expected += failureLine(path);
    std::string const told = toldByChild([&] {
        std::string others;
        for (std::string const& path : paths) {
            test::writeFile(path, "");
            LogFile log(path);
            std::string const message = complaint([&] { log.open(READ); });
            if (message != NOT_OPENED) others += message;
        }
        return others;
    });
    bool const same = told == expected;
    CHECK(same);
}

TEST_CASE("the line is written out before the exception is thrown") {
    Place const place;
    place.write("");
    test::Outcome const outcome = test::inChild([&] {
        LogFile log(place.path());
        try {
            log.open(READ);
        } catch (std::runtime_error const&) {
            ::_exit(42); // nothing is flushed from here on
        }
        return 1;
    });
    CHECK(outcome.exitCode == 42);
    CHECK(outcome.out == failureLine(place.path()));
}

TEST_CASE("nothing is printed where the file itself cannot be opened") {
    struct Row {
        char const* label;
        std::string path;
        unsigned int mode;
    };
    Place const place;
    std::string const folder = place.directory().path();
    for (Row const& row : std::vector<Row>{
             {"a missing file", place.path(), READ},
             {"no mode", place.path(), 0},
             {"no mode but binary", place.path(), BINARY},
             {"a missing directory, reading", folder + "/missing/program.log", READ},
             {"a missing directory, writing", folder + "/missing/program.log", WRITE},
             {"a missing directory, both", folder + "/missing/program.log", READ_WRITE},
             {"a directory", folder, WRITE},
             {"no name", folder + "/x/", READ_WRITE},
         }) {
        CAPTURE(row.label);
        CHECK(toldByOpening(row.path, row.mode) == "[failed to open file.]");
    }
    CHECK(!place.exists());
    for (unsigned int const mode : {READ, WRITE, READ_WRITE}) {
        CHECK(toldByChild([&] {
                  LogFile nameless;
                  return complaint([&] { nameless.open(mode); });
              }) == NOT_OPENED);
    }
}

TEST_CASE("nothing is printed by a log that opens") {
    Place const place;
    CHECK(toldByOpening(place.path(), WRITE) == "[<nothing>]");
    CHECK(toldByOpening(place.path(), READ_WRITE) == "[<nothing>]");
}

TEST_CASE("a failed open leaves the log closed, in the fail state and of use again") {
    Place const place;
    place.write("kept\n");
    CHECK(toldByChild([&] {
              LogFile log(place.path());
              std::string const message = complaint([&] { log.open(READ); });
              bool const asExpected = isClosed(log) && log.fail();
              log.clear();
              openPutAndClose(log, READ_WRITE, "more\n");
              return message + (asExpected && log.good() ? " As expected" : " Otherwise");
          }) == failureLine(place.path()) + NOT_OPENED + " As expected");
    CHECK(place.bytes() == "kept\nmore\n");
}

TEST_CASE("a log that can be created but not opened again prints the line, too") {
    for (unsigned int const mode : {WRITE, READ_WRITE}) {
        CAPTURE(mode);
        Place const place;
        REQUIRE(::chmod(place.directory().path().c_str(), 0777) == 0);
        std::string const told = toldByChild([&] {
            // The administrator may open everything, so become somebody else.
            unsigned const nobody = 65534;
            if (::geteuid() == 0 &&
                (::setgroups(0, nullptr) != 0 || ::setgid(nobody) != 0 || ::setuid(nobody) != 0)) {
                return "still the administrator"s;
            }
            ::umask(0777); // the new file is nobody's to open
            LogFile log(place.path());
            std::string const message = complaint([&] { log.open(mode); });
            return message + (isClosed(log) && log.fail() ? " As expected" : " Otherwise");
        });
        CHECK(told == failureLine(place.path()) + NOT_OPENED + " As expected");
        CHECK(place.exists());
    }
}

TEST_CASE("a directory can be opened without the write bit, but not as a log") {
    test::TempDir const directory;
    CHECK(toldByOpening(directory.path(), READ) ==
          failureLine(directory.path()) + "[failed to open file.]");
}

TEST_CASE("opening an open log closes it first and opens it again") {
    OwnLog log;
    // The last empties nothing, since the file was open.
    for (unsigned int const mode : {WRITE, READ_WRITE, WRITE}) {
        log.open(mode);
        CHECK(log.is_open());
        CHECK(log.getMode() == 0UL);
        log.clear();
        put(log, "line\n");
    }
    log.close();
    CHECK(log.bytes() == "line\nline\nline\n");
}

TEST_CASE("synchronize of an open log writes it out, closes it and fails to open it") {
    Place const place;
    CHECK(toldByChild([&] {
              LogFile log(place.path());
              log.open(READ_WRITE);
              put(log, "line\n");
              std::string const message = complaint([&] { log.synchronize(); });
              return message + (isClosed(log) ? " Closed" : " Open");
          }) == NOT_OPENED + " Closed"s); // and nothing else is printed
    CHECK(place.bytes() == "line\n");
}

TEST_CASE("synchronize of a closed log does nothing") {
    OwnLog log;
    log.synchronize();
    CHECK(!log.is_open());
    CHECK(!log.place.exists());
}

TEST_CASE("a log with a mode set is opened as a plain file by synchronize") {
    OwnLog log(READ_WRITE);
    put(log, "one\n");
    log.setMode(File::READ | File::WRITE);
    log.synchronize();
    CHECK(log.is_open());
    CHECK(log.getMode() == 3UL);
    put(log, "two"); // not at the end any more
    log.close();
    CHECK(log.bytes() == "two\n");
}

TEST_CASE("a call through a file opens the log as a plain file") {
    OwnLog log;
    log.place.write("before\n");
    File& file = log;
    file.open(File::READ | File::WRITE);
    CHECK(file.getMode() == 3UL);
    put(log, "AFTER");
    log.close();
    CHECK(log.bytes() == "AFTERe\n");
    file.open(File::READ); // without the line and the failure
    CHECK(file.getMode() == 1UL);
    std::string content;
    CHECK(bool(std::getline(file, content)));
    CHECK(content == "AFTERe");
}

namespace {

/// A log that notes when the opening of a log is called.
class Recorder : public LogFile {
public:
    using LogFile::LogFile;
    void open(unsigned int mode) override {
        ++calls;
        LogFile::open(mode);
    }
    int calls = 0;
};

} // namespace

TEST_CASE("the opening of a log can be overridden") {
    test::OwnFile<Recorder> recorder;
    LogFile& log = recorder;
    log.open(WRITE);
    CHECK(recorder.calls == 1);
    log.close();
    File& file = recorder;
    file.open(File::WRITE);
    CHECK(recorder.calls == 1);
}

TEST_CASE("a write that fails shows in the state of the stream and throws nothing") {
    Place const place;
    CHECK(toldByChild([&] {
              test::limitFileSize(5);
              LogFile log(place.path());
              log.open(READ_WRITE);
              put(log, "more than five bytes");
              std::string text = log.good() ? "buffered, " : "not buffered, ";
              log.flush();
              text += log.bad() && log.is_open() ? "bad, " : "not bad, ";
              text += complaint([&] { log.close(); });
              text += log.is_open() ? ", open" : ", closed";
              LogFile destroyed(place.path()); // whose destructor is quiet as well
              destroyed.open(READ_WRITE);
              put(destroyed, "more than five bytes");
              return text;
          }) == "buffered, bad, <nothing>, closed");
    CHECK(place.bytes() == "more ");
}

TEST_CASE("a full device shows in the state of the stream") {
    LogFile log{std::string("/dev/full")};
    log.open(READ_WRITE);
    CHECK(log.is_open());
    putNow(log, "line\n");
    CHECK(log.bad());
    CHECK(complaint([&] { log.close(); }) == "<nothing>");
    CHECK(log.fail());
}

TEST_CASE("opening takes the lock only for a while, and output takes none") {
    OwnLog log;
    CHECK(log.lock());
    log.open(READ_WRITE); // the holder may
    CHECK(log.unlock());
    std::thread([&] {
        log.lock();
        log.unlock();
    }).join();
    CHECK(log.lock());
    std::thread([&] { put(log, "line\n"); }).join();
    CHECK(log.unlock());
    log.close();
    CHECK(log.bytes() == "line\n");
}
