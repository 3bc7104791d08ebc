// The log file: opening, appending alone and together with others, and what it says when it cannot.
#include <doctest/doctest.h>

#include <grp.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstddef>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <sstream>
#include <stdexcept>
#include <string>
#include <thread>
#include <type_traits>
#include <utility>
#include <vector>

#include <koru/logfile.h>
#include <koru/string.h>

#include "support/selfexec.h"
#include "support/slots.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::File;
using Koru::LogFile;
using test::messageOf;
using test::slotOf;
using test::slotOfOpen;
using namespace std::string_literals;

namespace {

unsigned int const READ = 1;
unsigned int const WRITE = 2;
unsigned int const READ_WRITE = 3;
unsigned int const BINARY = 0x80000000U;

char const* const NOT_OPENED = "failed to open file.";

template <class Callable>
std::string complaint(Callable callable) {
    return messageOf<std::runtime_error>(callable);
}

/// A log's place, without the file at first.
class LogPlace {
public:
    explicit LogPlace(std::string const& name = "program.log") : path_(directory_ / name) {}
    std::string const& path() const { return path_; }
    test::TempDir const& directory() const { return directory_; }
    void write(std::string const& content) const { test::writeFile(path_, content); }
    std::string content() const { return test::readFile(path_); }
    bool exists() const { return std::filesystem::exists(path_); }

private:
    test::TempDir directory_;
    std::string path_;
};

void put(std::ostream& log, std::string const& text) {
    log.write(text.data(), static_cast<std::streamsize>(text.size()));
}

/// What opening the log prints, behind what it throws.
test::Outcome printedByOpening(std::string const& path, unsigned int mode) {
    return test::inChild([&] {
        LogFile log(path);
        std::string const message = complaint([&] { log.open(mode); });
        std::printf("[%s]", message.c_str());
        return 0;
    });
}

} // namespace

// ----------------------------------------------------------------------------------------- the
// type

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
    unsigned int const* const address = &LogFile::MAX_LINE_LENGTH;
    unsigned int const volatile* const looked = address;
    CHECK(*looked == 1024U);
}

TEST_CASE("open of a log is a virtual operation of its own behind those of a file") {
    CHECK(slotOfOpen<File>() == 2);
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
    CHECK(!nameless.is_open());
    CHECK(nameless.getMode() == 0UL);
    CHECK(nameless.getName().empty());

    LogPlace const place;
    File::Path const path(place.path());
    LogFile const log(path);
    CHECK(!log.is_open());
    CHECK(log.getMode() == 0UL);
    bool const same = log.getName() == static_cast<std::wstring>(path);
    CHECK(same);
    CHECK(!place.exists());
}

// --------------------------------------------------------------------------------------- appending

TEST_CASE("opening for writing alone empties a log, for reading and writing keeps it") {
    struct Row {
        char const* label;
        unsigned int mode;
        std::string kept;
    };
    LogPlace const place;
    for (Row const& row : std::vector<Row>{
             {"writing", WRITE, ""},
             {"reading and writing", READ_WRITE, "before\n"},
             {"writing, binary", WRITE | BINARY, ""},
             {"reading and writing, binary", READ_WRITE | BINARY, "before\n"},
             {"writing, other bits", WRITE | 0x7FFFFFFCU, ""},
             {"reading and writing, other bits", 0x7FFFFFFFU, "before\n"},
         }) {
        CAPTURE(row.label);
        place.write("before\n");
        LogFile log(place.path());
        log.open(row.mode);
        CHECK(log.is_open());
        CHECK(log.good());
        CHECK(log.getMode() == 0UL);
        CHECK(place.content() == row.kept);
        put(log, "after\n");
        log.close();
        CHECK(place.content() == row.kept + "after\n");
        CHECK(!log.is_open());
        CHECK(log.getMode() == 0UL);
    }
}

TEST_CASE("either mode creates a missing log") {
    LogPlace const place;
    for (unsigned int const mode : {WRITE, READ_WRITE}) {
        std::filesystem::remove(place.path());
        LogFile log(place.path());
        log.open(mode);
        CHECK(place.content() == "");
        put(log, "line\n");
        log.flush();
        CHECK(place.content() == "line\n");
    }
}

