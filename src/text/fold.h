// How names are compared, character by character.
#ifndef KORU_TEXT_FOLD_H
#define KORU_TEXT_FOLD_H

#include <cstdint>
#include <cwchar>
#include <cwctype>

namespace Koru {

/// The letters of ASCII that locales dispute. All others are paired, A with a to Z with z and with
/// nothing else, in every locale.
enum DisputedLetter : std::uint8_t {
    CAPITAL_I = 'I', ///< in Turkish and Azerbaijani the capital of dotless i, U+0131
    SMALL_I = 'i',   ///< also the lower case of dotted I, U+0130
    SMALL_K = 'k',   ///< also the lower case of the Kelvin sign, U+212A
};

/// Whether every locale lowers a character as ASCII does. It does not matter here what else is
/// lowered to the same.
inline bool isUndisputed(wchar_t c) { return static_cast<wint_t>(c) < 0x80 && c != CAPITAL_I; }

/// The character as towlower gives it under the current C locale, which is asked where it matters.
inline wint_t lower(wchar_t c) {
    auto const value = static_cast<wint_t>(c);
    if (!isUndisputed(c)) return std::towlower(value);
    return c >= L'A' && c <= L'Z' ? value + (L'a' - L'A') : value;
}

/// Whether I and i are a pair under the current C locale.
inline bool isPairOfI() { return lower(CAPITAL_I) == SMALL_I; }

/// Compares two texts as wcscasecmp (POSIX) does. A cursor's `next` gives one character after the
/// other and then 0. Inlined by force: a call costs as much as a few characters.
template <class CursorA, class CursorB>
[[gnu::always_inline]] inline int compareFolded(CursorA a, CursorB b) {
    for (;;) {
        wchar_t const x = a.next();
        wchar_t const y = b.next();
        // Equal characters are equal in every locale; only others need to be folded.
        if (x == y) {
            if (x == 0) return 0;
            continue;
        }
        wint_t const lowerX = lower(x);
        wint_t const lowerY = lower(y);
        // Intended: the difference wraps, as that of wcscasecmp does.
        if (lowerX != lowerY) return static_cast<int>(lowerX - lowerY);
    }
}

/// A cursor over text that ends with a NUL.
class WideCursor {
public:
    explicit WideCursor(wchar_t const* text) : text_(text) {}
    wchar_t next() { return *text_ == 0 ? L'\0' : *text_++; }

private:
    wchar_t const* text_;
};

} // namespace Koru

#endif
