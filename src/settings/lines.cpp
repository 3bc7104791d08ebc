#include "settings/lines.h"

#include <algorithm>

#include "file/rewind.h"

namespace Koru {

namespace {

constexpr std::size_t FIRST_CAPACITY_MOST = 1024 * 1024;

/// How many bytes the file says it has, as a hint: pipes and the files of /proc do not tell, and
/// directories lie. Leaves the stream at the start of the file, where it has one.
std::size_t _sizeHint(File& file) {
    std::streamoff const size = file.rdbuf()->pubseekoff(0, std::ios::end, std::ios::in);
    file.rdbuf()->pubseekpos(0, std::ios::in);
    if (size <= 0 || static_cast<unsigned long long>(size) >= static_cast<std::size_t>(-1))
        return 0;
    return static_cast<std::size_t>(size);
}

/// Moves the bytes to memory of another size.
void _grow(FileBytes& bytes, std::size_t capacity) {
    std::unique_ptr<char[]> larger(new char[capacity]);
    std::copy_n(bytes.data.get(), bytes.size, larger.get());
    bytes.data = std::move(larger);
}

} // namespace

FileBytes readBytes(File& file) {
    rewind(file);
    std::size_t const hint = _sizeHint(file);
    std::size_t capacity = std::clamp<std::size_t>(hint, 1, FIRST_CAPACITY_MOST);
    FileBytes bytes;
    bytes.data.reset(new char[capacity]);
    // Each peek that finds nothing buffered reads a block. So what came before an error is kept.
    while (file.peek() != std::char_traits<char>::eof()) {
        auto const arrived = static_cast<std::size_t>(file.rdbuf()->in_avail());
        if (arrived > capacity - bytes.size) {
            capacity = std::max({2 * capacity, bytes.size + arrived, hint});
            _grow(bytes, capacity);
        }
        bytes.size += static_cast<std::size_t>(file.rdbuf()->sgetn(
            bytes.data.get() + bytes.size, static_cast<std::streamsize>(arrived)));
    }
    bytes.whole = !file.bad();
    return bytes;
}

} // namespace Koru