TEST_CASE("output follows that of earlier openings") {
    LogPlace const place;
    std::string expected;
    LogFile log(place.path());
    for (int i = 0; i < 20; ++i) {
        log.open(READ_WRITE);
        std::string const line = "line " + std::to_string(i) + "\n";
        put(log, line);
        expected += line;
        log.close();
        CHECK(place.content() == expected);
    }
}

TEST_CASE("output before close, before destruction and before a flush is in the file afterwards") {
    LogPlace const place;
    std::string const large(300000, 'x');
    {
        LogFile log(place.path());
        log.open(READ_WRITE);
        put(log, "one\n");
        log.flush();
        CHECK(place.content() == "one\n");
        put(log, "two\n");
    }
    CHECK(place.content() == "one\ntwo\n");
    std::unique_ptr<File> log = [&] {
        auto opened = std::make_unique<LogFile>(place.path());
        opened->open(WRITE);
        return opened;
    }();
    put(*log, large);
    log.reset();
    bool const same = place.content() == large;
    CHECK(same);
}

TEST_CASE("nothing is added to what the caller writes") {
    LogPlace const place;
    std::string all;
    for (int i = 0; i < 256; ++i) all += static_cast<char>(i);
    std::string const longLine(3UL * LogFile::MAX_LINE_LENGTH, 'l'); // no limit is imposed
    LogFile log(place.path());
    log.open(WRITE);
    log.close();
    CHECK(place.content() == "");
    log.open(WRITE);
    put(log, all);
    put(log, longLine);
    log.close();
    CHECK(place.content() == all + longLine);
}

TEST_CASE("seeking does not move where output goes") {
    LogPlace const place;
    place.write("before\n");
    LogFile log(place.path());
    log.open(READ_WRITE);
    log.seekp(0);
    put(log, "one\n");
    log.flush();
    log.seekp(2);
    put(log, "two\n");
    log.close();
    CHECK(place.content() == "before\none\ntwo\n");
}

TEST_CASE("a log cannot be read, whatever its mode was") {
    LogPlace const place;
    place.write("before\n");
    LogFile log(place.path());
    log.open(READ_WRITE);
    log.seekg(0);
    CHECK(log.rdbuf()->sgetc() == std::char_traits<char>::eof());
}

TEST_CASE("what others write or delete meanwhile does not hide output") {
    LogPlace const place;
    LogFile log(place.path());
    log.open(WRITE);
    put(log, "one\n");
    log.flush();
    std::ofstream(place.path(), std::ios::app) << "other\n";
    put(log, "two\n");
    log.flush();
    CHECK(place.content() == "one\nother\ntwo\n");
    std::filesystem::resize_file(place.path(), 0);
    put(log, "three\n");
    log.flush();
    CHECK(place.content() == "three\n");
}

TEST_CASE("two logs of one file append by turns") {
    LogPlace const place;
    LogFile a(place.path());
    LogFile b(place.path());
    a.open(WRITE);
    b.open(READ_WRITE);
    std::string expected;
    for (int i = 0; i < 50; ++i) {
        LogFile& log = i % 3 == 0 ? a : b;
        std::string const line = std::to_string(i) + " of one of them\n";
        put(log, line);
        log.flush();
        expected += line;
    }
    CHECK(place.content() == expected);
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
        put(log, lineOf(writer, i));
        log.flush();
        if (!log.good()) return 1;
    }
    return 0;
}

test::RegisterSelf const appender("append lines", [](int argc, char** argv) {
    return argc == 2 ? appendLines(argv[0], argv[1]) : 2;
});

/// Checks that the file has every line of these writers, whole and in the order of each.
void checkLines(std::string const& content, std::vector<std::string> const& writers) {
    std::vector<int> next(writers.size(), 0);
    std::istringstream lines(content);
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
    LogPlace const place;
    place.write(""); // of several that create it at once, one may empty what another has written
    std::vector<std::string> const writers{"a", "b", "c"};
    std::vector<test::Outcome> outcomes(writers.size());
    std::vector<std::thread> threads;
    for (std::size_t i = 0; i < writers.size(); ++i) {
        threads.emplace_back([&, i] {
            outcomes[i] = test::execute(test::ownExecutable(),
                                        {"test", "--self=append lines", place.path(), writers[i]});
        });
    }
    for (std::thread& thread : threads) thread.join();
    for (test::Outcome const& outcome : outcomes) CHECK(outcome.exitCode == 0);
    checkLines(place.content(), writers);
}

