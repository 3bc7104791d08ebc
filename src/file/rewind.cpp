#include "file/rewind.h"

#include <cerrno>
#include <stdexcept>

namespace Koru {

namespace {

bool _failed(std::streampos position) { return position == std::streampos(std::streamoff(-1)); }

/// Whether the file is a pipe or the like. To ask for the position moves nothing and flushes
/// nothing, so the answer is about the file alone.
bool _hasNoStart(std::filebuf& buffer) {
    errno = 0;
    return _failed(buffer.pubseekoff(0, std::ios::cur, std::ios::in)) && errno == ESPIPE;
}

} // namespace

void rewind(File& file) {
    file.flush();
    file.clear();
    // Writes out what flush left because the stream was in the fail state.
    bool const atStart = !_failed(file.rdbuf()->pubseekpos(0, std::ios::in));
    if (atStart || _hasNoStart(*file.rdbuf())) return;
    file.setstate(std::ios::failbit);
    throw std::runtime_error("failed to read from file");
}

} // namespace Koru
