#include "settings/lines.h"

#include <algorithm>
#include <new>
#include <stdexcept>

#include "concurrency/cancellation.h"
#include "file/rewind.h"

namespace Koru {

namespace {

constexpr std::size_t FIRST_CAPACITY_MOST = 1024 * 1024;

/// How many bytes are to come, as far as the system knows: pipes and the files of /proc do not
/// tell, and what a file says may be more than memory holds.
std::size_t _sizeHint(File& file) {
    std::streamsize const size = file.rdbuf()->in_avail();
    return size <= 0 ? 0 : static_cast<std::size_t>(size);
}

/// Moves the bytes to larger memory.
/// @param needed  the least that it has to hold
/// @param wished  what it had better hold; taken back step by step where there is not as much
/// @return how much it holds
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

/// Reads up to the end of the file, or an error. Each peek that finds nothing buffered reads a
/// block, so what came before an error is kept.
void _readAll(File& file, FileBytes& bytes) {
    std::size_t const hint = _sizeHint(file);
    std::size_t capacity = _grow(bytes, 1, std::min(hint, FIRST_CAPACITY_MOST));
    while (file.peek() != std::char_traits<char>::eof()) {
        auto const arrived = static_cast<std::size_t>(file.rdbuf()->in_avail());
        if (arrived > capacity - bytes.size)
            capacity = _grow(bytes, bytes.size + arrived, std::max(2 * capacity, hint));
        bytes.size += static_cast<std::size_t>(file.rdbuf()->sgetn(
            bytes.data.get() + bytes.size, static_cast<std::streamsize>(arrived)));
    }
    if (file.bad()) throw std::runtime_error("failed to read from file");
}

} // namespace

FileBytes readBytes(File& file) {
    FileBytes bytes;
    rewind(file);
    bytes.failure = attempt(
        [&] {
            _readAll(file, bytes);
            return std::exception_ptr();
        },
        [] { return std::current_exception(); });
    return bytes;
}

} // namespace Koru
