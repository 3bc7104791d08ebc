// The lines of a settings file: what the sectioned file and the flat one have in common.
#ifndef KORU_SETTINGS_LINES_H
#define KORU_SETTINGS_LINES_H

#include <cstddef>
#include <cstring>
#include <exception>
#include <memory>
#include <string_view>

#include <koru/file.h>

namespace Koru {

/// The bytes of a file.
struct FileBytes {
    std::unique_ptr<char[]> data;
    std::size_t size = 0;
    std::exception_ptr failure; ///< what came after them in place of the file's end; mostly null
};

/// Flushes the stream, clears its state and reads the file from its start to its end, or up to what
/// failed: an error, which throws where the caller enabled the stream's exceptions, or want of
/// memory. Leaves the stream as a peek at the end does.
/// @throws what `rewind` throws
FileBytes readBytes(File& file);

/// Calls `use` with every line that is not empty. Only a line feed ends a line; after an error the
/// last line counts only if one ended it.
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

/// Whether a trimmed line is a comment.
inline bool isComment(std::string_view line) {
    return !line.empty() && (line.front() == '#' || line.front() == ';');
}

} // namespace Koru

#endif
