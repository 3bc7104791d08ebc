// Files when memory runs out, what a plain file, a log and the structured files have in common.
#include <doctest/doctest.h>

#include <sys/resource.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <string>

#include <koru/logfile.h>

#include "support/failingmemory.h"
#include "support/structuredfile.h"
#include "support/subprocess.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::File;
using Koru::LogFile;
using test::Failing;
using test::Flat;
using test::memoryRanOut;
using test::messageOf;
using test::readFile;
using test::Records;
using test::runOutOfMemory;
using test::Sectioned;
using test::TempDir;
using test::writeFile;

TEST_CASE("a log that runs out of memory while it is opened is closed and can be opened again") {
    TempDir const directory;
    std::string const path = directory / "program.log";
    for (Failing const failing : {Failing::ONE, Failing::ONE_AND_ALL_LATER}) {
        writeFile(path, "line\n");
        for (long before = 0;; ++before) {
            CAPTURE(before);
            LogFile log(path);
            std::string const outcome = runOutOfMemory(before, failing, [&] { log.open(3U); });
            if (!memoryRanOut()) break;
            CHECK(outcome == "std::bad_alloc");
            CHECK(!log.is_open());
            log.clear();
            log.open(3U);
            log.write("x\n", 2).flush();
            CHECK(log.good());
        }
        CHECK(readFile(path).substr(0, 7) == "line\nx\n");
    }
}

TEST_CASE("a file that runs out of memory while it is opened is closed and keeps its content") {
    TempDir const directory;
    std::string const path = directory / "file";
    writeFile(path, "content");
    for (long before = 0;; ++before) {
        CAPTURE(before);
        File file(std::wstring(path.begin(), path.end()));
        std::string const outcome = runOutOfMemory(before, Failing::ONE_AND_ALL_LATER,
                                                   [&] { file.open(File::READ | File::WRITE); });
        if (!memoryRanOut()) break;
        CHECK(outcome == "std::bad_alloc");
        CHECK(!file.is_open());
    }
    CHECK(readFile(path) == "content");
}

TEST_CASE_TEMPLATE("lines read before memory runs out are held", Family, Sectioned, Flat) {
    TempDir const directory;
    std::string const path = directory / "file";
    int const count = 5000;
    writeFile(path, Family::bytes(0, count));
    std::size_t most = 0;
    for (long before = 0;; ++before) {
        CAPTURE(before);
        typename Family::File file(path);
        std::string const outcome =
            runOutOfMemory(before, Failing::ONE, [&] { file.open(File::READ); });
        std::size_t const held = test::sizeOf<Family>(file);
        CHECK(test::holds<Family>(file, 0, static_cast<int>(held)));
        if (!memoryRanOut()) break;
        if (outcome == "done") CHECK(held == static_cast<std::size_t>(count)); // only a guess
        most = std::max(most, held);
    }
    CHECK(most > 0);
}

namespace {

std::size_t const LARGE = 190 * 1024 * 1024;

/// What the process takes of its address space, in bytes.
std::size_t _addressSpace() {
    return std::stoul(readFile("/proc/self/statm")) *
           static_cast<std::size_t>(::sysconf(_SC_PAGESIZE));
}

} // namespace

TEST_CASE_TEMPLATE("a large file of comments takes its own size and no room for entries" *
                       doctest::skip(!test::ADDRESS_SPACE_CAN_BE_LIMITED),
                   Family, Sectioned, Flat) {
    TempDir const directory;
    std::string const path = directory / "file";
    writeFile(path, Family::bytes(0, 2) + "#");
    // The rest of the comment is a hole, which takes no place on the disk.
    REQUIRE(::truncate(path.c_str(), static_cast<off_t>(LARGE)) == 0);
    CHECK(test::ending([&] {
              std::size_t const most = _addressSpace() + LARGE + LARGE / 8;
              rlimit const limit = {most, most};
              if (::setrlimit(RLIMIT_AS, &limit) != 0) return 1;
              typename Family::File file(path);
              file.open(File::READ);
              return test::sizeOf<Family>(file) == 2 ? 0 : 2;
          }) == "exit 0");
}
