#include "settings/storedtext.h"

#include <koru/string.h>

#include "text/narrow.h"

namespace Koru {

std::wstring StoredText::str() const {
    constexpr std::size_t few = 64; // Beyond it, widening several at a time is worthwhile.
    if (isWide()) return wideString(wide_->data(), wide_->size());
    if (size_ <= few && isPlain(bytes())) return std::wstring(bytes_, bytes_ + size_);
    return make_wstring(bytes_, size_);
}

namespace {

/// Decides the rarer cases. A function of its own, so that the usual ones do without its stack.
__attribute__((noinline)) int _compareFolded(StoredText const& a, StoredText const& b) {
    return a.withCursor(
        [&b](auto x) { return b.withCursor([&x](auto y) { return compareFolded(x, y); }); });
}

} // namespace

int compare(StoredText const& a, StoredText const& b) {
    if (a.isWide() || b.isWide()) return _compareFolded(a, b);
    std::string_view const x = a.bytes();
    std::string_view const y = b.bytes();
    std::size_t const i = firstDifference(x, y);
    if (i == y.size()) return i == x.size() ? 0 : 1;
    if (i == x.size()) return -1;
    // Usually the first two characters that differ decide.
    bool const decided = isUndisputed(x[i]) && isUndisputed(y[i]) && lower(x[i]) != lower(y[i]);
    return decided ? static_cast<int>(lower(x[i]) - lower(y[i])) : _compareFolded(a, b);
}

namespace {

__attribute__((noinline)) bool _areEqualFolded(StoredText const& a, std::wstring const& b) {
    if (std::wstring const* const wide = a.wide()) return compare(*wide, b) == 0;
    return compareFolded(BytesCursor(a.bytes()), WideCursor(b.c_str())) == 0;
}

} // namespace

bool areEqual(StoredText const& a, std::wstring const& b) {
    // Usually a caller spells a name as the file does.
    if (!a.isWide() && a.bytes().size() == b.size() &&
        areSameAscii(a.bytes().data(), b.data(), b.size()))
        return true;
    return _areEqualFolded(a, b);
}

} // namespace Koru