TEST_CASE("threads share a log when they guard it with its lock") {
    LogPlace const place;
    LogFile log(place.path());
    log.open(READ_WRITE);
    std::vector<std::string> const writers{"x", "y"};
    std::vector<std::thread> threads;
    for (std::string const& writer : writers) {
        threads.emplace_back([&log, writer] {
            for (int i = 0; i < LINES; ++i) {
                log.lock();
                put(log, lineOf(writer, i));
                log.unlock();
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
    log.close();
    checkLines(place.content(), writers);
}

TEST_CASE("the library's inserters write to a log") {
    LogPlace const place;
    LogFile log(place.path());
    log.open(WRITE);
    Koru::operator<<(log, L"wide \u00E9"s) << '\n';
    Koru::operator<<(log, std::string(300, 'n')) << '\n'; // counted with 8 bits
    Koru::operator<<(log, File::Path("/dir/name")) << std::endl;
    log << 42 << ' ' << std::hex << 255 << '\n';
    log.close();
    CHECK(place.content() == "wide \xE9\n" + std::string(44, 'n') + "\n/dir/name\n42 ff\n");
}

// ------------------------------------------------------------------------------ what goes wrong

TEST_CASE("a log without the write bit prints its whole name on standard output and fails") {
    std::vector<std::string> names{"a.log", "x"};
    for (std::size_t const size : {5UL, 126UL, 127UL, 128UL, 129UL, 200UL, 255UL}) {
        names.push_back(std::string(size - 4, 'n') + ".log");
    }
    names.push_back("\xC3\xA9t\xC3\xA9 \xE2\x82\xAC \xF0\x9F\x99\x82.log");
    names.push_back("with blanks %s %n.log");
    for (std::string const& name : names) {
        CAPTURE(name);
        LogPlace const place(name);
        place.write("kept\n");
        std::string const line = "File::open() failed to open " + place.path() + "\n";
        for (unsigned int const mode : {READ, READ | BINARY, READ | 0x70U}) {
            test::Outcome const outcome = printedByOpening(place.path(), mode);
            CHECK(outcome.exitCode == 0);
            CHECK(outcome.out == line + "[failed to open file.]");
        }
        CHECK(place.content() == "kept\n");
    }
}

TEST_CASE("the line has the whole name also when the path is of every length up to 600") {
    test::TempDir const directory;
    std::string folder = directory.path();
    std::string expected;
    std::vector<std::string> paths;
    while (folder.size() < 350) {
        folder += "/" + std::string(100, 'd');
        std::filesystem::create_directory(folder);
    }
    for (std::size_t size = folder.size() + 2; size <= folder.size() + 250; ++size) {
        paths.push_back(folder + "/" + std::string(size - folder.size() - 1, 'f'));
        expected += "File::open() failed to open " + paths.back() + "\n[failed to open file.]";
    }
    CHECK(paths.back().size() >= 600);
    test::Outcome const outcome = test::inChild([&] {
        for (std::string const& path : paths) {
            test::writeFile(path, "");
            LogFile log(path);
            std::string const message = complaint([&] { log.open(READ); });
            std::printf("[%s]", message.c_str());
        }
        return 0;
    });
    bool const same = outcome.out == expected;
    CHECK(same);
}

TEST_CASE("the line is written out before the exception is thrown") {
    LogPlace const place;
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
    CHECK(outcome.out == "File::open() failed to open " + place.path() + "\n");
}

TEST_CASE("nothing is printed where the file itself cannot be opened") {
    LogPlace const place;
    std::string const missingFolder = place.directory() / "missing/program.log";
    for (std::pair<std::string, unsigned int> const& row :
         std::vector<std::pair<std::string, unsigned int>>{
             {place.path(), READ},                           // a missing file
             {place.path(), 0U},                             // no mode at all
             {place.path(), BINARY},                         // likewise
             {missingFolder, READ},                          // a missing directory
             {missingFolder, WRITE},                         // likewise
             {missingFolder, READ_WRITE},                    // likewise
             {place.directory().path(), WRITE},              // a directory
             {place.directory().path() + "/x/", READ_WRITE}, // no name
         }) {
        CAPTURE(row.first);
        CAPTURE(row.second);
        test::Outcome const outcome = printedByOpening(row.first, row.second);
        CHECK(outcome.out == "[failed to open file.]");
    }
    CHECK(!place.exists());
    LogFile nameless;
    for (unsigned int const mode : {READ, WRITE, READ_WRITE}) {
        CHECK(complaint([&] { nameless.open(mode); }) == NOT_OPENED);
    }
    test::Outcome const outcome = test::inChild([] {
        LogFile log;
        return complaint([&] { log.open(WRITE); }) == NOT_OPENED ? 0 : 1;
    });
    CHECK(outcome.exitCode == 0);
    CHECK(outcome.out == "");
}

TEST_CASE("nothing is printed by a log that opens") {
    LogPlace const place;
    for (unsigned int const mode : {WRITE, READ_WRITE}) {
        CHECK(printedByOpening(place.path(), mode).out == "[<nothing>]");
    }
}

TEST_CASE("a failed open leaves the log closed, in the fail state and of use again") {
    LogPlace const place;
    place.write("kept\n");
    test::Outcome const outcome = test::inChild([&] {
        LogFile log(place.path());
        if (complaint([&] { log.open(READ); }) != NOT_OPENED) return 1;
        if (log.is_open() || !log.fail() || log.getMode() != 0UL) return 2;
        log.clear();
        log.open(READ_WRITE);
        put(log, "more\n");
        log.close();
        return log.good() ? 42 : 3;
    });
    CHECK(outcome.exitCode == 42);
    CHECK(place.content() == "kept\nmore\n");
}

TEST_CASE("a log that can be created but not opened again prints the line, too") {
    for (unsigned int const mode : {WRITE, READ_WRITE}) {
        CAPTURE(mode);
        LogPlace const place;
        REQUIRE(::chmod(place.directory().path().c_str(), 0777) == 0);
        test::Outcome const outcome = test::inChild([&] {
            // The administrator may open everything, so become somebody else.
            unsigned const nobody = 65534;
            if (::geteuid() == 0 &&
                (::setgroups(0, nullptr) != 0 || ::setgid(nobody) != 0 || ::setuid(nobody) != 0)) {
                return 1;
            }
            ::umask(0777); // the new file is nobody's to open
            LogFile log(place.path());
            std::string const message = complaint([&] { log.open(mode); });
            std::printf("[%s]", message.c_str());
            return log.is_open() || !log.fail() || log.getMode() != 0UL ? 2 : 42;
        });
        CHECK(outcome.exitCode == 42);
        CHECK(outcome.out ==
              "File::open() failed to open " + place.path() + "\n[failed to open file.]");
        CHECK(place.exists());
    }
}

TEST_CASE("a directory can be opened without the write bit, but not as a log") {
    LogPlace const place;
    std::string const folder = place.directory() / "folder";
    std::filesystem::create_directory(folder);
    CHECK(printedByOpening(folder, READ).out ==
          "File::open() failed to open " + folder + "\n[failed to open file.]");
}

TEST_CASE("opening an open log closes it first and opens it again") {
    LogPlace const place;
    LogFile log(place.path());
    log.open(WRITE);
    put(log, "one\n");
    log.open(READ_WRITE);
    CHECK(log.is_open());
    CHECK(log.getMode() == 0UL);
    log.clear();
    put(log, "two\n");
    log.open(WRITE); // which empties nothing, since the file was open
    log.clear();
    put(log, "three\n");
    log.close();
    CHECK(place.content() == "one\ntwo\nthree\n");
}

TEST_CASE("synchronize of an open log writes it out, closes it and fails to open it") {
    LogPlace const place;
    test::Outcome const outcome = test::inChild([&] {
        LogFile log(place.path());
        log.open(READ_WRITE);
        put(log, "line\n");
        std::string const message = complaint([&] { log.synchronize(); });
        std::printf("[%s]", message.c_str());
        return log.is_open() || log.getMode() != 0UL ? 1 : 42;
    });
    CHECK(outcome.exitCode == 42);
    CHECK(outcome.out == "[failed to open file.]"); // and nothing else is printed
    CHECK(place.content() == "line\n");
}

TEST_CASE("synchronize of a closed log does nothing") {
    LogPlace const place;
    LogFile log(place.path());
    log.synchronize();
    CHECK(!log.is_open());
    CHECK(!place.exists());
}

TEST_CASE("a log with a mode set is opened as a plain file by synchronize") {
    LogPlace const place;
    LogFile log(place.path());
    log.open(READ_WRITE);
    put(log, "one\n");
    log.setMode(File::READ | File::WRITE);
    log.synchronize();
    CHECK(log.is_open());
    CHECK(log.getMode() == 3UL);
    put(log, "two"); // not at the end any more
    log.close();
    CHECK(place.content() == "two\n");
}

TEST_CASE("a call through a file opens the log as a plain file") {
    LogPlace const place;
    place.write("before\n");
    LogFile log(place.path());
    File& file = log;
    file.open(File::READ | File::WRITE);
    CHECK(file.getMode() == 3UL);
    put(log, "AFTER");
    log.close();
    CHECK(place.content() == "AFTERe\n");
    file.open(File::READ); // without the line and the failure
    CHECK(file.is_open());
    CHECK(file.getMode() == 1UL);
    std::string content(7, ' ');
    CHECK(bool(file.read(&content[0], 7)));
    CHECK(content == "AFTERe\n");
}

namespace {

/// A log whose overrides note which of the two openings was called.
class Recorder : public LogFile {
public:
    using LogFile::LogFile;
    void open(unsigned int mode) override {
        called = "of the log";
        LogFile::open(mode);
    }
    std::string called;
};

} // namespace

TEST_CASE("the opening of a log can be overridden") {
    LogPlace const place;
    Recorder recorder(place.path());
    LogFile& log = recorder;
    log.open(WRITE);
    CHECK(recorder.called == "of the log");
    recorder.called.clear();
    recorder.close();
    File& file = recorder;
    file.open(File::WRITE);
    CHECK(recorder.called == "");
}

TEST_CASE("a write that fails shows in the state of the stream and throws nothing") {
    LogPlace const place;
    test::Outcome const outcome = test::inChild([&] {
        ::signal(SIGXFSZ, SIG_IGN);
        LogFile log(place.path());
        log.open(READ_WRITE);
        rlimit limit = {};
        ::getrlimit(RLIMIT_FSIZE, &limit);
        limit.rlim_cur = 5;
        ::setrlimit(RLIMIT_FSIZE, &limit);
        put(log, "more than five bytes");
        if (!log.good()) return 1; // still buffered
        log.flush();
        if (!log.bad()) return 2;
        if (!log.is_open()) return 3;
        std::string const message = complaint([&] { log.close(); });
        if (message != "<nothing>" || log.is_open()) return 4;
        LogFile destroyed(place.path());
        destroyed.open(READ_WRITE);
        put(destroyed, "more than five bytes");
        return 42; // and so is its destructor quiet
    });
    CHECK(outcome.exitCode == 42);
    CHECK(outcome.out == "");
    CHECK(place.content() == "more ");
}

TEST_CASE("a full device shows in the state of the stream") {
    LogFile log{std::string("/dev/full")};
    log.open(READ_WRITE);
    CHECK(log.is_open());
    put(log, "line\n");
    log.flush();
    CHECK(log.bad());
    CHECK(messageOf<std::exception>([&] { log.close(); }) == "<nothing>");
    CHECK(log.fail());
}

TEST_CASE("opening takes the lock only for a while, and output takes none") {
    LogPlace const place;
    LogFile log(place.path());
    CHECK(log.lock());
    log.open(READ_WRITE); // the holder may
    CHECK(log.unlock());
    std::thread other([&] {
        log.lock();
        log.unlock();
    });
    other.join();
    CHECK(log.lock());
    std::thread writer([&] { put(log, "line\n"); });
    writer.join();
    CHECK(log.unlock());
    log.close();
    CHECK(place.content() == "line\n");
}
