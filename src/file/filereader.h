// Reading a structured file, from its start to its end.
#ifndef KORU_FILE_FILEREADER_H
#define KORU_FILE_FILEREADER_H

#include <cstddef>
#include <exception>
#include <memory>
#include <string_view>

#include <koru/file.h>

namespace Koru {

/// The bytes of a file, up to its end or to what stopped the reading.
struct FileBytes {
    std::string_view view() const { return std::string_view(data.get(), size); }

    std::unique_ptr<char[]> data;
    std::size_t size = 0;
    std::exception_ptr failure; ///< what prevented reading on; null at the end of the file
};

/// Gives the bytes of a file in the portions in which they arrive from the system. So it never
/// relies on the size that the file claims to have, and loses no bytes that arrive before an error.
class FileReader {
public:
    /// Flushes the stream, clears its state and goes to the start of the file. A pipe, which has no
    /// start, is read from where it is.
    /// @throws std::runtime_error "failed to read from file" if buffered output cannot be written,
    ///         or if the seek fails: the file would look empty
    explicit FileReader(File& file);

    FileReader(FileReader const&) = delete;
    FileReader& operator=(FileReader const&) = delete;

    /// How many bytes have arrived and have not been taken yet. Reads the next portion if there are
    /// none; 0 means the end of the file or an error.
    std::size_t arrived();

    /// Takes up to `size` of the bytes that have arrived, and returns how many it took.
    std::size_t take(char* to, std::size_t size);

    /// Whether `arrived` returned 0 because of an error.
    bool hasFailed() const { return file_.bad(); }

    /// Sets the stream's fail state and throws.
    /// @throws std::runtime_error "failed to read from file"
    [[noreturn]] void fail();

    /// Reads the rest of the file. An error, an exception of the stream or a lack of memory ends
    /// the reading early and becomes the `failure` of the bytes. Leaves the stream as a peek at the
    /// end does.
    FileBytes readAll();

private:
    std::size_t sizeHint();
    void readAll(FileBytes& bytes);

    File& file_;
};

} // namespace Koru

#endif
