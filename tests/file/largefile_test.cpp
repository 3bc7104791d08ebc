// Files of more than 2 GiB, as docs/largefiles.md has it. They have holes: they take no room on the
// disk and hold zeros where nothing was written.
#include <doctest/doctest.h>

#include <climits>
#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <ios>
#include <limits>
#include <new>
#include <stdexcept>
#include <string>
#include <system_error>

#include <koru/datafile.h>
#include <koru/file.h>
#include <koru/initializationfile.h>
#include <koru/logfile.h>
#include <koru/propertyfile.h>
#include <koru/string.h>
#include <koru/system.h>

#include "support/failingmemory.h"
#include "support/skip.h"
#include "support/tempdir.h"

using Koru::File;

namespace {

std::uintmax_t const GIB = std::uintmax_t{1} << 30U;
unsigned long const READ_WRITE = File::READ | File::WRITE;

/// A file with these bytes at its start and a hole up to its size.
struct LargeFile : test::Place {
    explicit LargeFile(std::uintmax_t size, std::string const& start = "") {
        write(start);
        std::error_code failure;
        std::filesystem::resize_file(path(), size, failure);
        isThere = !failure;
        if (!isThere) test::skipped("no file can be that large here: " + failure.message());
    }
    std::wstring wide() const { return Koru::make_wstring(path()); }
    std::uintmax_t size() const { return std::filesystem::file_size(path()); }

    /// The last bytes, as many.
    std::string tail(std::streamsize count) const {
        std::ifstream in(path(), std::ios::binary);
        in.seekg(-count, std::ios::end);
        std::string bytes(static_cast<std::size_t>(count), '\0');
        in.read(&bytes[0], count);
        return bytes;
    }

    bool isThere = false;
};

/// Where the stream is, as a number of its own width.
std::uintmax_t at(std::streampos position) {
    return static_cast<std::uintmax_t>(static_cast<std::streamoff>(position));
}

/// What `use` throws where memory is short: no allocation of 16 MiB or more succeeds.
template <class Use>
std::string whileMemoryIsShort(Use use) {
    std::size_t const least = 16U << 20U;
    return test::runOutOfMemory({0, test::Failing::ONE_AND_ALL_LATER, least, SIZE_MAX}, use);
}

} // namespace

TEST_CASE("a file of 5 GiB is opened for reading and for both") {
    LargeFile const large(5 * GIB, "start");
    if (!large.isThere) return;
    for (unsigned long const mode : {File::READ, READ_WRITE}) {
        File file(large.wide());
        file.open(mode);
        std::string word(5, ' ');
        file.read(&word[0], 5);
        CHECK(word == "start");
    }
    CHECK(large.size() == 5 * GIB);
}

TEST_CASE("positions have 64 bits") {
    LargeFile const large(5 * GIB);
    if (!large.isThere) return;
    File file(large.wide());
    file.open(READ_WRITE);
    auto const far = static_cast<std::streamoff>(4 * GIB + 3);
    file.seekp(far);
    file.write("here", 4);
    CHECK(at(file.tellp()) == 4 * GIB + 7);
    file.seekg(far);
    std::string word(4, ' ');
    file.read(&word[0], 4);
    CHECK(word == "here");
    file.seekg(0, std::ios::end);
    CHECK(at(file.tellg()) == 5 * GIB);
}

TEST_CASE("a file grows past 2 and past 4 GiB") {
    for (std::uintmax_t const size : {2 * GIB - 2, 4 * GIB - 2}) {
        LargeFile const large(size);
        if (!large.isThere) return;
        File file(large.wide());
        file.open(READ_WRITE);
        file.seekp(0, std::ios::end);
        file.write("over", 4);
        file.close();
        CHECK_FALSE(file.fail());
        CHECK(large.size() == size + 2 + 2);
        CHECK(large.tail(4) == "over");
    }
}

TEST_CASE("opening for writing alone empties a large file") {
    LargeFile const large(5 * GIB);
    if (!large.isThere) return;
    File file(large.wide());
    file.open(File::WRITE);
    CHECK(large.size() == 0);
}

