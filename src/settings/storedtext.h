// How a settings table keeps its text.
//
// Opening a file makes three strings of every line, and most programs look at few of them. So text
// from a file stays where it was read, as bytes, and is widened when somebody asks for it. The
// bytes are always those that make_string gives for the characters; where the file has others, they
// have been replaced. What callers set is kept as a wide string.
#ifndef KORU_SETTINGS_STOREDTEXT_H
#define KORU_SETTINGS_STOREDTEXT_H

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "text/convert.h"
#include "text/fingerprint.h"
#include "text/fold.h"
#include "text/wellformed.h"

namespace Koru {

/// A view of text that somebody else holds: bytes or a wide string. Empty by default.
class StoredText {
public:
    StoredText() : bytes_(""), size_(0) {}

    /// Bytes that make_string gives for what make_wstring makes of them.
    explicit StoredText(std::string_view bytes) : bytes_(bytes.data()), size_(bytes.size()) {}

    /// A wide string of any content.
    explicit StoredText(std::wstring* wide) : wide_(wide), size_(WIDE) {}

    bool isWide() const { return size_ == WIDE; }

    bool empty() const { return isWide() ? wide_->empty() : size_ == 0; }

    /// The wide string, or null where the text is bytes.
    std::wstring* wide() const { return isWide() ? wide_ : nullptr; }

    /// The bytes of a text that is not wide.
    std::string_view bytes() const { return std::string_view(bytes_, size_); }

    /// The text as a string, all characters of a wide one included.
    std::wstring str() const;

    /// Calls `use` with a cursor over the characters.
    template <class Use>
    auto withCursor(Use use) const;

private:
    static constexpr std::size_t WIDE = static_cast<std::size_t>(-1);

    union {
        char const* bytes_;
        std::wstring* wide_;
    };
    std::size_t size_; // or WIDE
};

/// A cursor over the characters of bytes.
class BytesCursor {
public:
    explicit BytesCursor(std::string_view bytes)
        : at_(bytes.data()), end_(bytes.data() + bytes.size()) {}

    wchar_t next() {
        if (at_ == end_) return 0;
        if (static_cast<signed char>(*at_) >= 0) return *at_++;
        Decoded const c = decodeOne(at_, static_cast<std::size_t>(end_ - at_));
        at_ += c.size;
        return c.value;
    }

private:
    char const* at_;
    char const* end_;
};

template <class Use>
auto StoredText::withCursor(Use use) const {
    if (isWide()) return use(WideCursor(wide_->c_str()));
    return use(BytesCursor(bytes()));
}

/// Compares as `compare` does with the wide strings.
int compare(StoredText const& a, StoredText const& b);

/// Whether `compare` finds them equal.
bool areEqual(StoredText const& a, std::wstring const& b);

/// Mixes the text into the number of the text before it, see text/fingerprint.h.
inline std::uint32_t mixFingerprint(std::uint32_t before, std::wstring const& text) {
    return mixFingerprint(before, text.data(), text.size());
}
inline std::uint32_t mixFingerprint(std::uint32_t before, StoredText const& text) {
    if (std::wstring const* const wide = text.wide()) return mixFingerprint(before, *wide);
    return mixFingerprint(before, text.bytes().data(), text.bytes().size());
}

} // namespace Koru

#endif
