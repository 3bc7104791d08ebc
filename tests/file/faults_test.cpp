// What the system refuses for a passing reason loses nothing: failing calls, cancelled threads,
// streams that throw and memory that runs out, for a plain file, a log and the structured files.
#include <doctest/doctest.h>

#include <pthread.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstddef>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <ios>
#include <memory>
#include <stdexcept>
#include <string>
#include <type_traits>

#include <koru/file.h>
#include <koru/logfile.h>

#include "support/cancellation.h"
#include "support/failingmemory.h"
#include "support/holder.h"
#include "support/structuredfile.h"
#include "support/subprocess.h"
#include "support/systemcalls.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::LogFile;
using test::Call;
using test::Failing;
using test::FailingCall;
using test::Flat;
using test::memoryRanOut;
using test::readFile;
using test::Records;
using test::runOutOfMemory;
using test::Sectioned;
using test::writeFile;

namespace {

unsigned long const READ = Koru::File::READ;
unsigned long const WRITE = Koru::File::WRITE;
unsigned long const READ_WRITE = READ | WRITE;

int const COUNT = 1000; // entries, more than a stream reads at once

char const* const NOT_OPENED = "failed to open file.";
char const* const NOT_CLOSED = "failed to close file.";
char const* const NOT_READ = "failed to read from file";

template <class Callable>
std::string complaint(Callable callable) {
    return test::messageOf<std::runtime_error>(callable);
}

/// Calls the callable with every error that may be gone the next time.
template <class Callable>
void forPassingReasons(Callable callable) {
    for (int const error : {EMFILE, ENFILE, ENOMEM, EINTR, EIO, EACCES, ELOOP}) {
        INFO(std::string(std::strerror(error)));
        callable(error);
    }
}

/// A file in a temporary directory.
struct Place {
    std::wstring wide() const { return directory.wide("file"); }
    std::string content() const { return readFile(path); }

    test::TempDir const directory;
    std::string const path = directory / "file";
};

/// The same with the entries of a structured file.
template <class Family>
struct Stored : Place {
    using File = typename Family::File;

    explicit Stored(int count = COUNT) : old(Family::bytes(0, count)) { restore(); }

    void restore() const { writeFile(path, old); }
    bool isOld() const { return content() == old; }
    /// Whether it holds one entry more than at first, or this many.
    bool isNew(int count = COUNT + 1) const { return test::isWhole<Family>(content(), 0, count); }
    /// The file, opened and with one entry more.
    std::unique_ptr<File> changed() const {
        auto file = std::make_unique<File>(path);
        file->open(READ_WRITE);
        Family::add(*file, static_cast<int>(test::sizeOf<Family>(*file)));
        return file;
    }

    std::string const old;
};

using One = std::integral_constant<Failing, Failing::ONE>;
using OneAndAllLater = std::integral_constant<Failing, Failing::ONE_AND_ALL_LATER>;

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

void cancelAfterAWhile(pthread_t thread) {
    ::usleep(20000);
    ::pthread_cancel(thread);
}

/// What std::filebuf::close does within the scope of an object: nothing.
struct BuffersStayOpen {
    BuffersStayOpen() { exist = true; }
    BuffersStayOpen(BuffersStayOpen const&) = delete;
    BuffersStayOpen& operator=(BuffersStayOpen const&) = delete;
    ~BuffersStayOpen() { exist = false; }

    static inline bool exist = false;
};

} // namespace

// Under the name by which the library calls that of the standard library.
#define KORU_FILEBUF_CLOSE "_ZNSt13basic_filebufIcSt11char_traitsIcEE5closeEv"
extern "C" std::filebuf* closeBuffer(std::filebuf* buffer) __asm__(KORU_FILEBUF_CLOSE);

extern "C" std::filebuf* closeBuffer(std::filebuf* buffer) {
    auto const close = test::realFunction<std::filebuf* (*)(std::filebuf*)>(KORU_FILEBUF_CLOSE);
    return BuffersStayOpen::exist ? nullptr : close(buffer);
}

TEST_CASE_FIXTURE(Place, "a file that cannot be opened for a passing reason is tried once and "
                         "keeps its content") {
    writeFile(path, "content");
    forPassingReasons([&](int error) {
        for (unsigned long const mode : {READ, WRITE, READ_WRITE}) {
            CAPTURE(mode);
            {
                Koru::File file(wide());
                FailingCall const fault(Call::OPEN, error);
                CHECK(complaint([&] { file.open(mode); }) == NOT_OPENED);
                CHECK(errno == error);
                CHECK(fault.made() == 1);
                CHECK(!file.is_open());
                CHECK(file.fail());
                CHECK(file.getMode() == 0);
            }
            CHECK(content() == "content");
        }
    });
}

