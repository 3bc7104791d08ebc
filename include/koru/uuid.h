/// @file
/// A 16-byte universally unique identifier.
#ifndef KORU_UUID_H
#define KORU_UUID_H

#include <iosfwd>
#include <string>
#include <vector>

#include <koru/export.h>

namespace Koru {

/// 16 bytes with the text form of RFC 9562: 32 lower-case hexadecimal digits in groups of 8, 4, 4,
/// 4 and 12 with hyphens between them. A plain value: distinct objects may be used from several
/// threads at once. Identifiers are not generated here.
///
/// Nothing is thrown for bad input: it gives the identifier of 16 zero bytes.
class KORU_EXPORT Uuid {
public:
    /// 16 zero bytes.
    Uuid();

    Uuid(unsigned char const (&bytes)[16]);

    /// All zero unless there are exactly 16 bytes.
    Uuid(std::vector<unsigned char> const& bytes);

    /// Reads the text form in lower or upper case; all zero for text that is refused.
    /// Intended: what is asked is 36 characters (up to the first NUL), hexadecimal digits and
    /// hyphens, and no hyphen among the last as many characters as there are hyphens. So the
    /// hyphens may stand elsewhere, and of 36 digits without any the last four are ignored; with
    /// more than four hyphens fewer than 32 digits are enough, and the last are read twice.
    Uuid(std::string const& text);

    operator std::vector<unsigned char>() const;

    /// The text form, 36 characters.
    operator std::string() const;

    friend KORU_EXPORT bool operator==(Uuid const& a, Uuid const& b);
    friend KORU_EXPORT std::ostream& operator<<(std::ostream& os, Uuid const& uuid);

private:
    unsigned char bytes_[16];
};

KORU_EXPORT bool operator==(Uuid const& a, Uuid const& b);
KORU_EXPORT bool operator!=(Uuid const& a, Uuid const& b);

/// Writes the text form.
KORU_EXPORT std::ostream& operator<<(std::ostream& os, Uuid const& uuid);

} // namespace Koru

#endif
