// Reading a structured file, from its start to its end.
#ifndef KORU_FILE_FILEREADER_H
#define KORU_FILE_FILEREADER_H

#include <cstddef>
#include <exception>
#include <memory>
#include <string_view>

#include <koru/file.h>

namespace Koru {

/// The bytes of a file, as far as they could be read.
struct FileBytes {
    std::string_view view() const { return std::string_view(data.get(), size); }

    std::unique_ptr<char[]> data;
    std::size_t size = 0;
    std::exception_ptr failure; ///< what came instead of the end of the file; null if nothing did
};

/// Gives the bytes of a file in the portions in which the system gives them: nobody has to know the
/// size of the file beforehand, and what came before an error is not lost.
class FileReader {
public:
    /// Flushes the stream, clears its state and goes to the start of the file. What has no start, a
    /// pipe, is read from where it is.
    /// @throws std::runtime_error "failed to read from file" where output that is still buffered
    ///         cannot be written, or where the seek fails: the file would look empty
    explicit FileReader(File& file);

    FileReader(FileReader const&) = delete;
    FileReader& operator=(FileReader const&) = delete;

    /// How many bytes are there to be taken. Reads the next portion when all before it are taken; 0
    /// then means the end of the file, or an error.
    std::size_t arrived();

    /// Takes that many of the bytes that are there, and returns how many those were.
    std::size_t take(char* to, std::size_t size);

    /// Whether it was an error that `arrived` took for the end.
    bool hasFailed() const { return file_.bad(); }

    /// Sets the stream's fail state and throws.
    /// @throws std::runtime_error "failed to read from file"
    [[noreturn]] void fail();

    /// Reads the rest of the file, or up to what fails: an error, for which the stream throws if
    /// its user wants that, or want of memory. Leaves the stream as a peek at the end does.
    FileBytes readAll();

private:
    std::size_t sizeHint();
    void readAll(FileBytes& bytes);

    File& file_;
};

} // namespace Koru

#endif
