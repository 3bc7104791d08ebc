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
/// 4 and 12 with hyphens between them. A plain value: several threads may use distinct objects at
/// once. The library does not generate identifiers.
///
/// Bad input throws nothing: it gives the identifier of 16 zero bytes.
class KORU_EXPORT Uuid {
public:
    /// 16 zero bytes.
    Uuid();

    /// The 16 bytes in the order given.
    Uuid(unsigned char const (&bytes)[16]);

    /// The same; all zero when the vector's size is not 16.
    Uuid(std::vector<unsigned char> const& bytes);

    /// Reads the text form, in lower or upper case; all zero for text that it refuses.
    /// Intended: it accepts every text of 36 hexadecimal digits and hyphens (counted up to the
    /// first NUL) that has no hyphen among its last n characters, n being the number of its
    /// hyphens. So hyphens may be in other places, and of 36 digits without a hyphen it ignores the
    /// last four. With more than four hyphens, fewer than 32 digits are enough; it reads the last
    /// ones twice.
    Uuid(std::string const& text);

    /// The 16 bytes in order.
    operator std::vector<unsigned char>() const;

    /// The text form, 36 characters.
    operator std::string() const;

    friend KORU_EXPORT bool operator==(Uuid const& a, Uuid const& b);
    friend KORU_EXPORT std::ostream& operator<<(std::ostream& os, Uuid const& uuid);

private:
    unsigned char bytes_[16];
};

/// @{
/// Equal when all 16 bytes are.
KORU_EXPORT bool operator==(Uuid const& a, Uuid const& b);
KORU_EXPORT bool operator!=(Uuid const& a, Uuid const& b);
/// @}

/// Writes the text form.
KORU_EXPORT std::ostream& operator<<(std::ostream& os, Uuid const& uuid);

} // namespace Koru

#endif
