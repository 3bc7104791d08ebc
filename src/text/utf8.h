// The two conversions, a block at a time: a string is then allocated once, at its size, and no
// memory of it is written twice. Both go through text in steps of sixteen units. Steps of ASCII
// take SSE2; steps of well-formed text that is not ASCII take SSSE3 where the machine has it; all
// else goes by the plain rules, character by character. What comes out is the same.
#ifndef KORU_TEXT_UTF8_H
#define KORU_TEXT_UTF8_H

#include <cstddef>

namespace Koru {

/// The units that a block has room for.
constexpr std::size_t BLOCK = 2048;

/// How a block on the stack is aligned, and with it the frame of the function that has it. The
/// functions below need that: they keep vectors on the stack without aligning it, and on 32 bits
/// an application may call the library with a stack that is aligned to four bytes only.
constexpr std::size_t BLOCK_ALIGNMENT = 16;

/// How many bytes or characters a step takes in at the most.
constexpr std::ptrdiff_t STEP = 16;

/// How far a conversion has come. Taken and returned by value, which keeps it in registers: any
/// byte that is written through a reference to it might change it, as far as the compiler knows.
template <class In, class Out>
struct Progress {
    In const* s;
    Out* to;
};

/// Decodes to a block until it may be too small for another step, or the text ends, or a zero comes
/// out, which ends the text. Moves `s` on, to `end` in the latter cases, and returns the end of
/// what was written. There is no zero byte before `end`. To `shuffle` is only for a machine that
/// can (see CAN_SHUFFLE).
wchar_t* decodeBlock(char const*& s, char const* end, wchar_t* to, bool shuffle);

/// The same from characters to bytes, where the text also ends at a character of zero.
char* encodeBlock(wchar_t const*& s, wchar_t const* end, char* to, bool shuffle);

/// The number of bytes that are not continuation bytes: the number of characters, if the text is
/// well-formed.
std::size_t countLeads(char const* s, std::size_t size);

} // namespace Koru

#endif
