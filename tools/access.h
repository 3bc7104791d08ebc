// How files are opened: for reading, which changes nothing, or for a change that is saved safely.
#ifndef KORU_TOOLS_ACCESS_H
#define KORU_TOOLS_ACCESS_H

#include <filesystem>
#include <functional>
#include <string>
#include <vector>

#include "table.h"

namespace tool {

/// The path for the library, which takes it as it is. A parsed path could name neither a file
/// directly below the root nor one with a backslash in its name.
Koru::File::Path verbatim(std::filesystem::path const& path);

/// The entries of a file, whose path starts at the working directory. Creates and changes nothing.
std::vector<Entry> read(Family const& family, std::string const& file);

/// What else a change may do, or does.
struct Options {
    bool mayCreate = false;   ///< the file, if it is missing
    bool mayLose = false;     ///< lines that the library ignores, or would write otherwise
    bool isToReplace = false; ///< the change begins with an empty table
};

/// Changes a file, or what a link leads to, so that it is the old one or the new one at any time:
/// `action` changes a copy, which takes the file's place in one step. A file that would hold the
/// same entries afterwards is left alone.
void change(Family const& family, std::string const& file, Options options,
            std::function<void(Table&)> const& action);

} // namespace tool

#endif
