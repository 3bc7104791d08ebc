#include "text/insert.h"

#include <ostream>

#include "concurrency/cancellation.h"

namespace Koru {

namespace {

/// Whether inserting characters one by one comes down to handing each to the stream's buffer: a
/// width pads the first one, unitbuf flushes each, a tied stream is flushed before each.
inline bool _passesThrough(std::ostream const& os) {
    return os.good() && os.width() == 0 && (os.flags() & std::ios::unitbuf) == 0 &&
           os.tie() == nullptr;
}

/// Notes that the buffer threw, as formatted output does: without an exception of the stream's own.
void _setBad(std::ostream& os) {
    try {
        os.setstate(std::ios::badbit);
    } catch (std::ios::failure const&) { // The buffer's exception takes its place.
    }
}

/// Hands the characters up to `last` and that one to the buffer, at once but with the same outcome
/// as one by one: the first that fails makes the stream bad, and the one after it makes it fail.
void _passThrough(std::ostream& os, char const* s, char const* last) {
    bool onlyLast = false; // whether it alone is left to be put
    auto const put = [&] {
        onlyLast = os.rdbuf()->sputn(s, last - s) == last - s;
        if (onlyLast && os.rdbuf()->sputc(*last) != std::char_traits<char>::eof()) return;
        os.setstate(std::ios::badbit);
    };
    auto const setBad = [&os] { _setBad(os); };
    auto const catchUnlessAsked = [&os] {
        _setBad(os);
        // `attempt` calls this in a handler.
        // cppcheck-suppress rethrowNoCurrentException
        if ((os.exceptions() & std::ios::badbit) != 0) throw;
    };
    undoIfCancelled([&] { attempt(put, catchUnlessAsked); }, setBad);
    if (!onlyLast) os.setstate(std::ios::failbit);
}

} // namespace

void insert(std::ostream& os, char const* s, std::size_t size) {
    if (size == 0) return;
    char const* const last = s + size - 1;
    if (_passesThrough(os)) {
        _passThrough(os, s, last);
        return;
    }
    for (; s <= last; ++s) os << *s;
}

} // namespace Koru
