// What the system refuses for a passing reason loses nothing: failing calls, cancelled threads and
// streams that throw, for a plain file, a log and the structured files.
#include <doctest/doctest.h>

#include <pthread.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <functional>
#include <ios>
#include <memory>
#include <string>
#include <vector>

#include <koru/file.h>
#include <koru/logfile.h>

#include "support/cancellation.h"
#include "support/structuredfile.h"
#include "support/subprocess.h"
#include "support/systemcalls.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::LogFile;
using test::Call;
using test::FailingCall;
using test::Flat;
using test::messageOf;
using test::readFile;
using test::Records;
using test::Sectioned;
using test::TempDir;
using test::writeFile;

namespace {

unsigned long const READ = Koru::File::READ;
unsigned long const WRITE = Koru::File::WRITE;
unsigned long const READ_WRITE = READ | WRITE;

int const COUNT = 1000; // entries, more than a stream reads at once

struct Reason {
    char const* label;
    int error;
};

std::vector<Reason> const PASSING_REASONS = {
    {"no descriptor left in the process", EMFILE},
    {"no descriptor left in the system", ENFILE},
    {"no memory", ENOMEM},
    {"interrupted", EINTR},
    {"the disk", EIO},
    {"no permission", EACCES},
    {"too many links", ELOOP},
};

/// Lets the object of a family be used under a name that makes overloads plain.
std::wstring wide(std::string const& path) { return std::wstring(path.begin(), path.end()); }

} // namespace

// ------------------------------------------------------------------------------ failing to open

TEST_CASE("a file that cannot be opened for a passing reason is tried once and keeps its content") {
    TempDir const directory;
    std::string const path = directory / "file";
    for (Reason const& reason : PASSING_REASONS) {
        for (unsigned long const mode : {READ, WRITE, READ_WRITE}) {
            CAPTURE(reason.label);
            CAPTURE(mode);
            writeFile(path, "content");
            {
                Koru::File file(wide(path));
                FailingCall const fault(Call::OPEN, reason.error);
                CHECK(messageOf<std::runtime_error>([&] { file.open(mode); }) ==
                      "failed to open file.");
                CHECK(fault.made() == 1);
                CHECK(!file.is_open());
                CHECK(file.fail());
                CHECK(file.getMode() == 0);
            }
            CHECK(readFile(path) == "content");
        }
    }
}

TEST_CASE("a missing file is tried twice, and so is a link that leads nowhere") {
    TempDir const directory;
    std::filesystem::create_symlink(directory / "target", directory / "link");
    for (char const* const name : {"missing", "link"}) {
        CAPTURE(name);
        Koru::File file(directory.wide(name));
        FailingCall const counter(Call::OPEN, 0, 1000);
        file.open(READ_WRITE);
        CHECK(counter.made() == 2);
        CHECK(file.good());
        file.close();
        CHECK(readFile(directory / name).empty());
    }
    CHECK(std::filesystem::exists(directory / "target"));
}

TEST_CASE("a second attempt that fails is the failure to open") {
    TempDir const directory;
    Koru::File file(directory.wide("missing"));
    FailingCall const fault(Call::OPEN, EMFILE, 1);
    CHECK(messageOf<std::runtime_error>([&] { file.open(READ_WRITE); }) == "failed to open file.");
    CHECK(fault.made() == 2);
    CHECK(!std::filesystem::exists(directory / "missing"));
}

TEST_CASE("errno tells why a file could not be opened") {
    TempDir const directory;
    writeFile(directory / "file", "content");
    Koru::File file(directory.wide("file"));
    FailingCall const fault(Call::OPEN, EMFILE);
    int error = 0;
    try {
        file.open(READ_WRITE);
    } catch (std::runtime_error const&) {
        error = errno;
    }
    CHECK(error == EMFILE);
}

TEST_CASE_TEMPLATE("a structured file that cannot be opened keeps its content, also after it is "
                   "destroyed",
                   Family, Sectioned, Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    std::string const old = Family::bytes(0, COUNT);
    for (Reason const& reason : PASSING_REASONS) {
        CAPTURE(reason.label);
        writeFile(path, old);
        {
            typename Family::File file(path);
            FailingCall const fault(Call::OPEN, reason.error);
            CHECK(messageOf<std::runtime_error>([&] { file.open(READ_WRITE); }) ==
                  "failed to open file.");
        }
        bool const unchanged = readFile(path) == old;
        CHECK(unchanged);
    }
}

