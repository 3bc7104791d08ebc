// Formatted output of characters, as the inserters of strings do it.
#ifndef KORU_TEXT_INSERT_H
#define KORU_TEXT_INSERT_H

#include <cstddef>
#include <iosfwd>

namespace Koru {

/// Inserts characters so that it looks like inserting one after the other with `os << c`: width and
/// fill apply to the first one only.
void insert(std::ostream& os, char const* s, std::size_t size);

} // namespace Koru

#endif
