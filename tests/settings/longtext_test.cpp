// Settings whose text is too long for a string, as only 32 bits can meet it: a line of a file may
// be longer. A program of its own, since the reading call and the operators that allocate memory
// are replaced for all of it.
#include <doctest/doctest.h>

#include <sys/mman.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <koru/initializationfile.h>
#include <koru/propertyfile.h>

#include "support/failingmemory.h"
#include "support/tempdir.h"
#include "support/throws.h"

using Koru::InitializationFile;
using Koru::PropertyFile;

namespace {

constexpr std::size_t PIECE = 1 << 20;
constexpr std::size_t SIZE = test::ReserveForHugeBlock::HUGE_SIZE;
constexpr bool NARROW_ADDRESSES = sizeof(void*) == 4;
static_assert(!NARROW_ADDRESSES || SIZE - PIECE > PTRDIFF_MAX / sizeof(wchar_t), "");

/// Memory for a file that is alike but for its ends: all between them is one piece, again and
/// again, since a machine might not have as much.
class Memory {
public:
    Memory() {
        void* const memory = ::mmap(nullptr, SIZE, PROT_READ | PROT_WRITE,
                                    MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE, -1, 0);
        REQUIRE(memory != MAP_FAILED);
        memory_ = static_cast<char*>(memory);
        int const piece = ::memfd_create("piece", 0);
        REQUIRE(::ftruncate(piece, PIECE) == 0);
        for (std::size_t at = PIECE; at < SIZE - PIECE; at += PIECE) {
            REQUIRE(::mmap(memory_ + at, PIECE, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_FIXED,
                           piece, 0) != MAP_FAILED);
        }
        ::close(piece);
    }
    Memory(Memory const&) = delete;
    Memory& operator=(Memory const&) = delete;
    ~Memory() { ::munmap(memory_, SIZE); }

    void* get() const { return memory_; }

private:
    char* memory_ = nullptr;
};

void* memory() {
    static Memory const theMemory; // whose pages take a second to be made
    return theMemory.get();
}

bool holesAreText = false; // whether what nobody wrote is read as `x`

} // namespace

extern "C" ssize_t read(int fd, void* buffer, size_t count) {
    auto const at = static_cast<std::size_t>(::lseek(fd, 0, SEEK_CUR));
    if (holesAreText && at >= PIECE && at < SIZE - PIECE - count) {
        std::memset(buffer, 'x', count);
        ::lseek(fd, static_cast<off_t>(count), SEEK_CUR);
        return static_cast<ssize_t>(count);
    }
    auto const size = static_cast<ssize_t>(::syscall(SYS_read, fd, buffer, count));
    char* const bytes = static_cast<char*>(buffer);
    if (holesAreText && size > 0) std::replace(bytes, bytes + size, '\0', 'x');
    return size;
}

namespace {

/// Opens a file that is all `x` but for its ends and says how the question ends.
template <class File, class Ask>
std::string answer(std::string const& head, std::string const& tail, Ask ask) {
    test::Place const place;
    place.write(head);
    std::filesystem::resize_file(place.path(), SIZE - tail.size());
    std::ofstream(place.path(), std::ios::app) << tail;
    test::ReserveForHugeBlock const reserve(memory());
    std::vector<char> buffer(PIECE); // fewer calls
    File file(place.path());
    static_cast<std::fstream&>(file).rdbuf()->pubsetbuf(buffer.data(), PIECE);
    holesAreText = true;
    file.open(Koru::File::READ);
    holesAreText = false;
    return test::messageOf<std::bad_alloc>([&] { ask(file); });
}

} // namespace

TEST_CASE("a section, key or value too long for a string is want of memory when it is asked for" *
          doctest::skip(!NARROW_ADDRESSES)) {
    auto const section = [](InitializationFile& file) { file.enumerateSections(); };
    auto const key = [](InitializationFile& file) { file.enumerateKeys(L"s"); };
    auto const value = [](InitializationFile& file) { file.getValue(L"s", L"k"); };
    CHECK(answer<InitializationFile>("[", "]\nk=v\n", section) == "std::bad_alloc");
    CHECK(answer<InitializationFile>("[s]\n", "=v\n", key) == "std::bad_alloc");
    CHECK(answer<InitializationFile>("[s]\nk=", "\n", value) == "std::bad_alloc");
}

TEST_CASE("a property too long for a string is want of memory when it is asked for" *
          doctest::skip(!NARROW_ADDRESSES)) {
    auto const key = [](PropertyFile& file) { file.enumerateKeys(); };
    auto const value = [](PropertyFile& file) { file.getValue(L"k"); };
    CHECK(answer<PropertyFile>("", "=v\n", key) == "std::bad_alloc");
    CHECK(answer<PropertyFile>("k=", "\n", value) == "std::bad_alloc");
}
