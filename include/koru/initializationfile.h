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
/// when the file was opened for writing.
///
/// The format: narrow text in UTF-8 (`make_string`, `make_wstring`), lines ended by a line feed. A
/// line is trimmed of tabs and blanks; then
/// - a first `#` or `;` makes it a comment;
/// - a first `[` makes it a header, whose name is what remains without the brackets at both ends;
/// - a line with `=` is an entry of the current section: the key is all before the first `=`, the
///   value all after it, neither of them trimmed further (`name = value` has the key `name `);
/// - other lines, entries before the first header and entries with an empty key are ignored.
///
/// Intended: a carriage return is ordinary text and stays at the end of values and section names.
/// Comments, blank lines and the order of the lines are lost when the file is written. There is no
/// temporary file: the old file is deleted, then the new one is written.
///
/// Names compare without regard to case (`compare` of <koru/string.h>, under the current C locale)
/// and keep the case they were given. A section exists as long as an entry carries its name. The
/// table is sorted by section and key in `open` and when it is written; what is added in between
/// stands at its end. Where several entries have equal names, the first in the table counts.
///
/// Every operation of this class holds the file's lock from its beginning to its end, so one object
/// may be used by several threads at once. Results are copies. All operations may throw
/// `std::bad_alloc`. A thread that is cancelled in `open` leaves the mode 0: nothing is written.
class KORU_EXPORT InitializationFile : public File {
public:
    /// No limit is imposed on lines; published for callers.
    static unsigned long const MAX_LINE_LENGTH = 4294967295UL;

    /// A closed file without a name and with an empty table.
    InitializationFile();

    /// A closed file with an empty table.
    InitializationFile(File::Path const& path);

    InitializationFile(InitializationFile const&) = delete;
    InitializationFile& operator=(InitializationFile const&) = delete;

    /// Does what `close` does, also when an exception between two changes destroys the object:
    /// `setMode(0)` before gives the changes up. What goes wrong is lost; call `close` first to see
    /// it.
    ~InitializationFile() override;

    /// Opens the file as `File::open` does and replaces the table: with `READ` by the entries of
    /// the file, sorted, otherwise by nothing, so that `close` then replaces the whole file.
    /// @throws std::runtime_error "failed to open file."; the table is unchanged
    /// @throws std::runtime_error "failed to read from file"; the file stays open, the table holds
    ///         what was read, and with `WRITE` the destructor writes that: `setMode(0)` first
    void open(unsigned long mode) override;
    /// As in `File`: no stream's open mode.
    void open(std::ios_base::openmode) = delete;

    /// When the mode has `WRITE`: sorts the table, deletes the file and writes it anew. In any case
    /// empties the table and closes the file. Without `WRITE` changes are lost silently. What only
    /// close(2) finds, such as a quota, is in `fail()` and not thrown. Cancellation is held off.
    /// @throws std::runtime_error "failed to write to file"; the file is open then and partly
    ///         written, the table intact
    /// @throws std::runtime_error "failed to open file."; the mode is 0 then and the table intact:
    ///         `setMode` and another `close` try again. The file is gone or empty; or as it was, if
    ///         neither was possible; or the new one, if it could be written without a stream.
    /// @throws std::runtime_error "failed to close file."
    void close() override;

    /// The name of each run of entries in one section, in the order of the table: each section once
    /// while the table is sorted, again for entries that were added to it since.
    virtual std::vector<std::wstring> enumerateSections();

    /// Adds an entry with empty key and value, unless the section exists. Such a section is gone
    /// after the file was written and read again.
    virtual void createSection(std::wstring const& section);

    /// Intended: removes every other entry of the section. Each removal moves the next entry into
    /// the place just visited, where it is not looked at, so of four adjacent entries the second
    /// and fourth stay. Repeat until `enumerateKeys` is empty to remove them all.
    virtual void removeSection(std::wstring const& section);

    /// The keys of all entries of the section in the order of the table, duplicates and empty keys
    /// included.
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
