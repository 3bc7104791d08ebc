/// @file
/// Length, case-insensitive comparison, UTF-8 conversion and stream output of strings: the one
/// place where the wide strings of the interface meet the bytes of files and system calls.
///
/// Everywhere in the library a string ends at its first NUL character, whatever its stored size.
/// Several threads may call all functions at once. None reports an error: text that cannot be
/// converted comes out as described. They throw nothing but `std::bad_alloc`, also for text that is
/// too long for a string; the inserters fail and throw as the stream's own output does.
#ifndef KORU_STRING_H
#define KORU_STRING_H

#include <cstddef>
#include <iosfwd>
#include <string>

#include <koru/export.h>

namespace Koru {

/// @{
/// The empty strings; `make_string` and `make_wstring` return copies of them. They exist before any
/// function of the library can be called, even by the static constructors of an application.
extern KORU_EXPORT std::string const _null_string;
extern KORU_EXPORT std::wstring const _null_wstring;
/// @}

/// @{
/// The number of characters before the first NUL; 0 for a null pointer.
KORU_EXPORT std::size_t length(char const* s);
KORU_EXPORT std::size_t length(std::string const& s);
KORU_EXPORT std::size_t length(wchar_t const* s);
KORU_EXPORT std::size_t length(std::wstring const& s);
/// @}

/// @{
/// Compares without regard to case, as `strcasecmp` and `wcscasecmp` (POSIX) do under the current
/// C locale: negative, 0 or positive. Wide ASCII letters other than I and i pair as they do in
/// every locale of the C library, even where a locale that you have compiled yourself pairs them
/// differently. Characters of 0x80000000 and above compare as the C library subtracts them, which
/// is not a consistent order. Pointers must not be null.
KORU_EXPORT int compare(char const* a, char const* b);
KORU_EXPORT int compare(std::string const& a, std::string const& b);
KORU_EXPORT int compare(wchar_t const* a, wchar_t const* b);
KORU_EXPORT int compare(std::wstring const& a, std::wstring const& b);
/// @}

/// @{
/// Copies the text up to the first NUL; gives the empty string for a null pointer.
KORU_EXPORT std::string make_string(char const* s);
KORU_EXPORT std::wstring make_wstring(wchar_t const* s);
/// @}

/// @{
/// Encodes as UTF-8 in its early form with sequences of up to six bytes (RFC 2279), so that every
/// value from 0 to 0x7FFFFFFF, surrogates included, survives encoding and decoding. A value of
/// 0x80000000 or above becomes its low byte; if that byte is zero, the result ends there.
/// A null pointer gives the empty string.
KORU_EXPORT std::string make_string(std::wstring const& s);
KORU_EXPORT std::string make_string(wchar_t const* s);
/// @}

/// @{
/// Decodes UTF-8 (RFC 2279, one to six bytes a character) without validating it: the lead byte
/// decides how many bytes make a character, each byte that follows gives its low six bits, overlong
/// forms are accepted, and a character that the end of the text cuts short gives `?` for each of
/// its bytes.
/// Intended: a stray continuation byte (0x80 to 0xBF), 0xFE or 0xFF counts as the first of six
/// bytes wherever five more follow. An overlong zero ends the result. A null pointer gives the
/// empty string.
KORU_EXPORT std::wstring make_wstring(std::string const& s);
KORU_EXPORT std::wstring make_wstring(char const* s);
/// @}

/// Writes every stored character of the string, NULs included, as its low 8 bits. It does not
/// encode, so text beyond Latin-1 comes out garbled: for UTF-8, write `make_string(s)` with
/// `os.write`. Width and fill apply to the first character only.
KORU_EXPORT std::ostream& operator<<(std::ostream& os, std::wstring const& s);

/// Writes the first n bytes of the string, n being the low 8 bits of its stored size read as a
/// signed number; nothing when n is 0 or negative.
/// Intended: it writes all of 127 bytes, none of 128 to 256, and the first 44 of 300. For text of
/// any length, use `os.write`. Inside namespace `Koru`, and wherever that is imported, the compiler
/// chooses this operator over the standard one. Width and fill apply to the first byte only.
KORU_EXPORT std::ostream& operator<<(std::ostream& os, std::string const& s);

} // namespace Koru

#endif
