// The lines of a settings file: what the sectioned file and the flat one have in common.
#ifndef KORU_SETTINGS_LINES_H
#define KORU_SETTINGS_LINES_H

#include <cstddef>
#include <cstring>
#include <exception>
#include <string_view>

#include "file/filereader.h"
#include "settings/storedtext.h"

namespace Koru {

/// Calls `use(line)` for every line that is not empty. A line feed ends a line, and so does the end
/// of the file, but not a failure: the line that it cut short is left out.
template <class Use>
void eachLine(FileBytes const& bytes, Use use) {
    char const* at = bytes.data.get();
    char const* const end = at + bytes.size;
    while (at != end) {
        auto const left = static_cast<std::size_t>(end - at);
        auto const* const feed = static_cast<char const*>(std::memchr(at, '\n', left));
        if (feed == nullptr && bytes.failure != nullptr) return;
        char const* const stop = feed == nullptr ? end : feed;
        if (stop != at) use(std::string_view(at, static_cast<std::size_t>(stop - at)));
        at = feed == nullptr ? end : feed + 1;
    }
}

/// The line without the tabs and blanks at both ends. A line of nothing else stays as it is.
inline std::string_view trim(std::string_view line) {
    auto const isText = [](char c) { return c != ' ' && c != '\t'; };
    std::size_t last = line.size();
    while (last != 0 && !isText(line[last - 1])) --last;
    if (last == 0) return line;
    std::size_t first = 0;
    while (!isText(line[first])) ++first;
    return std::string_view(line.data() + first, last - first);
}

/// Whether a trimmed line, which is not empty, is a comment.
inline bool isComment(std::string_view line) { return line.front() == '#' || line.front() == ';'; }

/// Calls `parse(line, plain)` for every line that is neither empty nor a comment, trimmed; `plain`
/// is what `isPlain` says of it.
/// @throws what reading the file ended with, after the lines that came before
template <class Parse>
void parseLines(FileBytes const& bytes, Parse parse) {
    eachLine(bytes, [&parse](std::string_view untrimmed) {
        std::string_view const line = trim(untrimmed);
        if (!isComment(line)) parse(line, isPlain(line));
    });
    if (bytes.failure != nullptr) std::rethrow_exception(bytes.failure);
}

} // namespace Koru

#endif
