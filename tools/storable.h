// Whether a settings file or a property file gives text back as it was set: both consist of lines
// in which nothing is escaped.
#ifndef KORU_TOOLS_STORABLE_H
#define KORU_TOOLS_STORABLE_H

#include <string>

namespace tool {

/// @throws Failure with the reason, for a key that would not come back. The characters of
///         `beginnings` begin lines of another kind.
void checkKey(std::string const& key, char const* beginnings);
/// @throws Failure likewise
void checkValue(std::string const& value);
/// @throws Failure likewise
void checkSection(std::string const& section);

} // namespace tool

#endif
