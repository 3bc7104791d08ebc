// How reading a structured file begins.
#ifndef KORU_FILE_REWIND_H
#define KORU_FILE_REWIND_H

#include <koru/file.h>

namespace Koru {

/// Flushes the stream, clears its state and goes to the start of the file. What has no start, a
/// pipe, is read from where it is.
inline void rewind(File& file) {
    file.flush();
    file.clear();
    file.rdbuf()->pubseekpos(0, std::ios::in);
}

} // namespace Koru

#endif
