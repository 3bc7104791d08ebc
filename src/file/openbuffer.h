// Opening the buffer of a file stream.
#ifndef KORU_FILE_OPENBUFFER_H
#define KORU_FILE_OPENBUFFER_H

#include <fstream>
#include <string>

namespace Koru {

/// Opens the buffer and returns whether it is open. If memory for it runs out, the standard library
/// leaves the file open without a buffer; this closes the file and passes the exception on.
inline bool openBuffer(std::filebuf& buffer, std::string const& name, std::ios::openmode mode) {
    try {
        return buffer.open(name, mode) != nullptr;
    } catch (...) {
        buffer.close();
        throw;
    }
}

} // namespace Koru

#endif