TEST_CASE_FIXTURE(Place, "a missing file is tried twice, and so is a link that leads nowhere") {
    std::filesystem::create_symlink(directory / "target", directory / "link");
    for (std::string const name : {"missing", "link"}) {
        CAPTURE(name);
        Koru::File file(directory.wide(name));
        FailingCall const counter(Call::OPEN, 0, 1000);
        file.open(READ_WRITE);
        CHECK(counter.made() == 2);
        CHECK(file.good());
        CHECK(readFile(directory / name).empty());
    }
    CHECK(std::filesystem::exists(directory / "target"));
}

TEST_CASE_FIXTURE(Place, "a second attempt that fails is the failure to open") {
    Koru::File file(wide());
    FailingCall const fault(Call::OPEN, EMFILE, 1);
    CHECK(complaint([&] { file.open(READ_WRITE); }) == NOT_OPENED);
    CHECK(fault.made() == 2);
    CHECK(!std::filesystem::exists(path));
}

TEST_CASE_TEMPLATE("a structured file that cannot be opened keeps its content, also after it is "
                   "destroyed",
                   Family, Sectioned, Flat, Records) {
    Stored<Family> const stored;
    forPassingReasons([&](int error) {
        {
            typename Family::File file(stored.path);
            FailingCall const fault(Call::OPEN, error);
            CHECK(complaint([&] { file.open(READ_WRITE); }) == NOT_OPENED);
        }
        CHECK(stored.isOld());
    });
}

TEST_CASE_TEMPLATE("synchronize that cannot open the file again has written it whole", Family,
                   Sectioned, Flat, Records) {
    Stored<Family> const stored;
    forPassingReasons([&](int error) {
        stored.restore();
        {
            auto const file = stored.changed();
            // Two attempts create the file that close has deleted; the next one reopens it.
            FailingCall const fault(Call::OPEN, error, 2);
            CHECK(complaint([&] { file->synchronize(); }) == NOT_OPENED);
            CHECK(file->getMode() == 0);
        }
        CHECK(stored.isNew());
    });
}

TEST_CASE_TEMPLATE("close that cannot create the new file through a stream writes it without one",
                   Family, Sectioned, Flat, Records) {
    Stored<Family> const stored;
    mode_t const mask = ::umask(0);
    forPassingReasons([&](int error) {
        for (long const before : {0L, 1L}) {
            CAPTURE(before);
            stored.restore();
            {
                auto const file = stored.changed();
                FailingCall const fault(Call::OPEN, error, before);
                FailingCall const createdLate(Call::DESCRIPTOR, EINTR);
                FailingCall const interruption(Call::WRITE, EINTR); // does not end the content
                CHECK(complaint([&] { file->close(); }) == NOT_OPENED);
            }
            CHECK(stored.isNew());
            struct stat status = {};
            CHECK(::stat(stored.path.c_str(), &status) == 0);
            CHECK((status.st_mode & 07777U) == 0666U); // as a stream creates it
        }
    });
    ::umask(mask);
}

TEST_CASE_TEMPLATE("close writes the new file through any descriptor, standard input's too", Family,
                   Sectioned, Flat, Records) {
    Stored<Family> const stored;
    stored.restore();
    CHECK(test::ending([&] {
              auto const file = stored.changed();
              ::close(STDIN_FILENO);
              FailingCall const fault(Call::OPEN, EMFILE);
              bool const isReported = complaint([&] { file->close(); }) == NOT_OPENED;
              return isReported && ::fcntl(STDIN_FILENO, F_GETFD) == -1 ? 0 : 1;
          }) == "exit 0");
    CHECK(stored.isNew());
}

TEST_CASE_TEMPLATE("a file whose buffer stays open stays as it was, and can be closed later",
                   Family, Sectioned, Flat, Records) {
    Stored<Family> const stored;
    auto const file = stored.changed();
    unsigned long const mode = file->getMode();
    {
        BuffersStayOpen const fault;
        CHECK(complaint([&] { file->close(); }) == NOT_CLOSED);
    }
    CHECK(file->is_open());
    CHECK(file->fail());
    CHECK(file->getMode() == mode);
    CHECK(stored.isOld());
    { test::Holder<Koru::File> const otherThread(*file); } // The lock is free.
    CHECK(test::sizeOf<Family>(*file) == COUNT + 1);
    file->close();
    CHECK(stored.isNew());
}

