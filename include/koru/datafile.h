/// @file
/// A binary file of records with keys.
#ifndef KORU_DATAFILE_H
#define KORU_DATAFILE_H

#include <memory>
#include <string>
#include <vector>

#include <koru/export.h>
#include <koru/file.h>

namespace Koru {

class RecordSet;

/// A file of records, each a wide key with bytes of data. `open` reads the whole file into memory,
/// every other operation works on the records held, and `close` or the destructor writes them back
/// when the file was opened for writing.
///
/// Intended: records stand in the order of their addresses in memory, neither by key nor by
/// insertion, and a record's position may change with every `open`. Keys are compared without
/// regard to case (`compare` of <koru/string.h>, up to the first NUL, under the current C locale).
///
/// The format, all numbers little-endian: for each record the length K of the key in bytes (32
/// bits), K bytes of key, the length D of the data (32 bits), D bytes of data. A key takes two
/// bytes a character: zero, then the low 8 bits of the character.
/// Intended: characters above U+00FF lose their high bits, and 0x80 to 0xFF read back as 0xFFFFFF80
/// to 0xFFFFFFFF. Only keys of 0x00 to 0x7F survive.
///
/// Every operation but construction and destruction holds the file's lock from its beginning to its
/// end, so one object may be used by several threads at once, save for the references that
/// `operator[]` gives. All operations may throw `std::bad_alloc`. A thread that is cancelled in
/// `open` leaves the mode 0: nothing is written.
class KORU_EXPORT DataFile : public File {
public:
    class Record;

    /// A closed file without a name and without records.
    DataFile();

    /// A closed file without records.
    DataFile(File::Path const& path);

    DataFile(DataFile const&) = delete;
    DataFile& operator=(DataFile const&) = delete;

    /// Does what `close` does if the file is open. What goes wrong is lost; call `close` first to
    /// see it.
    ~DataFile() override;

    /// Opens the file as `File::open` does, with `BINARY` added to the mode, and replaces the
    /// records: with `READ` by those of the file, otherwise by none. Entries with equal keys are
    /// all held.
    /// @throws std::runtime_error "failed to open file."; the records are unchanged
    /// @throws std::runtime_error "failed to read from file" for an entry that is cut short or
    ///         claims to be longer than the file, and where reading fails; std::invalid_argument
    ///         "zero length key" for an entry without a key; on 32 bits std::bad_alloc for a length
    ///         of 2 GiB or more. The file is open then, the entries before that one are held, and
    ///         with `WRITE` the destructor writes those: `setMode(0)` first.
    void open(unsigned long mode) override;
    /// As in `File`: no stream's open mode.
    void open(std::ios_base::openmode) = delete;

    /// When the mode has `WRITE`: deletes the file and writes all records to a new one. In any case
    /// destroys the records and closes the file. Without `WRITE` changes are lost silently. What
    /// only close(2) finds, such as a quota, is in `fail()` and not thrown. Cancellation is held
    /// off.
    /// @throws std::runtime_error "failed to write to file"; the file is open then and partly
    ///         written, the records are held
    /// @throws std::runtime_error "failed to open file."; the mode is 0 then and the records held:
    ///         `setMode` and another `close` try again. The file is gone or empty; or as it was, if
    ///         neither was possible; or the new one, if it could be written without a stream.
    /// @throws std::runtime_error "failed to close file."
    void close() override;

    /// The number of records held.
    unsigned long size() const;

    /// The record at a position from 0, for reading and changing. The reference is valid until the
    /// record is removed, or the file opened or closed; using it is not guarded by the lock. A key
    /// that is changed through it is not compared with those of other records.
    /// @throws std::out_of_range "object does not exist"
    Record& operator[](unsigned long index);

    /// Holds a copy of the record, unless one with an equal key is held: then nothing happens.
    void insert(Record const& record);

    /// Destroys the first record whose key equals this one's; nothing happens without one.
    void remove(Record const& record);

private:
    std::unique_ptr<RecordSet> records_;
};

/// A key and data. A plain value: distinct objects may be used from several threads at once.
class KORU_EXPORT DataFile::Record {
public:
    /// Key and data empty.
    Record();

    /// @throws std::invalid_argument "zero length key", as `setKey`
    Record(std::wstring const& key, std::vector<unsigned char> const& data);

    Record(Record const& other);
    Record& operator=(Record const& other);
    virtual ~Record();

    /// The key, valid as long as the record and until `setKey`.
    virtual std::wstring const& getKey() const;

    /// Sets the key, without the blanks, tabs and line feeds at its ends. A key of nothing else is
    /// kept as it is.
    /// @throws std::invalid_argument "zero length key" when what remains is empty or begins with
    ///         NUL; the record is unchanged
    virtual void setKey(std::wstring const& key);

    /// The data, valid as long as the record and until `setData`.
    virtual std::vector<unsigned char> const& getData() const;
    virtual void setData(std::vector<unsigned char> const& data);

private:
    std::wstring key_;
    std::vector<unsigned char> data_;
};

} // namespace Koru

#endif
