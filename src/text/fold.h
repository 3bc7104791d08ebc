// How names are compared, character by character.
#ifndef KORU_TEXT_FOLD_H
#define KORU_TEXT_FOLD_H

#include <cwchar>
#include <cwctype>

namespace Koru {

/// The character as towlower gives it under the current C locale. No locale disputes how ASCII is
/// lowered but for I, the capital of dotless i in Turkish, so only that and what is beyond ASCII
/// has to be asked.
inline wint_t lower(wchar_t c) {
    auto const value = static_cast<wint_t>(c);
    if (value >= 0x80 || c == L'I') return std::towlower(value);
    return c >= L'A' && c <= L'Z' ? value + (L'a' - L'A') : value;
}

/// Whether every locale lowers a character as ASCII has it.
inline bool isUndisputed(wchar_t c) { return static_cast<wint_t>(c) < 0x80 && c != L'I'; }

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