TEST_CASE_TEMPLATE("synchronize that cannot open the file again has written it whole", Family,
                   Sectioned, Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    for (Reason const& reason : PASSING_REASONS) {
        CAPTURE(reason.label);
        writeFile(path, Family::bytes(0, COUNT));
        {
            typename Family::File file(path);
            file.open(READ_WRITE);
            Family::add(file, COUNT);
            // Two attempts create the file that close has deleted; the next one reopens it.
            FailingCall const fault(Call::OPEN, reason.error, 2);
            CHECK(messageOf<std::runtime_error>([&] { file.synchronize(); }) ==
                  "failed to open file.");
            CHECK(file.getMode() == 0);
        }
        CHECK(test::isWhole<Family>(readFile(path), 0, COUNT + 1));
    }
}

TEST_CASE_TEMPLATE("close that cannot create the new file through a stream writes it without one",
                   Family, Sectioned, Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    for (Reason const& reason : PASSING_REASONS) {
        for (long const before : {0L, 1L}) {
            CAPTURE(reason.label);
            CAPTURE(before);
            writeFile(path, Family::bytes(0, COUNT));
            {
                typename Family::File file(path);
                file.open(READ_WRITE);
                Family::add(file, COUNT);
                FailingCall const fault(Call::OPEN, reason.error, before);
                CHECK(messageOf<std::runtime_error>([&] { file.close(); }) ==
                      "failed to open file.");
            }
            CHECK(test::isWhole<Family>(readFile(path), 0, COUNT + 1));
        }
    }
}

TEST_CASE("a log that cannot be opened for a passing reason keeps its content") {
    TempDir const directory;
    std::string const path = directory / "program.log";
    for (Reason const& reason : PASSING_REASONS) {
        CAPTURE(reason.label);
        for (long const before : {0L, 1L}) { // the file itself; the opening for appending
            CAPTURE(before);
            writeFile(path, "line\n");
            test::Outcome const outcome = test::inChild([&] {
                LogFile log(path);
                FailingCall const fault(Call::OPEN, reason.error, before);
                std::string const message = messageOf<std::runtime_error>([&] { log.open(3); });
                return message == "failed to open file." && !log.is_open() ? 0 : 1;
            });
            CHECK(outcome.exitCode == 0);
            CHECK(outcome.out == (before == 0 ? "" : "File::open() failed to open " + path + "\n"));
            CHECK(readFile(path) == "line\n");
        }
    }
}

TEST_CASE_TEMPLATE("without a descriptor left no file is emptied", Family, Sectioned, Flat,
                   Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    std::string const old = Family::bytes(0, COUNT);
    writeFile(path, old);
    test::Outcome const outcome = test::inChild([&] {
        rlimit const none = {0, 0};
        ::setrlimit(RLIMIT_NOFILE, &none);
        typename Family::File file(path);
        return messageOf<std::runtime_error>([&] { file.open(READ_WRITE); }) ==
                       "failed to open file."
                   ? 0
                   : 1;
    });
    CHECK(outcome.exitCode == 0);
    bool const unchanged = readFile(path) == old;
    CHECK(unchanged);
}

TEST_CASE_TEMPLATE("without memory for a stream no file is emptied" *
                       doctest::skip(!test::MALLOC_CAN_FAIL),
                   Family, Sectioned, Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    std::string const old = Family::bytes(0, COUNT);
    writeFile(path, old);
    {
        typename Family::File file(path);
        Koru::File plain(wide(path));
        LogFile log(path);
        std::vector<std::string> messages;
        for (std::function<void()> const& open : std::vector<std::function<void()>>{
                 [&] { file.open(READ_WRITE); }, [&] { plain.open(READ_WRITE); },
                 [&] { log.open(3); }}) {
            test::streamsWithoutMemory = 1;
            messages.push_back(messageOf<std::runtime_error>(open));
        }
        for (std::string const& message : messages) CHECK(message == "failed to open file.");
    }
    bool const unchanged = readFile(path) == old;
    CHECK(unchanged);
}

TEST_CASE_TEMPLATE("close without memory for a stream writes the new file without one" *
                       doctest::skip(!test::MALLOC_CAN_FAIL),
                   Family, Sectioned, Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    writeFile(path, Family::bytes(0, COUNT));
    {
        typename Family::File file(path);
        file.open(READ_WRITE);
        Family::add(file, COUNT);
        test::streamsWithoutMemory = 1;
        CHECK(messageOf<std::runtime_error>([&] { file.close(); }) == "failed to open file.");
    }
    CHECK(test::isWhole<Family>(readFile(path), 0, COUNT + 1));
}

