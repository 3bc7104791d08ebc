/// @file
/// A file to which text is only appended.
#ifndef KORU_LOGFILE_H
#define KORU_LOGFILE_H

#include <koru/export.h>
#include <koru/file.h>

namespace Koru {

/// A file whose every write goes to its end, even when other processes append to it too:
/// @code
///     Koru::LogFile log("app.log"); // beside the executable
///     log.open(Koru::File::READ | Koru::File::WRITE); // keeps the lines that are there
///     log.write("started\n", 8).flush();
/// @endcode
///
/// The caller decides what a line looks like and writes it as to any stream. A line stays whole
/// among those of other processes when one `write` brings all of it and one `flush` follows; a
/// piece of 1,024 bytes or more goes out before the rest. The file should exist before several
/// processes open it: of two that find it missing at the same time, the later one empties it.
///
/// Intended: while the log is open, its mode is 0. So `synchronize` closes it and then fails with
/// "failed to open file.".
///
/// Stream output does not take the file's lock; threads that share a log call `lock` and `unlock`
/// around each line.
class KORU_EXPORT LogFile : public File {
public:
    /// Published for callers that format lines; the library imposes no limit.
    static unsigned int const MAX_LINE_LENGTH = 1024U;

    /// A closed file without a name.
    LogFile();

    /// A closed file.
    LogFile(File::Path const& path);

    /// Not copyable, as no stream is.
    LogFile(LogFile const&) = delete;
    LogFile& operator=(LogFile const&) = delete;

    /// Closes the file. Failures are lost; to see them, flush first and look at the state.
    ~LogFile() override;

    /// Opens the log for appending. This is an operation of its own, which hides `File::open`.
    /// `READ | WRITE` keeps the content, `WRITE` alone empties the file first; both create a
    /// missing file. A log that is open stays open, in the fail state: it drops all output
    /// until `clear()`.
    /// @throws std::runtime_error "failed to open file."; the log is then closed. Where the file
    ///         itself can be opened, as with a mode that lacks `WRITE`, a line goes to standard
    ///         output first: "File::open() failed to open " and the name.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Woverloaded-virtual"
    virtual void open(unsigned int mode);
#pragma GCC diagnostic pop
};

} // namespace Koru

#endif
