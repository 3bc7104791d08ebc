/// @file
/// A settings file with sections.
#ifndef KORU_INITIALIZATIONFILE_H
#define KORU_INITIALIZATIONFILE_H

#include <memory>
#include <string>
#include <vector>

#include <koru/export.h>
#include <koru/file.h>

namespace Koru {

class SettingsTable;

/// A settings file of `key=value` lines under `[section]` headers. `open` reads the whole file into
/// a table, every other operation works on the table, and `close` or the destructor writes it back
/// when the file was opened for writing:
/// @code
///     Koru::InitializationFile settings("app.ini"); // beside the executable
///     settings.open(Koru::File::READ | Koru::File::WRITE);
///     settings.setValue(L"window", L"width", L"1024");
/// @endcode
///
/// The format: narrow text in UTF-8 (`make_string`, `make_wstring`), in lines that end with a line
/// feed. Each line is trimmed of tabs and blanks; then
/// - a line that begins with `#` or `;` is a comment;
/// - a line that begins with `[` is a header, whose name is the line without the brackets at
///   both ends;
/// - a line with `=` is an entry of the current section: the key is all before the first `=`, the
///   value all after it, neither of them trimmed further (`name = value` has the key `name `);
/// - other lines, entries before the first header and entries with an empty key are ignored.
///
/// Intended: a carriage return is ordinary text and stays at the end of values and section names.
/// Writing the file loses comments, blank lines and the order of the lines. There is no temporary
/// file: the old file is deleted, then the new one is written.
///
/// Names compare without regard to case (`compare` of <koru/string.h>, under the current C locale)
/// and keep the case they were given. A section exists as long as an entry has its name. `open`
/// sorts the table by section and key, and so does writing it; entries added in between are at its
/// end. Of several entries with equal names, the first in the table counts.
///
/// Every operation of this class holds the file's lock from beginning to end, so several threads
/// may use one object at once. Results are copies. Every operation may throw `std::bad_alloc`. A
/// thread that is cancelled in `open` leaves the mode 0, so that nothing is written.
class KORU_EXPORT InitializationFile : public File {
public:
    /// Published for callers; the library imposes no limit on lines.
    static unsigned long const MAX_LINE_LENGTH = 4294967295UL;

    /// A closed file without a name and with an empty table.
    InitializationFile();

    /// A closed file with an empty table.
    InitializationFile(File::Path const& path);

    /// Not copyable, as no stream is.
    InitializationFile(InitializationFile const&) = delete;
    InitializationFile& operator=(InitializationFile const&) = delete;

    /// Does what `close` does, even when an exception between two changes destroys the object; to
    /// give up the changes, call `setMode(0)` first. Failures are lost; to see them, call
    /// `close` first.
    ~InitializationFile() override;

    /// Opens the file as `File::open` does and replaces the table: with `READ`, by the sorted
    /// entries of the file; otherwise by nothing, so that `close` replaces the whole file.
    /// @throws std::runtime_error "failed to open file."; the table is unchanged
    /// @throws std::runtime_error "failed to read from file"; the file stays open, the table holds
    ///         what was read, and with `WRITE` the destructor writes that unless you call
    ///         `setMode(0)` first
    void open(unsigned long mode) override;
    /// Refuses a stream's open mode, as `File` does.
    void open(std::ios_base::openmode) = delete;

    /// If the mode has `WRITE`, sorts the table, deletes the file and writes the table to a new
    /// one. In any case empties the table and closes the file; without `WRITE`, changes are lost
    /// silently. An error that only close(2) reports, such as a quota, shows in `fail()` and throws
    /// nothing. Holds cancellation off.
    /// @throws std::runtime_error "failed to write to file"; the file is then open and partly
    ///         written, the table intact
    /// @throws std::runtime_error "failed to open file."; the mode is then 0 and the table intact:
    ///         `setMode` and another `close` try again. The file is gone or empty; as it was, if
    ///         neither was possible; the new one, if it could be written without a stream.
    /// @throws std::runtime_error "failed to close file."
    void close() override;

    /// The names of the sections in the order of the table, one for each run of entries in the same
    /// section: each section once while the table is sorted, and again for entries added since.
    virtual std::vector<std::wstring> enumerateSections();

    /// Adds an entry with empty key and value, unless the section exists. A section with nothing
    /// else is gone when the file has been written and read again.
    virtual void createSection(std::wstring const& section);

    /// Intended: removes every other entry of the section. Each removal moves the next entry into
    /// the place just visited, where it is passed over, so of four adjacent entries the second and
    /// fourth stay. To remove them all, repeat until `enumerateKeys` is empty.
    virtual void removeSection(std::wstring const& section);

    /// The keys of all entries of the section in the order of the table, with duplicates and
    /// empty keys.
    virtual std::vector<std::wstring> enumerateKeys(std::wstring const& section);

    /// Adds an entry with an empty value, unless section and key exist.
    virtual void createKey(std::wstring const& section, std::wstring const& key);

    /// Removes the first entry with this section and key; its duplicates stay.
    virtual void removeKey(std::wstring const& section, std::wstring const& key);

    /// The value of the first entry with this section and key; empty when there is none.
    virtual std::wstring getValue(std::wstring const& section, std::wstring const& key);

    /// Replaces the value of the first entry with this section and key, or adds an entry.
    virtual void setValue(std::wstring const& section, std::wstring const& key,
                          std::wstring const& value);

private:
    std::unique_ptr<SettingsTable> table_;
};

} // namespace Koru

#endif