// --------------------------------------------------------------------------------- cancellation

namespace {

/// Runs a step in a thread that is cancelled at one of its cancellation points.
/// @return whether it came to that one
template <class Step>
bool cancelledAt(long point, Step step) {
    return test::endsCancelled(
        [&] {
            test::callsBeforeCancellation = point;
            step();
        },
        [](pthread_t) {});
}

} // namespace

TEST_CASE_TEMPLATE("a thread cancelled while it opens a file leaves the content, wherever that is",
                   Family, Sectioned, Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    std::string const old = Family::bytes(0, COUNT);
    for (bool const modeIsSetBefore : {false, true}) {
        for (bool const outlives : {false, true}) {
            long point = 0;
            for (bool cancelled = true; cancelled; ++point) {
                CAPTURE(modeIsSetBefore);
                CAPTURE(outlives);
                CAPTURE(point);
                writeFile(path, old);
                std::unique_ptr<typename Family::File> file;
                cancelled = cancelledAt(point, [&] {
                    file = std::make_unique<typename Family::File>(path);
                    if (modeIsSetBefore) file->setMode(READ_WRITE);
                    if (outlives) {
                        file->open(READ_WRITE);
                        return;
                    }
                    auto const own = std::move(file);
                    own->open(READ_WRITE);
                });
                CHECK((file != nullptr) == outlives);
                if (cancelled && outlives) {
                    CHECK(file->getMode() == 0);
                    file->close();
                }
                file.reset();
                bool const unchanged = cancelled ? readFile(path) == old
                                                 : test::isWhole<Family>(readFile(path), 0, COUNT);
                CHECK(unchanged);
            }
            CHECK(point > 4); // the opening and several reads were cancelled
        }
    }
}

TEST_CASE_TEMPLATE("a thread cancelled in synchronize or close leaves the old content or the new",
                   Family, Sectioned, Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    std::string const old = Family::bytes(0, COUNT);
    using Step = void (*)(typename Family::File&);
    for (Step const step : {Step([](typename Family::File& f) { f.synchronize(); }),
                            Step([](typename Family::File& f) { f.close(); })}) {
        for (bool const outlives : {false, true}) {
            long point = 0;
            for (bool cancelled = true; cancelled && point < 1000; ++point) {
                CAPTURE(outlives);
                CAPTURE(point);
                writeFile(path, old);
                auto file = std::make_unique<typename Family::File>(path);
                file->open(READ_WRITE);
                Family::add(*file, COUNT);
                cancelled = cancelledAt(point, [&] {
                    typename Family::File& target = *file;
                    std::unique_ptr<typename Family::File> const own(outlives ? nullptr
                                                                              : file.release());
                    step(target);
                    ::pthread_testcancel();
                });
                file.reset();
                std::string const bytes = readFile(path);
                bool const whole = bytes == old || test::isWhole<Family>(bytes, 0, COUNT + 1);
                CHECK(whole);
                if (!cancelled) CHECK(bytes.size() == Family::bytes(0, COUNT + 1).size());
            }
        }
    }
}

TEST_CASE_TEMPLATE("a thread that waits for a writer to a pipe can be cancelled", Family, Sectioned,
                   Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "pipe";
    REQUIRE(::mkfifo(path.c_str(), 0600) == 0);
    // For reading alone the opening waits; for both the reading does.
    for (unsigned long const mode : {READ, READ_WRITE}) {
        CAPTURE(mode);
        test::Outcome const outcome = test::inChild([&] {
            ::alarm(60);
            typename Family::File file(path);
            bool const cancelled = test::endsCancelled([&] { file.open(mode); },
                                                       [](pthread_t thread) {
                                                           ::usleep(20000);
                                                           ::pthread_cancel(thread);
                                                       });
            return cancelled && file.getMode() == 0 ? 0 : 1;
        });
        CHECK(outcome.signal == 0);
        CHECK(outcome.exitCode == 0);
        CHECK(std::filesystem::is_fifo(path));
    }
}

TEST_CASE_TEMPLATE("a thread cancelled while it waits for the lock changes neither mode nor file",
                   Family, Sectioned, Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    writeFile(path, Family::bytes(0, 3));
    test::Outcome const outcome = test::inChild([&] {
        ::alarm(60);
        typename Family::File file(path);
        file.open(READ_WRITE);
        Family::add(file, 3);
        file.lock();
        bool const cancelled = test::endsCancelled([&] { file.open(READ); },
                                                   [](pthread_t thread) {
                                                       ::usleep(20000);
                                                       ::pthread_cancel(thread);
                                                   });
        bool const unchanged = file.getMode() != 0 && test::sizeOf<Family>(file) == 4;
        file.close();
        file.unlock();
        return cancelled && unchanged ? 0 : 1;
    });
    CHECK(outcome.signal == 0);
    CHECK(outcome.exitCode == 0);
    CHECK(test::isWhole<Family>(readFile(path), 0, 4));
}

