/// @file
/// A file that text is only appended to.
#ifndef KORU_LOGFILE_H
#define KORU_LOGFILE_H

#include <koru/export.h>
#include <koru/file.h>

namespace Koru {

/// A file opened so that every write goes to its end, also when other processes append to it. What
/// a line looks like is the caller's business: write to the object as to any stream. A line is
/// whole among those of other processes when one `write` brings all of it and one `flush` follows;
/// a piece of 1,024 bytes or more goes out before the rest. The file should exist before several
/// processes open it: of two that find it missing at once, the later empties it.
///
/// Intended: while the log is open its mode is 0. So `synchronize` closes it and then fails with
/// "failed to open file.".
///
/// Stream output does not take the file's lock; threads that share a log guard it with `lock` and
/// `unlock`.
class KORU_EXPORT LogFile : public File {
public:
    /// Published for callers that format lines; no limit is imposed.
    static unsigned int const MAX_LINE_LENGTH = 1024U;

    /// A closed file without a name.
    LogFile();

    /// A closed file.
    LogFile(File::Path const& path);

    LogFile(LogFile const&) = delete;
    LogFile& operator=(LogFile const&) = delete;

    /// Closes the file. What goes wrong is lost; flush and look at the stream's state to see it.
    ~LogFile() override;

    /// Opens the log for appending; its own operation, which hides `File::open`. `READ | WRITE`
    /// keeps what is there, `WRITE` alone empties the file first; both create a missing file. A log
    /// that is open stays so, in the fail state: it drops all output until `clear()`.
    /// @throws std::runtime_error "failed to open file."; it is closed then. Where the file itself
    ///         can be opened, as without `WRITE`, a line "File::open() failed to open " and the
    ///         name goes to standard output first.
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Woverloaded-virtual"
    virtual void open(unsigned int mode);
#pragma GCC diagnostic pop
};

} // namespace Koru

#endif
