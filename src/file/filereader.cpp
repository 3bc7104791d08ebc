#include "file/filereader.h"

#include <algorithm>
#include <cerrno>
#include <new>
#include <stdexcept>
#include <utility>

#include "concurrency/cancellation.h"

namespace Koru {

namespace {

constexpr std::size_t FIRST_CAPACITY_MOST = 1024 * 1024; // bytes

bool _failed(std::streampos position) { return position == std::streampos(std::streamoff(-1)); }

/// Whether the file is a pipe or the like. Asks for the position: that neither moves nor flushes
/// anything, so it fails for no other reason.
bool _hasNoStart(std::filebuf& buffer) {
    errno = 0;
    return _failed(buffer.pubseekoff(0, std::ios::cur, std::ios::in)) && errno == ESPIPE;
}

/// Moves the bytes to larger memory.
/// @param needed  the size that it must have at least
/// @param wished  the size that it should have; tries smaller ones if memory is short
/// @return the size that it has
std::size_t _grow(FileBytes& bytes, std::size_t needed, std::size_t wished) {
    std::size_t capacity = std::max(needed, wished);
    std::unique_ptr<char[]> larger(new (std::nothrow) char[capacity]);
    while (!larger && capacity != needed) {
        capacity = needed + (capacity - needed) / 2;
        larger.reset(new (std::nothrow) char[capacity]);
    }
    if (!larger) throw std::bad_alloc();
    std::copy_n(bytes.data.get(), bytes.size, larger.get());
    bytes.data = std::move(larger);
    return capacity;
}

} // namespace

FileReader::FileReader(File& file) : file_(file) {
    file.flush();
    file.clear();
    // Seeking also writes what flush left in the buffer, if the stream was in the fail state.
    bool const atStart = !_failed(file.rdbuf()->pubseekpos(0, std::ios::in));
    if (!atStart && !_hasNoStart(*file.rdbuf())) fail();
}

std::size_t FileReader::arrived() {
    if (file_.peek() == std::char_traits<char>::eof()) return 0;
    return static_cast<std::size_t>(file_.rdbuf()->in_avail());
}

std::size_t FileReader::take(char* to, std::size_t size) {
    return static_cast<std::size_t>(file_.rdbuf()->sgetn(to, static_cast<std::streamsize>(size)));
}

void FileReader::fail() {
    file_.setstate(std::ios::failbit);
    throw std::runtime_error("failed to read from file");
}

FileBytes FileReader::readAll() {
    FileBytes bytes;
    bytes.failure = attempt(
        [&] {
            readAll(bytes);
            return std::exception_ptr();
        },
        [] { return std::current_exception(); });
    return bytes;
}

/// How many bytes are to come, as far as the system knows. Only a guess: pipes and the files of
/// /proc do not tell, and a file may claim more than memory can hold.
std::size_t FileReader::sizeHint() {
    std::streamsize const size = file_.rdbuf()->in_avail();
    return size <= 0 ? 0 : static_cast<std::size_t>(size);
}

void FileReader::readAll(FileBytes& bytes) {
    std::size_t const hint = sizeHint();
    std::size_t capacity = _grow(bytes, 1, std::min(hint, FIRST_CAPACITY_MOST));
    while (std::size_t const portion = arrived()) {
        if (portion > capacity - bytes.size) {
            std::size_t const wished = hint > capacity ? hint : 2 * capacity;
            capacity = _grow(bytes, bytes.size + portion, wished);
        }
        bytes.size += take(bytes.data.get() + bytes.size, portion);
    }
    if (hasFailed()) throw std::runtime_error("failed to read from file");
}

} // namespace Koru
