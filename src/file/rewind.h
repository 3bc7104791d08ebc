// How reading a structured file begins.
#ifndef KORU_FILE_REWIND_H
#define KORU_FILE_REWIND_H

#include <koru/file.h>

namespace Koru {

/// Flushes the stream, clears its state and goes to the start of the file. What has no start, a
/// pipe, is read from where it is.
/// @throws std::runtime_error "failed to read from file" where output that is still buffered cannot
///         be written, or the file cannot be gone back in: it would look empty
void rewind(File& file);

} // namespace Koru

#endif