// ------------------------------------------------------------------------- streams that throw

TEST_CASE_TEMPLATE("where the stream throws while it is read, what came before is held", Family,
                   Sectioned, Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    writeFile(path, Family::bytes(0, COUNT));
    typename Family::File file(path);
    file.exceptions(std::ios::badbit);
    {
        FailingCall const fault(Call::READ, EIO, 1, FailingCall::FOR_EVER);
        CHECK_THROWS_AS(file.open(READ), std::ios::failure);
    }
    CHECK(file.is_open());
    std::size_t const held = test::sizeOf<Family>(file);
    CHECK(held > 100);
    CHECK(held < static_cast<std::size_t>(COUNT));
    CHECK(test::holds<Family>(file, 0, static_cast<int>(held)));
}

TEST_CASE_TEMPLATE("where the stream throws at the end of the file, all of it is held", Family,
                   Sectioned, Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    writeFile(path, Family::bytes(0, COUNT));
    typename Family::File file(path);
    file.exceptions(std::ios::eofbit);
    CHECK_THROWS_AS(file.open(READ), std::ios::failure);
    CHECK(test::sizeOf<Family>(file) == static_cast<std::size_t>(COUNT));
    file.exceptions(std::ios::goodbit);
}

TEST_CASE_TEMPLATE("a last line that the end of the file cuts off is lost where that throws",
                   Family, Sectioned, Flat) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    std::string bytes = Family::bytes(0, 2);
    bytes.pop_back();
    writeFile(path, bytes);
    typename Family::File file(path);
    file.exceptions(std::ios::eofbit);
    CHECK_THROWS_AS(file.open(READ), std::ios::failure);
    CHECK(test::sizeOf<Family>(file) == 1);
    file.exceptions(std::ios::goodbit);
    file.close();
    file.open(READ);
    CHECK(test::sizeOf<Family>(file) == 2);
}

// ------------------------------------------------------------------------ flushing and seeking

TEST_CASE_TEMPLATE("a file that cannot be gone back in is no empty file", Family, Sectioned, Flat,
                   Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    std::string const old = Family::bytes(0, COUNT);
    writeFile(path, old);
    for (int const error : {EIO, EINVAL, EOVERFLOW}) {
        CAPTURE(error);
        typename Family::File file(path);
        {
            FailingCall const fault(Call::SEEK, error, 0, FailingCall::FOR_EVER);
            CHECK(messageOf<std::runtime_error>([&] { file.open(READ_WRITE); }) ==
                  "failed to read from file");
            CHECK(fault.made() > 0);
        }
        CHECK(file.is_open());
        CHECK(file.fail());
        file.setMode(0);
        file.close();
        bool const unchanged = readFile(path) == old;
        CHECK(unchanged);
    }
}

TEST_CASE_TEMPLATE("output that cannot be written out is a failure to read the file again", Family,
                   Sectioned, Flat, Records) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    writeFile(path, Family::bytes(0, COUNT));
    typename Family::File file(path);
    file.open(READ_WRITE);
    file.clear();
    file.seekp(0, std::ios::end);
    file.write("; more", 6);
    {
        FailingCall const fault(Call::WRITE, ENOSPC, 0, FailingCall::FOR_EVER);
        CHECK(messageOf<std::runtime_error>([&] { file.open(READ_WRITE); }) ==
              "failed to read from file");
    }
    CHECK(file.is_open());
    file.setMode(0);
}

// ---------------------------------------------------------------------------------------- memory

TEST_CASE_TEMPLATE("a size that the system claims is only a guess", Family, Sectioned, Flat) {
    CAPTURE(Family::label());
    TempDir const directory;
    std::string const path = directory / "file";
    int const count = 200000; // more than the first piece of memory holds
    writeFile(path, Family::bytes(0, count));
    for (int const claimed : {0, 1, 0x7FFFFFFF}) {
        CAPTURE(claimed);
        typename Family::File file(path);
        test::claimedSize = claimed;
        file.open(READ);
        test::claimedSize = -1;
        CHECK(test::sizeOf<Family>(file) == static_cast<std::size_t>(count));
    }
}