TEST_CASE_FIXTURE(Place, "a log that cannot be opened for a passing reason keeps its content") {
    writeFile(path, "line\n");
    forPassingReasons([&](int error) {
        for (long const before : {0L, 1L}) { // the file itself; the opening for appending
            CAPTURE(before);
            test::Outcome const outcome = test::inChild([&] {
                LogFile log(path);
                FailingCall const fault(Call::OPEN, error, before);
                return complaint([&] { log.open(3); }) == NOT_OPENED && !log.is_open() ? 0 : 1;
            });
            CHECK(outcome.exitCode == 0);
            CHECK(outcome.out == (before == 0 ? "" : "File::open() failed to open " + path + "\n"));
            CHECK(content() == "line\n");
        }
    });
}

TEST_CASE_TEMPLATE("without a descriptor left no file is emptied", Family, Sectioned, Flat,
                   Records) {
    Stored<Family> const stored;
    CHECK(test::ending([&] {
              rlimit const none = {0, 0};
              ::setrlimit(RLIMIT_NOFILE, &none);
              typename Family::File file(stored.path);
              return complaint([&] { file.open(READ_WRITE); }) == NOT_OPENED ? 0 : 1;
          }) == "exit 0");
    CHECK(stored.isOld());
}

TEST_CASE_TEMPLATE("without memory for a stream no file is emptied" *
                       doctest::skip(!test::MALLOC_CAN_FAIL),
                   Family, Sectioned, Flat, Records) {
    Stored<Family> const stored;
    {
        typename Family::File file(stored.path);
        Koru::File plain(stored.wide());
        LogFile log(stored.path);
        std::function<void()> const openers[] = {
            [&] { file.open(READ_WRITE); }, [&] { plain.open(READ_WRITE); }, [&] { log.open(3); }};
        for (auto const& open : openers) {
            test::streamsWithoutMemory = 1;
            CHECK(complaint(open) == NOT_OPENED);
        }
    }
    CHECK(stored.isOld());
}

TEST_CASE_TEMPLATE("close without memory for a stream writes the new file without one" *
                       doctest::skip(!test::MALLOC_CAN_FAIL),
                   Family, Sectioned, Flat, Records) {
    Stored<Family> const stored;
    {
        auto const file = stored.changed();
        test::streamsWithoutMemory = 1;
        CHECK(complaint([&] { file->close(); }) == NOT_OPENED);
    }
    CHECK(stored.isNew());
}

TEST_CASE_TEMPLATE("a thread cancelled while it opens a file leaves the content, wherever that is",
                   Family, Sectioned, Flat, Records) {
    Stored<Family> const stored;
    for (int const variant : {0, 1, 2, 3}) {
        bool const modeIsSetBefore = (variant & 1) != 0;
        bool const outlives = (variant & 2) != 0; // the file the thread
        long point = 0;
        for (bool cancelled = true; cancelled; ++point) {
            INFO("variant ", variant, ", point ", point);
            stored.restore();
            std::unique_ptr<typename Family::File> file;
            cancelled = cancelledAt(point, [&] {
                file = std::make_unique<typename Family::File>(stored.path);
                if (modeIsSetBefore) file->setMode(READ_WRITE);
                typename Family::File& target = *file;
                auto const own = outlives ? nullptr : std::move(file);
                target.open(READ_WRITE);
            });
            CHECK((file != nullptr) == outlives);
            if (cancelled && outlives) {
                CHECK(file->getMode() == 0);
                file->close();
            }
            file.reset();
            bool const unchanged = cancelled ? stored.isOld() : stored.isNew(COUNT);
            CHECK(unchanged);
        }
        CHECK(point > 4); // the opening and several reads were cancelled
    }
}

TEST_CASE_TEMPLATE("a thread cancelled in synchronize or close leaves the old content or the new",
                   Family, Sectioned, Flat, Records) {
    Stored<Family> const stored;
    for (int const variant : {0, 1, 2, 3}) {
        bool const closes = (variant & 1) != 0;
        bool const outlives = (variant & 2) != 0; // the file the thread
        long point = 0;
        for (bool cancelled = true; cancelled && point < 1000; ++point) {
            INFO("variant ", variant, ", point ", point);
            stored.restore();
            auto file = stored.changed();
            cancelled = cancelledAt(point, [&] {
                typename Family::File& target = *file;
                auto const own = outlives ? nullptr : std::move(file);
                closes ? target.close() : target.synchronize();
                ::pthread_testcancel();
            });
            file.reset();
            CHECK((stored.isOld() || stored.isNew()));
            if (!cancelled) CHECK(stored.isNew());
        }
    }
}

