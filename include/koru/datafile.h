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
/// every other operation works on the records there, and `close` or the destructor writes them back
/// when the file was opened for writing:
/// @code
///     Koru::DataFile users("users.dat"); // beside the executable
///     users.open(Koru::File::READ | Koru::File::WRITE);
///     users.insert(Koru::DataFile::Record(L"ann", {0x01, 0x02}));
/// @endcode
///
/// Intended: records are in the order of their addresses in memory, neither by key nor by
/// insertion, and a record's position may change with every `open`. Keys compare without regard to
/// case (`compare` of <koru/string.h>, up to the first NUL, under the current C locale).
///
/// The format, all numbers little-endian: for each record the length K of the key in bytes (32
/// bits), K bytes of key, the length D of the data (32 bits), D bytes of data. A key has two bytes
/// for each character: zero, then the low 8 bits of the character.
/// Intended: characters above U+00FF lose their high bits, and 0x80 to 0xFF read back as 0xFFFFFF80
/// to 0xFFFFFFFF. Only characters from 0x00 to 0x7F survive.
///
/// Every operation except construction and destruction holds the file's lock from beginning to end,
/// so several threads may use one object at once, but not the references that `operator[]` returns.
/// Every operation may throw `std::bad_alloc`. A thread that is cancelled in `open` leaves the mode
/// 0, so that nothing is written.
class KORU_EXPORT DataFile : public File {
public:
    class Record;

    /// A closed file without a name and without records.
    DataFile();

    /// A closed file without records.
    DataFile(File::Path const& path);

    /// Not copyable, as no stream is.
    DataFile(DataFile const&) = delete;
    DataFile& operator=(DataFile const&) = delete;

    /// Does what `close` does if the file is open. Failures are lost; to see them, call
    /// `close` first.
    ~DataFile() override;

    /// Opens the file as `File::open` does, with `BINARY` added to the mode, and replaces the
    /// records: with `READ`, by all of the file's, duplicate keys included; otherwise by none.
    /// @throws std::runtime_error "failed to open file."; the records are unchanged
    /// @throws std::runtime_error "failed to read from file" for an entry that is cut short or
    ///         claims to be longer than the file, and where reading fails; std::invalid_argument
    ///         "zero length key" for an entry without a key; on 32 bits std::bad_alloc for a length
    ///         of 2 GiB or more. The file is then open and holds the entries before that one; with
    ///         `WRITE` the destructor writes those unless you call `setMode(0)` first.
    void open(unsigned long mode) override;
    /// Refuses a stream's open mode, as `File` does.
    void open(std::ios_base::openmode) = delete;

    /// If the mode has `WRITE`, deletes the file and writes all records to a new one. In any case
    /// destroys the records and closes the file; without `WRITE`, changes are lost silently. An
    /// error that only close(2) reports, such as a quota, shows in `fail()` and throws nothing.
    /// Holds cancellation off.
    /// @throws std::runtime_error "failed to write to file"; the file is then open and partly
    ///         written, the records intact
    /// @throws std::runtime_error "failed to open file."; the mode is then 0, the records intact:
    ///         `setMode` and another `close` try again. The file is gone or empty; as it was, if
    ///         neither was possible; the new one, if it could be written without a stream.
    /// @throws std::runtime_error "failed to close file."
    void close() override;

    /// The number of records.
    unsigned long size() const;

    /// The record at a position, counted from 0, to read and change. The reference is valid until
    /// the record is removed or the file opened or closed; the lock does not guard its use. A key
    /// changed through it is not compared with the keys of other records.
    /// @throws std::out_of_range "object does not exist"
    Record& operator[](unsigned long index);

    /// Adds a copy of the record; does nothing when there is a record with an equal key.
    void insert(Record const& record);

    /// Destroys the first record whose key equals this one's, if there is one.
    void remove(Record const& record);

private:
    std::unique_ptr<RecordSet> records_;
};

/// A key and data. A plain value: several threads may use distinct objects at once.
class KORU_EXPORT DataFile::Record {
public:
    /// Key and data empty.
    Record();

    /// Key, trimmed as by `setKey`, and data.
    /// @throws std::invalid_argument "zero length key", as `setKey`
    Record(std::wstring const& key, std::vector<unsigned char> const& data);

    /// @{
    /// Copies key and data.
    Record(Record const& other);
    Record& operator=(Record const& other);
    /// @}

    /// Virtual, so that derived records can be deleted through a pointer to this class.
    virtual ~Record();

    /// The key; the reference is valid until `setKey` is called or the record destroyed.
    virtual std::wstring const& getKey() const;

    /// Sets the key, without the blanks, tabs and line feeds at its ends; a key that consists of
    /// nothing else stays as it is.
    /// @throws std::invalid_argument "zero length key" when what remains is empty or begins with
    ///         NUL; the record is unchanged
    virtual void setKey(std::wstring const& key);

    /// The data; the reference is valid until `setData` is called or the record destroyed.
    virtual std::vector<unsigned char> const& getData() const;

    /// Sets the data.
    virtual void setData(std::vector<unsigned char> const& data);

private:
    std::wstring key_;
    std::vector<unsigned char> data_;
};

} // namespace Koru

#endif
