#ifndef KORU_BENCH_FIXEDBUFFER_H
#define KORU_BENCH_FIXEDBUFFER_H

#include <streambuf>

namespace bench {

/// A stream's buffer of fixed size that is written from its start over and over, so that no growth
/// is timed.
template <class Character>
class FixedBuffer : public std::basic_streambuf<Character> {
public:
    FixedBuffer() { rewind(); }
    void rewind() { this->setp(characters_, characters_ + 256); }

private:
    Character characters_[256];
};

} // namespace bench

#endif