TEST_CASE_TEMPLATE("a thread that waits for a writer to a pipe can be cancelled", Family, Sectioned,
                   Flat, Records) {
    Place const place;
    REQUIRE(::mkfifo(place.path.c_str(), 0600) == 0);
    // For reading alone the opening waits; for both the reading does.
    for (unsigned long const mode : {READ, READ_WRITE}) {
        CAPTURE(mode);
        CHECK(test::ending([&] {
                  typename Family::File file(place.path);
                  auto const open = [&] { file.open(mode); };
                  return test::endsCancelled(open, cancelAfterAWhile) && file.getMode() == 0 ? 0
                                                                                             : 1;
              }) == "exit 0");
        CHECK(std::filesystem::is_fifo(place.path));
    }
}

TEST_CASE_TEMPLATE("a thread cancelled while it waits for the lock changes neither mode nor file",
                   Family, Sectioned, Flat, Records) {
    Stored<Family> const stored(3);
    CHECK(test::ending([&] {
              auto const file = stored.changed();
              file->lock();
              if (!test::endsCancelled([&] { file->open(READ); }, cancelAfterAWhile)) return 1;
              if (file->getMode() == 0 || test::sizeOf<Family>(*file) != 4) return 2;
              file->close();
              return file->unlock() ? 0 : 3;
          }) == "exit 0");
    CHECK(stored.isNew(4));
}

TEST_CASE_TEMPLATE("where the stream throws while it is read, what came before is held", Family,
                   Sectioned, Flat, Records) {
    Stored<Family> const stored;
    typename Family::File file(stored.path);
    file.exceptions(std::ios::badbit);
    {
        FailingCall const fault(Call::READ, EIO, 1, FailingCall::FOR_EVER);
        CHECK_THROWS_AS(file.open(READ), std::ios::failure);
    }
    CHECK(file.is_open());
    int const held = static_cast<int>(test::sizeOf<Family>(file));
    CHECK(held > 100);
    CHECK(held < COUNT);
    CHECK(test::holds<Family>(file, 0, held));
}

TEST_CASE_TEMPLATE("where the stream throws at the end of the file, all of it is held", Family,
                   Sectioned, Flat, Records) {
    Stored<Family> const stored;
    typename Family::File file(stored.path);
    file.exceptions(std::ios::eofbit);
    CHECK_THROWS_AS(file.open(READ), std::ios::failure);
    CHECK(test::sizeOf<Family>(file) == COUNT);
    file.exceptions(std::ios::goodbit);
}

TEST_CASE_TEMPLATE("a last line that the end of the file cuts off is lost where that throws",
                   Family, Sectioned, Flat) {
    Stored<Family> const stored(2);
    writeFile(stored.path, stored.old.substr(0, stored.old.size() - 1));
    typename Family::File file(stored.path);
    file.exceptions(std::ios::eofbit);
    CHECK_THROWS_AS(file.open(READ), std::ios::failure);
    CHECK(test::sizeOf<Family>(file) == 1);
    file.exceptions(std::ios::goodbit);
    file.close();
    file.open(READ);
    CHECK(test::sizeOf<Family>(file) == 2);
}

TEST_CASE_TEMPLATE("a file that cannot be read from its start again is not an empty file", Family,
                   Sectioned, Flat, Records) {
    Stored<Family> const stored;
    for (int const error : {EIO, EINVAL, EOVERFLOW}) {
        CAPTURE(error);
        typename Family::File file(stored.path);
        {
            FailingCall const fault(Call::SEEK, error, 0, FailingCall::FOR_EVER);
            CHECK(complaint([&] { file.open(READ_WRITE); }) == NOT_READ);
            CHECK(fault.made() > 0);
        }
        CHECK(file.is_open());
        CHECK(file.fail());
        file.setMode(0);
        file.close();
        CHECK(stored.isOld());
    }
}

TEST_CASE_TEMPLATE("output that cannot be written out is a failure to read the file again", Family,
                   Sectioned, Flat, Records) {
    Stored<Family> const stored;
    typename Family::File file(stored.path);
    file.open(READ_WRITE);
    file.clear();
    file.seekp(0, std::ios::end);
    file << "; more";
    {
        FailingCall const fault(Call::WRITE, ENOSPC, 0, FailingCall::FOR_EVER);
        CHECK(complaint([&] { file.open(READ_WRITE); }) == NOT_READ);
    }
    CHECK(file.is_open());
    file.setMode(0);
}

