// Entries as text, in the form of the file's own family or of its text form, and as lines of JSON.
#ifndef KORU_TOOLS_PRINT_H
#define KORU_TOOLS_PRINT_H

#include <string>
#include <vector>

#include "table.h"

namespace tool {

enum class Format { TEXT, JSON };

/// Everything, to read again with `parse`.
std::string exported(Family const& family, std::vector<Entry> const& entries, Format format);

/// The names only, a line each: keys, or where the entries have no key, sections.
std::string listed(std::vector<Entry> const& entries, Format format);

/// Reads what `exported` wrote.
/// @throws Failure when it is something else
std::vector<Entry> parse(Family const& family, std::string const& bytes, Format format);

} // namespace tool

#endif