TEST_CASE("a large file is found, renamed, recreated and removed") {
    LargeFile const large(5 * GIB);
    if (!large.isThere) return;
    std::wstring const other = large.wide() + L"2";
    CHECK(File::exists(large.wide()));
    CHECK(File::rename(large.wide(), other));
    CHECK(std::filesystem::file_size(large.path() + "2") == 5 * GIB);
    CHECK(File::rename(other, large.wide()));
    CHECK(File::create(large.wide()));
    CHECK(large.size() == 0);
    CHECK(File::remove(large.wide()));
    CHECK_FALSE(Koru::System::existsFile(large.wide()));
}

TEST_CASE("copy of a large file copies as little as of any other") {
    LargeFile const large(5 * GIB);
    if (!large.isThere) return;
    std::wstring const copy = large.wide() + L"2";
    CHECK(File::copy(large.wide(), copy));
    CHECK(std::filesystem::file_size(large.path() + "2") < 20);
}

TEST_CASE("a relative path to a large file is resolved") {
    LargeFile const large(5 * GIB);
    if (!large.isThere) return;
    std::string const up = "../../../../../../../../../../../../../../../..";
    CHECK(std::wstring(File::Path(up + large.path())) == large.wide());
}

TEST_CASE("the rest of a large file is copied through its stream") {
    LargeFile const large(5 * GIB, "start");
    if (!large.isThere) return;
    File file(large.wide());
    file.open(File::READ);
    file.seekg(static_cast<std::streamoff>(5 * GIB - 4));
    std::ofstream out(large.path() + "2", std::ios::binary);
    out << file.rdbuf();
    CHECK(at(out.tellp()) == 4);
}

TEST_CASE("one call moves at most what a streamsize counts") {
    auto const most = static_cast<std::uintmax_t>(std::numeric_limits<std::streamsize>::max());
    CHECK(most == (sizeof(long) == 4 ? 2 * GIB - 1 : std::numeric_limits<std::int64_t>::max()));
    CHECK(std::numeric_limits<std::streamoff>::max() == std::numeric_limits<std::int64_t>::max());
}

TEST_CASE("a log is appended to past 2 and past 4 GiB") {
    for (std::uintmax_t const size : {2 * GIB - 2, 4 * GIB - 2, 5 * GIB}) {
        LargeFile const large(size);
        if (!large.isThere) return;
        Koru::LogFile log{File::Path(large.path())};
        log.open(static_cast<unsigned int>(READ_WRITE));
        log.write("line\n", 5).flush();
        CHECK(log.good());
        CHECK(large.size() == size + 5);
        CHECK(large.tail(5) == "line\n");
        CHECK(at(log.tellp()) == size + 5);
    }
}

TEST_CASE(
    "a settings file that memory cannot hold is std::bad_alloc, and nothing of it is written") {
    LargeFile const large(5 * GIB, "[s]\nk=1\n");
    if (!large.isThere) return;
    CHECK(whileMemoryIsShort([&] {
              Koru::InitializationFile settings(large.path());
              try {
                  settings.open(READ_WRITE);
              } catch (...) {
                  settings.setMode(0);
                  throw;
              }
          }) == "std::bad_alloc");
    CHECK(large.size() == 5 * GIB);
    CHECK(whileMemoryIsShort([&] {
              Koru::PropertyFile properties(large.path());
              properties.open(File::READ);
          }) == "std::bad_alloc");
}

TEST_CASE(
    "records beyond what memory can hold are std::bad_alloc, and those before them are held") {
    // The key "a" with no data; then the key "b" with 1 GiB of data, which is there.
    std::string const start("\2\0\0\0\0a\0\0\0\0"
                            "\2\0\0\0\0b\0\0\0\x40",
                            20);
    LargeFile const large(5 * GIB, start);
    if (!large.isThere) return;
    CHECK(whileMemoryIsShort([&] {
              Koru::DataFile file{File::Path(large.path())};
              try {
                  file.open(READ_WRITE);
              } catch (...) {
                  file.setMode(0);
                  if (file.size() != 1) throw std::runtime_error("not one record");
                  throw;
              }
          }) == "std::bad_alloc");
    CHECK(large.size() == 5 * GIB);
}

#if LONG_MAX == 2147483647
TEST_CASE("data of 2 GiB and more cannot be read by a 32-bit program, whatever memory there is") {
    std::string const start("\2\0\0\0\0a\0\0\0\x80", 10);
    LargeFile const large(5 * GIB, start);
    if (!large.isThere) return;
    Koru::DataFile file{File::Path(large.path())};
    CHECK_THROWS_AS(file.open(File::READ), std::bad_alloc);
    CHECK(file.size() == 0);
}
#endif