TEST_CASE_TEMPLATE("a size that the system claims is only a guess", Family, Sectioned, Flat) {
    int const count = 200000; // more than the first piece of memory holds
    Stored<Family> const stored(count);
    for (int const claimed : {0, 1, 0x7FFFFFFF}) {
        CAPTURE(claimed);
        typename Family::File file(stored.path);
        test::claimedSize = claimed;
        file.open(READ);
        test::claimedSize = -1;
        CHECK(test::sizeOf<Family>(file) == count);
    }
}

TEST_CASE_TEMPLATE("memory is taken for the bytes that arrive, not for the size that is claimed",
                   Family, Sectioned, Flat) {
    Stored<Family> const stored(1);
    typename Family::File file(stored.path);
    test::claimedSize = 0x7FFFFFFF;
    {
        test::FailingMemory const none({0, Failing::ONE_AND_ALL_LATER, 2 * 1024 * 1024});
        file.open(READ);
    }
    test::claimedSize = -1;
    CHECK(!memoryRanOut());
    CHECK(test::sizeOf<Family>(file) == 1);
}

TEST_CASE_TEMPLATE("a log that runs out of memory while it is opened is closed and can be opened "
                   "again",
                   Times, One, OneAndAllLater) {
    Place const place;
    writeFile(place.path, "line\n");
    for (long before = 0;; ++before) {
        CAPTURE(before);
        LogFile log(place.path);
        std::string const outcome = runOutOfMemory(before, Times::value, [&] { log.open(3U); });
        if (!memoryRanOut()) break;
        CHECK(outcome == "std::bad_alloc");
        CHECK(!log.is_open());
        log.clear();
        log.open(3U);
        log << "x\n" << std::flush;
        CHECK(log.good());
    }
    CHECK(place.content().substr(0, 7) == "line\nx\n");
}

TEST_CASE_FIXTURE(Place,
                  "a file that runs out of memory while it is opened is closed and keeps its "
                  "content") {
    writeFile(path, "content");
    for (long before = 0;; ++before) {
        CAPTURE(before);
        Koru::File file(wide());
        std::string const outcome =
            runOutOfMemory(before, Failing::ONE_AND_ALL_LATER, [&] { file.open(READ_WRITE); });
        if (!memoryRanOut()) break;
        CHECK(outcome == "std::bad_alloc");
        CHECK(!file.is_open());
    }
    CHECK(content() == "content");
}

TEST_CASE_TEMPLATE("lines read before memory runs out are held", Family, Sectioned, Flat) {
    Stored<Family> const stored(5000);
    int most = 0;
    for (long before = 0;; ++before) {
        CAPTURE(before);
        typename Family::File file(stored.path);
        std::string const outcome = runOutOfMemory(before, Failing::ONE, [&] { file.open(READ); });
        int const held = static_cast<int>(test::sizeOf<Family>(file));
        CHECK(test::holds<Family>(file, 0, held));
        if (!memoryRanOut()) break;
        if (outcome == "done") CHECK(held == 5000); // only a guess
        most = std::max(most, held);
    }
    CHECK(most > 0);
}

TEST_CASE_TEMPLATE("a large file of comments takes its own size and no room for entries" *
                       doctest::skip(!test::ADDRESS_SPACE_CAN_BE_LIMITED),
                   Family, Sectioned, Flat) {
    std::size_t const large = 190 * 1024 * 1024;
    Stored<Family> const stored(2);
    writeFile(stored.path, stored.old + "#");
    // The rest of the comment is a hole, which takes no place on the disk.
    REQUIRE(::truncate(stored.path.c_str(), static_cast<off_t>(large)) == 0);
    CHECK(test::ending([&] {
              std::size_t const pages =
                  std::stoul(readFile("/proc/self/statm")); // of address space
              std::size_t const most =
                  pages * static_cast<std::size_t>(::sysconf(_SC_PAGESIZE)) + large + large / 8;
              rlimit const limit = {most, most};
              if (::setrlimit(RLIMIT_AS, &limit) != 0) return 1;
              typename Family::File file(stored.path);
              file.open(READ);
              return test::sizeOf<Family>(file) == 2 ? 0 : 2;
          }) == "exit 0");
}
