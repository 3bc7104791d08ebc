// How both settings files are loaded.
#ifndef KORU_SETTINGS_LOAD_H
#define KORU_SETTINGS_LOAD_H

#include <exception>
#include <string_view>

#include "settings/lines.h"
#include "settings/settingstable.h"

namespace Koru {

/// Reads the file and calls `parse(line, plain)` for every line that is neither empty nor a
/// comment, trimmed; `plain` tells what `isPlain` gives for it.
/// @throws std::runtime_error "failed to read from file", or what else reading throws, after the
///         lines that came before
template <class Parse>
void loadLines(File& file, SettingsTable& table, Parse parse) {
    constexpr std::size_t usualLine = 32; // bytes, to guess the number of entries from
    FileBytes const& bytes = table.hold(readBytes(file));
    table.expect(bytes.size / usualLine);
    eachLine(bytes, [&parse](std::string_view untrimmed) {
        std::string_view const line = trim(untrimmed);
        if (!isComment(line)) parse(line, isPlain(line));
    });
    if (bytes.failure != nullptr) std::rethrow_exception(bytes.failure);
}

} // namespace Koru

#endif
